#!/usr/bin/env bash
# Builds the libFuzzer targets (preset "fuzz": clang 14 with AddressSanitizer
# and UndefinedBehaviorSanitizer) and runs them over their seed corpora.
#   scripts/fuzz.sh                  every target, 30 seconds each
#   scripts/fuzz.sh TARGET [SECONDS] one target (document, drift, manifest,
#                                    plugin_exchange, schema)
#   scripts/fuzz.sh all SECONDS      every target, SECONDS each
# The seed corpora in fuzz/corpus/ are only read; inputs the fuzzer
# finds go to build/fuzz/corpus/TARGET, crashing inputs to
# build/fuzz/findings/TARGET. Exits non-zero on the first finding.
# HOX_FUZZ_SEED=N fixes libFuzzer's seed (CI does, so that a red run is
# reproducible with the same command); unset or 0, each run draws its own.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
cd "$top"
# shellcheck source=scripts/deps.sh
source scripts/deps.sh
hoxcm_install_deps

targets=(document drift manifest plugin_exchange schema)
which=${1:-all}
seconds=${2:-30}
if [ "$which" != all ]; then
  case " ${targets[*]} " in
    *" $which "*) targets=("$which") ;;
    *) echo "fuzz.sh: unknown target '$which' (${targets[*]})" >&2; exit 2 ;;
  esac
fi

launcher=()
command -v ccache >/dev/null && launcher=(-DCMAKE_CXX_COMPILER_LAUNCHER=ccache -DCMAKE_C_COMPILER_LAUNCHER=ccache)
cmake --preset fuzz "${launcher[@]}" >/dev/null
cmake --build --preset fuzz -j "$(nproc)" --target "${targets[@]/#/fuzz_}"

out=build/fuzz
for target in "${targets[@]}"; do
  mkdir -p "$out/corpus/$target" "$out/findings/$target"
  log="$out/findings/$target/last-run.log"
  echo "fuzz_$target: ${seconds}s"
  # -rss_limit_mb: a reader that ignores its bound shows as a finding, not
  # as a machine out of memory. -timeout: one input must not take seconds.
  if ! "$out/fuzz/fuzz_$target" "$out/corpus/$target" "fuzz/corpus/$target" \
      -max_total_time="$seconds" -seed="${HOX_FUZZ_SEED:-0}" -rss_limit_mb=2048 -timeout=10 -print_final_stats=1 \
      -artifact_prefix="$out/findings/$target/" >"$log" 2>&1; then
    tail -n 40 "$log" >&2
    echo "fuzz_$target: FINDING (input and log in $out/findings/$target/)" >&2
    exit 1
  fi
  runs=$(sed -n 's/^stat::number_of_executed_units: *//p' "$log")
  rate=$(sed -n 's/^stat::average_exec_per_sec: *//p' "$log")
  echo "fuzz_$target: ${runs:-?} executions, ${rate:-?} exec/s, no finding"
done
