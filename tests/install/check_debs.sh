#!/usr/bin/env bash
# Checks the Debian packages that `cpack -G DEB` makes from a build: lintian
# reports no error over any of them; then, as root:
#   check_debs.sh BUILD_DIR host
#       installs them with dpkg -i, builds consumer.cpp against /usr with
#       pkg-config and with find_package and runs both with an empty
#       environment, and gdb finds a library function's source line through
#       the -dbgsym package;
#   check_debs.sh ARM_BUILD_DIR arm HOST_BUILD_DIR ARM_SQLITE_ROOT
#       installs the armhf libraries (with their -dbgsym) and the amd64
#       packages side by side, and runs consumer.cpp of each architecture
#       against the libraries in /usr: amd64 built with pkg-config, armhf
#       built with the cross toolchain against the armhf -dev package's files
#       and run under qemu-arm. (libulo-db-dev:armhf itself needs
#       libsqlite3-dev:armhf, which drags in the armhf C library headers: not
#       installed here.)
# and at the end (on every way out, too) removes and purges every package by
# name and checks that dpkg knows none of them and no library is left.
set -euo pipefail
build=$(cd "$1" && pwd) mode=$2 here=$(cd "$(dirname "$0")" && pwd)
work=$(mktemp -d "${TMPDIR:-/tmp}/ulo_db_debs.XXXXXX")
names=(libulo-db-dev libulo-db1-dbgsym libulo-db1)
installed=()
purge() {
    ((${#installed[@]})) || return 0
    # Without maintainer scripts or conffiles a removed package is gone:
    # the purge then only confirms it.
    dpkg -r "${installed[@]}" >/dev/null && dpkg -P "${installed[@]}" 2>&1 | grep -v "isn't installed" >&2 || true
}
trap 'purge || true; rm -rf "$work"' EXIT

# The packages of a build: .deb and the -dbgsym .ddeb, with lintian's verdict.
make_debs() {
    (cd "$1" && rm -f ./libulo-db*.deb ./libulo-db*.ddeb && cpack -G DEB >/dev/null)
    lintian --fail-on error "$1"/libulo-db*.deb "$1"/libulo-db*.ddeb 2> >(grep -v 'running with root' >&2)
    echo "lintian: no error in $(cd "$1" && echo libulo-db*.deb libulo-db*.ddeb)"
}

make_debs "$build"
if [[ $(id -u) -ne 0 ]]; then
    echo "installing the packages skipped: it needs root"
    exit 0
fi
debs=("$build"/libulo-db*.deb "$build"/libulo-db*.ddeb)
installed=("${names[@]}")
if [[ $mode == arm ]]; then
    make_debs "$3"
    dpkg-deb -x "$build"/libulo-db-dev_*_armhf.deb "$work/armhf" && dpkg-deb -x "$build"/libulo-db1_*_armhf.deb "$work/armhf"
    debs=("$3"/libulo-db*.deb "$3"/libulo-db*.ddeb "$build"/libulo-db1_*.deb "$build"/libulo-db1-dbgsym_*.ddeb)
    installed=("${names[@]/%/:amd64}" libulo-db1-dbgsym:armhf libulo-db1:armhf)
fi
dpkg -i "${debs[@]}" >/dev/null
echo "installed: $(dpkg-query -W -f='${Package}:${Architecture} ' 'libulo-db*')"

# The outside program against /usr, run with an empty environment.
# shellcheck disable=SC2046
c++ -std=c++17 "$here/consumer.cpp" -o "$work/pc" $(pkg-config --cflags --libs ulo_db)
mkdir "$work/pc.data" && env -i "$work/pc" "$work/pc.data"
if [[ $mode == host ]]; then
    cmake -S "$here/consumer" -B "$work/cmake" >/dev/null && cmake --build "$work/cmake" >/dev/null
    mkdir "$work/cmake.data" && env -i "$work/cmake/consumer" "$work/cmake.data"
    library=/usr/lib/$(dpkg-architecture -qDEB_HOST_MULTIARCH)/libulo_db.so.1
    file -L "$library" | grep ', stripped$'
    gdb -batch -ex 'info line DADatabase::Upsert' "$library" 2>&1 | grep -m1 -E '^Line [0-9]+ of ".*/DADatabase\.cpp"'
else
    # Without a run path: the libraries come from /usr/lib/arm-linux-gnueabihf.
    cmake -S "$here/consumer" -B "$work/arm" -DCMAKE_SKIP_RPATH=ON -Dulo_db_DIR="$work/armhf/usr/lib/arm-linux-gnueabihf/cmake/ulo_db" \
        -DCMAKE_TOOLCHAIN_FILE="$here/../../cmake/toolchains/arm-linux-gnueabihf.cmake" -DULO_DB_ARM_SQLITE_ROOT="$4" >/dev/null
    cmake --build "$work/arm" >/dev/null
    mkdir "$work/arm.data" && env -i qemu-arm "$work/arm/consumer" "$work/arm.data"
    echo "ran side by side: $(file -b "$work/pc" | cut -d, -f1-2); $(file -b "$work/arm/consumer" | cut -d, -f1-2) under qemu-arm"
fi

purge
installed=()
for name in "${names[@]}"; do
    if dpkg -l "$name" 2>/dev/null | grep -q '^[a-z][a-z] '; then
        echo "$name is still known to dpkg after its purge:" >&2 && dpkg -l "$name" >&2 && exit 1
    fi
done
for deb in "${debs[@]}"; do
    while read -r path; do
        [[ ! -e $path && ! -L $path ]] || { echo "$path is left behind by $(basename "$deb")" >&2 && exit 1; }
    done < <(dpkg-deb -c "$deb" | awk '$1 !~ /^d/ {print substr($6, 2)}')
done
echo "packages purged: none of ${names[*]} is known to dpkg"
