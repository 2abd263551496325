#!/usr/bin/python3
"""End-to-end tests of the reliqa tool, run as a user runs it.

    cli_test.py BUILD/bin/reliqa REPO_ROOT

A cross build sets RELIQA_EMULATOR to the program that runs the tool on this
machine; every run of the tool then goes through it.

Covers the error paths (one test per kind of bad input: exit status 2, one
"reliqa: FILE:LINE: ..." line, nothing on standard output, nothing stored),
JSON Lines streaming, the guard that keeps a rejected model out of the store,
the default store location, and the explanations of scores (sums, refusals,
the waterfall chart).
"""

import base64
import json
import os
import random
import re
import select
import shutil
import sqlite3
import struct
import subprocess
import sys
import tempfile
import unittest
import xml.etree.ElementTree as ET

RELIQA = None  # the command that runs the tool: [emulator] + [path]
ROOT = None
MAGIC = 314156


def model_text(version=4, tree_record=None):
    """A model text with one tree (a single leaf of 0.5 unless given)."""
    def line(b):
        return base64.b64encode(b).decode() + "\n"
    if tree_record is None:
        tree_record = struct.pack("<d", 1.0) + b"C" + struct.pack("<d", 0.5) + struct.pack("<i", 0)
    text = line(struct.pack("<ii", MAGIC, version)) + line(struct.pack("<dI", 0.0, 1)) + line(tree_record)
    text += line(struct.pack("<I", 1)) + line(b"k1")
    if version in (3, 4):
        text += line(struct.pack("<I", 1)) + line(struct.pack("<i", 1)) + line(struct.pack("<I", 0))
    if version == 4:
        text += line(struct.pack("<I", 0))
    return text


def collection(assets=2, **extra):
    c = {
        "collectionID": "c1", "timeSinceStory": 3.5, "locationInfo": None, "assetCounts": None,
        "assetDetails": [{
            "assetID": f"a{i}", "assetType": "photo", "creationDateSinceEpoch": 1700000000 + 3600 * i,
            "modificationDateSinceEpoch": -1, "pixelWidth": 4032, "pixelHeight": 3024, "latitude": 38.7,
            "longitude": -9.1, "videoDuration": 0, "isFavorite": i % 2, "isHidden": 0, "mediaSubtypes": 0,
            "sourceType": 1, "blurrinessMetric": {"isCalculated": True, "value": 0.1 * i},
            "darknessMetric": {"isCalculated": False, "value": 0}} for i in range(assets)],
        "duplicateInfos": [],
    }
    c.update(extra)
    return c


class Tool(unittest.TestCase):
    def setUp(self):
        self.dir = tempfile.mkdtemp(prefix="reliqa-cli-")
        self.store = os.path.join(self.dir, "store.db")
        self.env = dict(os.environ, TZ="UTC", HOME=self.dir, XDG_DATA_HOME=os.path.join(self.dir, "xdg"))

    def tearDown(self):
        shutil.rmtree(self.dir, ignore_errors=True)

    def path(self, name, content=None):
        p = os.path.join(self.dir, name)
        if content is not None:
            with open(p, "w") as f:
                f.write(content if isinstance(content, str) else json.dumps(content, indent=1))
        return p

    def run_tool(self, *args, stdin=None, store=True):
        argv = RELIQA + (["--store", self.store] if store else []) + list(args)
        return subprocess.run(argv, input=stdin, capture_output=True, text=True, env=self.env, timeout=60)

    def ok(self, *args, **kw):
        r = self.run_tool(*args, **kw)
        self.assertEqual(r.returncode, 0, r.stderr)
        return r.stdout

    def refused(self, *args, pattern, **kw):
        """Exit 2, nothing on standard output, and a 'reliqa: ...' line matching pattern."""
        r = self.run_tool(*args, **kw)
        self.assertEqual(r.returncode, 2, r.stderr)
        self.assertEqual(r.stdout, "")
        lines = [l for l in r.stderr.splitlines() if l.startswith("reliqa: ")]
        self.assertEqual(len(lines), 1, r.stderr)
        self.assertRegex(lines[0], pattern)
        return lines[0]

    def classify(self, coll):
        return json.loads(self.ok("classify", self.path("c.json", coll)))


class UsageErrors(Tool):
    def test_help_exits_zero_on_every_subcommand(self):
        for cmd in ([], ["set-model"], ["classify"], ["score"], ["explain"], ["pdp"], ["convert", "xgboost"]):
            r = self.run_tool(*cmd, "--help")
            self.assertEqual(r.returncode, 0)
            self.assertIn("Usage:", r.stdout)

    def test_bad_command_lines_exit_2_and_point_to_help(self):
        cases = [
            (["bogus"], r"unknown command 'bogus'; see 'reliqa --help'"),
            (["classify", "--frobnicate", "x"], r"classify: .*--frobnicate.*; see 'reliqa classify --help'"),
            (["classify"], r"classify: FILE is required"),
            (["set-model", "--model-id", "x", "--threshold", "abc"], r"set-model: .*--threshold.*abc"),
            (["set-model", "--model-id", "x", "--threshold", "nan"], r"--threshold must be a finite number"),
            (["pdp", "m", "--feature", "1", "--from", "2", "--to", "1", "--steps", "5"], r"--from below --to"),
            (["convert", "xgboost", "m.json", "-o", "x", "--feature-ids", "1;2"], r"--feature-ids"),
        ]
        for argv, pattern in cases:
            with self.subTest(argv=argv):
                self.refused(*argv, pattern=pattern)


class BadInput(Tool):
    def test_malformed_json_names_file_and_line(self):
        p = self.path("bad.json", '{\n  "collectionID": "x",\n  "timeSinceStory": 1,,\n}')
        self.refused("classify", p, pattern=re.escape(p) + r":3: ")

    def test_missing_and_mistyped_fields(self):
        c = collection()
        del c["duplicateInfos"]
        self.refused("classify", self.path("m.json", c), pattern=r"m\.json:1: missing member duplicateInfos")
        c = collection()
        c["assetDetails"][1]["pixelWidth"] = "wide"
        self.refused("features", self.path("t.json", c),
                     pattern=r"t\.json:\d+: assetDetails\[1\]\.pixelWidth: expected a number, got a string")

    def test_unreadable_files(self):
        missing = os.path.join(self.dir, "nope.json")
        self.refused("classify", missing, pattern=re.escape(missing) + r": cannot open: No such file")
        self.refused("score", "--model", missing, pattern=r"nope\.json: cannot open")
        self.refused("inspect", self.dir, pattern=r"cannot read: Is a directory")

    def test_bad_feature_rows_and_server_features(self):
        m = self.path("m.txt", model_text())
        self.refused("score", "--model", m, stdin='\n{"1":"x"}\n{"1":2}\n',
                     pattern=r"<stdin>:2: feature 1: expected a number, got a string")
        self.refused("set-server-features", self.path("sf.json", '{"1": "0.5",\n "2": true}'),
                     pattern=r"sf\.json:2: feature \"2\": expected a number text")

    def test_unconvertible_xgboost_models(self):
        j = {"learner": {"objective": {"name": "multi:softprob"}, "gradient_booster": {"name": "gbtree"},
                         "learner_model_param": {"num_class": "3", "num_feature": "2", "base_score": "5E-1"}}}
        self.refused("convert", "xgboost", self.path("x.json", j), "-o", self.path("out.txt"),
                     pattern=r"x\.json: objective \"multi:softprob\" cannot be converted")
        self.assertFalse(os.path.exists(os.path.join(self.dir, "out.txt")))

    def test_classification_failure_is_reported_not_crashed(self):
        c = collection(2)
        for a in c["assetDetails"]:
            a["latitude"] = 1e308
        out = self.run_tool("classify", self.path("inf.json", c))
        # The mean of two huge latitudes overflows to infinity, which JSON cannot hold.
        self.assertEqual(out.returncode, 2, out.stderr)
        self.assertRegex(out.stderr, r"reliqa: .*inf\.json:1: classification failed: .*INF")


class Conversion(Tool):
    def test_feature_ids_name_the_features_of_an_unnamed_model(self):
        tree = {"left_children": [1, -1, -1], "right_children": [2, -1, -1], "split_indices": [1, 0, 0],
                "split_conditions": [0.5, -0.25, 0.75], "split_type": [0, 0, 0], "tree_param": {"num_nodes": "3"}}
        m = {"learner": {"feature_names": [], "objective": {"name": "binary:logistic"},
                         "learner_model_param": {"base_score": "5E-1", "num_feature": "3"},
                         "gradient_booster": {"name": "gbtree", "model": {"trees": [tree]}}}}
        x, out = self.path("x.json", m), self.path("x.txt")
        self.refused("convert", "xgboost", x, "-o", out, pattern=r"no feature names.*--feature-ids")
        self.refused("convert", "xgboost", "--feature-ids", "5,7", x, "-o", out, pattern=r"gives 2 ids .* 3 features")
        self.ok("convert", "xgboost", "--feature-ids", "5, 7,9", x, "-o", out)  # the model may follow the ids
        self.assertRegex(self.ok("inspect", out), r"feature mapping +3: 5, 7, 9")


class ModelGuard(Tool):
    def test_rejected_model_never_reaches_the_store(self):
        good = self.path("good.txt", model_text())
        self.ok("set-model", "--model", good, "--model-id", "good", "--threshold", "0.25")
        before = self.classify(collection())
        corrupt = model_text(tree_record=struct.pack("<d", 1.0) + b"X")
        for args, pattern in [
            (["--model", self.path("bad.txt", corrupt)], r"bad\.txt: the model cannot be loaded: .*tree"),
            (["--model", "-"], r"<stdin>: the model cannot be loaded"),
            (["--model", os.path.join(self.dir, "missing.txt")], r"missing\.txt: cannot open"),
        ]:
            with self.subTest(args=args):
                self.refused("set-model", *args, "--model-id", "bad", "--threshold", "0.9", stdin=corrupt,
                             pattern=pattern)
                self.assertEqual(self.ok("model-id"), "good\n")
                self.assertEqual(self.classify(collection()), before)

    def test_a_store_holding_an_unloadable_model_can_be_repaired(self):
        good = self.path("good.txt", model_text())
        self.ok("set-model", "--model", good, "--model-id", "good", "--threshold", "0.25")
        with sqlite3.connect(self.store) as db:  # as if written by some other means
            db.execute("UPDATE entries SET value = ? WHERE key = 'RELIQA_model'",
                       (model_text(tree_record=struct.pack("<d", 1.0) + b"X").encode(),))
        self.refused("classify", self.path("c.json", collection()), pattern=r"the stored model cannot be loaded")
        self.refused("set-model", "--model-id", "x", "--threshold", "0.5",
                     pattern=r"give a replacement with --model FILE")
        r = self.run_tool("set-model", "--model", good, "--model-id", "fixed", "--threshold", "0.5")
        self.assertEqual(r.returncode, 0, r.stderr)
        self.assertIn("replacing it", r.stderr)
        self.assertEqual(self.classify(collection())["loggingData"]["model_id"], "fixed")

    def test_accepted_but_unusual_models_warn(self):
        r = self.run_tool("set-model", "--model", self.path("v7.txt", model_text(version=7)), "--model-id", "v7",
                          "--threshold", "0.5")
        self.assertEqual(r.returncode, 0, r.stderr)
        self.assertRegex(r.stderr, r"warning: .*v7\.txt: format version 7 is not 2, 3 or 4")
        self.assertEqual(self.ok("model-id"), "v7\n")
        self.assertEqual(self.classify(collection())["score"], 0.5)

    def test_empty_model_changes_only_id_and_threshold(self):
        self.ok("set-model", "--model", self.path("good.txt", model_text()), "--model-id", "a", "--threshold", "0.1")
        score = self.classify(collection())["score"]
        self.ok("set-model", "--model", self.path("empty.txt", ""), "--model-id", "b", "--threshold", "0.99")
        r = self.classify(collection())
        self.assertEqual((r["score"], r["isOverThreshold"]), (score, False))
        self.assertEqual((r["loggingData"]["model_id"], r["loggingData"]["threshold"]), ("b", "0.99"))

    def test_server_features_replace_and_refusals_keep_them(self):
        self.ok("set-server-features", self.path("sf.json", {"300": 2, "1": "9.5", "01": "7", "-4": 1}))
        fv = json.loads(self.classify(collection())["loggingData"]["feature_vector"])
        self.assertEqual((fv["1"], fv["300"], fv["-4"]), (9.5, 2, 1))
        self.assertEqual(list(fv), [str(i) for i in sorted(int(k) for k in fv)])  # members by ascending id
        before = self.classify(collection())
        self.refused("set-server-features", self.path("nan.json", {"2": "nan"}), pattern=r"reads as NaN")
        # Values the store would keep but never give back: every later classify would fail.
        for key, value in [("12", "1152921504606846976"), ("3", "9223372036854775808"),
                           ("3", "-9223372036854775809")]:
            with self.subTest(value=value):
                self.refused("set-server-features", self.path("big.json", {key: value}),
                             pattern=r'big\.json:2: feature "%s": value "%s" cannot be stored: it would not read back \(.+\)$'
                             % (key, value))
                self.assertEqual(self.classify(collection()), before)


class Streaming(Tool):
    def test_each_line_is_answered_before_the_next_arrives(self):
        p = subprocess.Popen(RELIQA + ["--store", self.store, "classify", "-"], stdin=subprocess.PIPE,
                             stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, text=True, env=self.env)
        try:
            for i in range(3):
                p.stdin.write(json.dumps(collection(i + 1)) + "\n")
                p.stdin.flush()
                ready, _, _ = select.select([p.stdout], [], [], 20)
                self.assertTrue(ready, "no answer while the input stays open")
                self.assertEqual(json.loads(p.stdout.readline())["score"], 1)
            p.stdin.close()
            self.assertEqual(p.stdout.read(), "")
            self.assertEqual(p.wait(20), 0)
        finally:
            p.kill()
            p.stdout.close()

    def test_answers_in_order_until_a_bad_line(self):
        lines = [json.dumps(collection(1)), "", json.dumps(collection(3)), '{"collectionID": 5}',
                 json.dumps(collection(2))]
        r = self.run_tool("features", "-", stdin="\n".join(lines) + "\n")
        self.assertEqual(r.returncode, 2)
        out = [json.loads(l) for l in r.stdout.splitlines()]
        self.assertEqual([o["4"] for o in out], [0, 0])  # two answers, then the refusal
        self.assertEqual([o["25"] for o in out], [4032, 4032])
        self.assertRegex(r.stderr, r"reliqa: <stdin>:4: collectionID: expected a string, got a number")

    def test_score_streams_rows_with_crlf_and_no_final_newline(self):
        m = self.path("m.txt", model_text())
        out = self.ok("score", "--model", m, "--raw", stdin='{"1":1}\r\n\n{}')
        self.assertEqual(out, "0.5\n0.5\n")


class Store(Tool):
    def test_default_store_follows_xdg_and_home(self):
        self.ok("set-model", "--model-id", "xdg", "--threshold", "0.5", store=False)
        self.assertTrue(os.path.exists(os.path.join(self.dir, "xdg", "reliqa", "store.db")))
        del self.env["XDG_DATA_HOME"]
        self.ok("set-model", "--model-id", "home", "--threshold", "0.5", store=False)
        self.assertTrue(os.path.exists(os.path.join(self.dir, ".local", "share", "reliqa", "store.db")))
        self.assertEqual(self.ok("model-id", store=False), "home\n")

    def test_classify_output_shape(self):
        self.ok("set-model", "--model", self.path("m.txt", model_text()), "--model-id", "m\"1", "--threshold",
                "0.5")
        line = self.ok("classify", self.path("c.json", collection()))
        self.assertTrue(line.startswith('{"score":0.6224593312018546,"isOverThreshold":true,"loggingData":'
                                        '{"score":"0.6224593312018546","model_id":"m\\"1","feature_vector":"{'))
        self.assertTrue(line.endswith('","threshold":"0.5"}}\n'))


class Features(Tool):
    def test_hours_follow_the_tz_variable(self):
        c = self.path("c.json", collection(1))  # created 22:13 UTC
        utc = json.loads(self.ok("features", c))
        self.env["TZ"] = "JST-9"  # a POSIX rule: needs no zone files
        tokyo = json.loads(self.ok("features", c))
        self.assertEqual((utc["44"], tokyo["44"]), (22, 7))
        self.assertEqual(len(utc), 73)  # no location, so no feature 2


class Inspection(Tool):
    def test_inspect_and_pdp_on_the_example_model(self):
        model = os.path.join(ROOT, "examples", "model.txt")
        summary = self.ok("inspect", model)
        self.assertRegex(summary, r"format +version 4")
        self.assertRegex(summary, r"compiled as +16-bit forest \(74 input keys\)")
        self.assertIn("Final value = ", self.ok("inspect", model, "--tree", "3"))
        self.refused("inspect", model, "--tree", "100000", pattern=r"there is no tree 100000")
        svg = self.path("pdp.svg")
        csv = self.ok("pdp", model, "--feature", "4", "--from", "1", "--to", "60", "--steps", "60", "--svg", svg)
        self.assertEqual(len(csv.splitlines()), 61)
        with open(svg) as f:
            self.assertIn("<polyline", f.read())


class Explain(Tool):
    """`explain` on the example model: sums that reach the scores of `score`, and its refusals."""

    def setUp(self):
        super().setUp()
        self.model = os.path.join(ROOT, "examples", "model.txt")
        self.xgboost = os.path.join(ROOT, "examples", "model.json")
        self.example = os.path.join(ROOT, "examples", "collection.json")
        self.features = self.ok("features", self.example)
        # Background: the example's features, each scaled at random.
        rng = random.Random(7)
        example = json.loads(self.features)
        self.background = self.path("bg.jsonl", "".join(
            json.dumps({k: v * rng.uniform(0, 2) for k, v in example.items()}) + "\n" for _ in range(60)))

    def explain(self, *args, covers=None, **kw):
        covers = covers or ["--background", self.background]
        return [json.loads(l) for l in self.ok("explain", "--model", self.model, *covers, *args, **kw).splitlines()]

    def assertAddsUp(self, e):
        contributions = e["contributions"].values()
        total = e["bias"] + sum(contributions)
        self.assertLessEqual(abs(total - e["raw_score"]), 1e-9 * max(sum(abs(c) for c in contributions), 1e-300))

    def test_collections_and_rows_are_explained_up_to_the_scores_of_score(self):
        rows = self.path("rows.jsonl", self.features + json.dumps({"4": 30, "7": -1}) + "\n")
        raw = [float(t) for t in self.ok("score", "--raw", "--model", self.model, rows).split()]
        scores = [float(t) for t in self.ok("score", "--model", self.model, rows).split()]
        from_file = self.explain(self.example)
        with open(self.example) as f:
            example = json.load(f)
        from_stdin = self.explain("-", stdin=json.dumps(collection(3)) + "\n\n" + json.dumps(example) + "\n")
        from_rows = self.explain("--rows", rows)
        with_xgboost = self.explain("--rows", "-", covers=["--xgboost", self.xgboost],
                                    stdin=self.features + '{"4":30,"7":-1}')
        self.assertEqual((len(from_file), len(from_stdin), len(from_rows), len(with_xgboost)), (1, 2, 2, 2))
        # The collection's computed features, as features prints them, are the row.
        self.assertEqual(from_file[0], from_stdin[1])
        self.assertEqual(from_file[0], from_rows[0])
        for e in from_rows + with_xgboost:
            self.assertEqual(list(e), ["bias", "contributions", "raw_score", "score"])
            self.assertEqual(list(e["contributions"]), [str(i) for i in range(1, 75)])
            self.assertAddsUp(e)
        self.assertEqual([e["raw_score"] for e in from_rows], raw)
        self.assertEqual([e["score"] for e in with_xgboost], scores)
        self.assertNotEqual(from_rows[1]["bias"], with_xgboost[1]["bias"])  # the covers differ
        for e in from_stdin:
            self.assertAddsUp(e)

    def test_a_background_makes_the_bias_its_mean_raw_score(self):
        # With covers counted over rows, each tree's expectation is its mean
        # over them; counting goes a block of rows at a time, so cross one.
        rng = random.Random(11)
        rows = "".join(json.dumps({str(i): rng.choice([0, 1, 5, 40, 1e4]) * rng.random() for i in range(1, 75)}) + "\n"
                       for _ in range(1100))
        background = self.path("big.jsonl", rows)
        raw = [float(t) for t in self.ok("score", "--raw", "--model", self.model, background).split()]
        e = self.explain("--rows", "-", covers=["--background", background], stdin=self.features)[0]
        self.assertAlmostEqual(e["bias"], sum(raw) / len(raw), places=9)

    def test_covers_are_required_and_must_fit(self):
        c = self.example
        self.refused("explain", "--model", self.model, c,
                     pattern=r"covers are needed and never guessed: give --xgboost")
        self.refused("explain", "--model", self.model, "--xgboost", self.xgboost, "--background", self.background, c,
                     pattern=r"--xgboost and --background both give the covers; give one")
        self.refused("explain", "--model", self.model, "--xgboost", self.xgboost,
                     pattern=r"give a collection \(FILE, or - for JSON Lines\) or --rows FILE")
        self.refused("explain", "--model", self.model, "--background", "-", "-", pattern=r"only one input can come")
        with open(self.xgboost) as f:
            xgboost = json.load(f)
        booster = xgboost["learner"]["gradient_booster"]["model"]
        tree = booster["trees"][3]
        tree["split_conditions"][0] = float(tree["split_conditions"][0]) + 0.5
        self.refused("explain", "--model", self.model, "--xgboost", self.path("moved.json", json.dumps(xgboost)), c,
                     pattern=r"moved\.json:\d+: tree 3, node 0 \(node 0 .*\): the model tests x <= .*, XGBoost x < ")
        del booster["trees"][-1], booster["tree_info"][-1]
        booster["gbtree_model_param"]["num_trees"] = "119"
        self.refused("explain", "--model", self.model, "--xgboost", self.path("short.json", json.dumps(xgboost)), c,
                     pattern=r"short\.json: the XGBoost model has 119 trees but the model 120")
        bad = self.path("bad.jsonl", '{"1": 2}\n\n{"1": "x"}\n')
        self.refused("explain", "--model", self.model, "--background", bad, c,
                     pattern=re.escape(bad) + r":3: feature 1: expected a number, got a string")
        self.refused("explain", "--model", self.model, "--background", self.path("empty.jsonl", "\n"), c,
                     pattern=r"empty\.jsonl: the background has no rows")

    def test_waterfall_chart_of_one_input(self):
        svg = self.path("why.svg")
        e = self.explain(self.example, "--svg", svg)[0]
        texts = ["".join(t.itertext()) for t in ET.parse(svg).getroot().iter("{http://www.w3.org/2000/svg}text")]
        self.assertIn("bias", texts)
        self.assertIn("raw score", texts)
        self.assertIn("%.4g" % e["bias"], texts)
        self.assertIn("%.4g\u2192 score %.4g" % (e["raw_score"], e["score"]), texts)
        self.assertEqual(sum(t.startswith("feature ") for t in texts), 12)
        self.assertIn("62 other features", texts)
        # One chart draws one input: a second is refused after the first answer, and nothing is drawn.
        os.remove(svg)
        r = self.run_tool("explain", "--model", self.model, "--background", self.background, "--rows", "-",
                          "--svg", svg, stdin=self.features + "\n" + self.features)
        self.assertEqual((r.returncode, len(r.stdout.splitlines())), (2, 1))
        self.assertRegex(r.stderr, r"reliqa: <stdin>:3: --svg draws one input, and this is a second one")
        self.assertFalse(os.path.exists(svg))

    def test_a_converted_model_is_labelled_with_its_feature_names(self):
        tree = {"left_children": [1, -1, -1], "right_children": [2, -1, -1], "split_indices": [1, 0, 0],
                "split_conditions": [0.5, -0.25, 0.75], "sum_hessian": [10, 3, 7], "tree_param": {"num_nodes": "3"}}
        m = {"learner": {"feature_names": ["age", "size & <weight>"], "objective": {"name": "binary:logistic"},
                         "learner_model_param": {"base_score": "5E-1", "num_feature": "2"},
                         "gradient_booster": {"name": "gbtree", "model": {"trees": [tree]}}}}
        x, txt, svg = self.path("x.json", m), self.path("x.txt"), self.path("x.svg")
        self.ok("convert", "xgboost", "--feature-ids", "5,-9", x, "-o", txt)
        out = self.ok("explain", "--model", txt, "--xgboost", x, "--rows", "-", "--svg", svg, stdin='{"-9": 0.25}')
        # Covers 3 and 7 of 10: the left leaf differs from the mean 0.45 by -0.7.
        e = json.loads(out)
        self.assertEqual((list(e["contributions"]), e["contributions"]["5"], e["raw_score"]), (["-9", "5"], 0, -0.25))
        self.assertAlmostEqual(e["bias"], 0.45, places=14)
        self.assertAlmostEqual(e["contributions"]["-9"], -0.7, places=14)
        with open(svg) as f:
            self.assertIn("feature -9 (size &amp; &lt;weight&gt;)", f.read())


if __name__ == "__main__":
    ROOT = sys.argv[2]
    RELIQA = ([os.environ["RELIQA_EMULATOR"]] if os.environ.get("RELIQA_EMULATOR") else []) + [sys.argv[1]]
    unittest.main(argv=sys.argv[:1], verbosity=1)
