#!/usr/bin/env bash
# The JVM benchmark: classify of the example collection through JNI, beside
# the native classify of the same input in the same process.
#   scripts/bench-java.sh [BUILD [LIBDIR]]
# BUILD (default build-x86_64, the shipped configuration) gives the jars and
# the tests' native helpers; LIBDIR (default dist/x86_64, what ships) the
# libraries measured. Build and package them first (scripts/build-abi.sh
# x86_64, scripts/package.sh); figures under an emulator mean nothing.
set -euo pipefail
cd "$(dirname "$0")/.."
BUILD=${1:-build-x86_64}
LIBDIR=${2:-dist/x86_64}
for f in "$BUILD/java/reliqa.jar" "$BUILD/java/reliqa-tests.jar" "$BUILD/java/reliqa-bench.jar" \
         "$BUILD/lib/libreliqa_jni_testsupport.so" "$LIBDIR/libreliqaclassifier.so"; do
  [ -e "$f" ] || { echo "bench-java: missing $f" >&2; exit 1; }
done
support=$(mktemp -d)
trap 'rm -rf "$support"' EXIT
cp "$BUILD/lib/libreliqa_jni_testsupport.so" "$support/"
libpath=$(realpath "$LIBDIR"):$support
LD_LIBRARY_PATH=$libpath java -Djava.library.path="$libpath" \
  -cp "$BUILD/java/reliqa.jar:$BUILD/java/reliqa-tests.jar:$BUILD/java/reliqa-bench.jar" \
  com.kestrova.sharefold.reliqaclassifier.models.ClassifyReliqaBench examples/model.txt
