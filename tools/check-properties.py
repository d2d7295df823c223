#!/usr/bin/env python3
"""The host warns about property keys that nothing reads: its list of known keys
(platform/host/KnownProperties.cpp) must hold every key the sources read, and nothing else."""
import pathlib
import re
import sys

top = pathlib.Path(__file__).resolve().parent.parent
key = re.compile(r'"((?:kv\.orvex|orvex\.host|ro\.board|kelvo\.build)\.[A-Za-z0-9_.]+)"')
listed_file = top / "platform/host/KnownProperties.cpp"
listed = set(key.findall(listed_file.read_text()))
read = set()
for folder in ("auth", "base", "buffers", "capture", "codec", "config", "media", "net", "platform",
               "publish", "rtp", "rtsp", "server", "service", "stream", "sync", "web", "webrtc"):
    for path in (top / folder).rglob("*.[ch]*"):
        if path != listed_file and path.suffix in (".cpp", ".h"):
            read |= set(key.findall(path.read_text(errors="replace")))
for k in sorted(read - listed):
    print("check-properties: %s is read but not in %s" % (k, listed_file.relative_to(top)))
for k in sorted(listed - read):
    print("check-properties: %s is listed but nothing reads it" % k)
print("check-properties: %d keys read, %d listed, %d differences"
      % (len(read), len(listed), len(read ^ listed)))
sys.exit(1 if read ^ listed else 0)
