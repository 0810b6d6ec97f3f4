#!/bin/bash
# The scripted session of scripts/demo.sh; runs inside tests/sandbox.sh.
set -uo pipefail
[ "${VEXO_IN_SANDBOX:-}" = 1 ] || { echo "run scripts/demo.sh instead" >&2; exit 2; }
bin=${VEXO_BIN_DIR:?}
work=/tmp/vexo-demo
mkdir -p "$work/bin"

# Our programs by their plain names, through the emulator on the PowerPC build.
for p in vexorcd vexorctl standin-audiod standin-mediacenter remote-sim syslog-sink; do
    printf '#!/bin/sh\nexec %s %s "$@"\n' "${VEXO_EMULATOR:-}" "$bin/$p" >"$work/bin/$p"
    chmod +x "$work/bin/$p"
done
export PATH="$work/bin:$PATH"

pids=()
cleanup() {
    local p
    for p in "${pids[@]}"; do kill "$p" 2>/dev/null; done
    wait 2>/dev/null
}
trap cleanup EXIT

# Each peer writes to a file of its own; the session prints new lines in order.
syslog-sink >"$work/syslog" 2>&1 & pids+=($!)
standin-audiod >"$work/audio" 2>&1 & pids+=($!)
seen_audio=0 seen_media=0 seen_log=0
show() {  # show FILE VAR PREFIX [FILTER]: prints the lines of FILE not shown yet
    local file=$1 var=$2 prefix=$3 filter=${4:-cat} n
    n=$(wc -l <"$file")
    if [ "$n" -gt "${!var}" ]; then
        tail -n +"$((${!var} + 1))" "$file" | head -n "$((n - ${!var}))" | "$filter" | sed "s/^/$prefix/"
        printf -v "$var" '%s' "$n"
    fi
}
settle() {  # waits until nothing new has arrived for a moment, then shows it all
    local last=-1 now
    for _ in $(seq 60); do
        now=$(cat "$work/audio" "$work/syslog" "$work/media" 2>/dev/null | wc -l)
        [ "$now" = "$last" ] && break
        last=$now
        sleep 0.35
    done
    local before=$seen_audio
    show "$work/audio" seen_audio "      audio daemon got: "
    [ -f "$work/media" ] && show "$work/media" seen_media "      media center got: " name_keys
    [ "${1:-}" = media ] && [ "$seen_audio" = "$before" ] &&
        echo "      (the audio daemon got nothing: the key was left to the media center)"
    show "$work/syslog" seen_log   "      syslog:           "
}
# Adds the key's label to each "key 0x..." line, from the remote's own key list.
name_keys() {
    local line code label
    while IFS= read -r line; do
        code=${line##*key }
        label=$(remote-sim keys | awk -v c="$code" '$1 == c { $1 = ""; sub(/^ +/, ""); print; exit }')
        echo "$line${label:+ ($label)}"
    done
}
step() { echo; echo "== $*"; }
remote() { remote-sim --drain-ms 3000 "$@" >/dev/null || echo "      (remote-sim failed)"; }
for _ in $(seq 100); do [ -S /tmp/vexoaudiod.sock ] && [ -S /dev/log ] && break; sleep 0.1; done
seen_audio=$(wc -l <"$work/audio")
seen_log=$(wc -l <"$work/syslog")

if [ -n "${VEXO_EMULATOR:-}" ]; then
    # Bytes 4 and 5 of an ELF header: the class (1: 32-bit) and the byte order (2: big-endian).
    elf=$(od -An -tu1 -j4 -N2 "$bin/vexorcd" | tr -s ' ')
    [ "$elf" = " 1 2" ] && kind="32-bit big-endian" || kind="unexpected ELF class/data:$elf"
    echo "The programs below are the PowerPC build ($kind), each run under ${VEXO_EMULATOR%% *}."
fi

step "The receiver is plugged in (a FIFO stands at /dev/usb/hiddev5); vexorcd starts"
mkfifo /dev/usb/hiddev5
# A writer must stay open, or the receiver would read end of file; it lives
# in a process of its own so that vexorcd does not inherit it.
(exec 7<>/dev/usb/hiddev5; exec sleep 100000) & pids+=($!)
vexorcd
for _ in $(seq 100); do [ -S /tmp/vexoctrl ] && [ -s /var/run/vexorcd.pid ] && break; sleep 0.1; done
daemon=$(cat /var/run/vexorcd.pid)
# The loop runs once it serves the control socket (action 0 does nothing).
vexorctl 0 >/dev/null
echo "      vexorcd runs, pid $daemon"

step "Play on the remote"
remote tap Play; settle
step "Next, a short press"
remote tap Next; settle
step "Next, held for 1.2 s (a long press)"
remote hold Next 1200; settle
step "Volume Plus, held for a second (repeats every 200 ms)"
remote hold "Volume Plus" 1000; settle
step "Custom 3, a short press"
remote tap "Custom 3"; settle
step "Custom 3, held for 1.2 s"
remote hold "Custom 3" 1200; settle
step "A local program injects an action: vexorctl toggle-shuffle"
vexorctl toggle-shuffle; settle

step "The media-center UI starts and takes the keys"
standin-mediacenter >"$work/media" 2>&1 & media=$!; pids+=($media)
for _ in $(seq 100); do [ -S /tmp/MediaCenter.sock ] && break; sleep 0.1; done
seen_media=$(wc -l <"$work/media")
remote tap Play; settle media
step "The media-center UI goes away; the daemon acts on the keys again"
kill "$media"; wait "$media" 2>/dev/null
remote tap Play; settle

step "The receiver is unplugged: SIGUSR2"
kill -USR2 "$daemon"; sleep 0.5
if ls -l /proc/"$daemon"/fd 2>/dev/null | grep -q hiddev5; then
    echo "      vexorcd still holds /dev/usb/hiddev5 (unexpected)"
else
    echo "      vexorcd has closed /dev/usb/hiddev5"
fi
step "Injected actions still work while it is unplugged: vexorctl stop"
vexorctl stop; settle
step "The receiver is plugged in again: SIGUSR1, then Play on the remote"
kill -USR1 "$daemon"; sleep 0.5
remote tap Play; settle

if [ "${VEXO_DEMO_SHELL:-0}" = 1 ]; then
    if [ -t 0 ]; then
        # The sandbox's fresh /dev has no terminal node; the shell needs one.
        [ -e /dev/tty ] || mknod -m 666 /dev/tty c 5 0
        cat <<MSG

== A shell in the sandbox. vexorcd (pid $daemon) and the stand-ins still run.
   Try: vexorctl play            vexorctl --list
        remote-sim tap Next      remote-sim hold vol+ 1000     remote-sim keys
        cat $work/audio          (what the audio daemon got)
        cat $work/syslog         (what vexorcd logged)
        kill -USR2 $daemon / kill -USR1 $daemon   (unplug / replug)
   Leave with exit; everything stops and nothing is left behind.
MSG
        # What the user's last command returned is theirs; a shell that
        # could not run at all is the demo's failure.
        PS1='(vexo sandbox) \$ ' bash --norc -i
        [ $? -lt 126 ] || { echo "demo: the shell could not run" >&2; exit 1; }
        seen_audio=$(wc -l <"$work/audio") seen_log=$(wc -l <"$work/syslog")
    else
        # No terminal: each line of standard input is a command, run in turn
        # with what the peers got after it.
        step "Commands from standard input (vexorcd is pid $daemon)"
        while IFS= read -r line; do
            [ -n "$line" ] || continue
            echo "\$ $line"
            bash -c "$line" </dev/null
            settle
        done
    fi
fi

step "SIGTERM: vexorcd stops, removes its pid file and control socket"
kill -TERM "$daemon"
for _ in $(seq 100); do [ -e /var/run/vexorcd.pid ] || break; sleep 0.1; done
for _ in $(seq 100); do kill -0 "$daemon" 2>/dev/null || break; sleep 0.1; done
if [ -e /var/run/vexorcd.pid ] || [ -e /tmp/vexoctrl ]; then
    echo "      vexorcd left its files behind (unexpected)"
else
    echo "      stopped cleanly; the sandbox goes with everything in it"
fi
settle
