# Sourced by every check script here, which is called as
#   check_NAME.sh SOURCE_DIR [EMULATOR ARGS...] KELVANE
# (the emulator runs the tool of a cross build): the tool's command line, the
# fixtures, and a failure count the script reports at its end.
set -uo pipefail
source_dir=$1
shift
kelvane=("$@")
fixtures=$source_dir/tests/fixtures

failures=0
fail() { echo "FAIL $*"; failures=$((failures + 1)); }
