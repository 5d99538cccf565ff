#!/bin/sh
# SPDX-License-Identifier: MIT
# Counts the exported calls (every global of coffer.map and platform.map)
# whose declaration in include/coffer/ has no complete comment block right
# above it: /** ... */ with @param for each argument, @return unless the call
# returns void, and the headings @par Ownership, @par Failure and @par Panic;
# or a block that copies a complete one with @copydoc. $1: the source tree.
set -eu
cd "$1"
awk '
  FNR == 1 { inmap = FILENAME ~ /\.map$/; global = 0 }
  inmap {
    gsub(/\/\*.*\*\//, ""); if (/\/\*/) skip = 1; if (skip) { if (/\*\//) skip = 0; next }
    if (/global:/) global = 1; if (/local:|}/) global = 0
    if (global) for (i = 1; i <= NF; i++) if ($i ~ /^[A-Za-z_][A-Za-z0-9_]*;$/) want[substr($i, 1, length($i) - 1)] = 1
    next
  }
  /^ *\/\*\*/ { block = ""; inblock = 1 }
  inblock { block = block " " $0; if (/\*\//) { inblock = 0; end = FNR }; next }
  !/^#/ && /COFFER_(PLATFORM_)?API [^(]*\(/ { decl = ""; start = FNR; indecl = 1 }
  indecl {
    decl = decl " " $0; if (decl !~ /;/) next
    indecl = 0; ok = start == end + 1
    match(decl, /[A-Za-z_0-9]+\(/); name = substr(decl, RSTART, RLENGTH - 1)
    head = substr(decl, 1, RSTART - 1); rest = substr(decl, RSTART + RLENGTH)
    args = substr(rest, 1, index(rest, ")") - 1)
    if (ok && block !~ /@copydoc/) {
      ok = block ~ /@par Ownership/ && block ~ /@par Failure/ && block ~ /@par Panic/
      if (head !~ /API void $/ && block !~ /@return/) ok = 0
      n = split(args, arg, ","); if (args ~ /^ *void *$/) n = 0
      for (i = 1; i <= n; i++) {
        if (arg[i] ~ /\.\.\./) continue
        sub(/[^A-Za-z_0-9]*$/, "", arg[i]); match(arg[i], /[A-Za-z_0-9]+$/)
        if (block !~ ("@param(\\[(in|out|in,out)\\])? " substr(arg[i], RSTART, RLENGTH) " ")) ok = 0
      }
    }
    if (ok) documented[name] = 1
  }
  END {
    for (name in want) if (!(name in documented)) { print "undocumented: " name; missing++ }
    printf "%d missing of %d exported calls\n", missing, length(want)
    exit missing > 0
  }
' coffer.map platform/platform.map include/coffer/*.h
