#!/usr/bin/env bash
# Builds hoxcm and runs the whole test suite with ctest. On a fresh Debian 12
# machine it first installs the Debian packages it needs.
#   scripts/run-tests.sh            the default preset (release with debug info)
#   scripts/run-tests.sh asan       the same suite under AddressSanitizer + UBSan
#   scripts/run-tests.sh tsan       the test programs that run threads, under
#                                   ThreadSanitizer (the preset names them)
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
cd "$top"
# shellcheck source=scripts/deps.sh
source scripts/deps.sh
hoxcm_install_deps

preset=${1:-default}
jobs=$(nproc)
launcher=()
command -v ccache >/dev/null && launcher=(-DCMAKE_CXX_COMPILER_LAUNCHER=ccache -DCMAKE_C_COMPILER_LAUNCHER=ccache)
cmake --preset "$preset" "${launcher[@]}"
cmake --build --preset "$preset" -j "$jobs"
ctest --preset "$preset" -j "$jobs"
