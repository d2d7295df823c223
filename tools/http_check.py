#!/usr/bin/env python3
"""Raw HTTP clients that lean on orvex's web viewer (kv.orvex.http) at 127.0.0.1:PORT.

    http_check.py bad PORT                   hostile and malformed requests, each on its own
                                             connection, all at once: one line per request with
                                             the answer's status (or "closed") and how long it took
    http_check.py flood PORT SOURCE COUNT    COUNT connections at once from SOURCE; while they are
                                             open, a page load from 127.0.0.1; then all closed
    http_check.py trickle PORT SOURCE COUNT SECONDS
                                             COUNT connections from SOURCE sending a header byte
                                             every 2 s for SECONDS, then silent until the service
                                             ends them: how each one ended
    http_check.py cycles PORT COUNT QUERY    COUNT times: open the stream, read 8 KB, close;
                                             then COUNT connections closed without a request
    http_check.py viewers PORT COUNT QUERY   COUNT stream readers at once, each reading for 2 s
    http_check.py crowd PORT ADDRESSES EACH KIND QUERY
                                             EACH connections from each of ADDRESSES addresses
                                             (127.0.0.10 on), KIND idle or trickling a header
                                             byte a second; meanwhile, every 2 s for 10 s, how
                                             long 127.0.0.1 waits for the page and for the
                                             stream's first bytes (within 1 s and 3 s: the
                                             stream starts at a key frame)

Every wait is bounded; the exit status is 0 when every answer was within its bound and of the
kind the mode expects, 1 otherwise (the lines say which).
"""
import random
import select
import socket
import sys
import threading
import time

HOST = "127.0.0.1"
WAIT = 15.0  # the service's idle timeout (10 s) and a margin: no answer is awaited longer


def connect(port, source=None, timeout=WAIT):
    s = socket.socket(socket.AF_INET, socket.SOCK_STREAM)
    s.settimeout(timeout)
    if source:
        s.bind((source, 0))
    s.connect((HOST, port))
    s.setsockopt(socket.IPPROTO_TCP, socket.TCP_NODELAY, 1)
    return s


def answer(s, until):
    """The status of the answer on `s` ("closed" when the service closed it without one), read
    until `until`; None when neither came in time."""
    data = b""
    while b"\r\n" not in data:
        left = until - time.monotonic()
        if left <= 0:
            return None
        s.settimeout(left)
        try:
            chunk = s.recv(4096)
        except socket.timeout:
            return None
        except OSError:
            chunk = b""
        if not chunk:
            break
        data += chunk
    if not data:
        return "closed"
    words = data.split(b"\r\n", 1)[0].split()
    if len(words) >= 2 and words[0].startswith(b"HTTP/") and words[1].isdigit():
        return int(words[1])
    return "garbage %r" % data[:40]


def get(port, path="/", source=None):
    """A plain GET: the status and the whole body (the page answers with Content-Length)."""
    s = connect(port, source)
    try:
        s.sendall(("GET %s HTTP/1.1\r\nHost: %s\r\nConnection: close\r\n\r\n" %
                   (path, HOST)).encode())
        data = b""
        until = time.monotonic() + WAIT
        while time.monotonic() < until:
            chunk = s.recv(65536)
            if not chunk:
                break
            data += chunk
        head, _, body = data.partition(b"\r\n\r\n")
        words = head.split(b"\r\n", 1)[0].split()
        return (int(words[1]) if len(words) >= 2 and words[1].isdigit() else None), body
    finally:
        s.close()


def hostile_requests():
    host = b"Host: 127.0.0.1\r\n"
    garbage = random.Random(554).randbytes(4096)  # the same bytes every run
    return [
        ("garbage bytes", garbage + b"\r\n\r\n"),
        ("request line without version", b"GET /stream.mp4\r\n" + host + b"\r\n"),
        ("absurd method", b"X" * 2000 + b" / HTTP/1.1\r\n" + host + b"\r\n"),
        ("100 KB URL", b"GET /" + b"a" * 100000 + b" HTTP/1.1\r\n" + host + b"\r\n"),
        ("200 headers of 1 KB",
         b"GET / HTTP/1.1\r\n" + host +
         b"".join(b"X-Filler-%d: %s\r\n" % (i, b"f" * 1000) for i in range(200)) + b"\r\n"),
        ("header line without colon", b"GET / HTTP/1.1\r\n" + host + b"NoColonHere\r\n\r\n"),
        ("NUL bytes", b"GET / HTTP/1.1\x00\r\n" + host + b"X-A\x00: b\r\n\r\n"),
        ("HTTP/0.9", b"GET /\r\n"),
        ("Content-Length: -1", b"POST / HTTP/1.1\r\n" + host + b"Content-Length: -1\r\n\r\nab"),
        ("broken chunk", b"POST / HTTP/1.1\r\n" + host +
         b"Transfer-Encoding: chunked\r\n\r\nzz\r\nhello\r\n0\r\n\r\n"),
        ("unknown HTTP version", b"GET / HTTP/7.3\r\n" + host + b"\r\n"),
    ]


def bad(port):
    results = {}

    def one(name, request):
        begin = time.monotonic()
        until = begin + WAIT
        try:
            s = connect(port)
        except OSError as e:
            results[name] = ("refused (%s)" % e, 0)
            return
        try:
            try:
                s.sendall(request)
            except OSError:
                pass  # it may stop reading and answer early; what it said is still to read
            status = answer(s, until)
        finally:
            s.close()
        results[name] = (status, time.monotonic() - begin)

    def split(name, request):
        # A valid request one byte per write: the answer must be the same as in one write.
        begin = time.monotonic()
        s = connect(port)
        try:
            for i in range(len(request)):
                s.send(request[i:i + 1])
                time.sleep(0.01)
            status = answer(s, begin + WAIT)
        finally:
            s.close()
        results[name] = (status, time.monotonic() - begin)

    cases = hostile_requests()
    threads = [threading.Thread(target=one, args=case) for case in cases]
    split_name = "valid request one byte per write"
    threads.append(threading.Thread(target=split, args=(
        split_name, b"GET / HTTP/1.1\r\nHost: 127.0.0.1\r\nUser-Agent: trickle\r\n\r\n")))
    for t in threads:
        t.start()
    for t in threads:
        t.join(WAIT + 5)
    rc = 0
    for name in [c[0] for c in cases] + [split_name]:
        status, took = results.get(name, (None, WAIT))
        if name == split_name:
            good = status == 200
        else:
            # A refusal: a 4xx, 505 for a version it does not speak, or the connection closed.
            good = status == "closed" or (isinstance(status, int) and
                                          (400 <= status < 500 or status == 505))
        rc |= 0 if good else 1
        print("%s: %s in %d ms%s" % (name, "no answer" if status is None else status,
                                     took * 1000, "" if good else "  <-- wrong"))
    return rc


def still_open(socks, seconds):
    """The sockets the service has not closed after `seconds`."""
    until = time.monotonic() + seconds
    alive = list(socks)
    while alive and time.monotonic() < until:
        readable, _, _ = select.select(alive, [], [], max(0.0, until - time.monotonic()))
        for s in readable:
            try:
                ended = s.recv(1) == b""
            except OSError:
                ended = True
            if ended:
                alive.remove(s)
    return alive


def flood(port, source, count):
    socks, failed = [], 0
    for _ in range(count):
        try:
            socks.append(connect(port, source, timeout=5))
        except OSError:
            failed += 1
    alive = still_open(socks, 2.0)
    begin = time.monotonic()
    status, body = get(port)
    took = time.monotonic() - begin
    for s in socks:
        s.close()
    print("accepted=%d closed_by_service=%d connect_failed=%d page_from_%s=%s (%d bytes in %d ms)"
          % (len(alive), len(socks) - len(alive), failed, HOST, status, len(body), took * 1000))
    return 0 if status == 200 and body else 1


def trickle(port, source, count, seconds):
    request = b"GET / HTTP/1.1\r\nHost: 127.0.0.1\r\nX-Slow: " + b"s" * 100
    socks = []
    for _ in range(count):
        try:
            socks.append(connect(port, source, timeout=5))
        except OSError:
            pass
    began = time.monotonic()
    alive = still_open(socks, 1.0)
    refused = len(socks) - len(alive)
    sent, step, during = 0, 2.0, 0
    last_byte = time.monotonic()
    while alive and time.monotonic() - began < seconds:
        for s in list(alive):
            try:
                s.send(request[sent:sent + 1])
            except OSError:
                alive.remove(s)
                during += 1
        sent += 1
        last_byte = time.monotonic()
        before = len(alive)
        alive = still_open(alive, step)
        during += before - len(alive)
    open_after = len(alive)
    alive = still_open(alive, WAIT)
    ended_after = time.monotonic() - last_byte
    for s in socks:
        s.close()
    print("refused_at_once=%d ended_while_trickling=%d open_after_%ds=%d bytes_each=%d "
          "then_closed_by_service=%d within %.1f s of their last byte still_open=%d"
          % (refused, during, seconds, open_after, sent, open_after - len(alive), ended_after,
             len(alive)))
    return 0 if not alive else 1


def cycles(port, count, query):
    """A departed viewer's slot is free once the service's next write to it fails, a frame
    interval later: 50 ms between cycles leaves it that and more, yet 16 slots fill only if
    viewers stay counted for most of a second after they left."""
    served = short = 0
    other = []
    for _ in range(count):
        time.sleep(0.05)
        s = connect(port)
        try:
            s.sendall(("GET /stream.mp4?%s HTTP/1.1\r\nHost: %s\r\n\r\n" %
                       (query, HOST)).encode())
            data = b""
            until = time.monotonic() + WAIT
            while len(data) < 8192 and time.monotonic() < until:
                chunk = s.recv(8192)
                if not chunk:
                    break
                data += chunk
        except OSError as e:
            data = str(e).encode()
        finally:
            s.close()
        if data.startswith(b"HTTP/1.1 200") and len(data) >= 8192:
            served += 1
        elif data.startswith(b"HTTP/1.1 200"):
            short += 1
        else:
            other.append(data[:40])
    bare = 0
    for _ in range(count):
        connect(port).close()
        bare += 1
    print("stream_cycles=%d served_8KB=%d short=%d other=%d %s bare_connections=%d"
          % (count, served, short, len(other), other[:2] if other else "", bare))
    return 0 if served == count else 1


def viewers(port, count, query):
    socks = [connect(port) for _ in range(count)]
    for s in socks:
        s.sendall(("GET /stream.mp4?%s HTTP/1.1\r\nHost: %s\r\n\r\n" % (query, HOST)).encode())
    until = time.monotonic() + WAIT
    statuses = [answer(s, until) for s in socks]
    # Those that got a stream read it for 2 s: each must keep receiving.
    got = [0] * count
    stop = time.monotonic() + 2.0
    while time.monotonic() < stop:
        readable, _, _ = select.select(socks, [], [], 0.2)
        for s in readable:
            try:
                got[socks.index(s)] += len(s.recv(65536))
            except OSError:
                pass
    for s in socks:
        s.close()
    streaming = sum(1 for st, n in zip(statuses, got) if st == 200 and n > 0)
    counts = {}
    for st in statuses:
        counts[st] = counts.get(st, 0) + 1
    print("statuses=%s streaming=%d least_bytes_in_2s=%d" % (
        " ".join("%s:%d" % kv for kv in sorted(counts.items(), key=str)), streaming,
        min(n for st, n in zip(statuses, got) if st == 200) if streaming else 0))
    return 0


def first_bytes(port, path, source=None):
    """Seconds until the first bytes of a 200 answer to GET `path`; None when none came in
    time or the answer was not 200."""
    began = time.monotonic()
    try:
        s = connect(port, source, timeout=5)
        s.sendall(("GET %s HTTP/1.1\r\nHost: %s\r\nConnection: close\r\n\r\n" %
                   (path, HOST)).encode())
        status = answer(s, began + 5)
        s.close()
    except OSError:
        return None
    return time.monotonic() - began if status == 200 else None


def crowd(port, addresses, each, kind, query):
    socks = []
    stop = threading.Event()
    for a in range(addresses):
        for _ in range(each):
            try:
                socks.append(connect(port, "127.0.0.%d" % (10 + a), timeout=5))
            except OSError:
                pass

    def trickle_bytes():
        request = b"GET / HTTP/1.1\r\nHost: 127.0.0.1\r\nX-Slow: " + b"s" * 100
        sent = 0
        while not stop.wait(1.0):
            for s in socks:
                try:
                    s.send(request[sent:sent + 1])
                except OSError:
                    pass
            sent += 1

    if kind == "trickling":
        threading.Thread(target=trickle_bytes, daemon=True).start()
    page, stream = [], []
    for _ in range(5):
        time.sleep(2)
        page.append(first_bytes(port, "/"))
        stream.append(first_bytes(port, "/stream.mp4?" + query))
    stop.set()
    for s in socks:
        s.close()
    worst = lambda xs: "never" if None in xs else "%d ms" % (1000 * max(xs))
    print("%s=%d from %d addresses: page worst %s, stream start worst %s (5 tries each)"
          % (kind, len(socks), addresses, worst(page), worst(stream)))
    # The stream starts at a key frame, up to one key frame interval (2 s) away.
    return 0 if None not in page + stream and max(page) < 1.0 and max(stream) < 3.0 else 1


def main():
    mode, port = sys.argv[1], int(sys.argv[2])
    args = sys.argv[3:]
    if mode == "bad":
        sys.exit(bad(port))
    if mode == "flood":
        sys.exit(flood(port, args[0], int(args[1])))
    if mode == "trickle":
        sys.exit(trickle(port, args[0], int(args[1]), float(args[2])))
    if mode == "cycles":
        sys.exit(cycles(port, int(args[0]), args[1]))
    if mode == "viewers":
        sys.exit(viewers(port, int(args[0]), args[1]))
    if mode == "crowd":
        sys.exit(crowd(port, int(args[0]), int(args[1]), args[2], args[3]))
    sys.exit(__doc__)


if __name__ == "__main__":
    main()
