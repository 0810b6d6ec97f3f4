#!/bin/bash
# Builds the fuzz targets with clang (libFuzzer, ASan, UBSan) and runs each
# inside tests/sandbox.sh with a fixed seed over its checked-in corpus
# (fuzz/corpus/TARGET/). New inputs go to a scratch corpus in the build tree;
# the checked-in one is only read. Prints one line per target (runs, coverage,
# time) and ends with "fuzz: N passed, N failed".
#
# Usage: fuzz/run.sh [--quick | --long SECONDS] [TARGET...]
#   --quick         a few seconds per target (the test command's step; default)
#   --long SECONDS  SECONDS per target, for a real hunt
# Environment: VEXO_FUZZ_BUILD (build directory, default build/fuzz),
#              VEXO_FUZZ_SEED (default 1).
set -uo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"

seconds=4
targets=()
while [ $# -gt 0 ]; do
    case "$1" in
    --quick) seconds=4 ;;
    --long)
        shift
        seconds=${1:?--long needs a number of seconds}
        ;;
    -h|--help)
        sed -n '2,13p' "$0" | sed 's/^# \{0,1\}//'
        exit 0
        ;;
    -*) echo "fuzz/run.sh: unknown option $1" >&2; exit 2 ;;
    *) targets+=("$1") ;;
    esac
    shift
done

build=${VEXO_FUZZ_BUILD:-build/fuzz}
case "$build" in /*) ;; *) build="$root/$build" ;; esac
seed=${VEXO_FUZZ_SEED:-1}

echo "=== fuzz: configure and build ($build)"
mkdir -p "$build"
if ! cmake -S fuzz -B "$build" -DCMAKE_CXX_COMPILER=clang++ >"$build/configure.log" 2>&1; then
    cat "$build/configure.log"
    echo "fuzz: 0 passed, 1 failed"
    exit 1
fi
if ! cmake --build "$build" -j2; then
    echo "fuzz: 0 passed, 1 failed"
    exit 1
fi

if [ ${#targets[@]} -eq 0 ]; then
    for exe in "$build"/bin/fuzz_*; do
        [ -x "$exe" ] && targets+=("$(basename "$exe")")
    done
fi

pass=0
fail=0
printf '%-18s %10s %8s %8s %8s %6s  %s\n' target runs exec/s cov features secs result
for t in "${targets[@]}"; do
    exe="$build/bin/$t"
    corpus="fuzz/corpus/$t"
    work="$build/work/$t"
    arts="$build/artifacts"
    log="$build/logs/$t.log"
    mkdir -p "$work" "$arts" "$(dirname "$log")" "$corpus"
    start=$(date +%s)
    # The scratch corpus comes first: libFuzzer writes new inputs there only.
    tests/sandbox.sh "$exe" -seed="$seed" -max_total_time="$seconds" -print_final_stats=1 \
        -timeout=10 -rss_limit_mb=1024 -artifact_prefix="$arts/$t-" \
        "$work" "$corpus" >"$log" 2>&1
    rc=$?
    took=$(( $(date +%s) - start ))
    runs=$(sed -nE 's/^stat::number_of_executed_units: *([0-9]+).*/\1/p' "$log" | tail -n 1)
    rate=$(sed -nE 's/^stat::average_exec_per_sec: *([0-9]+).*/\1/p' "$log" | tail -n 1)
    cov=$(grep -oE 'cov: [0-9]+' "$log" | tail -n 1 | awk '{print $2}')
    ft=$(grep -oE 'ft: [0-9]+' "$log" | tail -n 1 | awk '{print $2}')
    if [ "$rc" -eq 0 ]; then
        result=ok
        pass=$((pass + 1))
    else
        result="FAILED (exit $rc, log $log)"
        fail=$((fail + 1))
    fi
    printf '%-18s %10s %8s %8s %8s %6s  %s\n' "$t" "${runs:--}" "${rate:--}" "${cov:--}" \
        "${ft:--}" "$took" "$result"
    if [ "$rc" -ne 0 ]; then
        grep -E 'ERROR|fuzz check failed|runtime error|SUMMARY|Test unit written' "$log" | head -n 20
    fi
done
echo "fuzz: ${pass} passed, ${fail} failed"
[ "$fail" -eq 0 ]
