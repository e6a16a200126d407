#!/usr/bin/env bash
# Installs what is missing, builds, and runs every test twice: in a normal
# build and in a build with AddressSanitizer and UndefinedBehaviorSanitizer;
# in between, the benchmark's checks in the optimised build.
set -euo pipefail
here="$(cd "$(dirname "$0")/.." && pwd)"
cd "$here"
bash scripts/install-deps.sh

BUILD_TYPE=Debug bash scripts/build.sh build-test
(cd build-test && ctest --output-on-failure -j "$(nproc)" --timeout 300)

# The performance ratios against the minimal ncurses program, in the
# optimised build: bytes per key and per changed cell, keys typed ahead, the
# first frame, peak memory and idle wake-ups (ratios only, never times).
bash scripts/bench.sh --check

BUILD_TYPE=Debug bash scripts/build.sh build-sanitize -DVELK_SANITIZE=ON
export ASAN_OPTIONS=detect_leaks=1:abort_on_error=1:verify_asan_link_order=0
export UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1
(cd build-sanitize && ctest --output-on-failure -j "$(nproc)" --timeout 600)

# Each fuzz target briefly (a clang build of the libraries and fuzz/).
bash scripts/fuzz.sh 15
