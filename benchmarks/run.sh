#!/usr/bin/env bash
# Builds and runs the benchmark program in the default preset; extra arguments go to the program
# (for example --benchmark_filter=5000).
set -euo pipefail
cd "$(dirname "$0")/.."
./scripts/setup.sh
cmake --preset default >/dev/null
cmake --build --preset default --target alarmsearch-bench
exec build/default/bin/alarmsearch-bench --benchmark_repetitions=5 "$@"
