#!/usr/bin/env bash
# Installs every package that the build, the tests and the demo need on a
# Debian 12 machine (idempotent), then configures and builds in build/.
#   scripts/setup.sh [BUILD_DIR] [extra cmake arguments...]
# With -DCMAKE_TOOLCHAIN_FILE=cmake/i386.cmake among the arguments, the
# 32-bit x86 packages (Debian multiarch) are installed as well.
set -euo pipefail
cd "$(dirname "$0")/.."

PACKAGES=(build-essential cmake pkg-config libjsoncpp-dev libcli11-dev libgtest-dev
          libgmock-dev libbenchmark-dev libsqlite3-dev libunistring-dev util-linux
          dpkg-dev file)  # the last two: cpack -G DEB (dpkg-shlibdeps)
if [[ " $* " == *"cmake/i386.cmake"* ]]; then
  # The search daemon links the i386 SQLite runtime (cmake/i386.cmake says why).
  PACKAGES+=(g++-multilib libjsoncpp-dev:i386 libunistring-dev:i386 libgtest-dev:i386
             libgmock-dev:i386 libsqlite3-0:i386)
  if ! dpkg --print-foreign-architectures | grep -qx i386; then
    SUDO=""
    [ "$(id -u)" -eq 0 ] || SUDO="sudo"
    $SUDO dpkg --add-architecture i386
  fi
fi

missing=()
for p in "${PACKAGES[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
if [ ${#missing[@]} -gt 0 ]; then
  SUDO=""
  [ "$(id -u)" -eq 0 ] || SUDO="sudo"
  $SUDO apt-get update -qq || true  # a mirror out of sync must not stop an install from the cached lists
  DEBIAN_FRONTEND=noninteractive $SUDO apt-get install -y -qq "${missing[@]}"
fi

BUILD_DIR="${1:-build}"
shift || true
cmake -S . -B "$BUILD_DIR" -DCMAKE_BUILD_TYPE=RelWithDebInfo "$@" > /dev/null
cmake --build "$BUILD_DIR" -j "$(nproc)"
