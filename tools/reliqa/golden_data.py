#!/usr/bin/python3
"""Writes tools/reliqa/testdata/golden_collections.jsonl, the data of golden_test.cc.

Generates a fixed set of collections (seeded, so the same every run), has the
`reliqa` tool of a native build compute their features and scores, and stores
everything as exact IEEE-754 bit patterns:

  {"features":{"1":"<16 hex digits>",...},"score":"<hex>","rawScore":"<hex>","collection":{...}}

one collection per line. The hex digits are the big-endian bits of the double
(struct.pack('>d')), so "3ff0000000000000" is 1.0.

The tool runs with TZ=Europe/Berlin, the zone the test sets, since the hour
features depend on it. Every date lies in 1970..2037, where a 32-bit time_t
holds it.

  /usr/bin/python3 tools/reliqa/golden_data.py --reliqa build/bin/reliqa
"""

import argparse
import calendar
import json
import os
import random
import struct
import subprocess
import sys

HERE = os.path.dirname(os.path.abspath(__file__))
ROOT = os.path.dirname(os.path.dirname(HERE))
SEED = 20240331
COUNT = 300
TIME_ZONE = "Europe/Berlin"
LAST_DATE = calendar.timegm((2037, 12, 31, 23, 59, 59))  # below 2^31 - 1

COUNT_NAMES = ["tileCount", "totalAssetsCount", "photosCount", "burstCount", "videosCount", "loopsCount",
               "totalAssetsWithinBurstsCount", "totalAssetsWithinLoopsCount", "facesCount",
               "photosWithFacesCount"]
PLACES = ["Harbour front", "Old town", "Lakeside", "Summit", "Market hall", "Grandma's garden", "Stadium",
          "Ferry", "Caf\u00e9 du Parc", "Beach"]


def last_sunday(year, month):
    """Day of the month of the last Sunday of `month`."""
    days = calendar.monthrange(year, month)[1]
    return max(d for d in range(days - 6, days + 1) if calendar.weekday(year, month, d) == 6)


def dst_change(rng):
    """Seconds since the epoch of a Central European switch (01:00 UTC on the
    last Sunday of March or October, rules in force since 1996)."""
    year = rng.randint(1996, 2037)
    month = rng.choice([3, 10])
    return calendar.timegm((year, month, last_sunday(year, month), 1, 0, 0))


def awkward(rng, low, high):
    """A value in [low, high] whose binary fraction does not end early."""
    kind = rng.random()
    if kind < 0.4:
        return rng.uniform(low, high)  # full 53-bit mantissa
    if kind < 0.8:
        return round(rng.uniform(low, high), rng.randint(1, 4))  # decimal fractions: 0.1, 0.37, ...
    return float(rng.randint(int(low), int(high)))


def clamp_date(seconds):
    return max(0, min(LAST_DATE, int(seconds)))


def collection_size(rng, index):
    if index < 4:
        return 0
    if index in (50, 250):
        return 1000
    if index % 37 == 0:
        return rng.randint(100, 300)
    r = rng.random()
    if r < 0.1:
        return 1
    if r < 0.8:
        return rng.randint(2, 12)
    return rng.randint(13, 40)


def make_assets(rng, cid, n, centre):
    # Where the dates cluster and how far they spread.
    mode = rng.random()
    if mode < 0.45:
        anchor = dst_change(rng)
        spread = rng.choice([600, 3600, 3 * 3600, 86400])
    elif mode < 0.55:
        anchor = rng.choice([0, 86400, LAST_DATE - 86400 * 3, LAST_DATE])
        spread = rng.choice([60, 7200, 86400 * 2])
    else:
        anchor = rng.randint(0, LAST_DATE)
        spread = rng.choice([60, 3600, 86400, 86400 * 14, 86400 * 365, 86400 * 365 * 20])
    p_calculated = rng.choice([0.0, 0.5, 0.9, 1.0])
    p_modified = rng.choice([0.0, 0.3, 0.8, 1.0])
    p_video = rng.choice([0.0, 0.1, 0.4])
    widths = [(4032.0, 3024.0), (1170.0, 2532.0), (1920.0, 1080.0), (3024.0, 4032.0), (640.0, 480.0)]
    assets = []
    for i in range(n):
        created = clamp_date(anchor + rng.randint(-spread, spread))
        if rng.random() < p_modified:
            modified = clamp_date(created + rng.choice([rng.randint(0, 600), rng.randint(0, 86400 * 400),
                                                        -rng.randint(0, 3600)]))
        else:
            modified = -1
        video = rng.random() < p_video
        w, h = rng.choice(widths)
        if rng.random() < 0.15:
            w, h = awkward(rng, 100, 8000), awkward(rng, 100, 8000)
        lat, lon = centre
        asset = {
            "assetID": "%s-A%04d" % (cid, i),
            "assetType": "video" if video else "photo",
            "creationDateSinceEpoch": created,
            "modificationDateSinceEpoch": modified,
            "pixelWidth": w,
            "pixelHeight": h,
            "latitude": lat + rng.uniform(-0.05, 0.05),
            "longitude": lon + rng.uniform(-0.05, 0.05),
            "videoDuration": awkward(rng, 0.5, 600) if video else 0.0,
            "isFavorite": int(rng.random() < 0.1),
            "isHidden": int(rng.random() < 0.03),
            "mediaSubtypes": rng.choice([0, 0, 0, 1, 2, 4, 8, 16, 64, 512, 1 << 17, 1 << 19]),
            "sourceType": rng.choice([1, 1, 1, 2, 4, 8]),
            "blurrinessMetric": {"isCalculated": rng.random() < p_calculated, "value": awkward(rng, 0, 1)},
            "darknessMetric": {"isCalculated": rng.random() < p_calculated, "value": awkward(rng, 0, 1)},
        }
        assets.append(asset)
    return assets


def make_collection(rng, index):
    cid = "G%03d" % index
    n = collection_size(rng, index)
    centre = (rng.uniform(-60, 70), rng.uniform(-180, 180))
    location = None
    if rng.random() < 0.7:
        location = {"name": rng.choice(PLACES), "isLandmark": rng.random() < 0.3,
                    "longitude": centre[1], "latitude": centre[0]}
    counts = None
    if rng.random() < 0.75:
        counts = {name: rng.randint(0, max(1, 2 * n)) for name in COUNT_NAMES}
    assets = make_assets(rng, cid, n, centre)
    duplicates = []
    if n >= 2 and rng.random() < 0.6:
        for _ in range(rng.randint(1, min(40, n))):
            a, b = rng.sample(range(n), 2)
            duplicates.append({"assetIdA": assets[a]["assetID"], "assetIdB": assets[b]["assetID"],
                               "dupeCoefficient": awkward(rng, 0, 1)})
    return {
        "collectionID": cid,
        "timeSinceStory": awkward(rng, 0, 400) if rng.random() < 0.9 else -1.0,
        "locationInfo": location,
        "assetCounts": counts,
        "assetDetails": assets,
        "duplicateInfos": duplicates,
    }


def bits(value):
    return struct.pack(">d", value).hex()


def exact(text):
    """Reads one JSON line keeping every number exactly (and -0 as -0.0)."""
    return json.loads(text, parse_int=float, parse_float=float)


def run(reliqa, args, stdin):
    env = dict(os.environ, TZ=TIME_ZONE)
    done = subprocess.run([reliqa] + args, input=stdin, capture_output=True, text=True, env=env)
    if done.returncode != 0:
        sys.exit("reliqa %s failed: %s" % (" ".join(args), done.stderr))
    return done.stdout.splitlines()


def main():
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--reliqa", required=True, help="the reliqa tool of a native (x86_64) build")
    parser.add_argument("--model", default=os.path.join(ROOT, "examples", "model.txt"))
    parser.add_argument("--out", default=os.path.join(HERE, "testdata", "golden_collections.jsonl"))
    args = parser.parse_args()

    rng = random.Random(SEED)
    collections = [json.dumps(make_collection(rng, i), separators=(",", ":"), ensure_ascii=False)
                   for i in range(COUNT)]
    feature_lines = run(args.reliqa, ["features", "-"], "\n".join(collections) + "\n")
    rows = "\n".join(feature_lines) + "\n"
    scores = run(args.reliqa, ["score", "--model", args.model, "-"], rows)
    raw_scores = run(args.reliqa, ["score", "--raw", "--model", args.model, "-"], rows)
    if not len(feature_lines) == len(scores) == len(raw_scores) == COUNT:
        sys.exit("reliqa answered %d/%d/%d lines for %d collections" %
                 (len(feature_lines), len(scores), len(raw_scores), COUNT))

    os.makedirs(os.path.dirname(args.out), exist_ok=True)
    with open(args.out, "w", encoding="utf-8") as out:
        for collection, features, score, raw in zip(collections, feature_lines, scores, raw_scores):
            values = exact(features)
            expected = ",".join('"%d":"%s"' % (fid, bits(values[str(fid)]))
                                for fid in sorted(int(k) for k in values))
            out.write('{"features":{%s},"score":"%s","rawScore":"%s","collection":%s}\n' %
                      (expected, bits(exact(score)), bits(exact(raw)), collection))
    print("%s: %d collections, %d bytes" % (args.out, COUNT, os.path.getsize(args.out)))


if __name__ == "__main__":
    main()
