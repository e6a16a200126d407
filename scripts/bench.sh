#!/usr/bin/env bash
# Builds the benchmark in an optimised tree (the release build's settings)
# and runs it: the console beside a minimal ncurses menu program, as ratios
# from the same run. `bash scripts/bench.sh --check` also fails when a ratio
# falls back behind the figures the console reaches (scripts/test.sh runs it).
set -euo pipefail
here="$(cd "$(dirname "$0")/.." && pwd)"
cd "$here"
bash scripts/install-deps.sh
cmake -S "$here" -B build-bench -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo -DVELK_TESTS=ON >/dev/null
ninja -C build-bench -j "$(nproc)" velk_bench
exec build-bench/bench/velk_bench "$@"
