#!/usr/bin/env bash
# The main job: build kelvane and run it on the committed sample file.
set -euo pipefail
cd "$(dirname "$0")/.."
bash scripts/install-deps.sh build
cmake --preset default >/dev/null
cmake --build --preset default -j"$(nproc)" --target kelvane_cli >/dev/null
./build/default/tools/kelvane info samples/sample.mkv
