#!/usr/bin/env bash
# Builds the libraries that the shipped libraries link in: glog, gflags, fmt,
# double-conversion, simdjson and SQLite, and GoogleTest for the tests that
# run on each ABI, from Debian's source packages of exactly the versions whose
# headers the project compiles against, and prints the install prefix (lib/
# and include/, with each package's CMake files) on standard output.
#   scripts/build-deps.sh x86_64|arm64|armhf
# They are static archives of position-independent code, compiled like the
# shipped libraries themselves by the ABI's toolchain file
# (cmake/toolchains/<ABI>.cmake): clang, LLVM's libc++, hidden visibility and
# one section per function, so that a library linking them in exports none of
# their symbols and drops what it does not use. Debian's own builds cannot be
# used: they are shared libraries on GNU's C++ runtime.
#
# Sources are fetched with `apt-get source` through a private APT
# configuration (the machine's own Debian mirrors, as deb-src), so the
# system's APT state is left alone. Sources and builds are cached under
# ${XDG_CACHE_HOME:-~/.cache}/reliqa/, keyed by the ABI, the versions, the
# flags, the toolchain files and this script (less their comments), so a
# second run only prints the prefix. Build logs go to <prefix>.build/<library>.log while building; JOBS
# sets the build parallelism (default: the number of cores).
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
# version is the one rebuilt), and the archives the build must leave in lib/.
DEPS=(
  "gflags            libgflags-dev            libgflags.a"
  "google-glog       libgoogle-glog-dev       libglog.a"
  "fmtlib            libfmt-dev               libfmt.a"
  "double-conversion libdouble-conversion-dev libdouble-conversion.a"
  "simdjson          libsimdjson-dev          libsimdjson.a"
  "sqlite3           libsqlite3-dev           libsqlite3.a"
  "googletest        libgtest-dev             libgtest.a libgtest_main.a libgmock.a"
)

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
SYSROOT=$(bash scripts/sysroot.sh "$ABI")
TOOLCHAIN=$ROOT/cmake/toolchains/$ABI.cmake
key=$( { echo "$ABI $SYSROOT"; printf '%s\n' "${versions[@]}";
         key_text scripts/build-deps.sh scripts/cache-common.sh "$TOOLCHAIN" cmake/toolchains/shipped.cmake \
                  cmake/toolchains/cross-common.cmake cmake/BuildFlags.cmake; } |
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
# The toolchain file gives every compile the project's flags (runtime,
# visibility, sections, no contraction, hardening).
CMAKE_COMMON=(
  -G Ninja -Wno-dev
  -DCMAKE_TOOLCHAIN_FILE="$TOOLCHAIN"
  -DCMAKE_BUILD_TYPE=Release
  # Release with -O2 instead of its -O3, as the project's optimised builds.
  # NDEBUG as Debian has it (some of these headers change class layouts
  # without it).
  "-DCMAKE_C_FLAGS_RELEASE=-O2 -DNDEBUG" "-DCMAKE_CXX_FLAGS_RELEASE=-O2 -DNDEBUG"
  -DCMAKE_INSTALL_PREFIX="$PREFIX.tmp" -DCMAKE_INSTALL_LIBDIR=lib
  -DRELIQA_DEPS="$PREFIX.tmp" -DRELIQA_SYSROOT:PATH="$SYSROOT"
  -DBUILD_SHARED_LIBS=OFF -DCMAKE_POSITION_INDEPENDENT_CODE=ON
  -DBUILD_TESTING=OFF
)

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

# The options are those of each package's debian/rules, less tests and docs,
# and static.
src=$(unpack_source gflags "$(version_of gflags)")
cmake_build gflags "$src" -DBUILD_STATIC_LIBS=ON -DLIB_INSTALL_DIR=lib

src=$(unpack_source google-glog "$(version_of google-glog)")
cmake_build glog "$src" -DWITH_GFLAGS=ON -DWITH_UNWIND=OFF -DWITH_GTEST=OFF \
  -Dgflags_DIR="$PREFIX.tmp/lib/cmake/gflags"

src=$(unpack_source fmtlib "$(version_of fmtlib)")
cmake_build fmt "$src" -DFMT_DOC=OFF -DFMT_TEST=OFF -DFMT_PEDANTIC=ON

src=$(unpack_source double-conversion "$(version_of double-conversion)")
cmake_build double-conversion "$src"

src=$(unpack_source simdjson "$(version_of simdjson)")
cmake_build simdjson "$src" -DSIMDJSON_DEVELOPER_MODE=OFF

src=$(unpack_source googletest "$(version_of googletest)")
cmake_build googletest "$src" -DBUILD_GMOCK=ON -DINSTALL_GTEST=ON

# SQLite: Debian's source is the full tree. Its amalgamation (sqlite3.c) is
# generated once on this machine, from the patched tree, with the configure
# options of debian/rules. Its feature options are Debian's too, read from the
# source package: the -D flags of debian/rules' CFLAGS and those that configure
# adds for the options given to it (OPT_FEATURE_FLAGS of the Makefile it
# writes). What configure learns of the C library is given below instead: it
# is the same for every target (glibc here, bionic on a phone), and configure
# would also pick up libraries of this machine that the app does not have.
src=$(unpack_source sqlite3 "$(version_of sqlite3)")
amalg=$src/.amalgamation
if [ ! -f "$amalg/sqlite3.c" ] || [ ! -f "$amalg/features" ]; then
  echo "build-deps: generating the SQLite amalgamation" >&2
  rm -rf "$amalg" "$amalg.tmp"
  mkdir -p "$amalg.tmp"
  if ! (cd "$amalg.tmp" && "$src/configure" --enable-threadsafe --enable-load-extension \
          --enable-json --enable-fts4 --enable-fts5 --disable-tcl &&
        make sqlite3.c) >"$BUILD/sqlite3-amalgamation.log" 2>&1; then
    tail -n 40 "$BUILD/sqlite3-amalgamation.log" >&2
    echo "build-deps: generating the SQLite amalgamation failed (is tclsh installed?)" >&2
    exit 1
  fi
  { sed -n '/^export CFLAGS += /,/[^\\]$/p' "$src/debian/rules"
    sed -n 's/^OPT_FEATURE_FLAGS *= *//p' "$amalg.tmp/Makefile"; } |
    { grep -oE -- '-DSQLITE_[A-Z0-9_]+(=[0-9]+)?' || true; } | sed 's/^-D//' >"$amalg.tmp/features"
  # The shapes read above are Debian's; if they change, say so rather than
  # build a different SQLite.
  if ! grep -qx 'SQLITE_THREADSAFE=1' "$amalg.tmp/features" || ! grep -qx 'SQLITE_ENABLE_FTS5' "$amalg.tmp/features"; then
    echo "build-deps: could not read SQLite's feature options from debian/rules and the configured" \
         "Makefile of $src (found: $(tr '\n' ' ' <"$amalg.tmp/features"))" >&2
    exit 1
  fi
  mkdir -p "$amalg"
  cp "$amalg.tmp/sqlite3.c" "$amalg.tmp/sqlite3.h" "$amalg.tmp/sqlite3ext.h" "$amalg.tmp/features" "$amalg/"
  rm -rf "$amalg.tmp"
fi
mkdir -p "$BUILD/sqlite3-src"
cat >"$BUILD/sqlite3-src/CMakeLists.txt" <<EOF
cmake_minimum_required(VERSION 3.16)
project(sqlite3 C)
add_library(sqlite3 STATIC "$amalg/sqlite3.c")
target_compile_options(sqlite3 PRIVATE -fno-strict-aliasing)
target_compile_definitions(sqlite3 PRIVATE
  # Debian's feature options
  $(tr '\n' ' ' <"$amalg/features")
  # the C library
  _REENTRANT=1 HAVE_USLEEP=1 HAVE_FDATASYNC=1 HAVE_LOCALTIME_R=1 HAVE_GMTIME_R=1
  HAVE_ISNAN=1 HAVE_STRCHRNUL=1 HAVE_POSIX_FALLOCATE=1 HAVE_UTIME=1
  HAVE_DECL_STRERROR_R=1 HAVE_STRERROR_R=1 HAVE_STDINT_H=1 HAVE_INTTYPES_H=1)
install(TARGETS sqlite3 ARCHIVE DESTINATION lib)
install(FILES "$amalg/sqlite3.h" "$amalg/sqlite3ext.h" DESTINATION include)
EOF
cmake_build sqlite3 "$BUILD/sqlite3-src"

# Every archive must be there, and the C++ ones must be built on libc++
# (whose names live in std::__1) and not on GNU's runtime (std::__cxx11): an
# archive built on another runtime could link, and fail when it runs.
NM=$(command -v llvm-nm-14 || command -v llvm-nm)
for entry in "${DEPS[@]}"; do
  read -r src _ archives <<<"$entry"
  paths=()
  for archive in $archives; do
    paths+=("$PREFIX.tmp/lib/$archive")
    [ -f "$PREFIX.tmp/lib/$archive" ] || { echo "build-deps: $ABI: $archive was not built" >&2; exit 1; }
  done
  [ "$src" = sqlite3 ] && continue
  names=$("$NM" -C "${paths[@]}" 2>/dev/null)
  if ! grep -q 'std::__1::' <<<"$names" || grep -q 'std::__cxx11::' <<<"$names"; then
    echo "build-deps: $ABI: $archives: not built on libc++" >&2
    exit 1
  fi
done

rm -rf "$BUILD"
publish_cached "$PREFIX"
