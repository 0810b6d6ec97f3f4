#!/bin/bash
# The measurements that run the daemon. Runs inside tests/sandbox.sh (private
# /tmp, /run, /var, /dev and pid namespace), so the daemon uses its built-in
# paths; started by bench/run.sh.
#
# Usage: measure.sh BIN_DIR OUT_FILE
# Appends "key=value" lines to OUT_FILE. Sizes of the runs come from
# BENCH_ACTIONS, BENCH_OPEN_ACTIONS, BENCH_SENDERS, BENCH_PER_SENDER and
# BENCH_IDLE_SECONDS.
set -uo pipefail

bin=$1
out=$2
actions=${BENCH_ACTIONS:-2000}
open_actions=${BENCH_OPEN_ACTIONS:-2000}
senders=${BENCH_SENDERS:-4}
per_sender=${BENCH_PER_SENDER:-2500}
idle=${BENCH_IDLE_SECONDS:-5}
failed=0

emit() { echo "$1=$2" >>"$out"; }
note() { echo "measure: $*" >&2; }

# Every process this script starts, by pid, for the final clean-up.
started=()
cleanup() {
    local p
    for p in "${started[@]}"; do kill -KILL "$p" 2>/dev/null; done
}
trap cleanup EXIT

# The daemon's built-in paths: pid_file, ctrl_socket, receiver, syslog_socket.
eval "$("$bin/vexobench" paths)"

# The tools' stand-in logger; its first line says that it listens.
"$bin/syslog-sink" >>/tmp/syslog.txt 2>&1 &
started+=($!)
for _ in $(seq 100); do [ -S "$syslog_socket" ] && break; sleep 0.05; done
syslog_lines() { grep -vc '^syslog-sink: listening on' /tmp/syslog.txt; }

# Starts the daemon (with the environment given as arguments) and prints its
# pid once it serves its control socket.
start_daemon() {
    rm -f "$pid_file"
    env "$@" "$bin/vexorcd" || return 1
    local pid=""
    for _ in $(seq 200); do
        [ -s "$pid_file" ] && [ -S "$ctrl_socket" ] && pid=$(cat "$pid_file") && break
        sleep 0.05
    done
    [ -n "$pid" ] || return 1
    echo "$pid"
}

# Sends SIGTERM and waits until the daemon has gone (it is this script's
# child once detached, so it is reaped here).
stop_daemon() {
    kill -TERM "$1" 2>/dev/null
    for _ in $(seq 200); do
        [ -d "/proc/$1" ] || return 0
        [ "$(awk '{print $3}' "/proc/$1/stat" 2>/dev/null)" = Z ] && { wait "$1" 2>/dev/null; return 0; }
        sleep 0.05
    done
    note "daemon $1 did not stop"
    kill -KILL "$1" 2>/dev/null
    return 1
}

# utime+stime in clock ticks, and the nanoseconds on a CPU.
cpu_ticks() { awk '{print $14 + $15}' "/proc/$1/stat"; }
cpu_ns() { awk '{print $1}' "/proc/$1/schedstat"; }
switches() { awk '/^voluntary_ctxt_switches/ {print $2}' "/proc/$1/status"; }

# Idle figures of a running daemon under the label given: system calls per
# loop turn (strace -c; a turn is one pause), then CPU time per second and
# loop turns per second without strace (from the voluntary context switches:
# SLEEPS of them per turn, the pause and the receiver's wait if open).
idle_figures() {
    local pid=$1 label=$2 sleeps=$3 trace=/tmp/strace-$2.txt
    timeout -s INT "$idle" strace -c -f -p "$pid" -o "$trace" 2>/dev/null
    awk -v label="$label" '
        $1 ~ /^[0-9.]+$/ && NF >= 5 && $NF != "total" { n[$NF] = $4; total += $4 }
        END {
            pause = ("clock_nanosleep" in n ? n["clock_nanosleep"] : 0) + ("nanosleep" in n ? n["nanosleep"] : 0)
            if (pause == 0) { print label ".turns=0"; exit }
            printf "%s.turns=%d\n%s.syscalls_per_turn=%.2f\n", label, pause, label, total / pause
            list = ""
            for (s in n) if (n[s] / pause >= 0.005) list = list sprintf("%s %.2f, ", s, n[s] / pause)
            sub(/, $/, "", list)
            print label ".breakdown=" list
        }' "$trace" >>"$out"
    local t0 c0 s0 t1 c1 s1 hz
    hz=$(getconf CLK_TCK)
    t0=$(cpu_ticks "$pid"); c0=$(cpu_ns "$pid"); s0=$(switches "$pid")
    sleep "$idle"
    t1=$(cpu_ticks "$pid"); c1=$(cpu_ns "$pid"); s1=$(switches "$pid")
    emit "$label.cpu_ms_per_s" "$(awk -v d=$((t1 - t0)) -v hz="$hz" -v s="$idle" 'BEGIN {printf "%.2f", d * 1000 / hz / s}')"
    emit "$label.oncpu_ms_per_s" "$(awk -v d=$((c1 - c0)) -v s="$idle" 'BEGIN {printf "%.2f", d / 1e6 / s}')"
    emit "$label.turns_per_s" "$(awk -v d=$((s1 - s0)) -v s="$idle" -v k="$sleeps" 'BEGIN {printf "%.0f", d / k / s}')"
}

# The receiver as a FIFO with a writer held open (remote-sim --stay): the
# daemon's wait on it runs its whole 200 ms.
remote=""
receiver_open() {
    rm -f "$receiver" /tmp/remote-sim.txt
    "$bin/remote-sim" --stay >/tmp/remote-sim.txt 2>&1 &
    remote=$!
    started+=("$remote")
    for _ in $(seq 100); do
        grep -q '^ready ' /tmp/remote-sim.txt && break
        sleep 0.05
    done
    kill -USR1 "$1"
    "$bin/vexobench" wait-open "$1" && return 0
    note "the daemon did not open the receiver"
    return 1
}
receiver_close() {
    kill -USR2 "$1"
    "$bin/vexobench" wait-open "$1" closed
    [ -z "$remote" ] || { kill -TERM "$remote"; wait "$remote"; }
    remote=""
    rm -f "$receiver"
}

# 1. The baseline: the same road without the daemon.
note "baseline ($actions actions)"
"$bin/vexobench" baseline "$actions" >>"$out" || failed=1

pid=$(start_daemon) || { note "the daemon did not start"; exit 1; }
started+=("$pid")

# 2. Idle cost, receiver closed and open.
note "idle, receiver closed"
idle_figures "$pid" idle_closed 1
note "idle, receiver open"
receiver_open "$pid" && idle_figures "$pid" idle_open 2
receiver_close "$pid"

# System calls of one action beyond the idle turn's three (receiver closed):
# counted with strace over a run of sequential actions.
note "system calls per action"
strace -c -f -p "$pid" -o /tmp/strace-actions.txt 2>/dev/null &
tracer=$!
sleep 1
"$bin/vexobench" latency 300 >/dev/null || failed=1
kill -INT "$tracer"
wait "$tracer"
awk -v n=300 '
    $1 ~ /^[0-9.]+$/ && NF >= 5 && $NF != "total" { c[$NF] = $4; total += $4 }
    END {
        pause = ("clock_nanosleep" in c ? c["clock_nanosleep"] : 0) + ("nanosleep" in c ? c["nanosleep"] : 0)
        # The two polls of every turn; select is pselect6 on some machines.
        poll = ("pselect6" in c) ? "pselect6" : "select"
        c[poll] -= 2 * pause
        delete c["clock_nanosleep"]; delete c["nanosleep"]
        printf "action.syscalls=%.2f\n", (total - 3 * pause) / n
        list = ""
        for (s in c) if (c[s] / n >= 0.005) list = list sprintf("%s %.2f, ", s, c[s] / n)
        sub(/, $/, "", list)
        print "action.breakdown=" list
    }' /tmp/strace-actions.txt >>"$out"

# 3. Latency, receiver closed and open.
note "latency, receiver closed ($actions actions)"
"$bin/vexobench" latency "$actions" >>"$out" || failed=1
note "latency, receiver open ($open_actions actions, 200 ms each)"
"$bin/vexobench" latency "$open_actions" "$pid" >>"$out" || failed=1

# 4. Throughput with concurrent senders.
note "throughput ($senders senders x $per_sender actions)"
"$bin/vexobench" throughput "$senders" "$per_sender" >>"$out" || failed=1

emit memory.vmhwm_kb "$(awk '/^VmHWM/ {print $2}' "/proc/$pid/status")"
emit memory.vmrss_kb "$(awk '/^VmRSS/ {print $2}' "/proc/$pid/status")"
emit syslog.measured_runs "$(syslog_lines)"
stop_daemon "$pid"

# 5. Heap allocations, over every road of the daemon.
note "allocations"
: >/tmp/syslog.txt
pid=$(start_daemon LD_PRELOAD="$bin/libvexoalloc.so" VEXO_ALLOC_REPORT=/tmp/alloc.txt \
    VEXO_ALLOC_TRACE=/tmp/alloc-trace.txt) || { note "the daemon did not start"; exit 1; }
started+=("$pid")
"$bin/vexobench" exercise "$pid" >>"$out" || failed=1
stop_daemon "$pid"
sed 's/^/alloc./' /tmp/alloc.txt >>"$out"
emit syslog.exercise "$(syslog_lines)"
if [ -s /tmp/alloc-trace.txt ]; then
    note "allocations after start-up:"
    cat /tmp/alloc-trace.txt >&2
fi

# 6. Instruction counts of the hot pure functions.
if [ -x "$bin/vexohot" ]; then
    note "instruction counts"
    for fn in $("$bin/vexohot" list); do
        toggles=()
        for t in $("$bin/vexohot" toggles "$fn"); do toggles+=("--toggle-collect=$t"); done
        valgrind --tool=callgrind --callgrind-out-file=/tmp/cg.out --collect-atstart=no \
            "${toggles[@]}" "$bin/vexohot" run "$fn" >/tmp/cg.log 2>&1
        calls=$("$bin/vexohot" calls "$fn")
        total=$(awk '/^summary:|^totals:/ {print $2; exit}' /tmp/cg.out)
        emit "instr.$fn" "$(awk -v t="${total:-0}" -v c="$calls" 'BEGIN {printf "%.0f", t / c}')"
        emit "instr_what.$fn" "$("$bin/vexohot" describe "$fn")"
    done
fi

exit "$failed"
