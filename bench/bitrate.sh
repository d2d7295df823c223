#!/usr/bin/env bash
# The picture's bit rate against the rate the capture asks of the encoder (2048 kbit/s for
# cameraid=hd0), over SECONDS, for the test pattern, a moving screen (a ball) and a screen in
# full motion (scrolling bars), at 1280x720 and 30 fps. Each run is orvex on the shipped host
# settings in a network namespace of its own, played by one ffmpeg client that copies the H.264
# it receives; the rate is the bytes of that copy over its duration.
#   bench/bitrate.sh [BUILD_DIR] [SECONDS]      (root: namespaces and port 554)
# Not part of the test run.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
build=$(cd "${1:-$top/build}" && pwd)
seconds=${2:-30}
target_kbit=2048

if [[ -z "${ORVEX_BENCH_NETNS:-}" ]]; then
  "$top/tools/install-deps.sh" e2e
  [[ -x "$build/orvex" ]] || { echo "bitrate: no $build/orvex; build first (tools/test.sh)"; exit 1; }
  for source in "pattern" "gst:videotestsrc pattern=ball is-live=true" \
                "gst:videotestsrc pattern=smpte horizontal-speed=4 is-live=true"; do
    ORVEX_BENCH_NETNS=1 unshare -n bash -c 'ip link set lo up && exec "$0" "$@"' \
      "$0" "$build" "$seconds" "$source"
  done
  exit 0
fi

source=$3
work=$(mktemp -d)
trap 'kill "$orvex" 2>/dev/null || true; wait 2>/dev/null || true; rm -rf "$work"' EXIT
cp "$top/platform/host/orvex.prop" "$work/orvex.prop"
printf 'orvex.host.video=%s\norvex.host.audio=tone\n' "$source" >>"$work/orvex.prop"
ORVEX_PROP_FILE="$work/orvex.prop" ORVEX_LOG="file:$work/orvex.log" ORVEX_AUTH=off \
  ORVEX_BINDER_DIR="$work/binder" "$build/orvex" >"$work/stdout" 2>&1 &
orvex=$!
for _ in $(seq 100); do (exec 3<>/dev/tcp/127.0.0.1/554) 2>/dev/null && break; sleep 0.1; done
url="rtsp://127.0.0.1/skyvo.0?width=1280&height=720&cameraid=hd0&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none&framerate=30"
timeout -k 5 $((seconds + 30)) ffmpeg -y -hide_banner -nostats -loglevel error -rtsp_transport udp \
  -i "$url" -map 0:v -c copy -t "$seconds" -f h264 "$work/video.h264" </dev/null
frames=$(ffprobe -v error -count_frames -select_streams v:0 -show_entries stream=nb_read_frames \
  -of csv=p=0 "$work/video.h264")
bytes=$(stat -c %s "$work/video.h264")
python3 - "$source" "$bytes" "$frames" "$seconds" "$target_kbit" <<'PY'
import sys
source, size, frames, seconds, target = sys.argv[1], int(sys.argv[2]), int(sys.argv[3]), int(sys.argv[4]), int(sys.argv[5])
kbit = size * 8 / seconds / 1000
off = (kbit - target) * 100 / target
print("bitrate: %-55s %6.0f kbit/s (%+5.1f%% of %d), %.1f fps, %s" %
      (source, kbit, off, target, frames / seconds, "within 15%" if abs(off) <= 15 else "OUTSIDE 15%"))
PY
