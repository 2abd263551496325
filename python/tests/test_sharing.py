"""Models and classifiers shared across threads and processes, and the other
number types that predict() takes."""

import pickle
import threading

import numpy as np
import pandas as pd

import reliqa
from conftest import EXAMPLES, assert_same_bits


def test_a_classifier_shared_by_threads_survives_set_model(store):
    with open(f"{EXAMPLES}/model.txt", "rb") as f:
        text = f.read()
    with open(f"{EXAMPLES}/collection.json") as f:
        collection = f.read()
    classifier = reliqa.Classifier(store)
    classifier.set_model(text, "m0", 0.5)
    expected = classifier.classify(collection)["score"]
    scores, failures, done = [], [], threading.Event()

    def classify():
        try:
            while not done.is_set():
                scores.append(classifier.classify(collection)["score"])
        except Exception as e:  # noqa: BLE001 - reported below
            failures.append(e)

    workers = [threading.Thread(target=classify) for _ in range(2)]
    for w in workers:
        w.start()
    for i in range(1, 60):
        classifier.set_model(text if i % 2 else b"", f"m{i}", 0.5)
    done.set()
    for w in workers:
        w.join()
    assert not failures and scores and set(scores) == {expected}
    assert classifier.model_id == "m59"


def test_models_pickle_as_their_text(trained):
    copy = pickle.loads(pickle.dumps(trained.model))
    assert copy.text == trained.model.text
    assert_same_bits(copy.predict(trained.X[:200]), trained.model.predict(trained.X[:200]))


def test_other_number_types_score_as_doubles(trained):
    X = np.round(trained.X[:300] * 4).astype(np.float64)
    expected = trained.model.predict(X)
    for other in (X.astype(np.int32), X.astype(">f8"), X.astype(np.float16)):
        assert_same_bits(trained.model.predict(other), trained.model.predict(other.astype(np.float64)))
    assert_same_bits(trained.model.predict(X.astype(np.int64)), expected)
    frame = pd.DataFrame(X, columns=range(1, 7)).astype("Int64")
    frame.iloc[0, 0] = pd.NA  # absent, as NaN is
    with_nan = X.copy()
    with_nan[0, 0] = np.nan
    assert_same_bits(trained.model.predict(frame), trained.model.predict(with_nan))


def test_missing_matches_float32_cells_by_their_own_value(trained):
    X = trained.X[:200].copy()
    X[::3, 2] = np.float32(-999.9)
    absent = X.astype(np.float64)
    absent[::3, 2] = np.nan
    expected = trained.model.predict(absent)
    assert_same_bits(trained.model.predict(X, missing=-999.9), expected)
    assert_same_bits(trained.model.predict(X.astype(np.float64), missing=float(np.float32(-999.9))), expected)
