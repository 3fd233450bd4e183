#!/usr/bin/env bash
# Checks the Debian packages that `cpack -G DEB` makes from a build.
#   check_debs.sh BUILD_DIR host
#       (root) installs them with dpkg -i, builds consumer.cpp against /usr
#       with pkg-config and with find_package, runs both with an empty
#       environment, then removes the packages (on every way out, too) and
#       checks that nothing of them is left.
#   check_debs.sh BUILD_DIR arm ARM_SQLITE_ROOT
#       checks the armhf packages' architecture and contents, builds the
#       consumer with the cross toolchain against their unpacked files
#       (find_package) and runs it under qemu-arm with the armhf SQLite.
set -euo pipefail
build=$(cd "$1" && pwd) mode=$2 here=$(cd "$(dirname "$0")" && pwd)
work=$(mktemp -d "${TMPDIR:-/tmp}/ulo_db_debs.XXXXXX") root=/usr
trap '[[ $mode != host ]] || dpkg -r libulo-db-dev libulo-db1 >/dev/null 2>&1; rm -rf "$work"' EXIT
(cd "$build" && rm -f ./libulo-db*.deb && cpack -G DEB >/dev/null)
debs=("$build"/libulo-db*.deb)
run=(env -i) cmake_args=()
if [[ $mode == host ]]; then
    dpkg -i "${debs[@]}" >/dev/null
    # shellcheck disable=SC2046
    c++ -std=c++17 "$here/consumer.cpp" -o "$work/pc" $(pkg-config --cflags --libs ulo_db) && mkdir "$work/pc.data"
else
    root=$work/usr
    for deb in "${debs[@]}"; do
        dpkg-deb -I "$deb" | grep -x ' Architecture: armhf' >/dev/null && dpkg-deb -c "$deb" && dpkg-deb -x "$deb" "$work"
    done | grep -cE '/(lib(ulo_db|ulo_util|dlog)\.so(\.1|\.1\.0\.0)?( ->.*)?|ulo_db\.pc|ulo_dbConfig\.cmake|DADatabase\.h)$' | grep -qx 12
    cmake_args=(-DCMAKE_TOOLCHAIN_FILE="$here/../../cmake/toolchains/arm-linux-gnueabihf.cmake" -DULO_DB_ARM_SQLITE_ROOT="$3")
    run=(qemu-arm -L /usr/arm-linux-gnueabihf -E LD_LIBRARY_PATH="$3/usr/lib/arm-linux-gnueabihf")
fi
cmake -S "$here/consumer" -B "$work/cmake" -Dulo_db_DIR="$root/lib/cmake/ulo_db" "${cmake_args[@]}" >/dev/null
cmake --build "$work/cmake" >/dev/null && mkdir "$work/cmake/consumer.data"
for program in "$work"/pc "$work"/cmake/consumer; do
    [[ ! -e $program ]] || "${run[@]}" "$program" "$program.data"
done
if [[ $mode == host ]]; then
    dpkg -r libulo-db-dev libulo-db1 >/dev/null
    if dpkg-query -W libulo-db-dev libulo-db1 2>/dev/null || compgen -G "/usr/lib/lib*ulo*" >/dev/null; then
        echo "removing the packages left something behind" >&2 && exit 1
    fi
fi
echo "debs: ${debs[*]##*/} passed"
