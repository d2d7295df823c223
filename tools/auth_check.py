#!/usr/bin/env python3
"""What a viewer sees of orvex's refusals and password changes, checked with hand-made Digest
answers (urllib's own handler would hide the steps). Every mode prints one line of key=value
and exits non-zero when the service did not answer as a person would want.

    auth_check.py locked SOURCE HTTP_PORT           the RTSP and HTTP answers to a locked address
    auth_check.py size USER:PASSWORD HTTP_PORT       /stream.mp4 at a size the capture refuses
    auth_check.py login USER:PASSWORD HTTP_PORT      served (200) or refused (401) right now
    auth_check.py keep USER:PASSWORD HTTP_PORT FILE  a nonce the service gave, kept for `reuse`
    auth_check.py reuse HTTP_PORT FILE               an answer to that nonce (after a restart)
"""
import hashlib
import http.client
import json
import re
import socket
import sys
import time

WAIT = 5.0


def md5(text):
    return hashlib.md5(text.encode()).hexdigest()


def request(port, path, headers=None, source="127.0.0.1"):
    """One GET: (status, headers as a dict of lower-case names, body up to 4 KiB, seconds)."""
    begin = time.time()
    conn = http.client.HTTPConnection("127.0.0.1", port, timeout=WAIT,
                                      source_address=(source, 0))
    try:
        conn.request("GET", path, headers=headers or {})
        r = conn.getresponse()
        body = r.read(4096).decode("utf-8", "replace") if r.status != 200 else ""
        return r.status, {k.lower(): v for k, v in r.getheaders()}, body, time.time() - begin
    finally:
        conn.close()


def authorization(challenge, user, password, path, nc=1):
    """The Digest answer to a WWW-Authenticate value, with qop=auth when it is offered."""
    fields = dict(re.findall(r'(\w+)="?([^",]*)"?', challenge))
    ha1 = md5("%s:%s:%s" % (user, fields["realm"], password))
    ha2 = md5("GET:" + path)
    value = 'Digest username="%s", realm="%s", nonce="%s", uri="%s"' % (
        user, fields["realm"], fields["nonce"], path)
    if "auth" in fields.get("qop", ""):
        cnonce, count = "0a4f113b", "%08x" % nc
        response = md5(":".join([ha1, fields["nonce"], count, cnonce, "auth", ha2]))
        value += ', qop=auth, nc=%s, cnonce="%s"' % (count, cnonce)
    else:
        response = md5(":".join([ha1, fields["nonce"], ha2]))
    return value + ', response="%s"' % response


def answered(port, credentials, path):
    """(status, headers, body, seconds, the challenge answered) of a request after a challenge."""
    user, password = credentials.split(":", 1)
    status, headers, _, _ = request(port, path)
    if status != 401:
        return status, headers, "", 0.0, ""
    challenge = headers["www-authenticate"]
    auth = authorization(challenge, user, password, path)
    status, headers, body, took = request(port, path, {"Authorization": auth})
    return status, headers, body, took, challenge


def locked(source, port):
    s = socket.create_connection(("127.0.0.1", 554), timeout=WAIT, source_address=(source, 0))
    s.sendall(b"OPTIONS rtsp://127.0.0.1/skyvo.0 RTSP/1.0\r\nCSeq: 1\r\n\r\n")
    rtsp = ""
    try:
        while "\r\n\r\n" not in rtsp:
            chunk = s.recv(1000).decode("latin-1")
            if not chunk:
                break
            rtsp += chunk
    except ConnectionResetError:
        rtsp = rtsp or "reset"
    s.close()
    status, headers, body, _ = request(port, "/", source=source)
    rtsp_status = rtsp.split("\r\n")[0] if rtsp else "closed"
    retry = re.search(r"\r\nRetry-After: (\d+)\r\n", rtsp)
    print("rtsp=%r rtsp_retry_after=%s http=%d http_retry_after=%s challenge=%s body=%r" % (
        rtsp_status, retry.group(1) if retry else "-", status, headers.get("retry-after", "-"),
        "yes" if "www-authenticate" in headers or "WWW-Authenticate" in rtsp else "no",
        body.strip()))
    good = (rtsp_status.startswith("RTSP/1.0 403") and retry and status == 429 and
            headers.get("retry-after", "").isdigit() and "www-authenticate" not in headers)
    return 0 if good else 1


def size(credentials, port):
    status, _, body, took, _ = answered(port, credentials, "/stream.mp4?width=1000&height=700")
    print("status=%d seconds=%.3f body=%r" % (status, took, body.strip()))
    return 0 if status == 400 and "1280x720" in body and took < 1.0 else 1


def login(credentials, port):
    status, _, _, _, _ = answered(port, credentials, "/")
    print("status=%d" % status)
    return 0


def keep(credentials, port, path):
    status, _, _, _, challenge = answered(port, credentials, "/")
    with open(path, "w") as f:
        json.dump({"credentials": credentials, "challenge": challenge}, f)
    print("status=%d" % status)
    return 0 if status == 200 else 1


def reuse(port, path):
    with open(path) as f:
        kept = json.load(f)
    user, password = kept["credentials"].split(":", 1)
    auth = authorization(kept["challenge"], user, password, "/", nc=2)
    status, headers, _, _ = request(port, "/", {"Authorization": auth})
    stale = "stale=true" in headers.get("www-authenticate", "").lower()
    print("status=%d stale=%s" % (status, "yes" if stale else "no"))
    return 0 if status == 200 or (status == 401 and stale) else 1


def main():
    mode, args = sys.argv[1], sys.argv[2:]
    modes = {"locked": lambda: locked(args[0], int(args[1])),
             "size": lambda: size(args[0], int(args[1])),
             "login": lambda: login(args[0], int(args[1])),
             "keep": lambda: keep(args[0], int(args[1]), args[2]),
             "reuse": lambda: reuse(int(args[0]), args[1])}
    sys.exit(modes[mode]())


if __name__ == "__main__":
    main()
