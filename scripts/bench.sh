#!/usr/bin/env bash
# Builds the benchmarks with full optimisation (build-release/, Release) and
# runs them. Arguments go to Google Benchmark, e.g.
#
#   scripts/bench.sh --benchmark_filter=KivAsyncService --benchmark_repetitions=5
set -euo pipefail

cd "$(dirname "${BASH_SOURCE[0]}")/.."

bash scripts/deps.sh
cmake -S . -B build-release -G Ninja -DCMAKE_BUILD_TYPE=Release -DKIVI_BUILD_TESTS=OFF \
  -DKIVI_BUILD_TOOLS=OFF >/dev/null
cmake --build build-release --target kivi_bench
exec build-release/bench/kivi_bench --benchmark_counters_tabular=true "$@"
