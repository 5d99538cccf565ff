#!/usr/bin/env bash
# SPDX-License-Identifier: MIT
# Installs what is missing, builds coffer and runs the whole test suite twice:
# optimised, then (after each fuzz target has run briefly from its corpus)
# under AddressSanitizer and UndefinedBehaviorSanitizer with the library
# checking its own invariants after every change. Warnings are errors here.
# The optimised run also builds consumers against an installed copy and
# compares the ABI with the recorded one.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/setup.sh
jobs=$(nproc)
run() {
  local dir=$1
  shift
  echo "== $dir"
  cmake -S . -B "$dir" -DCOFFER_WERROR=ON "$@" >/dev/null
  cmake --build "$dir" -j"$jobs" >/dev/null
  ctest --test-dir "$dir" --output-on-failure -j"$jobs"
}
run build-release -DCMAKE_BUILD_TYPE=Release -DCOFFER_PACKAGING_TESTS=ON
scripts/fuzz.sh 5
run build-sanitize -DCMAKE_BUILD_TYPE=Debug -DCOFFER_SANITIZE=ON -DCOFFER_CHECKS=ON
