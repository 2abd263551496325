#!/usr/bin/env bash
# Installs a reliqa wheel into a fresh virtual environment (made with
# --system-site-packages, so that Debian's numpy, pandas, XGBoost and Dask are
# seen), without the network, and runs the README's Python example there,
# outside the source tree; then a replay of the example logs on a LocalCluster,
# whose worker processes must find the installed package.
#   test-wheel.sh WHEEL
set -euo pipefail
wheel=$(realpath "$1")
root=$(cd "$(dirname "$0")/.." && pwd)
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

/usr/bin/python3 -m venv --system-site-packages "$work/venv"
"$work/venv/bin/pip" install --quiet --no-index --no-deps "$wheel"
# The example is the README's block after the "wheel example" marker.
awk '/<!-- wheel example -->/ {on = 1; next} on && /^```python/ {inside = 1; next}
     inside && /^```/ {exit} inside {print}' "$root/README.md" > "$work/example.py"
[ -s "$work/example.py" ] || { echo "test-wheel: no example found in README.md" >&2; exit 1; }
cd "$work"
RELIQA_SOURCE=$root TZ=UTC "$work/venv/bin/python" example.py
TZ=UTC "$work/venv/bin/python" -m reliqa replay "$root/examples/replay_logs.jsonl" --model "$root/examples/model.txt" \
  --label opened --workers 1 --out "$work/report"
[ -s "$work/report/report.html" ] || { echo "test-wheel: the replay wrote no report" >&2; exit 1; }
where=$("$work/venv/bin/python" -c 'import reliqa, os; print(os.path.dirname(reliqa.__file__))')
case "$where" in
  "$work/venv/"*) echo "test-wheel: the example ran on the installed package ($where)" ;;
  *) echo "test-wheel: reliqa was imported from $where, not from the virtual environment" >&2; exit 1 ;;
esac
