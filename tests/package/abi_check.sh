#!/bin/sh
# SPDX-License-Identifier: MIT
# Compares libcoffer.so ($2) and libcoffer-platform.so ($3) with the ABI of
# coffer 1.0.0 recorded in $1/abi (the abi-record target writes it). abidiff
# counts a member appended to a record as harmless, but these records are a
# shared-memory format and callers allocate some of them (nodes, sentinels,
# locks), so every change counts: only added symbols pass.
set -u
rc=0
for lib in "$2" "$3"; do
  echo "== $(basename "$lib")"
  abidiff --harmless --no-added-syms "$1/abi/$(basename "$lib" .so).abi" "$lib" || rc=1
done
exit $rc
