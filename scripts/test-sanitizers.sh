#!/usr/bin/env bash
# Builds the library and the whole test suite with a sanitizer and runs
# every CTest test under it; any sanitizer report fails the run.
#
#   scripts/test-sanitizers.sh            # address, then thread
#   scripts/test-sanitizers.sh address    # ASan + UBSan + LeakSanitizer, clang -> build-asan,
#                                         # then the libFuzzer target from it for 60 s
#   scripts/test-sanitizers.sh thread     # TSan, g++                    -> build-tsan
#
# Further arguments after the mode go to ctest (e.g. -R Concurrent).
set -euo pipefail

source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"
ROOT=$ULO_ROOT
JOBS=$ULO_JOBS
cd "$ROOT"

mode=${1:-all}
[[ $# -gt 0 ]] && shift
case $mode in
address | thread) modes=("$mode") ;;
all) modes=(address thread) ;;
*)
    echo "usage: $0 [address|thread|all] [ctest arguments...]" >&2
    exit 2
    ;;
esac

step "Host build tools (missing ones only)"
ulo_install build tests
[[ $mode == thread ]] || ulo_install clang

# TSan maps its shadow memory at fixed addresses; with a high ASLR entropy
# (vm.mmap_rnd_bits > 28, common on newer kernels) the program's own
# mappings can land there and TSan stops with "unexpected memory mapping".
# Running the tests without address randomisation avoids that.
no_aslr=()
if setarch "$(uname -m)" -R true 2>/dev/null; then
    no_aslr=(setarch "$(uname -m)" -R)
fi

run() {
    local sanitizer=$1
    shift
    # The address build is clang's: it compiles the sanitized suite about
    # three times faster than g++ and builds the libFuzzer target alongside,
    # so one build serves both (the host and thread builds are g++'s).
    local build compiler=()
    case $sanitizer in
    address) build=$ROOT/build-asan compiler=(-DCMAKE_CXX_COMPILER=clang++ -DULO_DB_BUILD_FUZZER=ON) ;;
    thread) build=$ROOT/build-tsan ;;
    esac

    step "[$sanitizer] configure $build"
    # An address build made with g++ (before it was clang's) cannot switch compilers: made anew.
    if [[ $sanitizer == address ]] && ! grep -qs '^ULO_DB_BUILD_FUZZER:BOOL=ON' "$build/CMakeCache.txt"; then
        rm -rf "$build"
    fi
    ulo_configure "$build" "${compiler[@]}" -DULO_DB_SANITIZER="$sanitizer" -DCMAKE_BUILD_TYPE=RelWithDebInfo \
        -DULO_DB_BUILD_TESTS=ON -DULO_DB_BUILD_BENCHMARKS=OFF -DULO_DB_BUILD_DOCS=OFF

    step "[$sanitizer] build"
    cmake --build "$build" -j "$JOBS"

    step "[$sanitizer] ctest"
    local -a wrap=()
    [[ $sanitizer == thread ]] && wrap=("${no_aslr[@]}")
    (
        cd "$build"
        export ASAN_OPTIONS=halt_on_error=1:detect_leaks=1:abort_on_error=0
        export UBSAN_OPTIONS=halt_on_error=1:print_stacktrace=1
        export TSAN_OPTIONS=halt_on_error=1:second_deadlock_stack=1
        echo "ASAN_OPTIONS=$ASAN_OPTIONS UBSAN_OPTIONS=$UBSAN_OPTIONS TSAN_OPTIONS=$TSAN_OPTIONS ${wrap[*]}"
        "${wrap[@]}" ctest --output-on-failure -j "$JOBS" "$@"
    )
}

# The libFuzzer target of the address build, run for a bounded time from an
# empty corpus (a crash, leak or sanitizer report fails the run).
fuzz() {
    step "[fuzz] run 60 s"
    local corpus
    corpus=$(mktemp -d "${TMPDIR:-/tmp}/ulo_db_fuzz.XXXXXX")
    (cd "$ROOT/build-asan" && ASAN_OPTIONS=detect_leaks=1 fuzz/ulo_db_fuzz -max_total_time=60 -print_final_stats=1 "$corpus")
    rm -rf "$corpus"
}

for sanitizer in "${modes[@]}"; do
    start=$SECONDS
    run "$sanitizer" "$@"
    if [[ $sanitizer == address ]]; then fuzz; fi
    echo "[$sanitizer] passed in $((SECONDS - start)) s"
done
