"""python3 -m reliqa COMMAND: the package's commands.

    python3 -m reliqa replay LOGS... --model NEW.txt [--threshold T | --show-rate R | --precision P]
                             [--label FIELD] [--scheduler ADDRESS | --workers N | --in-process]
                             [--out REPORT_DIR]

Exit status: 0 on success, 2 for a refused command line or a replay that
cannot be done (the message names the file or the option), 1 otherwise.
"""

from __future__ import annotations

import argparse
import os
import sys
from typing import List, Optional


def _fraction(text: str) -> float:
    try:
        value = float(text)
    except ValueError:
        raise argparse.ArgumentTypeError(f"expected a number, got {text!r}") from None
    return value


def _count(text: str) -> int:
    try:
        value = int(text)
    except ValueError:
        raise argparse.ArgumentTypeError(f"expected a whole number, got {text!r}") from None
    return value


def _bytes(text: str) -> int:
    units = {"k": 1 << 10, "m": 1 << 20, "g": 1 << 30}
    t = text.strip().lower().removesuffix("ib").removesuffix("b")
    scale = units.get(t[-1:], 1)
    try:
        return int(float(t[:-1] if scale > 1 else t) * scale)
    except ValueError:
        raise argparse.ArgumentTypeError(f"expected a size such as 64M, got {text!r}") from None


def _parser() -> argparse.ArgumentParser:
    parser = argparse.ArgumentParser(prog="python3 -m reliqa", description="The reliqa package's commands.")
    commands = parser.add_subparsers(dest="command", required=True, metavar="COMMAND")
    r = commands.add_parser(
        "replay", help="score logged classifications with a candidate model and report what would change",
        description="Scores the logged feature vectors of classification results with a candidate model "
                    "and reports, beside the logged scores, thresholds and verdicts: show rates, verdicts that "
                    "flip, score histograms and, with labels, ROC AUC and precision and recall along the "
                    "thresholds. Writes REPORT_DIR/report.json and REPORT_DIR/report.html.")
    r.add_argument("logs", nargs="+", metavar="LOGS",
                   help="JSON Lines files or glob patterns, plain or gzip-compressed")
    r.add_argument("--model", required=True, metavar="NEW.txt", help="the candidate model text")
    judged = r.add_mutually_exclusive_group()
    judged.add_argument("--threshold", type=_fraction, metavar="T", help="judge the candidate at T")
    judged.add_argument("--show-rate", type=_fraction, metavar="R",
                        help="judge it at the lowest threshold whose show rate is at most R")
    judged.add_argument("--precision", type=_fraction, metavar="P",
                        help="judge it at the lowest threshold whose precision is at least P (needs --label)")
    r.add_argument("--label", metavar="FIELD", help="the member of each line holding its label: true/false or 1/0")
    where = r.add_mutually_exclusive_group()
    where.add_argument("--scheduler", metavar="ADDRESS",
                       help="join the Dask cluster of this scheduler (default: start a LocalCluster)")
    where.add_argument("--in-process", action="store_true", help="run in this process's threads, without Dask")
    r.add_argument("--workers", type=_count, metavar="N",
                   help="worker processes of the LocalCluster, or threads in process (default: one per core)")
    r.add_argument("--out", default="replay-report", metavar="REPORT_DIR",
                   help="where report.json and report.html go (default: %(default)s)")
    r.add_argument("--blocksize", type=_bytes, default=None, metavar="BYTES",
                   help="bytes of an uncompressed file per task (default: 64M)")
    return parser


def main(argv: Optional[List[str]] = None) -> int:
    args = _parser().parse_args(argv)
    from . import ReplayError, replay
    from ._replay import DEFAULT_BLOCKSIZE

    if args.scheduler and args.workers is not None:
        print("reliqa replay: --workers is for the LocalCluster or --in-process; a scheduler has its own",
              file=sys.stderr)
        return 2
    try:
        report = replay(args.logs, args.model, threshold=args.threshold, show_rate=args.show_rate,
                        precision=args.precision, label=args.label, scheduler=args.scheduler,
                        workers=args.workers, in_process=args.in_process, out=args.out,
                        blocksize=args.blocksize or DEFAULT_BLOCKSIZE)
    except (ReplayError, ValueError) as e:
        print(f"reliqa replay: {e}", file=sys.stderr)
        return 2
    print(report.summary())
    print(f"report: {os.path.join(args.out, 'report.html')}")
    return 0


if __name__ == "__main__":
    sys.exit(main())
