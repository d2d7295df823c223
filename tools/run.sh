#!/usr/bin/env bash
# Builds the service in build/ and runs it with the host properties shipped in the repository.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
"$top/tools/install-deps.sh"
cmake -S "$top" -B "$top/build" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
cmake --build "$top/build"
if [[ ! -x "$top/build/orvex" ]]; then
  echo "run: built the libraries, tests and benchmarks; the orvex executable is not part of the tree yet, so there is nothing to run."
  exit 0
fi
export ORVEX_PROP_FILE="${ORVEX_PROP_FILE:-$top/platform/host/orvex.prop}"
exec "$top/build/orvex" "$@"
