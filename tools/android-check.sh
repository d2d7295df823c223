#!/usr/bin/env bash
# Syntax-only check, for 32-bit ARM, of every source the television build can compile (all of
# Android.bp's srcs: the shared layers, the Android adapters, and the optional web viewer and
# publisher with the stand-ins a build without them takes).
# Uses Debian's AOSP headers for binder, utils, log and cutils; tests/android_shims supplies
# declaration-only stand-ins for what Debian lacks (camera, media, audio); the vendor SDK's
# declarations come from platform/android/vendor. Nothing is linked or run.
set -u

ROOT="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
CXX=arm-linux-gnueabihf-g++
AOSP=/usr/include/android
PACKAGES=(g++-arm-linux-gnueabihf android-platform-frameworks-native-headers
          android-libutils-dev android-liblog-dev android-libcutils-dev libmicrohttpd-dev)

missing=()
for pkg in "${PACKAGES[@]}"; do
    if ! dpkg-query -W -f='${Status}' "$pkg" 2>/dev/null | grep -q 'install ok installed'; then
        missing+=("$pkg")
    fi
done
if [ "${#missing[@]}" -gt 0 ]; then
    echo "android-check: installing ${missing[*]}"
    if ! { apt-get update -qq && DEBIAN_FRONTEND=noninteractive \
            apt-get install -y -qq "${missing[@]}"; } >/dev/null; then
        echo "android-check: could not install ${missing[*]}" >&2
        exit 2
    fi
fi

for header in binder/Binder.h utils/String16.h log/log.h cutils/properties.h; do
    if [ ! -f "$AOSP/$header" ]; then
        echo "android-check: $AOSP/$header not found" >&2
        exit 2
    fi
done

# libmicrohttpd's one header, which the television build takes from its own copy of the
# library: Debian's is the same release's, and a folder of its own keeps the rest of
# /usr/include (this machine's, not ARM's) out of sight.
mhd=$(mktemp -d)
trap 'rm -rf "$mhd"' EXIT
ln -s /usr/include/microhttpd.h "$mhd/microhttpd.h"

# The AOSP and shim directories are system includes: their own warnings (clang pragmas,
# libc++-style transitive includes) are not ours to fix. Our sources get the full warning set.
FLAGS=(-std=c++17 -fsyntax-only -Wall -Wextra -Werror
       -I"$ROOT"
       -isystem "$AOSP"
       -isystem "$ROOT/tests/android_shims"
       -I"$ROOT/platform/android/vendor"
       -isystem "$mhd")

passed=0
failed=0
shopt -s nullglob
files=()
while IFS= read -r src; do
    files+=("$ROOT/$src")
done < <(sed -n '/srcs: \[/,/\]/s/^ *"\([^"]*\)",*$/\1/p' "$ROOT/Android.bp")
if [ "${#files[@]}" -eq 0 ]; then
    echo "android-check: no sources listed in Android.bp" >&2
    exit 2
fi
for file in "${files[@]}"; do
    rel="${file#"$ROOT"/}"
    if output="$("$CXX" "${FLAGS[@]}" "$file" 2>&1)"; then
        echo "android-check: ok $rel"
        passed=$((passed + 1))
    else
        echo "android-check: FAIL $rel"
        printf '%s\n' "$output" | sed 's/^/    /'
        failed=$((failed + 1))
    fi
done

echo "android-check: $passed passed, $failed failed"
[ "$failed" -eq 0 ]
