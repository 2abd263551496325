#!/usr/bin/env bash
# The JVM tests of the JNI libraries: runs the JUnit 5 suite of
# <build>/java/reliqa-tests.jar in a JVM with -Xcheck:jni, fails on any JNI
# warning the JVM prints, and checks that libreliqaclassifier.so exports only
# its JNI entry points. Usage: scripts/test-java.sh <build directory>
set -euo pipefail
cd "$(dirname "$0")/.."
BUILD=${1:?usage: $0 <build directory>}
LIB=$BUILD/lib
JAR=$BUILD/java/reliqa.jar
TESTS=$BUILD/java/reliqa-tests.jar
JUNIT=/usr/share/java/junit-platform-console-standalone.jar

for f in "$LIB/libreliqaclassifier.so" "$LIB/libkestrova_host.so" \
         "$LIB/libreliqa_jni_testsupport.so" "$JAR" "$TESTS" "$JUNIT"; do
  [ -e "$f" ] || { echo "test-java: missing $f (build the plain tree first)" >&2; exit 1; }
done

echo "-- exported symbols of libreliqaclassifier.so"
exported=$(nm -D --defined-only "$LIB/libreliqaclassifier.so" | awk '{print $3}' | sort | tr '\n' ' ')
if [ "$exported" != "JNI_OnLoad JNI_OnLoad_Weak " ]; then
  echo "test-java: libreliqaclassifier.so must export exactly JNI_OnLoad and JNI_OnLoad_Weak," \
       "but exports: $exported" >&2
  exit 1
fi
echo "JNI_OnLoad JNI_OnLoad_Weak"

echo "-- JUnit suite (-Xcheck:jni)"
log=$(mktemp)
trap 'rm -f "$log"' EXIT
status=0
java -Xcheck:jni -Djava.library.path="$LIB" \
  -cp "$JUNIT:$JAR:$TESTS" org.junit.platform.console.ConsoleLauncher \
  --disable-banner --disable-ansi-colors --details=tree --fail-if-no-tests \
  --scan-classpath "$TESTS" 2>&1 | tee "$log" || status=$?

# Checked JNI reports misuse as "WARNING in native method: ...", local
# reference growth as "WARNING: JNI local refs: ..." and hard errors as
# "FATAL ERROR in native method: ...".
if grep -aE "WARNING in native method|WARNING: JNI local refs|FATAL ERROR in native method" "$log" >/dev/null; then
  echo "test-java: the JVM reported JNI problems:" >&2
  grep -aE -A3 "WARNING in native method|WARNING: JNI local refs|FATAL ERROR in native method" "$log" >&2
  exit 1
fi
if [ "$status" -ne 0 ]; then
  echo "test-java: JUnit suite failed (exit $status)" >&2
  exit "$status"
fi
passed=$(sed -n 's/.*\[ *\([0-9]*\) tests successful *\].*/\1/p' "$log" | tail -1)
failed=$(sed -n 's/.*\[ *\([0-9]*\) tests failed *\].*/\1/p' "$log" | tail -1)
echo "${passed:-0} passed, ${failed:-0} failed"
