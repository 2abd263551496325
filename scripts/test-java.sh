#!/usr/bin/env bash
# The JVM tests of the JNI libraries: runs the JUnit 5 suite of
# BUILD/java/reliqa-tests.jar in a JVM with -Xcheck:jni and fails on any JNI
# warning the JVM prints. Registered as the test jvm_suite of every build
# that makes the jars (java/CMakeLists.txt), which passes its arguments:
#   scripts/test-java.sh BUILD LIBDIR JUNIT_CONSOLE_JAR
# BUILD is a build directory; its lib/ gives the tests' own native library.
# LIBDIR holds the libreliqaclassifier.so and libkestrova_host.so under test
# (BUILD/stripped: what ships). A cross build's tests run in the Java runtime
# of its sysroot, under the emulator.
set -euo pipefail
cd "$(dirname "$0")/.."
BUILD=${1:?usage: $0 BUILD LIBDIR JUNIT_CONSOLE_JAR}
LIBDIR=${2:?usage: $0 BUILD LIBDIR JUNIT_CONSOLE_JAR}
JUNIT=${3:?usage: $0 BUILD LIBDIR JUNIT_CONSOLE_JAR}
JAR=$BUILD/java/reliqa.jar
TESTS=$BUILD/java/reliqa-tests.jar
SUPPORT=$BUILD/lib/libreliqa_jni_testsupport.so

for f in "$LIBDIR/libreliqaclassifier.so" "$LIBDIR/libkestrova_host.so" "$SUPPORT" "$JAR" "$TESTS" "$JUNIT"; do
  [ -e "$f" ] || { echo "test-java: missing $f (build $BUILD first)" >&2; exit 1; }
done

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
# The tests' own library, alone in a directory, so that every other library
# comes from LIBDIR.
mkdir "$work/support"
cp "$SUPPORT" "$work/support/"
libpath=$(realpath "$LIBDIR"):$work/support

java=(java)
if [ -x "$BUILD/emulator" ]; then
  sysroot=$(sed -n 's/^RELIQA_SYSROOT:PATH=//p' "$BUILD/CMakeCache.txt")
  jvm=$(ls "$sysroot"/usr/lib/jvm/java-17-openjdk-*/bin/java 2>/dev/null | head -n 1)
  [ -n "$jvm" ] || { echo "test-java: no Java runtime in the sysroot $sysroot (scripts/sysroot.sh)" >&2; exit 1; }
  # The emulator runs one program, and this machine does not run programs of
  # the ABI by itself: the tests start child JVMs through the emulator, and
  # the JVM starts them by fork and exec, not through its spawn helper (a
  # program of the ABI).
  # The tests' temporary files go to a tmpfs: the host's ext4 hands the
  # emulated process (a 64-bit process to the host's kernel) 64-bit directory
  # offsets, which a 32-bit Java runtime cannot read (EOVERFLOW); tmpfs's fit.
  [ -d /dev/shm ] && [ -w /dev/shm ] || { echo "test-java: needs a writable tmpfs at /dev/shm" >&2; exit 1; }
  tmp=$(mktemp -d -p /dev/shm reliqa-java.XXXXXX)
  trap 'rm -rf "$work" "$tmp"' EXIT
  java=("$(realpath "$BUILD/emulator")" "$jvm" "-Dreliqa.emulator=$(realpath "$BUILD/emulator")"
        -Djdk.lang.Process.launchMechanism=FORK "-Djava.io.tmpdir=$tmp")
fi

echo "-- JUnit suite (-Xcheck:jni): $LIBDIR"
log=$work/log
status=0
LD_LIBRARY_PATH=$libpath "${java[@]}" -Xcheck:jni -Djava.library.path="$libpath" \
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
