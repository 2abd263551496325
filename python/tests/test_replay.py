"""Replaying logged classifications: the candidate's scores are the tool's,
lines that cannot be read are counted and named, and the report is the same
in process, on one worker, on two, and when a worker dies mid-run."""

import gzip
import json
import os
import random
import re
import shutil
import signal
import subprocess
import sys
import threading
import time

import numpy as np
import pytest

import reliqa
from reliqa._replay_tally import GRID, MAX_LINE
from conftest import SOURCE, assert_same_bits, run_tool

distributed = pytest.importorskip("distributed")

LABEL = "opened"
MODELS = (("m-2024-05", "0.5"), ("m-2024-06", "0.35"))
# Lines that are not rows, with a part of the reason each is refused for.
BAD_LINES = [
    ("not JSON at all", "not JSON"),
    ('{"score":"0.5","model_id":"m","threshold":"0.5","opened":true}', "no logged feature_vector"),
    ('{"1":"x","opened":true}', "expected a number"),
    ('{"1":1,"01":2,"opened":false}', "feature 1 appears twice"),
    ('{"1":1,"2":3}', 'no label "opened"'),
    ('{"1":1,"opened":"yes"}', "expected true, false, 0 or 1"),
    ('{"1":1,"opened":true} trailing', "unexpected text after the end"),
    ('{"score":"0.5","model_id":"m","feature_vector":"[1,2]","threshold":"0.5","opened":0}',
     "feature_vector: expected a feature vector"),
    ('{"score":"NaN","model_id":"m","feature_vector":"{}","threshold":"0.5","opened":0}', "is not a finite number"),
    ('{"user":"u1","opened":true}', "neither a classification result"),
]


def number_texts(rng, x):
    """A feature value as the phone writes it, or in another valid form."""
    r = rng.random()
    if r < 0.05:
        return repr(float(round(x)))           # 3.0
    if r < 0.1:
        return f"{x:.20f}"                      # a long run of digits
    if r < 0.13:
        return f"{x:E}"                         # exponent
    if r < 0.15:
        return "-0"
    if r < 0.2:
        return str(int(round(x * 1000)))        # an integer
    return repr(float(x))


def feature_text(rng, values):
    keys = [str(i + 1) for i in range(len(values))]
    pairs = [(k, number_texts(rng, v)) for k, v in zip(keys, values) if not np.isnan(v)]
    rng.shuffle(pairs)
    if rng.random() < 0.1:
        pairs.append(("-7", "1.5"))             # ids the model does not read
        pairs.append(("0099", "2"))
    return "{" + ",".join(f'"{k}":{v}' for k, v in pairs) + "}"


@pytest.fixture(scope="module")
def logs(trained, tmp_path_factory):
    """Logged lines of every form, good and bad, over a plain and a gzip file.
    Per good line: its feature-vector text, logged score and threshold
    (None for a bare row) and label; per bad line: a part of its reason."""
    rng = random.Random(5)
    nrng = np.random.default_rng(5)
    X = nrng.normal(size=(2400, 6))
    X[nrng.random(X.shape) < 0.08] = np.nan
    y = (np.nan_to_num(X[:, 0]) + nrng.normal(scale=0.8, size=len(X)) > 0).astype(int)
    folder = tmp_path_factory.mktemp("logs")
    good, bad = [], []
    lines = []

    def add(text, fv=None, logged=None, threshold=None, label=None, why=None):
        lines.append(text)
        if why is None:
            good.append(dict(line=len(lines), fv=fv, logged=logged, threshold=threshold, label=label))
        else:
            bad.append(dict(line=len(lines), why=why))

    for i, (row, label) in enumerate(zip(X, y)):
        fv = feature_text(rng, row)
        model_id, threshold = MODELS[i % 2]
        # Some logged scores lie on the edges of the score grid, one on its threshold.
        score = rng.random() if rng.random() < 0.9 else rng.choice([0.25, 0.5, 0.75, float(threshold)])
        tag = [False, True, 0, 1][label + 2 * (i % 2)]
        r = rng.random()
        if r < 0.6:
            logging = [("score", repr(score)), ("model_id", model_id), ("feature_vector", fv),
                       ("threshold", threshold)]
            rng.shuffle(logging)
            text = json.dumps({"score": score, "isOverThreshold": score > float(threshold),
                               "loggingData": dict(logging), "user": f"u{i}", LABEL: tag}, separators=(",", ":"))
        elif r < 0.8:
            text = json.dumps({"collection": i, "score": repr(score), "model_id": model_id,
                               "feature_vector": json.loads(fv), "threshold": threshold, LABEL: tag})
            fv = json.dumps(json.loads(fv))
        else:
            text = fv[:-1] + ("," if fv != "{}" else "") + f'"{LABEL}":{json.dumps(tag)}' + "}"
            score, threshold = None, None
        add(text + ("\r" if i % 97 == 0 else ""), fv=fv, logged=score,
            threshold=None if threshold is None else float(threshold), label=label)
        if i % 211 == 0:
            lines.append("")
        if i % 150 == 7:
            text, why = BAD_LINES[(i // 150) % len(BAD_LINES)]
            add(text, why=why)
    half = len(lines) // 2
    plain = folder / "day-1.jsonl"
    plain.write_text("\n".join(lines[:half]) + "\n")
    packed = folder / "day-2.jsonl.gz"
    with gzip.open(packed, "wt") as f:
        f.write("\n".join(lines[half:]))  # no newline after the last line
    for entry in good + bad:
        entry["file"], entry["at"] = (plain, entry["line"]) if entry["line"] <= half else (packed, entry["line"] - half)
    return dict(folder=folder, files=[plain, packed], good=good, bad=bad, lines=lines, half=half)


@pytest.fixture(scope="module")
def expected(trained, logs):
    """The tool's score of every good line's feature vector."""
    stdin = "".join(g["fv"] + "\n" for g in logs["good"])
    out = run_tool("score", "--model", trained.path, stdin=stdin).stdout.split()
    return np.array([float(v) for v in out])


@pytest.fixture(scope="module")
def cluster():
    """A LocalCluster of two worker processes, shared by the tests of this module."""
    import logging

    with distributed.LocalCluster(n_workers=2, threads_per_worker=1, processes=True, dashboard_address=None,
                                  silence_logs=logging.ERROR) as c, distributed.Client(c) as client:
        yield client


def comparable(report):
    """The report without how it ran and how the model was given."""
    data = dict(report.data)
    del data["run"]
    data["candidate"] = {k: v for k, v in data["candidate"].items() if k != "model"}
    return data


def assert_same_report(a, b):
    assert json.dumps(comparable(a)) == json.dumps(comparable(b))
    for name in ("candidate", "logged", "verdicts"):
        assert np.array_equal(getattr(a.tally, name), getattr(b.tally, name)), name
    for who in ("candidate", "baseline"):
        if a.data.get("labels"):
            assert a.data["labels"]["auc"][who]["auc"].hex() == b.data["labels"]["auc"][who]["auc"].hex()


def test_candidate_scores_are_the_tools_and_both_readings_agree(trained, logs, expected):
    data = "\n".join(logs["lines"]).encode()
    quick = trained.model._native.replay_block(data, LABEL, 1, MAX_LINE, 100)
    careful = trained.model._native.replay_block(data, LABEL, 1, MAX_LINE, 100, True)
    for key in ("candidate", "logged", "threshold", "model", "label", "line"):
        assert np.array_equal(quick[key], careful[key], equal_nan=key in ("logged", "threshold")), key
    assert quick["reasons"] == careful["reasons"] and quick["models"] == careful["models"]
    good, bad = logs["good"], logs["bad"]
    assert list(quick["line"]) == [g["line"] for g in good]
    assert_same_bits(quick["candidate"], expected)
    logged = np.array([np.nan if g["logged"] is None else g["logged"] for g in good])
    assert_same_bits(quick["logged"], logged)
    assert list(quick["label"]) == [g["label"] for g in good]
    assert quick["refused"] == len(bad) and [line for line, _ in quick["reasons"]] == [b["line"] for b in bad]
    for (_, why), b in zip(quick["reasons"], bad):
        assert b["why"] in why, (why, b)
    # Without labels, the lines refused for theirs are rows.
    unlabeled = trained.model._native.replay_block(data, None, 1, MAX_LINE, 100)
    assert unlabeled["refused"] == sum("label" not in b["why"] and "true, false" not in b["why"] for b in bad)


def test_lines_too_long_and_numbers_the_tool_refuses(trained):
    native = trained.model._native
    lines = [b'{"1":' + b"1" * 400 + b"}", b'{"1":1e400}', b'{"1":0.25000000000000000000}',
             b'{"1":-0}', b'{"\\u0031":2}', b"{}"]
    for careful in (False, True):
        r = native.replay_block(b"\n".join(lines), None, 1, 300, 10, careful)
        assert [line for line, _ in r["reasons"]] == [1, 2]
        assert "longer than 300 bytes" in r["reasons"][0][1]
    rows = [b'{"1":0.25}', b'{"1":-0}', b'{"1":2}', b"{}"]
    tool = run_tool("score", "--model", trained.path, stdin=b"\n".join(rows).decode()).stdout.split()
    assert_same_bits(r["candidate"], [float(v) for v in tool])


def grid_suffix(scores):
    """Rows with a score at most k / GRID, for every k, straight from the scores."""
    return np.searchsorted(np.sort(scores), np.arange(GRID + 1) / GRID, side="right")


def test_report_is_the_same_in_process_on_one_worker_and_on_two(trained, logs, expected, cluster):
    files = [str(logs["folder"] / "*.jsonl"), str(logs["files"][1])]
    runs = {"in process": reliqa.replay(files, trained.model, label=LABEL, in_process=True, workers=2),
            "two workers": reliqa.replay(files, trained.path, label=LABEL, client=cluster, blocksize=20000)}
    with distributed.LocalCluster(n_workers=1, threads_per_worker=1, processes=True, dashboard_address=None) as c, \
            distributed.Client(c) as one:
        runs["one worker"] = reliqa.replay(files, trained.model, label=LABEL, client=one, blocksize=7000)
    first = runs["in process"]
    for name, report in runs.items():
        assert_same_report(first, report)
        assert report.data["run"]["tasks"] > (3 if name != "in process" else 1)

    # The counts are the scores': rows above each threshold of the grid, and
    # an AUC within its bound of the exact one.
    d, t = first.data, first.tally
    good = logs["good"]
    labels = np.array([g["label"] for g in good])
    has = np.array([g["logged"] is not None for g in good])
    above = t.candidate.sum(axis=(0, 1))[::-1].cumsum()[::-1]
    k = np.arange(1, GRID)
    assert np.array_equal(above[k], len(expected) - grid_suffix(expected)[k])
    pos, neg = np.sort(expected[labels == 1]), np.sort(expected[labels == 0])
    wins = np.searchsorted(neg, pos, side="left").sum() + 0.5 * (
        np.searchsorted(neg, pos, side="right") - np.searchsorted(neg, pos, side="left")).sum()
    exact = wins / (len(pos) * len(neg))
    a = d["labels"]["auc"]["candidate"]
    assert abs(a["auc"] - exact) <= a["error_bound"] and a["error_bound"] < 1e-3
    assert 0.6 < exact < 1.0
    assert d["rows"] == {"scored": len(good), "with_baseline": int(has.sum()), "bare": int((~has).sum())}
    assert d["logs"]["lines_read"] == len(good) + len(logs["bad"])
    models = {(m["model_id"], m["threshold"]): m["rows"] for m in d["baseline"]["models"]}
    assert sum(models.values()) == has.sum() and set(models) == {(m, float(t)) for m, t in MODELS}
    # Refusals name the file and line, across blocks and in the compressed file.
    assert d["logs"]["refused"] == len(logs["bad"])
    assert [r.split(": ", 1)[0] for r in d["logs"]["refusals"]] == [f"{b['file']}:{b['at']}"
                                                                    for b in logs["bad"][:10]]


def test_verdicts_and_flips_at_each_way_of_judging(trained, logs, expected):
    good = logs["good"]
    has = np.array([g["logged"] is not None for g in good])
    logged = np.array([g["logged"] if g["logged"] is not None else np.nan for g in good])
    threshold = np.array([g["threshold"] if g["threshold"] is not None else np.nan for g in good])
    labels = np.array([g["label"] for g in good])
    was = logged > threshold

    def check(report, now, judged):
        d = report.data
        assert d["flips"]["shown_to_hidden"] == int((was & ~now & has & judged).sum())
        assert d["flips"]["hidden_to_shown"] == int((~was & now & has & judged).sum())
        assert d["show_rate"]["candidate"] == int((now & judged).sum()) / int(judged.sum())
        assert d["show_rate"]["baseline"] == int(was[has].sum()) / int(has.sum())
        p = d["labels"]["at_verdicts"]["candidate"]
        assert p["true_positives"] == int((now & judged & (labels == 1)).sum())

    files = logs["files"]
    report = reliqa.replay(files, trained.model, label=LABEL, in_process=True)
    check(report, expected > threshold, has)
    curves = report.data["curves"]
    assert curves["baseline"]["show_rate"] == [(logged[has] > t).mean() for t in curves["thresholds"]]
    assert curves["candidate"]["show_rate"] == [(expected > t).mean() for t in curves["thresholds"]]
    assert report.data["judged_at"]["unjudged_rows"] == int((~has).sum())
    first = report.data["flips"]["examples"]["shown_to_hidden"][0]
    i = np.flatnonzero(was & (expected <= threshold) & has)[0]
    assert first["where"] == f"{good[i]['file']}:{good[i]['at']}" and first["candidate_score"] == expected[i]

    report = reliqa.replay(files, trained.model, label=LABEL, threshold=0.42, in_process=True)
    check(report, expected > 0.42, np.ones(len(good), bool))

    report = reliqa.replay(files, trained.model, label=LABEL, show_rate=0.3, in_process=True)
    t = report.data["judged_at"]["threshold"]
    rate = lambda t: (expected > t).mean()
    assert report.data["judged_at"]["met"] and rate(t) <= 0.3 < rate(t - 1 / GRID)
    check(report, expected > t, np.ones(len(good), bool))

    report = reliqa.replay(files, trained.model, label=LABEL, precision=0.8, in_process=True)
    t = report.data["judged_at"]["threshold"]
    precision = lambda t: labels[expected > t].mean()
    assert report.data["judged_at"]["met"] and precision(t) >= 0.8 > precision(t - 1 / GRID)
    check(report, expected > t, np.ones(len(good), bool))


def test_every_line_is_read_once_however_the_files_are_cut(trained, tmp_path, monkeypatch):
    """Lines across block edges, lines too long (refused, however they are
    cut), blank and CRLF lines, no newline at the end: the same counts and
    line numbers for any block size, and for a compressed copy read in small
    pieces."""
    from reliqa import _replay_tally

    rng = random.Random(11)
    lines = []
    for i in range(160):
        r = rng.random()
        if r < 0.1:
            lines.append("")
        elif r < 0.2:
            lines.append('{"1":' + "1" * rng.randint(200, 700) + ',"opened":true}')  # too long
        elif r < 0.3:
            lines.append("bad" * rng.randint(1, 30))
        else:
            lines.append(json.dumps({"1": rng.random(), "2": rng.random() * 10, LABEL: i % 3 == 0})
                         + ("\r" if i % 7 == 0 else ""))
    plain = tmp_path / "cut.jsonl"
    plain.write_text("\n".join(lines))
    packed = tmp_path / "cut.jsonl.gz"
    packed.write_bytes(gzip.compress(plain.read_bytes()))

    def counts(path, **kwargs):
        r = reliqa.replay(path, trained.model, label=LABEL, in_process=True, max_line=150, **kwargs)
        refusals = [line.split(":", 1)[1] for line in r.data["logs"]["refusals"]]  # without the file
        return r.tally.read, r.tally.refused, refusals, r.tally.candidate.tobytes(), r.data["logs"]["files"][0]["lines"]

    whole = counts(plain)
    assert whole[0] == sum(1 for l in lines if l.strip()) and whole[4] == len(lines)
    too_long = [i + 1 for i, l in enumerate(lines) if len(l) > 150]
    last = int(whole[2][-1].split(":")[0])
    assert [int(r.split(":")[0]) for r in whole[2] if "longer than 150 bytes" in r] == [i for i in too_long
                                                                                        if i <= last]
    for blocksize in (61, 150, 999):
        assert counts(plain, blocksize=blocksize) == whole, blocksize
    monkeypatch.setattr(_replay_tally, "STREAM_PIECE", 97)
    assert counts(packed) == whole


def test_a_worker_killed_mid_run_changes_nothing(trained, logs, cluster, tmp_path):
    big = tmp_path / "big.jsonl"
    big.write_bytes(logs["files"][0].read_bytes() * 6)
    expected = reliqa.replay(big, trained.model, label=LABEL, in_process=True)
    pids = cluster.run(os.getpid)
    outcome = {}

    def run():
        try:
            outcome["report"] = reliqa.replay(big, trained.model, label=LABEL, client=cluster, blocksize=16 << 10)
        except BaseException as e:  # reported below
            outcome["error"] = e

    runner = threading.Thread(target=run)
    runner.start()
    victim = None
    deadline = time.monotonic() + 60
    while victim is None and runner.is_alive() and time.monotonic() < deadline:
        # A worker that holds a finished tally: killing it loses work done.
        for worker, keys in cluster.has_what().items():
            if worker in pids and any(str(k).startswith("tally_block") for k in keys):
                victim = worker
                break
        time.sleep(0.005)
    assert victim is not None and runner.is_alive(), "the run ended before a worker could be killed"
    os.kill(pids[victim], signal.SIGKILL)
    runner.join(120)
    assert not runner.is_alive() and "error" not in outcome, outcome.get("error")
    assert_same_report(expected, outcome["report"])
    cluster.wait_for_workers(2, timeout=60)
    assert set(cluster.run(os.getpid).values()) != set(pids.values())


def test_bad_files_and_options_are_errors_that_name_them(trained, logs, tmp_path):
    broken = tmp_path / "broken.jsonl.gz"
    broken.write_bytes(gzip.compress(logs["files"][0].read_bytes())[:5000])
    cases = [
        (dict(logs=[logs["files"][0], broken]), f"{broken}: cannot be read"),
        (dict(logs=str(tmp_path / "nothing-*.jsonl")), "nothing-*.jsonl: no file matches"),
        (dict(logs=tmp_path / "absent.jsonl"), "absent.jsonl: cannot be read"),
        (dict(logs=tmp_path), "is a directory"),
        (dict(logs=logs["files"], threshold=0.5, show_rate=0.2), "at most one of"),
        (dict(logs=logs["files"], precision=0.9), "needs labels"),
        (dict(logs=logs["files"], label="feature_vector"), "not a label member"),
        (dict(logs=logs["files"], show_rate=1.5), "show_rate must lie in [0, 1]"),
    ]
    for kwargs, message in cases:
        logs_arg = kwargs.pop("logs")
        with pytest.raises(reliqa.ReplayError) as e:
            reliqa.replay(logs_arg, trained.model, in_process=True, **kwargs)
        assert message in str(e.value)


def test_command_line_on_a_separately_started_cluster(trained, logs, tmp_path):
    dask = shutil.which("dask")
    if dask is None:
        pytest.skip("no dask command")
    env = dict(os.environ)
    started = []
    try:
        info = tmp_path / "scheduler.json"
        started.append(subprocess.Popen([dask, "scheduler", "--host", "127.0.0.1", "--port", "0", "--no-dashboard",
                                         "--scheduler-file", str(info)], env=env, stdout=subprocess.DEVNULL,
                                        stderr=subprocess.DEVNULL))
        deadline = time.monotonic() + 60
        while not info.exists() and time.monotonic() < deadline:
            time.sleep(0.1)
        address = json.loads(info.read_text())["address"]
        # The worker finds the package through PYTHONPATH, as a cluster's would
        # through the installed wheel.
        started.append(subprocess.Popen([dask, "worker", address, "--nthreads", "1", "--no-dashboard"], env=env,
                                        stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL))
        out = tmp_path / "report"
        argv = [sys.executable, "-m", "reliqa", "replay", *map(str, logs["files"]), "--model", str(trained.path),
                "--label", LABEL, "--show-rate", "0.25", "--scheduler", address, "--out", str(out)]
        r = subprocess.run(argv, env=env, capture_output=True, text=True, timeout=180)
        assert r.returncode == 0, r.stderr
        assert "report: " in r.stdout and "candidate threshold" in r.stdout
        written = json.loads((out / "report.json").read_text())
        assert written["run"]["where"] == f"Dask scheduler {address}" and written["run"]["workers"] == 1
        here = reliqa.replay(logs["files"], trained.model, label=LABEL, show_rate=0.25, in_process=True)
        del written["run"]
        del written["candidate"]["model"]
        assert written == json.loads(json.dumps(comparable(here)))
        page = (out / "report.html").read_text()
        assert page.count("<svg") == 4 and not re.search(r'(src|href)="(https?:|//)', page)
    finally:
        for p in reversed(started):
            p.terminate()
            p.wait(30)
    r = subprocess.run([sys.executable, "-m", "reliqa", "replay", str(tmp_path / "absent.jsonl"), "--model",
                        str(trained.path), "--in-process"], env=env, capture_output=True, text=True, timeout=60)
    assert r.returncode == 2 and r.stderr.startswith("reliqa replay: ") and "absent.jsonl" in r.stderr
