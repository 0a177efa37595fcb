#!/usr/bin/env bash
# Builds the kivi tool (build/, RelWithDebInfo, the tree scripts/test.sh
# uses) and runs `kivi demo`, passing any arguments through.
#
#   scripts/demo.sh [demo arguments...]
set -euo pipefail

cd "$(dirname "${BASH_SOURCE[0]}")/.."

bash scripts/deps.sh
cmake -S . -B build -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
cmake --build build --target kivi
exec build/kivi demo "$@"
