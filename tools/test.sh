#!/usr/bin/env bash
# Builds everything in build/ and runs every test with ctest.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
"$top/tools/install-deps.sh"
# CI sets ORVEX_WERROR=ON: warnings fail the build there.
cmake -S "$top" -B "$top/build" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo \
      -DORVEX_WERROR="${ORVEX_WERROR:-OFF}" >/dev/null
cmake --build "$top/build"
ctest --test-dir "$top/build" --output-on-failure -j "$(nproc)"
