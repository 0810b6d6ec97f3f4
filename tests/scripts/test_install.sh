#!/bin/bash
# cmake --install stages a Debian-style target root under DESTDIR: the daemon
# in sbin, the companion client in bin, the manual pages, the examples.
set -u
build=$(cd "${VEXO_BIN_DIR:?}/.." && pwd)
stage=/tmp/stage
rm -rf "$stage"
DESTDIR=$stage cmake --install "$build" --prefix /usr >/dev/null || { echo "FAILED: install"; exit 1; }
fail=0
for f in usr/sbin/vexorcd usr/bin/vexorctl usr/share/man/man8/vexorcd.8 usr/share/man/man1/vexorctl.1 \
         usr/share/doc/vexorcd/examples/vexorcd.init usr/share/doc/vexorcd/examples/99-vexorcd-receiver.rules; do
    [ -e "$stage/$f" ] || { echo "FAILED: $f not installed"; fail=1; }
done
[ -x "$stage/usr/sbin/vexorcd" ] || { echo "FAILED: vexorcd not executable"; fail=1; }
# Nothing of the tests or the stand-ins goes onto the target.
extra=$(find "$stage" -type f | grep -v -E '/(vexorcd|vexorctl|vexorcd\.8|vexorctl\.1|vexorcd\.init|99-vexorcd-receiver\.rules)$')
[ -z "$extra" ] || { echo "FAILED: unexpected files installed: $extra"; fail=1; }
find "$stage" -type f | sort
rm -rf "$stage"
[ $fail -eq 0 ] && echo "install: all checks passed"
exit $fail
