#!/usr/bin/env bash
# Installs the built library into a temporary prefix and builds a client
# against it twice: with find_package(hoxcm) and with pkg-config; then sets up
# a host with the installed hoxcfg.
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
# The installed hoxcfg sets up a host from the installation it is part of,
# wherever that was installed.
libdirs="$work/prefix/lib:$work/prefix/lib/x86_64-linux-gnu"
report=$(LD_LIBRARY_PATH="$libdirs" "$work/prefix/bin/hoxcfg" --root "$work/host" init --sample)
for part in "from the installation" "installed cpp_plugin_runner" "installed py_plugin_runner" \
            "installed manifest schemas" "C++ plugin libraries"; do
  grep -qF "$part" <<<"$report" || { echo "hoxcfg init from the installation: no '$part' in: $report" >&2; exit 1; }
done
[ -x "$work/host/usr/lib/tarvik/configmanager/apply_modules/network/libnetwork.so" ]
