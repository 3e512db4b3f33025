#!/usr/bin/env bash
# The drift part of the demo: exports the sandbox host, changes a few values
# of the document and shows the compliance report and the apply tasks that
# the changed document would generate.
#
#   scripts/demo-drift.sh HOXCFG ROOT      (ROOT: a host root made by hoxcfg init --sample)
set -euo pipefail
hoxcfg=$1
export HOX_ROOT=$2
doc="$HOX_ROOT/demo-desired.json"

# shellcheck source=scripts/demo-show.sh
source "$(dirname "$0")/demo-show.sh"

"$hoxcfg" export --output "$doc"
show "The exported document matches the host" compliance "$doc"

# A few changes: an NTP server more, a new CHAP secret, a new user with a
# password, the NFS mounts removed, another huge page count.
python3 - "$doc" <<'PY'
import json, sys
path = sys.argv[1]
with open(path) as f:
    doc = json.load(f)
p = doc["profile"]
p["services"]["time"]["ntp"]["servers"].append("ntp3.example.com")
p["storage"]["iscsi"]["targets"][0]["chapSecret"] = "a-new-secret"
p["security"]["accounts"]["users"].append({"name": "alice", "password": "alice-password", "shell": "/bin/bash"})
del p["storage"]["nfs"]
p["system"]["kernel"]["boot_options"]["hugepages"] = 8192
with open(path, "w") as f:
    json.dump(doc, f)
PY
show "After a few changes (secrets masked in the report)" compliance "$doc"
show "The apply tasks of the changed document" drift "$doc"
show "The same at boot: every item, without comparison" drift --boot "$doc"
