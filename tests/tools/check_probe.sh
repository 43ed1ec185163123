#!/usr/bin/env bash
# Runs `kelvane probe` (the plug-in connected through the host's set-up) on
# every fixture and compares the channels it offers with the tracks mkvinfo
# recorded in NAME.expected; then probes a fixture through a pipe, which must
# rate the same through an input that cannot seek.
#   check_probe.sh SOURCE_DIR [EMULATOR ARGS...] KELVANE
source "$(dirname "${BASH_SOURCE[0]}")/check_common.sh" "$@"

# The codecs the plug-in offers, as four-character codes; others are left out.
declare -A fourcc=([V_MPEG4/ISO/AVC]=AVC1 [V_MPEG4/ISO/ASP]=MP4V [V_MPEG4/MS/V3]=MP43 [V_MPEG1]=MP1V
  [V_MPEG2]=MP2V [V_THEORA]=THEO [A_MPEG/L3]=M2A3 [A_MPEG/L2]=M2A2 [A_PCM/INT/LIT]=RAWA [A_PCM/INT/BIG]=RAWA
  [A_DTS]=DTSA [A_VORBIS]=VRBS [A_FLAC]=FLAC [A_AAC]=M4AC [A_AC3]=AC3A)
key() { sed -n "s/.* $1=\([^ ]*\).*/\1/p" <<<"$2"; }

for expected in "$fixtures"/*.expected; do
  name=$(basename "$expected" .expected)
  out=$("${kelvane[@]}" probe "$fixtures/$name.mkv" 2>/dev/null)
  status=$?
  if ! grep -q '^doc_type matroska$' "$expected"; then
    expect "$name exit code (not matroska)" 1 "$status"
    expect "$name rating" 0 "$(sed -n 's/^rating: //p' <<<"$out")"
    continue
  fi
  expect "$name exit code" 0 "$status"
  # An encrypted track's channel comes after the others, not set up.
  want="" unset=""
  while read -r track; do
    code=${fourcc[$(key codec "$track")]:-}$(key vfw_fourcc "$track")
    [[ -z $code ]] && continue
    if [[ -n $(key encryption "$track") ]]; then
      unset+="not set up;"
    elif [[ $(key type "$track") == video ]]; then
      want+="$code $(key width "$track")x$(key height "$track");"
    else
      rate=$(key sampling_frequency "$track"); want+="$code ${rate%%.*};"
    fi
  done < <(grep '^track ' "$expected")
  got=$(awk '/^    fourcc: /{c=$2} /^    width: /{w=$2} /^    height: /{printf "%s %sx%s;", c, w, $2}
             /^    sample_rate: /{printf "%s %s;", c, $2} /^    reason: .* is encrypted/{printf "not set up;"}' <<<"$out")
  expect "$name channels" "$want$unset" "$got"
done

# Through a pipe: unbuffered, not seekable, the same channels.
file=$("${kelvane[@]}" probe "$fixtures/long_cues.mkv" 2>/dev/null)
piped=$(cat "$fixtures/long_cues.mkv" | "${kelvane[@]}" probe - 2>/dev/null)
expect "pipe exit code" 0 $?
expect "pipe rating" 80 "$(sed -n 's/^rating: //p' <<<"$piped")"
expect "pipe seekable" no "$(sed -n 's/^seekable: //p' <<<"$piped")"
expect "file seekable" yes "$(sed -n 's/^seekable: //p' <<<"$file")"
expect "input channel set-up" "0 0 0" "$(sed -n 's/^  set_[a-z_]*: //p' <<<"$piped" | tr '\n' ' ' | sed 's/ $//')"
expect "pipe channels" "$(sed -n '/^channels:/,$p' <<<"$file")" "$(sed -n '/^channels:/,$p' <<<"$piped")"

finish "kelvane probe offers the fixtures' tracks"
