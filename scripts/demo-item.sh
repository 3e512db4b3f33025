#!/usr/bin/env bash
# The single-item part of the demo: one item read, one set at once, one
# removed, one staged for the next boot, the next change refused until a
# (simulated) boot-time run has applied it, then accepted.
#
#   scripts/demo-item.sh HOXCFG ROOT      (ROOT: a host root made by hoxcfg init --sample)
set -euo pipefail
hoxcfg=$1
export HOX_ROOT=$2

# Shows one command and its exit status; a status the step does not expect
# ends the demo.
show() {
  local expected=$1 title=$2
  shift 2
  echo
  echo "== $title"
  echo "\$ hoxcfg $*"
  local rc=0
  "$hoxcfg" "$@" || rc=$?
  echo "(exit $rc)"
  [ "$rc" -eq "$expected" ] || { echo "expected exit $expected" >&2; exit 1; }
}

show 0 "One item: its configuration, its default, whether it is the user's (secrets masked)" \
  get security/accounts/users
show 1 "A value that does not fit the key's schema: each finding, exit 1" \
  set network/dns/config --yes --value '{"servers": ["10.0.0.53", "not an address"], "domain": "x"}'
show 0 "No impact: applied at once by the network plugin" \
  set network/dns/config --yes --value '{"servers": ["10.0.0.53"], "search": ["lab.example.com"]}'
echo "--- $HOX_ROOT/etc/resolv.conf ---"
cat "$HOX_ROOT/etc/resolv.conf"
show 0 "The same value again: nothing to do" \
  set network/dns/config --yes --value '{"servers": ["10.0.0.53"], "search": ["lab.example.com"]}'
show 0 "Remove a singleton's configuration through its plugin" delete services/syslog/config --yes
show 2 "A default that may change but never go cannot be removed" delete services/time/ntp --yes
show 3 "More huge pages need a reboot: staged for the next boot (exit 3), the host untouched" \
  set system/kernel/boot_options --yes --value '{"iommu": true, "hugepages": 4096, "console": "ttyS0"}'
echo
echo "== The staged change, waiting for the boot-time apply"
echo "\$ hoxcfg show desired | grep hugepages"
"$hoxcfg" show desired | grep hugepages
show 2 "Until the host has booted, every further change is refused (error 2029)" \
  set network/dns/config --yes --value '{"servers": ["10.0.0.54"]}'
show 0 "Reboot (simulated): the boot-time apply applies the staged item and returns boot mode to normal" \
  boot run --yes
show 0 "Changes go through again" set network/dns/config --yes --value '{"servers": ["10.0.0.54"]}'
