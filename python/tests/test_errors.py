"""Refused input: a ValueError that says what and where, never a crash."""

import json
import os
import struct
import subprocess
import sys
import textwrap

import numpy as np
import pandas as pd
import pytest

import reliqa
from conftest import EXAMPLES, model_text, run_tool, tool_error

X6 = np.zeros((4, 6))
IDS = [1, 2, 3, 4, 5]


@pytest.mark.parametrize("call, pattern", [
    (lambda m: m.predict(np.full((4, 6), "a")), r"X must hold real numbers, got <U1"),
    (lambda m: m.predict(pd.DataFrame({1: [0.0], 2: pd.Categorical(["a"])})), r"column 2 holds category"),
    (lambda m: m.predict(np.zeros((4, 5))), r"X has 5 columns but the model reads 6 features"),
    (lambda m: m.predict(X6, feature_ids=[1, 2, 3]), r"X has 6 columns but feature_ids names 3"),
    (lambda m: m.predict(X6, feature_ids=IDS + ["01"]), r"items 0 and 5 both name feature id 1"),
    (lambda m: m.predict(X6, feature_ids=IDS + [2 ** 31]), r"item 5: feature id 2147483648 is outside"),
    (lambda m: m.predict(pd.DataFrame(X6, columns=IDS + ["six"])), r"column 5: .*'six' is not a decimal"),
    (lambda m: m.predict(pd.DataFrame({1: [0.0], 2: ["a"]})), r"column 2 holds object"),
    (lambda m: m.predict_rows([{1: 0.5}, {2: 1.0, 3: "x"}]), r"row 1, feature 3: a feature value is a number"),
    (lambda m: m.predict_rows([{1: 0.5}, {}, None]), r"row 2: a row is a dict or a JSON text"),
    (lambda m: m.predict_rows([{1: 0.5, "1": 2.0}]), r"row 0: feature id 1 is given twice"),
    (lambda m: m.predict_rows([{10 ** 30: 0.5}]), r"row 0: feature id 10{30} is outside"),
    (lambda m: m.predict_rows(['{"1": 0.5}', '{"2": "0.5"}']), r"row 1:1: feature 2: expected a number"),
])
def test_bad_scoring_input(trained, call, pattern):
    with pytest.raises(ValueError, match=pattern):
        call(trained.model)


def xgboost_json(objective="binary:logistic", names=()):
    tree = {"left_children": [1, -1, -1], "right_children": [2, -1, -1], "split_indices": [1, 0, 0],
            "split_conditions": [0.5, -0.25, 0.75], "split_type": [0, 0, 0], "tree_param": {"num_nodes": "3"}}
    return json.dumps({"learner": {
        "feature_names": list(names), "objective": {"name": objective},
        "learner_model_param": {"base_score": "5E-1", "num_feature": "3"},
        "gradient_booster": {"name": "gbtree", "model": {"trees": [tree]}}}}).encode()


def test_bad_models():
    with pytest.raises(ValueError, match=r"the model text: the model cannot be loaded: tree 0"):
        reliqa.Model(model_text(tree_record=struct.pack("<d", 1.0) + b"X"))
    with pytest.raises(ValueError, match=r'objective "multi:softprob" cannot be converted'):
        reliqa.Model.from_xgboost(xgboost_json("multi:softprob"))
    with pytest.raises(ValueError, match=r'feature name "a" is not an integer feature id'):
        reliqa.Model.from_xgboost(xgboost_json(names="abc"))
    assert list(reliqa.Model.from_xgboost(xgboost_json(), feature_ids=[5, 7, 9]).feature_ids) == [5, 7, 9]


def test_conversion_messages_name_the_feature_ids_argument():
    for names, ids in (((), None), ("abc", None), ((), [5, 7])):
        with pytest.raises(ValueError) as refused:
            reliqa.Model.from_xgboost(xgboost_json(names=names), feature_ids=ids)
        assert "feature_ids" in str(refused.value) and "--feature-ids" not in str(refused.value)


def test_conversion_writes_nothing_on_stdout(trained, capfd):
    reliqa.Model.from_xgboost(trained.json)
    assert capfd.readouterr().out == ""


def test_bad_collections_are_named_as_the_tool_names_them(tmp_path):
    with open(os.path.join(EXAMPLES, "collection.json")) as f:
        good = json.load(f)
    bad = json.loads(json.dumps(good))
    bad["assetDetails"][3]["pixelWidth"] = "wide"
    member = r"assetDetails\[3\]\.pixelWidth: expected a number, got a string"
    (tmp_path / "pretty.json").write_text(json.dumps(bad, indent=2))
    with pytest.raises(ValueError) as refused:
        reliqa.features(tmp_path / "pretty.json")
    assert str(refused.value) == tool_error(run_tool("features", tmp_path / "pretty.json", ok=False))
    (tmp_path / "c.jsonl").write_text(f"{json.dumps(good)}\n\n{json.dumps(bad)}\n")
    with pytest.raises(ValueError, match=rf"c\.jsonl:3: {member}"):
        reliqa.features(tmp_path / "c.jsonl")
    with pytest.raises(ValueError, match=rf"collection 1: {member}"):
        reliqa.features([good, json.dumps(bad)])
    with pytest.raises(ValueError, match=member):
        reliqa.Classifier(tmp_path / "s.db").classify(bad)


def test_nasty_input_never_crashes_the_interpreter(trained, tmp_path):
    # In a child process, so that a crash fails this test and not the run.
    script = textwrap.dedent(f"""
        import numpy as np, reliqa
        m = reliqa.Model.load({str(trained.path)!r})
        def attempt(call):
            try:
                call()
            except (ValueError, TypeError, OverflowError):
                pass
        assert m.predict(np.zeros((0, 6)), nthread=3).shape == (0,)
        assert m.predict(np.zeros((0, 0)), feature_ids=[]).shape == (0,)
        assert m.predict_rows([]).shape == (0,) and reliqa.features([]).shape == (0, 74)
        assert m.predict(np.zeros((3000, 6))[::-1, ::-1], nthread=4).shape == (3000,)
        for key in (2 ** 63, -2 ** 63 - 1, 10 ** 100, "99999999999", "", "1e3", b"1", None):
            attempt(lambda: m.predict_rows([{{key: 1.0}}]))
            attempt(lambda: m.predict(np.zeros((2, 1)), feature_ids=[key]))
        for row in (None, 5, [1, 2], b"\\xff\\xfe", "", "[1]", '{{"1": 1e999}}', '{{"1": {{}}}}'):
            attempt(lambda: m.predict_rows([row]))
        attempt(lambda: m.predict(np.zeros((2, 6)), nthread=2 ** 70))
        attempt(lambda: reliqa.Model(b"\\x00" * 1000))
        attempt(lambda: reliqa.Model.from_xgboost(b"[]"))
        c = reliqa.Classifier({str(tmp_path / "s.db")!r})
        for bad in ("", "[]", "null", b"\\xff", '{{"collectionID": 1}}', {{"assetDetails": [None]}}):
            attempt(lambda: c.classify(bad))
            attempt(lambda: reliqa.features([bad]))
        for features in ({{"1": {{}}}}, {{None: 1}}, {{1: [1]}}, {{1: "1" * 400}}):
            attempt(lambda: c.set_server_features(features))
        print("survived")
    """)
    r = subprocess.run([sys.executable, "-c", script], capture_output=True, text=True, timeout=120)
    assert r.returncode == 0 and r.stdout.endswith("survived\n"), r.stderr[-3000:]
