#!/usr/bin/env bash
# Runs clang-tidy (the checks of .clang-tidy, warnings as errors) on every
# C++ source of the library, the tools, the runners and the sample plugins,
# with the compile commands of the default preset (configured if needed).
# Exits non-zero on any warning.
#   scripts/tidy.sh [FILE...]    only these files
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
cd "$top"
# shellcheck source=scripts/deps.sh
source scripts/deps.sh
hoxcm_install_deps

[ -f build/default/compile_commands.json ] || cmake --preset default >/dev/null
if [ $# -gt 0 ]; then
  files=("$@")
else
  mapfile -t files < <(git ls-files 'src/*.cc' 'tools/*.cc' 'runners/*.cc' 'sdk/*.cc')
fi
# The file list goes in as one anchored alternation of absolute paths.
regex=$(printf '%s\n' "${files[@]}" | sed "s|^|$top/|; s|[.]|[.]|g" | paste -sd'|')
log=$(mktemp)
trap 'rm -f "$log"' EXIT
status=0
run-clang-tidy-14 -p build/default -quiet -j "$(nproc)" "^($regex)\$" >"$log" 2>&1 || status=$?
# Only the findings: not the counts of warnings suppressed in system headers.
grep -v -e '^[0-9]* warnings\? generated' -e '^Suppressed [0-9]* warnings' -e '^Use -header-filter' \
  -e '^clang-tidy-14 ' -e '^Running clang-tidy' -e '^$' "$log" || true
[ "$status" -eq 0 ] && echo "clang-tidy: no warning in ${#files[@]} files"
exit "$status"
