#!/bin/sh
# SPDX-License-Identifier: MIT
# Installs the build tree $2 (of the sources $1) into a temporary prefix and
# builds and runs one C program against it with pkg-config, with -lcoffer
# alone, with find_package, and against the sources with add_subdirectory.
set -eu
src=$1 build=$2 cc=$3 here=$(cd "$(dirname "$0")" && pwd) t=$(mktemp -d)
trap 'rm -rf "$t"' EXIT
cmake --install "$build" --prefix "$t/usr" >/dev/null
lib=$t/usr/lib
test -f "$t/usr/share/doc/coffer/guide.md" -a -f "$t/usr/share/doc/coffer/examples/shared_demo.c"
# Neither -rpath nor -rpath-link: libcoffer.so finds its platform library itself.
PKG_CONFIG_PATH=$lib/pkgconfig pkg-config --cflags --libs coffer >"$t/flags"
"$cc" -m32 -Wall -Werror "$here/consumer/main.c" $(cat "$t/flags") -o "$t/pc"
"$cc" -m32 -Wall -Werror -DPLAIN "$here/consumer/main.c" -I"$t/usr/include" -L"$lib" -lcoffer -o "$t/plain"
LD_LIBRARY_PATH=$lib "$t/pc"
LD_LIBRARY_PATH=$lib "$t/plain"
for way in find_package add_subdirectory; do
  arg=-DCMAKE_PREFIX_PATH=$t/usr
  [ $way = find_package ] || arg=-DCOFFER_SOURCE=$src
  cmake -S "$here/consumer" -B "$t/$way" "$arg" -DCMAKE_C_COMPILER="$cc" -DCMAKE_C_FLAGS=-m32 \
    -DCMAKE_EXE_LINKER_FLAGS=-m32 >/dev/null
  cmake --build "$t/$way" -j2 >/dev/null
  "$t/$way/consumer"
done
# A prefix of /usr installs the libraries into the i386 multiarch directory.
cmake -S "$src" -B "$t/usr-layout" -DCMAKE_INSTALL_PREFIX=/usr -DCOFFER_TESTS=OFF >/dev/null
grep -q "^CMAKE_INSTALL_LIBDIR:PATH=lib/i386-linux-gnu$" "$t/usr-layout/CMakeCache.txt"
echo "consumers: pkg-config, -lcoffer, find_package and add_subdirectory all built and ran"
