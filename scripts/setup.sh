#!/usr/bin/env bash
# Installs what building coffer needs on Debian 12 (run as root): the 32-bit
# toolchain, the GoogleTest sources, CMake and make. Does nothing when all are there.
set -euo pipefail
packages=(g++-multilib googletest cmake make binutils)
missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
if ((${#missing[@]})); then
  echo "installing: ${missing[*]}"
  apt-get update -qq
  DEBIAN_FRONTEND=noninteractive apt-get install -y -qq "${missing[@]}"
fi
