#!/usr/bin/env bash
# Builds the library and runs its demo: every operation on a real database
# file, with the generated SQL, the results and the log lines.
#   scripts/demo.sh [DIRECTORY]   (default /tmp/ulo_db_demo)
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
"$root/scripts/install-deps.sh" build
cmake -S "$root" -B "$root/build" -DULO_DB_BUILD_BENCHMARKS=OFF >/dev/null
cmake --build "$root/build" --target ulo_db_demo -j"$(nproc)" >/dev/null
exec "$root/build/examples/ulo_db_demo" "$@"
