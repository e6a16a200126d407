#!/usr/bin/env bash
# Makes the pictures of the console's screens in docs/ anew: builds the
# console and the picture program into ./build-screenshots, then runs scripted
# sessions on a simulated host and writes one SVG per screen.
set -euo pipefail
here="$(cd "$(dirname "$0")/.." && pwd)"
cd "$here"
bash scripts/install-deps.sh
cmake -S "$here" -B build-screenshots -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo -DVELK_TESTS=ON >/dev/null
ninja -C build-screenshots -j "$(nproc)" velk velk-simhost velk_screenshots
mkdir -p docs
build-screenshots/tests/e2e/velk_screenshots docs
