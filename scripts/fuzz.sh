#!/usr/bin/env bash
# Builds the libFuzzer targets (fuzz/) with clang-14, AddressSanitizer and
# UndefinedBehaviorSanitizer in build-fuzz, then runs each for SECONDS
# (default 20) on its committed seeds plus what earlier runs found.
#   scripts/fuzz.sh [SECONDS] [TARGET...]     TARGET: markup address state keys texts dns interfaces
# A failing target leaves its input in build-fuzz/crashes/ and its output in
# build-fuzz/logs/; the script goes on with the others and fails at the end.
set -euo pipefail
here="$(cd "$(dirname "$0")/.." && pwd)"
cd "$here"
seconds="${1:-20}"
if [ $# -gt 0 ]; then shift; fi
all=(markup address state keys texts dns interfaces)
targets=("$@")
if [ ${#targets[@]} -eq 0 ]; then targets=("${all[@]}"); fi

build=build-fuzz
# -O1 with line tables only: quick to build, stack traces with lines, and
# assertions left on.
CC=clang-14 CXX=clang++-14 cmake -S "$here" -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo \
  -DCMAKE_C_FLAGS_RELWITHDEBINFO="-O1 -gline-tables-only" -DCMAKE_CXX_FLAGS_RELWITHDEBINFO="-O1 -gline-tables-only" \
  -DVELK_FUZZ=ON >/dev/null
ninja -C "$build" -j "$(nproc)" fuzzers

export ASAN_OPTIONS=detect_leaks=1:abort_on_error=1:verify_asan_link_order=0
export UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1
mkdir -p "$build/logs" "$build/crashes"
failed=()
for t in "${targets[@]}"; do
  corpus="$build/corpus/$t"
  mkdir -p "$corpus"
  args=(-max_total_time="$seconds" -timeout=10 -rss_limit_mb=2048 -print_final_stats=1
        -artifact_prefix="$build/crashes/$t-")
  if [ -f "fuzz/$t.dict" ]; then args+=(-dict="fuzz/$t.dict"); fi
  log="$build/logs/$t.log"
  if "$build/fuzz/fuzz_$t" "${args[@]}" "$corpus" "fuzz/corpus/$t" >"$log" 2>&1; then
    runs=$(sed -n 's/^stat::number_of_executed_units: *//p' "$log" | tail -n 1)
    echo "fuzz_$t: ${runs:-?} runs in ${seconds} s, no failure"
  else
    echo "fuzz_$t: FAILED (log: $log)"
    grep -E "RULE BROKEN|ERROR: |runtime error|Test unit written|SUMMARY" "$log" | head -n 20 || true
    failed+=("$t")
  fi
done
if [ ${#failed[@]} -gt 0 ]; then
  echo "failing fuzz targets: ${failed[*]}"
  exit 1
fi
