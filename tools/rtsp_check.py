#!/usr/bin/env python3
"""A small RTSP client for checking a running orvex.

    rtsp_check.py packets URL [SECONDS]   receive RTP, check packet formats, print rates
    rtsp_check.py measure URL [SECONDS]   decode with ffmpeg, print frame rate and A/V offset
    rtsp_check.py latency URL [SECONDS]   decode with a low-delay ffmpeg, print the delay from
                                          the host pattern's capture stamp to the decoded frame
    rtsp_check.py split URL [SECONDS]     the same delay cut in two: capture to the frame's last
                                          packet here, and that packet to the decoded frame
    rtsp_check.py stamps URL [SECONDS]    the audio RTP time stamp steps (one AAC frame each)
    rtsp_check.py first URL [SECONDS]     the types of the first H.264 NAL units that arrive;
                                          fails unless the first is an SPS (a key picture)
    (measure and latency also read what a media server gives: rtmp://, an HLS playlist, a file)
    rtsp_check.py guess URL SOURCE        wrong passwords from SOURCE until the connection ends,
                                          then the URL's right one from there

URLs may carry user:password@: requests are then answered with Digest when the service asks.

With --service-log FILE (the service's log, orvex.host.log=file:FILE), 'latency' and 'split'
also print the service's own reports written meanwhile: with kv.orvex.latency=1 the video
sender logs, every 300 frames, how long frames waited in its ring and took to send.

The service announces audio as payload type 97. Its packets carry 97 too when the property
kv.orvex.audiopt says so (the host default), and then 'measure' plays the URL with stock ffmpeg.
Left at the television's 98, ffmpeg would drop every audio packet (it keeps to the SDP's type),
so 'measure' then hands ffmpeg its own SDP with the type the packets carry.
"""
import hashlib
import os
import re
import socket
import struct
import subprocess
import sys
import tempfile
import threading
import time


class Session:
    """URLs may carry user:password@, answered with Digest when the service asks."""

    def __init__(self, url, source=None):
        m = re.match(r"rtsp://(?:([^:@/]*):([^@/]*)@)?([^/:@]+)(?::(\d+))?/", url)
        self.user, self.password = m.group(1), m.group(2)
        self.url = re.sub(r"^rtsp://[^@/]*@", "rtsp://", url)
        self.realm = self.nonce = None
        self.sock = socket.create_connection((m.group(3), int(m.group(4) or 554)), timeout=10,
                                             source_address=(source, 0) if source else None)
        self.cseq = 0
        self.lock = threading.Lock()

    def authorization(self, method, url):
        if self.nonce is None:
            return ""
        md5 = lambda text: hashlib.md5(text.encode()).hexdigest()
        ha1 = md5("%s:%s:%s" % (self.user, self.realm, self.password))
        response = md5("%s:%s:%s" % (ha1, self.nonce, md5("%s:%s" % (method, url))))
        return ('Authorization: Digest username="%s", realm="%s", nonce="%s", uri="%s", '
                'response="%s"\r\n' % (self.user, self.realm, self.nonce, url, response))

    def request(self, method, url, headers=""):
        head, body = self.exchange(method, url, headers)
        if head.startswith("RTSP/1.0 401") and self.user is not None:
            self.realm = re.search(r'realm="([^"]*)"', head).group(1)
            self.nonce = re.search(r'nonce="([^"]*)"', head).group(1)
            head, body = self.exchange(method, url, headers)
        if not head.startswith("RTSP/1.0 200 OK"):
            raise RuntimeError(method + ": " + head)
        return head, body

    def exchange(self, method, url, headers):
        with self.lock:
            self.cseq += 1
            self.sock.sendall(("%s %s RTSP/1.0\r\nCSeq: %d\r\n%s%s\r\n" % (
                method, url, self.cseq, self.authorization(method, url), headers)).encode())
            data = b""
            while b"\r\n\r\n" not in data:
                chunk = self.sock.recv(4096)
                if not chunk:
                    raise RuntimeError("connection closed after " + method)
                data += chunk
            head, _, body = data.partition(b"\r\n\r\n")
            m = re.search(rb"Content-Length: (\d+)", head)
            while m and len(body) < int(m.group(1)):
                body += self.sock.recv(4096)
            return head.decode(errors="replace"), body.decode(errors="replace")

    def play(self, ports):
        _, sdp = self.request("DESCRIBE", self.url)
        for i, port in enumerate(ports):
            self.request("SETUP", "%s/trackID=%d" % (self.url, i + 1),
                         "Transport: RTP/AVP;unicast;client_port=%d-%d\r\n" % (port, port + 1))
        self.request("PLAY", self.url)
        return sdp

    def keep_alive(self, seconds):
        """The service drops a connection that is quiet for 10 s."""
        end = time.time() + seconds
        while time.time() < end:
            time.sleep(min(4.0, max(0.0, end - time.time())))
            self.request("GET_PARAMETER", self.url)


def udp_pair():
    s = socket.socket(socket.AF_INET, socket.SOCK_DGRAM)
    s.bind(("127.0.0.1", 0))
    s.setsockopt(socket.SOL_SOCKET, socket.SO_RCVBUF, 4 << 20)
    return s


def packets(url, seconds):
    video, audio = udp_pair(), udp_pair()
    session = Session(url)
    session.play([video.getsockname()[1], audio.getsockname()[1]])
    stats = {"video": [0, 0, set(), set()], "audio": [0, 0, set(), set()]}
    bad = []

    def receive(sock, name):
        sock.settimeout(0.5)
        end = time.time() + seconds
        while time.time() < end:
            try:
                p = sock.recv(2048)
            except socket.timeout:
                continue
            st = stats[name]
            st[0] += 1
            st[1] += len(p)
            st[2].add(p[1] & 0x7F)
            st[3].add(struct.unpack(">I", p[8:12])[0])
            if p[0] != 0x80:
                bad.append(name + " version byte")
            if name == "audio" and p[12:14] != b"\x00\x10":
                bad.append("audio AU header")
    threads = [threading.Thread(target=receive, args=(video, "video")),
               threading.Thread(target=receive, args=(audio, "audio"))]
    for t in threads:
        t.start()
    session.keep_alive(seconds)
    for t in threads:
        t.join()
    for name, (n, size, pts, ssrcs) in stats.items():
        print("%s packets=%d kbit/s=%.0f payload_types=%s ssrc=%s" %
              (name, n, size * 8 / seconds / 1000, sorted(pts), sorted(ssrcs)))
    if bad or not stats["video"][0] or not stats["audio"][0]:
        print("bad:", sorted(set(bad)) or "no packets")
        return 1
    return 0


SDP = """v=0
o=- 0 0 IN IP4 127.0.0.1
s=orvex
c=IN IP4 127.0.0.1
t=0 0
m=video %d RTP/AVP 96
a=rtpmap:96 H264/90000
a=fmtp:96 packetization-mode=1
m=audio %d RTP/AVP %d
a=rtpmap:%d MPEG4-GENERIC/48000/2
a=fmtp:%d streamtype=5; profile-level-id=1; mode=AAC-hbr; config=1190; SizeLength=13; IndexLength=3; IndexDeltaLength=3;
"""


def audio_payload_types(url):
    """The audio payload type the SDP announces and the one the packets carry."""
    video, audio = udp_pair(), udp_pair()
    session = Session(url)
    sdp = session.play([video.getsockname()[1], audio.getsockname()[1]])
    audio.settimeout(5)
    carried = audio.recv(2048)[1] & 0x7F
    session.sock.close()
    announced = int(re.search(r"m=audio \d+ RTP/AVP (\d+)", sdp).group(1))
    return announced, carried


def measure(url, seconds):
    session = sdp_file = None
    if not url.startswith("rtsp://"):  # a media server's stream (RTMP, HLS, SRT): as it is
        announced = carried = 0
        source = ["-t", str(seconds), "-i", url]
    else:
        announced, carried = audio_payload_types(url)
        time.sleep(1)  # the service stops capture when that client leaves
    if url.startswith("rtsp://") and carried == announced:
        source = ["-rtsp_transport", "udp", "-t", str(seconds), "-i", url]
    elif url.startswith("rtsp://"):
        video, audio = udp_pair(), udp_pair()
        ports = [video.getsockname()[1], audio.getsockname()[1]]
        video.close()
        audio.close()
        session = Session(url)
        session.play(ports)
        with tempfile.NamedTemporaryFile("w", suffix=".sdp", delete=False) as f:
            f.write(SDP % (ports[0], ports[1], carried, carried, carried))
        sdp_file = f.name
        source = ["-protocol_whitelist", "file,udp,rtp", "-t", str(seconds), "-i", sdp_file]
    # The flash square's middle: it lies at about 1/48 to 9/48 of the height from the corner.
    graph = ("[0:v]crop=ih/16:ih/16:ih/12:ih/12,showinfo[v];"
             "[0:a]astats=metadata=1:reset=1,"
             "ametadata=mode=print:key=lavfi.astats.Overall.RMS_level[a]")
    cmd = ["ffmpeg", "-hide_banner", "-nostats"] + source + ["-filter_complex", graph,
           "-map", "[v]", "-f", "null", "-", "-map", "[a]", "-f", "null", "-"]
    if session:
        threading.Thread(target=session.keep_alive, args=(seconds + 8,), daemon=True).start()
    out = subprocess.run(cmd, stderr=subprocess.PIPE, stdout=subprocess.DEVNULL, text=True,
                         timeout=seconds + 30).stderr
    if sdp_file:
        os.unlink(sdp_file)
    video_t = [(float(t), int(y) > 128) for t, y in
               re.findall(r"pts_time:\s*([0-9.]+).*?mean:\[(\d+)", out)]
    audio_t, last = [], None
    for line in out.splitlines():
        m = re.search(r"pts_time:([0-9.]+)", line)
        if m and "showinfo" not in line:
            last = float(m.group(1))
        m = re.search(r"RMS_level=(\S+)", line)
        if m and last is not None:
            level = -1e9 if "inf" in m.group(1) else float(m.group(1))
            audio_t.append((last, level > -40.0))

    def onsets(samples):
        return [t for (t, on), (_, was) in zip(samples[1:], samples) if on and not was]

    v_on, a_on = onsets(video_t), onsets(audio_t)
    fps = (len(video_t) - 1) / (video_t[-1][0] - video_t[0][0]) if len(video_t) > 1 else 0.0
    diffs = []
    for a in a_on:
        v = min(v_on, key=lambda x: abs(x - a), default=None)
        if v is not None and abs(v - a) < 0.5:
            diffs.append((a - v) * 1000.0)
    errors = len(re.findall(r"(?i)error while decoding|concealing", out))
    offset = sum(diffs) / len(diffs) if diffs else float("nan")
    print("frames=%d fps=%.2f audio_frames=%d av_offset_ms=%.1f onsets=%d decode_errors=%d "
          "audio_pt=%d/%d client=%s" % (len(video_t), fps, len(audio_t), offset, len(diffs), errors,
                                        announced, carried, "rtsp" if session is None else "sdp"))
    return 0 if video_t and audio_t and errors == 0 else 1


def read_stamp(luma, width, height):
    """The capture time (low 32 bits of the host's monotonic milliseconds) the host test pattern
    draws along its bottom: 36 cells, white, black, 32 bits (white is 1), black, white."""
    cell = (width // 40) & ~7
    if cell < 8 or height < 8 * cell:
        return None
    x0, y0, half = cell, (height - 2 * cell) & ~7, cell // 2
    stamp = 0
    for i in range(36):
        x = x0 + i * cell + cell // 4
        total = 0
        for y in range(y0 + cell // 4, y0 + cell // 4 + half):
            total += sum(luma[y * width + x:y * width + x + half])
        white = total // (half * half) > 125
        if i in (0, 35):
            if not white:
                return None
        elif i in (1, 34):
            if white:
                return None
        else:
            stamp = stamp << 1 | white
    return stamp


def latency(url, seconds):
    """Capture to display on one machine: the pattern's stamp and this process both read
    CLOCK_MONOTONIC, and a frame counts as displayed when its last byte leaves the decoder."""
    width = int((re.search(r"[?&]width=(\d+)", url) or [0, 1280])[1])
    height = int((re.search(r"[?&]height=(\d+)", url) or [0, 720])[1])
    # RTSP announces its tracks; a media server's stream (RTMP) is probed as ffmpeg likes.
    rtsp = ["-probesize", "32", "-analyzeduration", "0", "-rtsp_transport", "udp"]
    cmd = ["ffmpeg", "-hide_banner", "-loglevel", "error", "-fflags", "nobuffer",
           "-flags", "low_delay"] + (rtsp if url.startswith("rtsp://") else []) + [
           "-t", str(seconds), "-i", url, "-map", "0:v",
           "-vsync", "passthrough", "-pix_fmt", "gray", "-f", "rawvideo", "-"]
    size = width * height
    delays, frames = [], 0
    with subprocess.Popen(cmd, stdout=subprocess.PIPE, stderr=subprocess.DEVNULL) as ff:
        while True:
            frame = ff.stdout.read(size)
            if len(frame) < size:
                break
            now = int(time.clock_gettime(time.CLOCK_MONOTONIC) * 1000) & 0xFFFFFFFF
            frames += 1
            stamp = read_stamp(frame, width, height)
            if stamp is not None:
                delay = (now - stamp) & 0xFFFFFFFF
                if delay < 1 << 31:
                    delays.append(delay)
    if not delays:
        print("frames=%d stamped=0 (no capture stamps: not the host test pattern, or not %dx%d)"
              % (frames, width, height))
        return 1
    delays.sort()

    def pct(p):
        return delays[min(len(delays) - 1, int(p * len(delays)))]
    print("frames=%d stamped=%d latency_ms p50=%d p95=%d max=%d" %
          (frames, len(delays), pct(0.50), pct(0.95), delays[-1]))
    return 0


def split(url, seconds):
    """Receives the RTP itself and hands ffmpeg the access units, noting when each one's last
    packet (the marker) arrived: what the service and the network take is apart from what the
    decoder takes."""
    width = int((re.search(r"[?&]width=(\d+)", url) or [0, 1280])[1])
    height = int((re.search(r"[?&]height=(\d+)", url) or [0, 720])[1])

    def now():
        return int(time.clock_gettime(time.CLOCK_MONOTONIC) * 1000) & 0xFFFFFFFF
    video, audio = udp_pair(), udp_pair()
    session = Session(url)
    session.play([video.getsockname()[1], audio.getsockname()[1]])
    ff = subprocess.Popen(["ffmpeg", "-v", "quiet", "-fflags", "nobuffer", "-flags", "low_delay",
                           "-probesize", "32", "-analyzeduration", "0", "-f", "h264", "-i", "-",
                           "-pix_fmt", "gray", "-f", "rawvideo", "-"],
                          stdin=subprocess.PIPE, stdout=subprocess.PIPE)
    arrivals = []

    def receive():
        end = time.time() + seconds
        video.settimeout(0.5)
        try:
            while time.time() < end:
                try:
                    p = video.recv(2048)
                except socket.timeout:
                    continue
                nal = p[12:]
                if not nal:
                    continue
                if nal[0] & 0x1F == 28 and len(nal) > 2:  # FU-A
                    if nal[1] & 0x80:
                        ff.stdin.write(b"\0\0\0\1" + bytes([(nal[0] & 0xE0) | (nal[1] & 0x1F)]))
                    ff.stdin.write(nal[2:])
                else:
                    ff.stdin.write(b"\0\0\0\1" + nal)
                if p[1] & 0x80:
                    ff.stdin.flush()
                    arrivals.append(now())
        finally:
            ff.stdin.close()
    threading.Thread(target=receive, daemon=True).start()
    threading.Thread(target=session.keep_alive, args=(seconds,), daemon=True).start()
    whole, wire, decode = [], [], []
    while True:
        frame = ff.stdout.read(width * height)
        if len(frame) < width * height:
            break
        t = now()
        stamp = read_stamp(frame, width, height)
        if stamp is None:
            continue
        # The frame's own arrival is the first one at or after its capture; this holds while
        # the service sends each frame within a frame period of its capture.
        mine = [a for a in arrivals[-8:] if (a - stamp) & 0xFFFFFFFF < 1 << 31]
        if not mine:
            continue
        whole.append((t - stamp) & 0xFFFFFFFF)
        wire.append((mine[0] - stamp) & 0xFFFFFFFF)
        decode.append((t - mine[0]) & 0xFFFFFFFF)
    ff.wait()
    if not whole:
        print("stamped=0 (no capture stamps: not the host test pattern, or not %dx%d)"
              % (width, height))
        return 1
    for part in (whole, wire, decode):
        part.sort()
    print("stamped=%d p50/max ms: capture_to_decoded=%d/%d capture_to_last_packet=%d/%d "
          "last_packet_to_decoded=%d/%d" %
          (len(whole), whole[len(whole) // 2], whole[-1], wire[len(wire) // 2], wire[-1],
           decode[len(decode) // 2], decode[-1]))
    return 0


def stamps(url, seconds):
    """The audio RTP time stamp steps: one AAC frame is 1024 at 48 kHz, and the send loop's
    millisecond rounding allows 1008-1056."""
    video, audio = udp_pair(), udp_pair()
    session = Session(url)
    session.play([video.getsockname()[1], audio.getsockname()[1]])
    audio.settimeout(1.0)
    seen = []
    end = time.time() + seconds
    keep = time.time()
    while time.time() < end:
        try:
            packet = audio.recv(2048)
        except socket.timeout:
            continue
        seen.append(struct.unpack("!I", packet[4:8])[0])
        if time.time() - keep > 4:
            session.request("GET_PARAMETER", session.url)
            keep = time.time()
    steps = [(b - a) & 0xFFFFFFFF for a, b in zip(seen, seen[1:])]
    outside = [s for s in steps if not 1008 <= s <= 1056]
    print("audio_steps=%d outside_1008_1056=%d min=%d max=%d" %
          (len(steps), len(outside), min(steps or [0]), max(steps or [0])))
    return 0 if steps and not outside else 1


def first(url, seconds):
    """The NAL unit types that begin the video a client gets (FU-A fragments count once, at
    their start). A client held to a key picture gets an SPS first."""
    video, audio = udp_pair(), udp_pair()
    session = Session(url)
    session.play([video.getsockname()[1], audio.getsockname()[1]])
    video.settimeout(seconds)
    types = []
    try:
        while len(types) < 6:
            p = video.recv(2048)
            if p[12] & 0x1F != 28:
                types.append(p[12] & 0x1F)
            elif p[13] & 0x80:
                types.append(p[13] & 0x1F)
    except socket.timeout:
        pass
    print("first_nal_types=%s" % ",".join(map(str, types)))
    return 0 if types and types[0] == 7 else 1


def guess(url, source):
    """A scripted guesser from `source`: wrong passwords until the service ends the connection.
    Then one more connection from the same address with the right password (the URL's)."""
    wrong = re.sub(r"^rtsp://([^:@/]*):[^@/]*@", r"rtsp://\1:wrong@", url)
    session = Session(wrong, source)
    begin = time.time()
    answers = 0
    try:
        while answers < 100:
            head, _ = session.exchange("DESCRIBE", session.url, "")
            if not head:
                break
            if session.nonce is not None:
                answers += 1  # an answer that carried a (wrong) password
            session.realm = re.search(r'realm="([^"]*)"', head).group(1)
            session.nonce = re.search(r'nonce="([^"]*)"', head).group(1)
    except (OSError, RuntimeError, AttributeError):
        pass
    took = time.time() - begin
    try:
        Session(url, source).request("DESCRIBE", re.sub(r"^rtsp://[^@/]*@", "rtsp://", url))
        after = "served"
    except (OSError, RuntimeError) as e:
        after = "refused (%s)" % type(e).__name__
    print("wrong_answers=%d seconds=%.3f right_password_after=%s" % (answers, took, after))
    return 0


def service_reports(path, offset):
    """The service's latency lines appended to its log since `offset`."""
    try:
        with open(path, "rb") as log:
            log.seek(offset)
            text = log.read().decode("utf-8", "replace")
    except OSError as e:
        return ["cannot read the service log: %s" % e]
    return [line.split(": ", 1)[-1] for line in text.splitlines() if "latency of the last" in line]


def main():
    args = sys.argv[1:]
    log = None
    if "--service-log" in args:
        at = args.index("--service-log")
        log = args[at + 1]
        del args[at:at + 2]
    mode, url = args[0], args[1]
    if mode == "guess":
        sys.exit(guess(url, args[2]))
    seconds = float(args[2]) if len(args) > 2 else 10.0
    modes = {"packets": packets, "measure": measure, "latency": latency, "split": split,
             "stamps": stamps, "first": first}
    offset = os.path.getsize(log) if log and os.path.exists(log) else 0
    rc = modes[mode](url, seconds)
    if log:
        for line in service_reports(log, offset):
            print("service: " + line)
    sys.exit(rc)


if __name__ == "__main__":
    main()
