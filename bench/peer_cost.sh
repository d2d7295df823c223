#!/usr/bin/env bash
# What serving costs: orvex (fed by orvex-feed, no picture of its own) beside gst-rtsp-server,
# both serving the same H.264 sample at 30 fps with an AAC track, each to one ffmpeg client over
# UDP for the same time, one after the other in this run. Each server runs in a network
# namespace of its own (port 554 there). Prints, per server: CPU seconds during the client's
# play, delivered Mbit, CPU per Mbit, peak RSS; then the ratio orvex/peer.
#   bench/peer_cost.sh [BUILD_DIR] [SECONDS]      (root: namespaces and port 554)
# Not part of the test run.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
self="$top/bench/peer_cost.sh"
sample=${ORVEX_PEER_SAMPLE:-$top/../shared/media/testsrc2_1280x720_30fps_4s.h264}

# utime+stime of a process in seconds.
cpu_s() {
  awk -v hz="$(getconf CLK_TCK)" '{ sub(/^.*\) /, ""); printf "%.3f", ($12 + $13) / hz }' \
    "/proc/$1/stat"
}
hwm_kb() { awk '/^VmHWM:/ { print $2 }' "/proc/$1/status"; }
# /proc/net/dev is this namespace's (sysfs would show the one it was mounted in).
lo_bytes() { awk '$1 == "lo:" { print $2 }' /proc/net/dev; }
lo_packets() { awk '$1 == "lo:" { print $3 }' /proc/net/dev; }

wait_port() {
  for _ in $(seq 100); do
    python3 - <<'EOF' 2>/dev/null && return 0
import socket; socket.create_connection(("127.0.0.1", 554), timeout=0.2).close()
EOF
    sleep 0.1
  done
  echo "peer_cost: nothing listens on 554" >&2
  return 1
}

# One client for $seconds; prints "name cpu_s feed_cpu_s mbit hwm_kb es_kb".
# On loopback each packet is counted once on receive with a 14-byte link header; minus that
# and the IPv4 and UDP headers, the rest is the UDP payload (RTSP and RTCP add a few kB).
play() {
  local name=$1 server=$2 feed=$3 url=$4 seconds=$5 work=$6
  local c0 f0=0 b0 p0
  c0=$(cpu_s "$server")
  [[ -n $feed ]] && f0=$(cpu_s "$feed")
  b0=$(lo_bytes)
  p0=$(lo_packets)
  ffmpeg -hide_banner -nostats -rtsp_transport udp -t "$seconds" -i "$url" -c copy -f null - \
    2>"$work/$name-ffmpeg.log" </dev/null || true
  local c1 f1=0 b1 p1
  c1=$(cpu_s "$server")
  [[ -n $feed ]] && f1=$(cpu_s "$feed")
  b1=$(lo_bytes)
  p1=$(lo_packets)
  local es
  es=$(grep -o 'video:[0-9]*kB audio:[0-9]*kB' "$work/$name-ffmpeg.log" | tail -1 |
       awk -F'[:k ]' '{ print $2 + $5 }')
  echo "$name $(awk -v a="$c0" -v b="$c1" 'BEGIN { printf "%.3f", b - a }') \
$(awk -v a="$f0" -v b="$f1" 'BEGIN { printf "%.3f", b - a }') \
$(awk -v b=$((b1 - b0)) -v p=$((p1 - p0)) 'BEGIN { printf "%.3f", (b - 42 * p) * 8 / 1e6 }') \
$(hwm_kb "$server") ${es:-0}"
}

inside_orvex() {
  local build=$1 seconds=$2 work=$3
  ip link set lo up
  cat >"$work/orvex.prop" <<EOF
kelvo.build.kelvotv=sa
ro.board.platform=android
kv.orvex.audiopt=97
kv.orvex.wake=${ORVEX_WAKE:-event}
kv.orvex.aacenc=${ORVEX_AACENC:-inline}
orvex.host.log=file:$work/orvex.log
orvex.host.video=none
orvex.host.audio=tone
EOF
  mkdir -p "$work/binder"
  ORVEX_PROP_FILE="$work/orvex.prop" ORVEX_BINDER_DIR="$work/binder" \
    "$build/orvex" >/dev/null 2>>"$work/orvex.log" &
  local server=$!
  wait_port
  ORVEX_BINDER_DIR="$work/binder" "$build/orvex-feed" --loop --fps 30 "$sample" \
    2>>"$work/feed.log" &
  local feed=$!
  sleep 1
  play orvex "$server" "$feed" \
    'rtsp://127.0.0.1/skyvo.0?width=1280&height=720&cameraid=hd0&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none&framerate=30' \
    "$seconds" "$work"
  kill "$feed" "$server" 2>/dev/null || true
  wait 2>/dev/null || true
}

inside_peer() {
  local seconds=$2 work=$3
  ip link set lo up
  # The sample repeated covers the play (the bytes orvex-feed --loop sends); a raw H.264 file
  # carries no time stamps for real-time pace, so it goes into Matroska first.
  local long="$work/long.h264"
  : >"$long"
  for _ in $(seq $((seconds / 4 + 3))); do cat "$sample" >>"$long"; done
  ffmpeg -v error -y -framerate 30 -i "$long" -c copy "$work/long.mkv" </dev/null
  cat >"$work/peer.py" <<EOF
import gi
gi.require_version("Gst", "1.0")
gi.require_version("GstRtspServer", "1.0")
from gi.repository import Gst, GstRtspServer, GLib
Gst.init(None)
server = GstRtspServer.RTSPServer()
server.set_service("554")
factory = GstRtspServer.RTSPMediaFactory()
factory.set_launch(
    "( filesrc location=$work/long.mkv ! matroskademux ! h264parse ! rtph264pay name=pay0 pt=96 config-interval=-1"
    " audiotestsrc wave=sine freq=1000 ! audio/x-raw,rate=48000,channels=2"
    " ! voaacenc bitrate=128000 ! rtpmp4gpay name=pay1 pt=97 )")
factory.set_shared(True)
server.get_mount_points().add_factory("/skyvo.0", factory)
server.attach(None)
GLib.MainLoop().run()
EOF
  # Debian's interpreter: the bindings come from Debian's packages.
  /usr/bin/python3 "$work/peer.py" >/dev/null 2>"$work/peer.log" &
  local server=$!
  wait_port
  sleep 1
  play peer "$server" "" rtsp://127.0.0.1/skyvo.0 "$seconds" "$work"
  kill "$server" 2>/dev/null || true
  wait 2>/dev/null || true
}

if [[ "${1:-}" == --inside ]]; then
  "inside_$2" "$3" "$4" "$5"
  exit
fi

build=$(cd "${1:-$top/build}" && pwd)
seconds=${2:-20}
"$top/tools/install-deps.sh" bench
[[ -x $build/orvex && -x $build/orvex-feed ]] ||
  cmake --build "$build" --target orvex orvex-feed -j2 >/dev/null
work=$(mktemp -d /tmp/peer_cost.XXXXXX)
[[ -n ${ORVEX_PEER_KEEP:-} ]] || trap 'rm -rf "$work"' EXIT
mkdir -p "$work/orvex" "$work/peer"
o=$(unshare -n bash "$self" --inside orvex "$build" "$seconds" "$work/orvex")
p=$(unshare -n bash "$self" --inside peer "$build" "$seconds" "$work/peer")
printf '%-6s %8s %8s %10s %12s %10s %10s\n' server cpu_s feed_s mbit cpu_ms/mbit peak_rss_mb es_kb
for line in "$o" "$p"; do
  read -r name cpu feed mbit hwm es <<<"$line"
  awk -v n="$name" -v c="$cpu" -v f="$feed" -v m="$mbit" -v h="$hwm" -v e="$es" 'BEGIN {
    printf "%-6s %8.2f %8.2f %10.1f %12.2f %10.1f %10d\n", n, c, f, m,
           (m > 0 ? 1000 * c / m : 0), h / 1024, e }'
done
read -r _ ocpu _ ombit _ _ <<<"$o"
read -r _ pcpu _ pmbit _ _ <<<"$p"
awk -v oc="$ocpu" -v om="$ombit" -v pc="$pcpu" -v pm="$pmbit" 'BEGIN {
  if (om > 0 && pm > 0 && pc > 0) printf "ratio orvex/peer (cpu per mbit): %.2f\n", (oc / om) / (pc / pm)
  else print "ratio orvex/peer: n/a (a server delivered nothing)" }'
