#!/usr/bin/python3
"""Trains the models of the side-by-side benchmark and converts them.

    xgboost_models.py RELIQA OUT_DIR

Writes OUT_DIR/{m100_d6,m500_d6,m2000_d8}.{json,ubj,txt}: XGBoost JSON (and UBJSON) models of
100 trees of depth 6, 500 of depth 6 and 2000 of depth 8 over 74 features
(named 1 to 74), trained on a fixed synthetic data set, and their conversions
by `reliqa convert xgboost`. Deterministic for a given XGBoost version.
Needs Debian's python3-xgboost and python3-numpy (/usr/bin/python3).
"""

import os
import subprocess
import sys

import numpy as np
import xgboost as xgb

SEED = 1234
MODELS = [("m100_d6", 100, 6), ("m500_d6", 500, 6), ("m2000_d8", 2000, 8)]


def main():
    reliqa, out = sys.argv[1], sys.argv[2]
    os.makedirs(out, exist_ok=True)
    rng = np.random.RandomState(SEED)
    n, f = 20000, 74
    x = rng.normal(size=(n, f)).astype(np.float32)
    w = rng.normal(size=f)
    logit = x @ w * 0.3 + np.sin(3 * x[:, 0]) * x[:, 1] + (x[:, 2] > 0.5) * x[:, 3] - 0.2
    y = (rng.rand(n) < 1 / (1 + np.exp(-logit))).astype(np.float32)
    data = xgb.DMatrix(x, label=y, feature_names=[str(i) for i in range(1, f + 1)])
    for name, trees, depth in MODELS:
        params = {"objective": "binary:logistic", "base_score": 0.45, "max_depth": depth, "eta": 0.05,
                  "subsample": 0.7, "colsample_bytree": 0.8, "min_child_weight": 0.05, "lambda": 1.0,
                  "tree_method": "hist", "max_bin": 256, "seed": SEED, "nthread": 2}
        booster = xgb.train(params, data, trees)
        booster.save_model(os.path.join(out, name + ".json"))
        booster.save_model(os.path.join(out, name + ".ubj"))  # XGBoost's own binary form, for its load time
        subprocess.run([reliqa, "convert", "xgboost", os.path.join(out, name + ".json"), "-o",
                        os.path.join(out, name + ".txt")], check=True)
        print(f"xgboost_models: {name} written", file=sys.stderr)


if __name__ == "__main__":
    main()
