#!/bin/bash
# The sample init script and udev rule, and the manual pages: syntax, and the
# init script and the rule's commands driving the real daemon in the sandbox.
set -u
src=${VEXO_SOURCE_DIR:?}
bin=${VEXO_BIN_DIR:?}
fail=0
check() {  # check DESCRIPTION COMMAND...
    if "${@:2}"; then echo "ok: $1"; else echo "FAILED: $1"; fail=1; fi
}
[ "${VEXO_IN_SANDBOX:-}" = 1 ] || { echo "run me through tests/sandbox.sh"; exit 2; }

init=$src/contrib/vexorcd.init
rules=$src/contrib/99-vexorcd-receiver.rules

check "init script parses (sh -n)" sh -n "$init"

# A udev rule line: comma-separated KEY[{attr}] OP "value" pairs.
pair='[A-Z_]+(\{[^}]*\})?[[:space:]]*(==|!=|\+=|-=|:=|=)[[:space:]]*"[^"]*"'
rule_lines_ok() {
    local line n=0
    while IFS= read -r line; do
        n=$((n + 1))
        [[ -z "${line// /}" || "$line" =~ ^[[:space:]]*# ]] && continue
        if ! [[ "$line" =~ ^$pair([[:space:]]*,[[:space:]]*$pair)*[[:space:]]*$ ]]; then
            echo "  line $n is not a udev rule: $line"
            return 1
        fi
    done <"$rules"
}
check "udev rule lines are well formed" rule_lines_ok

# The commands the rule runs, with udev's "$$" turned into "$".
mapfile -t run_cmds < <(sed -nE "s/.*RUN\+=\"\/bin\/sh -c '([^']*)'\".*/\1/p" "$rules" | sed 's/\$\$/$/g')
check "the rule runs two shell commands" test "${#run_cmds[@]}" -eq 2
for c in "${run_cmds[@]}"; do
    check "rule command parses: $c" sh -n -c "$c"
done

check "manual pages format without warnings" bash -c \
    "out=\$(groff -t -man -ww -z '$src'/doc/*.[1-8] 2>&1); [ -z \"\$out\" ] || { echo \"\$out\"; false; }"

# The init script against the real daemon.
export DAEMON="${VEXO_EMULATOR:+$VEXO_EMULATOR }$bin/vexorcd"
export STOP_TIMEOUT=10
check "init start" sh "$init" start
check "status finds it running" sh "$init" status
pid=$(cat /var/run/vexorcd.pid)
check "start again changes nothing" bash -c "sh '$init' start | grep -q 'already running (pid $pid)'"
# Wait until its loop runs (the handlers come after the drivers open).
for _ in $(seq 100); do [ -S /tmp/vexoctrl ] && break; sleep 0.1; done
sleep 0.5
for c in "${run_cmds[@]}"; do
    sh -c "$c"
done
sleep 0.3
check "the hot-plug signals leave the daemon running" kill -0 "$pid"
check "init stop" sh "$init" stop
check "stop waited for the pid file to go" test ! -e /var/run/vexorcd.pid
gone() {  # the process has ended (a zombie left to this shell counts as ended)
    local _
    for _ in $(seq 100); do
        kill -0 "$pid" 2>/dev/null || return 0
        grep -q '^State:.*Z' "/proc/$pid/status" 2>/dev/null && return 0
        sleep 0.1
    done
    return 1
}
check "the daemon is gone" gone
check "status after stop says not running (exit 3)" bash -c "sh '$init' status; test \$? -eq 3"
check "stop when not running is fine" sh "$init" stop

[ $fail -eq 0 ] && echo "contrib: all checks passed"
exit $fail
