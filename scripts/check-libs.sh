#!/usr/bin/env bash
# Checks the libraries scripts/package.sh put into dist/<ABI>/ (not
# dist/<ABI>/symbols/) and prints a Markdown table of what the app ships.
# Usage: scripts/check-libs.sh
# Every library must have:
#   - LOAD segments aligned to at least 16 KB (phones with 16 KB pages);
#   - no text relocations, a GNU_RELRO segment and BIND_NOW (full RELRO);
#   - a build ID (crash reports are matched against dist/<ABI>/symbols/);
#   - no RUNPATH or RPATH other than $ORIGIN;
#   - every DT_NEEDED either shipped next to it or provided by the platform
#     (the C library, the C++ runtime and the loader: on a phone these come
#     with the platform and the NDK);
#   - every symbol resolved when loaded with the libraries beside it (ldd -r
#     for x86_64, the sysroot's loader under qemu for arm64 and armhf);
# and libreliqaclassifier.so must export only JNI_OnLoad and JNI_OnLoad_Weak.
# Each violation is reported on standard error; the exit status is 1 if there
# was any. The table goes to standard output.
set -euo pipefail
cd "$(dirname "$0")/.."

. scripts/platform-libs.sh

failures=0
fail() {  # fail <ABI>/<library> <what is wrong>
  echo "check-libs: $1: $2" >&2
  failures=$((failures + 1))
}

abis=()
for dir in dist/*/; do
  abi=$(basename "$dir")
  case "$abi" in x86_64 | arm64 | armhf) abis+=("$abi") ;; esac
done
if [ ${#abis[@]} -eq 0 ]; then
  echo "check-libs: dist/ holds no ABI directory; run scripts/package.sh first" >&2
  exit 1
fi

# Loads <lib> with the libraries of its directory and prints what the loader
# reports, the way ldd -r does.
# $sysroot is the ABI's sysroot (none for x86_64).
load_report() {  # load_report <ABI> <library>
  local abi=$1 lib=$2 dir
  dir=$(dirname "$lib")
  case "$abi" in
    x86_64) LD_LIBRARY_PATH=$dir ldd -r "$lib" 2>&1 || true ;;
    arm64 | armhf)
      local qemu=qemu-aarch64-static loader=$sysroot/lib/ld-linux-aarch64.so.1
      if [ "$abi" = armhf ]; then qemu=qemu-arm-static loader=$sysroot/lib/ld-linux-armhf.so.3; fi
      LD_TRACE_LOADED_OBJECTS=1 LD_WARN=yes LD_BIND_NOW=yes \
        "$qemu" -L "$sysroot" "$loader" --library-path "$dir" "$lib" 2>&1 || true ;;
  esac
}

table="| ABI | Library | Stripped size (bytes) | DT_NEEDED |
|---|---|---:|---|"
totals=""
for abi in "${abis[@]}"; do
  libs=()
  for f in dist/"$abi"/*.so*; do [ -f "$f" ] && libs+=("$f"); done
  if [ ${#libs[@]} -eq 0 ]; then
    fail "$abi" "dist/$abi holds no library"
    continue
  fi
  sysroot=""
  [ "$abi" = x86_64 ] || sysroot=$(bash scripts/sysroot.sh "$abi")
  total=0
  for lib in "${libs[@]}"; do
    name=$(basename "$lib")
    where=$abi/$name
    dynamic=$(readelf -dW "$lib")
    segments=$(readelf -lW "$lib")

    # 16 KB pages: the alignment is the last column of each LOAD line.
    min_align=""
    for align in $(awk '$1 == "LOAD" { print $NF }' <<<"$segments"); do
      if [ -z "$min_align" ] || [ $((align)) -lt "$min_align" ]; then min_align=$((align)); fi
    done
    if [ -z "$min_align" ]; then
      fail "$where" "has no LOAD segment"
    elif [ "$min_align" -lt 16384 ]; then
      fail "$where" "a LOAD segment is aligned to $min_align bytes, less than 16384"
    fi

    if grep -qE '\(TEXTREL\)|\(FLAGS\).*TEXTREL' <<<"$dynamic"; then
      fail "$where" "has text relocations (TEXTREL)"
    fi
    grep -qE '^[[:space:]]*GNU_RELRO' <<<"$segments" || fail "$where" "has no GNU_RELRO segment"
    if ! grep -qE '\(FLAGS\).*BIND_NOW|\(FLAGS_1\).*[[:space:]]NOW' <<<"$dynamic"; then
      fail "$where" "is not linked with BIND_NOW (-z now)"
    fi
    readelf -nW "$lib" | grep -q 'Build ID' || fail "$where" "has no build ID note"

    # Search paths: none, or only the library's own directory.
    while read -r path; do
      IFS=: read -ra entries <<<"$path"
      for entry in "${entries[@]}"; do
        case "$entry" in
          '$ORIGIN' | '${ORIGIN}') ;;
          *) fail "$where" "has a search path outside the package: '$entry'" ;;
        esac
      done
    done < <(sed -n 's/.*(\(RUNPATH\|RPATH\)).*\[\(.*\)\]/\2/p' <<<"$dynamic")

    needed=$(sed -n 's/.*(NEEDED).*\[\(.*\)\]/\1/p' <<<"$dynamic")
    for dep in $needed; do
      if ! is_system_lib "$dep" && [ ! -f "dist/$abi/$dep" ]; then
        fail "$where" "needs $dep, which is neither shipped in dist/$abi nor a platform library"
      fi
    done

    if [ "$name" = libreliqaclassifier.so ]; then
      # Defined global and weak dynamic symbols, without version suffixes.
      exported=$(readelf -W --dyn-syms "$lib" |
        awk '$7 != "UND" && $7 != "Ndx" && ($5 == "GLOBAL" || $5 == "WEAK") && $4 != "SECTION" && $4 != "FILE" && $8 != "" { sub(/@.*/, "", $8); print $8 }' |
        sort -u | tr '\n' ' ')
      if [ "$exported" != "JNI_OnLoad JNI_OnLoad_Weak " ]; then
        fail "$where" "must export exactly JNI_OnLoad and JNI_OnLoad_Weak, but exports: $exported"
      fi
    fi

    report=$(load_report "$abi" "$lib")
    if grep -q 'undefined symbol' <<<"$report"; then
      fail "$where" "has unresolved symbols: $(grep 'undefined symbol' <<<"$report" | head -5 | tr '\n' ';')"
    fi
    # A library of ours must come from the package, not from the machine.
    while read -r dep path; do
      is_system_lib "$dep" && continue
      case "$path" in
        "dist/$abi/"* | "$PWD/dist/$abi/"*) ;;
        *) fail "$where" "loads $dep from $path instead of dist/$abi" ;;
      esac
    done < <(sed -n 's/^[[:space:]]*\([^ ]*\) => \(\/[^ ]*\|dist\/[^ ]*\).*/\1 \2/p' <<<"$report")
    if grep -qE 'not found|error while loading|cannot open' <<<"$report"; then
      fail "$where" "cannot be loaded: $(grep -E 'not found|error while loading|cannot open' <<<"$report" | head -3 | tr '\n' ';')"
    fi

    size=$(stat -c %s "$lib")
    total=$((total + size))
    table+="
| $abi | $name | $size | $(paste -sd, <<<"$needed" | sed 's/,/, /g') |"
  done
  totals+="| $abi | $total |
"
done

echo "$table"
echo
echo "| ABI | Total shipped (bytes) |"
echo "|---|---:|"
printf '%s' "$totals"

if [ "$failures" -gt 0 ]; then
  echo "check-libs: $failures violation(s)" >&2
  exit 1
fi
echo "check-libs: all checks passed" >&2
