#!/usr/bin/env bash
# Makes (once) a Debian sysroot for a target ABI and prints its path.
#   scripts/sysroot.sh x86_64|arm64|armhf
# The sysroot holds what a phone's platform and NDK stand for: the target's C
# library, LLVM's C++ runtime (libc++, libc++abi and libunwind, linked
# statically), libgcc's builtins and the time zones; the header-only CLI11 the
# tool builds against; and a Java runtime of the target, which runs the JVM
# suite under the emulator. Every other library the project uses is built from
# source for the target by scripts/build-deps.sh. The packages are unpacked by
# mmdebstrap from the machine's own Debian sources (nothing is installed on
# this machine for another architecture). x86_64 has one too, without the
# Java runtime (its programs run on this machine): LLVM's libunwind, which
# libc++ needs, cannot be installed beside the libunwind that Debian's glog
# package needs for the plain builds. It is cached under ~/.cache/reliqa/ and made anew
# when the package list or the sources change.
set -euo pipefail
ABI=${1:?usage: $0 x86_64|arm64|armhf}
case "$ABI" in
  x86_64) ARCH=amd64 ;;
  arm64 | armhf) ARCH=$ABI ;;
  *) echo "sysroot: unknown ABI '$ABI' (x86_64, arm64 or armhf)" >&2; exit 2 ;;
esac

PACKAGES=(
  libc6-dev libgcc-12-dev libc++-14-dev libc++abi-14-dev libunwind-14-dev tzdata
  libcli11-dev
)
[ "$ABI" = x86_64 ] || PACKAGES+=(openjdk-17-jre-headless)

cd "$(dirname "$0")/.."
. scripts/cache-common.sh

sources=$(mktemp)
trap 'rm -f "$sources" "$sources.nosec"' EXIT
debian_sources >"$sources"
[ -s "$sources" ] || { echo "sysroot: no Debian sources configured in /etc/apt" >&2; exit 1; }

key=$( { echo "$ABI"; printf '%s\n' "${PACKAGES[@]}"; cat "$sources"; key_text scripts/sysroot.sh scripts/cache-common.sh; } |
       sha256sum | cut -c1-12)
ROOT=$CACHE/sysroot-$ABI-$key
if [ -f "$ROOT/.complete" ]; then
  echo "$ROOT"
  exit 0
fi

mkdir -p "$CACHE"
rm -rf "$ROOT" "$ROOT.tmp"
include=$(IFS=,; echo "${PACKAGES[*]}")
unpack() {  # unpack <sources file>
  mmdebstrap --quiet --variant=extract --arch="$ARCH" --include="$include" \
    "$(. /etc/os-release && echo "$VERSION_CODENAME")" "$ROOT.tmp" "$1" >&2
}
echo "sysroot: unpacking $ABI packages into $ROOT" >&2
if ! unpack "$sources"; then
  # A mirror caught mid-sync serves an index that does not match its release
  # file, which happens to the security suite's smaller architectures. Its
  # fixes are folded into the next point release, so go on without it.
  grep -v -- '-security' "$sources" >"$sources.nosec" || true
  cmp -s "$sources" "$sources.nosec" && exit 1
  echo "sysroot: retrying without the security suite" >&2
  rm -rf "$ROOT.tmp"
  unpack "$sources.nosec"
fi
# Merge /lib into /usr/lib as an installed Debian system has it: the target's
# loader, run under qemu-user, then finds every library in its first
# directory.
if [ -d "$ROOT.tmp/lib" ] && [ ! -L "$ROOT.tmp/lib" ]; then
  cp -a "$ROOT.tmp/lib/." "$ROOT.tmp/usr/lib/"
  rm -rf "$ROOT.tmp/lib"
  ln -s usr/lib "$ROOT.tmp/lib"
fi
# The build machine's loader cache describes its own libraries, and the
# target's loader would read it: give the sysroot an empty one.
mkdir -p "$ROOT.tmp/etc"
: >"$ROOT.tmp/etc/ld.so.cache"
# Some of the packages link their development files with absolute paths;
# make them point inside the sysroot.
find "$ROOT.tmp" -type l -lname '/*' | while read -r link; do
  target=$(readlink "$link")
  ln -sfn "$ROOT/${target#/}" "$link"
done
# and some CMake package files name their headers by absolute path.
{ grep -rlZ 'INTERFACE_INCLUDE_DIRECTORIES "/usr/' "$ROOT.tmp/usr/lib" "$ROOT.tmp/usr/share" --include='*.cmake' || true; } |
  xargs -0 -r sed -i "s|INTERFACE_INCLUDE_DIRECTORIES \"/usr/|INTERFACE_INCLUDE_DIRECTORIES \"$ROOT/usr/|"
publish_cached "$ROOT"
