# Shared by the screen capture checks (e2e-capture.sh, e2e-wayland.sh): sourced once `top`,
# `build`, `work`, `pids` and `fail` are set. start_capturing VIDEO AUDIO writes the shipped
# host properties with those sources (and payload type 97 for stock players), starts orvex
# with its log in the work folder at debug level (the checks read the capture's debug lines)
# and waits until it listens; `orvex` is its pid, `url WIDTH HEIGHT` the URL to play.
url() { echo "rtsp://127.0.0.1/skyvo.0?width=$1&height=$2&cameraid=hd0&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none&framerate=30"; }

start_capturing() {
  cp "$top/platform/host/orvex.prop" "$work/orvex.prop"
  printf 'orvex.host.video=%s\norvex.host.audio=%s\nkv.orvex.audiopt=97\n' "$1" "$2" \
    >>"$work/orvex.prop"
  export ORVEX_PROP_FILE="$work/orvex.prop"
  export ORVEX_LOG="file:$work/orvex.log"
  export ORVEX_LOG_LEVEL=debug
  export ORVEX_BINDER_DIR="$work/binder"
  "$build/orvex" >"$work/stdout" 2>&1 &
  orvex=$!
  pids+=($orvex)
  for _ in $(seq 100); do (exec 3<>/dev/tcp/127.0.0.1/554) 2>/dev/null && break; sleep 0.1; done
  kill -0 "$orvex" 2>/dev/null || fail "orvex did not start"
  sleep 0.5
}
