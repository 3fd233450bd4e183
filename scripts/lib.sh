# Shared by the scripts in this folder (source it, do not run it):
#   ULO_ROOT, ULO_JOBS      the repository and the number of build jobs
#   step TEXT...            prints a step heading
#   ulo_install GROUP...    installs with apt-get the missing Debian packages
#                           of the named groups (a prepared machine is left
#                           untouched)
#   ulo_configure BUILD ARG...
#                           cmake -S ULO_ROOT -B BUILD ARG..., with Ninja when
#                           it is there and BUILD is new
# shellcheck shell=bash

ULO_ROOT=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
# shellcheck disable=SC2034  # used by the scripts that source this file
ULO_JOBS=$(nproc)

# What each job needs, by Debian package name.
declare -A ULO_GROUPS=(
    [build]="cmake g++ make pkg-config libsqlite3-dev"
    [tests]="googletest libgtest-dev sqlite3"
    [arm]="cmake g++-arm-linux-gnueabihf qemu-user googletest ninja-build"
    [static]="clang-tidy clang-format"
    [docs]="doxygen"
    [bench]="libbenchmark-dev libsqlitecpp-dev python3 gnuplot-nox"
    [package]="dpkg dpkg-dev file binutils lintian gdb pkg-config"
    [armhf-runtime]="libc6:armhf libstdc++6:armhf libgcc-s1:armhf libsqlite3-0:armhf"
    [clang]="clang libclang-rt-14-dev"
)

step() { printf '\n==> [%d s] %s\n' "$SECONDS" "$*"; }

ulo_install() {
    local group name wanted=() missing=() names sudo=""
    for group in "$@"; do
        [[ -n "${ULO_GROUPS[$group]:-}" ]] || { echo "ulo_install: unknown group '$group'" >&2; return 2; }
        read -ra names <<<"${ULO_GROUPS[$group]}"
        wanted+=("${names[@]}")
    done
    for name in "${wanted[@]}"; do
        dpkg-query -W -f='${Status}' "$name" 2>/dev/null | grep -q "install ok installed" || missing+=("$name")
    done
    ((${#missing[@]})) || return 0
    [[ $(id -u) -eq 0 ]] || sudo=sudo
    echo "installing ${missing[*]}"
    # A mirror in mid-sync may fail one index; the others are enough.
    $sudo apt-get update -qq || echo "apt-get update reported errors; trying with the lists there are" >&2
    DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
}

ulo_configure() {
    local build=$1 generator=()
    shift
    [[ ! -e $build/CMakeCache.txt ]] && command -v ninja >/dev/null && generator=(-G Ninja)
    cmake -S "$ULO_ROOT" -B "$build" "${generator[@]}" "$@"
}
