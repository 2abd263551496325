#!/usr/bin/env bash
# Runs every test of the project on a fresh Debian 12 machine:
#   1. the GoogleTest suite (plain build: gcc, GNU's C++ runtime and the
#      machine's libraries; ctest),
#   2. the same suite built with AddressSanitizer + UndefinedBehaviorSanitizer,
#   3. the same suite built with ThreadSanitizer,
#   4. each libFuzzer target for FUZZ_SECONDS (default 60) on its seed corpus,
#   5. the JVM suite on the plain build, and the trainer cross-check,
#   6. for x86_64, arm64 and 32-bit ARM: the shipped configuration (LLVM's
#      libc++ and every dependency linked in), its GoogleTest suite and CLI
#      tests (arm64 and ARM under the emulator), and the example classified
#      with the same output bytes as by the plain build,
#   7. the shipped libraries of every ABI and the Android archive, packaged
#      and checked,
#   8. the JVM suite on every ABI against the packaged libraries (arm64 and
#      ARM in their own Java runtime, under the emulator).
# Any failure or sanitizer report makes it exit non-zero.
set -euo pipefail
cd "$(dirname "$0")/.."
ROOT=$PWD
FUZZ_SECONDS=${FUZZ_SECONDS:-60}
JOBS=${JOBS:-$(nproc)}

bash scripts/setup.sh

step() { printf '\n==== %s\n' "$*"; }

# Runs every test that the build in $1 registers (extra ctest arguments
# follow). A build that registers no test, or a run that leaves any
# registered test out, fails the step.
run_ctest() {
  local dir=$1 registered ran log
  shift
  registered=$(ctest --test-dir "$dir" -N | sed -n 's/^Total Tests: \([0-9]*\)$/\1/p')
  log=$(mktemp)
  ctest --test-dir "$dir" --output-on-failure --no-tests=error -j "$JOBS" "$@" | tee "$log"
  ran=$(sed -n 's/.* tests failed out of \([0-9]*\)$/\1/p' "$log" | tail -n 1)
  rm -f "$log"
  if [ -z "$registered" ] || [ -z "$ran" ] || [ "$ran" -lt "$registered" ]; then
    echo "test.sh: $dir registers ${registered:-no} tests but ${ran:-none} ran" >&2
    exit 1
  fi
  echo "-- $dir: all $registered registered tests ran"
}

configure() {  # configure <dir> <cmake args...>; warnings are errors in every build
  local dir=$1; shift
  cmake -S "$ROOT" -B "$dir" -G Ninja -Wno-dev -DRELIQA_WERROR=ON "$@" >/dev/null
}

step "plain build and tests"
configure build
cmake --build build -j "$JOBS"
run_ctest build

export ASAN_OPTIONS=abort_on_error=1:detect_leaks=1:strict_string_checks=1
export UBSAN_OPTIONS=halt_on_error=1:print_stacktrace=1
export TSAN_OPTIONS=halt_on_error=1:second_deadlock_stack=1

step "AddressSanitizer + UndefinedBehaviorSanitizer build and tests"
configure build-asan -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ \
  -DRELIQA_SANITIZER=asan -DRELIQA_BENCH=OFF -DCMAKE_BUILD_TYPE=RelWithDebInfo
cmake --build build-asan -j "$JOBS"
run_ctest build-asan

step "ThreadSanitizer build and tests"
configure build-tsan -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ \
  -DRELIQA_SANITIZER=tsan -DRELIQA_BENCH=OFF -DCMAKE_BUILD_TYPE=RelWithDebInfo
cmake --build build-tsan -j "$JOBS"
run_ctest build-tsan

step "fuzzing, ${FUZZ_SECONDS}s per target"
configure build-fuzz -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ \
  -DRELIQA_FUZZ=ON -DRELIQA_BENCH=OFF -DCMAKE_BUILD_TYPE=RelWithDebInfo
cmake --build build-fuzz -j "$JOBS" --target fuzz_targets
for target in build-fuzz/bin/fuzz_*; do
  name=$(basename "$target")
  seeds="fuzz/corpus/${name#fuzz_}"
  work=$(mktemp -d)
  [ -d "$seeds" ] && cp -r "$seeds"/. "$work"/
  echo "-- $name"
  "$target" -max_total_time="$FUZZ_SECONDS" -timeout=10 -rss_limit_mb=2048 \
    -artifact_prefix="$work/" -print_final_stats=1 "$work" 2>&1 | tail -n 12
  rm -rf "$work"
done

step "JVM tests (plain build)"
bash scripts/test-java.sh build
step "cross-check against the trainer"
bash scripts/test-crosscheck.sh build

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
  bash scripts/build-abi.sh "$abi" -DRELIQA_WERROR=ON
  run_ctest "build-$abi"
  if [ "$(classify_example "build-$abi")" != "$expected" ]; then
    echo "test: build-$abi/bin/reliqa classifies the example differently from build/bin/reliqa" >&2
    exit 1
  fi
  echo "the example classified by build-$abi/bin/reliqa: the same bytes as build/bin/reliqa"
done

step "shipped libraries and the Android archive"
bash scripts/package.sh
bash scripts/check-libs.sh
bash scripts/test-check-libs.sh
aar=$(mktemp -d)
/usr/bin/python3 scripts/aar.py check dist/reliqa.aar --extract "$aar"
bash scripts/check-libs.sh x86_64="$aar/jni/x86_64" arm64="$aar/jni/arm64-v8a" armhf="$aar/jni/armeabi-v7a" >/dev/null
rm -rf "$aar"
echo "dist/reliqa.aar: the layout is right and every library in it passes check-libs"

for abi in x86_64 arm64 armhf; do
  step "JVM tests ($abi, the packaged libraries)"
  bash scripts/test-java.sh "build-$abi" "dist/$abi"
done

step "all tests passed"
