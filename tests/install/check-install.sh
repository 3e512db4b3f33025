#!/usr/bin/env bash
# Installs the built library into a temporary prefix and builds a client
# against it twice: with find_package(hoxcm) and with pkg-config.
set -euo pipefail
build=$1
source_dir=$2
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
cmake --install "$build" --prefix "$work/prefix" >/dev/null
cmake -S "$source_dir/cmake/consumer" -B "$work/consumer" -DCMAKE_PREFIX_PATH="$work/prefix" \
      -DCMAKE_CXX_FLAGS="${CXXFLAGS:-}" -DCMAKE_EXE_LINKER_FLAGS="${LDFLAGS:-}" >/dev/null
cmake --build "$work/consumer" >/dev/null
LD_LIBRARY_PATH="$work/prefix/lib:$work/prefix/lib/x86_64-linux-gnu" "$work/consumer/consumer"
libdir=$(dirname "$(find "$work/prefix" -name hoxcm.pc | head -1)")
export PKG_CONFIG_PATH="$libdir"
# shellcheck disable=SC2046
g++ -std=c++17 ${CXXFLAGS:-} "$source_dir/cmake/consumer/main.cc" -o "$work/consumer-pc" \
    $(pkg-config --cflags --libs hoxcm) ${LDFLAGS:-}
LD_LIBRARY_PATH="$libdir/.." "$work/consumer-pc"
