#!/usr/bin/env bash
# Builds the service in build/ and runs it with the host properties shipped in the repository.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
"$top/tools/install-deps.sh"
cmake -S "$top" -B "$top/build" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
# Only what running needs: the service, the GStreamer module it loads and orvex-feed (the tests
# and benchmarks are tools/test.sh's).
echo "run: building orvex, its GStreamer module and orvex-feed in build/ on $(nproc) cores" \
     "(the first build takes a few minutes)"
cmake --build "$top/build" --target orvex orvex_host_gst orvex-feed -j "$(nproc)"
query="skyvo.0?width=1280&height=720&cameraid=hd0&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none&framerate=30"
# The address other machines reach this one at (the URL is for them; 127.0.0.1 also works here).
address=$( (ip -4 route get 192.0.2.1 2>/dev/null || true) | sed -n 's/.* src \([0-9.]*\).*/\1/p')
address=${address:-127.0.0.1}
url="rtsp://$address/$query"
export ORVEX_PROP_FILE="${ORVEX_PROP_FILE:-$top/platform/host/orvex.prop}"
if [[ $ORVEX_PROP_FILE == "$top/platform/host/orvex.prop" && ${ORVEX_AUTH:-on} != off ]]; then
  # Who may watch: a user "orvex" with a random password, made at the first start. The shipped
  # properties are read as they are (edits take effect while the service runs), with a small
  # file of this script's laid over them that points kv.orvex.auth at the credentials.
  conf=${XDG_CONFIG_HOME:-$HOME/.config}/orvex
  users=$conf/users.htdigest
  mkdir -p "$conf"
  if [[ ! -s $users ]]; then
    password=$(ORVEX_USERS=$users "$top/tools/orvex-passwd" --random orvex)
    (umask 077 && echo "rtsp://orvex:$password@$address/$query" >"$conf/play-url")
    echo "run: made $users with the user \"orvex\" (change the password: tools/orvex-passwd orvex)"
  fi
  { echo "# Made by tools/run.sh at every start: who may watch. Other settings belong in"
    echo "# $top/platform/host/orvex.prop, which is read as it is."
    echo "kv.orvex.auth=$users"; } >"$conf/run.prop"
  # Earlier versions of this script ran a copy of the shipped file from here.
  if head -n 1 "$conf/orvex.prop" 2>/dev/null | grep -q '^# Made by tools/run.sh'; then
    rm -f "$conf/orvex.prop"
  fi
  export ORVEX_PROP_FILE=$ORVEX_PROP_FILE:$conf/run.prop
  if [[ -s $conf/play-url ]]; then
    url=$(sed "s|@[^/]*/|@$address/|" "$conf/play-url")
  else
    url="rtsp://USER:PASSWORD@$address/$query"
  fi
fi
if [[ $(id -u) -ne 0 ]] && ! getcap "$top/build/orvex" 2>/dev/null | grep -q cap_net_bind_service; then
  echo "run: orvex listens on port 554, which needs privileges on Linux. Either run as root:"
  echo "       sudo ORVEX_PROP_FILE=$ORVEX_PROP_FILE $top/build/orvex"
  echo "     or allow the binary once:"
  echo "       sudo setcap cap_net_bind_service=+ep $top/build/orvex && $0"
  exit 1
fi
# The web port as the service will read it: the last file of the list that sets it.
http_port=
IFS=: read -r -a prop_files <<<"$ORVEX_PROP_FILE"
for f in "${prop_files[@]}"; do
  p=$(sed -n 's/^[[:space:]]*kv\.orvex\.http[[:space:]]*=[[:space:]]*\([0-9]*\)[[:space:]]*$/\1/p' "$f" 2>/dev/null | tail -n 1)
  [[ -n $p ]] && http_port=$p
done
echo "run: starting orvex; play it with"
echo "       ffplay -rtsp_transport udp '$url'"
if [[ -n $http_port ]]; then
  echo "     or open the page in a browser (a phone on the same network too):"
  login=; [[ $url == *@* ]] && login="   (the user and password of the URL above)"
  echo "       http://$address:$http_port/$login"
fi
echo "     (stop with Ctrl-C or SIGTERM; ORVEX_AUTH=off $0 runs without passwords)"
exec "$top/build/orvex" "$@"
