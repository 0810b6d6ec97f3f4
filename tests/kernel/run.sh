#!/bin/bash
# Boots vexorcd on a real 32-bit big-endian PowerPC kernel under
# qemu-system-ppc, the receiver a USB HID gadget read through hiddev, and
# prints the checks that the machine's init (init.cpp) makes. Needs root.
#   bash tests/kernel/run.sh                 the checks, then "kernel: N passed, N failed"
#   bash tests/kernel/run.sh --demo          the same session, showing what each peer got
# The kernel is built once per machine (niced, 5 to 14 minutes) from
# linux-source-6.1 and kernel.config into /var/cache/vexorcd-kernel/HASH.
set -euo pipefail
here=$(cd "$(dirname "$0")" && pwd)
root=$(cd "$here/../.." && pwd)
case "${1:-}" in
"") mode=check filter='^(ok  |FAIL|machine up)' ;;
--demo) mode=demo filter='' ;;
*) sed -n '2,8p' "$0" | sed 's/^# \{0,1\}//'; exit 2 ;;
esac
fail() { echo "FAIL $*"; echo "kernel: 0 passed, 1 failed"; exit 1; }
[ "$(id -u)" = 0 ] || fail "run as root"
# shellcheck source=scripts/deps.sh
. "$root/scripts/deps.sh"
vexo_install_deps "${VEXO_KERNEL_PACKAGES[@]}" || fail "packages missing"

kver=$(dpkg-query -W -f='${Version}' linux-source-6.1)
kcache=/var/cache/vexorcd-kernel/$( { echo "$kver"; cat "$here/kernel.config"; } | sha256sum | cut -c1-16)
vmlinux=$kcache/vmlinux
if [ ! -f "$vmlinux" ]; then
    t0=$SECONDS
    echo "building the PowerPC kernel once into $kcache"
    mkdir -p "$kcache"
    tree=$(mktemp -d "$kcache/src.XXXXXX")
    kmake=(nice -n 10 make -s ARCH=powerpc CROSS_COMPILE=powerpc-linux-gnu-)
    ( cd "$tree" && tar -xf /usr/src/linux-source-6.1.tar.xz --strip-components=1 &&
      "${kmake[@]}" tinyconfig >/dev/null &&
      scripts/kconfig/merge_config.sh -m .config "$here/kernel.config" >/dev/null &&
      "${kmake[@]}" olddefconfig >/dev/null && "${kmake[@]}" -j"$(nproc)" vmlinux &&
      cp .config "$kcache/config" && powerpc-linux-gnu-strip -o vmlinux.stripped vmlinux &&
      mv vmlinux.stripped "$vmlinux" ) || { rm -rf "$tree"; fail "kernel build"; }
    rm -rf "$tree"
    echo "kernel built in $((SECONDS - t0)) s"
fi

# The initramfs: our init, the PowerPC programs and the C library they need.
programs=(vexorcd standin-audiod standin-mediacenter syslog-sink remote-sim)
( cd "$root" && cmake --preset ppc >/dev/null &&
  cmake --build --preset ppc --target "${programs[@]}" kernel-init >/dev/null ) || fail "PowerPC build"
bin=$root/build/ppc/bin out=$root/build/ppc/kernel
stage=$out/initramfs
rm -rf "$stage" && mkdir -p "$stage"/{bin,lib,dev,proc,sys}
powerpc-linux-gnu-strip -o "$stage/init" "$bin/kernel-init"
for p in "${programs[@]}"; do powerpc-linux-gnu-strip -o "$stage/bin/$p" "$bin/$p"; done
for lib in $(powerpc-linux-gnu-readelf -d "$stage/init" "$stage"/bin/* |
             sed -n 's/.*Shared library: \[\(.*\)\]/\1/p' | sort -u); do
    cp -L "/usr/powerpc-linux-gnu/lib/$lib" "$stage/lib/"
done
mknod "$stage/dev/console" c 5 1
( cd "$stage" && find . | cpio -o -H newc --quiet | gzip -9 ) >"$out/initramfs.cpio.gz"

# Boot; the init powers the machine off after its verdict.
log=$out/console.log t0=$SECONDS
timeout 300 qemu-system-ppc -M ppce500 -cpu e500mc -m 256 -nographic -no-reboot -nic none \
    -kernel "$vmlinux" -initrd "$out/initramfs.cpio.gz" \
    -append "console=ttyS0 panic=-1 quiet vexomode=$mode" </dev/null |
    sed -u 's/\r$//' | tee "$log" | grep --line-buffered -E "$filter" || true
[ "$mode" = demo ] && exit 0
echo "machine ran $((SECONDS - t0)) s; vmlinux $(du -k "$vmlinux" | cut -f1) KiB," \
    "initramfs $(du -k "$out/initramfs.cpio.gz" | cut -f1) KiB; console in $log"
verdict=$(grep -E '^kernel: [0-9]+ passed, [0-9]+ failed$' "$log" || true)
if [ -z "$verdict" ]; then
    tail -n 20 "$log"
    verdict="kernel: $(grep -c '^ok  ' "$log" || true) passed, $(($(grep -c '^FAIL' "$log" || true) + 1)) failed"
    echo "FAIL the machine gave no verdict"
fi
echo "$verdict"
[[ "$verdict" == *" 0 failed" ]]
