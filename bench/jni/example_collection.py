#!/usr/bin/python3
"""Writes ExampleCollection.java: a collection file as the Java input records.

  example_collection.py COLLECTION.json OUT.java

The JVM benchmark classifies the example collection through the Java API, and
the JDK has no JSON reader; so the collection becomes Java code at build time.
Every double is written as its bit pattern, so the Java records hold exactly
the values that the tool reads from the file.
"""

import json
import struct
import sys


def double(value):
    bits = struct.unpack(">q", struct.pack(">d", float(value)))[0]
    return f"Double.longBitsToDouble({bits}L)"


def string(value):
    return json.dumps(value, ensure_ascii=True)  # a JSON string with \\u escapes is a Java string


def metric(m):
    return f"new OptionalImageMetricValue({str(m['isCalculated']).lower()}, {double(m['value'])})"


def asset(a):
    return ("new AssetDetail(" + ", ".join([
        string(a["assetID"]), string(a["assetType"]),
        f"{int(a['creationDateSinceEpoch'])}L", f"{int(a['modificationDateSinceEpoch'])}L",
        double(a["pixelWidth"]), double(a["pixelHeight"]), double(a["latitude"]), double(a["longitude"]),
        double(a["videoDuration"]), str(int(a["isFavorite"])), str(int(a["isHidden"])),
        str(int(a["mediaSubtypes"])), str(int(a["sourceType"])),
        metric(a["blurrinessMetric"]), metric(a["darknessMetric"])]) + ")")


def main():
    source, out = sys.argv[1], sys.argv[2]
    with open(source) as f:
        c = json.load(f)
    location = "null"
    if c.get("locationInfo") is not None:
        l = c["locationInfo"]
        location = (f"new LocationInfo({string(l['name'])}, {str(l['isLandmark']).lower()}, "
                    f"{double(l['longitude'])}, {double(l['latitude'])})")
    counts = "null"
    if c.get("assetCounts") is not None:
        names = ["tileCount", "totalAssetsCount", "photosCount", "burstCount", "loopsCount", "videosCount",
                 "totalAssetsWithinBurstsCount", "totalAssetsWithinLoopsCount", "facesCount",
                 "photosWithFacesCount"]
        counts = "new AssetCounts(" + ", ".join(str(int(c["assetCounts"][n])) for n in names) + ")"
    assets = ",\n        ".join(asset(a) for a in c["assetDetails"])
    duplicates = ",\n        ".join(
        f"new DuplicateInfo({string(d['assetIdA'])}, {string(d['assetIdB'])}, {double(d['dupeCoefficient'])})"
        for d in c["duplicateInfos"])
    with open(out, "w") as f:
        f.write(f"""// Written by bench/jni/example_collection.py from {source.split('/')[-1]}; do not edit.
package com.kestrova.sharefold.reliqaclassifier.models;

final class ExampleCollection {{
  private ExampleCollection() {{}}

  static ReliqaClassifierInput input() {{
    return new ReliqaClassifierInput({string(c['collectionID'])}, {double(c['timeSinceStory'])},
        {location},
        {counts},
        new AssetDetail[] {{
        {assets}}},
        new DuplicateInfo[] {{
        {duplicates}}});
  }}
}}
""")


if __name__ == "__main__":
    main()
