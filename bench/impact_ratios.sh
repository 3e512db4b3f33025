#!/bin/sh
# Builds the drift benchmarks in release mode and prints the two ratios of
# the verdicts on the generated pair (about 20 MB per document at the default
# scale): Impact without plugin runs / the compliance walk, and validation
# against the host document schema / parsing the document.
# Usage: bench/impact_ratios.sh [scale] [repetitions]   (defaults 200, 3)
set -eu
here=$(cd "$(dirname "$0")/.." && pwd)
build=${BUILD_DIR:-$here/build/drift-release}
scale=${1:-200}
repetitions=${2:-3}
cmake -S "$here" -B "$build" -DCMAKE_BUILD_TYPE=Release -DHOXCM_BUILD_TESTS=OFF -DHOXCM_BUILD_TOOLS=OFF \
  -DHOXCM_BUILD_SAMPLES=OFF -DHOXCM_BUILD_BENCHMARKS=ON >/dev/null
cmake --build "$build" -j2 --target drift_bench >/dev/null
"$build/bench/drift_bench" --scale="$scale" \
  --benchmark_filter='BM_ParseDesired|BM_DriftCompliance|BM_Impact|BM_Validate' \
  --benchmark_repetitions="$repetitions" --benchmark_report_aggregates_only=true
