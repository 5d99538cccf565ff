#!/bin/sh
# SPDX-License-Identifier: MIT
# libcoffer.so ($1) exports exactly the calls its version script ($2) lists,
# carries its SONAME, and leaves the platform calls to the dynamic linker
# (unbound, and no DT_SYMBOLIC), so a program can interpose its own.
set -eu
nm -D --defined-only "$1" | awk '$2 != "A" {sub(/@.*/, "", $3); print $3}' | sort >exported.txt
sed '/\/\*/,/\*\//d; /}/d' "$2" | grep -o '[A-Za-z0-9_]\+;' | tr -d ';' | sort -u >listed.txt
diff listed.txt exported.txt
for call in Panic Tandel_AcquireExclLock Tandel_ReleaseExclLock; do
  nm -D --undefined-only "$1" | grep -q " $call@" || { echo "$call is not left to the dynamic linker"; exit 1; }
done
readelf -d "$1" | grep -q 'SONAME.*\[libcoffer\.so\.1\]'
! readelf -d "$1" | grep -q SYMBOLIC
