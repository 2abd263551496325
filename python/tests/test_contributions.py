"""Contributions: XGBoost's own on converted models, the score they add up
to on any model, the same bits for every thread count and after pickling,
and clear refusals."""

import json
import os
import pickle

import numpy as np
import pandas as pd
import pytest
import xgboost as xgb

import reliqa
from conftest import EXAMPLES, assert_same_bits

IDS = [1, 2, 3, 4, 5, 6]


def rows_without_nan(trained, n, seed):
    """Ordinary values and values on split points, where the branches turn."""
    rng = np.random.default_rng(seed)
    X = rng.normal(size=(n, 6)).astype(np.float32)
    for f, s in trained.splits.items():
        on = rng.random(n) < 0.3
        X[on, f] = rng.choice(s, on.sum())
    return X


def assert_add_up(model, X, contributions, **kwargs):
    raw = model.predict(X, output_margin=True, **kwargs)
    scale = np.abs(contributions[:, :-1]).sum(axis=1)
    assert np.all(np.abs(contributions.sum(axis=1) - raw) <= 1e-9 * np.maximum(scale, 1e-300))


def test_trainer_covers_give_xgboosts_contributions(trained):
    X = rows_without_nan(trained, 1500, seed=3)
    ours = trained.model.contributions(X)
    theirs = trained.booster.predict(xgb.DMatrix(X, feature_names=[str(i) for i in IDS]), pred_contribs=True)
    assert ours.shape == theirs.shape == (len(X), 7)
    np.testing.assert_allclose(ours, theirs, rtol=0, atol=1e-5)
    assert_add_up(trained.model, X, ours)
    # Columns named in another order, as an array or a frame, give the same
    # contributions in the model's order.
    order = [3, 0, 5, 1, 4, 2]
    shuffled = trained.model.contributions(X[:, order], feature_ids=[IDS[i] for i in order])
    assert_same_bits(shuffled, ours)
    frame = pd.DataFrame(X[:, order], columns=[str(IDS[i]) for i in order])
    assert_same_bits(trained.model.contributions(frame), ours)


def test_background_covers_on_the_example_model(golden):
    model = reliqa.Model.load(os.path.join(EXAMPLES, "model.txt"))
    features = reliqa.features([c["collection"] for c in golden])  # a frame named by feature ids
    background, X = features.iloc[:200], features.iloc[200:]
    got = model.contributions(X, background=background)
    assert got.shape == (len(X), len(model.feature_ids) + 1)
    assert_add_up(model, X, got)
    # The bias is the expectation over the covers: the same for every row.
    assert np.all(got[:, -1] == got[0, -1])


def test_threads_layouts_and_pickling_keep_the_bits(trained):
    X = rows_without_nan(trained, 700, seed=5)
    X[::7, 2] = np.nan
    one = trained.model.contributions(X, nthread=1)
    assert_same_bits(trained.model.contributions(X, nthread=2), one)
    assert_same_bits(trained.model.contributions(np.asfortranarray(X.astype(np.float64))), one)
    assert_same_bits(trained.model.contributions(X[::-1])[::-1], one)
    copy = pickle.loads(pickle.dumps(trained.model))
    assert_same_bits(copy.contributions(X), one)
    # One row alone gives its row of a block.
    assert_same_bits(trained.model.contributions(X[5:6])[0], one[5])


def test_refusals_say_what_to_do(trained):
    X = rows_without_nan(trained, 10, seed=9)
    text_only = reliqa.Model(trained.model.text)
    with pytest.raises(ValueError, match="background=.*from_xgboost"):
        text_only.contributions(X)
    with pytest.raises(ValueError, match="background has no rows"):
        text_only.contributions(X, background=X[:0])
    with pytest.raises(ValueError, match="background has 5 columns"):
        text_only.contributions(X, background=X[:, :5])
    with pytest.raises(ValueError, match="X has 4 columns but feature_ids names 6"):
        trained.model.contributions(X[:, :4], feature_ids=IDS)
    with pytest.raises(ValueError, match="nthread"):
        trained.model.contributions(X, nthread=-5)
    # A background counted over rows replaces the trainer's covers.
    assert not np.array_equal(trained.model.contributions(X, background=X), trained.model.contributions(X))


def test_nan_rows_match_xgboost_where_default_directions_agree(trained):
    """NaN takes our trees' NaN branches (with missing=None): right at the
    root, left below. XGBoost sends it the way each split learned. Given a
    copy of the XGBoost model whose default directions are ours, the two
    agree on rows with NaN too; with the learned ones they may not."""
    rng = np.random.default_rng(11)
    X = rows_without_nan(trained, 800, seed=13)
    X[rng.random(X.shape) < 0.25] = np.nan
    doc = json.loads(trained.json)
    trees = doc["learner"]["gradient_booster"]["model"]["trees"]
    learned = [t["default_left"][:] for t in trees]
    for t in trees:
        t["default_left"] = [0] + [1] * (len(t["default_left"]) - 1)
    ours_directions = xgb.Booster()
    ours_directions.load_model(bytearray(json.dumps(doc).encode()))
    names = [str(i) for i in IDS]
    ours = trained.model.contributions(X, missing=None)
    theirs = ours_directions.predict(xgb.DMatrix(X, feature_names=names), pred_contribs=True)
    np.testing.assert_allclose(ours, theirs, rtol=0, atol=1e-5)
    # The trained model's own directions differ from ours at some splits,
    # and then the contributions of some NaN rows differ.
    assert any(d != e for t, l in zip(trees, learned) for d, e in zip(t["default_left"], l))
    trained_contribs = trained.booster.predict(xgb.DMatrix(X, feature_names=names), pred_contribs=True)
    assert np.abs(ours - trained_contribs).max() > 1e-3
