#!/usr/bin/env bash
# Cross-check of `reliqa convert xgboost` against XGBoost itself: trains small
# models, converts them, and requires the same verdicts and scores within 1e-6
# on a few thousand rows (including rows on and just below split values).
#   bash scripts/test-crosscheck.sh [BUILD_DIR]     (default: build)
set -euo pipefail
cd "$(dirname "$0")/.."
BUILD=${1:-build}
cmake --build "$BUILD" --target reliqa >/dev/null
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
/usr/bin/python3 tools/reliqa/crosscheck.py "$BUILD/bin/reliqa" "$work"
