"""Scores: bit for bit the tool's on arrays, rows and frames, for every
layout and thread count, and XGBoost's on converted models."""

import itertools
import json
import math

import numpy as np
import pandas as pd
import pytest
import xgboost as xgb

import reliqa
from conftest import assert_same_bits, model_text, rows_of, run_tool, tool_scores

IDS = [1, 2, 3, 4, 5, 6]
# Values beyond float32 become infinities in float32 copies, on purpose.
pytestmark = pytest.mark.filterwarnings("ignore:overflow encountered in cast:RuntimeWarning")


def edge_matrix(trained, n, seed):
    """Cells on and around split values, signed zeros, NaN, tiny, huge and
    ordinary values."""
    rng = np.random.default_rng(seed)
    columns = []
    for s in trained.splits.values():
        below = np.nextafter(s, np.float32(-np.inf))
        pool = np.concatenate([s, below, np.nextafter(s, np.float32(np.inf)),
                               (s.astype(np.float64) + below) / 2,  # halfway between two floats
                               [0.0, -0.0, np.nan, np.nan, 1e-45, -1e-300, 1e30, 1e300, -1e300, 3.4028235e38],
                               rng.normal(size=len(s))])
        columns.append(rng.choice(pool, n))
    return np.stack(columns, axis=1)


@pytest.fixture(scope="module")
def edges(trained):
    return edge_matrix(trained, 2000, seed=1)


def test_scores_are_the_tools(trained, edges):
    m, rows = trained.model, rows_of(edges, IDS)
    raw = m.predict(edges, output_margin=True)
    assert len(set(raw)) > 100
    assert_same_bits(raw, tool_scores(trained.path, rows))
    probability = m.predict(edges)
    assert_same_bits(probability, tool_scores(trained.path, rows, raw=False))
    assert_same_bits(probability, [1.0 / (math.exp(-r) + 1.0) for r in raw])
    assert_same_bits(m.predict_rows(rows, output_margin=True), raw)
    assert_same_bits(m.predict_rows([json.dumps(r) for r in rows], output_margin=True), raw)
    sentinel = np.where(np.isnan(edges), -999.0, edges)
    assert_same_bits(m.predict(sentinel, missing=-999.0, output_margin=True), raw)
    # Some columns only, and one the model does not read: the others read 0.
    X = np.column_stack([edges[:, 2], edges[:, 0], np.full(len(edges), 5.0)])
    assert_same_bits(m.predict(X, feature_ids=[3, "1", 99], output_margin=True),
                     tool_scores(trained.path, rows_of(X, [3, 1, 99])))


def test_nan_as_a_value_takes_the_nan_branches(trained, edges):
    routed = trained.model.predict(edges, missing=None, output_margin=True)
    rows = [dict(zip(IDS, row)) for row in edges]
    assert_same_bits(trained.model.predict_rows(rows, missing=None, output_margin=True), routed)
    absent = trained.model.predict(edges, output_margin=True)
    has_nan = np.isnan(edges).any(axis=1)
    assert_same_bits(routed[~has_nan], absent[~has_nan])
    assert (routed[has_nan] != absent[has_nan]).any()


def test_constant_model(tmp_path):
    (tmp_path / "leaf.txt").write_text(model_text())
    got = reliqa.Model.load(tmp_path / "leaf.txt").predict(np.ones((2000, 1)), output_margin=True, nthread=3)
    assert_same_bits(got, np.full(2000, tool_scores(tmp_path / "leaf.txt", [{"1": 3.0}])[0]))


def test_converted_models_agree_with_xgboost(trained, edges, tmp_path):
    # Training rows, and rows on and around every split value: XGBoost goes
    # left on x < s, the model text on x <= the float below s.
    on_splits = np.where(np.isnan(edges) | (np.abs(edges) > 1e30), 0.0, edges).astype(np.float32)
    X = np.concatenate([trained.X[:1000], on_splits])
    expected = trained.booster.inplace_predict(X)
    for source in (trained.booster, trained.json, trained.json_path):
        m = reliqa.Model.from_xgboost(source)
        assert m.text == trained.model.text
        np.testing.assert_allclose(m.predict(X), expected, rtol=0, atol=1e-6)
        assert ((m.predict(X) > 0.5) == (expected > 0.5)).all()
    run_tool("convert", "xgboost", trained.json_path, "-o", tmp_path / "t.txt")
    assert (tmp_path / "t.txt").read_bytes() == trained.model.text


def test_unnamed_features_take_the_given_ids(tmp_path):
    X = np.random.default_rng(3).normal(size=(800, 3)).astype(np.float32)
    booster = xgb.train({"objective": "binary:logistic", "max_depth": 3, "nthread": 1},
                        xgb.DMatrix(X, label=X[:, 0] > X[:, 2]), 10)
    m = reliqa.Model.from_xgboost(booster, feature_ids=[40, 7, "-2"])
    frame = pd.DataFrame({"-2": X[:, 2], 40: X[:, 0], "7": X[:, 1]})
    np.testing.assert_allclose(m.predict(frame), booster.predict(xgb.DMatrix(X)), rtol=0, atol=1e-6)
    booster.save_model(tmp_path / "u.json")
    run_tool("convert", "xgboost", "--feature-ids", "40,7,-2", tmp_path / "u.json", "-o", tmp_path / "u.txt")
    assert (tmp_path / "u.txt").read_bytes() == m.text


def test_every_thread_count_and_layout_gives_the_same_bits(trained):
    X = edge_matrix(trained, 5000, seed=2).astype(np.float32).astype(np.float64)
    wide = np.full((2 * len(X), 13), 7.0)
    wide[::2, 1::2] = X
    layouts = {"C": X, "Fortran": np.asfortranarray(X), "strided": wide[::2, 1::2], "float32": X.astype(np.float32)}
    for missing in (np.nan, None):
        expected = trained.model.predict(X, missing=missing, nthread=1)
        for (name, layout), nthread in itertools.product(layouts.items(), [1, 2, 3, 0]):
            got = trained.model.predict(layout, missing=missing, nthread=nthread)
            assert_same_bits(got, expected, f"{name}, nthread={nthread}, missing={missing}:")


def test_frames_map_columns_by_name(trained, edges):
    expected = trained.model.predict(edges)
    frame = pd.DataFrame(edges, columns=IDS)
    assert_same_bits(trained.model.predict(frame), expected)
    shuffled = pd.DataFrame({str(i) if i % 2 else i: frame[i] for i in (5, 1, 6, 3, 2, 4)}).assign(**{"17": 1.0})
    assert_same_bits(trained.model.predict(shuffled), expected)
    mixed = frame.astype({5: np.float32})
    mixed[1] = np.arange(len(frame))  # int64 among floats
    assert_same_bits(trained.model.predict(mixed), trained.model.predict(mixed.to_numpy(np.float64)))
    assert_same_bits(trained.model.predict(frame[[6, 2]]),
                     trained.model.predict(frame[[6, 2]].to_numpy(), feature_ids=[6, 2]))
