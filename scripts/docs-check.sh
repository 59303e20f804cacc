#!/usr/bin/env bash
# Builds the API reference from the public headers into a scratch directory
# and fails when doxygen finds a public class, call, constant or enumeration
# without a documentation comment (or a comment it cannot read). Runs alone:
#   scripts/docs-check.sh
set -euo pipefail
cd "$(dirname "$0")/.."
command -v doxygen >/dev/null || { echo "docs-check: doxygen is missing (scripts/install-deps.sh)"; exit 1; }
out=$(mktemp -d)
trap 'rm -rf "$out"' EXIT
if ! { cat docs/Doxyfile; echo "OUTPUT_DIRECTORY = $out"
  echo "WARN_AS_ERROR = FAIL_ON_WARNINGS"; echo "WARN_LOGFILE = $out/warnings"; } | doxygen - >/dev/null; then
  cat "$out/warnings"
  echo "docs-check: $(sort -u "$out/warnings" | grep -c 'is not documented') undocumented, $(sort -u "$out/warnings" | grep -vc 'is not documented') other problems"
  exit 1
fi
echo "docs-check: every public declaration is documented"
