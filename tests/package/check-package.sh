#!/usr/bin/env bash
# The Debian packages as an operator and a plugin author meet them, in a
# throwaway root (dpkg --root; maintainer scripts run without chroot and see
# DPKG_ROOT): install, use the installed files only, upgrade, remove, purge;
# then lintian.
#   tests/package/check-package.sh SOURCE_DIR PACKAGE_DIR
set -euo pipefail
top=$(cd "$1" && pwd)
debs=$(cd "$2" && pwd)
runtime=$(ls "$debs"/hoxcm_*.deb)
dev=$(ls "$debs"/hoxcm-dev_*.deb)
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
inst=$work/root
multiarch=$(dpkg-architecture -qDEB_HOST_MULTIARCH)

fail() { echo "check-package: $*" >&2; exit 1; }
step() { echo "== $*"; }
# The throwaway root has none of the packages hoxcm depends on: dpkg says
# so (kept in dpkg.log) and goes on.
in_root() {
  dpkg --root="$inst" --log=/dev/null --force-script-chrootless --force-depends --force-not-root \
       --no-triggers "$@" 2>>"$work/dpkg.log" || { cat "$work/dpkg.log" >&2; return 1; }
}
# The installed program, finding the installed library (the package sets no
# RPATH: on a host the library is in the loader's path).
hoxcfg() { LD_LIBRARY_PATH="$inst/usr/lib/$multiarch" "$inst/usr/bin/hoxcfg" "$@"; }

mkdir -p "$inst/var/lib/dpkg/updates" "$inst/var/lib/dpkg/info" "$inst/var/lib/dpkg/triggers"
touch "$inst/var/lib/dpkg/status" "$inst/var/lib/dpkg/available"

step "install"
in_root -i "$runtime" "$dev" >/dev/null
[ "$(in_root -s hoxcm | sed -n 's/^Status: //p')" = "install ok installed" ] || fail "hoxcm is not installed"
for path in usr/bin/hoxcfg usr/lib/tarvik/configmanager/bin/cpp_plugin_runner \
            usr/lib/tarvik/configmanager/bin/py_plugin_runner usr/lib/"$multiarch"/libhoxcm.so.0 \
            usr/lib/"$multiarch"/libhoxcm.so usr/include/hoxcm/operations.h \
            usr/lib/"$multiarch"/cmake/hoxcm/hoxcmConfig.cmake usr/lib/"$multiarch"/pkgconfig/hoxcm.pc \
            usr/share/man/man1/hoxcfg.1.gz usr/share/bash-completion/completions/hoxcfg \
            usr/share/doc/hoxcm/copyright usr/lib/systemd/system/hoxcm-boot.service \
            usr/lib/systemd/system/hoxcm-bootstrap.service; do
  [ -e "$inst/$path" ] || fail "/$path is not installed"
done
ls "$inst"/usr/lib/tarvik/configmanager/plugin_schemas/*.json >/dev/null || fail "no manifest schemas installed"
grep -q '^ExecStart=/usr/bin/hoxcfg ' "$inst/usr/lib/systemd/system/hoxcm-boot.service" ||
  fail "the boot service does not run the installed hoxcfg"
for dir in var/lib/tarvik/configstore var/tarvik/lifecycle; do
  [ "$(stat -c %a "$inst/$dir")" = 700 ] || fail "/$dir has mode $(stat -c %a "$inst/$dir"), not 700"
done
# A package build holds nothing of the tests.
if { dpkg-deb -c "$runtime"; dpkg-deb -c "$dev"; } | grep -Ei '/tests?/|_test\b|gtest|gmock|failpoint'; then
  fail "the packages hold test machinery"
fi

step "man pages: one per command hoxcfg --help lists"
commands() {  # the command paths below "$@", from their help
  local sub
  for sub in $(hoxcfg "$@" --help | sed -n '/^Commands:/,/^$/s/^  \([a-z-]*\) .*/\1/p'); do
    echo "$* $sub"
    commands "$@" "$sub"
  done
}
while read -r command; do
  page=$inst/usr/share/man/man1/hoxcfg-${command// /-}.1.gz
  [ -f "$page" ] || fail "no man page for hoxcfg $command"
  summary=$(hoxcfg $command --help | head -1)
  zcat "$page" | sed 's/\\-/-/g; s/\\&//g' | grep -qF -- "$summary" || fail "the man page of hoxcfg $command lacks its summary"
done < <(commands | sed 's/^ //')

step "completion: the subcommands of the installed hoxcfg"
expected=$(hoxcfg --help | sed -n '/^Commands:/,/^$/s/^  \([a-z-]*\) .*/\1/p' | sort | tr '\n' ' ')
actual=$(bash -c 'source "$1"; COMP_WORDS=(hoxcfg ""); COMP_CWORD=1; _hoxcfg; printf "%s\n" "${COMPREPLY[@]}" | sort | tr "\n" " "' \
              _ "$inst/usr/share/bash-completion/completions/hoxcfg")
[ "$actual" = "$expected" ] || fail "completion offers '$actual', hoxcfg --help lists '$expected'"

step "hoxcfg init --sample and compliance, the installed package's root as the host"
hoxcfg --root "$inst" init --sample >/dev/null
hoxcfg --root "$inst" export >"$work/exported.json"
hoxcfg --root "$inst" compliance "$work/exported.json" >/dev/null || fail "the host does not comply with its own export"
hoxcfg --root "$inst" --json compliance "$work/exported.json" | python3 -c 'import json, sys; json.load(sys.stdin)'
[ -s "$inst/var/lib/tarvik/configstore/configstore.db" ] || fail "no configuration store"

step "a client built against the installed hoxcm-dev (find_package and pkg-config)"
cmake -S "$top/cmake/consumer" -B "$work/consumer" -DCMAKE_PREFIX_PATH="$inst/usr" >/dev/null
cmake --build "$work/consumer" >/dev/null
LD_LIBRARY_PATH="$inst/usr/lib/$multiarch" "$work/consumer/consumer" >/dev/null
# shellcheck disable=SC2046
g++ -std=c++17 "$top/cmake/consumer/main.cc" -o "$work/consumer-pc" \
    $(PKG_CONFIG_PATH="$inst/usr/lib/$multiarch/pkgconfig" pkg-config --cflags --libs hoxcm)
LD_LIBRARY_PATH="$inst/usr/lib/$multiarch" "$work/consumer-pc" >/dev/null

step "a Python plugin run by the installed runner"
host=$work/host
hoxcfg --root "$host" init >/dev/null
mkdir -p "$host/etc" && echo 5f0c1d2e3a4b4c5d8e9f0a1b2c3d4e5f >"$host/etc/machine-id"
# Only the author's plugin: init brings the sample plugins along.
rm -rf "$host"/usr/lib/tarvik/configmanager/apply_modules/*
cp -r "$top/tests/package/plugin/schema/." "$host/usr/lib/tarvik/configmanager/schemas/"
cp -r "$top/tests/package/plugin/greeting" "$host/usr/lib/tarvik/configmanager/apply_modules/"
echo '{"demo": {"greeting": {"message": {"text": "hello"}}}}' >"$work/good.json"
echo '{"demo": {"greeting": {"message": {"text": " "}}}}' >"$work/blank.json"
hoxcfg --root "$host" validate "$work/good.json" >/dev/null || fail "the plugin refused a good greeting"
status=0
hoxcfg --root "$host" --json validate "$work/blank.json" >"$work/findings.json" || status=$?
[ "$status" = 1 ] || fail "validate of a blank greeting ended with $status, not 1"
grep -q com.example.greeting.blank "$work/findings.json" || fail "the plugin's finding is missing: $(cat "$work/findings.json")"

step "upgrade: the store and the host's files stay"
repack() {  # $1 the package, $2 its new revision
  rm -rf "$work/repack" && dpkg-deb -R "$1" "$work/repack"
  sed -i "s/^Version: \(.*\)-[0-9]*$/Version: \1-$2/" "$work/repack/DEBIAN/control"
  sed -i "s/(= \(.*\)-[0-9]*)/(= \1-$2)/" "$work/repack/DEBIAN/control"
  fakeroot dpkg-deb -b "$work/repack" "$work/$(basename "$1" .deb)-$2.deb" >/dev/null
  echo "$work/$(basename "$1" .deb)-$2.deb"
}
in_root -i "$(repack "$runtime" 2)" "$(repack "$dev" 2)" >/dev/null
in_root -s hoxcm | grep -q '^Version: .*-2$' || fail "the upgrade did not happen"
hoxcfg --root "$inst" compliance "$work/exported.json" >/dev/null || fail "the host's configuration did not survive the upgrade"

step "remove and purge"
in_root -r hoxcm-dev hoxcm >/dev/null 2>&1
for path in usr/bin/hoxcfg usr/lib/"$multiarch"/libhoxcm.so.0 usr/include/hoxcm usr/share/man/man1/hoxcfg.1.gz; do
  [ ! -e "$inst/$path" ] || fail "/$path is left after removal"
done
in_root -P hoxcm hoxcm-dev >/dev/null 2>&1
[ -s "$inst/var/lib/tarvik/configstore/configstore.db" ] || fail "the purge removed the host's configuration store"
[ ! -e "$inst/var/tarvik/lifecycle" ] || fail "the purge left the lifecycle directory"
in_root -l 2>/dev/null | grep -q '^.. *hoxcm' && fail "dpkg still lists hoxcm"

step "lintian"
lintian --fail-on error "$runtime" "$dev"
echo "check-package: all checks passed"
