#!/usr/bin/env bash
# Installs what building and testing tav-ipmi needs on Debian, if missing.
set -euo pipefail

need=()
command -v cmake >/dev/null || need+=(cmake)
command -v g++ >/dev/null || need+=(g++)
command -v make >/dev/null || need+=(make)
[ -f /usr/include/gtest/gtest.h ] || need+=(libgtest-dev)
[ -f /usr/include/gmock/gmock.h ] || need+=(libgmock-dev)
[ -f /usr/include/benchmark/benchmark.h ] || need+=(libbenchmark-dev)
[ -f /usr/include/linux/ipmi.h ] || need+=(linux-libc-dev)
command -v pkg-config >/dev/null || need+=(pkg-config)
# The tool: argument parsing, JSON output, the metrics endpoint.
[ -f /usr/include/CLI/CLI.hpp ] || need+=(libcli11-dev)
[ -f /usr/include/nlohmann/json.hpp ] || need+=(nlohmann-json3-dev)
[ -f /usr/include/httplib.h ] || need+=(libcpp-httplib-dev)
# `serve --web.config.file`: TLS, the file's YAML, bcrypt password hashes.
[ -f /usr/include/openssl/ssl.h ] || need+=(libssl-dev)
[ -f /usr/include/yaml-cpp/yaml.h ] || need+=(libyaml-cpp-dev)
[ -f /usr/include/crypt.h ] || need+=(libcrypt-dev)
command -v curl >/dev/null || need+=(curl)
# The API reference and its check that every public declaration is documented.
command -v doxygen >/dev/null || need+=(doxygen)
# libFuzzer targets: clang and its sanitizer/fuzzer runtime, where the
# distribution has them (the test script skips fuzzing without them).
optional=()
command -v clang++ >/dev/null || optional+=(clang)
compgen -G "/usr/lib/llvm-*/lib/clang/*/lib/linux/libclang_rt.fuzzer-x86_64.a" >/dev/null || optional+=(libclang-rt-14-dev)
# Independent IPMI clients: they check the simulator and our decodings.
command -v ipmitool >/dev/null || need+=(ipmitool)
command -v ipmi-sensors >/dev/null || need+=(freeipmi-tools)

sudo=""
[ "$(id -u)" -ne 0 ] && sudo="sudo"
if [ ${#need[@]} -gt 0 ] || [ ${#optional[@]} -gt 0 ]; then
  $sudo apt-get update -qq
fi
if [ ${#need[@]} -gt 0 ]; then
  DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "${need[@]}"
fi
if [ ${#optional[@]} -gt 0 ] && apt-cache show "${optional[@]}" >/dev/null 2>&1; then
  DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "${optional[@]}" ||
    echo "install-deps: ${optional[*]} not installed; fuzz targets cannot be built"
fi
