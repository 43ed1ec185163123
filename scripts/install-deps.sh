#!/usr/bin/env bash
# Installs what building and testing kelvane needs on a Debian machine (as root).
# Usage: install-deps.sh [build|test]   (build: native toolchain only; test: everything)
set -euo pipefail

what=${1:-test}
packages=(cmake make g++ googletest libgtest-dev libgmock-dev zlib1g-dev)
if [[ $what == test ]]; then
  # mkvtoolnix: mkvextract's attachments, chapters and timestamps, against which extract's are checked.
  # python3: the tool checks read the JSON documents with it.
  packages+=(g++-arm-linux-gnueabihf qemu-user clang libclang-rt-14-dev libbenchmark-dev ffmpeg mkvtoolnix python3)
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

# The 32-bit ARM build links zlib statically from Debian's armhf zlib1g-dev,
# unpacked into its own directory (cmake/toolchain-armhf.cmake looks there):
# no armhf architecture is added to the system, so later updates stay as they were.
armhf_zlib=/opt/kelvane-armhf-zlib
if [[ $what == test && ! -e $armhf_zlib/usr/lib/arm-linux-gnueabihf/libz.a ]]; then
  echo "unpacking zlib1g-dev:armhf into $armhf_zlib"
  download=$(mktemp -d)
  chmod 755 "$download"  # apt fetches as its own user
  # Another architecture's index may be caught mid-sync on the mirror: zlib comes from the main archive.
  apt-get -qq -o APT::Architectures::=armhf update >/dev/null 2>&1 || true
  (cd "$download" && apt-get -qq -o APT::Architectures::=armhf download zlib1g-dev:armhf)
  dpkg-deb -x "$download"/zlib1g-dev_*_armhf.deb "$armhf_zlib"
  rm -rf "$download"
  apt-get update -qq
fi
