#!/bin/bash
# Runs one command as root as the first process of private pid, network and
# mount namespaces, with fresh tmpfs over /tmp, /run, /var and /dev: the
# daemon's built-in paths are the test's own, the kernel's socket limits are
# its defaults, every process started dies with the command, and nothing is
# left on the host. Usage: tests/sandbox.sh COMMAND [ARG...]
set -eu
if [ "${VEXO_IN_SANDBOX:-}" != 1 ]; then
    [ "$(id -u)" = 0 ] || { echo "sandbox.sh: must run as root (it mounts tmpfs)" >&2; exit 2; }
    export VEXO_IN_SANDBOX=1
    exec unshare --mount --propagation private --net --pid --fork --kill-child --mount-proc -- "$0" "$@"
fi

# Directories that must stay visible although they may sit below a hidden
# mount point (a clone under /tmp, say): hold them open, bind them back after.
keep=("$(cd "$(dirname "$0")/.." && pwd)" "$PWD" ${VEXO_BIN_DIR:+"$VEXO_BIN_DIR"})
fd=20
declare -a kept_fd kept_dir
for d in "${keep[@]}"; do
    case "$d" in
    /tmp|/tmp/*|/run|/run/*|/dev|/dev/*|/var|/var/*)
        eval "exec $fd<\"\$d\""
        kept_fd+=("$fd"); kept_dir+=("$d"); fd=$((fd + 1)) ;;
    esac
done

for m in tmp:1777:256m run:0755:64m var:0755:64m dev:0755:8m; do
    IFS=: read -r dir mode size <<<"$m"
    mount -t tmpfs -o "mode=$mode,size=$size" "vexo-$dir" "/$dir"
done
ln -s /run /var/run
ln -s /run/lock /var/lock
mkdir -p /var/tmp /var/lib /var/log /var/cache /dev/usb /dev/shm /run/lock
chmod 1777 /var/tmp /dev/shm
for dev in null:3 zero:5 random:8 urandom:9; do mknod -m 666 "/dev/${dev%:*}" c 1 "${dev#*:}"; done
ln -s /proc/self/fd /dev/fd
for n in 0:stdin 1:stdout 2:stderr; do ln -s "/proc/self/fd/${n%:*}" "/dev/${n#*:}"; done

for i in "${!kept_fd[@]}"; do
    mkdir -p "${kept_dir[$i]}"
    mount --no-canonicalize --bind "/proc/self/fd/${kept_fd[$i]}" "${kept_dir[$i]}"
    eval "exec ${kept_fd[$i]}<&-"
done
cd "$PWD" 2>/dev/null || cd /
exec "$@"
