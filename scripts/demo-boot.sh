#!/usr/bin/env bash
# The boot part of the demo: a bootstrap from a document that needs a
# reboot, a simulated reboot (the boot service's two steps, as its systemd
# unit runs them), the outcome as management clients read it, and the
# SmartNIC's desired configuration.
#
#   scripts/demo-boot.sh HOXCFG ROOT      (ROOT: a host root made by hoxcfg init --sample)
set -euo pipefail
hoxcfg=$1
export HOX_ROOT=$2

# shellcheck source=scripts/demo-show.sh
source "$(dirname "$0")/demo-show.sh"

autodeploy=("$HOX_ROOT/etc/tarvik/autodeploy/waiterNotify.json" "$HOX_ROOT/etc/tarvik/firewall/autodeploy.xml")
"$hoxcfg" export --output "$HOX_ROOT/demo-boot-base.json"
python3 - "$HOX_ROOT/demo-boot-base.json" "$HOX_ROOT/firstboot.json" <<'PY'
import json, sys
doc = json.load(open(sys.argv[1]))
doc["profile"]["system"]["kernel"]["boot_options"]["hugepages"] = 8192
doc["profile"]["services"]["time"]["ntp"]["servers"] = ["ntp1.example.org", "ntp2.example.org"]
json.dump(doc, open(sys.argv[2], "w"))
PY

echo
echo "== The installer left two auto-deployment files for the first boot"
ls -l "${autodeploy[@]}"
cp "${autodeploy[1]}" "$HOX_ROOT/autodeploy.xml.before"
show "Bootstrap from a first-boot document that needs a reboot: staged (exit 3), the files kept in the store" \
  bootstrap --yes "$HOX_ROOT/firstboot.json"
echo "--- the files are gone from the disk until the next boot:"
ls "${autodeploy[@]}" 2>&1 || true

echo
echo "== Reboot (simulated): the boot service runs the boot-time apply, then marks the boot complete"
show "The boot-time apply with the boot-capable plugins" boot run --yes
show "Until the boot is marked complete, its outcome is not reported (exit 4)" boot status
show "Mark the boot complete (the unit does it after the run)" boot complete --yes
show "The outcome of the boot-time apply" boot status
show "The same for a management client" boot status --json
echo "--- the files are back, the XML byte for byte; the kernel plugin wrote the new boot options:"
ls -l "${autodeploy[@]}"
cmp "${autodeploy[1]}" "$HOX_ROOT/autodeploy.xml.before" && echo "autodeploy.xml: identical"
cat "$HOX_ROOT/etc/tarvik/boot-options.conf"
show "The host now complies with the first-boot document" compliance "$HOX_ROOT/firstboot.json"

printf '{"smartnic": {"ports": {"uplink": {"mtu": 9000}}}}\n' > "$HOX_ROOT/smartnic.json"
show "The SmartNIC's desired configuration, stored for its agent" smartnic set --yes "$HOX_ROOT/smartnic.json"
