#!/usr/bin/env bash
# Installs the build tree into a fresh prefix, then builds and runs a program
# against the installed package twice: once with pkg-config, once with
# CMake's find_package. The programs run with LD_LIBRARY_PATH unset: the
# installed libraries must find each other on their own.
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

echo "-- pkg-config"
export PKG_CONFIG_PATH=$libdir/pkgconfig
# shellcheck disable=SC2046
"$cxx" -std=c++17 "$here/consumer.cpp" -o "$work/consumer_pc" $(pkg-config --cflags --libs ulo_db) -Wl,-rpath,"$libdir"
mkdir "$work/run_pc"
"$work/consumer_pc" "$work/run_pc"

echo "-- find_package"
cmake -S "$here/consumer" -B "$work/consumer_build" -DCMAKE_PREFIX_PATH="$prefix" -DCMAKE_CXX_COMPILER="$cxx" >/dev/null
cmake --build "$work/consumer_build" >/dev/null
mkdir "$work/run_cmake"
"$work/consumer_build/consumer" "$work/run_cmake"
