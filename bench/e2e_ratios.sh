#!/bin/bash
# Whole processes on generated hosts: for each size, a sandbox seeded with
# the host document (hoxcfg init --from), then, run after run and
# interleaved so that they share the machine's load:
#   parse    the library's parse of both documents alone (bench/parse_documents)
#   comply   hoxcfg compliance --json DESIRED (read the desired file, extract
#            the host from SQLite, load the schemas, walk, write the report)
#   export   hoxcfg export
# It prints the median wall and CPU (user + system) time and the peak
# resident memory of each, the ratios of compliance to the parse, and where
# one compliance check spends its time (bench/compliance_phases). Then the
# wall time of hoxcfg compliance on the sample host.
#
# Usage: bench/e2e_ratios.sh [RUNS] [REPLICAS...]
#   RUNS      runs of each process per size (default 5)
#   REPLICAS  copies of the sample host's keys, 100 instances per
#             multi-instance key (default 260 1300: about 20 MB and 100 MB
#             per document)
# BUILD_DIR chooses the build tree (default build/e2e-release), WORK_DIR the
# scratch directory (default a new one under /tmp, removed at the end).
set -euo pipefail
here=$(cd "$(dirname "$0")/.." && pwd)
build=${BUILD_DIR:-$here/build/e2e-release}
runs=${1:-5}
shift || true
sizes=("$@")
[ ${#sizes[@]} -gt 0 ] || sizes=(260 1300)
timer=/usr/bin/time
[ -x "$timer" ] || { echo "e2e_ratios.sh: $timer is missing (Debian package 'time')" >&2; exit 2; }

cmake -S "$here" -B "$build" -DCMAKE_BUILD_TYPE=Release -DHOXCM_BUILD_TESTS=OFF -DHOXCM_BUILD_SAMPLES=OFF \
  -DHOXCM_BUILD_BENCHMARKS=ON >/dev/null
if ! cmake --build "$build" -j2 --target hoxcfg host_generate parse_documents compliance_phases \
  >"${TMPDIR:-/tmp}/hoxcm-e2e-build.log" 2>&1; then
  cat "${TMPDIR:-/tmp}/hoxcm-e2e-build.log" >&2
  exit 2
fi
hoxcfg=$build/tools/hoxcfg

work=${WORK_DIR:-}
if [ -z "$work" ]; then
  work=$(mktemp -d /tmp/hoxcm-e2e.XXXXXX)
  trap 'rm -rf "$work"' EXIT
fi
export HOX_LOG_LEVEL=-1

# Runs "$@" under the timer; appends "wall cpu peak_kb" to the file $out.
measure() {
  local out=$1
  shift
  "$timer" -f "%e %U %S %M" -o "$work/time" "$@" >/dev/null 2>"$work/stderr" || {
    local rc=$?
    # compliance answers 1 when the host differs: that is its normal answer.
    if [ "$rc" -ne 1 ]; then
      echo "e2e_ratios.sh: '$*' failed ($rc):" >&2
      cat "$work/stderr" >&2
      exit 2
    fi
  }
  tail -n 1 "$work/time" | awk '{printf "%s %.3f %s\n", $1, $2 + $3, $4}' >>"$out"
}

# "median min max" of column $2 of file $1.
stats() { sort -n -k"$2" "$1" | awk -v c="$2" '{v[NR]=$c} END {printf "%s %s %s\n", v[int((NR+1)/2)], v[1], v[NR]}'; }

row() {
  local name=$1 file=$2
  read -r wall wmin wmax < <(stats "$file" 1)
  read -r cpu cmin cmax < <(stats "$file" 2)
  read -r peak _ _ < <(stats "$file" 3)
  printf "  %-7s wall %6.2f s (%.2f-%.2f)   cpu %6.2f s (%.2f-%.2f)   peak %7.1f MB\n" \
    "$name" "$wall" "$wmin" "$wmax" "$cpu" "$cmin" "$cmax" "$(calc "$peak / 1024")"
}

median() { read -r m _ _ < <(stats "$1" "$2"); echo "$m"; }
calc() { awk "BEGIN {printf \"%.2f\", $1}"; }

for replicas in "${sizes[@]}"; do
  data=$work/docs-$replicas
  root=$work/root-$replicas
  mkdir -p "$data"
  "$build/bench/host_generate" "$data" "$replicas" 100 >"$work/sizes"
  keys=$(find "$data/schemas" -name '*.json' | wc -l)
  echo "== $replicas replicas: $(tr '\n' ' ' <"$work/sizes")($keys keys)"
  rm -rf "$root"
  : >"$work/init"
  measure "$work/init" "$hoxcfg" init --root "$root" --from "$data/host.json" --schemas "$data/schemas"
  read -r iwall icpu ipeak <"$work/init"
  printf "  init --from: wall %.2f s, cpu %.2f s, peak %.1f MB\n" "$iwall" "$icpu" "$(calc "$ipeak / 1024")"
  : >"$work/parse"
  : >"$work/comply"
  : >"$work/export"
  for _ in $(seq "$runs"); do
    measure "$work/parse" "$build/bench/parse_documents" "$data/host.json" "$data/desired.json"
    measure "$work/comply" "$hoxcfg" compliance --root "$root" --json "$data/desired.json"
    measure "$work/export" "$hoxcfg" export --root "$root"
  done
  row parse "$work/parse"
  row comply "$work/comply"
  row export "$work/export"
  echo "  compliance / parse: wall $(calc "$(median "$work/comply" 1) / $(median "$work/parse" 1)")," \
    "cpu $(calc "$(median "$work/comply" 2) / $(median "$work/parse" 2)")," \
    "peak memory $(calc "$(median "$work/comply" 3) / $(median "$work/parse" 3)")"
  echo "  one compliance check, phase by phase:"
  HOX_ROOT=$root "$build/bench/compliance_phases" "$data/desired.json"
  rm -rf "$root" "$data"
done

sample=$work/sample
"$hoxcfg" init --root "$sample" --sample >/dev/null
# GNU time counts in hundredths of a second: the sample host is timed with
# the clock in nanoseconds.
: >"$work/sample-runs"
for _ in $(seq $((runs * 4))); do
  start=$(date +%s%N)
  rc=0
  "$hoxcfg" compliance --root "$sample" --json "$here/data/sample-host/user-config.json" >/dev/null 2>&1 || rc=$?
  [ "$rc" -le 1 ] || { echo "e2e_ratios.sh: compliance on the sample host failed ($rc)" >&2; exit 2; }
  echo "$(( ($(date +%s%N) - start) / 1000 ))" >>"$work/sample-runs"
done
read -r swall swmin swmax < <(stats "$work/sample-runs" 1)
echo "== sample host: hoxcfg compliance wall $(calc "$swall / 1000") ms" \
  "($(calc "$swmin / 1000")-$(calc "$swmax / 1000") ms over $((runs * 4)) runs)"
