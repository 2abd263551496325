#!/usr/bin/python3
"""Trains the example model on synthetic collections and converts it.

    /usr/bin/python3 examples/train_model.py --reliqa build/bin/reliqa

1. Draws --collections synthetic collections (examples/synth.py, --seed).
2. Computes their 74 features with `reliqa features -` (JSON Lines in and out,
   TZ=UTC), so the model learns from exactly the features the classifier
   computes. A feature that a collection lacks (feature 2 without a location)
   is given as 0.0, which is what the converted model sees for it.
3. Trains an XGBoost binary:logistic model whose feature names are the
   feature ids, and writes examples/model.json.
4. Converts it with `reliqa convert xgboost` into examples/model.txt.
5. Writes the example collection (examples/collection.json) from the same seed.

Needs Debian's python3-xgboost and python3-numpy (run it with /usr/bin/python3).
"""

import argparse
import json
import os
import subprocess
import sys

import numpy as np
import xgboost as xgb

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
import synth  # noqa: E402

N_FEATURES = 74


def features_of(reliqa, collections):
    lines = "".join(json.dumps(c, separators=(",", ":")) + "\n" for c in collections)
    env = dict(os.environ, TZ="UTC")
    out = subprocess.run([reliqa, "features", "-"], input=lines.encode(), env=env,
                         stdout=subprocess.PIPE, check=True).stdout.decode()
    rows = []
    for line in out.splitlines():
        feats = json.loads(line)
        rows.append([float(feats.get(str(i), 0.0)) for i in range(1, N_FEATURES + 1)])
    if len(rows) != len(collections):
        sys.exit(f"train_model: expected {len(collections)} feature rows, got {len(rows)}")
    return np.array(rows, dtype=np.float64)


def main():
    here = os.path.dirname(os.path.abspath(__file__))
    ap = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    ap.add_argument("--reliqa", default=os.path.join(here, "..", "build", "bin", "reliqa"))
    ap.add_argument("--out-dir", default=here)
    ap.add_argument("--seed", type=int, default=20261123)
    ap.add_argument("--collections", type=int, default=4000)
    ap.add_argument("--trees", type=int, default=120)
    ap.add_argument("--depth", type=int, default=4)
    args = ap.parse_args()

    rng = np.random.RandomState(args.seed)
    collections, labels = [], []
    for i in range(args.collections):
        c, q = synth.make_collection(rng, i)
        collections.append(c)
        labels.append(synth.label(rng, q))
    y = np.array(labels, dtype=np.float64)
    x = features_of(args.reliqa, collections)

    n_train = int(0.8 * len(y))
    names = [str(i) for i in range(1, N_FEATURES + 1)]
    dtrain = xgb.DMatrix(x[:n_train], label=y[:n_train], feature_names=names)
    dvalid = xgb.DMatrix(x[n_train:], label=y[n_train:], feature_names=names)
    params = {
        "objective": "binary:logistic",
        "base_score": float(y[:n_train].mean()),
        "max_depth": args.depth,
        "eta": 0.08,
        "subsample": 0.8,
        "colsample_bytree": 0.8,
        "min_child_weight": 2.0,
        "tree_method": "hist",
        "eval_metric": ["logloss", "auc"],
        "seed": args.seed,
        "nthread": 1,
    }
    booster = xgb.train(params, dtrain, args.trees, evals=[(dvalid, "valid")], verbose_eval=False)
    p = booster.predict(dvalid)
    accuracy = float(((p > 0.5) == (y[n_train:] > 0.5)).mean())
    print(f"train_model: {len(y)} collections, {int(y.sum())} positive; "
          f"validation accuracy {accuracy:.3f}", file=sys.stderr)

    model_json = os.path.join(args.out_dir, "model.json")
    model_txt = os.path.join(args.out_dir, "model.txt")
    booster.save_model(model_json)
    subprocess.run([args.reliqa, "convert", "xgboost", model_json, "-o", model_txt], check=True)

    # The example collection: about forty assets, some videos, a few
    # near-duplicate pairs, taken at a known place.
    ex_rng = np.random.RandomState(args.seed + 1)
    while True:
        c, _ = synth.make_collection(ex_rng, 0, n_assets=40)
        c["collectionID"] = "lisbon-weekend"
        if (c["locationInfo"] and c["assetCounts"]["videosCount"] >= 3
                and 3 <= len(c["duplicateInfos"]) <= 8):
            break
    with open(os.path.join(args.out_dir, "collection.json"), "w") as f:
        json.dump(c, f, indent=2)
        f.write("\n")


if __name__ == "__main__":
    main()
