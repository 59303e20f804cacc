#!/usr/bin/env bash
# Builds tav-ipmi and runs every test: a plain build, then AddressSanitizer +
# UndefinedBehaviorSanitizer, then ThreadSanitizer, the fuzz targets, and last
# the library on the kernel's IPMI driver in a QEMU guest (skipped where QEMU
# cannot run).
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/install-deps.sh

# libFuzzer's findings belong in build-fuzz/artifacts/, never in the tree.
if git ls-files 2>/dev/null | grep -E '(^|/)(crash|leak|oom|slow-unit|timeout)-[0-9a-f]{40}$'; then
  echo "libFuzzer artifacts are tracked in the tree (above): remove them"
  exit 1
fi

jobs=$(nproc)
build() {
  local dir=$1
  shift
  cmake -S . -B "$dir" "$@" >/dev/null
  cmake --build "$dir" -j"$jobs"
}

# Every option this script relies on is set here, so a build directory left by
# another script (the demo builds no tests) cannot silently drop tests.
echo "== plain build"
build build -DTAV_IPMI_BUILD_TESTS=ON -DTAV_IPMI_BUILD_BENCH=ON -DTAV_IPMI_BUILD_TOOL=ON \
  -DTAV_IPMI_BUILD_VM_TESTS=ON -DTAV_IPMI_SANITIZE=
ctest --test-dir build --output-on-failure -j"$jobs"

echo "== API reference: every public declaration documented"
scripts/docs-check.sh

echo "== install"
scripts/install-test.sh build

echo "== Prometheus scrapes the tool"
scripts/prometheus-test.sh build

echo "== benchmarks"
# Every benchmark once (under two minutes; a benchmark that finds the library
# asking other exchanges than its algorithm needs fails here), then the
# library beside ipmitool and FreeIPMI, briefly: that the comparison runs.
# bench/report.sh measures both in full and rewrites bench/README.md's tables.
build/bench/tav-ipmi-bench --benchmark_min_time=0.01 | tee build/bench/last-run.txt
if grep "ERROR OCCURRED" build/bench/last-run.txt | grep -v "not present"; then
  echo "a benchmark failed"
  exit 1
fi
bench/peers.sh --quick --build build

echo "== AddressSanitizer + UndefinedBehaviorSanitizer"
build build-asan -DTAV_IPMI_SANITIZE=address,undefined -DTAV_IPMI_BUILD_TESTS=ON -DTAV_IPMI_BUILD_BENCH=OFF \
  -DTAV_IPMI_BUILD_TOOL=ON
ctest --test-dir build-asan --output-on-failure -j"$jobs"

echo "== ThreadSanitizer"
build build-tsan -DTAV_IPMI_SANITIZE=thread -DTAV_IPMI_BUILD_TESTS=ON -DTAV_IPMI_BUILD_BENCH=OFF \
  -DTAV_IPMI_BUILD_TOOL=ON
# ThreadSanitizer's own symbolizer can deadlock in a race report while the
# simulator's interposed calls run (the test then times out without a word):
# reports are written unsymbolized and their frames resolved here instead.
symbolize_frames() {
  local line path
  while IFS= read -r line; do
    if [[ $line =~ ^(.*#[0-9]+)\ \<null\>\ \<null\>\ \(([^+]+)\+(0x[0-9a-f]+)\) ]] &&
      path=$(find build-tsan -name "${BASH_REMATCH[2]##*/}" -type f -perm -u+x -print -quit) && [ -n "$path" ]; then
      echo "${BASH_REMATCH[1]} $(addr2line -f -C -i -e "$path" "${BASH_REMATCH[3]}" | paste -d' ' - - | paste -sd';')"
    else
      echo "$line"
    fi
  done
}
TSAN_OPTIONS="halt_on_error=1 symbolize=0" ctest --test-dir build-tsan --output-on-failure -j"$jobs" \
  -E 'PeerTools|Peer' | symbolize_frames

echo "== fuzz targets (bounded run, ASan + UBSan)"
# Twenty seconds per target; skipped where clang and its fuzzer runtime are missing.
if command -v clang++ >/dev/null &&
  compgen -G "/usr/lib/llvm-*/lib/clang/*/lib/linux/libclang_rt.fuzzer-x86_64.a" >/dev/null; then
  scripts/fuzz.sh "${TAV_IPMI_FUZZ_SECONDS:-20}"
else
  echo "clang or libFuzzer not installable here: fuzz targets skipped"
fi

echo "== the kernel's IPMI driver in a QEMU guest"
TAV_IPMI_VM_BUILD=build scripts/vm-test.sh
