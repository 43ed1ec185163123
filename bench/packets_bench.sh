#!/usr/bin/env bash
# Playback throughput: `kelvane packets --no-hash` (streamer → kelvane.so →
# one sink per channel) against ffmpeg's stream copy of the same file, with
# frames per second, megabytes per second and peak resident memory of each.
#   bench/packets_bench.sh KELVANE [SECONDS] [BUFFER_SIZE]
# KELVANE is the built tool (kelvane.so next to it). The test file, AVC at a
# high bit rate plus AAC, SECONDS long (default 120), is made once in
# $TMPDIR/kelvane-bench.
set -euo pipefail
kelvane=$1
seconds=${2:-120}
buffer=${3:-32768}
dir=${TMPDIR:-/tmp}/kelvane-bench
file=$dir/bench_${seconds}s.mkv
mkdir -p "$dir"

if [[ ! -s $file ]]; then
  echo "making $file ..." >&2
  ffmpeg -nostdin -v error -f lavfi -i "testsrc2=size=1280x720:rate=30" -f lavfi -i "sine=frequency=440" \
    -t "$seconds" -c:v libx264 -preset ultrafast -b:v 12M -g 60 -c:a aac -b:a 128k -f matroska "$file"
fi
bytes=$(stat -c %s "$file")
frames=$("$kelvane" packets --no-hash "$file" 2>/dev/null | awk '$3 != "config"' | wc -l)

# run NAME COMMAND...: wall seconds and peak resident kilobytes, best of three.
run() {
  local name=$1 best_wall="" best_rss="" wall rss
  shift
  for _ in 1 2 3; do
    /usr/bin/time -f "%e %M" -o "$dir/time.txt" "$@" >/dev/null 2>&1
    read -r wall rss <"$dir/time.txt"
    if [[ -z $best_wall ]] || awk -v a="$wall" -v b="$best_wall" 'BEGIN { exit !(a < b) }'; then
      best_wall=$wall best_rss=$rss
    fi
  done
  awk -v n="$name" -v w="$best_wall" -v r="$best_rss" -v f="$frames" -v b="$bytes" 'BEGIN {
    if (w < 0.01) w = 0.01
    printf "%-16s %7.2f s %10.0f frames/s %8.1f MB/s %8.1f MiB peak\n", n, w, f / w, b / w / 1e6, r / 1024 }'
}

echo "file: $file, $((bytes / 1000000)) MB, $frames frames, input buffers of $buffer bytes"
run "kelvane packets" "$kelvane" packets --no-hash --buffer-size "$buffer" "$file"
run "ffmpeg -c copy" ffmpeg -nostdin -v error -i "$file" -map 0 -c copy -f null -
