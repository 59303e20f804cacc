#!/usr/bin/env bash
# Builds tav-ipmi and its command-line tool, then shows the simulated BMC.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/install-deps.sh
cmake -S . -B build -DTAV_IPMI_BUILD_TESTS=OFF -DTAV_IPMI_BUILD_BENCH=OFF -DTAV_IPMI_BUILD_TOOL=ON -DTAV_IPMI_SANITIZE= >/dev/null
cmake --build build -j"$(nproc)" --target tavipmi tav-ipmi-sim-preload
./build/tools/tavipmi --simulate "$@"
