#!/bin/sh
# Builds the drift benchmarks in release mode and prints their ratios:
# walk / parse at the medium scale, wide keys, peak memory of a compliance
# check. Usage: bench/drift_ratios.sh [scale]   (default 200: ~20 MB documents)
set -eu
here=$(cd "$(dirname "$0")/.." && pwd)
build=${BUILD_DIR:-$here/build/drift-release}
scale=${1:-200}
cmake -S "$here" -B "$build" -DCMAKE_BUILD_TYPE=Release -DHOXCM_BUILD_TESTS=OFF -DHOXCM_BUILD_TOOLS=OFF \
  -DHOXCM_BUILD_SAMPLES=OFF -DHOXCM_BUILD_BENCHMARKS=ON >/dev/null
cmake --build "$build" -j2 --target drift_bench drift_memory >/dev/null
"$build/bench/drift_bench" --scale="$scale" --benchmark_filter="${BENCH_FILTER:-.}" \
  --benchmark_repetitions=3 --benchmark_report_aggregates_only=true
"$build/bench/drift_memory" "$scale"
