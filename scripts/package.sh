#!/usr/bin/env bash
# Builds the Debian packages hoxcm and hoxcm-dev with CPack into
# build/package/ (docs/packaging.md). On a fresh Debian 12 machine it first
# installs the Debian packages it needs.
#   scripts/package.sh           build the packages
#   scripts/package.sh --check   build them, then install, upgrade and remove
#                                them in a throwaway root, build and run a
#                                client and a plugin against them, and run lintian
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
cd "$top"
# shellcheck source=scripts/deps.sh
source scripts/deps.sh
# dpkg-shlibdeps computes Depends; CPack finds the programs with file(1).
HOXCM_DEBIAN_PACKAGES+=(dpkg-dev file fakeroot lintian)
hoxcm_install_deps

check=false
[ "${1:-}" = --check ] && check=true
out=build/package
launcher=()
command -v ccache >/dev/null && launcher=(-DCMAKE_CXX_COMPILER_LAUNCHER=ccache -DCMAKE_C_COMPILER_LAUNCHER=ccache)
# The same compiler flags as the default preset, so that ccache serves a
# machine that has built the tests already.
cmake -S . -B "$out" -DCMAKE_BUILD_TYPE=RelWithDebInfo -DCMAKE_INSTALL_PREFIX=/usr -DCMAKE_SKIP_INSTALL_RPATH=ON \
      -DHOXCM_BUILD_TESTS=OFF -DHOXCM_BUILD_BENCHMARKS=OFF -DHOXCM_BUILD_FUZZERS=OFF -DHOXCM_FAILPOINTS=OFF \
      "${launcher[@]}" >/dev/null
cmake --build "$out" -j "$(nproc)"
rm -f "$out"/*.deb
(cd "$out" && cpack -G DEB >/dev/null)
ls "$out"/*.deb
if $check; then
  tests/package/check-package.sh "$top" "$out"
fi
