#!/usr/bin/env bash
# Runs `kelvane metadata` (which loads kelvane.so) on fixtures and compares
# the entries it prints with the tags and tracks recorded in NAME.expected.
#   check_metadata.sh SOURCE_DIR [EMULATOR ARGS...] KELVANE
source "$(dirname "${BASH_SOURCE[0]}")/check_common.sh" "$@"

run() { "${kelvane[@]}" metadata "$fixtures/$1.mkv" 2>&1 || echo "exit code $?"; }  # NAME: what the tool prints

# The tags fixture: each offered tag under its key, with the text of .expected.
out=$(run tags)
entry() { sed -n "s/^  $1 ($2): //p" <<<"$out" | head -1; }
tag() { sed -n "s/^tag $1 //p" "$fixtures/tags.expected" | head -1; }
for pair in TITLE:Name ARTIST:Artist GENRE:Genre ALBUM:Album COMMENT:Comment; do
  expect "tags ${pair#*:}" "$(tag "${pair%%:*}")" "$(entry "${pair#*:}" UTF8)"
done
expect "tags SampleRate" "$(sed -n 's/.*sampling_frequency=\([0-9]*\).*/\1/p' "$fixtures/tags.expected")" \
  "$(entry SampleRate NUM4 | cut -d' ' -f1)"

# A video track's picture size.
out=$(run avc_aac)
track=$(grep -m1 '^track .*type=video' "$fixtures/avc_aac.expected")
expect "avc_aac Width" "$(sed -n 's/.* width=\([0-9]*\).*/\1/p' <<<"$track")" "$(entry Width NUM4 | cut -d' ' -f1)"
expect "avc_aac Height" "$(sed -n 's/.* height=\([0-9]*\).*/\1/p' <<<"$track")" "$(entry Height NUM4 | cut -d' ' -f1)"
expect "avc_aac entry count" "$(grep -c '^  ' <<<"$out")" "$(sed -n 's/^Entries: //p' <<<"$out")"

finish "kelvane metadata matches the fixtures"
