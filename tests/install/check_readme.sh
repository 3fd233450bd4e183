#!/usr/bin/env bash
# The README's tour as one program: its ```cpp blocks in order, their
# #include lines at the top and everything else the body of main, compiled
# against the build (installed into a fresh prefix, found with pkg-config)
# and run in a fresh temporary directory. It must build, exit 0 and log no
# failed open or operation.
# Usage: check_readme.sh README BUILD_DIR CXX
set -euo pipefail
readme=$1 build_dir=$2 cxx=$3
work=$(mktemp -d "${TMPDIR:-/tmp}/ulo_db_readme.XXXXXX")
trap 'rm -rf "$work"' EXIT

awk '/^```cpp$/ {block = 1; next} /^```$/ {block = 0} block' "$readme" >"$work/blocks"
{
    grep '^#include' "$work/blocks"
    echo 'int main()'
    echo '{'
    grep -v '^#include' "$work/blocks"
    echo '}'
} >"$work/tour.cpp"

cmake --install "$build_dir" --prefix "$work/prefix" >/dev/null
libdir=$(dirname "$(find "$work/prefix" -name 'libulo_db.so' -print -quit)")
# shellcheck disable=SC2046
"$cxx" -std=c++17 -Wall "$work/tour.cpp" -o "$work/tour" \
    $(PKG_CONFIG_PATH=$libdir/pkgconfig pkg-config --cflags --libs ulo_db) -Wl,-rpath,"$libdir"
mkdir "$work/tmp"
status=0
env -u LD_LIBRARY_PATH TMPDIR="$work/tmp" "$work/tour" 2>"$work/log" || status=$?
cat "$work/log"
if ((status != 0)) || grep -qi 'failed' "$work/log"; then
    echo "the tour failed: exit status $status, log above" >&2
    exit 1
fi
echo "README tour: $(grep -c '' "$work/blocks") lines built and ran"
