#!/usr/bin/env bash
# Builds libulo_db and its tests for 32-bit ARM (arm-linux-gnueabihf) into
# build-arm and runs the whole CTest suite under qemu-arm.
#
#   scripts/test-arm.sh            # from a fresh Debian 12 machine, as root
#
# The target's SQLite comes from Debian's armhf packages, downloaded with
# apt-get download and unpacked with dpkg -x into build-arm/arm-sqlite (the
# armhf runtime packages are installed only for the package check at the
# end). GoogleTest is compiled for the target from
# /usr/src/googletest. Extra arguments go to ctest. At the end the armhf
# Debian packages are made (cpack) and checked with lintian; then, as root,
# they are installed side by side with the amd64 ones (from build, made here
# if missing), an outside program of each architecture is built against them
# and run (armhf under qemu-arm), and all are purged again.
set -euo pipefail

source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"
ROOT=$ULO_ROOT
BUILD=$ROOT/build-arm
SQLITE_ROOT=$BUILD/arm-sqlite
JOBS=$ULO_JOBS
cd "$ROOT"

step "Host tools (cmake, ninja, cross compiler, qemu, googletest sources)"
ulo_install arm build package

step "armhf SQLite into $SQLITE_ROOT"
if ! dpkg --print-foreign-architectures | grep -qx armhf; then
    dpkg --add-architecture armhf
    rm -rf "$SQLITE_ROOT"  # fetched again below, with the armhf index
fi
if [[ ! -e $SQLITE_ROOT/usr/include/sqlite3.h || ! -e $SQLITE_ROOT/usr/lib/arm-linux-gnueabihf/libsqlite3.so ]]; then
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
    -DCMAKE_BUILD_TYPE=Release

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

step "Debian packages (armhf): lintian; installed next to amd64's, an outside program of each run"
# The armhf runtime libraries: dpkg-shlibdeps reads them for the Depends
# line, and the packages' dependencies need them installed.
ulo_install armhf-runtime
if [[ ! -e $ROOT/build/CMakeCache.txt ]]; then
    ulo_configure "$ROOT/build" >/dev/null
fi
cmake --build "$ROOT/build" --target ulo_db -j "$JOBS"
"$ROOT/tests/install/check_debs.sh" "$BUILD" arm "$ROOT/build" "$SQLITE_ROOT"
