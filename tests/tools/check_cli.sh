#!/usr/bin/env bash
# The kelvane tool as a person and a script use it: help texts, error
# messages and exit codes from a table, then every command's --json output
# parsed by a strict JSON reader, including a file name full of quotes,
# backslashes, control characters and bytes that are not UTF-8.
#   check_cli.sh SOURCE_DIR [EMULATOR ARGS...] KELVANE
source "$(dirname "${BASH_SOURCE[0]}")/check_common.sh" "$@"

cd "$work" || exit 1
ln -s "$fixtures/avc_aac.mkv" ./-dash.mkv
mkv=$fixtures/avc_aac.mkv
not_mkv=$source_dir/README.md
missing=$work/missing.mkv

# exit code | stream (out, err) | expected substrings, parted by & | arguments (words; $mkv, $fixtures, $not_mkv, $missing, $work expand)
while IFS='|' read -r code stream want args; do
  for v in mkv fixtures missing not_mkv work; do want=${want//\$$v/${!v}} args=${args//\$$v/${!v}}; done
  # shellcheck disable=SC2086
  "${kelvane[@]}" $args </dev/null >"$work/out" 2>"$work/err"
  got=$?
  [[ $got == "$code" ]] || fail "kelvane $args: exit code $got, expected $code"
  while IFS= read -r part; do
    grep -qF -- "$part" "$work/$stream" || fail "kelvane $args: no '$part' on std$stream: $(head -c 300 "$work/$stream")"
  done <<<"${want//&/$'\n'}"
  # The framework's names and answer codes only with KELVANE_LOG.
  ! grep -qE 'answered|answer -?[0-9]|Sniff|Parser_|Mmf|rating [0-9]' "$work/err" || fail "kelvane $args: framework words: $(cat "$work/err")"
  # Help goes to standard output only; errors to standard error only.
  [[ $code != 0 || ! -s $work/err ]] || fail "kelvane $args: succeeded but wrote to stderr: $(head -c 200 "$work/err")"
  [[ $code != 2 || ! -s $work/out ]] || fail "kelvane $args: usage error but wrote to stdout"
done <<'EOF'
0|out|usage: kelvane COMMAND&KELVANE_LOG|--help
0|out|kelvane 0.|--version
0|out|kelvane 0.|info --version
0|out|exit codes:|-h
0|out|docs/json.md|help
2|err|no command given|
2|err|unknown command 'frob'|frob
2|err|try 'kelvane --help'|help frob
0|out|usage: kelvane info [--json] [--tree] FILE&the demuxer's own header parser|info -h
0|out|usage: kelvane info|help info
2|err|kelvane info: no FILE given|info
2|err|kelvane info: unknown option '--frob'&try 'kelvane info --help'|info --frob $mkv
2|err|kelvane info: one FILE only|info $mkv $mkv
1|err|kelvane info: cannot open $missing: No such file or directory|info $missing
1|err|kelvane info: cannot read $work: Is a directory|info $work
1|err|kelvane info: $not_mkv: not a Matroska file|info $not_mkv
0|out|DocType: matroska&Date: unknown|info $mkv
0|out|DocType: matroska|info -- -dash.mkv
0|out|Language: eng (not stated: the default), BCP 47: en&Duration: 00:00:02.048 (2048000000 ns)|info $fixtures/multi_audio.mkv
0|out|Tracks: 3 (video 1, audio 0, subtitles 2, other 0)|info $fixtures/subtitles_srt.mkv
0|out|SimpleBlock: track 1, timecode 0, keyframe|info --tree $mkv
0|out|usage: kelvane probe [--json] [--plugin PATH] FILE&--plugin PATH|probe -h
2|err|kelvane probe: no FILE given|probe --json
2|err|kelvane probe: --plugin needs a PATH|probe $mkv --plugin
2|err|kelvane probe: unknown option '--frob'|probe --frob $mkv
1|err|kelvane probe: cannot open $missing: No such file or directory|probe $missing
1|err|kelvane probe: $not_mkv: not a Matroska file|probe $not_mkv
1|err|webm_vp8_vorbis.mkv: DocType webm is not played|probe $fixtures/webm_vp8_vorbis.mkv
1|out|rating: 0|probe $not_mkv
1|err|kelvane probe: cannot load the plug-in $missing|probe --plugin $missing $mkv
0|out|fourcc: AVC1|probe $mkv
0|out|channel 1 (track 2) is stored with zlib compression|probe $fixtures/rich_headers.mkv
0|out|usage: kelvane packets [OPTIONS] FILE&--channels K,K,...&--buffer-size BYTES&--no-hash&--trick-time MS|packets -h
0|out|--seek TIME[@AT]|help packets
2|err|kelvane packets: no FILE given|packets --no-hash
2|err|kelvane packets: --buffer-size: '0' is not a number of bytes|packets --buffer-size 0 $mkv
2|err|kelvane packets: --buffer-size: 'big' is not a number of bytes|packets --buffer-size big $mkv
2|err|kelvane packets: --buffer-size needs a value|packets $mkv --buffer-size
2|err|kelvane packets: --channels: 'x' is not a list|packets --channels x $mkv
2|err|kelvane packets: --channels: '0,0' is not a list of distinct|packets --channels 0,0 $mkv
2|err|offers no channel 2; its channels: 0 (track 1), 1 (track 2)|packets --channels 2 $mkv
2|err|kelvane packets: --seek: '1@x' is not TIME[@AT]|packets --seek 1@x $mkv
2|err|kelvane packets: --seek: 'x' is not TIME[@AT]|packets --seek x $mkv
2|err|kelvane packets: --ff: '-3' is not SPEED[@AT]|packets --ff -3 $mkv
2|err|kelvane packets: --trick-time: '0' is not MS|packets --trick-time 0 $mkv
2|err|kelvane packets: --scan-end needs a value|packets $mkv --scan-end
2|err|try 'kelvane packets --help'|packets --frob $mkv
2|err|kelvane packets: FILE cannot be standard input|packets -
1|err|kelvane packets: cannot open $missing: No such file or directory|packets $missing
1|err|kelvane packets: $not_mkv: not a Matroska file|packets $not_mkv
2|err|kelvane packets: --frames: '0' is not N|packets --frames 0 $mkv
0|out|1 2 seek|packets --seek 1 --frames 1 $mkv
1|out|"error": "the plug-in refused the file"|packets --json $not_mkv
0|out|0 1 0 2300 66fcf3ed|packets $mkv
0|out|usage: kelvane metadata [--json] [--plugin PATH] FILE&NUM4|metadata -h
2|err|kelvane metadata: no FILE given|metadata
2|err|kelvane metadata: unknown option '--frob'|metadata --frob $mkv
2|err|kelvane metadata: FILE cannot be standard input|metadata -
1|err|kelvane metadata: cannot read $work: Is a directory|metadata $work
1|err|kelvane metadata: $not_mkv: not a Matroska file|metadata $not_mkv
0|out|Width (NUM4): 160|metadata $mkv
0|out|  kelvane extract movie.mkv|extract --help
2|err|offers no track 9 (offered: 1 2 3 4)|extract $fixtures/multi_audio.mkv -t 9 -o $work/none
2|err|try 'kelvane extract --help'|extract $mkv
2|err|kelvane extract: unknown option '--bogus'|extract --bogus $mkv -o $work/none
2|err|kelvane extract: --buffer-size: '0' is not a number of bytes from 1 to 67108864|extract --buffer-size=0 $mkv -o $work/none
2|err|kelvane extract: --track: 'x' is not a list of track numbers|extract $mkv --track x -o $work/none
2|err|kelvane extract: FILE cannot be standard input|extract - -o $work/none
1|err|kelvane extract: cannot open $missing|extract $missing -o $work/none
1|err|kelvane extract: $not_mkv: not a Matroska file|extract $not_mkv -o $work/none
1|err|webm_vp8_vorbis.mkv: DocType webm is not played|extract $fixtures/webm_vp8_vorbis.mkv -o $work/none
EOF

# --until and --frames end playback early: the audio frames before 0.5 s as mkvinfo lists them, 3 per channel.
expect "packets --until 0.5: audio frames" "$(awk '$1 == 2 && $2 < 500 { n += split($5, f, ",") } END { print n }' \
  "$fixtures/avc_aac.blocks")" "$("${kelvane[@]}" packets --no-hash --channels 1 --until 0.5 "$mkv" | grep -vc config)"
got=$("${kelvane[@]}" packets --no-hash --frames 3 "$mkv" | awk '$3 != "config" { n[$1]++ } END { print n[0], n[1] }')
[[ $got == "3 3" ]] || fail "packets --frames 3: $got frames on the channels"

# A named FIFO and a pipe given by path: read once, or refused at once; none may hang.
mkfifo "$work/fifo"
while IFS='|' read -r code want args; do
  (timeout 20 cat "$mkv" >"$work/fifo" &)
  # shellcheck disable=SC2086
  for input in "$work/fifo" <(cat "$mkv"); do
    timeout 20 "${kelvane[@]}" $args "$input" >"$work/out" 2>&1
    got=$?
    [[ $got == "$code" ]] && grep -qF -- "$want" "$work/out" || fail "kelvane $args $input: exit $got: $(head -c 200 "$work/out")"
  done
  timeout 2 cat "$work/fifo" >/dev/null 2>&1  # a writer the command left waiting
done <<'EOF2'
0|Chapters and attachments: not read (the input cannot seek)|info
0|seekable: no|probe
2|FILE cannot be a pipe or FIFO: packets reads its input more than once|packets
2|FILE cannot be a pipe or FIFO: extract reads its input more than once|extract -o fifo_out
2|FILE cannot be a pipe or FIFO: metadata reads its input more than once|metadata
EOF2

# Every help text names every option the command accepts.
for command in info probe packets metadata extract; do
  for option in $("${kelvane[@]}" "$command" --help | grep -o -- '--[a-z-]*' | sort -u); do
    "${kelvane[@]}" "$command" "$option" >/dev/null 2>"$work/err" </dev/null
    grep -q "unknown option '$option'" "$work/err" && fail "$command --help mentions $option, which it refuses"
  done
done

# --json: a strict parse (no NaN or Infinity, no raw control characters), the
# common header fields, and the file name back exactly as given, with the
# bytes that are not UTF-8 replaced by U+FFFD. One reader checks every
# document: arguments come in threes (command, file, document).
odd=$work/$'odd "name" \\ \x01\t\x7f \xff\xc3( caf\xc3\xa9.mkv'
ln -s "$(cd "$fixtures" && pwd)/tags.mkv" "$odd"
documents=()
for file in "$fixtures"/*.mkv "$odd"; do
  for command in info probe metadata packets; do
    json=$work/doc${#documents[@]}.json
    "${kelvane[@]}" "$command" --json $([[ $command == packets ]] && echo --no-hash) "$file" >"$json" 2>/dev/null
    status=$?
    [[ $file == "$odd" && $status != 0 ]] && fail "$command --json on the oddly named file: exit code $status"
    # A refused or damaged file still gets its document from probe and packets.
    [[ $status == 0 || ($command == probe || $command == packets) && $status == 1 ]] &&
      documents+=("$command" "$file" "$json")
  done
done
python3 - "${documents[@]}" <<'PY' || failures=$((failures + 1))
import json, sys
def refuse(name): raise ValueError("not JSON: " + name)
args, bad = sys.argv[1:], 0
for command, name, path in zip(args[0::3], args[1::3], args[2::3]):
    try:
        doc = json.load(open(path, "rb"), parse_constant=refuse)
        assert doc["schema_version"] == (2 if command == "info" else 1), "schema_version"
        assert doc["command"] == command, "command"
        want = name.encode("utf-8", "surrogateescape").decode("utf-8", "replace")
        assert doc["file"] == want, "file %r, expected %r" % (doc["file"], want)
        assert isinstance(doc.get("channels", doc.get("tracks", doc.get("entries"))), list), "main list"
    except Exception as error:
        print("FAIL %s --json %r: %s" % (command, name, error))
        bad += 1
sys.exit(bad > 0)
PY

finish "kelvane help, errors, exit codes and JSON output as documented"
