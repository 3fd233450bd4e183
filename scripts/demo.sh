#!/usr/bin/env bash
# Builds the library and runs its demo: every operation on a real database
# file, with the generated SQL, the results and the log lines.
#   scripts/demo.sh [DIRECTORY]   (default /tmp/ulo_db_demo)
set -euo pipefail
source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"
ulo_install build
ulo_configure "$ULO_ROOT/build" >/dev/null
cmake --build "$ULO_ROOT/build" --target ulo_db_demo -j"$ULO_JOBS" >/dev/null
exec "$ULO_ROOT/build/examples/ulo_db_demo" "$@"
