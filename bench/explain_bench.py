#!/usr/bin/python3
"""Contributions from Python: reliqa's Model.contributions beside XGBoost's
predict(pred_contribs=True).

    PYTHONPATH=build/python /usr/bin/python3 bench/explain_bench.py [--models DIR] [--rows N]

Explains N (default 2,000) rows of 74 float32 features with the XGBoost models
m100_d6, m500_d6 and m2000_d8 (DIR, default build/xgboost-bench-models: build
the target xgboost_bench_models first) and their conversions, which keep the
trainer's covers, at one thread and at two. XGBoost 1.7 gets fewer rows where
it is slow (--xgboost-rows, default 200). Before timing, the contributions of
both are compared (within 1e-5). Then the memory that the covers and the
explainer's tables take (as the explainer counts it), beside the memory of the
loaded model (resident-set growth of loading its text in a fresh process). Prints tables headed by the CPU flags; timings are the best of
--repeat runs, wall time.

With --check it only compares, on more rows and on rows with NaN, and exits
non-zero on a difference (the test command runs it; it trains the models
first when DIR lacks them, with --reliqa's conversion). NaN goes the way of
each split's learned default in XGBoost and the way of our NaN rule in
reliqa (right at the root, left below it), so rows with NaN are compared
with a copy of the XGBoost model whose default directions are ours.
"""

import argparse
import json
import os
import subprocess
import sys

import numpy as np
import xgboost as xgb

import reliqa
from bench_common import best_time, cpu_flags, cpu_model

MODELS = ("m100_d6", "m500_d6", "m2000_d8")


# Resident growth of loading the model text, in a fresh process.
MEMORY_CHILD = r"""
import sys, reliqa
def rss():
    with open("/proc/self/statm") as f:
        return int(f.read().split()[1]) * 4096
text = open(sys.argv[1], "rb").read()
start = rss()
model = reliqa.Model(text)
print(rss() - start)
"""


def check(args):
    if not all(os.path.exists(os.path.join(args.models, n + ".json")) for n in MODELS):
        trainer = os.path.join(os.path.dirname(os.path.abspath(__file__)), "xgboost_models.py")
        subprocess.run([sys.executable, trainer, args.reliqa, args.models], check=True)
    rng = np.random.default_rng(5)
    for name in MODELS:
        path = os.path.join(args.models, name + ".json")
        booster = xgb.Booster(model_file=path)
        model = reliqa.Model.from_xgboost(booster)
        n = 60 if name == "m2000_d8" else 300
        X = rng.normal(size=(n, 74)).astype(np.float32)
        names = booster.feature_names
        worst = float(np.max(np.abs(booster.predict(xgb.DMatrix(X, feature_names=names), pred_contribs=True)
                                    - model.contributions(X))))
        with open(path) as f:
            doc = json.load(f)
        trees = doc["learner"]["gradient_booster"]["model"]["trees"]
        splits = differ = 0
        for t in trees:
            ours = [0] + [1] * (len(t["default_left"]) - 1)
            for node, (d, o) in enumerate(zip(t["default_left"], ours)):
                if t["left_children"][node] != -1:
                    splits += 1
                    differ += int(d) != o
            t["default_left"] = ours
        aligned = xgb.Booster()
        aligned.load_model(bytearray(json.dumps(doc).encode()))
        X[rng.random(X.shape) < 0.2] = np.nan
        theirs = aligned.predict(xgb.DMatrix(X, feature_names=names), pred_contribs=True)
        worst_nan = float(np.max(np.abs(theirs - model.contributions(X, missing=None))))
        print(f"{name}: largest difference {worst:.2g} on {n} rows, {worst_nan:.2g} on {n} rows with NaN; "
              f"XGBoost's default direction differs from our NaN rule at {differ} of {splits} splits")
        if not (worst <= 1e-5 and worst_nan <= 1e-5):
            sys.exit(f"{name}: contributions differ from XGBoost's by more than 1e-5")


def main():
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--models", default="build/xgboost-bench-models")
    parser.add_argument("--rows", type=int, default=2000)
    parser.add_argument("--xgboost-rows", type=int, default=200)
    parser.add_argument("--repeat", type=int, default=3)
    parser.add_argument("--check", action="store_true", help="compare only (see above)")
    parser.add_argument("--reliqa", default="build/bin/reliqa", help="the tool, to convert models with --check")
    args = parser.parse_args()
    if args.check:
        check(args)
        return

    rng = np.random.default_rng(11)
    X = rng.normal(size=(args.rows, 74)).astype(np.float32)
    print(f"CPU: {cpu_model()}, {os.cpu_count()} cores; flags: {cpu_flags()}")
    print(f"reliqa: {args.rows} rows, XGBoost {xgb.__version__}: {args.xgboost_rows} rows; 74 float32 features; "
          f"best of {args.repeat}\n")
    print("| model | threads | XGBoost ms/row | reliqa ms/row | x XGBoost |")
    print("|---|---:|---:|---:|---:|")
    per_row = {}
    for name in MODELS:
        path = os.path.join(args.models, name + ".json")
        booster = xgb.Booster(model_file=path)
        model = reliqa.Model.from_xgboost(booster)
        few = X[: args.xgboost_rows]
        theirs = booster.predict(xgb.DMatrix(few, feature_names=booster.feature_names), pred_contribs=True)
        mine = model.contributions(few)
        diff = float(np.max(np.abs(theirs.astype(np.float64) - mine)))
        if diff > 1e-5:
            sys.exit(f"{name}: contributions differ from XGBoost's by up to {diff}")
        for threads in (1, 2):
            booster.set_param({"nthread": threads})
            data = xgb.DMatrix(few, feature_names=booster.feature_names, nthread=threads)
            t_xgb = best_time(lambda: booster.predict(data, pred_contribs=True), 1) / len(few) * 1e3
            t = best_time(lambda: model.contributions(X, nthread=threads), args.repeat) / args.rows * 1e3
            per_row[(name, threads)] = t
            print(f"| {name} | {threads} | {t_xgb:.3f} | {t:.4f} | {t_xgb / t:.1f} |")

    print("\n| model | 2 threads over 1 |")
    print("|---|---:|")
    for name in MODELS:
        print(f"| {name} | {per_row[(name, 1)] / per_row[(name, 2)]:.2f}x |")

    print("\n| model | loaded model MiB | covers and explainer tables MiB |")
    print("|---|---:|---:|")
    for name in MODELS:
        child = subprocess.run([sys.executable, "-c", MEMORY_CHILD, os.path.join(args.models, name + ".txt")],
                               capture_output=True, text=True, check=True, env=os.environ)
        loaded = int(child.stdout)
        model = reliqa.Model.from_xgboost(xgb.Booster(model_file=os.path.join(args.models, name + ".json")))
        tables = model._native.explainer_bytes()
        print(f"| {name} | {loaded / 2**20:.1f} | {tables / 2**20:.1f} |")


if __name__ == "__main__":
    main()
