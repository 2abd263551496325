"""reliqa.replay(): a candidate model and threshold judged on logged traffic.

The phones log every classification: the score, the model id, the feature
vector and the threshold. :func:`replay` scores the logged feature vectors
with a candidate model, on a Dask cluster or in this process, and reports
what the candidate would have done beside what the logged model did.
"""

from __future__ import annotations

import glob
import hashlib
import logging
import math
import os
import sys
import time
from concurrent.futures import FIRST_COMPLETED, ThreadPoolExecutor, wait
from typing import Any, Dict, List, Optional, Sequence, Tuple, Union

import numpy as np

from . import _replay_report as _report
from ._replay_tally import (GRID, MAX_LINE, Block, Judging, ReplayError, Tally, merge_tallies,
                            tally_block)
from .model import Model

__all__ = ["replay", "ReplayReport", "ReplayError"]

PathLike = Union[str, "os.PathLike[str]"]

DEFAULT_BLOCKSIZE = 64 << 20
"""Bytes of logs per task: tens of thousands of rows, a fraction of a second
of work, so that Dask's millisecond per task does not count."""

_MERGE_FAN_IN = 8
_WORKER_START_SECONDS = 60
_LOGGING_KEYS = {"score", "model_id", "feature_vector", "threshold", "loggingData", "isOverThreshold"}


class ReplayReport:
    """What a replay found.

    Attributes
    ----------
    data:
        The report as written to ``report.json``: plain dicts, lists and
        numbers (``None`` where a figure has no rows to stand on).
    tally:
        The exact counts behind it; ``tally.candidate`` and ``tally.logged``
        hold the histograms on the full grid of 2^16 bins.
    """

    def __init__(self, data: Dict[str, Any], tally: Tally) -> None:
        self.data = data
        self.tally = tally

    def to_json(self) -> str:
        """The text of ``report.json``."""
        return _report.report_json(self.data)

    def to_html(self) -> str:
        """The text of ``report.html``: one self-contained page, its charts
        inline as SVG (needs matplotlib)."""
        return _report.report_html(self.data, self.tally)

    def write(self, directory: PathLike) -> Tuple[str, str]:
        """Writes ``report.json`` and ``report.html`` into `directory` (made
        when missing); returns their paths."""
        directory = os.fspath(directory)
        os.makedirs(directory, exist_ok=True)
        paths = (os.path.join(directory, "report.json"), os.path.join(directory, "report.html"))
        _report.write_atomically(paths[0], self.to_json())
        _report.write_atomically(paths[1], self.to_html())
        return paths

    def summary(self) -> str:
        """A few lines for a terminal."""
        d = self.data
        rates, flips = d["show_rate"], d["flips"]
        lines = [f"{d['logs']['lines_read']:,} lines read, {d['rows']['scored']:,} rows scored, "
                 f"{d['logs']['refused']:,} refused",
                 f"show rate: candidate {_report._pct(rates['candidate'])}, "
                 f"baseline {_report._pct(rates['baseline'])}",
                 f"flips: {flips['shown_to_hidden']:,} shown -> hidden, {flips['hidden_to_shown']:,} hidden -> shown "
                 f"of {flips['rows_compared']:,}"]
        if d["judged_at"]["rule"] in ("show_rate", "precision"):
            j = d["judged_at"]
            lines.append(f"candidate threshold {j['threshold']:.6g} for the {j['rule'].replace('_', ' ')} "
                         f"{j['target']:g}" + ("" if j["met"] else " (not met: the nearest)"))
        if "labels" in d:
            a = d["labels"]["auc"]
            lines.append("ROC AUC: candidate " + (f"{a['candidate']['auc']:.4f}" if a["candidate"] else "-")
                         + ", baseline " + (f"{a['baseline']['auc']:.4f}" if a["baseline"] else "-"))
        return "\n".join(lines)

    def __repr__(self) -> str:
        return f"<reliqa.ReplayReport: {self.data['rows']['scored']} rows>"


def replay(
    logs: Union[PathLike, Sequence[PathLike]],
    model: Union[Model, PathLike],
    *,
    threshold: Optional[float] = None,
    show_rate: Optional[float] = None,
    precision: Optional[float] = None,
    label: Optional[str] = None,
    scheduler: Optional[str] = None,
    client: Any = None,
    workers: Optional[int] = None,
    in_process: bool = False,
    out: Optional[PathLike] = None,
    blocksize: int = DEFAULT_BLOCKSIZE,
    max_line: int = MAX_LINE,
) -> ReplayReport:
    """Replays logged classifications with a candidate model.

    Parameters
    ----------
    logs:
        JSON Lines files or glob patterns (``"logs/2024-05-*.jsonl.gz"``),
        plain or gzip-compressed. Each line is a classification result as
        ``reliqa classify`` prints it (extra members such as a user id are
        skipped), its four logging values on their own, or a bare feature row
        (``{"3": 0.25, ...}``), which has no baseline.
    model:
        The candidate: a :class:`Model` or the path of a model text.
    threshold, show_rate, precision:
        At most one. The candidate is judged at `threshold`; or at the
        threshold of the score grid whose show rate is at most `show_rate`;
        or at the lowest one whose precision is at least `precision` (needs
        `label`). Without any, at each row's logged threshold.
    label:
        The member of each line that holds its label: true, false, 0 or 1
        (the user opened the collection, or dismissed it). A line without it
        is refused.
    scheduler:
        The address of a Dask scheduler to join (``"tcp://host:8786"``).
    client:
        A ``distributed.Client`` to run on, instead of `scheduler`.
    workers:
        Without `scheduler` or `client`: the worker processes of the
        ``LocalCluster`` started for the run (default: one per core), or the
        threads of the in-process run.
    in_process:
        Run in this process's threads, without Dask.
    out:
        A directory to write ``report.json`` and ``report.html`` into.
    blocksize:
        Bytes of an uncompressed file per task (a compressed file is one task).
    max_line:
        Longer lines are refused unread.

    Returns
    -------
    ReplayReport

    Raises
    ------
    ReplayError
        For a log that cannot be read (naming it), a pattern that matches no
        file, refused options, or workers that cannot run the replay. Lines
        that cannot be read are counted and reported, never raised.
    """
    started = time.perf_counter()
    target = _check_options(threshold, show_rate, precision, label, workers, blocksize, max_line,
                            scheduler, client, in_process)
    if out is not None:
        try:
            import matplotlib  # noqa: F401  (the page's charts; better said now than after the run)
        except ImportError as e:
            raise ReplayError(f"writing the report page needs matplotlib ({e}); install python3-matplotlib") from None
    if isinstance(model, Model):
        model_name = "the candidate model"
    else:
        model_name = os.fspath(model)
        try:
            model = Model.load(model)
        except OSError as e:
            raise ReplayError(f"{model_name}: cannot be read: {e.strerror or e}") from None
    if threshold is not None:
        judging = Judging(label, "fixed", float(threshold), max_line)
    elif target is not None:
        judging = Judging(label, "grid", math.nan, max_line)
    else:
        judging = Judging(label, "logged", math.nan, max_line)
    files = _expand(logs)
    blocks, compressed = _plan(files, blocksize)

    if in_process:
        threads = workers or os.cpu_count() or 1
        tally = _run_in_threads(model, blocks, judging, threads)
        where, count = "in this process", threads
    else:
        own = None
        try:
            if client is None:
                client, own = _connect(scheduler, workers)
            _check_workers(client)
            count = len(client.scheduler_info()["workers"])
            where = (f"Dask scheduler {scheduler}" if scheduler else
                     "a LocalCluster" if own is not None else "a Dask client's cluster")
            tally = _run_on_dask(client, model, blocks, judging)
        finally:
            if own is not None:
                client.close()
                own.close()
    if tally is None:
        tally = Tally(2 if label is not None else 1)
    seconds = time.perf_counter() - started
    data = _report_data(tally, judging, target, model, model_name, files, compressed, label)
    rows = data["logs"]["lines_read"]
    data["run"] = {"where": where, "workers": count, "tasks": len(blocks), "seconds": round(seconds, 3),
                   "lines_per_second": round(rows / seconds) if seconds > 0 else None,
                   "summary": f"Ran {'' if in_process else 'on '}{where} with {count} "
                              f"{'thread' if in_process else 'worker'}(s), {len(blocks)} task(s): {rows:,} lines "
                              f"in {seconds:.1f} s."}
    report = ReplayReport(data, tally)
    if out is not None:
        report.write(out)
    return report


def _check_options(threshold, show_rate, precision, label, workers, blocksize, max_line, scheduler, client,
                   in_process) -> Optional[Tuple[str, float]]:
    given = [n for n, v in (("threshold", threshold), ("show_rate", show_rate), ("precision", precision))
             if v is not None]
    if len(given) > 1:
        raise ReplayError(f"give at most one of threshold, show_rate and precision, not {' and '.join(given)}")
    if threshold is not None and not math.isfinite(float(threshold)):
        raise ReplayError(f"threshold must be a finite number, got {threshold!r}")
    if show_rate is not None and not 0.0 <= float(show_rate) <= 1.0:
        raise ReplayError(f"show_rate must lie in [0, 1], got {show_rate!r}")
    if precision is not None:
        if not 0.0 < float(precision) <= 1.0:
            raise ReplayError(f"precision must lie in (0, 1], got {precision!r}")
        if label is None:
            raise ReplayError("a precision target needs labels: name the label member")
    if label is not None:
        if not isinstance(label, str) or not label:
            raise ReplayError(f"label must name a member, got {label!r}")
        body = label[1:] if label.startswith("-") else label
        if label in _LOGGING_KEYS or (body.isdigit() and body.isascii()):
            raise ReplayError(f"label {label!r} is a logging value or a feature id, not a label member")
    if workers is not None and not (isinstance(workers, int) and 1 <= workers <= 4096):
        raise ReplayError(f"workers must be a count from 1 to 4096, got {workers!r}")
    if not (isinstance(blocksize, int) and 1 <= blocksize <= 1 << 30):
        raise ReplayError(f"blocksize must be from 1 byte to 1 GiB, got {blocksize!r}")
    if not (isinstance(max_line, int) and 1 <= max_line <= 1 << 30):
        raise ReplayError(f"max_line must be from 1 byte to 1 GiB, got {max_line!r}")
    if sum(bool(x) for x in (scheduler, client is not None, in_process)) > 1:
        raise ReplayError("give at most one of scheduler, client and in_process")
    if show_rate is not None:
        return ("show_rate", float(show_rate))
    if precision is not None:
        return ("precision", float(precision))
    return None


def _expand(logs) -> List[str]:
    """The files that the paths and patterns name, each once, in order."""
    items = [logs] if isinstance(logs, (str, bytes, os.PathLike)) else list(logs)
    if not items:
        raise ReplayError("no log files given")
    files: List[str] = []
    seen = set()
    for item in items:
        item = os.fsdecode(item)
        matches = sorted(glob.glob(item, recursive=True)) if glob.has_magic(item) else [item]
        if not matches:
            raise ReplayError(f"{item}: no file matches")
        for path in matches:
            if os.path.isdir(path):
                if glob.has_magic(item):
                    continue
                raise ReplayError(f"{path}: is a directory, not a log file")
            key = os.path.realpath(path)
            if key not in seen:
                seen.add(key)
                files.append(path)
    if not files:
        raise ReplayError(f"{items[0]}: no file matches")
    return files


def _plan(files: List[str], blocksize: int) -> Tuple[List[Block], List[bool]]:
    """Blocks of `blocksize` bytes; a compressed file is one block."""
    blocks: List[Block] = []
    compressed: List[bool] = []
    for i, path in enumerate(files):
        try:
            with open(path, "rb") as f:
                gz = f.read(2) == b"\x1f\x8b"
                size = os.fstat(f.fileno()).st_size
        except OSError as e:
            raise ReplayError(f"{path}: cannot be read: {e.strerror or e}") from None
        compressed.append(gz)
        if gz:
            blocks.append(Block(path, i, 0, 0, None, True))
        else:
            for j, start in enumerate(range(0, size, blocksize)):
                blocks.append(Block(path, i, j, start, min(start + blocksize, size), False))
    return blocks, compressed


def _run_in_threads(model: Model, blocks: List[Block], judging: Judging, threads: int) -> Optional[Tally]:
    total: Optional[Tally] = None
    with ThreadPoolExecutor(threads) as pool:
        todo = iter(blocks)
        running = set()
        try:
            while True:
                # A few blocks ahead of the threads, so that few tallies wait.
                while len(running) < 2 * threads:
                    block = next(todo, None)
                    if block is None:
                        break
                    running.add(pool.submit(tally_block, block, model, judging))
                if not running:
                    return total
                done, running = wait(running, return_when=FIRST_COMPLETED)
                for f in done:
                    tally = f.result()
                    total = tally if total is None else total.merge(tally)
        finally:
            for f in running:
                f.cancel()


def _worker_version() -> str:
    from . import __version__

    return __version__


def _connect(scheduler: Optional[str], workers: Optional[int]):
    try:
        from distributed import Client, LocalCluster
    except ImportError as e:
        raise ReplayError(f"replaying on a cluster needs Dask's distributed package ({e}); "
                          "install python3-distributed, or replay in process") from None
    if scheduler:
        try:
            client = Client(scheduler, timeout="20s")
        except (OSError, TimeoutError) as e:
            raise ReplayError(f"cannot reach the Dask scheduler at {scheduler}: {e}") from None
        return client, None
    import multiprocessing

    main = sys.modules.get("__main__")
    if getattr(main, "__name__", "") == "__mp_main__" or getattr(multiprocessing.current_process(), "_inheriting", False):
        # A worker process starts by importing the script that started the
        # cluster; without this it would start a cluster of its own, and so on.
        raise ReplayError("a LocalCluster cannot be started while a worker process starts: a script that "
                          "replays on one does so under 'if __name__ == \"__main__\":'")
    count = workers or os.cpu_count() or 1
    cluster = LocalCluster(n_workers=0, threads_per_worker=1, processes=True, dashboard_address=None,
                           silence_logs=logging.ERROR)
    try:
        client = Client(cluster)
        # Workers that cannot start are restarted for ever: wait for them a while only.
        cluster.scale(count)
        try:
            client.wait_for_workers(count, timeout=_WORKER_START_SECONDS)
        except Exception:  # a TimeoutError of the event loop's kind
            client.close()
            try:
                cluster.close(timeout=10)  # nannies busy restarting may not answer
            except Exception:
                pass
            raise ReplayError(f"the LocalCluster's {count} worker process(es) did not start within "
                              f"{_WORKER_START_SECONDS} s; a script that replays on a LocalCluster does so under "
                              "'if __name__ == \"__main__\":', since each worker process starts by importing it"
                              ) from None
        return client, cluster
    except ReplayError:
        raise
    except BaseException:
        cluster.close()
        raise


def _check_workers(client) -> None:
    from . import __version__

    try:
        client.wait_for_workers(1, timeout=60)
    except Exception:  # a TimeoutError of the event loop's kind
        raise ReplayError("the Dask cluster has no workers (none joined within 60 s)") from None
    try:
        versions = client.run(_worker_version)
    except Exception as e:
        raise ReplayError(f"the Dask workers cannot import reliqa ({type(e).__name__}: {e}); install the reliqa "
                          "wheel where the workers run, or start them with PYTHONPATH naming the folder that "
                          "holds the reliqa package") from None
    other = sorted(f"{w} has {v}" for w, v in versions.items() if v != __version__)
    if other:
        raise ReplayError(f"the Dask workers run another reliqa than this {__version__}: {', '.join(other)}")


def _run_on_dask(client, model: Model, blocks: List[Block], judging: Judging) -> Optional[Tally]:
    from distributed import as_completed

    if not blocks:
        return None
    # Once per worker: tasks get the model that the worker holds.
    [shared] = client.scatter([model], broadcast=True, hash=False)
    futures = client.map(tally_block, blocks, model=shared, judging=judging, pure=False)
    # Tallies are added on the workers, a few at a time as they come, so that
    # few wait in memory and only the sum comes back.
    ready = []
    done = as_completed(futures)
    try:
        for f in done:
            if f.status == "error":
                f.result()  # raises the task's error
            ready.append(f)
            if len(ready) >= _MERGE_FAN_IN or (done.count() == 0 and len(ready) > 1):
                done.add(client.submit(merge_tallies, *ready, pure=False))
                ready = []
        return ready[0].result()
    except Exception as e:
        client.cancel(futures + ready)
        if isinstance(e, ReplayError):
            raise
        if type(e).__name__ == "KilledWorker":
            raise ReplayError(f"the Dask workers died while replaying ({e})") from None
        raise


def _model_info(model: Model, name: str) -> Dict[str, Any]:
    return {"model": name, "sha256": hashlib.sha256(model.text).hexdigest(), "trees": model.num_trees,
            "features": int(len(model.feature_ids))}


def _report_data(tally: Tally, judging: Judging, target, model: Model, model_name: str, files: List[str],
                 compressed: List[bool], label: Optional[str]) -> Dict[str, Any]:
    figures = _report.figures(tally, judging, target)
    # Line numbers of each block's first line, from the lines of the blocks before it.
    first_line: Dict[Tuple[int, int], int] = {}
    per_file = [0] * len(files)
    for (f, b) in sorted(tally.lines):
        first_line[(f, b)] = per_file[f]
        per_file[f] += tally.lines[(f, b)]

    def where(f: int, b: int, line: int) -> str:
        return f"{files[f]}:{first_line.get((f, b), 0) + line}"

    data: Dict[str, Any] = {"candidate": _model_info(model, model_name), "label": label}
    data["logs"] = {
        "files": [{"path": p, "compressed": c, "lines": n} for p, c, n in zip(files, compressed, per_file)],
        "lines_read": tally.read,
        "refused": tally.refused,
        "refusals": [f"{where(f, b, line)}: {why}" for f, b, line, why in tally.reasons],
    }
    data["rows"] = figures.pop("rows")
    data["baseline"] = {
        "models": [{"model_id": m, "threshold": t, "rows": n}
                   for (m, t), n in sorted(tally.pairs.items(), key=lambda kv: (-kv[1], kv[0]))],
        "more_not_listed": tally.pairs_dropped,
    }
    data.update(figures)
    if judging.mode != "grid":
        data["flips"]["examples"] = {
            name: [{"where": where(f, b, line), "logged_score": s, "logged_threshold": t, "candidate_score": c}
                   for f, b, line, s, t, c in getattr(tally, attr)]
            for name, attr in (("shown_to_hidden", "to_hidden"), ("hidden_to_shown", "to_shown"))}
    data["grid"] = {"bins": GRID, "bin_width": 1 / GRID,
                    "auc_error_bound": "half the share of (positive, negative) pairs whose scores share a bin; "
                                       "given beside each AUC"}
    return data
