#!/usr/bin/env bash
# Builds the benchmarks with full optimisation (build-release/, Release) and
# runs them. Arguments go to Google Benchmark, e.g.
#
#   scripts/bench.sh --benchmark_filter=KivAsyncService --benchmark_repetitions=5
#
# With --peers first, builds and runs the side-by-side benchmark against other
# C++ clients instead (bench/peers, after installing their packages the way
# deps.sh installs the others); the other arguments go to
# scripts/peer_bench.py, e.g.
#
#   scripts/bench.sh --peers --rounds 5
#   scripts/bench.sh --peers --quick
set -euo pipefail

cd "$(dirname "${BASH_SOURCE[0]}")/.."

if [[ ${1:-} == --peers ]]; then
  shift
  bash scripts/deps.sh --peers
  cmake -S . -B build-release -G Ninja -DCMAKE_BUILD_TYPE=Release -DKIVI_BUILD_TESTS=OFF \
    -DKIVI_BUILD_TOOLS=OFF -DKIVI_BUILD_PEER_BENCH=ON >/dev/null
  cmake --build build-release --target kivi_peer_bench
  exec python3 scripts/peer_bench.py --bin build-release/bench/peers "$@"
fi

bash scripts/deps.sh
cmake -S . -B build-release -G Ninja -DCMAKE_BUILD_TYPE=Release -DKIVI_BUILD_TESTS=OFF \
  -DKIVI_BUILD_TOOLS=OFF >/dev/null
cmake --build build-release --target kivi_bench
exec build-release/bench/kivi_bench --benchmark_counters_tabular=true "$@"
