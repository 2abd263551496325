#!/usr/bin/python3
"""Writes and checks reliqa.aar, the Android library that app projects depend on.

  aar.py write OUT.aar --classes reliqa.jar --jni ANDROID_ABI=DIR ...
  aar.py check IN.aar [--extract DIR]

The archive holds AndroidManifest.xml (the package and minSdkVersion 21),
classes.jar (the Java package) and jni/<Android ABI>/ with the stripped
libreliqaclassifier.so and libkestrova_host.so of each of x86_64, arm64-v8a and
armeabi-v7a. It is written the same way every time: entries in a fixed order
with fixed dates and modes, so the same inputs give the same bytes.

`check` verifies exactly that layout and the manifest, and with --extract
unpacks jni/ into DIR, where scripts/check-libs.sh checks the libraries.
Problems are printed one a line on standard error and make the exit status 1.
"""

import argparse
import os
import sys
import xml.etree.ElementTree as ElementTree
import zipfile

PACKAGE = "com.kestrova.sharefold.reliqaclassifier"
MIN_SDK_VERSION = "21"
ANDROID_ABIS = ("arm64-v8a", "armeabi-v7a", "x86_64")
LIBRARIES = ("libkestrova_host.so", "libreliqaclassifier.so")
ANDROID_NS = "http://schemas.android.com/apk/res/android"
# A class every user of the package touches: classes.jar without it is not the package.
ENTRY_CLASS = "com/kestrova/sharefold/reliqaclassifier/models/ReliqaClassifier.class"

MANIFEST = f"""<?xml version="1.0" encoding="utf-8"?>
<manifest xmlns:android="{ANDROID_NS}"
    package="{PACKAGE}">
    <uses-sdk android:minSdkVersion="{MIN_SDK_VERSION}" />
</manifest>
"""


def expected_entries():
    return ["AndroidManifest.xml", "classes.jar"] + [
        f"jni/{abi}/{name}" for abi in ANDROID_ABIS for name in LIBRARIES]


def add(archive, name, data):
    info = zipfile.ZipInfo(name, date_time=(1980, 1, 1, 0, 0, 0))
    info.external_attr = 0o644 << 16
    info.compress_type = zipfile.ZIP_DEFLATED
    archive.writestr(info, data)


def write(args):
    jni = dict(item.split("=", 1) for item in args.jni)
    if sorted(jni) != sorted(ANDROID_ABIS):
        sys.exit(f"aar: --jni must name exactly {', '.join(ANDROID_ABIS)}; got {', '.join(sorted(jni))}")
    with open(args.classes, "rb") as f:
        classes = f.read()
    tmp = args.out + ".tmp"
    with zipfile.ZipFile(tmp, "w") as archive:
        add(archive, "AndroidManifest.xml", MANIFEST.encode())
        add(archive, "classes.jar", classes)
        for abi in ANDROID_ABIS:
            for name in LIBRARIES:
                with open(os.path.join(jni[abi], name), "rb") as f:
                    add(archive, f"jni/{abi}/{name}", f.read())
    os.replace(tmp, args.out)


def manifest_problems(text):
    try:
        root = ElementTree.fromstring(text)
    except ElementTree.ParseError as error:
        return [f"AndroidManifest.xml is not XML: {error}"]
    problems = []
    if root.tag != "manifest" or root.get("package") != PACKAGE:
        problems.append(f"AndroidManifest.xml must be a <manifest> of package {PACKAGE}")
    sdk = root.find("uses-sdk")
    if sdk is None or sdk.get(f"{{{ANDROID_NS}}}minSdkVersion") != MIN_SDK_VERSION:
        problems.append(f"AndroidManifest.xml must declare minSdkVersion {MIN_SDK_VERSION}")
    return problems


def check(args):
    problems = []
    with zipfile.ZipFile(args.aar) as archive:
        names = archive.namelist()
        if names != expected_entries():
            missing = sorted(set(expected_entries()) - set(names))
            extra = sorted(set(names) - set(expected_entries()))
            problems.append(f"entries differ from the layout: missing {missing}, unexpected {extra}"
                            if missing or extra else f"entries out of order: {names}")
        if "AndroidManifest.xml" in names:
            problems += manifest_problems(archive.read("AndroidManifest.xml"))
        if "classes.jar" in names:
            with archive.open("classes.jar") as jar, zipfile.ZipFile(jar) as classes:
                if ENTRY_CLASS not in classes.namelist():
                    problems.append(f"classes.jar lacks {ENTRY_CLASS}")
        for name in names:
            if name.startswith("jni/") and not archive.read(name).startswith(b"\x7fELF"):
                problems.append(f"{name} is not an ELF file")
        if args.extract and not problems:
            for name in names:
                if name.startswith("jni/"):
                    archive.extract(name, args.extract)
    for problem in problems:
        print(f"aar: {args.aar}: {problem}", file=sys.stderr)
    return 1 if problems else 0


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    commands = parser.add_subparsers(dest="command", required=True)
    w = commands.add_parser("write", help="write the archive")
    w.add_argument("out")
    w.add_argument("--classes", required=True, help="the Java package's jar")
    w.add_argument("--jni", action="append", default=[], metavar="ANDROID_ABI=DIR",
                   help="the directory holding the stripped libraries of one Android ABI")
    c = commands.add_parser("check", help="check the archive's layout")
    c.add_argument("aar")
    c.add_argument("--extract", metavar="DIR", help="unpack jni/ into DIR when the layout is right")
    args = parser.parse_args()
    if args.command == "write":
        write(args)
        return 0
    return check(args)


if __name__ == "__main__":
    sys.exit(main())
