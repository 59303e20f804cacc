#!/usr/bin/env bash
# The long SEL soak: 100,000 events (or the first argument) against the
# simulated controller, with lost and repeated records per handler.
# Needs the plain build of scripts/test.sh (build/).
set -euo pipefail
cd "$(dirname "$0")/.."
build=${TAV_IPMI_BUILD:-build}
[ -x "$build/tests/tav-ipmi-tests" ] || { echo "sel-soak: build the tests first (scripts/test.sh)"; exit 2; }
TAV_IPMI_SOAK_EVENTS=${1:-100000} "$build/tests/tav-ipmi-tests" --gtest_filter='SelSoak.*'
