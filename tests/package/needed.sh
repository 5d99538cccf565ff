#!/bin/sh
# SPDX-License-Identifier: MIT
# libcoffer.so ($1) may need the C library and the platform library only,
# plus the libraries matched by the extended regular expression $2.
set -eu
needed=$(readelf -d "$1" | sed -n 's/.*(NEEDED).*\[\(.*\)\]$/\1/p')
echo "$needed"
extra=$(echo "$needed" | grep -Ev "^(libc\.so\.6|libcoffer-platform\.so\.1|ld-linux\.so\.2)\$${2:+|^($2)\$}" || true)
[ -z "$extra" ] || { echo "needs more than libc and the platform library: $extra"; exit 1; }
