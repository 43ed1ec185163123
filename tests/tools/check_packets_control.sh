#!/usr/bin/env bash
# `kelvane packets` with playback control on long_cues and no_cues: after a
# seek the video resumes at the Cluster of the cue point at or before the
# seek time (long_cues.cues) and plays on as long_cues.blocks lists it; a fast
# forward delivers only the first TrickTime after cue points; a file without
# Cues refuses a seek to 5 s (check_cli.sh has the usage errors).
#   check_packets_control.sh SOURCE_DIR [EMULATOR ARGS...] KELVANE
source "$(dirname "${BASH_SOURCE[0]}")/check_common.sh" "$@"

# long_cues: TimecodeScale 1 ms, every cue point names track 1.
cue_times=$(awk '{ print $1 * 1000 }' "$fixtures/long_cues.cues" | sort -un)

# Track 1's frames (time size adler) from its block at time $1 on, in file order.
video_from() {
  awk -v t="$1" '$1 == 1 && $2 * 1000 == t { on = 1 }
    on && $1 == 1 { n = split($5, fs, ","); for (i = 1; i <= n; i++) { split(fs[i], f, ":"); print $2 * 1000, f[1], f[2] } }' \
    "$fixtures/long_cues.blocks"
}

out=$("${kelvane[@]}" packets --buffer-size 4096 --seek 12.3@1 "$fixtures/long_cues.mkv" 2>/dev/null) ||
  fail "seek: exit code $?"
cue=$(awk '$1 <= 12300000' <<<"$cue_times" | tail -1)
after=$(awk '$1 == 0 && $3 == "seek" { on = 1; next } on && $1 == 0 { print $3, $4, $5 }' <<<"$out")
[[ -n "$after" ]] || fail "seek: no video frames after the seek"
diff <(video_from "$cue") <(echo "$after") >/dev/null || fail "seek: video after the seek differs from the blocks from $cue us"

out=$("${kelvane[@]}" packets --channels 0 --trick-time 500 --seek 2@0 --ff 200@2 "$fixtures/long_cues.mkv" 2>/dev/null) ||
  fail "ff: exit code $?"
jumped=$(awk '$3 == "seek" { n++; next } n == 2 { print $3 }' <<<"$out")
[[ -n "$jumped" ]] || fail "ff: no frames after the scan started"
late=$(awk 'NR == FNR { cues[++n] = $1; next }
  { c = 0; for (i = 1; i <= n; i++) if (cues[i] <= $1) c = cues[i]; if ($1 - c > 500000) print $1 }' \
  <(echo "$cue_times") <(echo "$jumped"))
[[ -z "$late" ]] || fail "ff: frames later than TrickTime after their cue point: $late"

err=$("${kelvane[@]}" packets --seek 5@0.5 "$fixtures/no_cues.mkv" 2>&1 >/dev/null) || fail "no_cues: exit code $?"
grep -q "the plug-in refused --seek 5@0.5" <<<"$err" || fail "no_cues: the refused seek is not reported"
err=$("${kelvane[@]}" packets --seek 100@0.5 "$fixtures/long_cues.mkv" 2>&1 >/dev/null)
[[ $err == *"--seek 100@0.5 is past the end"* ]] || fail "a seek past the end is not reported: $err"

# A seek and a scan beside a channel record without a track; damage without recovery.
"${kelvane[@]}" packets --seek 0.5@0.2 --ff 200@0.6 "$fixtures/encrypted_aac.mkv" >/dev/null 2>&1 || fail "encrypted_aac: exit code $?"
out=$("${kelvane[@]}" packets --no-recover "$fixtures/damaged_zeroed.mkv" 2>"$work/err")
[[ $? == 1 && -n $out && $out != *" gap "* ]] || fail "--no-recover: went on past the damage or printed nothing"
[[ $(grep -c "stopped after .* us, after byte" "$work/err") == 2 ]] || fail "--no-recover: $(cat "$work/err")"

finish "packets control checks passed"
