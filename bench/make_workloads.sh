#!/usr/bin/env bash
# Makes the playback benchmark's files with ffmpeg and mkvmerge, outside the
# repository. Files already present are kept, so a second call costs nothing.
#   bench/make_workloads.sh [DIR]        (default /work/bench-data)
#
#   a.mkv         60 min, 64x64 noise AVC at 100 fps with B-frames, AAC, MP3,
#                 AC-3; SimpleBlocks, no lacing (ffmpeg's muxer): ~250 MB and
#                 ~790,000 frames, so the per-frame cost dominates.
#   a_laced.mkv   a.mkv remuxed by mkvmerge: AAC in Xiph lacing, AC-3 in fixed
#                 lacing (checked below with mkvinfo).
#   a_groups.mkv  a.mkv remuxed by mkvmerge with BlockGroups only.
#   a_2min.mkv    the first 2 minutes of a.mkv's recipe, for callgrind.
#   a_10s.mkv     the first 10 seconds of it: callgrind's count on it is the
#                 fixed cost (loading, rating, set-up) taken off a_2min's.
#   a10.mkv       a.mkv appended ten times (mkvmerge +), for peak memory
#                 against file size; made only with more than 8 GB free.
#   b.mkv         145 s of 1280x720 intra-only AVC (every frame a key frame of
#                 ~170 KB) plus 8-channel 24-bit PCM: ~800 MB, so the cost per
#                 byte dominates.
set -euo pipefail
dir=${1:-/work/bench-data}
mkdir -p "$dir"
cd "$dir"

made() { [[ -s $1 ]] && { echo "have $1"; true; }; }

# make_a SECONDS FILE
make_a() {
  made "$2" && return
  echo "making $2 ..."
  ffmpeg -nostdin -v error -y \
    -f lavfi -i "color=c=gray:s=64x64:r=100,noise=alls=60:allf=t+u" \
    -f lavfi -i "anoisesrc=r=48000:a=0.3" -t "$1" \
    -map 0:v -map 1:a -map 1:a -map 1:a \
    -c:v libx264 -preset veryfast -bf 2 -g 200 -b:v 220k -maxrate 220k -bufsize 440k \
    -c:a:0 aac -b:a:0 64k -c:a:1 libmp3lame -b:a:1 96k -c:a:2 ac3 -b:a:2 128k \
    -f matroska "$2.part"
  mv "$2.part" "$2"
}

make_a 3600 a.mkv
make_a 120 a_2min.mkv
make_a 10 a_10s.mkv

if ! made a_laced.mkv; then
  echo "making a_laced.mkv ..."
  mkvmerge -q -o a_laced.mkv.part --engage lacing_xiph a.mkv || [[ $? == 1 ]]
  mv a_laced.mkv.part a_laced.mkv
fi
# A block with more than one frame is a laced one: both AAC (Xiph) and AC-3
# (fixed) must have them, or the file measures nothing new.
for codec in A_AAC A_AC3; do
  track=$(mkvinfo a_laced.mkv | awk -v c="$codec" '/Track number:/ { for (i = 1; i < NF; ++i) if ($i == "number:") n = $(i + 1) }
    $0 ~ "Codec ID: " c { print n; exit }')
  laced=$(mkvinfo -v -v a_laced.mkv | head -20000 |
    grep -cE "track number $track, [2-9][0-9]* frame\(s\)" || true)
  [[ $laced -gt 0 ]] || { echo "a_laced.mkv: no laced blocks for $codec (track $track)" >&2; exit 1; }
  echo "a_laced.mkv: $codec track $track laced ($laced laced blocks in the first lines)"
done

if ! made a_groups.mkv; then
  echo "making a_groups.mkv ..."
  mkvmerge -q -o a_groups.mkv.part --disable-lacing --engage no_simpleblocks a.mkv || [[ $? == 1 ]]
  mv a_groups.mkv.part a_groups.mkv
fi
simple=$(mkvinfo -v a_groups.mkv | head -20000 | grep -c "Simple block" || true)
[[ $simple == 0 ]] || { echo "a_groups.mkv has SimpleBlocks" >&2; exit 1; }

if ! made b.mkv; then
  echo "making b.mkv ..."
  ffmpeg -nostdin -v error -y \
    -f lavfi -i "testsrc2=s=1280x720:r=25,noise=alls=8:allf=t" \
    -f lavfi -i "anoisesrc=r=48000:a=0.3" -t 145 \
    -map 0:v -map 1:a -c:v libx264 -preset ultrafast -g 1 -crf 20 -c:a pcm_s24le -ac 8 \
    -f matroska b.mkv.part
  mv b.mkv.part b.mkv
fi

free_kb=$(df -Pk . | awk 'NR == 2 { print $4 }')
if ! made a10.mkv; then
  if ((free_kb > 8 * 1024 * 1024)); then
    echo "making a10.mkv ..."
    args=(a.mkv)
    for _ in 2 3 4 5 6 7 8 9 10; do args+=(+ a.mkv); done
    mkvmerge -q -o a10.mkv.part "${args[@]}" || [[ $? == 1 ]]
    mv a10.mkv.part a10.mkv
  else
    echo "skipping a10.mkv: less than 8 GB free"
  fi
fi
ls -l "$dir"/*.mkv
