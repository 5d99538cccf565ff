#!/usr/bin/env bash
# Builds every fuzz target, tests/fuzz/*_fuzz.cpp, with libFuzzer and the
# address and undefined-behaviour sanitizers, and runs each for the given
# number of seconds (default 60) from its corpus, tests/fuzz/corpus/<target>.
# The library is compiled once, instrumented, into an archive each target
# links with, so a target takes whatever library code it calls. Inputs that
# add coverage go to build-fuzz/corpus/<target>, leaving the committed
# corpus as it is; a crash is saved under build-fuzz/crashes and fails the run.
set -euo pipefail
cd "$(dirname "$0")/.."
seconds=${1:-60}
out=build-fuzz
mkdir -p "$out/obj" "$out/crashes"
flags=(-m32 -g -O1 -std=c++17 -fno-exceptions -fsanitize=address,undefined
  -fno-sanitize-recover=all -Wall -Wextra -Werror -Iinclude -I.)

library=(platform/*.cpp mempool/*.cpp esa/*.cpp rbt/*.cpp hst/*.cpp hstaa/*.cpp)
archive=$out/libcoffer-fuzz.a
if [[ ! -f $archive ]] || [[ -n $(find include platform mempool esa rbt hst hstaa -newer "$archive" \
  -name '*.[ch]*' -print -quit) ]]; then
  echo "== library"
  objs=()
  for src in "${library[@]}"; do
    obj=$out/obj/${src//\//_}.o
    clang++ "${flags[@]}" -fsanitize=fuzzer-no-link -c "$src" -o "$obj"
    objs+=("$obj")
  done
  rm -f "$archive"
  ar rcs "$archive" "${objs[@]}"
fi

for src in tests/fuzz/*_fuzz.cpp; do
  name=$(basename "$src" .cpp)
  echo "== $name: ${seconds}s"
  clang++ "${flags[@]}" -fsanitize=fuzzer "$src" "$archive" -lpthread -o "$out/$name"
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
