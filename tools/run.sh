#!/usr/bin/env bash
# Builds the service in build/ and runs it with the host properties shipped in the repository.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
"$top/tools/install-deps.sh"
cmake -S "$top" -B "$top/build" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
cmake --build "$top/build"
export ORVEX_PROP_FILE="${ORVEX_PROP_FILE:-$top/platform/host/orvex.prop}"
url="rtsp://127.0.0.1/skyvo.0?width=1280&height=720&cameraid=hd0&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none&framerate=30"
if [[ $(id -u) -ne 0 ]] && ! getcap "$top/build/orvex" 2>/dev/null | grep -q cap_net_bind_service; then
  echo "run: orvex listens on port 554, which needs privileges on Linux. Either run as root:"
  echo "       sudo ORVEX_PROP_FILE=$ORVEX_PROP_FILE $top/build/orvex"
  echo "     or allow the binary once:"
  echo "       sudo setcap cap_net_bind_service=+ep $top/build/orvex && $0"
  exit 1
fi
echo "run: starting orvex; play it with"
echo "       ffplay -rtsp_transport udp '$url'"
echo "     (stop with Ctrl-C or SIGTERM)"
exec "$top/build/orvex" "$@"
