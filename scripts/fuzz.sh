#!/usr/bin/env bash
# Runs every fuzz target for SECONDS (default 45) each, seeded with the test
# fixtures and fuzz/corpus/<target>/, with fuzz/<name>.dict or else the
# Matroska element dictionary. A longer hunt: bash scripts/fuzz.sh 1800
# New corpus files land in build/fuzz/corpus/<target>/, crashes in build/fuzz/.
set -euo pipefail
cd "$(dirname "$0")/.."
seconds=${1:-45}
cmake --preset fuzz >/dev/null
cmake --build --preset fuzz -j"$(nproc)"
status=0
for fuzzer in build/fuzz/fuzz/*_fuzzer; do
  [[ -x $fuzzer ]] || continue
  name=$(basename "$fuzzer")
  corpus=build/fuzz/corpus/$name
  mkdir -p "$corpus"
  seeds=()
  # The cue lookup reads a cue table, not a file: fixtures would only slow it down.
  [[ -d tests/fixtures && $name != cue_lookup_fuzzer ]] && seeds+=(tests/fixtures)
  [[ -d fuzz/corpus/$name ]] && seeds+=("fuzz/corpus/$name")
  dict=(-dict=fuzz/matroska.dict)
  [[ -f fuzz/${name%_fuzzer}.dict ]] && dict=(-dict="fuzz/${name%_fuzzer}.dict")
  echo "--- $name for ${seconds}s"
  if ! "$fuzzer" "${dict[@]}" -max_total_time="$seconds" -timeout=10 -rss_limit_mb=2048 \
      -artifact_prefix=build/fuzz/ -print_final_stats=1 "$corpus" "${seeds[@]}" 2>build/fuzz/"$name".log; then
    tail -50 build/fuzz/"$name".log
    status=1
  else
    grep -E "^(stat::number_of_executed_units|stat::peak_rss_mb|#[0-9]+ +DONE)" build/fuzz/"$name".log || true
  fi
done
exit $status
