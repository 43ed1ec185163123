#!/usr/bin/env bash
# Runs `kelvane packets` (streamer → kelvane.so → sinks) on fixtures and
# compares the frames it prints with NAME.blocks: per track, in file order,
# time = ticks × (timecode_scale / 1000) microseconds, size and Adler-32. On a
# damaged fixture NAME.blocks is what mkvinfo reads of it (up to the damage,
# then from the next Cluster, which opens at a cue point): before each gap
# line up to 26 of those frames may be missing, one output buffer's worth.
#   check_packets.sh SOURCE_DIR [EMULATOR ARGS...] KELVANE
source "$(dirname "${BASH_SOURCE[0]}")/check_common.sh" "$@"

# The frames of the output on standard input (config lines aside) against
# NAME.blocks, track by track in file order, times in microseconds; up to 26
# expected frames may be missing right before each gap line.
same_frames() {  # name
  awk 'FILENAME ~ /expected$/ { if ($1 == "timecode_scale") us = int($2 / 1000); next }
    FILENAME ~ /blocks$/ {
      n = split($5, frames, ",")
      for (i = 1; i <= n; i++) { split(frames[i], f, ":"); want[$1, ++wanted[$1]] = $2 * us " " f[1] " " f[2] }
      next }
    $3 != "config" { got[$2, ++printed[$2]] = $3 " " $4 " " $5; lines++ }
    END { if (!lines) exit 1
      for (t in printed) {
        i = 1
        for (j = 1; j <= printed[t]; j++) {
          if (got[t, j] ~ /^gap /) {
            for (k = 0; k < 26 && i <= wanted[t] && want[t, i] != got[t, j + 1]; k++) i++
            continue }
          if (want[t, i++] != got[t, j]) exit 1 }
        if (i <= wanted[t]) exit 1 } }' "$fixtures/$1.expected" "$fixtures/$1.blocks" -
}

for name in avc_aac lace_xiph lace_fixed blockgroups multi_audio timescale_100us vorbis_odd_scale subtitles_srt \
            encrypted_aac encrypted_first damaged_zeroed truncated_cluster flipped_block_size; do
  damaged=0  # the exit code: 1 for damage that stops a channel or cuts the file
  [[ $name == damaged_zeroed || $name == truncated_cluster ]] && damaged=1
  for size in 1000 32768; do
    out=$("${kelvane[@]}" packets --buffer-size "$size" "$fixtures/$name.mkv" 2>"$work/err")
    code=$?
    [[ $code == "$damaged" ]] || { fail "$name/$size: exit code $code: $(cat "$work/err")"; continue; }
    same_frames "$name" <<<"$out" || fail "$name/$size: frames differ from $name.blocks"
    # Standard error says where each channel's frames part, or where the file ends.
    case $name in
      damaged_zeroed) grep -q "failed on damaged input after byte" "$work/err" || fail "$name/$size: no gap reported" ;;
      truncated_cluster)
        grep -q "ended prematurely, at byte $(sed -n 's/^file_size //p' "$fixtures/$name.expected") inside the Cluster" \
          "$work/err" || fail "$name/$size: the end inside a Cluster is not reported" ;;
    esac
  done
done

# One channel acquired, no hashes, JSON (which check_cli.sh parses): the same frames of that track only.
out=$("${kelvane[@]}" packets --channels 1 --no-hash --json "$fixtures/avc_aac.mkv" 2>/dev/null)
expect "avc_aac --channels 1 --json: frames" "$(awk '$1 == 2 { n += split($5, f, ",") } END { print n }' \
  "$fixtures/avc_aac.blocks")" "$(grep -c '"time_us"' <<<"$out")"
grep -q '"adler32"' <<<"$out" && fail "avc_aac --no-hash: a checksum was printed"

finish "kelvane packets matches the fixtures' blocks"
