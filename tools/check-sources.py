#!/usr/bin/env python3
"""The television build (Android.bp) must compile what the CMake build's television layers do.

Every library target in CMakeLists.txt except the host and fake platforms, plus the service's
entry point, is a television layer; Android.bp adds the android platform adapters on top. Some
layers are optional on the television: each optional Android.bp defaults module must list
exactly the sources of the CMake targets it stands for, the service's cc_binary must choose
one of each pair (and by default the one that needs no vendor library), and everything else
must be in the core. A source in one list and not the other fails the check, each named once.
"""
import pathlib
import re
import sys

# WebRTC playback is built for the host platform only, so far.
HOST_ONLY_TARGETS = {"orvex_platform_host", "orvex_platform_fake", "orvex_webrtc_dtls",
                     "orvex_webrtc_proto", "orvex_webrtc"}
ANDROID_ONLY = re.compile(r"^platform/android/")

# Android.bp defaults module -> the CMake targets whose sources it lists, in pairs of
# (built in, left out); the left-out one is the default.
OPTIONAL = {
    "web viewer": (("orvex_web_viewer", {"orvex_fmp4", "orvex_web"}),
                   ("orvex_without_web_viewer", {"orvex_web_absent"})),
    "publishing": (("orvex_publishing", {"orvex_publish"}),
                   ("orvex_without_publishing", {"orvex_publish_absent"})),
}


def cmake_targets(text):
    targets = {}
    for match in re.finditer(r"add_(library|executable)\(\s*(\w+)([^)]*)\)", text):
        kind, name, body = match.groups()
        if name in HOST_ONLY_TARGETS:
            continue
        words = body.split()
        if kind == "executable":
            # The executable links the host platform; of its sources only the entry is shared.
            words = [w for w in words if w == "service/main.cpp"]
        targets[name] = {w for w in words if re.search(r"\.(c|cc|cpp)$", w)}
    return targets


def bp_modules(text):
    """name -> (module type, sources without the android adapters, defaults it uses)."""
    modules = {}
    text = re.sub(r"//[^\n]*", "", text)
    for match in re.finditer(r"^(\w+) \{(.*?)^\}", text, re.S | re.M):
        kind, body = match.groups()
        if not kind.startswith("cc_"):
            continue
        name = re.search(r'name:\s*"([^"]+)"', body)
        if not name:
            continue
        srcs = re.search(r"srcs:\s*\[(.*?)\]", body, re.S)
        defaults = re.search(r"defaults:\s*\[(.*?)\]", body, re.S)
        sources = set(re.findall(r'"([^"]+)"', srcs.group(1))) if srcs else set()
        modules[name.group(1)] = (
            kind,
            {s for s in sources if not ANDROID_ONLY.match(s)},
            re.findall(r'"([^"]+)"', defaults.group(1)) if defaults else [],
        )
    return modules


def compare(what, cmake, bp, problems):
    problems += [f"check-sources: {s} is built by CMake but not by Android.bp ({what})"
                 for s in sorted(cmake - bp)]
    problems += [f"check-sources: {s} is built by Android.bp ({what}) but not by CMake"
                 for s in sorted(bp - cmake)]


def main():
    top = pathlib.Path(sys.argv[1] if len(sys.argv) > 1 else pathlib.Path(__file__).parent.parent)
    targets = cmake_targets((top / "CMakeLists.txt").read_text())
    modules = bp_modules((top / "Android.bp").read_text())
    problems = []

    optional_targets = set()
    optional_modules = set()
    for feature, pair in OPTIONAL.items():
        for module, names in pair:
            optional_modules.add(module)
            optional_targets |= names
            if module not in modules:
                problems.append(f"check-sources: Android.bp has no {module} ({feature})")
                continue
            cmake = set().union(*(targets.get(n, set()) for n in names))
            compare(module, cmake, modules[module][1], problems)

    binary = modules.get("orvex")
    if binary is None or binary[0] != "cc_binary":
        problems.append("check-sources: Android.bp has no cc_binary orvex")
        chosen = []
    else:
        chosen = binary[2]
    for feature, ((built_in, _), (left_out, _)) in OPTIONAL.items():
        if (built_in in chosen) == (left_out in chosen):
            problems.append(f"check-sources: orvex must use one of {built_in} and {left_out}")
        elif built_in in chosen:
            problems.append(f"check-sources: the {feature} is built in by default; it needs a "
                            f"vendor library, so {left_out} is the default")

    core_cmake = set().union(*(s for n, s in targets.items() if n not in optional_targets))
    core_bp = set().union(*(m[1] for n, m in modules.items() if n not in optional_modules))
    compare("core", core_cmake, core_bp, problems)

    listed = set().union(*targets.values()) | set().union(*(m[1] for m in modules.values()))
    problems += [f"check-sources: {s} is listed but does not exist"
                 for s in sorted(listed) if not (top / s).is_file()]
    for line in problems:
        print(line)
    print(f"check-sources: {len(core_cmake)} core television sources in CMake, {len(core_bp)} in "
          f"Android.bp; {len(OPTIONAL)} optional parts; {len(problems)} differences")
    return 1 if problems else 0


if __name__ == "__main__":
    sys.exit(main())
