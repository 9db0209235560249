#!/bin/sh
# Builds the libFuzzer harnesses with clang and runs each in turn.
#
#   scripts/fuzz.sh [SECONDS] [HARNESS...]
#
# Each harness runs for SECONDS (default 60) on a copy of its seed corpus
# (fuzz/corpus/HARNESS; the committed corpus never grows), at low priority, one
# at a time. Per harness it prints the executions, executions per second and
# coverage (edges and features). A finding (crash, sanitizer report, leak,
# timeout, out-of-memory or an oversized allocation) keeps its input and log in
# build/fuzz-findings/HARNESS and makes the script exit non-zero.
#
# Environment: FUZZ_BUILD (build folder, default build/fuzz), FUZZ_JOBS (build
# jobs, default 2), FUZZ_TIMEOUT (seconds one input may take, default 25).
set -eu

cd "$(dirname "$0")/.."
root=$(pwd)
seconds=${1:-60}
[ $# -gt 0 ] && shift
build=${FUZZ_BUILD:-build/fuzz}
jobs=${FUZZ_JOBS:-2}
timeout=${FUZZ_TIMEOUT:-25}
findings=$root/build/fuzz-findings

case $seconds in
'' | *[!0-9]*) echo "usage: scripts/fuzz.sh [SECONDS] [HARNESS...]" >&2; exit 2 ;;
esac

if [ $# -gt 0 ]; then
    harnesses=$*
else
    harnesses=$(for f in fuzz/*.cpp; do basename "$f" .cpp; done)
fi

if [ ! -f "$build/build.ninja" ]; then
    launcher=
    command -v ccache >/dev/null 2>&1 && launcher=-DCMAKE_CXX_COMPILER_LAUNCHER=ccache
    CXX=${CXX:-clang++} cmake -S . -B "$build" -G Ninja -DSKARN_FUZZ=ON -DSKARN_BUILD_TESTS=OFF \
        -DSKARN_BUILD_BENCH=OFF $launcher >/dev/null
fi
# shellcheck disable=SC2086
nice -n 10 ninja -C "$build" -j "$jobs" $harnesses >/dev/null

# Undefined behaviour ends a run (the build makes it so too); reports go to the log.
export UBSAN_OPTIONS=${UBSAN_OPTIONS:-halt_on_error=1:print_stacktrace=1}

work=$(mktemp -d "${TMPDIR:-/tmp}/skarn-fuzz.XXXXXX")
trap 'rm -rf "$work"' EXIT INT TERM

status=0
printf '%-20s %12s %8s %8s %8s  %s\n' harness executions exec/s edges features result
for h in $harnesses; do
    mkdir -p "$work/$h/corpus"
    if [ -d "fuzz/corpus/$h" ]; then
        cp -R "fuzz/corpus/$h/." "$work/$h/corpus/"
    fi
    log=$work/$h/log
    set +e
    nice -n 10 "$build/fuzz/$h" "$work/$h/corpus" -max_total_time="$seconds" -timeout="$timeout" \
        -rss_limit_mb=2048 -malloc_limit_mb=512 -print_final_stats=1 \
        -artifact_prefix="$work/$h/" >"$log" 2>&1
    rc=$?
    set -e
    execs=$(sed -n 's/^stat::number_of_executed_units: *//p' "$log" | tail -n 1)
    rate=$(sed -n 's/^stat::average_exec_per_sec: *//p' "$log" | tail -n 1)
    cov=$(grep -o 'cov: [0-9]*' "$log" | tail -n 1 | cut -d' ' -f2)
    ft=$(grep -o 'ft: [0-9]*' "$log" | tail -n 1 | cut -d' ' -f2)
    artifacts=$(find "$work/$h" -maxdepth 1 -type f \( -name 'crash-*' -o -name 'leak-*' -o -name 'timeout-*' \
        -o -name 'oom-*' \) | head -n 1)
    if [ $rc -ne 0 ] || [ -n "$artifacts" ]; then
        mkdir -p "$findings/$h"
        cp "$log" "$findings/$h/log"
        find "$work/$h" -maxdepth 1 -type f ! -name log -exec cp {} "$findings/$h/" \;
        result="FINDING (exit $rc): $findings/$h"
        status=1
    else
        result=ok
    fi
    printf '%-20s %12s %8s %8s %8s  %s\n' "$h" "${execs:-?}" "${rate:-?}" "${cov:-?}" "${ft:-?}" "$result"
done
exit $status
