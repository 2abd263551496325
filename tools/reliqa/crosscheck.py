#!/usr/bin/python3
"""Cross-check of converted models against XGBoost itself.

    crosscheck.py BUILD/bin/reliqa [WORKDIR]

Trains small XGBoost models (depth 3 to 8, base_score other than 0.5, with and
without integer feature names, both objectives, hist and exact splits),
converts each with `reliqa convert xgboost`, scores a few thousand rows through
`reliqa score` and through XGBoost, and requires the same verdict at 0.5 and
probabilities within 1e-6. The rows include values exactly on split values and
the float just below them, where a strict and a non-strict comparison differ.

It also explains a few hundred of those rows with `reliqa explain --rows`, its
covers taken from the XGBoost model (--xgboost), and requires every
contribution and the bias to be within 1e-5 of XGBoost's
predict(pred_contribs=True), and each explanation's raw score to be what
`reliqa score --raw` printed. Feature rows are JSON, which has no NaN, so rows
with missing values cannot reach the tool; they are not explained here.

Needs Debian's python3-xgboost and python3-numpy (/usr/bin/python3).
"""

import json
import os
import subprocess
import sys
import tempfile

import numpy as np
import xgboost as xgb

SEED = 424242

# name, features, depth, trees, base_score, objective, tree_method, feature names
MODELS = [
    ("d3-named-sparse-ids", 20, 3, 60, 0.3, "binary:logistic", "hist", "sparse"),
    ("d5-unnamed", 12, 5, 80, 0.7, "reg:logistic", "exact", None),
    ("d6-text-names", 16, 6, 100, 0.42, "binary:logistic", "exact", "text"),
    ("d8-74-features", 74, 8, 120, 0.2, "binary:logistic", "hist", "dense"),
]
RANDOM_ROWS = 1500
BOUNDARY_VALUES = 700  # split values tested on and just below
EXPLAINED_ROWS = 200   # random rows explained, and as many on or below split values
CONTRIBUTION_TOLERANCE = 1e-5


def make_data(rng, n, f):
    x = rng.normal(size=(n, f)).astype(np.float32)
    x[:, : f // 3] = np.round(x[:, : f // 3] * 3)  # some integer-valued features: many exact ties
    logit = x[:, 0] - 0.8 * x[:, 1] * x[:, 2] + np.sin(2 * x[:, 3 % f]) + 0.5 * (x[:, 4 % f] > 0.3)
    y = (rng.rand(n) < 1 / (1 + np.exp(-logit))).astype(np.float32)
    return x, y


def split_values(model_json):
    """(feature index, split value) of every split of every tree."""
    out = set()
    for tree in model_json["learner"]["gradient_booster"]["model"]["trees"]:
        for left, idx, cond in zip(tree["left_children"], tree["split_indices"], tree["split_conditions"]):
            if left != -1:
                out.add((idx, float(np.float32(cond))))
    return sorted(out)


def rows_for(rng, f, splits):
    base = rng.normal(size=(RANDOM_ROWS, f)).astype(np.float32)
    base[:, : f // 3] = np.round(base[:, : f // 3] * 3)
    picks = [splits[i] for i in rng.choice(len(splits), min(BOUNDARY_VALUES, len(splits)), replace=False)]
    special = []
    for idx, value in picks:
        for v in (np.float32(value), np.nextafter(np.float32(value), np.float32(-np.inf))):
            row = base[rng.randint(RANDOM_ROWS)].copy()
            row[idx] = v
            special.append(row)
    # Rows whose every feature sits on one of its own split values.
    by_feature = {}
    for idx, value in splits:
        by_feature.setdefault(idx, []).append(value)
    for _ in range(100):
        row = base[rng.randint(RANDOM_ROWS)].copy()
        for idx, values in by_feature.items():
            row[idx] = np.float32(values[rng.randint(len(values))])
        special.append(row)
    return np.vstack([base, np.array(special, dtype=np.float32)])


def check_model(reliqa, work, rng, config):
    name, f, depth, trees, base_score, objective, method, naming = config
    x, y = make_data(rng, 3000, f)
    if naming == "sparse":
        ids = [int(i) for i in sorted(rng.choice(5000, f, replace=False) - 1000)]
        names = [str(i) for i in ids]
    elif naming == "dense":
        ids = list(range(1, f + 1))
        names = [str(i) for i in ids]
    elif naming == "text":
        ids = [100 + 3 * i for i in range(f)]
        names = [f"feat_{i}" for i in range(f)]
    else:
        ids = [7 * i + 1 for i in range(f)]
        names = None
    dtrain = xgb.DMatrix(x, label=y, feature_names=names)
    params = {"objective": objective, "max_depth": depth, "eta": 0.3, "base_score": base_score,
              "tree_method": method, "seed": SEED, "nthread": 2, "min_child_weight": 0.5}
    booster = xgb.train(params, dtrain, trees)
    model_json = os.path.join(work, name + ".json")
    model_txt = os.path.join(work, name + ".txt")
    booster.save_model(model_json)
    with open(model_json) as fh:
        splits = split_values(json.load(fh))

    cmd = [reliqa, "convert", "xgboost", model_json, "-o", model_txt]
    if naming not in ("sparse", "dense"):
        cmd += ["--feature-ids", ",".join(map(str, ids))]
    subprocess.run(cmd, check=True, stderr=subprocess.DEVNULL)

    rows = rows_for(rng, f, splits)
    drows = xgb.DMatrix(rows, feature_names=names)
    theirs = booster.predict(drows).astype(np.float64)
    their_margin = booster.predict(drows, output_margin=True).astype(np.float64)
    # Each value is written as the double equal to its float, so both sides
    # see the same float.
    lines = "".join(json.dumps({str(i): float(v) for i, v in zip(ids, row)}, separators=(",", ":")) + "\n"
                    for row in rows)

    def score(*extra):
        out = subprocess.run([reliqa, "score", "--model", model_txt, *extra, "-"], input=lines.encode(),
                             stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, check=True).stdout
        return np.array([float(t) for t in out.decode().split()])

    ours, our_margin = score(), score("--raw")
    if len(ours) != len(rows):
        return [f"{name}: {len(ours)} scores for {len(rows)} rows"]
    problems = []
    verdicts = np.sum((ours > 0.5) != (theirs > 0.5))
    worst = float(np.max(np.abs(ours - theirs)))
    worst_margin = float(np.max(np.abs(our_margin - their_margin)))
    on_split = len(rows) - RANDOM_ROWS
    print(f"crosscheck: {name}: {len(rows)} rows ({on_split} on or just below split values), "
          f"{len(splits)} distinct splits; max |score diff| {worst:.2e}, max |raw diff| {worst_margin:.2e}, "
          f"verdict mismatches {verdicts}")
    if verdicts:
        problems.append(f"{name}: {verdicts} verdicts differ")
    if worst > 1e-6:
        i = int(np.argmax(np.abs(ours - theirs)))
        problems.append(f"{name}: row {i}: score {ours[i]!r} vs XGBoost {theirs[i]!r}")
    problems += check_contributions(reliqa, name, booster, model_json, model_txt, ids, names, rows, lines, our_margin)
    return problems


def check_contributions(reliqa, name, booster, model_json, model_txt, ids, names, rows, lines, our_margin):
    """Our explanations of some of the rows against XGBoost's pred_contribs."""
    picked = np.concatenate([np.arange(EXPLAINED_ROWS),
                             RANDOM_ROWS + np.arange(min(EXPLAINED_ROWS, len(rows) - RANDOM_ROWS))])
    all_lines = lines.splitlines(keepends=True)
    out = subprocess.run([reliqa, "explain", "--model", model_txt, "--xgboost", model_json, "--rows", "-"],
                         input="".join(all_lines[i] for i in picked).encode(), stdout=subprocess.PIPE,
                         stderr=subprocess.DEVNULL, check=True).stdout.decode().splitlines()
    if len(out) != len(picked):
        return [f"{name}: {len(out)} explanations for {len(picked)} rows"]
    explained = [json.loads(line) for line in out]
    # Ours in XGBoost's column order: one column per feature, then the bias.
    ours = np.array([[e["contributions"][str(i)] for i in ids] + [e["bias"]] for e in explained])
    theirs = booster.predict(xgb.DMatrix(rows[picked], feature_names=names), pred_contribs=True).astype(np.float64)
    diff = np.abs(ours - theirs)
    worst_row, worst_column = np.unravel_index(int(np.argmax(diff)), diff.shape)
    raw_mismatches = sum(e["raw_score"] != our_margin[i] for e, i in zip(explained, picked))
    print(f"crosscheck: {name}: contributions of {len(picked)} rows: max |diff| {diff.max():.2e} "
          f"(bias {diff[:, -1].max():.2e}), raw scores unlike score's {raw_mismatches}")
    problems = []
    if diff.max() > CONTRIBUTION_TOLERANCE:
        what = "bias" if worst_column == len(ids) else f"feature {ids[worst_column]}"
        problems.append(f"{name}: row {picked[worst_row]}: {what}: {ours[worst_row, worst_column]!r} vs "
                        f"XGBoost {theirs[worst_row, worst_column]!r}")
    if raw_mismatches:
        problems.append(f"{name}: {raw_mismatches} explanations give another raw score than score --raw")
    return problems


def main():
    reliqa = os.path.abspath(sys.argv[1])
    work = sys.argv[2] if len(sys.argv) > 2 else tempfile.mkdtemp(prefix="reliqa-crosscheck-")
    os.makedirs(work, exist_ok=True)
    rng = np.random.RandomState(SEED)
    problems = []
    for config in MODELS:
        problems += check_model(reliqa, work, rng, config)
    for p in problems:
        print("crosscheck: FAILED: " + p)
    print(f"crosscheck: {len(MODELS) - len({p.split(':')[0] for p in problems})} passed, "
          f"{len({p.split(':')[0] for p in problems})} failed")
    sys.exit(1 if problems else 0)


if __name__ == "__main__":
    main()
