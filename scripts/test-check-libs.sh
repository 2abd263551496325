#!/usr/bin/env bash
# Plants one fault at a time in a copy of a build's stripped libraries and
# requires scripts/check-libs.sh to fail on it with the message of the rule it
# breaks: a checker that passes everything would pass what ships too.
#   scripts/test-check-libs.sh BUILD   (the x86_64 shipped build; its test
#                                       shipped_libraries_faults runs this)
# The faulty libraries are small stand-ins for libkestrova_host.so, linked
# like the real ones except for the one fault.
set -euo pipefail
cd "$(dirname "$0")/.."
BUILD=${1:?usage: $0 BUILD}
base=$BUILD/stripped
[ -f "$base/libreliqaclassifier.so" ] || { echo "test-check-libs: $base holds no libraries; build $BUILD first" >&2; exit 1; }

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
cat >"$work/host.c" <<'EOF'
__attribute__((visibility("default"))) int JNI_OnLoad(void* vm, void* reserved) { return 0x10006; }
#ifdef EXTRA
EXTRA
#endif
EOF
# stand_in <output> [clang arguments]: a libkestrova_host.so with the given extras.
stand_in() {
  local out=$1
  shift
  clang -shared -fPIC -fvisibility=hidden -o "$out" "$work/host.c" -fuse-ld=lld \
    -Wl,-z,max-page-size=16384 -Wl,-z,relro,-z,now -Wl,--build-id -Wl,-soname,libkestrova_host.so "$@"
}

failures=0
# expect <what the fault is> <message check-libs must print> <setup command...>
expect() {
  local fault=$1 message=$2 dir=$work/case
  shift 2
  rm -rf "$dir" && mkdir -p "$dir/symbols" && cp -r "$base"/. "$dir/"
  "$@"
  local output status=0
  output=$(bash scripts/check-libs.sh "$BUILD=$dir" 2>&1 >/dev/null) || status=$?
  if [ "$status" -ne 0 ] && grep -qF -- "$message" <<<"$output"; then
    echo "ok: $fault"
  else
    echo "test-check-libs: $fault: expected a failure with \"$message\", got (exit $status):" >&2
    echo "$output" >&2
    failures=$((failures + 1))
  fi
}

dir=$work/case
expect "a versioned file name" "libfoo.so.1: is not named lib<name>.so" \
  cp "$base/libkestrova_host.so" "$dir/libfoo.so.1"
expect "a third library" "libsqlite3.so: is shipped, but only" \
  cp "$base/libkestrova_host.so" "$dir/libsqlite3.so"
expect "a SONAME other than the file name" "has SONAME 'libkestrova_host.so.1', not its file name" \
  stand_in "$dir/libkestrova_host.so" -Wl,-soname,libkestrova_host.so.1
expect "a run path" "has a RUNPATH ('\$ORIGIN')" \
  stand_in "$dir/libkestrova_host.so" '-Wl,-rpath,$ORIGIN' -Wl,--enable-new-dtags
expect "GNU's C++ runtime beneath" "needs libstdc++.so.6" \
  stand_in "$dir/libkestrova_host.so" -Wl,--no-as-needed -lstdc++
expect "a dependency's symbol exported" "exports what is not its own: sqlite3_open" \
  stand_in "$dir/libkestrova_host.so" \
    '-DEXTRA=__attribute__((visibility("default"))) int sqlite3_open(void) { return 0; }'
expect "test code inside" "contains test code: FaultySqliteVfs" \
  stand_in "$dir/symbols/libkestrova_host.so" '-DEXTRA=int FaultySqliteVfs(void) { return 0; }'

if [ "$failures" -gt 0 ]; then
  echo "test-check-libs: $failures planted fault(s) passed the check" >&2
  exit 1
fi
echo "test-check-libs: every planted fault failed the check"
