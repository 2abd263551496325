#!/usr/bin/env bash
# Packages the native libraries the app ships, per ABI, into dist/:
#   dist/<ABI>/           stripped libreliqaclassifier.so, libkestrova_host.so
#                         and every library they need (transitively) that the
#                         platform does not provide
#   dist/<ABI>/symbols/   the same libraries unstripped (same build IDs), for
#                         symbolising crash reports
#   dist/reliqa.jar       the Java classes (the same for every ABI)
# Usage: scripts/package.sh
# Every ABI whose build directory holds lib/libreliqaclassifier.so is packaged:
# build/ (x86_64), build-arm64/, build-armhf/. The dependencies come from
# scripts/build-deps.sh, which this script runs for each of those ABIs, never
# from the machine: Debian's own binaries are not fit to ship.
# The C library and the C++ runtime (and the dynamic loader) are left out: on
# a phone they come with the platform and the NDK. scripts/check-libs.sh
# checks the result.
set -euo pipefail
cd "$(dirname "$0")/.."

STRIP=$(command -v llvm-strip-14 || command -v llvm-strip || true)
[ -n "$STRIP" ] || { echo "package: llvm-strip not found (run scripts/setup.sh)" >&2; exit 1; }

. scripts/platform-libs.sh
needed_of() {  # needed_of <library>: its DT_NEEDED entries, one a line
  readelf -dW "$1" | sed -n 's/.*(NEEDED).*\[\(.*\)\]/\1/p'
}

abis=()
for pair in x86_64:build arm64:build-arm64 armhf:build-armhf; do
  [ -f "${pair#*:}/lib/libreliqaclassifier.so" ] && abis+=("$pair")
done
[ ${#abis[@]} -gt 0 ] || {
  echo "package: no build directory holds lib/libreliqaclassifier.so; build the tree first" \
       "(cmake --build build, or scripts/build-abi.sh arm64|armhf)" >&2
  exit 1
}
[ -f build/java/reliqa.jar ] || { echo "package: build/java/reliqa.jar is missing; build build/ first" >&2; exit 1; }

rm -rf dist
mkdir -p dist
cp build/java/reliqa.jar dist/reliqa.jar

for pair in "${abis[@]}"; do
  abi=${pair%%:*} build=${pair#*:}
  prefix=$(bash scripts/build-deps.sh "$abi")
  out=dist/$abi
  mkdir -p "$out/symbols"
  # Breadth-first over DT_NEEDED, starting from our two libraries; a name is
  # looked up among our own libraries first, then among the rebuilt ones.
  queue=(libreliqaclassifier.so libkestrova_host.so)
  declare -A parent=([libreliqaclassifier.so]="" [libkestrova_host.so]="")
  i=0
  while [ "$i" -lt ${#queue[@]} ]; do
    name=${queue[$i]}
    i=$((i + 1))
    src=""
    for dir in "$build/lib" "$prefix/lib"; do
      if [ -e "$dir/$name" ]; then src=$dir/$name; break; fi
    done
    if [ -z "$src" ]; then
      echo "package: $abi: $name (needed by ${parent[$name]}) is not a platform library and is" \
           "found neither in $build/lib nor in $prefix/lib" >&2
      exit 1
    fi
    cp -L "$src" "$out/symbols/$name"
    "$STRIP" --strip-all -o "$out/$name" "$out/symbols/$name"
    for dep in $(needed_of "$out/symbols/$name"); do
      is_system_lib "$dep" && continue
      [ -n "${parent[$dep]+set}" ] && continue
      parent[$dep]=$name
      queue+=("$dep")
    done
  done
  unset parent
  echo "package: $out: ${queue[*]}" >&2
done
echo "package: wrote dist/ (check it with scripts/check-libs.sh)" >&2
