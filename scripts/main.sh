#!/usr/bin/env bash
# Main job on a fresh Debian 12 machine: set up, build, and score a sample
# feature vector with the sample model.
set -euo pipefail
cd "$(dirname "$0")/.."
bash scripts/setup.sh
cmake -S . -B build -G Ninja -Wno-dev >/dev/null
cmake --build build --target gbdt-demo
build/bin/gbdt-demo examples/demo/model.txt 3=0.25 17=-1
