# Debian packages that building, testing and the demo need; sourced by the
# scripts. Installs only what is missing, so that a prepared machine is not
# touched (and needs no network).
VEXO_PACKAGES=(
    cmake make g++ googletest
    g++-powerpc-linux-gnu qemu-user
    util-linux mount procps groff-base
    clang libclang-rt-14-dev cppcheck clang-tidy
)
# What tests/kernel/run.sh adds: a PowerPC kernel built from source, booted
# under system emulation.
VEXO_KERNEL_PACKAGES=(
    linux-source-6.1 flex bison bc cpio xz-utils libssl-dev libelf-dev qemu-system-ppc
)

vexo_install_deps() {
    local missing=() p
    for p in "${VEXO_PACKAGES[@]}" "$@"; do
        dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'install ok installed' || missing+=("$p")
    done
    [ ${#missing[@]} -eq 0 ] && return 0
    if [ "$(id -u)" != 0 ]; then
        echo "missing Debian packages: ${missing[*]} (run as root to install them)" >&2
        return 1
    fi
    echo "installing: ${missing[*]}"
    apt-get update -qq && DEBIAN_FRONTEND=noninteractive apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
}
