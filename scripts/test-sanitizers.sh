#!/usr/bin/env bash
# Builds the suite with the sanitizers and runs it:
#   the whole suite under AddressSanitizer + UndefinedBehaviorSanitizer, then
#   the threaded tests under ThreadSanitizer, repeated so that races have a
#   chance to show. Any sanitizer report fails the run.
# Assumes the packages of scripts/install-deps.sh --test are installed.
set -euo pipefail
cd "$(dirname "$0")/.."

jobs=$(nproc)
asan=${SKARN_ASAN_BUILD_DIR:-build/asan}
tsan=${SKARN_TSAN_BUILD_DIR:-build/tsan}
# Threaded tests carry one of these words in their names.
threaded='*Concurrent*:*Thread*:*Race*:*Parallel*'
repeat=${SKARN_TSAN_REPEAT:-20}
# Line tables are enough for the sanitizers' reports, and -O1 is what they are
# tuned for: both builds compile about a third faster than with -O2 -g.
flags=(-DCMAKE_BUILD_TYPE=RelWithDebInfo "-DCMAKE_CXX_FLAGS_RELWITHDEBINFO=-O1 -g1 -DNDEBUG" -DSKARN_BUILD_BENCH=OFF)
start=$(date +%s)
elapsed() { echo "   ($(( $(date +%s) - start )) s so far)"; }

export ASAN_OPTIONS=detect_leaks=1:abort_on_error=1:detect_stack_use_after_return=1
export UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1
export TSAN_OPTIONS=halt_on_error=1:second_deadlock_stack=1

echo "== address and undefined-behaviour sanitizers: whole suite"
cmake -S . -B "$asan" -G Ninja "${flags[@]}" -DSKARN_SANITIZE="address;undefined" >/dev/null
cmake --build "$asan" -j"$jobs"
elapsed
ctest --test-dir "$asan" -j"$jobs" --output-on-failure --timeout 900
elapsed

echo "== thread sanitizer: threaded tests x$repeat"
cmake -S . -B "$tsan" -G Ninja "${flags[@]}" -DSKARN_SANITIZE=thread >/dev/null
targets=(test_platform test_utilities test_mxf test_formatreader test_ingest)
cmake --build "$tsan" -j"$jobs" --target "${targets[@]}"
elapsed
for t in "${targets[@]}"; do
  bin="$tsan/tests/$t"
  [[ -x "$bin" ]] || continue
  SKARN_TEST_BINARY_DIR="$PWD/$tsan" "$bin" --gtest_filter="$threaded" --gtest_repeat="$repeat" \
    --gtest_brief=1 >"$tsan/$t.log" 2>&1 || { cat "$tsan/$t.log"; echo "$t failed under the thread sanitizer"; exit 1; }
  echo "$t: $(grep -c '^\[  PASSED' "$tsan/$t.log" || true) passing rounds"
done
elapsed
