#!/usr/bin/env bash
# Builds the libFuzzer targets with clang (ASan + UBSan) and runs each for a
# bounded time. A crash fails the script and leaves the input in
# build-fuzz/artifacts/. Usage: scripts/fuzz.sh [SECONDS_PER_TARGET] [TARGET...]
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/install-deps.sh

seconds=${1:-20}
shift || true
dir=build-fuzz
CC=clang CXX=clang++ cmake -S . -B "$dir" -DTAV_IPMI_BUILD_FUZZ=ON -DTAV_IPMI_BUILD_TESTS=OFF \
  -DTAV_IPMI_BUILD_BENCH=OFF -DTAV_IPMI_BUILD_TOOL=OFF -DTAV_IPMI_SANITIZE= >/dev/null
targets=("$@")
if [ ${#targets[@]} -eq 0 ]; then
  for src in fuzz/*Fuzz.cpp; do targets+=("$(basename "$src" .cpp)"); done
fi
cmake --build "$dir" -j"$(nproc)" --target "${targets[@]}"

mkdir -p "$dir/artifacts"
for t in "${targets[@]}"; do
  corpus="$dir/corpus/$t"
  mkdir -p "$corpus"
  seeds=()
  [ -d "fuzz/seeds/$t" ] && seeds+=("fuzz/seeds/$t")
  # Real data seeds the targets it fits, read in place (libFuzzer writes only
  # to the first corpus directory); a long seed is cut at -max_len.
  real=../shared/data/real
  options=()
  case $t in
    SensorRecordFuzz | EntityTreeFuzz | SdrReaderFuzz)
      [ -d "$real/sdr" ] && seeds+=("$real/sdr")
      options+=(-max_len=4096) ;;
    HealthRulesFuzz) seeds+=(data) options+=(-max_len=2048) ;;
    SdrCacheFuzz) options+=(-max_len=8192) ;;
  esac
  echo "== $t: ${seconds}s"
  # The fuzzer's own threads keep real time: the simulator's virtual clock is
  # on only while a target runs one input, and rss_limit_mb=0 stops the memory watch.
  "$dir/fuzz/$t" -max_total_time="$seconds" -rss_limit_mb=0 -print_final_stats=1 "${options[@]}" \
    -artifact_prefix="$dir/artifacts/$t-" "$corpus" "${seeds[@]}" 2>&1 | tail -n 12
done
