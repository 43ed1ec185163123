#!/bin/sh
# Makes samples/sample.mkv, the demo file of the README: 2.5 s of AVC video
# (x264, 160x120, 25 frame/s, B-frames) and AAC-LC stereo audio, with a Title,
# multiplexed by mkvmerge. Deterministic: single-threaded bit-exact encoders
# from lavfi test sources and mkvmerge --deterministic.
set -eu
set -f

here=$(cd "$(dirname "$0")" && pwd)
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT INT TERM

FF="ffmpeg -hide_banner -loglevel error -nostdin -y"
EXACT="-threads 1 -flags:v +bitexact -flags:a +bitexact -fflags +bitexact"

$FF -f lavfi -i testsrc2=size=160x120:rate=25:duration=2.5 \
  -c:v libx264 -preset medium -profile:v high -crf 30 -bf 2 -g 25 -sc_threshold 0 -pix_fmt yuv420p \
  $EXACT -f h264 "$work/sample.h264"
$FF -f lavfi -i "aevalsrc=0.5*sin(2*PI*440*t)|0.5*sin(2*PI*554.37*t):s=48000:d=2.5" \
  -c:a aac -b:a 64k $EXACT -f adts "$work/sample.aac"
mkvmerge --quiet --deterministic 20240601 --title "kelvane sample: AVC and AAC" \
  -o "$here/sample.mkv" --default-duration 0:25fps "$work/sample.h264" "$work/sample.aac"

mkvinfo --ui-language en_US "$here/sample.mkv"
