#!/usr/bin/env bash
# Seek benchmark: 100 seeks to random times (fixed seed) in the 60-minute
# workload a.mkv. For each, kelvane (bench/seek_bench: the time from the seek
# request to the first frame on every channel, and the bytes read meanwhile)
# and, side by side on the same times, `ffprobe -read_intervals T%+#1` (a
# whole process: open, probe, seek, one packet; its wall time and the bytes
# its reader reports). Prints the median and 95th percentile of each.
#   bench/seek_bench.sh BUILD_DIR [DATA_DIR] [SEEKS]
# BUILD_DIR is a -DKELVANE_BENCH=ON build (bench/seek_bench, tools/kelvane.so).
set -euo pipefail
build=$(cd "${1:?usage: bench/seek_bench.sh BUILD_DIR [DATA_DIR] [SEEKS]}" && pwd)
data=${2:-/work/bench-data}
seeks=${3:-100}
here=$(cd "$(dirname "$0")" && pwd)
bash "$here/make_workloads.sh" "$data" >/dev/null
file=$data/a.mkv
tmp=$(mktemp -d)
trap 'rm -rf "$tmp"' EXIT

"$build/bench/seek_bench" "$build/tools/kelvane.so" "$file" "$seeks" >"$tmp/kelvane"
while read -r time_us _; do
  seconds=$(awk -v us="$time_us" 'BEGIN { printf "%.6f", us / 1e6 }')
  start=$(date +%s%N)
  ffprobe -v debug -read_intervals "$seconds%+#1" -show_packets -of compact "$file" >/dev/null 2>"$tmp/log"
  end=$(date +%s%N)
  bytes=$(sed -n 's/.*Statistics: \([0-9]*\) bytes read.*/\1/p' "$tmp/log" | awk '{ n += $1 } END { print n + 0 }')
  echo "$time_us $(((end - start) / 1000)) $bytes" >>"$tmp/ffprobe"
done <"$tmp/kelvane"

# median and 95th percentile (nearest rank) of column $2 of file $1
percentiles() { awk "{ print \$$2 }" "$1" | sort -n | awk '{ v[NR] = $1 } END {
  printf "%s %s", v[int((NR + 1) / 2)], v[int(NR * 0.95 + 0.999)] }'; }
echo "$(wc -l <"$tmp/kelvane") seeks in $(basename "$file") (seed fixed), median / 95th percentile:"
awk -v k="$(percentiles "$tmp/kelvane" 2)" -v kb="$(percentiles "$tmp/kelvane" 3)" \
    -v f="$(percentiles "$tmp/ffprobe" 2)" -v fb="$(percentiles "$tmp/ffprobe" 3)" 'BEGIN {
  split(k, a); split(kb, b); split(f, c); split(fb, d)
  printf "  kelvane, seek request to first frame on every channel: %.2f / %.2f ms, %d / %d bytes read\n", a[1] / 1000, a[2] / 1000, b[1], b[2]
  printf "  ffprobe -read_intervals T%%+#1, the whole process:      %.2f / %.2f ms, %d / %d bytes read\n", c[1] / 1000, c[2] / 1000, d[1], d[2]
}'
