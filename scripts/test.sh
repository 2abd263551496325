#!/usr/bin/env bash
# Runs every test of the project on a fresh Debian 12 machine, in the build
# configurations of CMakePresets.json; each build's tests are its CTest tests:
#   1. plain (gcc, GNU's C++ runtime, the machine's libraries): the GoogleTest
#      suite with a replay of every fuzz corpus, the CLI tests, the JVM suite
#      and the cross-check of converted models against the trainer;
#   2. the same suite built with AddressSanitizer + UndefinedBehaviorSanitizer,
#   3. and with ThreadSanitizer;
#   4. each libFuzzer target for FUZZ_SECONDS (default 60) on its corpus;
#   5. for x86_64, arm64 and 32-bit ARM, the shipped configuration (LLVM's
#      libc++, every dependency linked in): its whole suite (on ARM under the
#      emulator, the JVM suite in that ABI's Java runtime), the checks of the
#      libraries that ship, and the example classified with the same output
#      bytes as by the plain build;
#   6. dist/ and the Android archive, packaged from those builds and checked,
#      and the Python wheel installed into a fresh virtual environment, where
#      the README's example runs.
# Any failure or sanitizer report makes it exit non-zero.
set -euo pipefail
cd "$(dirname "$0")/.."
FUZZ_SECONDS=${FUZZ_SECONDS:-60}
JOBS=${JOBS:-$(nproc)}

bash scripts/setup.sh

step() { printf '\n==== %s\n' "$*"; }

# build_and_test <preset>: configure, build and run every test it registers.
build_and_test() {
  cmake --preset "$1" >/dev/null
  cmake --build --preset "$1" -j "$JOBS"
  ctest --preset "$1" -j "$JOBS"
}

step "plain build and tests"
build_and_test plain

export ASAN_OPTIONS=abort_on_error=1:detect_leaks=1:strict_string_checks=1
export UBSAN_OPTIONS=halt_on_error=1:print_stacktrace=1
export TSAN_OPTIONS=halt_on_error=1:second_deadlock_stack=1

step "AddressSanitizer + UndefinedBehaviorSanitizer build and tests"
build_and_test asan

step "ThreadSanitizer build and tests"
build_and_test tsan

step "fuzzing, ${FUZZ_SECONDS}s per target"
bash scripts/fuzz.sh --check "$FUZZ_SECONDS"

# The example collection, classified by the reliqa of a build ($1) on a
# fresh store; a cross build's runs through its emulator.
classify_example() {
  local build=$1 store run=()
  store=$(mktemp -d)
  [ -x "$build/emulator" ] && run=("$build/emulator")
  "${run[@]}" "$build/bin/reliqa" --store "$store/store.db" set-model --model examples/model.txt \
    --model-id example-synthetic-v1 --threshold 0.5 >/dev/null
  TZ=UTC "${run[@]}" "$build/bin/reliqa" --store "$store/store.db" classify examples/collection.json
  rm -rf "$store"
}

expected=$(classify_example build)
for abi in x86_64 arm64 armhf; do
  step "$abi: shipped configuration and tests"
  bash scripts/build-abi.sh "$abi"
  ctest --preset "$abi" -j "$JOBS"
  if [ "$(classify_example "build-$abi")" != "$expected" ]; then
    echo "test: build-$abi/bin/reliqa classifies the example differently from build/bin/reliqa" >&2
    exit 1
  fi
  echo "the example classified by build-$abi/bin/reliqa: the same bytes as build/bin/reliqa"
done

step "dist/ and the Android archive"
bash scripts/package.sh
bash scripts/check-libs.sh
aar=$(mktemp -d)
/usr/bin/python3 scripts/aar.py check dist/reliqa.aar --extract "$aar"
bash scripts/check-libs.sh build-x86_64="$aar/jni/x86_64" build-arm64="$aar/jni/arm64-v8a" \
  build-armhf="$aar/jni/armeabi-v7a" >/dev/null
rm -rf "$aar"
echo "dist/reliqa.aar: the layout is right and every library in it passes check-libs"

step "the Python wheel in a fresh virtual environment"
bash scripts/test-wheel.sh dist/reliqa-*.whl

step "all tests passed"
