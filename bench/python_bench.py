#!/usr/bin/python3
"""Scoring from Python: reliqa's Model.predict beside XGBoost's inplace_predict.

    PYTHONPATH=build/python /usr/bin/python3 bench/python_bench.py [--models DIR] [--rows N]

Scores N (default 100,000) rows of 74 float32 features with the XGBoost models
m500_d6 and m2000_d8 and their conversions (DIR, default
build/xgboost-bench-models: build the target xgboost_bench_models first), at
one thread and at two, with XGBoost 1.7's inplace_predict on the same rows
with the same thread count. reliqa runs with the walk this CPU picks, and
forced to the scalar walk (what machines without AVX-512, phones among them,
pick) and to the portable one. Before timing, the scores of both are compared.

Then: one row from Python (predict on a 1-row array) against the C++ score of
one row (build/bin/xgboost_bench, when built), and the peak resident memory of
scoring a million rows. Prints one table per run, headed by the CPU flags.
Timings are the best of --repeat runs, wall time.
"""

import argparse
import json
import os
import resource
import subprocess
import sys
import tempfile

import numpy as np
import xgboost as xgb

import reliqa
from bench_common import best_time, cpu_flags, cpu_model

MODELS = ("m500_d6", "m2000_d8")


def one_row_cpp(xgboost_bench):
    """µs of the C++ score of one row, per model, from xgboost_bench."""
    if not xgboost_bench or not os.access(xgboost_bench, os.X_OK):
        return {}
    with tempfile.TemporaryDirectory() as tmp:
        report_path = os.path.join(tmp, "report.json")
        subprocess.run([xgboost_bench, "--benchmark_filter=BM_Reliqa/(m500_d6|m2000_d8)$",
                        f"--benchmark_out={report_path}", "--benchmark_out_format=json",
                        "--benchmark_min_time=0.3"], capture_output=True, check=True)
        with open(report_path) as f:
            report = json.load(f)
    scale = {"ns": 1e-3, "us": 1.0, "ms": 1e3}
    return {b["name"].split("/")[1]: b["real_time"] * scale[b["time_unit"]] for b in report["benchmarks"]
            if b.get("run_type", "iteration") == "iteration"}


PEAK_RSS_CHILD = """
import resource, sys, numpy as np, reliqa
model = reliqa.Model.load(sys.argv[1])
rng = np.random.default_rng(3)
X = np.empty((1_000_000, 74), dtype=np.float32)
for i in range(0, len(X), 50_000):  # in chunks: no temporary as large as X
    X[i:i + 50_000] = rng.standard_normal(size=(50_000, 74), dtype=np.float32)
with open("/proc/self/statm") as f:  # resident now, in KiB as ru_maxrss
    before = int(f.read().split()[1]) * resource.getpagesize() // 1024
model.predict(X, nthread=2)
after = resource.getrusage(resource.RUSAGE_SELF).ru_maxrss
print(before, after)
"""


def main():
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--models", default="build/xgboost-bench-models")
    parser.add_argument("--rows", type=int, default=100_000)
    parser.add_argument("--repeat", type=int, default=3)
    parser.add_argument("--xgboost-bench", default="build/bin/xgboost_bench")
    args = parser.parse_args()

    rng = np.random.default_rng(11)
    X = rng.normal(size=(args.rows, 74)).astype(np.float32)
    walks = {"best": "", "scalar": "scalar", "portable": "portable"}
    print(f"CPU: {cpu_model()}, {os.cpu_count()} cores; flags: {cpu_flags()}")
    print(f"{args.rows} rows of 74 float32 features; XGBoost {xgb.__version__}; best of {args.repeat}\n")
    print("| model | threads | XGBoost µs/row | reliqa µs/row | x XGBoost | scalar µs/row | x XGBoost "
          "| portable µs/row | x XGBoost |")
    print("|---|---:|---:|---:|---:|---:|---:|---:|---:|")
    per_row = {}
    for name in MODELS:
        booster = xgb.Booster(model_file=os.path.join(args.models, name + ".json"))
        text = open(os.path.join(args.models, name + ".txt"), "rb").read()
        ours = {walk: reliqa.Model(text, _walk=flag) for walk, flag in walks.items()}
        theirs = booster.inplace_predict(X)
        mine = ours["best"].predict(X)
        diff = float(np.max(np.abs(theirs.astype(np.float64) - mine)))
        if diff > 1e-6 or not np.array_equal(theirs > 0.5, mine > 0.5):
            sys.exit(f"{name}: scores differ from XGBoost's by up to {diff}")
        for walk in ours:
            if not np.array_equal(ours[walk].predict(X), mine):
                sys.exit(f"{name}: the {walk} walk gives other bits")
        for threads in (1, 2):
            booster.set_param({"nthread": threads})
            t_xgb = best_time(lambda: booster.inplace_predict(X), max(1, args.repeat - 1)) / args.rows * 1e6
            row = [name, str(threads), f"{t_xgb:.3f}"]
            for walk, model in ours.items():
                t = best_time(lambda: model.predict(X, nthread=threads), args.repeat) / args.rows * 1e6
                per_row[(name, threads, walk)] = t
                row += [f"{t:.3f}", f"{t_xgb / t:.1f}"]
            print("| " + " | ".join(row) + " |")

    print("\n| model | walk | 2 threads over 1 |")
    print("|---|---|---:|")
    for name in MODELS:
        for walk in walks:
            print(f"| {name} | {walk} | {per_row[(name, 1, walk)] / per_row[(name, 2, walk)]:.2f}x |")

    cpp = one_row_cpp(args.xgboost_bench)
    print("\n| model | one row from Python µs | C++ score of one row µs | ratio |")
    print("|---|---:|---:|---:|")
    for name in MODELS:
        model = reliqa.Model.load(os.path.join(args.models, name + ".txt"))
        rows = [X[i:i + 1] for i in range(2000)]
        t = best_time(lambda: [model.predict(r) for r in rows], args.repeat) / len(rows) * 1e6
        c = cpp.get(name)
        print(f"| {name} | {t:.2f} | {'%.2f' % c if c else 'n/a'} | {'%.2f' % (t / c) if c else 'n/a'} |")

    child = subprocess.run([sys.executable, "-c", PEAK_RSS_CHILD, os.path.join(args.models, "m500_d6.txt")],
                           capture_output=True, text=True, check=True, env=os.environ)
    before, after = (int(v) for v in child.stdout.split())
    print(f"\nScoring 1,000,000 rows (m500_d6, 2 threads): peak RSS {after / 1024:.0f} MiB; resident before "
          f"the call, with X (282 MiB of float32) made: {before / 1024:.0f} MiB")


if __name__ == "__main__":
    main()
