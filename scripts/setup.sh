#!/usr/bin/env bash
# SPDX-License-Identifier: MIT
# Installs what building and testing coffer needs on Debian 12 (run as root):
# the 32-bit toolchain, the GoogleTest sources, CMake and make, binutils
# (readelf), pkg-config for the consumer test, abigail-tools (abidw,
# abidiff) for the ABI test, and for the fuzz targets clang with its
# sanitizer and libFuzzer runtimes (i386 included). Doxygen, for the optional
# docs target, is not required. Does nothing when all are there.
set -euo pipefail
packages=(g++-multilib googletest cmake make binutils pkg-config abigail-tools clang
  libclang-rt-14-dev)
missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
if ((${#missing[@]})); then
  echo "installing: ${missing[*]}"
  apt-get update -qq
  DEBIAN_FRONTEND=noninteractive apt-get install -y -qq "${missing[@]}"
fi
