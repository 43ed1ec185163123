#!/usr/bin/env bash
# Re-muxes a few fixtures with mkvmerge options drawn from SEED (lacing,
# BlockGroups, cues, cluster lengths, TimecodeScales), derives each remux's
# expected values from mkvinfo and ffprobe, and runs the conformance driver on
# them.
#
#   drawn_remuxes.sh SOURCE_DIR CONFORMANCE_TESTS SEED [COUNT]
set -euo pipefail
source_dir=$1 driver=$2 RANDOM=$3 count=${4:-8}
fixtures=$source_dir/tests/fixtures
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

# Appends one of the named array's entries to $drawn (no subshell: it would draw from a new seed).
pick() { local -n choices=$1; drawn+=" ${choices[RANDOM % ${#choices[@]}]}"; }
# Matroska files mkvmerge keeps as they are: not damaged, encrypted, stripped of headers, or WebM.
mapfile -t candidates < <(awk '!/^#/ && $1 !~ /damaged|truncated|flipped|encrypted|header_removal|webm/ { print $1 }' \
  "$fixtures/index.txt")
lacing=("" --disable-lacing "--engage lacing_xiph" "--engage lacing_ebml")
groups=("" "--engage no_simpleblocks")
clusters=("" "--cluster-length 1" "--cluster-length 3" "--cluster-length 200ms" "--cluster-length 1500ms")
scales=("" "--timestamp-scale 100000" "--timestamp-scale 123456" "--timestamp-scale 33333" "--timestamp-scale 1000"
  "--timestamp-scale 2000000")

for ((i = 0; i < count; ++i)); do
  drawn="" && pick candidates && name=${drawn# } drawn=""
  tracks=$(mkvmerge -i "$fixtures/$name.mkv" | grep -c '^Track ID')
  cues=("" --no-cues "--cues $((RANDOM % tracks)):all")
  pick lacing && pick groups && pick cues && pick clusters && pick scales
  remux=${name}_$i
  # shellcheck disable=SC2086  # the options are words; mkvmerge exits with 1 after warnings
  mkvmerge -q -o "$work/$remux.mkv" $drawn "$fixtures/$name.mkv" || (($? == 1))
  perl "$fixtures/derive_expected.pl" "$remux" "$work/$remux.mkv" "$work" >/dev/null
  echo "$remux  mkvmerge$drawn" | tr -s ' ' | tee -a "$work/index.txt"
done
KELVANE_FIXTURES=$work "$driver" --gtest_brief=1
