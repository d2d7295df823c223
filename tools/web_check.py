#!/usr/bin/env python3
"""Checks the web viewer in a real browser: Debian's headless chromium, driven through the
DevTools protocol over a pipe, so nothing beyond the standard library is needed.

    web_check.py play URL SECONDS --fps N [--no-audio] [--screenshot PNG]
        open the page, wait until it plays, then watch it for SECONDS; one line
        frames=.. fps=.. audio_bytes=.. errors=.. size=WxH reconnects=.. jumps=.. delay_ms=..
        (jumps: skips to the live edge; delay: buffered but not yet shown) and exit 0 only
        if it decoded at least 0.9 N frames a second, decoded sound (unless --no-audio)
        and saw no media error
    web_check.py latency URL SECONDS
        read the capture stamp the host test pattern draws in each frame the page shows
        and print the delay from capture to display, as rtsp_check.py latency does

URL is the page's (http://host:port/?width=..), with user:password@ when the service asks
for Digest: the browser is then given those credentials when challenged.
"""
import argparse
import base64
import fcntl
import json
import os
import select
import shutil
import signal
import subprocess
import sys
import tempfile
import time
import urllib.parse
import urllib.request

START_TIMEOUT = 15     # s from opening the page until it plays
COMMAND_TIMEOUT = 10   # s for any one DevTools command


class Browser:
    """One headless chromium and the DevTools session of its single page."""

    def __init__(self, credentials=None):
        self.credentials = credentials
        self.profile = tempfile.mkdtemp(prefix="web_check.")
        self.proc = None
        self.session = None
        self.next_id = 0
        self.pending = b""
        self.answered = set()  # requests given the credentials
        to_browser = os.pipe()
        from_browser = os.pipe()
        # Chromium reads commands on fd 3 and writes answers on fd 4. The ends are first moved
        # above 10 so that putting them at 3 and 4 in the child cannot overwrite one another.
        self.child_in = fcntl.fcntl(to_browser[0], fcntl.F_DUPFD_CLOEXEC, 10)
        self.child_out = fcntl.fcntl(from_browser[1], fcntl.F_DUPFD_CLOEXEC, 10)
        os.close(to_browser[0])
        os.close(from_browser[1])
        self.write_fd, self.read_fd = to_browser[1], from_browser[0]
        child_in, child_out = self.child_in, self.child_out

        def place_pipe():
            os.dup2(child_in, 3)
            os.dup2(child_out, 4)
        cmd = [shutil.which("chromium") or "chromium", "--headless=new", "--no-sandbox",
               "--remote-debugging-pipe", "--user-data-dir=" + self.profile,
               "--autoplay-policy=no-user-gesture-required", "--mute-audio",
               "--no-first-run", "--no-default-browser-check", "--disable-extensions",
               "--disable-background-networking", "--disable-component-update",
               "--disable-dev-shm-usage", "--disable-background-timer-throttling",
               "--disable-renderer-backgrounding", "--disable-backgrounding-occluded-windows",
               "--window-size=1280,860",
               # WebRTC on loopback and inside a network namespace: without these chromium
               # gathers no address to check from (or waits for an mDNS name forever).
               "--allow-loopback-in-peer-connection",
               "--disable-features=WebRtcHideLocalIpsWithMdns", "about:blank"]
        try:
            # Its own process group: the renderer and GPU children go down with it at the end.
            # Nothing else leaks in without close_fds: Python opens every descriptor
            # close-on-exec, and pass_fds cannot be used as it names the parent's 3 and 4.
            self.proc = subprocess.Popen(cmd, preexec_fn=place_pipe, close_fds=False,
                                         start_new_session=True, stdin=subprocess.DEVNULL,
                                         stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        finally:
            os.close(self.child_in)
            os.close(self.child_out)
        try:
            self.attach()
        except BaseException:
            self.close()
            raise

    def attach(self):
        targets = self.call("Target.getTargets")["targetInfos"]
        page = next((t for t in targets if t["type"] == "page"), None)
        target = page["targetId"] if page else \
            self.call("Target.createTarget", url="about:blank")["targetId"]
        self.session = self.call("Target.attachToTarget", targetId=target,
                                 flatten=True)["sessionId"]
        self.call("Page.enable", session=True)
        self.call("Runtime.enable", session=True)
        if self.credentials:
            self.call("Fetch.enable", session=True, handleAuthRequests=True,
                      patterns=[{"urlPattern": "*"}])

    def close(self):
        if self.proc:
            # Asked first: chromium then waits for its own children, where a signal to them
            # all would leave them unreaped. The signals are for a browser that does not go.
            if self.proc.poll() is None:
                try:
                    self.send("Browser.close")
                    self.proc.wait(timeout=5)
                except (OSError, subprocess.TimeoutExpired):
                    pass
            for sig in (signal.SIGTERM, signal.SIGKILL):
                try:
                    os.killpg(self.proc.pid, sig)
                except ProcessLookupError:
                    break
                try:
                    self.proc.wait(timeout=3)
                except subprocess.TimeoutExpired:
                    pass
            self.proc.wait()
        for fd in (self.write_fd, self.read_fd):
            try:
                os.close(fd)
            except OSError:
                pass
        shutil.rmtree(self.profile, ignore_errors=True)

    def send(self, method, session=False, **params):
        self.next_id += 1
        message = {"id": self.next_id, "method": method, "params": params}
        if session:
            message["sessionId"] = self.session
        data = json.dumps(message).encode() + b"\0"
        while data:
            data = data[os.write(self.write_fd, data):]
        return self.next_id

    def call(self, method, session=False, **params):
        wanted = self.send(method, session, **params)
        deadline = time.monotonic() + COMMAND_TIMEOUT
        while True:
            message = self.receive(deadline - time.monotonic())
            if message is None:
                raise RuntimeError("chromium did not answer %s in %d s" % (method, COMMAND_TIMEOUT))
            if message.get("id") == wanted:
                if "error" in message:
                    raise RuntimeError("%s: %s" % (method, message["error"].get("message")))
                return message.get("result", {})

    def receive(self, timeout):
        """The next message, events handled on the way; None when none came within timeout."""
        deadline = time.monotonic() + max(0, timeout)
        while True:
            end = self.pending.find(b"\0")
            if end >= 0:
                message = json.loads(self.pending[:end])
                self.pending = self.pending[end + 1:]
                if "method" in message:
                    self.on_event(message)
                    continue
                return message
            left = deadline - time.monotonic()
            if left <= 0 or not select.select([self.read_fd], [], [], left)[0]:
                return None
            chunk = os.read(self.read_fd, 1 << 20)
            if not chunk:
                raise RuntimeError("chromium closed its DevTools pipe (exit %s)" % self.proc.poll())
            self.pending += chunk

    def on_event(self, message):
        method, params = message["method"], message.get("params", {})
        # With Fetch on, every request waits for us; only the auth challenge needs an answer.
        if method == "Fetch.requestPaused":
            self.send("Fetch.continueRequest", session=True, requestId=params["requestId"])
        elif method == "Fetch.authRequired":
            # Asked again for the same request means the credentials were refused: a wrong
            # password is given once, not until the service locks us out.
            request = params["requestId"]
            if request in self.answered:
                self.send("Fetch.continueWithAuth", session=True, requestId=request,
                          authChallengeResponse={"response": "CancelAuth"})
                return
            self.answered.add(request)
            user, password = self.credentials
            self.send("Fetch.continueWithAuth", session=True, requestId=request,
                      authChallengeResponse={"response": "ProvideCredentials",
                                             "username": user, "password": password})
        elif method == "Runtime.exceptionThrown":
            details = params.get("exceptionDetails", {})
            text = details.get("exception", {}).get("description") or details.get("text")
            print("web_check: page exception: %s" % text, file=sys.stderr)

    def wait(self, seconds):
        """Lets seconds pass while still answering the browser's requests."""
        deadline = time.monotonic() + seconds
        while time.monotonic() < deadline:
            message = self.receive(deadline - time.monotonic())
            if message is not None and "id" in message:
                continue  # a late answer to a command already given up on

    def evaluate(self, expression):
        result = self.call("Runtime.evaluate", session=True, expression=expression,
                           returnByValue=True, awaitPromise=True)
        if "exceptionDetails" in result:
            raise RuntimeError("page script failed: %s" %
                               result["exceptionDetails"].get("exception", {}).get("description"))
        return result["result"].get("value")

    def stats(self):
        return self.evaluate("window.orvexStats ? window.orvexStats() : null")


def split_credentials(url):
    """The URL without user:password@, and the credentials (or None). Chromium is not handed
    them in the URL: the page fetches relative to its own address, and fetch refuses URLs
    that carry credentials."""
    parts = urllib.parse.urlsplit(url)
    if parts.username is None:
        return url, None
    host = parts.hostname + (":%d" % parts.port if parts.port else "")
    if ":" in parts.hostname:
        host = "[%s]" % parts.hostname + (":%d" % parts.port if parts.port else "")
    plain = urllib.parse.urlunsplit((parts.scheme, host, parts.path, parts.query, parts.fragment))
    return plain, (urllib.parse.unquote(parts.username),
                   urllib.parse.unquote(parts.password or ""))


def open_playing(url):
    """A browser showing the page, once it plays; raises when it does not within the bound."""
    plain, credentials = split_credentials(url)
    browser = Browser(credentials)
    try:
        browser.call("Page.navigate", session=True, url=plain)
        deadline = time.monotonic() + START_TIMEOUT
        stats = None
        while time.monotonic() < deadline:
            browser.wait(0.25)
            stats = browser.stats()
            if stats and stats["state"] == "playing" and stats["frames"] > 0:
                return browser
        raise RuntimeError("not playing after %d s; last stats: %s" %
                           (START_TIMEOUT, json.dumps(stats)))
    except BaseException:
        browser.close()
        raise


def grown(before, after):
    """How much a counter grew between two readings, when it may have restarted from 0."""
    return after - before if after >= before else after


SETTLE_SECONDS = 2.0


def play(args):
    browser = open_playing(args.url)
    try:
        # The first moments go to reaching the live edge (the page may jump there once): the
        # rate is taken from then on.
        browser.wait(SETTLE_SECONDS)
        first = last = browser.stats()
        frames = audio = 0
        start = time.monotonic()
        end = start + args.seconds
        while time.monotonic() < end:
            browser.wait(min(0.5, end - time.monotonic()))
            now = browser.stats()
            # A reconnect gives the page a new media source, whose counters start at 0.
            frames += grown(last["frames"], now["frames"])
            audio += grown(last["audioBytes"], now["audioBytes"])
            last = now
        elapsed = time.monotonic() - start
        if args.screenshot:
            shot = browser.call("Page.captureScreenshot", session=True, format="png")
            with open(args.screenshot, "wb") as f:
                f.write(base64.b64decode(shot["data"]))
    finally:
        browser.close()
    if last["audioBytes"] < 0:
        audio = -1  # a browser that does not count decoded sound
    fps = frames / elapsed
    print("frames=%d fps=%.1f audio_bytes=%d errors=%d size=%dx%d reconnects=%d jumps=%d "
          "delay_ms=%d transport=%s" % (frames, fps, audio, len(last["errors"]), last["width"],
                                        last["height"], last["reconnects"] - first["reconnects"],
                                        last["jumps"] - first["jumps"], last["delayMs"],
                                        last.get("transport", "mse")))
    for error in last["errors"]:
        print("web_check: page error: %s" % error, file=sys.stderr)
    failures = []
    if fps < 0.9 * args.fps:
        failures.append("decoded %.1f frames a second, want at least %.1f" % (fps, 0.9 * args.fps))
    if not args.no_audio and audio <= 0:
        failures.append("no sound decoded")
    if last["errors"]:
        failures.append("media errors")
    for failure in failures:
        print("web_check: %s" % failure, file=sys.stderr)
    return 1 if failures else 0


# Runs in the page: reads the stamp from every frame it presents, as rtsp_check.py's
# read_stamp does from decoded frames (same cells, same averaging, luma from RGB).
STAMP_READER = r"""
(() => {
  const video = document.querySelector('video');
  const record = window.webCheckStamps = { frames: 0, stamps: [] };
  const canvas = document.createElement('canvas');
  const ctx = canvas.getContext('2d', { willReadFrequently: true });
  function readStamp(width, height) {
    const cell = Math.floor(width / 40) & ~7;
    if (cell < 8 || height < 8 * cell) return null;
    const x0 = cell, y0 = (height - 2 * cell) & ~7, half = cell >> 1, top = y0 + (cell >> 2);
    // Only the stamp's rows are drawn (see onFrame): row 0 of the canvas is row `top`.
    const rows = ctx.getImageData(0, 0, width, half).data;
    let stamp = 0;
    for (let i = 0; i < 36; i++) {
      const x = x0 + i * cell + (cell >> 2);
      let total = 0;
      for (let y = 0; y < half; y++) {
        for (let k = (y * width + x) * 4, e = k + half * 4; k < e; k += 4) {
          total += 0.299 * rows[k] + 0.587 * rows[k + 1] + 0.114 * rows[k + 2];
        }
      }
      const white = Math.floor(total / (half * half)) > 125;
      if (i === 0 || i === 35) { if (!white) return null; }
      else if (i === 1 || i === 34) { if (white) return null; }
      else stamp = (stamp * 2 + (white ? 1 : 0)) >>> 0;
    }
    return stamp;
  }
  function onFrame(now, meta) {
    const shown = performance.timeOrigin + (meta.expectedDisplayTime || now);
    const width = video.videoWidth, height = video.videoHeight;
    record.frames++;
    if (width && height) {
      // Drawing the whole picture for a strip of it costs the page frames on a slow machine.
      const cell = Math.floor(width / 40) & ~7, half = Math.max(1, cell >> 1);
      const top = ((height - 2 * cell) & ~7) + (cell >> 2);
      if (canvas.width !== width || canvas.height !== half) {
        canvas.width = width;
        canvas.height = half;
      }
      ctx.drawImage(video, 0, top, width, half, 0, 0, width, half);
      const stamp = readStamp(width, height);
      if (stamp !== null) record.stamps.push([stamp, shown]);
    }
    video.requestVideoFrameCallback(onFrame);
  }
  if (!video.requestVideoFrameCallback) throw new Error('no requestVideoFrameCallback');
  video.requestVideoFrameCallback(onFrame);
  return true;
})()
"""


def realtime_minus_monotonic_ms():
    """CLOCK_REALTIME - CLOCK_MONOTONIC in ms, from the tightest of several readings."""
    best = None
    for _ in range(20):
        before = time.clock_gettime(time.CLOCK_REALTIME)
        mono = time.clock_gettime(time.CLOCK_MONOTONIC)
        after = time.clock_gettime(time.CLOCK_REALTIME)
        if best is None or after - before < best[0]:
            best = (after - before, (before + after) / 2 - mono)
    return best[1] * 1000


def latency(args):
    browser = open_playing(args.url)
    try:
        browser.evaluate(STAMP_READER)
        browser.wait(args.seconds)
        record = browser.evaluate("JSON.stringify(window.webCheckStamps)")
    finally:
        browser.close()
    record = json.loads(record)
    # The browser's times are wall-clock ms, the stamps monotonic ms: one offset between them.
    offset = realtime_minus_monotonic_ms()
    delays = []
    for stamp, shown in record["stamps"]:
        delay = (int(round(shown - offset)) - stamp) & 0xFFFFFFFF
        if delay < 1 << 31:
            delays.append(delay)
    if not delays:
        print("frames=%d stamped=0 (no capture stamps: not the host test pattern?)" %
              record["frames"])
        return 1
    delays.sort()

    def pct(p):
        return delays[min(len(delays) - 1, int(p * len(delays)))]
    # A freeze: more than 200 ms between two pictures shown, as a viewer sees a stall.
    shown = [s for _, s in record["stamps"]]
    pauses = [b - a for a, b in zip(shown, shown[1:])]
    print("frames=%d stamped=%d latency_ms p50=%d p95=%d max=%d freezes=%d longest_gap_ms=%d" %
          (record["frames"], len(delays), pct(0.50), pct(0.95), delays[-1],
           sum(1 for p in pauses if p > 200), max(pauses, default=0)))
    return 0


def gaps(args):
    """Reads the stream itself, without a browser, and notes when each picture's fragment
    arrives: the longest wait between two shows how long a viewer went without a picture."""
    parts = urllib.parse.urlsplit(args.url)
    plain = urllib.parse.urlunsplit(parts._replace(netloc=parts.hostname + (
        ":%d" % parts.port if parts.port else "")))
    passwords = urllib.request.HTTPPasswordMgrWithDefaultRealm()
    if parts.username:
        passwords.add_password(None, plain, urllib.parse.unquote(parts.username),
                               urllib.parse.unquote(parts.password or ""))
    opener = urllib.request.build_opener(urllib.request.HTTPDigestAuthHandler(passwords))
    arrivals, pending = [], b""
    end = time.monotonic() + args.seconds
    with opener.open(plain, timeout=10) as answer:
        while time.monotonic() < end:
            chunk = answer.read1(65536)
            if not chunk:
                break
            pending += chunk
            while len(pending) >= 8:
                size = int.from_bytes(pending[:4], "big")
                if size < 8:
                    raise RuntimeError("not an MP4 box stream")
                if len(pending) < size:
                    break
                box, pending = pending[:size], pending[size:]
                at = box.find(b"tfhd")
                if box[4:8] == b"moof" and at > 0 and box[at + 8:at + 12] == b"\0\0\0\1":
                    arrivals.append(time.monotonic())
    if len(arrivals) < 2:
        raise RuntimeError("%d pictures arrived" % len(arrivals))
    longest = max(b - a for a, b in zip(arrivals, arrivals[1:]))
    print("pictures=%d longest_gap_ms=%d" % (len(arrivals), longest * 1000))
    return 0


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n\n")[0])
    sub = parser.add_subparsers(dest="mode", required=True)
    p = sub.add_parser("play", help="watch the page play and check frame rate, sound, errors")
    p.add_argument("url")
    p.add_argument("seconds", type=float)
    p.add_argument("--fps", type=float, required=True, help="the stream's frame rate")
    p.add_argument("--no-audio", action="store_true", help="the stream has no sound")
    p.add_argument("--screenshot", metavar="PNG", help="save what the page shows at the end")
    p = sub.add_parser("latency", help="capture-to-display delay of the host test pattern")
    p.add_argument("url")
    p.add_argument("seconds", type=float)
    p = sub.add_parser("gaps", help="read /stream.mp4 and print the longest wait for a picture")
    p.add_argument("url")
    p.add_argument("seconds", type=float)
    args = parser.parse_args()
    try:
        return {"play": play, "latency": latency, "gaps": gaps}[args.mode](args)
    except RuntimeError as e:
        print("web_check: %s" % e, file=sys.stderr)
        return 2


if __name__ == "__main__":
    sys.exit(main())
