#!/usr/bin/python3
"""Packs the built Python package into a wheel.

  wheel.py PYTHON_DIR OUT_DIR

PYTHON_DIR is a build's python/ folder (build/python), holding reliqa/ with
the native module and the pure-Python files. Writes OUT_DIR/reliqa-VERSION-
TAG-TAG-PLATFORM.whl for this interpreter and machine, the same bytes for the
same inputs (entries sorted, fixed dates and modes), and prints its path. The
wheel needs no network to install: numpy and pandas come from the system
(a virtual environment made with --system-site-packages sees Debian's), and
the native module uses the machine's shared glog, fmt, double-conversion,
simdjson and SQLite, which scripts/setup.sh installs.
"""

import base64
import hashlib
import os
import re
import shutil
import subprocess
import sys
import tempfile
import sysconfig
import zipfile

NAME = "reliqa"
SUMMARY = "The phone's exact reliqa features and scores in numpy"
REQUIRES = ("numpy", "pandas")
# reliqa.replay() needs Dask, and matplotlib for its report page.
EXTRAS = {"replay": ("dask", "distributed", "matplotlib")}
DATE = (2020, 1, 1, 0, 0, 0)


def version_of(package_dir):
    with open(os.path.join(package_dir, "__init__.py"), encoding="utf-8") as f:
        found = re.search(r'^__version__ = "([^"]+)"', f.read(), re.M)
    if not found:
        sys.exit(f"wheel: no __version__ in {package_dir}/__init__.py")
    return found.group(1)


def tags():
    impl = f"cp{sys.version_info.major}{sys.version_info.minor}"
    platform = sysconfig.get_platform().replace("-", "_").replace(".", "_")
    return impl, impl, platform


def record_line(name, data):
    digest = base64.urlsafe_b64encode(hashlib.sha256(data).digest()).rstrip(b"=").decode()
    return f"{name},sha256={digest},{len(data)}"


def without_debug_info(path):
    """The module's bytes without debugging sections (the build keeps them)."""
    strip = shutil.which("strip")
    if strip is None:
        sys.exit("wheel: strip (binutils) is needed to pack the native module")
    with tempfile.TemporaryDirectory() as tmp:
        copy = os.path.join(tmp, os.path.basename(path))
        subprocess.run([strip, "--strip-debug", "-o", copy, path], check=True)
        with open(copy, "rb") as f:
            return f.read()


def main():
    if len(sys.argv) != 3:
        sys.exit(__doc__)
    python_dir, out_dir = sys.argv[1:]
    package_dir = os.path.join(python_dir, NAME)
    suffix = sysconfig.get_config_var("EXT_SUFFIX")
    if not os.path.isfile(os.path.join(package_dir, "_native" + suffix)):
        sys.exit(f"wheel: {package_dir} has no _native{suffix}; build the target reliqa_python first")
    version = version_of(package_dir)
    impl, abi, platform = tags()
    dist_info = f"{NAME}-{version}.dist-info"
    files = {}
    # The Python files of the sources: a file the build once copied and the
    # sources have since lost must not ship.
    sources = os.path.join(os.path.dirname(os.path.abspath(__file__)), "..", "python", NAME)
    for name in sorted(os.listdir(package_dir)):
        if name.endswith(".py") and os.path.exists(os.path.join(sources, name)):
            with open(os.path.join(package_dir, name), "rb") as f:
                files[f"{NAME}/{name}"] = f.read()
        elif name == "_native" + suffix:
            files[f"{NAME}/{name}"] = without_debug_info(os.path.join(package_dir, name))
    metadata = "\n".join(
        ["Metadata-Version: 2.1", f"Name: {NAME}", f"Version: {version}", f"Summary: {SUMMARY}",
         "Requires-Python: >=3.11"] + [f"Requires-Dist: {r}" for r in REQUIRES]
        + [line for extra, needs in EXTRAS.items()
           for line in [f"Provides-Extra: {extra}"] + [f'Requires-Dist: {r}; extra == "{extra}"' for r in needs]]
    ) + "\n"
    wheel = "\n".join(["Wheel-Version: 1.0", "Generator: reliqa scripts/wheel.py", "Root-Is-Purelib: false",
                       f"Tag: {impl}-{abi}-{platform}"]) + "\n"
    files[f"{dist_info}/METADATA"] = metadata.encode()
    files[f"{dist_info}/WHEEL"] = wheel.encode()
    record = [record_line(n, d) for n, d in files.items()] + [f"{dist_info}/RECORD,,"]
    files[f"{dist_info}/RECORD"] = ("\n".join(record) + "\n").encode()

    os.makedirs(out_dir, exist_ok=True)
    path = os.path.join(out_dir, f"{NAME}-{version}-{impl}-{abi}-{platform}.whl")
    tmp = path + ".tmp"
    with zipfile.ZipFile(tmp, "w", zipfile.ZIP_DEFLATED) as z:
        for name, data in files.items():
            info = zipfile.ZipInfo(name, DATE)
            info.external_attr = (0o755 if name.endswith(".so") else 0o644) << 16
            info.compress_type = zipfile.ZIP_DEFLATED
            z.writestr(info, data)
    os.replace(tmp, path)
    print(path)


if __name__ == "__main__":
    main()
