#!/usr/bin/env bash
# Builds an optimised tree with the benchmark and runs it: the console beside
# a minimal ncurses menu program, as ratios from the same run.
set -euo pipefail
here="$(cd "$(dirname "$0")/.." && pwd)"
cd "$here"
bash scripts/install-deps.sh
BUILD_TYPE=Release bash scripts/build.sh build-bench -DVELK_TESTS=ON
exec build-bench/bench/velk_bench "$@"
