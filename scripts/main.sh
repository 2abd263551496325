#!/usr/bin/env bash
# Main job on a fresh Debian 12 machine: set up, build the reliqa tool, load the
# example model into the default store and classify the example collection.
set -euo pipefail
cd "$(dirname "$0")/.."
bash scripts/setup.sh
cmake --preset plain >/dev/null
cmake --build --preset plain --target reliqa
build/bin/reliqa set-model --model examples/model.txt --model-id example-synthetic-v1 --threshold 0.5
build/bin/reliqa classify examples/collection.json
