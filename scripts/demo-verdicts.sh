#!/usr/bin/env bash
# The verdicts part of the demo: validation of a faulty document (a schema
# error and plugin findings) and the impact of two changes, one that needs
# maintenance mode and one that needs a reboot, with the reasons.
#
#   scripts/demo-verdicts.sh HOXCFG ROOT   (ROOT: a host root made by hoxcfg init --sample)
set -euo pipefail
hoxcfg=$1
export HOX_ROOT=$2

# shellcheck source=scripts/demo-show.sh
source "$(dirname "$0")/demo-show.sh"

# Writes the host's export, changed by the Python statements given, to FILE.
changed() {
  local file=$1 change=$2
  "$hoxcfg" export --output "$file"
  python3 - "$file" "$change" <<'PY'
import json, sys
path, change = sys.argv[1], sys.argv[2]
with open(path) as f:
    doc = json.load(f)
p = doc["profile"]
h = next(iter(doc["hostSpecific"].values()))  # this host's own section
exec(change)
with open(path, "w") as f:
    json.dump(doc, f)
PY
}

"$hoxcfg" export --output "$HOX_ROOT/demo-export.json"
faulty="$HOX_ROOT/demo-faulty.json"
changed "$faulty" '
h["network"]["interfaces"]["vnic"][0]["mtu"] = 100                        # below the schema minimum
h["network"]["interfaces"]["vnic"][1]["portgroup"] = "Nowhere"            # no such port group
h["system"]["identity"]["hostname"]["domain"] = "lab..example.com"        # an empty label
'
show "Validate the export: valid" validate "$HOX_ROOT/demo-export.json"
show "A faulty document: the schema finds the MTU (so the network plugin, owner of the vNICs, is not asked), the Python identity plugin the domain" \
  validate "$faulty"
show "Without the schema check: the C++ network plugin finds the vNIC whose port group does not exist (port groups are its references)" \
  validate --no-schema "$faulty"

maintenance="$HOX_ROOT/demo-maintenance.json"
changed "$maintenance" '
h["network"]["interfaces"]["vnic"][0]["mtu"] = 9000                       # the schema: an MTU change needs maintenance mode
p["network"]["vswitch"]["portgroups"][0]["vlan"] = 10                     # the Python plugin: the management network moves
'
show "Impact of a change that needs maintenance mode (the impact plugins in C++ and Python are asked)" \
  impact "$maintenance"

reboot="$HOX_ROOT/demo-reboot.json"
changed "$reboot" '
p["system"]["kernel"]["boot_options"]["hugepages"] = 4096                  # a huge page count the kernel reserves at boot
p["network"]["firewall"]["rules"].append({"name": "web", "action": "allow", "protocol": "tcp", "port": 443})
'
show "Impact of a change that needs a reboot (and a new firewall rule: maintenance mode, covered by the reboot)" \
  impact "$reboot"
