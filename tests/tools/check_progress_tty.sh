#!/usr/bin/env bash
# Drives `kelvane extract` as a person at a terminal does, in a
# pseudo-terminal made by script(1): the progress bar (bytes, frames, rate,
# time left) must appear there, every redraw short of the terminal's last
# column at 80 and at 40 columns (a wrapped line leaves stale lines behind),
# and must not when standard error is a pipe or a file, or with --quiet.
#   check_progress_tty.sh SOURCE_DIR [EMULATOR ARGS...] KELVANE
source "$(dirname "${BASH_SOURCE[0]}")/check_common.sh" "$@"
file=$source_dir/tests/fixtures/long_cues.mkv

command -v script >/dev/null || { echo "FAIL script(1) from util-linux is missing"; exit 1; }

# The final state of the bar, as the terminal shows it once the run is over.
bar='extract \[#+\] 100%  [0-9.]+ [KMG]?i?B  [0-9]+ frames  [0-9.]+ [KMG]?i?B/s  0:00 left'

in_terminal() {  # columns, output directory, extra options; prints what the terminal received
  script -qfec "stty cols $1; $(printf '%q ' "${kelvane[@]}" extract "$file" -o "$work/$2" "${@:3}")" /dev/null
}

for columns in 40 80; do
  longest=$(in_terminal $columns cols$columns | tr '\r' '\n' | sed 's/\x1b\[K//g' | awk '/^extract / { if (length > n) n = length } END { print n }')
  ((longest > 30 && longest < columns)) || fail "at $columns columns the longest line drawn has $longest"
done
seen=$(in_terminal 80 tty)
[[ $seen =~ $bar ]] || fail "no progress bar in a terminal; it showed: $(tr '\r' '\n' <<<"$seen" | head -3)"
[[ $seen == *"track 1 V_MPEG4/ISO/AVC"* ]] || fail "the terminal did not show the list of files"
[[ -s $work/tty/track1.h264 ]] || fail "nothing was extracted in the terminal"

seen=$(in_terminal 80 quiet --quiet)
[[ $seen == *frames* && ! $seen =~ $bar ]] || fail "--quiet still drew a progress bar"

"${kelvane[@]}" extract "$file" -o "$work/pipe" 2>&1 >/dev/null | cat >"$work/piped"
[[ ! -s $work/piped ]] || fail "progress on a piped standard error: $(head -c 200 "$work/piped")"
"${kelvane[@]}" extract "$file" -o "$work/file" >/dev/null 2>"$work/stderr"
[[ ! -s $work/stderr ]] || fail "progress in a file: $(head -c 200 "$work/stderr")"

finish "kelvane extract draws its progress bar in a terminal only"
