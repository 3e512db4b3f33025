# Sourced by the setup scripts: installs the Debian packages the build, the
# tests and the demo need, when any is missing. Needs root (apt-get) only
# when something is missing.
HOXCM_DEBIAN_PACKAGES=(
  build-essential cmake pkg-config ccache python3
  rapidjson-dev libboost-filesystem-dev libboost-graph-dev libsqlite3-dev sqlite3 libmd-dev libre2-dev
  libgtest-dev libgmock-dev libbenchmark-dev libcli11-dev json-schema-test-suite
  time
  # The fuzz targets (scripts/fuzz.sh) and clang-tidy (scripts/tidy.sh).
  clang-14 libclang-rt-14-dev clang-tidy-14
)

hoxcm_install_deps() {
  local missing=()
  local pkg
  for pkg in "${HOXCM_DEBIAN_PACKAGES[@]}"; do
    dpkg-query -W -f='${Status}' "$pkg" 2>/dev/null | grep -q "install ok installed" || missing+=("$pkg")
  done
  if [ ${#missing[@]} -gt 0 ]; then
    echo "Installing Debian packages: ${missing[*]}"
    local sudo=""
    [ "$(id -u)" = 0 ] || sudo="sudo"
    $sudo apt-get update -qq
    DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq "${missing[@]}"
  fi
  # valijson: headers only, unpacked without its Debian dependencies.
  "$(dirname "${BASH_SOURCE[0]}")/fetch-valijson.sh"
}
