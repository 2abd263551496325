#!/usr/bin/env bash
# Grows the fuzz corpora with a campaign:
#   bash scripts/fuzz.sh [SECONDS] [TARGET...]
# runs each fuzz target (all of them by default; names as in fuzz/, e.g.
# fuzz_model_reader) for SECONDS (default 1800) of one core each, starting from
# its committed corpus, then merges what the run found into
# fuzz/corpus/<corpus>/: every committed input stays, and a new input is added
# only when it reaches code that the corpus does not (libFuzzer -merge=1).
# Commit the grown corpora; the test suite replays them (fuzz_replay_*).
# Up to JOBS targets run at once (default: the number of cores). An input that
# crashes, hangs or leaks is kept in fuzz/findings/<target>/ and the script
# exits with status 1.
set -euo pipefail
cd "$(dirname "$0")/.."
RUN_SECONDS=${1:-1800}
[ $# -gt 0 ] && shift
JOBS=${JOBS:-$(nproc)}

bash scripts/setup.sh
cmake -S . -B build-fuzz -G Ninja -Wno-dev -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ \
  -DRELIQA_FUZZ=ON -DRELIQA_BENCH=OFF -DRELIQA_WERROR=ON -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
cmake --build build-fuzz -j "$JOBS" --target fuzz_targets

targets=("$@")
if [ ${#targets[@]} -eq 0 ]; then
  for bin in build-fuzz/bin/fuzz_*; do targets+=("$(basename "$bin")"); done
fi

logs=$(mktemp -d)
campaign() {  # campaign <target>: run, then merge into the committed corpus
  local name=$1 corpus="fuzz/corpus/${1#fuzz_}" work merged findings="fuzz/findings/$1"
  work=$(mktemp -d)
  merged=$(mktemp -d)
  mkdir -p "$findings"
  local before start status=0
  before=$(find "$corpus" -type f | wc -l)
  start=$(date +%s)
  "build-fuzz/bin/$name" -max_total_time="$RUN_SECONDS" -timeout=10 -rss_limit_mb=2048 \
    -artifact_prefix="$findings/" -print_final_stats=1 "$work" "$corpus" >"$logs/$name.log" 2>&1 || status=$?
  cp -r "$corpus"/. "$merged"/
  "build-fuzz/bin/$name" -merge=1 -timeout=10 -rss_limit_mb=2048 "$merged" "$work" >>"$logs/$name.log" 2>&1 ||
    status=$?
  rm -rf "$corpus" && mkdir -p "$corpus" && cp -r "$merged"/. "$corpus"/
  rm -rf "$work" "$merged"
  rmdir "$findings" 2>/dev/null || true
  local runs
  runs=$(sed -n 's/^stat::number_of_executed_units: *//p' "$logs/$name.log" | tail -n 1)
  printf '%-26s %6ss %12s runs  corpus %5s -> %5s  %s\n' "$name" "$(($(date +%s) - start))" "${runs:-?}" \
    "$before" "$(find "$corpus" -type f | wc -l)" "$([ "$status" -eq 0 ] && echo ok || echo "FINDING: see $findings")"
  return "$status"
}

failed=0
running=0
for name in "${targets[@]}"; do
  if [ ! -x "build-fuzz/bin/$name" ]; then
    echo "fuzz: no target $name in build-fuzz/bin" >&2
    exit 2
  fi
  campaign "$name" &
  running=$((running + 1))
  if [ "$running" -ge "$JOBS" ]; then
    wait -n || failed=1
    running=$((running - 1))
  fi
done
while [ "$running" -gt 0 ]; do
  wait -n || failed=1
  running=$((running - 1))
done
if [ "$failed" -ne 0 ]; then
  echo "fuzz: findings above; the logs are in $logs" >&2
  exit 1
fi
rm -rf "$logs"
