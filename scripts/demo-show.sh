# Sourced by the demo parts: show TITLE ARGS... prints the title and the
# command, runs hoxcfg ($hoxcfg) with ARGS and prints its exit status,
# whatever it is.
show() {
  echo
  echo "== $1"
  shift
  echo "\$ hoxcfg $*"
  set +e
  "$hoxcfg" "$@"
  echo "(exit $?)"
  set -e
}
