"""Features and classifications of collections, against the tool's and over
the same store in both directions."""

import json
import os
import re
import runpy
import struct
import time

import numpy as np
import pytest

import reliqa
from conftest import EXAMPLES, assert_same_bits, from_bits, model_text, run_tool, tool_error

MODEL = os.path.join(EXAMPLES, "model.txt")
COLLECTION = os.path.join(EXAMPLES, "collection.json")


def example():
    with open(COLLECTION) as f:
        return json.load(f)


def as_matrix(maps):
    X = np.full((len(maps), 74), np.nan)
    for r, features in enumerate(maps):
        for k, v in features.items():
            X[r, int(k) - 1] = v
    return X


@pytest.fixture(scope="module")
def collections(golden):
    make_collection = runpy.run_path(os.path.join(EXAMPLES, "synth.py"))["make_collection"]
    rng = np.random.RandomState(5)
    return [r["collection"] for r in golden] + [make_collection(rng, i)[0] for i in range(30)]


def jsonl(collections):
    return "".join(json.dumps(c) + "\n" for c in collections)


def test_features_are_the_tools(collections, tmp_path):
    maps = [json.loads(l) for l in run_tool("features", "-", stdin=jsonl(collections)).stdout.splitlines()]
    frame = reliqa.features(collections)
    assert list(frame.columns) == list(range(1, 75)) and (frame.dtypes == np.float64).all()
    assert_same_bits(frame.to_numpy().ravel(), as_matrix(maps).ravel())
    assert sum("2" not in m for m in maps) > 10  # no location: NaN, not 0
    path = tmp_path / "c.jsonl"
    path.write_text(jsonl(collections[:20]).replace("\n", "\n\n", 3))
    assert_same_bits(reliqa.features(path).to_numpy().ravel(), frame[:20].to_numpy().ravel())
    texts = [json.dumps(c).encode() for c in collections[:5]]
    assert_same_bits(reliqa.features(texts).to_numpy().ravel(), frame[:5].to_numpy().ravel())
    one = json.loads(run_tool("features", COLLECTION).stdout)  # one pretty-printed collection
    assert_same_bits(reliqa.features(COLLECTION).to_numpy()[0], as_matrix([one])[0])


def test_features_and_scores_follow_the_zone_of_the_call(golden):
    collections = [r["collection"] for r in golden]
    os.environ["TZ"] = "Europe/Berlin"
    time.tzset()
    try:
        berlin = reliqa.features(collections)
    finally:
        os.environ["TZ"] = "UTC"
        time.tzset()
    expected = as_matrix([{k: from_bits(v) for k, v in r["features"].items()} for r in golden])
    assert_same_bits(berlin.to_numpy().ravel(), expected.ravel())
    model = reliqa.Model.load(MODEL)
    assert_same_bits(model.predict(berlin, output_margin=True), [from_bits(r["rawScore"]) for r in golden])
    assert_same_bits(model.predict(berlin, nthread=2), [from_bits(r["score"]) for r in golden])
    assert (reliqa.features(collections).to_numpy() != berlin.to_numpy()).any()


def tool_classify(store, collections):
    return [json.loads(l) for l in run_tool("classify", "-", stdin=jsonl(collections), store=store).stdout.splitlines()]


def test_classifier_and_tool_share_the_store(collections, store):
    sample = collections[::7]
    run_tool("set-model", "--model", MODEL, "--model-id", "tool-set", "--threshold", "0.625", store=store)
    classifier = reliqa.Classifier(store)
    assert classifier.model_id == "tool-set"
    results = [classifier.classify(c) for c in sample]
    assert results == tool_classify(store, sample)
    assert {r["isOverThreshold"] for r in results} == {True, False}
    assert classifier.classify(json.dumps(sample[3])) == results[3]
    with open(MODEL) as f:
        classifier.set_model(f.read(), "python-set", 0.25)
    assert run_tool("model-id", store=store).stdout == "python-set\n"
    again = [classifier.classify(c) for c in sample]
    assert again == tool_classify(store, sample)
    assert {r["loggingData"]["threshold"] for r in again} == {"0.25"}
    classifier.set_model("", "renamed", 0.5)  # keeps the model
    assert [r["score"] for r in tool_classify(store, sample)] == [r["score"] for r in again]
    run_tool("set-model", "--model-id", "tool-again", "--threshold", "0.5", store=store)
    assert classifier.model_id == "tool-again"


def test_server_features_are_the_tools(tmp_path):
    given = {1: 21.5, "75": "0.8", "01": "7", "-4": 1.25, 300: 2, "12": " 3e2", 5: -0.0, "x": "abc"}
    ours, theirs = tmp_path / "ours.db", tmp_path / "theirs.db"
    reliqa.Classifier(ours).set_server_features(given)
    (tmp_path / "sf.json").write_text(json.dumps({str(k): v for k, v in given.items()}))
    run_tool("set-server-features", tmp_path / "sf.json", store=theirs)
    results = [reliqa.Classifier(s).classify(example()) for s in (ours, theirs)]
    assert results[0] == results[1] == json.loads(run_tool("classify", COLLECTION, store=ours).stdout)
    used = json.loads(results[0]["loggingData"]["feature_vector"])
    assert [used[k] for k in ("1", "75", "-4", "300", "12", "0")] == [21.5, 0.8, 1.25, 2, 300, 0]


@pytest.mark.parametrize("ours, theirs, pattern", [
    ({2: float("nan")}, '{"2": "nan"}', r'feature "2": value "nan" reads as NaN'),
    ({"2": float("-inf")}, '{"2": "-inf"}', r'feature "2": value "-inf" reads as infinity'),
    ({12: 2 ** 60}, '{"12": 1152921504606846976}', r'feature "12": value "1152921504606846976" cannot be stored'),
])
def test_refused_server_features_leave_the_store_alone(ours, theirs, pattern, store, tmp_path):
    classifier = reliqa.Classifier(store)
    classifier.set_server_features({1: 3.5})
    before = classifier.classify(example())
    with pytest.raises(ValueError, match=pattern):
        classifier.set_server_features(ours)
    (tmp_path / "sf.json").write_text(theirs)
    assert re.search(pattern, tool_error(run_tool("set-server-features", tmp_path / "sf.json", store=store, ok=False)))
    assert classifier.classify(example()) == before
    assert json.loads(run_tool("classify", COLLECTION, store=store).stdout) == before


def test_refused_models_leave_the_store_alone(store):
    classifier = reliqa.Classifier(store)
    with open(MODEL) as f:
        classifier.set_model(f.read(), "good", 0.5)
    before = classifier.classify(example())
    with pytest.raises(ValueError, match=r"the model cannot be loaded: tree 0 .*malformed"):
        classifier.set_model(model_text(tree_record=struct.pack("<d", 1.0) + b"X"), "bad", 0.9)
    with pytest.raises(ValueError, match=r"threshold must be a finite number"):
        classifier.set_model("", "bad", float("nan"))
    assert classifier.model_id == "good" and run_tool("model-id", store=store).stdout == "good\n"
    assert classifier.classify(example()) == before
    with pytest.warns(UserWarning, match=r"format version 7 is not 2, 3 or 4"):
        classifier.set_model(model_text(version=7), "v7", 0.5)
    assert run_tool("model-id", store=store).stdout == "v7\n"
