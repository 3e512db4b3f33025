#!/usr/bin/env bash
# The demo: builds hoxcm, creates a sandbox host (the sample host) under a
# temporary root and drives it through the real workflow with hoxcfg. On a
# fresh Debian 12 machine it first installs the Debian packages it needs.
#
#   scripts/run-demo.sh              build (preset default), demo, remove the sandbox
#   HOXCM_DEMO_KEEP=1 scripts/run-demo.sh   keep the sandbox root for a look around
#
# Nothing outside the build tree and the temporary root is touched (apart from
# installing missing packages).
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
cd "$top"
# shellcheck source=scripts/deps.sh
source scripts/deps.sh
hoxcm_install_deps

preset=default
build="$top/build/$preset"
launcher=()
command -v ccache >/dev/null && launcher=(-DCMAKE_CXX_COMPILER_LAUNCHER=ccache -DCMAKE_C_COMPILER_LAUNCHER=ccache)
echo "== Building (preset $preset)"
cmake --preset "$preset" "${launcher[@]}" >/dev/null
# The tool, the runners and the sample plugins; tests and benchmarks are not
# needed for the demo.
targets=(hoxcfg)
available=$(cmake --build "$build" --target help 2>/dev/null || true)
for t in cpp_plugin_runner hoxcm_sample_network; do
  grep -qE "^\.\.\. $t( |$)" <<<"$available" && targets+=("$t")
done
cmake --build --preset "$preset" -j "$(nproc)" --target "${targets[@]}"
hoxcfg="$build/tools/hoxcfg"

root=$(mktemp -d "${TMPDIR:-/tmp}/hoxcm-demo-XXXXXX")
if [ "${HOXCM_DEMO_KEEP:-0}" = 1 ]; then
  trap 'echo; echo "Sandbox kept at $root"' EXIT
else
  trap 'rm -rf "$root"' EXIT
fi
export HOX_ROOT="$root"

# Runs one command; exit 1 is an answer ("not compliant", "not in
# maintenance mode") and is shown, anything above ends the demo.
step() {
  echo
  echo "== $1"
  shift
  echo "\$ hoxcfg $*"
  local rc=0
  "$hoxcfg" "$@" || rc=$?
  [ "$rc" -eq 0 ] || echo "(exit $rc)"
  [ "$rc" -le 1 ] || exit "$rc"
}

step "Create a sample host under $root" init --sample

step "Export the host's configuration (sensitive values in clear: the file is private)" \
  export --output "$root/exported-host.json"
ls -l "$root/exported-host.json"
echo "--- exported document (first lines) ---"
pretty=$(python3 -m json.tool "$root/exported-host.json")
head -n 30 <<<"$pretty"
echo "... ($(wc -l <<<"$pretty") lines; the reference host:)"
grep -A 7 '"reference_host"' <<<"$pretty"

echo
echo "== The current configuration as the drift walk sees it (secrets masked; the lines holding them:)"
echo "\$ hoxcfg show current"
"$hoxcfg" show current >"$root/current.json"
grep -n '\*\*\*\*\*\*' <(python3 -m json.tool "$root/current.json")
step "Maintenance mode: the exit status answers too (0 on, 1 off)" maintenance status
step "Enter it (without a terminal to ask, --yes confirms; the change is logged to the system log)" \
  maintenance enter --yes
step "Leave it again" maintenance exit --yes

step "Is the host compliant with its own export? (exit 0: compliant)" compliance "$root/exported-host.json"

# Change a few values of the exported document and look at the drift: the
# compliance report (secrets masked) and the apply tasks it would generate.
scripts/demo-drift.sh "$hoxcfg" "$root"

# Validation and impact: findings per field, and what applying would cost.
scripts/demo-verdicts.sh "$hoxcfg" "$root"

# Plan and apply changes through the sample plugins: a plain one, one that
# needs maintenance mode, one that needs a reboot; then the apply history.
scripts/demo-apply.sh "$hoxcfg" "$root"

# A bootstrap that needs a reboot, a simulated reboot and the boot's outcome.
scripts/demo-boot.sh "$hoxcfg" "$root"

echo
echo "== The installed plugins and their dependency order (a table on a terminal, JSON in a pipe)"
echo "\$ hoxcfg plugins list | ..."
"$hoxcfg" plugins list > "$root/plugins.json"
python3 - "$root/plugins.json" <<'PY'
import json, sys
registry = json.load(open(sys.argv[1]))
for p in registry["plugins"]:
    print("%-18s v%d %-7s %-28s %s" % (p["id"], p["version"], p["type"], ",".join(p["supports"]), " ".join(p["accepts"])))
print("apply order:", " -> ".join(registry["order"]))
PY
step "Every installed manifest checked against its manifest schema" plugins check

echo
echo "== Errors say what, where and what to do"
printf '{\n  "profile": {\n    "network": {"dns": {"config": {"servers": ["10.0.0.1",]}}}\n  }\n}\n' > "$root/broken.json"
for args in "compliance $root/broken.json" "compliance $root/missing.json" "--root $root/nohost drift $root/exported-host.json" \
            "complaince $root/exported-host.json"; do
  echo "\$ hoxcfg $args"
  # shellcheck disable=SC2086
  "$hoxcfg" $args 2>&1 || echo "(exit $?)"
done

# Read, set and delete single items through the host API; a change staged
# for the next boot refuses further changes until the boot-time run.
scripts/demo-item.sh "$hoxcfg" "$root"
