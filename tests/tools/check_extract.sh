#!/usr/bin/env bash
# Runs `kelvane extract` on every fixture and decodes each extracted file with
# ffmpeg: its decoded frames must be those ffmpeg decodes from that track of
# the original file. Compared per decoded frame are the size and MD5 columns
# of framemd5; the dts, pts and duration columns are ignored because
# elementary streams (.h264, .mp3, .m2v...) carry no timestamps and other
# containers count in other time bases. Also ignored, and said where:
#  - PCM: a WAV demuxer cuts the samples into packets of its own choosing,
#    so the whole decoded stream's MD5 is compared instead;
#  - the end of the last audio frame, when the original drops it (a Matroska
#    DiscardPadding, which an elementary stream cannot carry): the decoded
#    samples must then be the original's followed by less than one frame.
# Raw tracks (no stream format) compare each frame of NAME.raw, as its index
# places it, with ffmpeg's packets of the track (-c copy). ffmpeg is required:
# without it the check fails.
#   check_extract.sh SOURCE_DIR [EMULATOR ARGS...] KELVANE
source "$(dirname "${BASH_SOURCE[0]}")/check_common.sh" "$@"

command -v ffmpeg >/dev/null || { echo "FAIL ffmpeg is missing (scripts/install-deps.sh test installs it)"; exit 1; }

ff() { ffmpeg -nostdin -v error "$@"; }
# "size md5" of each decoded frame. One IDCT for MPEG-4 Part 2 on both sides:
# ffmpeg picks Xvid's for a track the container calls XVID, which an
# elementary stream cannot say.
frames() { ff -idct simple "$@" -fps_mode passthrough -f framemd5 - | awk -F', *' '!/^#/ { print $5, $6 }'; }
# The decoded audio as 32-bit float samples, for the trimmed-tail comparison.
samples() { ff "$@" -c:a pcm_f32le -f f32le - 2>/dev/null; }  # may be cut short by head

compare_raw() {  # label original stream raw index
  local want got
  want=$(ff -i "$2" -map "0:$3" -c copy -f framemd5 - | awk -F', *' '!/^#/ { print $5, $6 }')
  got=$(perl -MDigest::MD5=md5_hex -e '
    open my $raw, "<:raw", $ARGV[0] or die; my $bytes = do { local $/; <$raw> };
    open my $index, "<", $ARGV[1] or die;
    while (<$index>) { my @f = split; print "$f[2] ", md5_hex(substr($bytes, $f[1], $f[2])), "\n" if $f[0] eq "frame" }
  ' "$4" "$5")
  [[ -n "$want" && "$want" == "$got" ]] || fail "$1: raw frames differ from the track's packets"
}

compare_decoded() {  # label original stream extracted type codec
  if [[ $6 == pcm_* ]]; then
    [[ $(ff -i "$2" -map "0:$3" -f md5 -) == $(ff -i "$4" -f md5 -) ]] || fail "$1: decoded PCM differs"
    return
  fi
  local want got last_want last_got bytes
  want=$(frames -i "$2" -map "0:$3")
  got=$(frames -i "$4")
  [[ -n "$want" ]] || { fail "$1: ffmpeg decodes nothing from the original"; return; }
  [[ "$want" == "$got" ]] && return
  last_want=${want##*$'\n'} last_got=${got##*$'\n'}
  if [[ $5 == audio && $(head -n-1 <<<"$want") == $(head -n-1 <<<"$got") && ${last_want%% *} -lt ${last_got%% *} ]]; then
    bytes=$(samples -i "$2" -map "0:$3" | wc -c)
    [[ $(samples -i "$2" -map "0:$3" | md5sum) == $(samples -i "$4" | head -c "$bytes" | md5sum) ]] && return
  fi
  fail "$1: decoded frames differ ($(wc -l <<<"$want") original, $(wc -l <<<"$got") extracted)"
}

checked=0
for original in "$fixtures"/*.mkv; do
  name=$(basename "$original" .mkv)
  out=$work/$name
  listing=$("${kelvane[@]}" extract -q "$original" -o "$out" 2>"$work/stderr")
  code=$?
  # The plug-in plays DocType matroska only.
  grep -qx 'doc_type matroska' "$fixtures/$name.expected" ||
    { [[ $code == 1 && -z "$listing" ]] || fail "$name: a refused file answers $code"; continue; }
  # What was delivered is written; the damage makes it exit 1 (a frame the damage garbled
  # may keep its track from being converted).
  grep -q '^damaged_at ' "$fixtures/$name.expected" &&
    { [[ $code == 1 && $listing == track* ]] || fail "$name: exit $code, wrote: $listing"; continue; }
  [[ $code == 0 ]] || { fail "$name: exit code $code: $(cat "$work/stderr")"; continue; }
  # ffmpeg numbers the streams in track-entry order.
  mapfile -t numbers < <(awk '/^track / { sub("number=", "", $2); print $2 }' "$fixtures/$name.expected")
  mapfile -t streams < <(ffprobe -v error -show_entries stream=codec_type,codec_name -of csv=p=0 "$original")
  while read -r _ track codec_id path _ index _; do
    [[ -n "$track" ]] || continue
    path=${path%,}
    stream=-1
    for i in "${!numbers[@]}"; do [[ ${numbers[$i]} == "$track" ]] && stream=$i; done
    label="$name track $track ${codec_id%:}"
    IFS=, read -r codec type <<<"${streams[$stream]:-}"
    if [[ $path == *.raw ]]; then
      compare_raw "$label" "$original" "$stream" "$path" "${index%,}"
    else
      compare_decoded "$label" "$original" "$stream" "$path" "$type" "$codec"
    fi
    checked=$((checked + 1))
  done <<<"$listing"
done
((checked >= 40)) || fail "only $checked tracks were extracted and compared"

# Input buffers of 333 bytes split most frames across output buffers (and a
# header-stripped frame from its prefix): the files must not change.
for name in avc_aac header_removal_mpeg4 theora_vorbis pcm_tracks flac tiny_lace_ebml; do
  "${kelvane[@]}" extract -q --buffer-size 333 "$fixtures/$name.mkv" -o "$work/small/$name" >/dev/null 2>&1 ||
    fail "$name --buffer-size 333: exit code $?"
  diff -r "$work/$name" "$work/small/$name" >/dev/null || fail "$name: 333-byte input buffers give other files"
done

# Attachments byte for byte, chapters and timestamps as mkvextract writes them.
file=$fixtures/rich_headers.mkv
mkdir -p "$work/ref"
(cd "$work/ref" && mkvextract "$file" attachments 1 2 chapters --simple chapters.txt \
  timestamps_v2 0:track1.timestamps.txt 1:track2.timestamps.txt >/dev/null) || fail "mkvextract failed on $file"
"${kelvane[@]}" extract -q "$file" -o "$work/mine" --timestamps --attachments "$work/mine" \
  --chapters "$work/mine/chapters.txt" >/dev/null || fail "extract --timestamps --attachments --chapters: exit code $?"
for name in notes.txt blob.bin chapters.txt track1.timestamps.txt track2.timestamps.txt; do
  cmp -s "$work/ref/$name" "$work/mine/$name" || fail "$name differs from mkvextract's"
done

# A selection of tracks (check_cli.sh has the usage errors).
"${kelvane[@]}" extract -q "$fixtures/multi_audio.mkv" -t 4,2 -o "$work/some" >/dev/null 2>&1 || fail "-t 4,2: exit code $?"
[[ $(ls "$work/some") == $'track2.mp3\ntrack4.aac' ]] || fail "-t 4,2 wrote: $(ls "$work/some" | tr '\n' ' ')"

finish "kelvane extract: $checked extracted tracks decode like the originals"
