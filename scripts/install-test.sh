#!/usr/bin/env bash
# Installs a built tree into a staging directory (DESTDIR) under a prefix of
# its own, then shows that the installed package stands alone: no file names
# the build or source tree; a consumer builds with find_package and another
# with pkg-config; the installed tool runs on the simulator while the build
# tree is out of reach. Usage: scripts/install-test.sh [BUILD_DIR]
set -euo pipefail
cd "$(dirname "$0")/.."
src=$(pwd)
build=$(cd "${1:-build}" && pwd)
prefix=/opt/tav-ipmi
stage=$(mktemp -d)
away="$build.out-of-reach"
trap 'rm -rf "$stage"; [ -d "$away" ] && mv "$away" "$build"' EXIT

fail() { echo "install test: $*" >&2; exit 1; }

DESTDIR="$stage/root" cmake --install "$build" --prefix "$prefix" >/dev/null
root="$stage/root$prefix"
for f in bin/tavipmi include/tav-ipmi/IpmiIfc.h share/man/man1/tavipmi.1 etc/sfcb/tav/sensor_health \
  lib/systemd/system/tavipmi.service share/tav-ipmi/prometheus/tavipmi-rules.yml; do
  [ -e "$root/$f" ] || fail "$f not installed"
done
libdir=$(dirname "$(find "$root" -name 'libtav-ipmi.so' | head -n1)")
[ -n "$libdir" ] || fail "libtav-ipmi.so not installed"
[ -e "$libdir/tav-ipmi/libtav-ipmi-sim-preload.so" ] || fail "the simulator's preload library is not installed"
if grep -rlF -e "$build" -e "$src" "$root"; then fail "installed files above name the build or source tree"; fi

# The unit starts the installed tool and ships hardened: systemd's own
# offline assessment rates its exposure 2.0 or less (a bare unit: 9.6).
unit="$root/lib/systemd/system/tavipmi.service"
grep -qx "ExecStart=$prefix/bin/tavipmi serve" "$unit" || fail "the unit does not start $prefix/bin/tavipmi"
if command -v systemd-analyze >/dev/null; then
  exposure=$(systemd-analyze security --offline=true "$unit" 2>/dev/null |
    sed -n 's/.*Overall exposure level for tavipmi.service: \([0-9.]*\).*/\1/p')
  [ -n "$exposure" ] || fail "systemd-analyze gave no exposure for the unit"
  awk -v e="$exposure" 'BEGIN { exit !(e <= 2.0) }' || fail "the unit's exposure is $exposure, above 2.0"
  echo "install test: the unit's exposure is $exposure"
fi

cat > "$stage/consumer.cpp" <<'CPP'
#include <stdio.h>
#include "IpmiIfc.h"
int main() { printf("%s\n", Ipmi::IpmiIfc::getManufacturerName(674)); }
CPP
cat > "$stage/CMakeLists.txt" <<'CMAKE'
cmake_minimum_required(VERSION 3.16)
project(consumer CXX)
find_package(tav-ipmi REQUIRED)
add_executable(consumer consumer.cpp)
target_link_libraries(consumer PRIVATE tav-ipmi::tav-ipmi)
CMAKE
cmake -S "$stage" -B "$stage/build" -DCMAKE_PREFIX_PATH="$root" >/dev/null
cmake --build "$stage/build" >/dev/null
[ "$(LD_LIBRARY_PATH="$libdir" "$stage/build/consumer")" = "Dell Inc." ] || fail "find_package consumer"
# shellcheck disable=SC2046
g++ -std=c++17 -o "$stage/pc-consumer" "$stage/consumer.cpp" \
  $(PKG_CONFIG_PATH="$libdir/pkgconfig" pkg-config --cflags --libs tav-ipmi)
[ "$(LD_LIBRARY_PATH="$libdir" "$stage/pc-consumer")" = "Dell Inc." ] || fail "pkg-config consumer"

mv "$build" "$away"
out=$("$root/bin/tavipmi" --simulate sensors) || fail "installed tool: $out"
mv "$away" "$build"
grep -q "PS1 Input Power" <<<"$out" || fail "installed tool shows no sensors: $out"
grep -q " OK" <<<"$out" || fail "installed tool found no health rules: $out"
[ "$("$root/bin/tavipmi" --version)" = "tavipmi (tav-ipmi) $(sed -n 's/^project(tav-ipmi VERSION \([^ ]*\).*/\1/p' CMakeLists.txt)" ] \
  || fail "tavipmi --version"
echo "install test: passed (prefix $prefix staged with DESTDIR)"
