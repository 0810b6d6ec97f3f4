#!/bin/bash
# Static analysis of the daemon and its tools (src/ and tools/): cppcheck for
# the 64-bit host and for a 32-bit platform like the target, and clang-tidy
# with the checks of .clang-tidy over a compile database of the native build.
# Both must be clean; a finding that is wrong is suppressed where it stands,
# with the reason beside it. Ends with "lint: N passed, N failed".
#
# Usage: scripts/lint.sh        (from anywhere; VEXO_LINT_BUILD, default build/lint,
#                                is where the compile database is made)
set -uo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
build=${VEXO_LINT_BUILD:-build/lint}

pass=0
fail=0
step() {  # name, then the command
    local name=$1
    shift
    echo "=== lint: $name"
    if "$@"; then
        pass=$((pass + 1))
    else
        echo "lint: $name found problems"
        fail=$((fail + 1))
    fi
}

cppcheck_all() {
    local platform rc=0
    for platform in unix64 unix32; do
        cppcheck --enable=warning,performance,portability --error-exitcode=1 --std=c++20 \
            --inline-suppr --quiet --platform="$platform" -I src -I tools src tools || rc=1
    done
    return "$rc"
}

clang_tidy_all() {
    # Only a compile database is needed: configure, do not build.
    cmake -S . -B "$build" -DCMAKE_BUILD_TYPE=Release -DVEXO_TESTS=OFF \
        -DCMAKE_EXPORT_COMPILE_COMMANDS=ON >"$build.log" 2>&1 || { cat "$build.log"; return 1; }
    rm -f "$build.log"
    local files
    mapfile -t files < <(ls src/*/*.cpp tools/*.cpp tools/*/*.cpp)
    printf '%s\n' "${files[@]}" |
        xargs -P 2 -n 4 clang-tidy -p "$build" --quiet 2>&1 |
        grep -vE '^[0-9]+ warnings? (and [0-9]+ errors? )?generated\.$|^Suppressed [0-9]+ warnings|^Use -header-filter|^Error while processing' |
        tee "$build/clang-tidy.log"
    ! grep -qE '(warning|error):' "$build/clang-tidy.log"
}

step cppcheck cppcheck_all
mkdir -p "$build"
step clang-tidy clang_tidy_all
echo "lint: ${pass} passed, ${fail} failed"
[ "$fail" -eq 0 ]
