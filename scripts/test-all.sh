#!/usr/bin/env bash
# Every test in every preset: native, ASan+UBSan, 32-bit ARM under qemu-arm,
# the threaded tests under ThreadSanitizer, then a short run of each fuzz target.
set -euo pipefail
cd "$(dirname "$0")/.."
bash scripts/install-deps.sh test

jobs=$(nproc)
failed=()
for preset in default asan armhf; do
  echo "=== preset $preset"
  cmake --preset "$preset" >/dev/null
  cmake --build --preset "$preset" -j"$jobs"
  ctest --preset "$preset" -j"$jobs" || failed+=("$preset")
done

# ThreadSanitizer only where channels run on threads: the ring and the
# playback threads tests (the test preset filters them), built alone.
echo "=== preset tsan"
cmake --preset tsan >/dev/null
cmake --build --preset tsan -j"$jobs"
ctest --preset tsan -j"$jobs" || failed+=(tsan)

if [[ -d fuzz ]] && compgen -G "fuzz/*_fuzzer.cpp" >/dev/null; then
  echo "=== fuzz (short runs)"
  bash scripts/fuzz.sh "${KELVANE_FUZZ_SECONDS:-60}" || failed+=(fuzz)
fi

if ((${#failed[@]})); then
  echo "FAILED in: ${failed[*]}"
  exit 1
fi
echo "all presets passed"
