#!/usr/bin/env bash
# Static checks:
#   1. clang-tidy (the repository's .clang-tidy, as C++17: GCC needs no -std
#      flag, so compile_commands.json has none) over the sources of the
#      library and the platform stand-ins, any warning is an error; it reads
#      compile_commands.json from a configure-only build in build-tidy;
#   2. clang-format --dry-run --Werror over every tracked *.cpp and *.h;
#   3. the doc target: Doxygen over the public headers, where any warning
#      (an undocumented public class or operation included) is an error.
# All run; the script fails if any found anything.
set -euo pipefail

source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"
ROOT=$ULO_ROOT
BUILD=$ROOT/build-tidy
JOBS=$ULO_JOBS
cd "$ROOT"

# The first of the given tool names found on PATH.
pick() {
    local name
    for name in "$@"; do
        command -v "$name" >/dev/null && { echo "$name"; return 0; }
    done
    return 1
}

if ! pick clang-tidy-14 clang-tidy >/dev/null || ! pick clang-format-14 clang-format >/dev/null; then
    ulo_install static
fi
TIDY=$(pick clang-tidy-14 clang-tidy)
FORMAT=$(pick clang-format-14 clang-format)
ulo_install build docs

step "Configure $BUILD for compile_commands.json (library and platform only) and the doc target"
ulo_configure "$BUILD" -DCMAKE_EXPORT_COMPILE_COMMANDS=ON \
    -DULO_DB_BUILD_TESTS=OFF -DULO_DB_BUILD_EXAMPLES=OFF -DULO_DB_BUILD_BENCHMARKS=OFF -DULO_DB_BUILD_DOCS=ON >/dev/null

mapfile -t sources < <(sed -nE 's/^ *"file": "(.*)",?$/\1/p' "$BUILD/compile_commands.json" |
    grep -E "^$ROOT/(lib|platform)/" | sort -u)
[[ ${#sources[@]} -gt 0 ]] || { echo "no library sources in $BUILD/compile_commands.json" >&2; exit 1; }

status=0
step "$TIDY over ${#sources[@]} sources ($("$TIDY" --version | sed -n 's/.*version \([0-9.]*\).*/\1/p'))"
if printf '%s\n' "${sources[@]}" |
    xargs -P "$JOBS" -n 2 "$TIDY" -p "$BUILD" --extra-arg=-std=c++17 --quiet --warnings-as-errors='*' 2> >(grep -v ' warnings generated\.$' >&2); then
    echo "clang-tidy: clean"
else
    echo "clang-tidy: FAILED" >&2
    status=1
fi

mapfile -t tracked < <(git ls-files '*.cpp' '*.h')
step "$FORMAT --dry-run --Werror over ${#tracked[@]} tracked files"
bad=()
for file in "${tracked[@]}"; do
    "$FORMAT" --dry-run --Werror "$file" 2>/dev/null || bad+=("$file")
done
if ((${#bad[@]})); then
    echo "clang-format: not formatted (run $FORMAT -i on them):" >&2
    printf '  %s\n' "${bad[@]}" >&2
    status=1
else
    echo "clang-format: clean"
fi

step "doxygen $(doxygen --version) over the public headers (cmake --build $BUILD --target doc)"
if cmake --build "$BUILD" --target doc; then
    echo "doxygen: clean"
else
    echo "doxygen: FAILED (every warning above is an error)" >&2
    status=1
fi

exit $status
