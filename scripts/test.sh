#!/usr/bin/env bash
# Builds and runs every test the project has, each suite in its own build:
#   host     the suite on this machine, the install and README checks, the
#            test names; the amd64 Debian packages (lintian; as root
#            installed, used, purged)
#   arm      the suite built for 32-bit ARM, run under qemu-arm; the armhf
#            packages (lintian; installed next to the amd64 ones, used, purged)
#   asan     the suite under AddressSanitizer + UndefinedBehaviorSanitizer
#            (leaks too), then the libFuzzer target for 60 s
#   tsan     the suite under ThreadSanitizer
#   static   clang-tidy, the clang-format check and Doxygen over the public
#            headers (any warning fails)
# With no argument all of them run; name some to run only those
# (scripts/test.sh host is the quick loop). Stops at the first failure.
set -euo pipefail
source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"
root=$ULO_ROOT
suites=("$@")
[[ ${#suites[@]} -gt 0 ]] || suites=(host arm asan tsan static)

# The host suite ends with the Debian packages: checked with lintian, and as
# root installed into /usr, used by an outside program and purged again.
run_host() {
    ulo_install build tests package
    # The benchmarks build in scripts/bench.sh; here they would only cost time.
    ulo_configure "$root/build" -DULO_DB_BUILD_TESTS=ON -DULO_DB_BUILD_BENCHMARKS=OFF >/dev/null
    cmake --build "$root/build" -j"$ULO_JOBS"
    # Twice the cores: many cases wait on a lock, a sleep or a sync.
    (cd "$root/build" && ctest --output-on-failure -j$((2 * ULO_JOBS)))
    step "Test names: a parameterised case is named by its generator, never by an index or its bytes"
    if (cd "$root/build" && ctest -N) | grep -E '^ *Test +#' | grep -E '#.*#|/[0-9]+$'; then
        echo "name these cases: INSTANTIATE_TEST_SUITE_P(..., name generator)" >&2
        return 1
    fi
    step "Debian packages (amd64): lintian; dpkg -i, an outside program against /usr, gdb, purge"
    "$root/tests/install/check_debs.sh" "$root/build" host
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
