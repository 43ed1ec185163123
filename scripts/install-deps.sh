#!/usr/bin/env bash
# Installs what building and testing kelvane needs on a Debian machine (as root).
# Usage: install-deps.sh [build|test]   (build: native toolchain only; test: everything)
set -euo pipefail

what=${1:-test}
packages=(cmake make g++ googletest libgtest-dev libgmock-dev)
if [[ $what == test ]]; then
  packages+=(g++-arm-linux-gnueabihf qemu-user clang libclang-rt-14-dev libbenchmark-dev ffmpeg)
fi

missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
if ((${#missing[@]})); then
  echo "installing: ${missing[*]}"
  export DEBIAN_FRONTEND=noninteractive
  apt-get update -qq
  apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
fi
