#!/usr/bin/env bash
# Runs the fuzz targets, one core each, starting from their committed corpora.
#   bash scripts/fuzz.sh [SECONDS] [TARGET...]           a campaign (default 1800 s)
#   bash scripts/fuzz.sh --check SECONDS [TARGET...]     the test command's run
# A campaign merges what each run found into fuzz/corpus/<corpus>/: every
# committed input stays, and a new input is added only when it reaches code
# that the corpus does not (libFuzzer -merge=1); commit the grown corpora (the
# test suite replays them: fuzz_replay_*). An input that crashes, hangs or
# leaks is kept in fuzz/findings/<target>/, and the script exits with status 1.
# --check leaves the corpora alone and keeps findings in a temporary directory
# that it names. Targets are named as in fuzz/ (e.g. fuzz_model_reader), all
# of them by default; up to JOBS run at once (default: the number of cores).
set -euo pipefail
cd "$(dirname "$0")/.."
CHECK=no
if [ "${1:-}" = --check ]; then
  CHECK=yes
  shift
  RUN_SECONDS=${1:?usage: $0 --check SECONDS [TARGET...]}
else
  RUN_SECONDS=${1:-1800}
fi
[ $# -gt 0 ] && shift
JOBS=${JOBS:-$(nproc)}

bash scripts/setup.sh
cmake --preset fuzz >/dev/null
cmake --build --preset fuzz -j "$JOBS"

targets=("$@")
if [ ${#targets[@]} -eq 0 ]; then
  for bin in build-fuzz/bin/fuzz_*; do targets+=("$(basename "$bin")"); done
fi

logs=$(mktemp -d)
findings_root=fuzz/findings
[ "$CHECK" = yes ] && findings_root=$logs/findings
campaign() {  # campaign <target>: run, then (unless checking) merge into the committed corpus
  local name=$1 corpus="fuzz/corpus/${1#fuzz_}" work merged findings="$findings_root/$1"
  work=$(mktemp -d)
  mkdir -p "$findings"
  local before start status=0
  before=$(find "$corpus" -type f | wc -l)
  start=$(date +%s)
  # A check runs on a copy of the corpus, which it may grow and drop.
  local inputs=("$work" "$corpus")
  [ "$CHECK" = yes ] && { cp -r "$corpus"/. "$work"/; inputs=("$work"); }
  "build-fuzz/bin/$name" -max_total_time="$RUN_SECONDS" -timeout=10 -rss_limit_mb=2048 \
    -artifact_prefix="$findings/" -print_final_stats=1 "${inputs[@]}" >"$logs/$name.log" 2>&1 || status=$?
  if [ "$CHECK" = no ]; then
    merged=$(mktemp -d)
    cp -r "$corpus"/. "$merged"/
    "build-fuzz/bin/$name" -merge=1 -timeout=10 -rss_limit_mb=2048 "$merged" "$work" >>"$logs/$name.log" 2>&1 ||
      status=$?
    rm -rf "$corpus" && mkdir -p "$corpus" && cp -r "$merged"/. "$corpus"/
    rm -rf "$merged"
  fi
  rm -rf "$work"
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
