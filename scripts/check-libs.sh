#!/usr/bin/env bash
# Checks the libraries an app ships and prints a Markdown table of them.
# Usage: scripts/check-libs.sh [BUILD[=DIR] ...]
# BUILD is a build of the shipped configuration (build-x86_64, build-arm64,
# build-armhf; its name after "build-" is the ABI), DIR the directory of the
# stripped libraries to check (default: BUILD/stripped, which the build's test
# shipped_libraries checks). Without arguments: build-<ABI>=dist/<ABI> for
# every dist/<ABI>/ that scripts/package.sh wrote.
# A DIR must hold exactly libreliqaclassifier.so and libkestrova_host.so (a
# symbols/ directory beside them is passed over), and every library must have:
#   - the name lib<name>.so, and its file name as SONAME: Android packages only
#     such files, and older Android versions find a library by file name;
#   - no RUNPATH or RPATH: an app's libraries are found in its own directory;
#   - no DT_NEEDED but the platform's C library (libc, libm, libdl and, with
#     glibc, its loader, which holds part of the C library: bionic's libc has
#     it all) and, for libreliqaclassifier.so, libkestrova_host.so: the
#     dependencies and the C++ runtime are inside;
#   - exported symbols of its own only: libreliqaclassifier.so exports exactly
#     what its version script (reliqaclassifier/jni/exports.map) makes global,
#     libkestrova_host.so its JNI_OnLoad and names in namespace kestrova
#     (nothing of the runtime or the dependencies);
#   - no test code (the failure-injecting store, the failing SQLite VFS) in
#     the symbol table of its unstripped copy (DIR/symbols/, else BUILD/lib/);
#   - LOAD segments aligned to at least 16 KB (phones with 16 KB pages);
#   - no text relocations, a GNU_RELRO segment and BIND_NOW (full RELRO);
#   - a build ID (crash reports are matched against the unstripped copies);
#   - every symbol resolved when loaded with the libraries beside it (ldd -r,
#     or the ABI's loader under BUILD's emulator), and libkestrova_host.so
#     taken from DIR, not from the machine.
# Each violation is reported on standard error; the exit status is 1 if there
# was any. The table goes to standard output.
set -euo pipefail
cd "$(dirname "$0")/.."

SHIPPED=(libkestrova_host.so libreliqaclassifier.so)

is_platform_lib() {  # is_platform_lib <DT_NEEDED entry>
  case "$1" in
    libc.so.6 | libm.so.6 | libdl.so.2 | ld-linux-*.so.*) return 0 ;;
    *) return 1 ;;
  esac
}

failures=0
fail() {  # fail <ABI>/<library> <what is wrong>
  echo "check-libs: $1: $2" >&2
  failures=$((failures + 1))
}

targets=("$@")
if [ ${#targets[@]} -eq 0 ]; then
  for abi in x86_64 arm64 armhf; do
    [ -d "dist/$abi" ] && targets+=("build-$abi=dist/$abi")
  done
fi
if [ ${#targets[@]} -eq 0 ]; then
  echo "check-libs: dist/ holds no ABI directory; run scripts/package.sh first" >&2
  exit 1
fi

# What the classifier library's version script makes global.
expected_exports=$(sed -n '/global:/,/local:/s/^[[:space:]]*\([A-Za-z_][A-Za-z0-9_]*\);.*/\1/p' \
  reliqaclassifier/jni/exports.map | sort -u | tr '\n' ' ')

# Loads <lib> with the libraries of its directory and prints what the loader
# reports, the way ldd -r does: on this machine, or with the loader that
# $build's programs use, under $build's emulator.
load_report() {  # load_report <library>
  local lib=$1 dir loader
  dir=$(dirname "$lib")
  if [ ! -x "$build/emulator" ]; then
    LD_LIBRARY_PATH=$dir ldd -r "$lib" 2>&1 || true
    return
  fi
  loader=$(readelf -lW "$build/bin/reliqa" | sed -n 's/.*Requesting program interpreter: \(.*\)\]/\1/p')
  LD_TRACE_LOADED_OBJECTS=1 LD_WARN=yes LD_BIND_NOW=yes \
    "$build/emulator" "$loader" --library-path "$dir" "$lib" 2>&1 || true
}

# Defined global and weak dynamic symbols, demangled, without versions.
exported_symbols() {  # exported_symbols <library>
  readelf -W --dyn-syms "$1" |
    awk '$7 != "UND" && $7 != "Ndx" && ($5 == "GLOBAL" || $5 == "WEAK") && $4 != "SECTION" && $4 != "FILE" && $8 != "" { sub(/@.*/, "", $8); print $8 }' |
    c++filt | sort -u
}

table="| ABI | Library | Stripped size (bytes) | DT_NEEDED |
|---|---|---:|---|"
totals=""
for target in "${targets[@]}"; do
  build=${target%%=*}
  dir=$build/stripped
  [ "$target" = "$build" ] || dir=${target#*=}
  abi=$(basename "$build")
  abi=${abi#build-}
  [ -d "$dir" ] || { echo "check-libs: $dir is not a directory" >&2; exit 2; }
  [ -f "$build/bin/reliqa" ] || { echo "check-libs: $build is not a build of the shipped configuration" >&2; exit 2; }

  # Exactly the two libraries, each a lib<name>.so.
  libs=()
  for f in "$dir"/*; do
    [ -d "$f" ] && [ "$(basename "$f")" = symbols ] && continue
    name=$(basename "$f")
    [[ "$name" =~ ^lib[A-Za-z0-9_]+\.so$ ]] || fail "$abi/$name" "is not named lib<name>.so"
    case " ${SHIPPED[*]} " in
      *" $name "*) libs+=("$f") ;;
      *) fail "$abi/$name" "is shipped, but only ${SHIPPED[*]} are" ;;
    esac
  done
  for name in "${SHIPPED[@]}"; do
    [ -f "$dir/$name" ] || fail "$abi/$name" "is missing from $dir"
  done

  total=0
  for lib in "${libs[@]}"; do
    name=$(basename "$lib")
    where=$abi/$name
    dynamic=$(readelf -dW "$lib")
    segments=$(readelf -lW "$lib")

    soname=$(sed -n 's/.*(SONAME).*\[\(.*\)\]/\1/p' <<<"$dynamic")
    [ "$soname" = "$name" ] || fail "$where" "has SONAME '${soname}', not its file name"
    while read -r kind path; do
      fail "$where" "has a $kind ('$path'): the app's libraries are found without one"
    done < <(sed -n 's/.*(\(RUNPATH\|RPATH\)).*\[\(.*\)\]/\1 \2/p' <<<"$dynamic")

    needed=$(sed -n 's/.*(NEEDED).*\[\(.*\)\]/\1/p' <<<"$dynamic")
    for dep in $needed; do
      is_platform_lib "$dep" && continue
      [ "$name" = libreliqaclassifier.so ] && [ "$dep" = libkestrova_host.so ] && continue
      fail "$where" "needs $dep, which is neither the platform's C library nor libkestrova_host.so"
    done

    exported=$(exported_symbols "$lib")
    if [ "$name" = libreliqaclassifier.so ]; then
      if [ "$(tr '\n' ' ' <<<"$exported")" != "$expected_exports" ]; then
        fail "$where" "must export exactly ${expected_exports}but exports: $(tr '\n' ' ' <<<"$exported")"
      fi
    else
      foreign=$(grep -vE '^(JNI_OnLoad|((typeinfo( name)?|vtable) for )?kestrova::.*)$' <<<"$exported" || true)
      [ -z "$foreign" ] || fail "$where" "exports what is not its own: $(head -5 <<<"$foreign" | tr '\n' ';')"
    fi

    unstripped=$dir/symbols/$name
    [ -f "$unstripped" ] || unstripped=$build/lib/$name
    test_code=$(nm -C "$unstripped" 2>/dev/null | grep -oE 'FaultInjectingKeyValueStore|FaultySqliteVfs' | sort -u || true)
    [ -z "$test_code" ] || fail "$where" "contains test code: $(tr '\n' ' ' <<<"$test_code")"

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

    report=$(load_report "$lib")
    if grep -q 'undefined symbol' <<<"$report"; then
      fail "$where" "has unresolved symbols: $(grep 'undefined symbol' <<<"$report" | head -5 | tr '\n' ';')"
    fi
    # libkestrova_host.so must come from the directory, not from the machine.
    while read -r dep path; do
      is_platform_lib "$dep" && continue
      [ "$(realpath "$path" 2>/dev/null)" = "$(realpath "$dir/$dep")" ] ||
        fail "$where" "loads $dep from $path instead of $dir"
    done < <(sed -n 's/^[[:space:]]*\([^ ]*\) => \([^ ]*\) .*/\1 \2/p' <<<"$report")
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
