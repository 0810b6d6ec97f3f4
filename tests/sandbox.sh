#!/bin/bash
# Runs one command as root, as the first process of a private pid namespace
# (it adopts every orphan, and all that is left dies with it), in a private
# mount namespace with fresh tmpfs over
# /tmp, /run, /var and /dev, so that the daemon's built-in paths
# ("/tmp/vexoctrl", "/var/run/vexorcd.pid", "/dev/usb/hiddev5", "/dev/log",
# "/var/packages/...") are private to the test. Nothing is left on the host
# when it ends.
#
# Usage: tests/sandbox.sh COMMAND [ARG...]
set -eu

if [ "${VEXO_IN_SANDBOX:-}" != 1 ]; then
    if [ "$(id -u)" != 0 ]; then
        echo "sandbox.sh: must run as root (it mounts tmpfs in a private namespace)" >&2
        exit 2
    fi
    export VEXO_IN_SANDBOX=1
    # --kill-child: a test that times out dies with its namespace.
    exec unshare --mount --propagation private --pid --fork --kill-child --mount-proc -- "$0" "$@"
fi

here=$(cd "$(dirname "$0")/.." && pwd)
# Directories that must stay visible although they may sit below a hidden
# mount point (a clone under /tmp, say): hold them open, re-bind them after.
keep=("$here" "$PWD")
[ -n "${VEXO_BIN_DIR:-}" ] && keep+=("$VEXO_BIN_DIR")
fd=20
declare -a kept_fd kept_dir
for d in "${keep[@]}"; do
    case "$d" in
    /tmp|/tmp/*|/run|/run/*|/dev|/dev/*|/var|/var/*)
        eval "exec $fd<\"\$d\""
        kept_fd+=("$fd"); kept_dir+=("$d"); fd=$((fd + 1)) ;;
    esac
done

mount -t tmpfs -o mode=1777,size=256m vexo-tmp /tmp
mount -t tmpfs -o mode=0755,size=64m vexo-run /run
mount -t tmpfs -o mode=0755,size=64m vexo-var /var
mount -t tmpfs -o mode=0755,size=8m vexo-dev /dev
ln -s /run /var/run
ln -s /run/lock /var/lock
mkdir -p /var/tmp /var/lib /var/log /var/cache
chmod 1777 /var/tmp
mknod -m 666 /dev/null c 1 3
mknod -m 666 /dev/zero c 1 5
mknod -m 666 /dev/random c 1 8
mknod -m 666 /dev/urandom c 1 9
ln -s /proc/self/fd /dev/fd
ln -s /proc/self/fd/0 /dev/stdin
ln -s /proc/self/fd/1 /dev/stdout
ln -s /proc/self/fd/2 /dev/stderr
mkdir -p /dev/usb /dev/shm /run/lock
chmod 1777 /dev/shm

for i in "${!kept_fd[@]}"; do
    mkdir -p "${kept_dir[$i]}"
    mount --no-canonicalize --bind "/proc/self/fd/${kept_fd[$i]}" "${kept_dir[$i]}"
    eval "exec ${kept_fd[$i]}<&-"
done

cd "$PWD" 2>/dev/null || cd /
exec "$@"
