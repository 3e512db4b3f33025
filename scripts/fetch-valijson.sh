#!/usr/bin/env bash
# Unpacks the valijson headers into third_party/ without installing the
# Debian package, whose dependencies (Qt, Poco, yaml-cpp, ...) we do not use.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
dest="$top/third_party/valijson"
[ -f "$dest/include/valijson/validator.hpp" ] && exit 0
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
cd "$work"
if ! apt-get download libvalijson-dev >/dev/null 2>&1; then
  [ "$(id -u)" = 0 ] && apt-get update -qq >/dev/null 2>&1 || true
  apt-get download libvalijson-dev >/dev/null
fi
dpkg-deb -x libvalijson-dev_*.deb unpacked
mkdir -p "$dest"
rm -rf "$dest/include"
cp -r unpacked/usr/include "$dest/include"
cp unpacked/usr/share/doc/libvalijson-dev/copyright "$dest/COPYRIGHT" 2>/dev/null || true
echo "valijson headers unpacked into $dest"
