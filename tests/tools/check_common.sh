# Sourced by every check script here, which is called as
#   check_NAME.sh SOURCE_DIR [EMULATOR ARGS...] KELVANE
# (the emulator runs the tool of a cross build): the tool's command line, the
# fixtures, a scratch directory, and a failure count that `finish` reports.
set -uo pipefail
source_dir=$1
shift
kelvane=("$@")
fixtures=$source_dir/tests/fixtures
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

failures=0
fail() { echo "FAIL $*"; failures=$((failures + 1)); }
expect() { [[ "$2" == "$3" ]] || fail "$1: expected '$2', the tool printed '$3'"; }  # what, expected, actual
# Ends the script: exit code 1 after any failure, else a line saying what was checked.
finish() {
  ((failures)) && { echo "$failures failures"; exit 1; }
  echo "$1"
}
