#!/usr/bin/env bash
# Installs every Debian package the project needs. Idempotent and quiet when
# everything is already there. Needs root (or sudo) only when something is missing.
set -euo pipefail

PACKAGES=(
  build-essential cmake ninja-build pkg-config
  clang libclang-rt-14-dev lld tzdata
  mmdebstrap qemu-user-static llvm-14 tcl
  libgoogle-glog-dev libdouble-conversion-dev libfmt-dev libsimdjson-dev libsqlite3-dev
  libgtest-dev libgmock-dev libbenchmark-dev libcli11-dev
  openjdk-17-jdk-headless junit5
  python3 python3-numpy python3-xgboost libxgboost-dev
  python3-dev pybind11-dev python3-pandas python3-pytest python3-venv python3-pip python3-wheel
  python3-dask python3-distributed python3-matplotlib python3-psutil chromium
)

missing=()
for p in "${PACKAGES[@]}"; do
  if ! dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'install ok installed'; then
    missing+=("$p")
  fi
done
[ ${#missing[@]} -eq 0 ] && exit 0

SUDO=""
if [ "$(id -u)" -ne 0 ]; then SUDO="sudo"; fi
echo "setup: installing ${missing[*]}" >&2
export DEBIAN_FRONTEND=noninteractive
$SUDO apt-get update -qq >/dev/null
$SUDO apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
