#!/usr/bin/env bash
# Builds the whole tree as an app ships it, for one ABI, into build-<ABI>/:
# clang, LLVM's libc++ linked statically, and the dependencies of
# scripts/build-deps.sh linked in (cmake/toolchains/<ABI>.cmake). The layout
# is that of build/ (bin/, lib/, java/): the JNI libraries, the reliqa tool
# and every test.
#   scripts/build-abi.sh x86_64|arm64|armhf [extra cmake arguments]
# Each is built against a Debian sysroot of the ABI (scripts/sysroot.sh).
# x86_64 runs here; build-<ABI>/emulator runs the programs of arm64 and armhf
# under qemu-user, e.g.
#   build-arm64/emulator build-arm64/bin/reliqa --help
# ctest --test-dir build-<ABI> runs the tests (through the emulator).
set -euo pipefail
cd "$(dirname "$0")/.."
ABI=${1:?usage: $0 x86_64|arm64|armhf [cmake arguments]}
shift
case "$ABI" in
  x86_64 | arm64 | armhf) ;;
  *) echo "build-abi: unknown ABI '$ABI' (x86_64, arm64 or armhf)" >&2; exit 2 ;;
esac

bash scripts/setup.sh
DEPS=$(bash scripts/build-deps.sh "$ABI")
SYSROOT=$(bash scripts/sysroot.sh "$ABI")
BUILD=build-$ABI
# A build configured against another sysroot or other dependencies keeps
# their compiler facts and paths: start it afresh.
if [ -f "$BUILD/CMakeCache.txt" ] &&
   ! { grep -qxF "RELIQA_SYSROOT:PATH=$SYSROOT" "$BUILD/CMakeCache.txt" &&
       grep -qxF "RELIQA_DEPS:PATH=$DEPS" "$BUILD/CMakeCache.txt"; }; then
  rm -rf "$BUILD/CMakeCache.txt" "$BUILD/CMakeFiles"
fi
cmake -S . -B "$BUILD" -G Ninja -Wno-dev \
  -DCMAKE_TOOLCHAIN_FILE="$PWD/cmake/toolchains/$ABI.cmake" \
  -DRELIQA_SYSROOT:PATH="$SYSROOT" -DRELIQA_DEPS:PATH="$DEPS" \
  -DCMAKE_BUILD_TYPE=RelWithDebInfo "$@" >/dev/null
cmake --build "$BUILD" -j "${JOBS:-$(nproc)}"
if [ -x "$BUILD/emulator" ]; then
  echo "build-abi: $BUILD is ready; run its programs with $BUILD/emulator" >&2
else
  echo "build-abi: $BUILD is ready" >&2
fi
