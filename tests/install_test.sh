#!/bin/sh
# Installs the build into a temporary prefix, then builds and runs a small
# consumer against it: once with pkg-config, once with find_package.
# Usage: install_test.sh <build dir> <consumer source dir> [extra compiler flags]
set -eu
build=$1
consumer=$2
flags=${3:-}
prefix=$(mktemp -d /tmp/korvsnmp-install-XXXXXX)
trap 'rm -rf "$prefix"' EXIT

cmake --install "$build" --prefix "$prefix" >/dev/null
pcdir=$(dirname "$(find "$prefix" -name korvsnmp.pc)")
libdir=$(dirname "$pcdir")
test -L "$libdir/libkorvsnmp.so.1" || { echo "no SONAME link libkorvsnmp.so.1"; exit 1; }

echo "== pkg-config"
# shellcheck disable=SC2046
g++ -std=c++17 $flags "$consumer/main.cpp" -o "$prefix/consumer-pc" \
    $(PKG_CONFIG_PATH="$pcdir" pkg-config --cflags --libs korvsnmp) -Wl,-rpath,"$libdir"
"$prefix/consumer-pc"

echo "== find_package"
cmake -S "$consumer" -B "$prefix/consumer-build" -DCMAKE_PREFIX_PATH="$prefix" \
    -DCMAKE_CXX_FLAGS="$flags" -DCMAKE_EXE_LINKER_FLAGS="$flags" \
    -DCMAKE_BUILD_RPATH="$libdir" >/dev/null
cmake --build "$prefix/consumer-build" >/dev/null
"$prefix/consumer-build/consumer"
