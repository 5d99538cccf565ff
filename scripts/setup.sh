#!/usr/bin/env bash
# Installs what building and testing coffer needs on Debian 12 (run as root):
# the 32-bit toolchain, the GoogleTest sources, CMake and make, binutils
# (readelf), pkg-config for the consumer test and abigail-tools (abidw,
# abidiff) for the ABI test. Doxygen, for the optional docs target, is not
# required. Does nothing when all are there.
set -euo pipefail
packages=(g++-multilib googletest cmake make binutils pkg-config abigail-tools)
missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
if ((${#missing[@]})); then
  echo "installing: ${missing[*]}"
  apt-get update -qq
  DEBIAN_FRONTEND=noninteractive apt-get install -y -qq "${missing[@]}"
fi
