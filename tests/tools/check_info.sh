#!/usr/bin/env bash
# Runs `kelvane info` on the sample and on every Matroska fixture and compares
# what it prints with the values mkvinfo reported for the same files
# (NAME.expected, written when the files were made).
#   check_info.sh SOURCE_DIR [EMULATOR ARGS...] KELVANE
source "$(dirname "${BASH_SOURCE[0]}")/check_common.sh" "$@"

checked=0
expect() {  # file, label, expected, actual
  if [[ "$3" != "$4" ]]; then
    echo "FAIL $1: $2: expected '$3', kelvane printed '$4'"
    failures=$((failures + 1))
  fi
}

check_file() {
  local mkv=$1 expected=$2
  local out
  out=$("${kelvane[@]}" info "$mkv" 2>&1) || { echo "FAIL $mkv: kelvane info exited $?"; echo "$out" | tail -3; failures=$((failures + 1)); return; }
  field() { sed -n "s/^  $1: //p" <<<"$out" | head -1; }
  value() { sed -n "s/^$1 //p" "$expected" | head -1; }
  expect "$mkv" DocType "$(value doc_type)" "$(field DocType)"
  expect "$mkv" TimecodeScale "$(value timecode_scale)" "$(field TimecodeScale)"
  if grep -q '^duration_ns ' "$expected"; then
    expect "$mkv" Duration "$(value duration_ns)" "$(field DurationNs)"
  fi
  local title; title=$(value title); [[ -z $title ]] && title="(none)"
  expect "$mkv" Title "$title" "$(field Title)"
  expect "$mkv" MuxingApp "$(value muxing_app)" "$(field MuxingApp)"
  expect "$mkv" WritingApp "$(value writing_app)" "$(field WritingApp)"
  expect "$mkv" "track count" "$(grep -c '^track ' "$expected")" "$(sed -n 's/^Tracks: \([0-9]*\).*/\1/p' <<<"$out")"
  checked=$((checked + 1))
}

check_file "$source_dir/samples/sample.mkv" "$source_dir/samples/sample.expected"
for expected in "$source_dir"/tests/fixtures/*.expected; do
  grep -q '^doc_type matroska$' "$expected" || continue
  check_file "${expected%.expected}.mkv" "$expected"
done

# A file that is not Matroska is refused with exit code 1.
"${kelvane[@]}" info "$source_dir/README.md" >/dev/null 2>&1
expect README.md "exit code for a non-Matroska file" 1 $?

echo "checked $checked files, $failures mismatches"
((failures == 0))
