# Sourced first by an end-to-end script that runs in a network namespace of its own, so that
# its ports (554, 8080, ...) are free whatever else runs on the machine: installs the packages
# of the install-deps.sh set named by the first argument, then runs the script again, with the
# remaining arguments, inside a new namespace whose loopback is up. Needs root.
if [[ -z "${ORVEX_E2E_NETNS:-}" ]]; then
  "$top/tools/install-deps.sh" "$1"
  shift
  exec env ORVEX_E2E_NETNS=1 unshare -n bash -c 'ip link set lo up && exec "$0" "$@"' "$0" "$@"
fi
