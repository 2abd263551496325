"""The work on one block of logs: reading it, scoring it through the native
module and counting what the replay's report needs.

It runs on Dask workers and in the driver's threads alike. Everything counted
is an exact integer, and the lists kept (the first reasons, the first flips,
the logged models) are the smallest by a fixed order, so that the sum of the
tallies does not depend on how the logs were split nor on the order in which
the tallies are added.
"""

from __future__ import annotations

import gzip
import math
import threading
import zlib
from dataclasses import dataclass
from typing import Dict, Iterator, List, Optional, Tuple

import numpy as np

GRID_BITS = 16
GRID = 1 << GRID_BITS
"""Scores are counted in GRID bins of equal width over [0, 1]: bin b holds the
scores in (b / GRID, (b + 1) / GRID] (bin 0 also 0 and below, the last bin
also 1 and above), so that "score > k / GRID" is "bin >= k" exactly."""

MAX_REASONS = 10     # refused lines kept with their reason
MAX_EXAMPLES = 5     # flipped rows kept, per direction
MAX_PAIRS = 1000     # (logged model id, logged threshold) pairs kept
MAX_LINE = 1 << 20   # longer lines are refused unread
STREAM_PIECE = 16 << 20  # bytes of a compressed file scored at once

# The baseline's verdict on a row, and the candidate's.
HIDDEN, SHOWN, NONE = 0, 1, 2


class ReplayError(Exception):
    """A replay that cannot be done: a log file that cannot be read, a
    cluster whose workers cannot run it, refused options."""


@dataclass(frozen=True)
class Block:
    """A byte range of one log file: the lines that start in [start, end).
    A compressed file is one block (end None)."""

    path: str
    file: int    # the file's index among the logs
    index: int   # the block's index within its file
    start: int
    end: Optional[int]
    compressed: bool


@dataclass(frozen=True)
class Judging:
    """How the rows are read and the candidate judged. mode "logged": at each
    row's logged threshold; "fixed": at `threshold`; "grid": at a threshold
    of the grid picked from the summed tallies (no verdicts are counted per
    row then)."""

    label: Optional[str]
    mode: str
    threshold: float = math.nan
    max_line: int = MAX_LINE


def grid_bins(scores: np.ndarray) -> np.ndarray:
    """The grid bin of each score (multiplying by 2^16 is exact)."""
    return np.clip(np.ceil(scores * GRID) - 1, 0, GRID - 1).astype(np.int64)


class Tally:
    """Counts of some blocks of logs.

    candidate[c, s, b]: rows of class c (the label; 0 without labels) whose
    baseline verdict is s (HIDDEN, SHOWN or NONE for a bare row) and whose
    candidate score falls in bin b. logged[c, b]: rows with a baseline by
    their logged score. verdicts[c, s, v]: rows by class, baseline verdict and
    candidate verdict v (NONE: a bare row with no threshold to judge it at).
    """

    def __init__(self, classes: int) -> None:
        self.classes = classes
        self.read = 0       # lines that are not blank
        self.refused = 0    # of which not rows
        self.reasons: List[Tuple[int, int, int, str]] = []  # (file, block, line, why)
        self.lines: Dict[Tuple[int, int], int] = {}         # lines of each block
        self.candidate = np.zeros((classes, 3, GRID), np.int64)
        self.logged = np.zeros((classes, GRID), np.int64)
        self.verdicts = np.zeros((classes, 3, 3), np.int64)
        self.pairs: Dict[Tuple[str, float], int] = {}
        self.pairs_dropped = False
        # (file, block, line, logged score, logged threshold, candidate score)
        self.to_hidden: List[Tuple[int, int, int, float, float, float]] = []
        self.to_shown: List[Tuple[int, int, int, float, float, float]] = []

    def add_rows(self, rows: dict, block: Block, judging: Judging) -> None:
        """Counts what the native module read from some lines of `block`."""
        self.read += rows["read"]
        self.refused += rows["refused"]
        if rows["reasons"]:
            self.reasons = _smallest(self.reasons + [(block.file, block.index, line, why)
                                                     for line, why in rows["reasons"]], MAX_REASONS)
        candidate = rows["candidate"]
        n = candidate.size
        if n == 0:
            return
        model = rows["model"]
        has = model >= 0
        logged = rows["logged"]
        threshold = rows["threshold"]
        state = np.full(n, NONE, np.int64)
        state[has] = logged[has] > threshold[has]
        cls = rows["label"].astype(np.int64) if self.classes == 2 else np.zeros(n, np.int64)
        group = cls * 3 + state
        self.candidate += np.bincount(group * GRID + grid_bins(candidate),
                                      minlength=self.classes * 3 * GRID).reshape(self.candidate.shape)
        self.logged += np.bincount(cls[has] * GRID + grid_bins(logged[has]),
                                   minlength=self.classes * GRID).reshape(self.logged.shape)
        if judging.mode != "grid":
            if judging.mode == "fixed":
                verdict = (candidate > judging.threshold).astype(np.int64)
            else:
                verdict = np.full(n, NONE, np.int64)
                verdict[has] = candidate[has] > threshold[has]
            self.verdicts += np.bincount(group * 3 + verdict,
                                         minlength=self.classes * 9).reshape(self.verdicts.shape)
            line = rows["line"]
            for name, was, now in (("to_hidden", SHOWN, HIDDEN), ("to_shown", HIDDEN, SHOWN)):
                at = np.flatnonzero((state == was) & (verdict == now))[:MAX_EXAMPLES]
                if at.size:
                    found = [(block.file, block.index, int(line[i]), float(logged[i]), float(threshold[i]),
                              float(candidate[i])) for i in at]
                    setattr(self, name, _smallest(getattr(self, name) + found, MAX_EXAMPLES))
        if has.any():
            thresholds, which = np.unique(threshold[has] + 0.0, return_inverse=True)  # -0 counts as 0
            counts = np.bincount(model[has].astype(np.int64) * thresholds.size + which)
            models = rows["models"]
            self._add_pairs({(models[key // thresholds.size], float(thresholds[key % thresholds.size])):
                             int(counts[key]) for key in np.flatnonzero(counts).tolist()})

    def _add_pairs(self, pairs: Dict[Tuple[str, float], int]) -> None:
        for key, count in pairs.items():
            self.pairs[key] = self.pairs.get(key, 0) + count
        if len(self.pairs) > MAX_PAIRS:
            # The smallest keys are kept: a pair among the first MAX_PAIRS of
            # all the logs is among the first of any part of them, so its count
            # is whole whatever the split.
            self.pairs = {k: self.pairs[k] for k in sorted(self.pairs)[:MAX_PAIRS]}
            self.pairs_dropped = True

    def merge(self, other: "Tally") -> "Tally":
        """Adds `other` into this tally and returns it."""
        self.read += other.read
        self.refused += other.refused
        self.reasons = _smallest(self.reasons + other.reasons, MAX_REASONS)
        self.lines.update(other.lines)
        self.candidate += other.candidate
        self.logged += other.logged
        self.verdicts += other.verdicts
        self.pairs_dropped |= other.pairs_dropped
        self._add_pairs(other.pairs)
        self.to_hidden = _smallest(self.to_hidden + other.to_hidden, MAX_EXAMPLES)
        self.to_shown = _smallest(self.to_shown + other.to_shown, MAX_EXAMPLES)
        return self

    # Between processes the histograms travel as their non-zero bins.
    def __getstate__(self) -> dict:
        state = dict(self.__dict__)
        state["candidate"] = _pack(self.candidate)
        state["logged"] = _pack(self.logged)
        return state

    def __setstate__(self, state: dict) -> None:
        state["candidate"] = _unpack(state["candidate"])
        state["logged"] = _unpack(state["logged"])
        self.__dict__.update(state)


def _smallest(items: list, n: int) -> list:
    return sorted(items)[:n]


def _pack(a: np.ndarray):
    at = np.flatnonzero(a)
    if at.size * 2 >= a.size:
        return a
    return (a.shape, at.astype(np.int32), a.ravel()[at])


def _unpack(packed) -> np.ndarray:
    if isinstance(packed, np.ndarray):
        return packed
    shape, at, values = packed
    a = np.zeros(shape, np.int64)
    a.ravel()[at] = values
    return a


def merge_tallies(*tallies: Tally) -> Tally:
    """The sum of some tallies (the first one is added to)."""
    total = tallies[0]
    for t in tallies[1:]:
        total.merge(t)
    return total


def tally_block(block: Block, model, judging: Judging) -> Tally:
    """Reads, scores and counts one block of logs with `model` (a
    reliqa.Model). Raises ReplayError naming the file when it cannot be read."""
    tally = Tally(2 if judging.label is not None else 1)
    native = model._native
    first = 1
    try:
        for data in _pieces(block, judging.max_line):
            rows = native.replay_block(data, judging.label, first, judging.max_line, MAX_REASONS)
            first += rows["lines"]
            tally.add_rows(rows, block, judging)
    except (OSError, EOFError, zlib.error) as e:  # a bad gzip stream is an OSError too
        raise ReplayError(f"{block.path}: cannot be read: {e}") from None
    tally.lines[(block.file, block.index)] = first - 1
    return tally


def _pieces(block: Block, max_line: int) -> Iterator[bytes]:
    """The block's lines, as a few runs of whole lines."""
    if block.compressed:
        with gzip.open(block.path, "rb") as f:
            yield from _stream_pieces(f, max_line)
    else:
        with open(block.path, "rb") as f:
            yield from _range_pieces(f, block.start, block.end, max_line)


def _range_pieces(f, start: int, end: int, max_line: int) -> Iterator[bytes]:
    if start > 0:
        # The line holding `start - 1` began in the block before (it ends
        # there when that byte is its newline).
        f.seek(start - 1)
        if not _skip_line(f):
            return
    begin = f.tell()
    if begin >= end:
        return
    # The block, and enough after it to end its last line (or to refuse that
    # line for its length), read at once into this thread's buffer.
    size = end - begin
    data = _buffer(size + max_line + 1)
    got = f.readinto(memoryview(data)[:size + max_line + 1])
    view = memoryview(data)[:got]
    if got > size and data[size - 1] != 0x0A:
        cut = data.find(b"\n", size - 1, got)
        view = view[:cut + 1] if cut >= 0 else view
    elif got > size:
        view = view[:size]
    yield view.toreadonly()


_local = threading.local()


def _buffer(size: int) -> bytearray:
    """A buffer of at least `size` bytes, kept by the thread for its next
    block: fresh memory would cost a page fault every 4 KiB."""
    data = getattr(_local, "buffer", None)
    if data is None or len(data) < size:
        data = _local.buffer = bytearray(size)
    return data


def _skip_line(f) -> bool:
    """Moves past the next newline; False at the end of the file."""
    while True:
        chunk = f.read(1 << 20)
        if not chunk:
            return False
        cut = chunk.find(b"\n")
        if cut >= 0:
            f.seek(cut + 1 - len(chunk), 1)
            return True


def _stream_pieces(f, max_line: int) -> Iterator[bytes]:
    carry = b""
    skipping = False  # inside a line that was too long
    while True:
        chunk = f.read(STREAM_PIECE)
        if not chunk:
            if carry:
                yield carry
            return
        if skipping:
            cut = chunk.find(b"\n")
            if cut < 0:
                continue
            chunk = chunk[cut + 1:]
            skipping = False
        data = carry + chunk if carry else chunk
        cut = data.rfind(b"\n")
        if cut < 0:
            carry = data
        else:
            yield data[:cut + 1]
            carry = data[cut + 1:]
        if len(carry) > max_line:
            # Too long: handed over cut short (the reader refuses it for its
            # length); the rest of it is skipped.
            yield carry[:max_line + 1]
            carry = b""
            skipping = True
