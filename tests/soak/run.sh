#!/bin/bash
# The soak, one command, as root, bounded in time:
#
#   bash tests/soak/run.sh [SECONDS]              ASan+UBSan build, default 300 s
#   bash tests/soak/run.sh --valgrind [SECONDS]   native Release build with the daemon under
#                                                 valgrind --track-fds=yes, default 120 s
#   bash tests/soak/run.sh --ppc [SECONDS]        PowerPC build under qemu-ppc, default 300 s
#
# The daemon runs in the test sandbox under a mixed load of injected actions
# and simulated keys while faults are injected at random; the soak then
# compares what was sent with what the stand-in audio daemon received and
# checks that descriptors and resident memory stayed flat. Under valgrind the
# daemon's own report must show no error, no leak and no descriptor left open
# beyond the standard ones and its syslog socket.
# Environment: VEXO_SOAK_SEED (default: from the clock, printed).
set -uo pipefail
root=$(cd "$(dirname "$0")/../.." && pwd)
cd "$root"

mode=asan
case "${1:-}" in
--valgrind) mode=valgrind; shift ;;
--ppc) mode=ppc; shift ;;
--asan) shift ;;
-h|--help) sed -n '2,15p' "$0" | sed 's/^# \{0,1\}//'; exit 0 ;;
esac
default=300
[ "$mode" = valgrind ] && default=120
seconds=${1:-$default}
seed=${VEXO_SOAK_SEED:-$(( $(date +%s) % 100000 ))}

# shellcheck source=scripts/deps.sh
. scripts/deps.sh
extra=()
[ "$mode" = valgrind ] && extra=(valgrind)
vexo_install_deps "${extra[@]}" || exit 1

build=$root/build/soak-$mode
case "$mode" in
asan) config=(-DCMAKE_BUILD_TYPE=Debug -DVEXO_SANITIZE=ON) ;;
valgrind) config=(-DCMAKE_BUILD_TYPE=Release) ;;
ppc) config=(-DCMAKE_BUILD_TYPE=Release --toolchain "$root/cmake/powerpc-linux-gnu.cmake") ;;
esac
echo "=== soak ($mode): build in $build"
cmake -S . -B "$build" "${config[@]}" >/dev/null || exit 1
cmake --build "$build" -j2 --target vexorcd soak_daemon || exit 1

report=$build/soak-report.txt
: >"$report"
export VEXO_SOAK_SECONDS=$seconds VEXO_SOAK_SEED=$seed VEXO_SOAK_REPORT=$report
emulator=()
if [ "$mode" = valgrind ]; then
    logs=$build/valgrind
    rm -rf "$logs"
    mkdir -p "$logs"
    export VEXO_SOAK_WRAPPER="valgrind --track-fds=yes --leak-check=full --show-leak-kinds=all --errors-for-leak-kinds=definite,indirect --log-file=$logs/vg.%p"
    # valgrind's own memory grows as it translates new code: its leak check
    # stands for the daemon's memory here.
    export VEXO_SOAK_RSS_SLACK_KB=1000000
fi
[ "$mode" = ppc ] && emulator=(qemu-ppc -L /usr/powerpc-linux-gnu)

echo "=== soak ($mode): ${seconds} s, seed $seed"
VEXO_BIN_DIR=$build/bin tests/sandbox.sh "${emulator[@]}" "$build/bin/soak_daemon"
status=$?
echo "=== soak ($mode): summary"
cat "$report"

if [ "$mode" = valgrind ]; then
    pid=$(sed -nE 's/.*daemon pid ([0-9]+).*/\1/p' "$report" | tail -n 1)
    log=$logs/vg.$pid
    if [ -z "$pid" ] || [ ! -f "$log" ]; then
        echo "no valgrind report for the daemon"
        status=1
    else
        echo "=== valgrind report of the daemon ($log)"
        grep -E 'FILE DESCRIPTORS|Open (file descriptor|AF_UNIX)|ERROR SUMMARY|definitely lost|indirectly lost|possibly lost|still reachable|in use at exit' "$log"
        # Descriptors the daemon itself opened and left open at exit: only
        # the socket syslog keeps. Those it inherited from whoever started it
        # (and valgrind's own log) are marked so by valgrind.
        own=$(awk '/Open (file descriptor|AF_UNIX socket|AF_INET)/ { if (fd) print fd; fd = $0; next }
                   /<inherited from parent>/ { fd = ""; next }
                   END { if (fd) print fd }' "$log")
        echo "opened by the daemon and open at exit:"
        echo "${own:-  (none)}"
        if ! grep -q 'ERROR SUMMARY: 0 errors' "$log"; then
            echo "valgrind found errors"
            status=1
        fi
        if [ "$(grep -c . <<<"$own")" -gt 1 ] || { [ -n "$own" ] && ! grep -q 'AF_UNIX socket' <<<"$own"; }; then
            echo "the daemon left descriptors open beyond its syslog socket"
            status=1
        fi
        if ! grep -qE 'in use at exit: 0 bytes|definitely lost: 0 bytes' "$log"; then
            echo "the daemon leaked memory"
            status=1
        fi
    fi
fi
if [ "$status" -eq 0 ]; then echo "soak ($mode): passed"; else echo "soak ($mode): FAILED"; fi
exit "$status"
