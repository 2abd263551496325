#!/usr/bin/env bash
# Rebuilds the shared libraries the app ships besides its own: glog, gflags,
# fmt, double-conversion, simdjson and SQLite, from Debian's source packages
# of exactly the versions whose headers the project compiles against, and
# prints the install prefix (lib/ and include/) on standard output.
#   scripts/build-deps.sh x86_64|arm64|armhf
# Debian's binaries of these libraries cannot go into the app: on amd64 their
# LOAD segments are aligned for 4 KB pages only, and several are linked
# without BIND_NOW. The copies made here keep Debian's SONAMEs and configure
# options, so they are drop-in replacements for the libraries the project was
# linked against, and are compiled and linked like our own libraries (16 KB
# pages, full RELRO, build IDs, section GC). The C library and the C++ runtime
# are not rebuilt: on a phone they come with the platform and the NDK.
#
# Sources are fetched with `apt-get source` through a private APT
# configuration (the machine's own Debian mirrors, as deb-src), so the
# system's APT state is left alone. Sources and builds are cached under
# ${XDG_CACHE_HOME:-~/.cache}/reliqa/, keyed by the ABI, the versions, the
# flags and this script, so a second run only prints the prefix.
# Build logs go to <prefix>.build/<library>.log while building; JOBS sets the
# build parallelism (default: the number of cores).
set -euo pipefail
cd "$(dirname "$0")/.."
ABI=${1:?usage: $0 x86_64|arm64|armhf}
case "$ABI" in
  x86_64 | arm64 | armhf) ;;
  *) echo "build-deps: unknown ABI '$ABI' (x86_64, arm64 or armhf)" >&2; exit 2 ;;
esac
bash scripts/setup.sh
ROOT=$PWD
JOBS=${JOBS:-$(nproc)}

# Source package, the -dev package whose headers we compile against (its
# version is the one rebuilt), and the SONAME the rebuilt library must keep.
DEPS=(
  "gflags            libgflags-dev            libgflags.so.2.2"
  "google-glog       libgoogle-glog-dev       libglog.so.1"
  "fmtlib            libfmt-dev               libfmt.so.9"
  "double-conversion libdouble-conversion-dev libdouble-conversion.so.3"
  "simdjson          libsimdjson-dev          libsimdjson.so.14"
  "sqlite3           libsqlite3-dev           libsqlite3.so.0"
)

CFLAGS_COMMON="-O2 -ffp-contract=off -ffunction-sections -fdata-sections -fstack-protector-strong -D_FORTIFY_SOURCE=2 -fPIC"
LDFLAGS_COMMON="-Wl,-z,max-page-size=16384 -Wl,-z,relro,-z,now -Wl,--build-id -Wl,--gc-sections -Wl,--no-undefined -Wl,--as-needed"

versions=()
for entry in "${DEPS[@]}"; do
  read -r src dev _ <<<"$entry"
  v=$(dpkg-query -W -f='${source:Package} ${source:Version}' "$dev" 2>/dev/null) ||
    { echo "build-deps: $dev is not installed (run scripts/setup.sh)" >&2; exit 1; }
  [ "${v%% *}" = "$src" ] || { echo "build-deps: $dev comes from ${v%% *}, expected $src" >&2; exit 1; }
  versions+=("$src=${v#* }")
done
version_of() {  # version_of <source package>
  local kv
  for kv in "${versions[@]}"; do [ "${kv%%=*}" = "$1" ] && echo "${kv#*=}"; done
}

. scripts/cache-common.sh
SYSROOT=""
if [ "$ABI" != x86_64 ]; then
  SYSROOT=$(bash scripts/sysroot.sh "$ABI")
fi
key=$( { echo "$ABI $SYSROOT"; printf '%s\n' "${versions[@]}"; echo "$CFLAGS_COMMON $LDFLAGS_COMMON";
         cat scripts/build-deps.sh scripts/cache-common.sh; [ "$ABI" = x86_64 ] || cat "cmake/toolchains/$ABI.cmake" cmake/toolchains/cross-common.cmake; } |
       sha256sum | cut -c1-12)
PREFIX=$CACHE/deps-$ABI-$key
if [ -f "$PREFIX/.complete" ]; then
  echo "$PREFIX"
  exit 0
fi

# ---- sources --------------------------------------------------------------
# Fetched once per version into $CACHE/deps-src/<package>_<version>/, with
# Debian's patches applied.
SRCDIR=$CACHE/deps-src
APTDIR=$SRCDIR/apt
fetch_sources() {
  mkdir -p "$APTDIR/parts" "$APTDIR/lists/partial" "$APTDIR/cache/archives/partial" "$SRCDIR/dl"
  rm -f "$APTDIR"/parts/*
  # The machine's configured mirrors, turned into source entries.
  debian_sources | sed -E 's/^[[:space:]]*deb[[:space:]]/deb-src /' >"$APTDIR/parts/machine.list"
  [ -s "$APTDIR/parts/machine.list" ] || { echo "build-deps: no Debian sources configured in /etc/apt" >&2; exit 1; }
  cat >"$APTDIR/apt.conf" <<EOF
Dir::Etc::SourceList "/dev/null";
Dir::Etc::SourceParts "$APTDIR/parts";
Dir::State::Lists "$APTDIR/lists";
Dir::Cache "$APTDIR/cache";
EOF
  local apt=(env APT_CONFIG="$APTDIR/apt.conf" apt-get -q -o APT::Sandbox::User=root)
  echo "build-deps: fetching source package indexes" >&2
  "${apt[@]}" update >&2
  local kv
  for kv in "${versions[@]}"; do
    [ -d "$SRCDIR/${kv%%=*}_${kv#*=}" ] && continue
    (cd "$SRCDIR/dl" && "${apt[@]}" source --download-only "${kv%%=*}=${kv#*=}" >&2)
  done
}
unpack_source() {  # unpack_source <package> <version>: prints the source tree
  local dir=$SRCDIR/$1_$2 dsc=$SRCDIR/dl/$1_${2#*:}.dsc
  if [ ! -d "$dir" ]; then
    rm -rf "$dir.tmp"
    # apt-get has checked every file against the signed index already.
    dpkg-source --no-check -x "$dsc" "$dir.tmp" >&2
    mv "$dir.tmp" "$dir"
  fi
  echo "$dir"
}
missing_source=no
for kv in "${versions[@]}"; do
  [ -d "$SRCDIR/${kv%%=*}_${kv#*=}" ] || [ -f "$SRCDIR/dl/${kv%%=*}_${kv#*=}.dsc" ] || missing_source=yes
done
[ "$missing_source" = no ] || fetch_sources

# ---- build ----------------------------------------------------------------
BUILD=$PREFIX.build
rm -rf "$PREFIX" "$PREFIX.tmp" "$BUILD"
mkdir -p "$PREFIX.tmp" "$BUILD"
# CMake starts CMAKE_<LANG>_FLAGS and the linker flags from these, and adds
# the toolchain file's target flags to them.
export CFLAGS="$CFLAGS_COMMON" CXXFLAGS="$CFLAGS_COMMON" LDFLAGS="$LDFLAGS_COMMON"
CMAKE_COMMON=(
  -G Ninja -Wno-dev
  -DCMAKE_BUILD_TYPE=Release
  # Release without its -O3: the -O2 above applies. NDEBUG as Debian has it
  # (some of these headers change class layouts without it).
  -DCMAKE_C_FLAGS_RELEASE=-DNDEBUG -DCMAKE_CXX_FLAGS_RELEASE=-DNDEBUG
  -DCMAKE_INSTALL_PREFIX="$PREFIX.tmp" -DCMAKE_INSTALL_LIBDIR=lib
  -DBUILD_TESTING=OFF
)
if [ "$ABI" != x86_64 ]; then
  CMAKE_COMMON+=(-DCMAKE_TOOLCHAIN_FILE="$ROOT/cmake/toolchains/$ABI.cmake" -DRELIQA_SYSROOT:PATH="$SYSROOT")
fi

cmake_build() {  # cmake_build <name> <source dir> [cmake arguments]: configure, build, install
  local name=$1 src=$2 log=$BUILD/$1.log
  shift 2
  echo "build-deps: $ABI: building $name" >&2
  if ! { cmake -S "$src" -B "$BUILD/$name" "${CMAKE_COMMON[@]}" "$@" &&
         cmake --build "$BUILD/$name" -j "$JOBS" &&
         cmake --install "$BUILD/$name"; } >"$log" 2>&1; then
    tail -n 40 "$log" >&2
    echo "build-deps: $ABI: building $name failed; the full log is $log" >&2
    exit 1
  fi
}

# The options are those of each package's debian/rules, less tests and docs.
src=$(unpack_source gflags "$(version_of gflags)")
cmake_build gflags "$src" -DBUILD_SHARED_LIBS=ON -DBUILD_STATIC_LIBS=OFF -DLIB_INSTALL_DIR=lib

src=$(unpack_source google-glog "$(version_of google-glog)")
cmake_build glog "$src" -DBUILD_SHARED_LIBS=ON -DWITH_GFLAGS=ON -DWITH_UNWIND=OFF -DWITH_GTEST=OFF \
  -Dgflags_DIR="$PREFIX.tmp/lib/cmake/gflags"

src=$(unpack_source fmtlib "$(version_of fmtlib)")
cmake_build fmt "$src" -DBUILD_SHARED_LIBS=ON -DCMAKE_POSITION_INDEPENDENT_CODE=ON \
  -DFMT_DOC=OFF -DFMT_TEST=OFF -DFMT_PEDANTIC=ON

src=$(unpack_source double-conversion "$(version_of double-conversion)")
cmake_build double-conversion "$src" -DBUILD_SHARED_LIBS=ON

src=$(unpack_source simdjson "$(version_of simdjson)")
cmake_build simdjson "$src" -DBUILD_SHARED_LIBS=ON -DSIMDJSON_DEVELOPER_MODE=OFF

# SQLite: Debian's source is the full tree. Its amalgamation (sqlite3.c) is
# generated once on this machine, from the patched tree, and compiled per
# ABI with the feature options of debian/rules.
src=$(unpack_source sqlite3 "$(version_of sqlite3)")
amalg=$src/.amalgamation
if [ ! -f "$amalg/sqlite3.c" ]; then
  echo "build-deps: generating the SQLite amalgamation" >&2
  rm -rf "$amalg.tmp"
  mkdir -p "$amalg.tmp"
  if ! (cd "$amalg.tmp" && "$src/configure" --enable-threadsafe --enable-load-extension \
          --enable-json --enable-fts4 --enable-fts5 --disable-tcl &&
        make sqlite3.c) >"$BUILD/sqlite3-amalgamation.log" 2>&1; then
    tail -n 40 "$BUILD/sqlite3-amalgamation.log" >&2
    echo "build-deps: generating the SQLite amalgamation failed (is tclsh installed?)" >&2
    exit 1
  fi
  mkdir -p "$amalg"
  cp "$amalg.tmp/sqlite3.c" "$amalg.tmp/sqlite3.h" "$amalg.tmp/sqlite3ext.h" "$amalg/"
  rm -rf "$amalg.tmp"
fi
mkdir -p "$BUILD/sqlite3-src"
cat >"$BUILD/sqlite3-src/CMakeLists.txt" <<EOF
cmake_minimum_required(VERSION 3.16)
project(sqlite3 C)
add_library(sqlite3 SHARED "$amalg/sqlite3.c")
set_target_properties(sqlite3 PROPERTIES VERSION 0.8.6 SOVERSION 0)
target_compile_options(sqlite3 PRIVATE -fno-strict-aliasing)
target_compile_definitions(sqlite3 PRIVATE
  # debian/rules CFLAGS
  SQLITE_SECURE_DELETE SQLITE_ENABLE_COLUMN_METADATA
  SQLITE_ENABLE_FTS3 SQLITE_ENABLE_FTS3_PARENTHESIS
  SQLITE_ENABLE_RTREE=1 SQLITE_SOUNDEX=1
  SQLITE_ENABLE_UNLOCK_NOTIFY
  SQLITE_OMIT_LOOKASIDE=1 SQLITE_ENABLE_DBSTAT_VTAB
  SQLITE_ALLOW_ROWID_IN_VIEW
  SQLITE_ENABLE_UPDATE_DELETE_LIMIT=1
  SQLITE_ENABLE_LOAD_EXTENSION
  SQLITE_ENABLE_JSON1
  SQLITE_LIKE_DOESNT_MATCH_BLOBS
  SQLITE_THREADSAFE=1
  SQLITE_ENABLE_FTS3_TOKENIZER=1
  SQLITE_USE_URI=1
  SQLITE_MAX_SCHEMA_RETRY=25
  SQLITE_ENABLE_PREUPDATE_HOOK
  SQLITE_ENABLE_SESSION
  SQLITE_ENABLE_STMTVTAB
  SQLITE_MAX_VARIABLE_NUMBER=250000
  # what its configure options (--enable-fts4 --enable-fts5 --enable-math
  # default) and checks of the C library add
  SQLITE_ENABLE_FTS4 SQLITE_ENABLE_FTS5 SQLITE_ENABLE_MATH_FUNCTIONS
  _REENTRANT=1 HAVE_USLEEP=1 HAVE_FDATASYNC=1 HAVE_LOCALTIME_R=1 HAVE_GMTIME_R=1
  HAVE_ISNAN=1 HAVE_STRCHRNUL=1 HAVE_POSIX_FALLOCATE=1 HAVE_UTIME=1
  HAVE_DECL_STRERROR_R=1 HAVE_STRERROR_R=1 HAVE_STDINT_H=1 HAVE_INTTYPES_H=1)
target_link_libraries(sqlite3 PRIVATE m \${CMAKE_DL_LIBS} pthread)
install(TARGETS sqlite3 LIBRARY DESTINATION lib)
install(FILES "$amalg/sqlite3.h" "$amalg/sqlite3ext.h" DESTINATION include)
EOF
cmake_build sqlite3 "$BUILD/sqlite3-src"

# Every library must carry Debian's SONAME.
for entry in "${DEPS[@]}"; do
  read -r _ _ soname <<<"$entry"
  lib=$PREFIX.tmp/lib/$soname
  [ -e "$lib" ] || { echo "build-deps: $ABI: $soname was not built" >&2; exit 1; }
  got=$(readelf -d "$lib" | sed -n 's/.*(SONAME).*\[\(.*\)\]/\1/p')
  [ "$got" = "$soname" ] || { echo "build-deps: $ABI: $lib has SONAME '$got', expected $soname" >&2; exit 1; }
done

rm -rf "$BUILD"
publish_cached "$PREFIX"
