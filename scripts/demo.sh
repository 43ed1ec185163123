#!/usr/bin/env bash
# The main job: build kelvane (the plug-in and the tool) and play the committed
# sample file through the plug-in: its channels, then every frame.
set -euo pipefail
cd "$(dirname "$0")/.."
bash scripts/install-deps.sh build
cmake --preset default >/dev/null
cmake --build --preset default -j"$(nproc)" --target kelvane_cli >/dev/null
./build/default/tools/kelvane probe samples/sample.mkv
./build/default/tools/kelvane packets samples/sample.mkv
