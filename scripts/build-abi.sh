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
# ctest --preset <ABI> runs the tests (through the emulator), among them the
# checks of what ships and the JVM suite.
set -euo pipefail
cd "$(dirname "$0")/.."
ABI=${1:?usage: $0 x86_64|arm64|armhf [cmake arguments]}
shift
case "$ABI" in
  x86_64 | arm64 | armhf) ;;
  *) echo "build-abi: unknown ABI '$ABI' (x86_64, arm64 or armhf)" >&2; exit 2 ;;
esac

bash scripts/setup.sh
# The preset of the ABI (CMakePresets.json) reads both from the environment.
export RELIQA_DEPS RELIQA_SYSROOT
RELIQA_DEPS=$(bash scripts/build-deps.sh "$ABI")
RELIQA_SYSROOT=$(bash scripts/sysroot.sh "$ABI")
BUILD=build-$ABI
# A build configured against another sysroot or other dependencies keeps
# their compiler facts and paths: start it afresh.
if [ -f "$BUILD/CMakeCache.txt" ] &&
   ! { grep -qxF "RELIQA_SYSROOT:PATH=$RELIQA_SYSROOT" "$BUILD/CMakeCache.txt" &&
       grep -qxF "RELIQA_DEPS:PATH=$RELIQA_DEPS" "$BUILD/CMakeCache.txt"; }; then
  rm -rf "$BUILD/CMakeCache.txt" "$BUILD/CMakeFiles"
fi
cmake --preset "$ABI" "$@" >/dev/null
cmake --build --preset "$ABI" -j "${JOBS:-$(nproc)}"
if [ -x "$BUILD/emulator" ]; then
  echo "build-abi: $BUILD is ready; run its programs with $BUILD/emulator" >&2
else
  echo "build-abi: $BUILD is ready" >&2
fi
