#!/usr/bin/env bash
# Installs what is missing, builds with warnings as errors, and runs the whole test suite twice:
# once as the library ships (then installs it into a temporary prefix and builds programs against
# it) and once under AddressSanitizer and UndefinedBehaviorSanitizer. Then runs each benchmark
# briefly to show it still works (timings from this short run mean nothing), and each fuzz target
# for a few seconds.
set -euo pipefail
cd "$(dirname "$0")/.."

jobs=$(nproc)
./scripts/install-deps.sh

cmake -S . -B build -DCMAKE_BUILD_TYPE=RelWithDebInfo -DFILEINDEX_BUILD_BENCH=ON -DFILEINDEX_WERROR=ON
cmake --build build -j"$jobs"
ctest --test-dir build -j"$jobs" --output-on-failure
./scripts/check-install.sh build

cmake -S . -B build-sanitize -DCMAKE_BUILD_TYPE=Debug -DFILEINDEX_SANITIZE=ON -DFILEINDEX_BUILD_BENCH=OFF \
  -DFILEINDEX_WERROR=ON
cmake --build build-sanitize -j"$jobs"
ctest --test-dir build-sanitize -j"$jobs" --output-on-failure

build/bench/fileindex_bench --benchmark_min_time=0.01 >/dev/null
build/bench/fileindex_platform_bench --benchmark_min_time=0.01 >/dev/null
build/bench/read_paths_bench --benchmark_min_time=0.01 >/dev/null
build/bench/monitor_bench --benchmark_filter=BM_Burst >/dev/null
./scripts/fuzz.sh 5
