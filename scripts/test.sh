#!/usr/bin/env bash
# Sets up, builds and runs every test three times: a normal build in build/,
# a build with AddressSanitizer and UndefinedBehaviorSanitizer in
# build-asan/, and a 32-bit x86 build in build-i386/ (the appliance's).
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/setup.sh build
(cd build && ctest --output-on-failure --timeout 300 -j "$(nproc)")

scripts/setup.sh build-asan -DVELLIS_SANITIZE=ON -DVELLIS_BUILD_BENCH=OFF
(cd build-asan && ASAN_OPTIONS=detect_leaks=1 UBSAN_OPTIONS=print_stacktrace=1 \
  ctest --output-on-failure --timeout 300 -j "$(nproc)")

scripts/setup.sh build-i386 -DCMAKE_TOOLCHAIN_FILE=cmake/i386.cmake -DVELLIS_BUILD_BENCH=OFF
(cd build-i386 && ctest --output-on-failure --timeout 300 -j "$(nproc)")
