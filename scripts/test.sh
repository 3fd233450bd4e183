#!/usr/bin/env bash
# Builds and runs every test the project has, each suite in its own build:
#   host     the suite on this machine
#   arm      the suite built for 32-bit ARM, run under qemu-arm
#   asan     the suite under AddressSanitizer + UndefinedBehaviorSanitizer (leaks too)
#   tsan     the suite under ThreadSanitizer
#   static   clang-tidy and the clang-format check
# With no argument all of them run; name some to run only those
# (scripts/test.sh host is the quick loop). Stops at the first failure.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
suites=("$@")
[[ ${#suites[@]} -gt 0 ]] || suites=(host arm asan tsan static)

run_host() {
    "$root/scripts/install-deps.sh" build
    cmake -S "$root" -B "$root/build" >/dev/null
    cmake --build "$root/build" -j"$(nproc)"
    (cd "$root/build" && ctest --output-on-failure -j"$(nproc)")
}

run_suite() {
    case $1 in
        host) run_host ;;
        arm) "$root/scripts/test-arm.sh" ;;
        asan) "$root/scripts/test-sanitizers.sh" address ;;
        tsan) "$root/scripts/test-sanitizers.sh" thread ;;
        static) "$root/scripts/check-static.sh" ;;
        *) echo "test.sh: unknown suite '$1'" >&2; return 2 ;;
    esac
}

log=$(mktemp "${TMPDIR:-/tmp}/ulo_db_test.XXXXXX")
trap 'rm -f "$log"' EXIT
passed=0
failed=0
for suite in "${suites[@]}"; do
    start=$SECONDS
    echo "==== $suite"
    run_suite "$suite" 2>&1 | tee "$log"
    # Add up what ctest reported ("100% tests passed, 0 tests failed out of 250").
    read -r total bad < <(sed -nE 's/.*tests passed, ([0-9]+) tests failed out of ([0-9]+).*/\2 \1/p' "$log" |
                          awk '{t += $1; f += $2} END {print t + 0, f + 0}')
    passed=$((passed + total - bad))
    failed=$((failed + bad))
    echo "==== $suite passed in $((SECONDS - start)) s"
done
echo
echo "all suites: $passed passed, $failed failed"
