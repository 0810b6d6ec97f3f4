#!/bin/bash
# The main job, on a fresh machine: builds what is missing, then runs vexorcd
# in the test sandbox beside the stand-in audio daemon, media-center UI and
# radio remote, and plays a short scripted session. Needs root.
#
#   bash scripts/demo.sh           the session on the native build
#   bash scripts/demo.sh --ppc     the same on the PowerPC build, under qemu-ppc
#   bash scripts/demo.sh --shell   the session, then a shell in the sandbox to
#                                  drive the daemon by hand (exit leaves it);
#                                  without a terminal, each line of standard
#                                  input is run as a command instead
#   bash scripts/demo.sh --kernel  a session on a real PowerPC kernel under
#                                  qemu-system-ppc, the receiver a USB HID
#                                  gadget (builds that kernel once, 5-14 min)
set -euo pipefail
cd "$(dirname "$0")/.."
preset=release
shell=0
for arg in "$@"; do
    case "$arg" in
    --ppc) preset=ppc ;;
    --shell) shell=1 ;;
    --kernel) exec bash tests/kernel/run.sh --demo ;;
    -h|--help) sed -n '2,/^[^#]/{/^#/s/^# \{0,1\}//p}' "$0"; exit 0 ;;
    *) echo "demo.sh: unknown option $arg (try --help)" >&2; exit 2 ;;
    esac
done
. scripts/deps.sh
vexo_install_deps
echo "Building the $preset build (only what is missing)..."
cmake --preset "$preset" >/dev/null
cmake --build --preset "$preset" --target vexorcd vexorctl standin-audiod \
    standin-mediacenter remote-sim syslog-sink >/dev/null

emulator=""
[ "$preset" = ppc ] && emulator="qemu-ppc -L /usr/powerpc-linux-gnu"
export VEXO_BIN_DIR="$PWD/build/$preset/bin" VEXO_EMULATOR="$emulator" VEXO_DEMO_SHELL="$shell"
exec tests/sandbox.sh bash scripts/demo-session.sh
