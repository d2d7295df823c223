# Shared by the measure modes of the screen casting checks (e2e-wayland.sh, e2e-capture.sh):
# sourced once `top`, `build`, `work`, `pids` and `fail` are set, with the screen running.
# The cost of a casting process counts its children too (orvex's X11 capture child), and every
# figure comes from a client that was seen to receive pictures in real time: a server that
# fails shows as a failure, never as 0% or as the frames of an earlier file.

# The process and all its descendants.
tree_pids() {
  local p
  echo "$1"
  for p in $(pgrep -P "$1"); do tree_pids "$p"; done
}
# Their user + system clock ticks, and their resident memory in MiB.
tree_ticks() {
  local p t=0
  for p in $(tree_pids "$1"); do
    t=$((t + $(awk '{print $14 + $15}' "/proc/$p/stat" 2>/dev/null || echo 0)))
  done
  echo "$t"
}
tree_rss_mib() {
  local p kb=0
  for p in $(tree_pids "$1"); do
    kb=$((kb + $(awk '/^VmRSS/ {print $2}' "/proc/$p/status" 2>/dev/null || echo 0)))
  done
  echo $((kb / 1024))
}

# A full-screen window on the screen being cast ($1: wayland or x11) showing the rest of the
# arguments' pipeline head; its pid in `window`.
show() {
  local screen=$1
  shift
  local sink="ximagesink"
  [[ $screen == wayland ]] && sink="waylandsink fullscreen=true"
  gst-launch-1.0 -q "$@" ! $sink >"$work/scene.log" 2>&1 &
  window=$!
  pids+=($window)
}

# One client plays $2 for 25 s while the CPU of process $1 and its children is read over the
# 10 s in the middle; prints "CPU% RSS_MiB fps" or fails when the pictures did not come at the
# rate of real time.
play_and_read() {
  local server=$1 url=$2 hz t0 t1 cpu0 cpu1 rss frames started took
  hz=$(getconf CLK_TCK)
  rm -f "$work/video.h264"
  started=$(date +%s.%N)
  timeout -k 5 60 ffmpeg -y -hide_banner -nostats -loglevel error -rtsp_transport udp \
    -i "$url" -map 0:v -c copy -t 25 -f h264 "$work/video.h264" </dev/null \
    2>"$work/client.log" &
  local client=$!
  sleep 8
  cpu0=$(tree_ticks "$server")
  sleep 10
  cpu1=$(tree_ticks "$server")
  rss=$(tree_rss_mib "$server")
  wait "$client" || true
  took=$(awk -v a="$started" -v b="$(date +%s.%N)" 'BEGIN { printf "%.1f", b - a }')
  frames=$(ffprobe -v error -count_frames -select_streams v:0 -show_entries \
    stream=nb_read_frames -of csv=p=0 "$work/video.h264" 2>/dev/null || echo 0)
  # 25 s of stream in less than 22 s of play: the server ran ahead of real time.
  [[ ${frames:-0} -gt 0 ]] && awk -v t="$took" 'BEGIN { exit !(t >= 22) }' ||
    fail "$url: ${frames:-0} pictures in ${took} s: $(tail -2 "$work/client.log")"
  echo "$(( (cpu1 - cpu0) * 100 / hz / 10 )) $rss $(awk -v f="$frames" 'BEGIN{printf "%.1f", f/25}')"
}

# CPU, memory and frame rate of process $1 (and children) casting screen $2 (wayland, x11) at
# 1280x720@30 to one client of $4, for a still screen, a small ball moving and bars scrolling
# over it all; $3 names the server in the lines.
measure_scenes() {
  local server=$1 screen=$2 label=$3 url=$4 scene result
  for scene in "still:" "ball:pattern=ball" "bars:pattern=smpte horizontal-speed=4"; do
    window=
    if [[ -n ${scene#*:} ]]; then
      show "$screen" videotestsrc ${scene#*:} is-live=true \
        ! "video/x-raw,width=1280,height=720,framerate=30/1"
      sleep 2
    fi
    result=($(play_and_read "$server" "$url"))
    # A failure inside the substitution ends only its subshell: its words come back instead.
    [[ ${#result[@]} -eq 3 ]] || fail "${result[*]}"
    [[ -n $window ]] && { kill "$window"; wait "$window" 2>/dev/null || true; }
    echo "$name: measure: 1280x720@30, ${scene%%:*} on a 1280x720 $screen screen, $label:" \
      "CPU ${result[0]}% of one core, RSS ${result[1]} MiB, ${result[2]} fps" \
      "(load average $(cut -d' ' -f1 /proc/loadavg) on $(nproc) cores)"
    sleep 2
  done
}

# The delay from a picture drawn to it decoded: the host pattern with its capture stamps (this
# machine's monotonic clock) shown full screen on $1, read back from the stream $3 by
# rtsp_check.py; $2 names the server.
measure_delay() {
  local screen=$1 label=$2 url=$3 painter
  local sink="ximagesink"
  [[ $screen == wayland ]] && sink="waylandsink fullscreen=true"
  "$build/orvex-pattern" 1280 720 30 | gst-launch-1.0 -q fdsrc blocksize=1382400 \
    ! rawvideoparse format=i420 width=1280 height=720 framerate=30/1 ! videoconvert \
    ! $sink sync=false >"$work/pattern.log" 2>&1 &
  painter=$!
  pids+=($painter)
  sleep 3
  echo "$name: measure: delay from the pattern drawn to the picture decoded, $label," \
    "1280x720@30: $(python3 "$top/tools/rtsp_check.py" latency "$url" 15)" \
    "(load average $(cut -d' ' -f1 /proc/loadavg))"
  kill "$painter" 2>/dev/null || true
  wait "$painter" 2>/dev/null || true
}

# gst-rtsp-server casting screen $1 with orvex's encoder settings (tools/cast_peer.py); its pid
# in `peer` once a short client has received a second of pictures from it (five tries).
start_peer() {
  /usr/bin/python3 "$top/tools/cast_peer.py" "$1" >"$work/peer.out" 2>"$work/peer.log" &
  peer=$!
  pids+=($peer)
  for _ in $(seq 100); do (exec 3<>/dev/tcp/127.0.0.1/554) 2>/dev/null && break; sleep 0.1; done
  local n frames
  for n in 1 2 3 4 5; do
    rm -f "$work/warm.h264"
    timeout -k 5 20 ffmpeg -y -hide_banner -nostats -loglevel error -rtsp_transport udp \
      -i rtsp://127.0.0.1/skyvo.0 -map 0:v -c copy -t 3 -f h264 "$work/warm.h264" </dev/null \
      2>>"$work/peer-warm.log" || true
    frames=$(ffprobe -v error -count_frames -select_streams v:0 -show_entries \
      stream=nb_read_frames -of csv=p=0 "$work/warm.h264" 2>/dev/null || echo 0)
    [[ ${frames:-0} -ge 30 ]] && return 0
    sleep 1
  done
  fail "gst-rtsp-server gave no pictures in five tries: $(tail -3 "$work/peer.log" "$work/peer-warm.log")"
}
