#!/usr/bin/env bash
# SPDX-License-Identifier: MIT
# Installs what is missing, builds coffer and runs the demo.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/setup.sh
cmake -S . -B build -DCMAKE_BUILD_TYPE=Release -DCOFFER_TESTS=OFF >/dev/null
cmake --build build -j"$(nproc)" >/dev/null
exec ./build/examples/shared_demo
