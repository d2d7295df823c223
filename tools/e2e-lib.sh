# Shared by the end-to-end scripts: sourced after `name`, `top` and `build` are set. Makes a
# work folder with the service's log and binder sockets in it, the ok/fail reporters, and a
# start that waits until the service listens on port 554.
"$top/tools/install-deps.sh" e2e
work=$(mktemp -d)
export ORVEX_LOG="file:$work/orvex.log"
export ORVEX_BINDER_DIR="$work/binder"
# The checks read the service's own traces: its debug lines and their copy on standard output.
export ORVEX_LOG_LEVEL=debug
pass=0
fail() { echo "$name: FAILED: $*"; tail -n 20 "$work/stdout" "$work/orvex.log" 2>/dev/null || true; exit 1; }
ok() { echo "$name: ok: $*"; pass=$((pass + 1)); }
pid=
trap '[[ -n $pid ]] && kill -9 $pid 2>/dev/null || true' EXIT

# Starts orvex with the given command and waits until it listens on port 554.
start() {
  "$@" >"$work/stdout" 2>"$work/stderr" &
  pid=$!
  for _ in $(seq 300); do
    (exec 3<>/dev/tcp/127.0.0.1/554) 2>/dev/null && break
    sleep 0.1
  done
  sleep 0.5
  kill -0 "$pid" 2>/dev/null || fail "orvex did not start (port 554 in use, or no privileges?)"
}

# UDP datagrams this network namespace dropped because a socket's receive buffer was full.
udp_rcvbuf_drops() {
  awk '/^Udp:/ { if (!h) { for (i = 1; i <= NF; i++) col[$i] = i; h = 1 } else print $col["RcvbufErrors"] }' \
    /proc/net/snmp
}

# An RTSP client (ffmpeg, picture only) that joins a running capture at $1: it must decode at
# least $2 pictures in its first 6 s with no complaint from its decoder (missing references or
# parameter sets, errors); $3 says what is checked.
join_check() {
  local log frames complaints drops
  drops=$(udp_rcvbuf_drops)
  log=$(timeout -k 5 25 ffmpeg -hide_banner -nostats -rtsp_transport udp -i "$1" -t 6 -map 0:v \
    -f null - 2>&1) || true
  frames=$(grep -o 'frame= *[0-9]*' <<<"$log" | tail -1 | grep -o '[0-9]*$')
  complaints=$(grep -ciE 'error|missing|non-existing|no frame|concealing' <<<"$log" || true)
  drops=$(($(udp_rcvbuf_drops) - drops))
  # A full client socket loses packets the service sent: the count tells that from a fault.
  [[ ${frames:-0} -ge $2 && $complaints -eq 0 ]] ||
    fail "$3: ${frames:-0} pictures, $complaints complaints, $drops UDP packets dropped by full receive buffers meanwhile: $(grep -iE 'error|missing|concealing' <<<"$log" | head -2)"
  ok "$3: ${frames:-0} pictures of 6 s decoded, no complaint"
}
