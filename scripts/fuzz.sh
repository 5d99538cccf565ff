#!/usr/bin/env bash
# SPDX-License-Identifier: MIT
# Builds every fuzz target, tests/fuzz/*_fuzz.cpp, with libFuzzer and the
# address and undefined-behaviour sanitizers, and runs each for the given
# number of seconds (default 60) from its corpus, tests/fuzz/corpus/<target>.
# The library, the test support (models, drivers, test pool) and
# coffer-inspect's reader are compiled once, instrumented, into archives
# that every target links with, so a target takes whatever it calls. Inputs
# that add coverage go to build-fuzz/corpus/<target>, leaving the committed
# corpus as it is; a crash is saved under build-fuzz/crashes and fails the
# run.
set -euo pipefail
cd "$(dirname "$0")/.."
seconds=${1:-60}
out=build-fuzz
mkdir -p "$out/obj" "$out/crashes"
flags=(-m32 -g -O1 -std=c++17 -fno-exceptions -fsanitize=address,undefined
  -fno-sanitize-recover=all -Wall -Wextra -Werror -Iinclude -I. -Itests)

# archive NAME SOURCE... : compiles the sources into $out/NAME.a when any
# source or header has changed since.
archive() {
  local name=$1 objs=() src obj
  shift
  if [[ -f $out/$name.a ]] && [[ -z $(find include platform mempool esa rbt hst hstaa roots tools tests/support \
    -newer "$out/$name.a" -name '*.[ch]*' -print -quit) ]]; then
    return
  fi
  echo "== $name"
  for src in "$@"; do
    obj=$out/obj/${src//\//_}.o
    clang++ "${flags[@]}" -fsanitize=fuzzer-no-link -c "$src" -o "$obj"
    objs+=("$obj")
  done
  rm -f "$out/$name.a"
  ar rcs "$out/$name.a" "${objs[@]}"
}
archive library platform/*.cpp mempool/*.cpp esa/*.cpp rbt/*.cpp hst/*.cpp hstaa/*.cpp roots/*.cpp
archive support tests/support/*.cpp
# coffer-inspect's reader: every command on a region image, without main.
archive reader tools/inspect/inspect.cpp

for src in tests/fuzz/*_fuzz.cpp; do
  name=$(basename "$src" .cpp)
  echo "== $name: ${seconds}s"
  clang++ "${flags[@]}" -fsanitize=fuzzer "$src" "$out/reader.a" "$out/support.a" "$out/library.a" -lpthread \
    -o "$out/$name"
  mkdir -p "$out/corpus/$name" "tests/fuzz/corpus/$name"
  status=0
  "$out/$name" -max_total_time="$seconds" -timeout=10 -rss_limit_mb=2048 -print_final_stats=1 \
    -artifact_prefix="$out/crashes/$name-" "$out/corpus/$name" "tests/fuzz/corpus/$name" \
    >"$out/$name.log" 2>&1 || status=$?
  grep -E "^#[0-9]+[[:space:]]+(INITED|DONE)|^stat::(number_of_executed_units|average_exec_per_sec)" \
    "$out/$name.log" || true
  if ((status)); then
    tail -n 40 "$out/$name.log"
    exit "$status"
  fi
done
