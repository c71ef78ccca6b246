#!/usr/bin/env bash
# Installs what is missing, builds, and runs every test. Run from anywhere.
#   The suite runs twice: a release build, then under ASan/UBSan (VORA_SANITIZE=0 skips that).
set -euo pipefail
root="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
cd "$root"

bash scripts/install-deps.sh

jobs="$(nproc)"
cmake -S . -B build -DCMAKE_BUILD_TYPE=Release >/dev/null
cmake --build build -j "$jobs"
ctest --test-dir build --output-on-failure -j "$jobs"

if [ "${VORA_SANITIZE:-1}" = "1" ]; then
    cmake -S . -B build-asan -DCMAKE_BUILD_TYPE=Debug -DVORA_SANITIZE=ON -DVORA_BUILD_BENCHMARKS=OFF >/dev/null
    cmake --build build-asan -j "$jobs"
    ctest --test-dir build-asan --output-on-failure -j "$jobs"
fi
