#!/bin/bash
# What a newcomer meets first: every program's --help exits 0, vexorctl
# explains a missing audio daemon on standard error, and the demo's --shell
# works on a terminal and from standard input.
set -u
bin=${VEXO_BIN_DIR:?} emu=${VEXO_EMULATOR:-} fail=0
check() {  # check WHAT COMMAND...: one line per check
    if "${@:2}"; then echo "ok   $1"; else echo "FAIL $1"; fail=1; fi
}
for p in vexorctl standin-audiod standin-mediacenter remote-sim syslog-sink; do
    check "$p --help exits 0" sh -c "$emu $bin/$p --help >/dev/null"
done
err=$($emu "$bin/vexorctl" audio play 2>&1 >/dev/null)
check "vexorctl shows why the audio daemon did not take a command" grep -qF \
    'vexorctl: ctrl.cpp:27 Failed to connect to /tmp/vexoaudiod.sock. [No such file or directory]' <<<"$err"

session() { VEXO_DEMO_SHELL=1 bash "$VEXO_SOURCE_DIR/scripts/demo-session.sh" 2>&1; }
out=$(printf 'vexorctl play\n' | session)
check "--shell without a terminal runs each line, then shows what the peers got" \
    grep -qFx "      audio daemon got: AUDIO_CMD_PLAY (4)" <<<"$(grep -A1 -Fx '$ vexorctl play' <<<"$out")"
# A terminal: a pseudo-terminal of a devpts of our own, the sandbox having none.
mkdir -p /dev/pts && mount -t devpts -o newinstance,ptmxmode=0666 devpts /dev/pts && ln -sf pts/ptmx /dev/ptmx
out=$(printf 'echo "shell-$((6 * 7))"\nexit\n' | script -qec "$(declare -f session); session" /dev/null)
check "--shell on a terminal gives a shell" grep -q 'shell-42' <<<"$out"
exit $fail
