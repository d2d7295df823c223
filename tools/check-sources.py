#!/usr/bin/env python3
"""The television build (Android.bp) must compile what the CMake build's television layers do.

Every library target in CMakeLists.txt except the host and fake platforms, plus the service's
entry point, is a television layer; Android.bp adds the android platform adapters on top. A
source in one list and not the other fails the check, each named once.
"""
import pathlib
import re
import sys

HOST_ONLY_TARGETS = {"orvex_platform_host", "orvex_platform_fake"}
ANDROID_ONLY = re.compile(r"^platform/android/")


def cmake_sources(text):
    sources = set()
    for match in re.finditer(r"add_(library|executable)\(\s*(\w+)([^)]*)\)", text):
        kind, name, body = match.groups()
        if name in HOST_ONLY_TARGETS:
            continue
        words = body.split()
        if kind == "executable":
            # The executable links the host platform; of its sources only the entry is shared.
            words = [w for w in words if w == "service/main.cpp"]
        sources.update(w for w in words if re.search(r"\.(c|cc|cpp)$", w))
    return sources


def bp_sources(text):
    block = re.search(r"srcs:\s*\[(.*?)\]", text, re.S)
    if not block:
        return set()
    return {s for s in re.findall(r'"([^"]+)"', block.group(1)) if not ANDROID_ONLY.match(s)}


def main():
    top = pathlib.Path(sys.argv[1] if len(sys.argv) > 1 else pathlib.Path(__file__).parent.parent)
    cmake = cmake_sources((top / "CMakeLists.txt").read_text())
    bp = bp_sources((top / "Android.bp").read_text())
    problems = [f"check-sources: {s} is built by CMake but not by Android.bp"
                for s in sorted(cmake - bp)]
    problems += [f"check-sources: {s} is built by Android.bp but not by CMake"
                 for s in sorted(bp - cmake)]
    missing = [s for s in sorted(cmake | bp) if not (top / s).is_file()]
    problems += [f"check-sources: {s} is listed but does not exist" for s in missing]
    for line in problems:
        print(line)
    print(f"check-sources: {len(cmake)} television sources in CMake, {len(bp)} in Android.bp, "
          f"{len(problems)} differences")
    return 1 if problems else 0


if __name__ == "__main__":
    sys.exit(main())
