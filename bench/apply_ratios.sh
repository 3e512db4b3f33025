#!/bin/sh
# Builds the apply benchmark in release mode and prints the library's own
# cost of applying 10,000 changed objects over 10 plugins whose runner does
# nothing: (Apply - the 10 bare runner processes) / CheckApply of the same
# document, against the aim 2.0. The ratio comes from the interleaved
# benchmark (CheckApply, Apply and the bare runners timed in every
# iteration, so that all three see the same load); the CPU ratio of the
# calling thread is printed beside it, steadier on a shared machine.
# Usage: bench/apply_ratios.sh [repetitions]   (default 5)
set -eu
here=$(cd "$(dirname "$0")/.." && pwd)
build=${BUILD_DIR:-$here/build/apply-release}
repetitions=${1:-5}
cmake -S "$here" -B "$build" -DCMAKE_BUILD_TYPE=Release -DHOXCM_BUILD_TESTS=OFF -DHOXCM_BUILD_TOOLS=OFF \
  -DHOXCM_BUILD_SAMPLES=OFF -DHOXCM_BUILD_BENCHMARKS=ON >/dev/null
cmake --build "$build" -j2 --target apply_bench >/dev/null
"$build/bench/apply_bench" --benchmark_filter="${BENCH_FILTER:-BM_ApplyAgainstCheckApply}" \
  --benchmark_repetitions="$repetitions" --benchmark_color=false
