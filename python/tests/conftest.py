"""Shared helpers: the reference tool, a small converted XGBoost model, the
golden collections."""

import base64
import json
import os
import struct
import subprocess
import time
from types import SimpleNamespace

import numpy as np
import pytest

# Hour and day features follow the local time zone; the tool runs in the same.
os.environ["TZ"] = "UTC"
time.tzset()

SOURCE = os.environ.get("RELIQA_SOURCE") or os.path.abspath(os.path.join(__file__, "..", "..", ".."))
TOOL = os.environ.get("RELIQA_TOOL") or os.path.join(SOURCE, "build", "bin", "reliqa")
EXAMPLES = os.path.join(SOURCE, "examples")


def run_tool(*args, stdin=None, store=None, ok=True):
    argv = [TOOL] + (["--store", str(store)] if store else []) + [str(a) for a in args]
    r = subprocess.run(argv, input=stdin, capture_output=True, text=True, timeout=120)
    assert r.returncode == 0 or not ok, r.stderr
    return r


def tool_error(r):
    """The message of a refused run, without the 'reliqa: ' prefix."""
    lines = [l for l in r.stderr.splitlines() if l.startswith("reliqa: ")]
    assert r.returncode == 2 and len(lines) == 1, r.stderr
    return lines[0][len("reliqa: "):]


def rows_of(X, ids):
    """A dense matrix as the tool's sparse rows: NaN cells left out."""
    return [{str(i): float(v) for i, v in zip(ids, row) if not np.isnan(v)} for row in np.asarray(X, np.float64)]


def tool_scores(model_path, rows, raw=True):
    stdin = "".join(json.dumps(r, allow_nan=False) + "\n" for r in rows)
    out = run_tool("score", "--model", model_path, *(["--raw"] if raw else []), stdin=stdin).stdout
    return np.array([float(v) for v in out.split()])


def assert_same_bits(got, expected, what=""):
    got, expected = np.asarray(got, np.float64), np.asarray(expected, np.float64)
    assert got.shape == expected.shape, what
    differ = np.flatnonzero(got.view(np.int64) != expected.view(np.int64))
    assert differ.size == 0, f"{what} {differ.size} differ, first {got[differ[0]]!r} != {expected[differ[0]]!r}"


def from_bits(text):
    return struct.unpack(">d", bytes.fromhex(text))[0]


def model_text(version=4, tree_record=None):
    """A model text of one tree over feature 1: a leaf of 0.5 unless given."""
    def line(b):
        return base64.b64encode(b).decode() + "\n"
    if tree_record is None:
        tree_record = struct.pack("<d", 1.0) + b"C" + struct.pack("<d", 0.5) + struct.pack("<i", 0)
    parts = [struct.pack("<ii", 314156, version), struct.pack("<dI", 0.0, 1), tree_record, struct.pack("<I", 1),
             b"k1", struct.pack("<I", 1), struct.pack("<i", 1), struct.pack("<I", 0), struct.pack("<I", 0)]
    return "".join(line(p) for p in parts)


@pytest.fixture(scope="session")
def trained(tmp_path_factory):
    """A booster over features "1".."6", its JSON, its conversion (as a Model
    and a file) and the float32 split values of each feature."""
    import xgboost as xgb
    import reliqa

    rng = np.random.default_rng(7)
    X = rng.normal(size=(3000, 6)).astype(np.float32)
    X[:, 4] = np.round(X[:, 4] * 2)  # few distinct values
    y = (X[:, 0] + X[:, 1] * X[:, 2] - 0.5 * X[:, 4] + rng.normal(scale=0.7, size=len(X)) > 0).astype(int)
    booster = xgb.train({"objective": "binary:logistic", "max_depth": 4, "nthread": 1, "base_score": 0.3},
                        xgb.DMatrix(X, label=y, feature_names=[str(i) for i in range(1, 7)]), 25)
    raw = bytes(booster.save_raw(raw_format="json"))
    folder = tmp_path_factory.mktemp("trained")
    (folder / "model.json").write_bytes(raw)
    model = reliqa.Model.from_xgboost(booster)
    model.save(folder / "model.txt")
    splits = {f: [] for f in range(6)}
    for tree in json.loads(raw)["learner"]["gradient_booster"]["model"]["trees"]:
        for left, f, s in zip(tree["left_children"], tree["split_indices"], tree["split_conditions"]):
            if left != -1:
                splits[f].append(s)
    return SimpleNamespace(booster=booster, X=X, json=raw, json_path=folder / "model.json", model=model,
                           path=folder / "model.txt", splits={f: np.unique(np.float32(v)) for f, v in splits.items()})


@pytest.fixture(scope="session")
def golden():
    """A few hundred collections of all sizes and shapes with their features
    and example-model scores (bits of doubles), computed in Europe/Berlin."""
    with open(os.path.join(SOURCE, "tools", "reliqa", "testdata", "golden_collections.jsonl")) as f:
        return [json.loads(line) for line in f if line.strip()]


@pytest.fixture
def store(tmp_path):
    return tmp_path / "store.db"
