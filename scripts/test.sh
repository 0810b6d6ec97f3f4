#!/bin/bash
# Runs every test: installs the Debian packages that are missing, builds the
# native build with ASan and UBSan and the PowerPC cross build, and runs the
# whole suite of both (the PowerPC one under qemu-ppc), then checks that the
# optimised release preset builds (its warnings differ), then the fuzz targets
# for a few seconds each, the static analysis and the checks on a PowerPC
# kernel (tests/kernel/run.sh). Needs root.
# The last line is "N passed, N failed" over both builds, the release build,
# the fuzz targets, the two static analysers and the kernel checks.
set -uo pipefail
cd "$(dirname "$0")/.."
# shellcheck source=scripts/deps.sh
. scripts/deps.sh
vexo_install_deps || exit 1

total_pass=0
total_fail=0
status=0
for preset in asan ppc; do
    echo "=== $preset: configure and build"
    if ! cmake --preset "$preset" >/dev/null || ! cmake --build --preset "$preset"; then
        echo "build $preset failed"
        status=1
        total_fail=$((total_fail + 1))
        continue
    fi
    echo "=== $preset: tests"
    log="build/$preset/ctest-summary.log"
    ctest --preset "$preset" 2>&1 | tee "$log"
    [ "${PIPESTATUS[0]}" -eq 0 ] || status=1
    summary=$(grep -E '[0-9]+% tests passed, [0-9]+ tests? failed out of [0-9]+' "$log" | tail -n 1)
    if [ -z "$summary" ]; then
        total_fail=$((total_fail + 1))
        status=1
        continue
    fi
    failed=$(sed -E 's/.* ([0-9]+) tests? failed out of ([0-9]+).*/\1/' <<<"$summary")
    all=$(sed -E 's/.* failed out of ([0-9]+).*/\1/' <<<"$summary")
    total_pass=$((total_pass + all - failed))
    total_fail=$((total_fail + failed))
done

# The release preset: only built, as one step. g++ at -O3 warns where the
# debug and cross builds do not, and warnings are errors.
echo "=== release: configure and build"
if cmake --preset release >/dev/null && cmake --build --preset release; then
    total_pass=$((total_pass + 1))
else
    echo "build release failed"
    status=1
    total_fail=$((total_fail + 1))
fi

# Fuzzing (a few seconds per target, fixed seed), static analysis, and the
# daemon on a PowerPC kernel under qemu-system-ppc (its kernel is built on
# first use); each ends with "NAME: N passed, N failed", counted with the
# tests above.
for step in "fuzz/run.sh --quick" "scripts/lint.sh" "tests/kernel/run.sh"; do
    log=$(mktemp)
    # shellcheck disable=SC2086
    bash $step 2>&1 | tee "$log"
    [ "${PIPESTATUS[0]}" -eq 0 ] || status=1
    summary=$(grep -E '^[a-z]+: [0-9]+ passed, [0-9]+ failed$' "$log" | tail -n 1)
    rm -f "$log"
    if [ -z "$summary" ]; then
        total_fail=$((total_fail + 1))
        status=1
        continue
    fi
    total_pass=$((total_pass + $(sed -E 's/.*: ([0-9]+) passed.*/\1/' <<<"$summary")))
    total_fail=$((total_fail + $(sed -E 's/.* ([0-9]+) failed$/\1/' <<<"$summary")))
done
echo "${total_pass} passed, ${total_fail} failed"
exit "$status"
