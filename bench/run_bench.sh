#!/usr/bin/env bash
# Playback benchmark: `kelvane packets --no-hash` (all channels), ffmpeg's
# stream copy and `cat` over the same files, alternating, ROUNDS times each,
# in one run. Prints medians, frames/s, MB/s, the ratios and peak memory;
# instructions per frame from callgrind on the 2-minute file; peak memory of
# a.mkv against a10.mkv; and the rating of a.mkv (bytes read, time), when the
# rating benchmark is built.
#   bench/run_bench.sh BUILD_DIR [DATA_DIR] [ROUNDS]
# BUILD_DIR holds tools/kelvane (kelvane.so beside it) and, with
# -DKELVANE_BENCH=ON, bench/rating_bench. DATA_DIR (default /work/bench-data)
# is filled by bench/make_workloads.sh first. Every frame count is checked
# against ffprobe's packet count, so a fast wrong answer fails the run.
set -euo pipefail
build=${1:?usage: bench/run_bench.sh BUILD_DIR [DATA_DIR] [ROUNDS]}
data=${2:-/work/bench-data}
rounds=${3:-5}
here=$(cd "$(dirname "$0")" && pwd)
kelvane=$(cd "$build" && pwd)/tools/kelvane
rating_bench=$(cd "$build" && pwd)/bench/rating_bench
[[ -x $kelvane ]] || { echo "no $kelvane" >&2; exit 2; }
bash "$here/make_workloads.sh" "$data" >/dev/null
tmp=$(mktemp -d)
trap 'rm -rf "$tmp"' EXIT

# Frames ffprobe reads, cached beside the file.
expected_frames() {
  local file=$1 cache=$1.frames
  if [[ ! -s $cache || $cache -ot $file ]]; then
    ffprobe -v error -count_packets -show_entries stream=nb_read_packets -of csv=p=0 "$file" |
      awk '{ n += $1 } END { print n }' >"$cache"
  fi
  cat "$cache"
}

# Frames kelvane delivers (configuration lines are not frames).
kelvane_frames() { "$kelvane" packets --no-hash "$1" | awk '$3 != "config"' | wc -l; }

# timed NAME FILE COMMAND...: appends "seconds peak_kib" to $tmp/NAME.
timed() {
  local name=$1 start end
  shift
  start=$(date +%s%N)
  /usr/bin/time -f "%M" -o "$tmp/rss" "$@" >/dev/null 2>"$tmp/err" || { cat "$tmp/err" >&2; exit 1; }
  end=$(date +%s%N)
  echo "$(((end - start) / 1000)) $(tail -1 "$tmp/rss")" >>"$tmp/$name"
}

median() { sort -n | awk '{ v[NR] = $1 } END { print NR % 2 ? v[(NR + 1) / 2] : (v[NR / 2] + v[NR / 2 + 1]) / 2 }'; }

files=(a a_laced a_groups b)
declare -A frames bytes
for f in "${files[@]}"; do
  file=$data/$f.mkv
  bytes[$f]=$(stat -c %s "$file")
  frames[$f]=$(expected_frames "$file")
  got=$(kelvane_frames "$file")
  if [[ $got != "${frames[$f]}" ]]; then
    echo "$f.mkv: kelvane delivered $got frames, ffprobe counts ${frames[$f]}" >&2
    exit 1
  fi
done

echo "kelvane: $kelvane"
echo "rounds: $rounds, alternating kelvane / ffmpeg / cat per file, files in the page cache"
for ((r = 0; r < rounds; ++r)); do
  for f in "${files[@]}"; do
    file=$data/$f.mkv
    cat "$file" >/dev/null
    timed "$f.kelvane" "$kelvane" packets --no-hash "$file"
    timed "$f.ffmpeg" ffmpeg -nostdin -v error -i "$file" -map 0 -c copy -f null -
    timed "$f.cat" cat "$file"
  done
done

printf "\n%-9s %-8s %10s %12s %9s %9s %9s\n" file tool "median ms" "frames/s" "MB/s" "ns/frame" "peak MiB"
declare -A us
for f in "${files[@]}"; do
  for tool in kelvane ffmpeg cat; do
    us[$f.$tool]=$(cut -d' ' -f1 "$tmp/$f.$tool" | median)
    rss=$(cut -d' ' -f2 "$tmp/$f.$tool" | sort -n | tail -1)
    awk -v f="$f" -v t="$tool" -v u="${us[$f.$tool]}" -v n="${frames[$f]}" -v b="${bytes[$f]}" -v r="$rss" 'BEGIN {
      printf "%-9s %-8s %10.1f %12.0f %9.0f %9.1f %9.1f\n", f, t, u / 1000, n / (u / 1e6), b / u, u * 1000 / n, r / 1024 }'
  done
done

echo
awk -v k="${us[a.kelvane]}" -v ff="${us[a.ffmpeg]}" -v c="${us[a.cat]}" 'BEGIN {
  printf "a.mkv: kelvane frames/s = %.1f x ffmpeg (goal >= 15); time = %.2f x cat (goal <= 3)\n", ff / k, k / c }'
for f in a_laced a_groups; do
  awk -v f="$f" -v u="${us[$f.kelvane]}" -v n="${frames[$f]}" -v ua="${us[a.kelvane]}" -v na="${frames[a]}" 'BEGIN {
    printf "%s.mkv: per-frame cost = %.2f x a.mkv (goal <= 1.2)\n", f, (u / n) / (ua / na) }'
done
awk -v k="${us[b.kelvane]}" -v c="${us[b.cat]}" 'BEGIN {
  printf "b.mkv: kelvane MB/s = %.0f%% of cat (goal >= 80%%)\n", 100 * c / k }'

# Instructions per delivered frame, host and plug-in together, all channels:
# the whole count over the frames, and the count per frame beyond the fixed
# cost of loading, rating and setting up (a_2min's count less a_10s's, over
# the frames a_2min has more).
callgrind_ir() {
  valgrind --tool=callgrind --callgrind-out-file="$tmp/callgrind.out" "$kelvane" packets --no-hash "$1" \
    >/dev/null 2>"$tmp/callgrind.err"
  sed -n 's/.*Collected : \([0-9]*\).*/\1/p' "$tmp/callgrind.err"
}
if command -v valgrind >/dev/null; then
  n=$(expected_frames "$data/a_2min.mkv")
  n0=$(expected_frames "$data/a_10s.mkv")
  ir=$(callgrind_ir "$data/a_2min.mkv")
  ir0=$(callgrind_ir "$data/a_10s.mkv")
  awk -v ir="$ir" -v n="$n" -v ir0="$ir0" -v n0="$n0" 'BEGIN {
    printf "a_2min.mkv under callgrind: %d instructions for %d frames = %.0f per frame (goal <= 800)\n", ir, n, ir / n
    printf "  beyond the fixed cost (a_10s.mkv: %d instructions, %d frames): %.0f per frame\n", ir0, n0, (ir - ir0) / (n - n0) }'
fi

# Peak memory against file size.
if [[ -s $data/a10.mkv ]]; then
  n10=$(expected_frames "$data/a10.mkv")
  got=$(kelvane_frames "$data/a10.mkv")
  [[ $got == "$n10" ]] || { echo "a10.mkv: kelvane delivered $got frames, ffprobe counts $n10" >&2; exit 1; }
  timed a10.kelvane "$kelvane" packets --no-hash "$data/a10.mkv"
  rss_a=$(cut -d' ' -f2 "$tmp/a.kelvane" | sort -n | tail -1)
  rss_a10=$(cut -d' ' -f2 "$tmp/a10.kelvane" | tail -1)
  awk -v a="$rss_a" -v b="$rss_a10" 'BEGIN {
    printf "peak memory: a.mkv %.1f MiB, a10.mkv %.1f MiB, difference %.2f MiB (goal < 1, both < 16)\n",
      a / 1024, b / 1024, (b - a) / 1024 }'
fi

# Rating of a.mkv in-process: bytes read and time.
if [[ -x $rating_bench ]]; then
  KELVANE_PLUGIN=$(dirname "$kelvane")/kelvane.so KELVANE_RATING_FILE=$data/a.mkv "$rating_bench" \
    --benchmark_min_time=0.2 2>/dev/null | grep -E "^BM_Rating"
fi
