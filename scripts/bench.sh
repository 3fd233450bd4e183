#!/usr/bin/env bash
# Builds the benchmarks in Release, runs the whole set (timings and the
# memory probes) and rewrites docs/benchmarks.md and docs/img/*.png from the
# results. One command from a fresh clone:
#
#   scripts/bench.sh                 # everything, about 5 minutes on 2 cores
#   BUILD_DIR=/path scripts/bench.sh # another build directory
#   REPETITIONS=5 scripts/bench.sh   # more repetitions per case (default 3)
#
# Data lives in mkdtemp folders under /dev/shm (tmpfs) and under the build
# directory (ordinary disk); all of it is removed at the end.
set -euo pipefail

source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"
ROOT=$ULO_ROOT
BUILD_DIR="${BUILD_DIR:-$ROOT/build-bench}"
REPETITIONS="${REPETITIONS:-3}"
RESULTS="$BUILD_DIR/bench-results"

ulo_install build bench
ulo_configure "$BUILD_DIR" -DCMAKE_BUILD_TYPE=Release -DULO_DB_BUILD_BENCHMARKS=ON >/dev/null
cmake --build "$BUILD_DIR" --target ulo_db_bench ulo_db_memory_probe -j"$ULO_JOBS"

mkdir -p "$RESULTS"
probe_dirs=()
cleanup() {
    for dir in "${probe_dirs[@]}"; do rm -rf "$dir"; done
}
trap cleanup EXIT

# Timings: every case on tmpfs and on disk, repetitions interleaved at
# random so that slow drifts of the machine hit the library and its
# baselines alike. The program removes its own data folders.
"$BUILD_DIR/bench/ulo_db_bench" \
    --ulo_tmpfs_parent=/dev/shm --ulo_disk_parent="$BUILD_DIR" \
    --benchmark_repetitions="$REPETITIONS" --benchmark_enable_random_interleaving=true \
    --benchmark_out="$RESULTS/bench.json" --benchmark_out_format=json

# Memory: one process per measurement so that one cannot mask another.
probe="$BUILD_DIR/bench/ulo_db_memory_probe"
: >"$RESULTS/memory.jsonl"
for location in tmpfs:/dev/shm disk:"$BUILD_DIR"; do
    name="${location%%:*}"
    dir="$(mktemp -d "${location#*:}/ulo_db_memory.XXXXXX")"
    probe_dirs+=("$dir")
    "$probe" prepare "$dir" 1000000
    for mode in cursor raw sqlitecpp; do
        "$probe" "$mode" "$dir" 1000000 | sed "s/^{/{\"location\": \"$name\", /" >>"$RESULTS/memory.jsonl"
    done
    rm -rf "$dir"
done
"$probe" locks 10000000 >>"$RESULTS/memory.jsonl"

python3 "$ROOT/bench/report.py" --bench "$RESULTS/bench.json" --memory "$RESULTS/memory.jsonl" \
    --build "$BUILD_DIR" --doc "$ROOT/docs/benchmarks.md" --img "$ROOT/docs/img"
echo "report: $ROOT/docs/benchmarks.md"
