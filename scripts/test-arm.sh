#!/usr/bin/env bash
# Builds libulo_db and its tests for 32-bit ARM (arm-linux-gnueabihf) into
# build-arm and runs the whole CTest suite under qemu-arm.
#
#   scripts/test-arm.sh            # from a fresh Debian 12 machine, as root
#
# The target's SQLite comes from Debian's armhf packages, downloaded with
# apt-get download and unpacked with dpkg -x into build-arm/arm-sqlite (no
# armhf package is installed). GoogleTest is compiled for the target from
# /usr/src/googletest. Extra arguments go to ctest. At the end the armhf
# Debian packages are made (cpack) and checked: architecture, contents, and
# an outside program built against them run under qemu-arm.
set -euo pipefail

source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"
ROOT=$ULO_ROOT
BUILD=$ROOT/build-arm
SQLITE_ROOT=$BUILD/arm-sqlite
JOBS=$ULO_JOBS
cd "$ROOT"

step "Host tools (cmake, ninja, cross compiler, qemu, googletest sources)"
ulo_install arm

step "armhf SQLite into $SQLITE_ROOT"
if [[ ! -e $SQLITE_ROOT/usr/include/sqlite3.h || ! -e $SQLITE_ROOT/usr/lib/arm-linux-gnueabihf/libsqlite3.so ]]; then
    dpkg --print-foreign-architectures | grep -qx armhf || dpkg --add-architecture armhf
    # A mirror in mid-sync may fail one index; the main armhf index is enough.
    apt-get update || echo "apt-get update failed in part; going on with the indexes there are"
    mkdir -p "$BUILD/debs" "$SQLITE_ROOT"
    # apt's download sandbox user cannot write into a root-owned folder.
    chmod 777 "$BUILD/debs"
    (cd "$BUILD/debs" && rm -f ./*.deb && apt-get download libsqlite3-0:armhf libsqlite3-dev:armhf)
    for deb in "$BUILD"/debs/*.deb; do
        echo "unpacking $(basename "$deb")"
        dpkg -x "$deb" "$SQLITE_ROOT"
    done
fi

step "Configure $BUILD"
ulo_configure "$BUILD" \
    -DCMAKE_TOOLCHAIN_FILE="$ROOT/cmake/toolchains/arm-linux-gnueabihf.cmake" \
    -DULO_DB_ARM_SQLITE_ROOT="$SQLITE_ROOT" \
    -DCMAKE_BUILD_TYPE=RelWithDebInfo

step "Build"
cmake --build "$BUILD" -j "$JOBS"

step "Stripped size of the ARM libulo_db.so"
lib=$(find "$BUILD/lib" -name 'libulo_db.so.*.*' -type f | head -n1)
file "$lib" 2>/dev/null || true
tmp=$(mktemp)
trap 'rm -f "$tmp"' EXIT
arm-linux-gnueabihf-strip -o "$tmp" "$lib"
echo "$(basename "$lib"): $(stat -c %s "$lib") bytes as built, $(stat -c %s "$tmp") bytes stripped"

step "Tests under qemu-arm"
(cd "$BUILD" && ctest --output-on-failure -j "$JOBS" "$@")

step "Debian packages (armhf): architecture, contents, an outside program under qemu-arm"
"$ROOT/tests/install/check_debs.sh" "$BUILD" arm "$SQLITE_ROOT"
