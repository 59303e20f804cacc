#!/usr/bin/env bash
# Builds tav-ipmi and runs every test: a plain build, then AddressSanitizer +
# UndefinedBehaviorSanitizer, then ThreadSanitizer.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/install-deps.sh

jobs=$(nproc)
build() {
  local dir=$1
  shift
  cmake -S . -B "$dir" "$@" >/dev/null
  cmake --build "$dir" -j"$jobs"
}

echo "== plain build"
build build
ctest --test-dir build --output-on-failure -j"$jobs"

echo "== benchmarks (short run)"
for b in build/bench/*-bench; do
  [ -x "$b" ] && "$b" --benchmark_min_time=0.01
done

echo "== AddressSanitizer + UndefinedBehaviorSanitizer"
build build-asan -DTAV_IPMI_SANITIZE=address,undefined -DTAV_IPMI_BUILD_BENCH=OFF
ctest --test-dir build-asan --output-on-failure -j"$jobs"

echo "== ThreadSanitizer"
build build-tsan -DTAV_IPMI_SANITIZE=thread -DTAV_IPMI_BUILD_BENCH=OFF
TSAN_OPTIONS="halt_on_error=1" ctest --test-dir build-tsan --output-on-failure -j"$jobs" -E 'PeerTools|Peer'
