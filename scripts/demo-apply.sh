#!/usr/bin/env bash
# The apply part of the demo: plans and applies changes to the sandbox host
# through the sample plugins (which write files below the root), then a
# change that needs maintenance mode, one that needs a reboot, and the apply
# history.
#
#   scripts/demo-apply.sh HOXCFG ROOT      (ROOT: a host root made by hoxcfg init --sample)
set -euo pipefail
hoxcfg=$1
export HOX_ROOT=$2

# shellcheck source=scripts/demo-show.sh
source "$(dirname "$0")/demo-show.sh"

# change DOCUMENT OUTPUT PYTHON: writes OUTPUT, the export DOCUMENT changed by
# the Python statements (p is the profile, h this host's own section).
change() {
  python3 - "$1" "$2" "$3" <<'PY'
import json, sys
source, target, code = sys.argv[1:]
with open(source) as f:
    doc = json.load(f)
p = doc["profile"]
h = doc["hostSpecific"][doc["metadata"]["reference_host"]["uuid"]]
exec(code)
with open(target, "w") as f:
    json.dump(doc, f)
PY
}

base="$HOX_ROOT/demo-base.json"
"$hoxcfg" export --output "$base"
change "$base" "$HOX_ROOT/demo-rename.json" '
h["system"]["identity"]["hostname"]["hostname"] = "hox-host-07"
p["network"]["dns"]["config"]["servers"] = ["10.20.0.53", "10.20.0.54"]'
change "$HOX_ROOT/demo-rename.json" "$HOX_ROOT/demo-firewall.json" '
p["network"]["firewall"]["rules"].append({"name": "https-in", "action": "allow", "protocol": "tcp", "port": 443})'
change "$HOX_ROOT/demo-firewall.json" "$HOX_ROOT/demo-hugepages.json" '
p["system"]["kernel"]["boot_options"]["hugepages"] = 4096'

show "What applying a new host name and DNS servers would do (exit 1: there is drift)" plan "$HOX_ROOT/demo-rename.json"
show "Apply it (--yes: there is no terminal to ask)" apply --yes "$HOX_ROOT/demo-rename.json"
echo "--- files the plugins wrote below the root:"
cat "$HOX_ROOT/etc/hostname" "$HOX_ROOT/etc/resolv.conf"
show "The host now complies with the document" compliance "$HOX_ROOT/demo-rename.json"

show "A firewall rule more needs maintenance mode: refused (exit 2)" apply --yes "$HOX_ROOT/demo-firewall.json"
show "Enter maintenance mode" maintenance enter --yes
show "Applied in maintenance mode, as a daemon sees it (--json: one event per line)" \
  apply --yes --json "$HOX_ROOT/demo-firewall.json"
show "Leave maintenance mode" maintenance exit --yes

show "More huge pages need a reboot: the plan says why" plan "$HOX_ROOT/demo-hugepages.json"
show "Applying stages the document for the next boot (exit 3); nothing runs now" \
  apply --yes "$HOX_ROOT/demo-hugepages.json"
echo "--- the staged document holds the new value:"
"$hoxcfg" show desired | grep hugepages

echo
echo "== Every apply is in the host's apply history (a table on a terminal, JSON in a pipe)"
echo "\$ hoxcfg history | ..."
"$hoxcfg" history | python3 -c '
import json, sys, time
for r in json.load(sys.stdin)["records"]:
    verdict = ("none", "maintenance mode", "reboot")[r["verdict"]["impact"]] if "verdict" in r else "-"
    error = r.get("exception", {}).get("text", "") or r.get("error", {}).get("id", "")
    print("#%-3d %s  %-8s verdict %-16s runs %d  %s %s" % (r["sequence"], time.strftime("%H:%M:%S", time.gmtime(r["startedAt"])),
          r["outcome"], verdict, len(r["runs"]), r["document"][:19], error))
'
