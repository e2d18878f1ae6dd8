#!/usr/bin/env bash
# Builds the libFuzzer targets (fuzz/) with clang, AddressSanitizer and UndefinedBehaviorSanitizer
# in build-fuzz, then runs each for SECONDS seconds (default 5) from its seed corpus
# fuzz/corpus/<target>. Inputs the fuzzer finds go to a scratch directory, not to the repository;
# an input that breaks a target is kept as build-fuzz/crash-* (or leak-*, timeout-*) and fails
# the script.
#
#   ./scripts/fuzz.sh          # the short run of the test script
#   ./scripts/fuzz.sh 1800     # half an hour per target
set -euo pipefail
cd "$(dirname "$0")/.."

seconds=${1:-5}
jobs=$(nproc)

cmake -S . -B build-fuzz -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ \
  -DCMAKE_BUILD_TYPE=Debug -DCMAKE_CXX_FLAGS_DEBUG="-g -O1" \
  -DFILEINDEX_BUILD_FUZZ=ON -DFILEINDEX_BUILD_TESTS=OFF -DFILEINDEX_BUILD_BENCH=OFF >/dev/null
cmake --build build-fuzz -j"$jobs" --target fileindex_fuzz

# The targets' sandboxes go into the scratch directory too, in memory where the machine allows,
# so that a target that stops on a failure leaves nothing behind.
scratch=$(mktemp -d -p "$( [ -w /dev/shm ] && echo /dev/shm || echo "${TMPDIR:-/tmp}")")
trap 'rm -rf "$scratch"' EXIT
export TMPDIR="$scratch"
for target in folders status queue request; do
  mkdir -p "$scratch/$target"
  log="$scratch/$target.log"
  if ! build-fuzz/fuzz/fileindex_fuzz_"$target" -max_total_time="$seconds" -timeout=10 \
      -rss_limit_mb=2048 -max_len=4096 -print_final_stats=1 -artifact_prefix=build-fuzz/ \
      "$scratch/$target" "fuzz/corpus/$target" >"$log" 2>&1; then
    cat "$log"
    echo "fuzz: $target failed; its input is in build-fuzz/" >&2
    exit 1
  fi
  runs=$(sed -n 's/^stat::number_of_executed_units: *//p' "$log")
  echo "fuzz: $target: $runs inputs in ${seconds}s, no failure"
done
