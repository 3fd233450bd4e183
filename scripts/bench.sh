#!/usr/bin/env bash
# Builds the benchmarks in Release, runs every case and rewrites the results
# in docs/benchmarks.md (which says how cases, targets and sections are
# added):
#
#   scripts/bench.sh                 # everything, about 5 minutes on 2 cores
#   BUILD_DIR=/path scripts/bench.sh # another build directory
#   REPETITIONS=5 scripts/bench.sh   # repetitions per case (default 3; writes take 9)
#
# Data lives in fresh folders under /dev/shm (tmpfs) and under the build
# directory (ordinary disk), removed at the end.
set -euo pipefail

source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"
BUILD_DIR="${BUILD_DIR:-$ULO_ROOT/build-bench}"
RESULTS="$BUILD_DIR/bench-results.json"

ulo_install build bench
ulo_configure "$BUILD_DIR" -DCMAKE_BUILD_TYPE=Release -DULO_DB_BUILD_BENCHMARKS=ON >/dev/null
cmake --build "$BUILD_DIR" --target ulo_db_bench -j"$ULO_JOBS"

# Repetitions interleaved at random, so that slow drifts of the machine hit
# the library and its baselines alike.
step "benchmarks"
TMPDIR="$BUILD_DIR" "$BUILD_DIR/bench/ulo_db_bench" \
    --benchmark_min_time=0.3 --benchmark_repetitions="${REPETITIONS:-3}" \
    --benchmark_enable_random_interleaving=true --benchmark_out="$RESULTS" --benchmark_out_format=json

python3 "$ULO_ROOT/bench/report.py" --bench "$RESULTS" --doc "$ULO_ROOT/docs/benchmarks.md"
echo "report: $ULO_ROOT/docs/benchmarks.md"
