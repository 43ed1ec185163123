#!/usr/bin/env bash
# The plug-in exports exactly one symbol, `interfaces`.
#   check_exports.sh NM PLUGIN
set -uo pipefail
nm_tool=$1 plugin=$2
symbols=$("$nm_tool" -D --defined-only "$plugin" | awk '{print $NF}') || { echo "FAIL: $nm_tool could not read $plugin"; exit 1; }
[[ "$symbols" == "interfaces" ]] || { echo "FAIL: $plugin exports:"; echo "$symbols"; exit 1; }
echo "$plugin exports only interfaces"
