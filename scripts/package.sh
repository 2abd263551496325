#!/usr/bin/env bash
# Packages what an app ships into dist/:
#   dist/<ABI>/           the two stripped libraries: libreliqaclassifier.so and
#                         libkestrova_host.so (the host's stand-in), each with
#                         its dependencies and C++ runtime inside
#   dist/<ABI>/symbols/   the same libraries unstripped (same build IDs), for
#                         symbolising crash reports
#   dist/reliqa.jar       the Java classes (the same for every ABI)
#   dist/reliqa.aar       the Android library: AndroidManifest.xml,
#                         classes.jar and jni/<Android ABI>/ with the stripped
#                         libraries of x86_64, arm64-v8a and armeabi-v7a
#   dist/reliqa-*.whl     the Python package of the plain build (build/python/),
#                         when that build has made it
# Usage: scripts/package.sh
# It packages the shipped builds of scripts/build-abi.sh: build-x86_64/,
# build-arm64/ and build-armhf/, all three (the archive holds every ABI); each
# has the stripped libraries in stripped/ and the unstripped ones in lib/.
# Each build's tests check its libraries; scripts/check-libs.sh checks dist/.
set -euo pipefail
cd "$(dirname "$0")/.."

LIBRARIES=(libreliqaclassifier.so libkestrova_host.so)
ABIS=(x86_64 arm64 armhf)
missing=()
for abi in "${ABIS[@]}"; do
  for name in "${LIBRARIES[@]}"; do
    for f in "build-$abi/lib/$name" "build-$abi/stripped/$name"; do
      [ -f "$f" ] || missing+=("$f")
    done
  done
done
if [ ${#missing[@]} -gt 0 ]; then
  echo "package: missing ${missing[*]}; build each ABI with scripts/build-abi.sh x86_64|arm64|armhf" >&2
  exit 1
fi
[ -f build-x86_64/java/reliqa.jar ] || { echo "package: build-x86_64/java/reliqa.jar is missing" >&2; exit 1; }

rm -rf dist
mkdir -p dist
cp build-x86_64/java/reliqa.jar dist/reliqa.jar
for abi in "${ABIS[@]}"; do
  mkdir -p "dist/$abi/symbols"
  for name in "${LIBRARIES[@]}"; do
    cp "build-$abi/lib/$name" "dist/$abi/symbols/$name"
    cp "build-$abi/stripped/$name" "dist/$abi/$name"
  done
done
/usr/bin/python3 scripts/aar.py write dist/reliqa.aar --classes dist/reliqa.jar \
  --jni x86_64=dist/x86_64 --jni arm64-v8a=dist/arm64 --jni armeabi-v7a=dist/armhf
if [ -d build/python/reliqa ]; then
  /usr/bin/python3 scripts/wheel.py build/python dist >/dev/null
fi
echo "package: wrote dist/ (check it with scripts/check-libs.sh)" >&2
