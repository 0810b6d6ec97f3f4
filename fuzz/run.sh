#!/bin/bash
# Builds the fuzz targets with clang (libFuzzer, ASan, UBSan) and runs each in
# tests/sandbox.sh with a fixed seed over its corpus fuzz/corpus/TARGET (only
# read: new inputs go to the build tree). Ends with "fuzz: N passed, N failed".
# Usage: fuzz/run.sh [--quick | --long SECONDS]   (--quick: 4 s per target, the test command's)
set -uo pipefail
cd "$(dirname "$0")/.."
seconds=4
[ "${1:-}" = --long ] && seconds=${2:?--long needs a number of seconds}
build=$PWD/build/fuzz
mkdir -p "$build/logs"
if ! cmake -S fuzz -B "$build" -DCMAKE_CXX_COMPILER=clang++ >"$build/configure.log" 2>&1 || ! cmake --build "$build" -j2; then
    cat "$build/configure.log"
    echo "fuzz: 0 passed, 1 failed"
    exit 1
fi
pass=0
fail=0
for src in fuzz/fuzz_*.cpp; do
    t=$(basename "$src" .cpp)
    exe=$build/bin/$t
    mkdir -p "$build/work/$t"
    if tests/sandbox.sh "$exe" -seed=1 -max_total_time="$seconds" -timeout=10 -rss_limit_mb=1024 -print_final_stats=1 \
        -artifact_prefix="$build/$t-" "$build/work/$t" "fuzz/corpus/$t" >"$build/logs/$t.log" 2>&1; then
        pass=$((pass + 1))
        echo "$t: $(sed -nE 's/^stat::number_of_executed_units: *//p' "$build/logs/$t.log") runs, ok"
    else
        fail=$((fail + 1))
        echo "$t: FAILED (log $build/logs/$t.log)"
        grep -E 'ERROR|fuzz check failed|runtime error|SUMMARY|Test unit written' "$build/logs/$t.log" | head -n 20
    fi
done
echo "fuzz: ${pass} passed, ${fail} failed"
[ "$fail" -eq 0 ]
