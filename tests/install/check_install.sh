#!/usr/bin/env bash
# Installs the build tree into a fresh prefix, compiles every installed
# header on its own, then builds and runs a program against the installed
# package twice: once with pkg-config, once with CMake's find_package. The programs run with LD_LIBRARY_PATH unset: the
# installed libraries must find each other on their own, by their run path
# $ORIGIN. Installed under the prefix /usr (staged with DESTDIR) they carry
# no run path at all, as system libraries.
# Usage: check_install.sh BUILD_DIR CXX
set -euo pipefail
build_dir=$1
cxx=$2
here=$(cd "$(dirname "$0")" && pwd)
work=$(mktemp -d "${TMPDIR:-/tmp}/ulo_db_install.XXXXXX")
trap 'rm -rf "$work"' EXIT
prefix=$work/prefix

cmake --install "$build_dir" --prefix "$prefix" >/dev/null
libdir=$(dirname "$(find "$prefix" -name 'libulo_db.so' -print -quit)")
unset LD_LIBRARY_PATH

# The run path of each installed library, "-" for none.
runpaths() {
    local library
    for library in "$1"/lib{ulo_db,ulo_util,dlog}.so.1; do
        printf '%s ' "$(readelf -d "$library" | sed -nE 's/.*\((RUNPATH|RPATH)\).*\[(.*)\]/\2/p' | grep . || echo -)"
    done
}
echo "-- run paths: under $prefix \$ORIGIN, under /usr none"
[[ $(runpaths "$libdir") == '$ORIGIN $ORIGIN $ORIGIN ' ]] || { echo "under $prefix: $(runpaths "$libdir")" >&2 && exit 1; }
DESTDIR=$work/staged cmake --install "$build_dir" --prefix /usr >/dev/null
staged=$work/staged/usr/${libdir#"$prefix"/}
[[ $(runpaths "$staged") == '- - - ' ]] || { echo "under /usr: $(runpaths "$staged")" >&2 && exit 1; }

echo "-- pkg-config"
export PKG_CONFIG_PATH=$libdir/pkgconfig
# shellcheck disable=SC2046
"$cxx" -std=c++17 "$here/consumer.cpp" -o "$work/consumer_pc" $(pkg-config --cflags --libs ulo_db) -Wl,-rpath,"$libdir"
mkdir "$work/run_pc"
"$work/consumer_pc" "$work/run_pc"

echo "-- every installed header compiles on its own"
# shellcheck disable=SC2016,SC2046
find "$prefix/include" -name '*.h' -printf '%f\n' | xargs -P "$(nproc)" -I{} sh -c \
    'echo "#include <{}>" | "$0" -std=c++17 -fsyntax-only -x c++ - "$@" || { echo "{} fails alone" >&2; exit 255; }' \
    "$cxx" $(pkg-config --cflags ulo_db)

echo "-- find_package"
cmake -S "$here/consumer" -B "$work/consumer_build" -DCMAKE_PREFIX_PATH="$prefix" -DCMAKE_CXX_COMPILER="$cxx" >/dev/null
cmake --build "$work/consumer_build" >/dev/null
mkdir "$work/run_cmake"
"$work/consumer_build/consumer" "$work/run_cmake"
