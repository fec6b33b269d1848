#!/usr/bin/env bash
# Builds the library and runs the whole test suite with ctest.
#
#   scripts/test.sh            native build in build/
#   scripts/test.sh sanitize   AddressSanitizer + UndefinedBehaviorSanitizer
#                              (leak checks on) in build-asan/
#   scripts/test.sh armhf      cross-build for 32-bit ARM in build-armhf/,
#                              the tests run under qemu
set -euo pipefail
cd "$(dirname "$0")/.."
source scripts/lib.sh

mode=${1:-native}
case "$mode" in
  native)
    scripts/setup.sh
    vetaj_build build
    dir=build
    ;;
  sanitize)
    scripts/setup.sh
    vetaj_build build-asan -DVETAJ_SANITIZE=ON -DCMAKE_BUILD_TYPE=Debug \
                -DCMAKE_C_FLAGS_DEBUG="-g -O1" -DCMAKE_CXX_FLAGS_DEBUG="-g -O1"
    export ASAN_OPTIONS=detect_leaks=1:strict_string_checks=1:detect_stack_use_after_return=1
    export UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1
    dir=build-asan
    ;;
  armhf)
    scripts/setup.sh armhf
    vetaj_build build-armhf -DCMAKE_TOOLCHAIN_FILE=cmake/toolchain-armhf.cmake
    dir=build-armhf
    ;;
  *)
    echo "usage: $0 [native|sanitize|armhf]" >&2
    exit 2
    ;;
esac

cd "$dir"
ctest -j2 --output-on-failure
