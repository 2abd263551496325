#!/usr/bin/python3
"""Says what each part of a shipped library contributes to its size.

  size-report.py LIBRARY.map [--library LIBRARY]

Reads the map that lld writes with -Map (the shipped build writes
lib/libreliqaclassifier.so.map) and sums the input sections of every section
that is loaded (what stripping keeps) by where they come from: the project's
own code, each dependency, the C++ runtime, libgcc and the C library's start
files, and what the linker makes itself (dynamic symbols, relocations, unwind
tables' index). With --library, the stripped size of that library is given
beside the sum; the difference is file headers and the padding that aligns
segments to 16 KB pages. Prints a Markdown table.
"""

import argparse
import collections
import os
import re
import subprocess
import sys
import tempfile

# Archive (or object) file name -> part. Anything else is the project's own.
PARTS = [
    (re.compile(r"^libglog\.a$"), "glog"),
    (re.compile(r"^libgflags(_nothreads)?\.a$"), "gflags"),
    (re.compile(r"^libfmt\.a$"), "fmt"),
    (re.compile(r"^libdouble-conversion\.a$"), "double-conversion"),
    (re.compile(r"^libsimdjson\.a$"), "simdjson"),
    (re.compile(r"^libsqlite3\.a$"), "SQLite"),
    # Debian's libc++.a holds libc++abi's objects as well.
    (re.compile(r"^libc\+\+\.a$"), "C++ runtime: libc++ and libc++abi"),
    (re.compile(r"^libc\+\+abi\.a$"), "C++ runtime: libc++abi"),
    (re.compile(r"^libunwind\.a$"), "C++ runtime: libunwind"),
    (re.compile(r"^libgcc(_eh)?\.a$|^crt.*\.o$|^libc_nonshared\.a$"), "libgcc and C start files"),
]
# Output sections that stripping removes or that take no room in the file.
UNLOADED = re.compile(r"^\.(debug|comment|symtab|strtab|shstrtab)|^\.tbss$|^\.bss$")
INPUT = re.compile(r"^\s*[0-9a-f]+\s+[0-9a-f]+\s+([0-9a-f]+)\s+\d+\s{9}(\S.*):\(([^)]*)\)$")
OUTPUT = re.compile(r"^\s*[0-9a-f]+\s+[0-9a-f]+\s+([0-9a-f]+)\s+\d+\s(\S+)$")


def part_of(origin):
    if origin.startswith("<internal>"):
        return "made by the linker"
    archive = origin.split("(", 1)[0]
    name = os.path.basename(archive)
    for pattern, part in PARTS:
        if pattern.search(name):
            return part
    return "reliqa (ours)"


def sizes(map_path):
    totals = collections.Counter()
    section = None
    with open(map_path) as f:
        next(f)  # column titles
        for line in f:
            match = OUTPUT.match(line)
            if match:
                section = match.group(2)
                continue
            match = INPUT.match(line)
            if match and section and not UNLOADED.search(section):
                totals[part_of(match.group(2))] += int(match.group(1), 16)
    return totals


def stripped_size(library):
    strip = "llvm-strip-14" if subprocess.run(["which", "llvm-strip-14"], capture_output=True).returncode == 0 \
        else "llvm-strip"
    with tempfile.TemporaryDirectory() as tmp:
        out = os.path.join(tmp, "stripped")
        subprocess.run([strip, "--strip-all", "-o", out, library], check=True)
        return os.path.getsize(out)


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("map")
    parser.add_argument("--library", help="the library the map belongs to, for its stripped size")
    args = parser.parse_args()
    totals = sizes(args.map)
    if not totals:
        sys.exit(f"size-report: no loaded input sections in {args.map}; is it a map written by lld?")
    print("| Part | Bytes | Share |")
    print("|---|---:|---:|")
    whole = sum(totals.values())
    for part, size in sorted(totals.items(), key=lambda item: -item[1]):
        print(f"| {part} | {size} | {100.0 * size / whole:.1f}% |")
    print(f"| all loaded sections | {whole} | 100.0% |")
    if args.library:
        stripped = stripped_size(args.library)
        print(f"| stripped file (headers and 16 KB page padding: {stripped - whole}) | {stripped} | |")


if __name__ == "__main__":
    main()
