#!/usr/bin/env bash
# Sets up, builds and runs every test twice: a normal build in build/, and a
# build with AddressSanitizer and UndefinedBehaviorSanitizer in build-asan/.
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/setup.sh build
(cd build && ctest --output-on-failure --timeout 300 -j "$(nproc)")

scripts/setup.sh build-asan -DVELLIS_SANITIZE=ON -DVELLIS_BUILD_BENCH=OFF
(cd build-asan && ASAN_OPTIONS=detect_leaks=1 UBSAN_OPTIONS=print_stacktrace=1 \
  ctest --output-on-failure --timeout 300 -j "$(nproc)")
