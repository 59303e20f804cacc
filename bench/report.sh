#!/usr/bin/env bash
# Regenerates every table of bench/README.md on this machine: builds the
# benchmarks, runs tav-ipmi-bench and bench/peers.sh, and renders both.
#
#   bench/report.sh [--build DIR] [--no-peers]
set -euo pipefail
cd "$(dirname "$0")/.."

build=build
peers=1
while [ $# -gt 0 ]; do
  case $1 in
    --build) build=$2; shift 2 ;;
    --no-peers) peers=0; shift ;;
    *) echo "usage: bench/report.sh [--build DIR] [--no-peers]" >&2; exit 2 ;;
  esac
done

scripts/install-deps.sh
cmake -S . -B "$build" -DTAV_IPMI_BUILD_BENCH=ON -DTAV_IPMI_BUILD_TOOL=ON -DTAV_IPMI_SANITIZE= >/dev/null
cmake --build "$build" -j"$(nproc)"

out=$(mktemp -d)
trap 'rm -rf "$out"' EXIT
# Three runs of everything: the tables show each figure's median, since one
# run on a shared machine can stray by more than the goals' margins.
"$build"/bench/tav-ipmi-bench --benchmark_repetitions=3 --benchmark_report_aggregates_only=true \
  --benchmark_out="$out/bench.json" --benchmark_out_format=json >/dev/null
if [ "$peers" = 1 ]; then
  bench/peers.sh --build "$build" >"$out/peers.md"
  python3 bench/report.py "$out/bench.json" bench/README.md "$out/peers.md"
else
  python3 bench/report.py "$out/bench.json" bench/README.md
fi
echo "bench/README.md: tables regenerated"
