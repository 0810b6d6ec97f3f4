#!/bin/bash
# Boots vexorcd on a real 32-bit big-endian PowerPC kernel under
# qemu-system-ppc, with the receiver a USB HID gadget read through hiddev,
# and prints the checks the machine's init made. Needs root.
#   bash tests/kernel/run.sh           the checks; last line "kernel: N passed, N failed"
#   bash tests/kernel/run.sh --demo    the same session, showing what each peer got
#   bash tests/kernel/run.sh --build-kernel   only build (or find) the kernel
# The kernel is built once per machine (niced, 5 to 14 minutes) from
# linux-source-6.1 and kernel.config, and kept in
# /var/cache/vexorcd-kernel/<hash of both>/vmlinux.
set -euo pipefail
here=$(cd "$(dirname "$0")" && pwd)
root=$(cd "$here/../.." && pwd)
case "${1:-}" in
"") mode=check ;;
--demo) mode=demo ;;
--build-kernel) mode=kernel ;;
*) sed -n '2,11p' "$0" | sed 's/^# \{0,1\}//'; exit 2 ;;
esac
[ "$(id -u)" = 0 ] || { echo "kernel: run as root"; echo "kernel: 0 passed, 1 failed"; exit 1; }
# shellcheck source=scripts/deps.sh
. "$root/scripts/deps.sh"
vexo_install_deps "${VEXO_KERNEL_PACKAGES[@]}"

ksrc=/usr/src/linux-source-6.1.tar.xz
kver=$(dpkg-query -W -f='${Version}' linux-source-6.1)
khash=$( { echo "$kver"; cat "$here/kernel.config"; } | sha256sum | cut -c1-16)
kcache=${VEXO_KERNEL_CACHE:-/var/cache/vexorcd-kernel}/$khash
vmlinux=$kcache/vmlinux
kmake=(nice -n 10 make -s ARCH=powerpc CROSS_COMPILE=powerpc-linux-gnu-)

build_kernel() {
    local t0=$SECONDS tree
    echo "building the PowerPC kernel once into $kcache (about 7-14 minutes)"
    mkdir -p "$kcache"
    tree=$(mktemp -d "$kcache/src.XXXXXX")
    tar -xf "$ksrc" -C "$tree" --strip-components=1
    ( cd "$tree" && "${kmake[@]}" tinyconfig >/dev/null &&
      KCONFIG_CONFIG=.config scripts/kconfig/merge_config.sh -m -O . .config "$here/kernel.config" >/dev/null &&
      "${kmake[@]}" olddefconfig >/dev/null &&
      "${kmake[@]}" -j"$(nproc)" vmlinux &&
      powerpc-linux-gnu-strip -o vmlinux.stripped vmlinux &&
      mv vmlinux.stripped "$vmlinux.tmp" && cp .config "$kcache/config" )
    rm -rf "$tree"
    mv "$vmlinux.tmp" "$vmlinux"
    echo "kernel built in $((SECONDS - t0)) s"
}
[ -f "$vmlinux" ] || build_kernel
[ "$mode" = kernel ] && exit 0

# The programs of the machine, from the PowerPC build.
programs=(vexorcd vexorctl standin-audiod standin-mediacenter syslog-sink remote-sim)
( cd "$root" && cmake --preset ppc >/dev/null &&
  cmake --build --preset ppc --target "${programs[@]}" kernel-init >/dev/null )
bin=$root/build/ppc/bin
out=$root/build/ppc/kernel
stage=$out/initramfs
rm -rf "$stage" && mkdir -p "$stage"/{bin,lib,dev,proc,sys,tmp}
powerpc-linux-gnu-strip -o "$stage/init" "$bin/kernel-init"
for p in "${programs[@]}"; do powerpc-linux-gnu-strip -o "$stage/bin/$p" "$bin/$p"; done
for lib in $(powerpc-linux-gnu-readelf -d "$stage/init" "$stage"/bin/* | sed -n 's/.*Shared library: \[\(.*\)\]/\1/p' | sort -u); do
    cp -L "/usr/powerpc-linux-gnu/lib/$lib" "$stage/lib/"
done
mknod "$stage/dev/console" c 5 1
( cd "$stage" && find . | cpio -o -H newc --quiet | gzip -9 ) >"$out/initramfs.cpio.gz"

# Boot; the init powers the machine off after its last line.
log=$out/console.log
t0=$SECONDS
timeout 300 qemu-system-ppc -M ppce500 -cpu e500mc -m 256 -nographic -no-reboot -nic none \
    -kernel "$vmlinux" -initrd "$out/initramfs.cpio.gz" \
    -append "console=ttyS0 panic=-1 quiet vexomode=$mode" </dev/null | tr -d '\r' >"$log" || true
if [ "$mode" = demo ]; then
    cat "$log"
    exit 0
fi
grep -E '^(ok  |FAIL|machine up)' "$log" || true
verdict=$(grep -E '^kernel: [0-9]+ passed, [0-9]+ failed$' "$log" | tail -n 1 || true)
echo "machine ran $((SECONDS - t0)) s (vmlinux $(du -k "$vmlinux" | cut -f1) KiB, initramfs $(du -k "$out/initramfs.cpio.gz" | cut -f1) KiB); console in $log"
if [ -z "$verdict" ]; then
    tail -n 20 "$log"
    verdict="kernel: $(grep -c '^ok  ' "$log" || true) passed, $(($(grep -c '^FAIL' "$log" || true) + 1)) failed"
    echo "FAIL the machine gave no verdict"
fi
echo "$verdict"
[[ "$verdict" == *" 0 failed" ]]
