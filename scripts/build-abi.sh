#!/usr/bin/env bash
# Cross-builds the whole tree for a phone ABI into build-<ABI>/, with the same
# layout as build/ (bin/, lib/): the libraries, the JNI library, the host
# libraries, the reliqa tool and the tests.
#   scripts/build-abi.sh arm64|armhf [extra cmake arguments]
# build-<ABI>/emulator runs a program of that ABI under qemu-user, e.g.
#   build-arm64/emulator build-arm64/bin/reliqa --help
# and ctest --test-dir build-<ABI> runs the tests through it.
set -euo pipefail
cd "$(dirname "$0")/.."
ABI=${1:?usage: $0 arm64|armhf [cmake arguments]}
shift
case "$ABI" in
  arm64 | armhf) ;;
  *) echo "build-abi: unknown ABI '$ABI' (arm64 or armhf)" >&2; exit 2 ;;
esac

bash scripts/setup.sh
SYSROOT=$(bash scripts/sysroot.sh "$ABI")
BUILD=build-$ABI
# A build configured against another sysroot keeps that sysroot's compiler
# facts: start it afresh.
if [ -f "$BUILD/CMakeCache.txt" ] && ! grep -qxF "RELIQA_SYSROOT:PATH=$SYSROOT" "$BUILD/CMakeCache.txt"; then
  rm -rf "$BUILD/CMakeCache.txt" "$BUILD/CMakeFiles"
fi
cmake -S . -B "$BUILD" -G Ninja -Wno-dev \
  -DCMAKE_TOOLCHAIN_FILE="$PWD/cmake/toolchains/$ABI.cmake" \
  -DRELIQA_SYSROOT:PATH="$SYSROOT" -DRELIQA_BENCH=OFF -DCMAKE_BUILD_TYPE=RelWithDebInfo "$@" >/dev/null
cmake --build "$BUILD" -j "${JOBS:-$(nproc)}"
echo "build-abi: $BUILD is ready; run its programs with $BUILD/emulator" >&2
