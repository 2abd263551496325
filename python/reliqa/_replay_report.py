"""The replay's figures, from the summed tally, and the report that shows them:
report.json, and report.html with its charts inline (matplotlib, as SVG).

Every figure is computed from exact integer counts in a fixed order, so the
same logs give the same report, bit for bit, however the work was split.
"""

from __future__ import annotations

import html
import io
import json
import math
import os
import tempfile
from typing import Any, Dict, List, Optional, Sequence, Tuple

import numpy as np

from ._replay_tally import GRID, HIDDEN, NONE, SHOWN, Judging, Tally

DISPLAY_BINS = 256  # histogram bins and curve points in report.json


def suffix_sums(h: np.ndarray) -> np.ndarray:
    """s[..., k] = rows in bins k and above, for k = 0 .. GRID: the rows whose
    score is above k / GRID (for 1 <= k < GRID)."""
    s = np.zeros(h.shape[:-1] + (GRID + 1,), np.int64)
    s[..., :GRID] = np.cumsum(h[..., ::-1], axis=-1)[..., ::-1]
    return s


def auc(positive: np.ndarray, negative: np.ndarray) -> Optional[Dict[str, Any]]:
    """ROC AUC from per-class histograms on the grid, with the bound of its
    error. Pairs in one bin count one half; each such pair is off by at most
    one half, so the AUC of the exact scores lies within `error_bound`.
    Python integers throughout, then one correctly rounded division."""
    pos = [int(v) for v in positive]
    neg = [int(v) for v in negative]
    p, n = sum(pos), sum(neg)
    if p == 0 or n == 0:
        return None
    below = 0
    wins = 0
    ties = 0
    for a, b in zip(pos, neg):
        wins += a * below
        ties += a * b
        below += b
    return {"auc": (2 * wins + ties) / (2 * p * n), "error_bound": ties / (2 * p * n),
            "positives": p, "negatives": n}


def _ratio(a: int, b: int) -> Optional[float]:
    return a / b if b else None


def pick_threshold(kind: str, target: float, shown: np.ndarray, positive: Optional[np.ndarray] = None
                   ) -> Tuple[int, bool]:
    """The grid threshold k (score > k / GRID) that meets a show rate (the
    lowest whose rate is at most `target`) or a precision (the lowest, so the
    highest recall, whose precision is at least `target`), and whether one
    does. `shown[k]` and `positive[k]` are suffix sums."""
    ks = np.arange(1, GRID)
    if kind == "show_rate":
        total = int(shown[0])
        meets = np.flatnonzero(shown[ks] <= target * total)
        return (int(ks[meets[0]]), True) if meets.size else (GRID - 1, False)
    counts = shown[ks]
    with np.errstate(invalid="ignore", divide="ignore"):
        precision = np.where(counts > 0, positive[ks] / np.maximum(counts, 1), -1.0)
    meets = np.flatnonzero(precision >= target)
    if meets.size:
        return int(ks[meets[0]]), True
    best = np.flatnonzero(precision == precision.max())
    return int(ks[best[0]]), False


def figures(tally: Tally, judging: Judging, target: Optional[Tuple[str, float]]) -> Dict[str, Any]:
    """Everything the report says that follows from the counts."""
    cand = tally.candidate            # [class, baseline verdict, bin]
    labeled = tally.classes == 2
    cand_all = cand.sum(axis=(0, 1))
    cand_logged = cand[:, :NONE].sum(axis=(0, 1))
    logged_all = tally.logged.sum(axis=0)
    s_cand = suffix_sums(cand_all)
    s_logged = suffix_sums(logged_all)

    out: Dict[str, Any] = {}
    verdicts = tally.verdicts.copy()
    if judging.mode == "grid":
        kind, value = target
        k, met = pick_threshold(kind, value, s_cand, suffix_sums(cand[1].sum(axis=0)) if labeled else None)
        shown = suffix_sums(cand)[..., k]                # [class, baseline verdict]
        verdicts[:] = 0
        verdicts[:, :, SHOWN] = shown
        verdicts[:, :, HIDDEN] = cand.sum(axis=2) - shown
        out["judged_at"] = {"rule": kind, "target": value, "threshold": k / GRID, "met": met}
    elif judging.mode == "fixed":
        out["judged_at"] = {"rule": "threshold", "threshold": judging.threshold}
    else:
        out["judged_at"] = {"rule": "logged thresholds", "threshold": None}
    out["judged_at"]["unjudged_rows"] = int(verdicts[:, :, NONE].sum())

    rows = int(cand.sum())
    with_baseline = int(cand[:, :NONE].sum())
    judged = int(verdicts[:, :, :NONE].sum())
    judged_logged = int(verdicts[:, :NONE, :NONE].sum())
    out["rows"] = {"scored": rows, "with_baseline": with_baseline, "bare": rows - with_baseline}
    out["show_rate"] = {
        "candidate": _ratio(int(verdicts[:, :, SHOWN].sum()), judged),
        "candidate_on_baseline_rows": _ratio(int(verdicts[:, :NONE, SHOWN].sum()), judged_logged),
        "baseline": _ratio(int(cand[:, SHOWN].sum()), with_baseline),
    }
    out["flips"] = {
        "rows_compared": judged_logged,
        "shown_to_hidden": int(verdicts[:, SHOWN, HIDDEN].sum()),
        "hidden_to_shown": int(verdicts[:, HIDDEN, SHOWN].sum()),
        "unchanged": int(verdicts[:, HIDDEN, HIDDEN].sum() + verdicts[:, SHOWN, SHOWN].sum()),
    }

    # Thresholds of the grid at which the curves are given.
    ks = np.arange(1, DISPLAY_BINS) * (GRID // DISPLAY_BINS)
    out["curves"] = {"thresholds": (ks / GRID).tolist(),
                     "candidate": {"show_rate": _rates(s_cand[ks], rows)},
                     "baseline": {"show_rate": _rates(s_logged[ks], with_baseline)}}
    out["histograms"] = {
        "bins": DISPLAY_BINS,
        "candidate": cand_all.reshape(DISPLAY_BINS, -1).sum(axis=1).tolist(),
        "candidate_on_baseline_rows": cand_logged.reshape(DISPLAY_BINS, -1).sum(axis=1).tolist(),
        "baseline": logged_all.reshape(DISPLAY_BINS, -1).sum(axis=1).tolist(),
    }
    if target is not None:
        kind, value = target
        met = {}
        for who, s, pos in (("candidate", s_cand, cand[1].sum(axis=0) if labeled else None),
                            ("baseline", s_logged, tally.logged[1] if labeled else None)):
            if int(s[0]) == 0:
                met[who] = None
                continue
            s_pos = suffix_sums(pos) if pos is not None else None
            k, ok = pick_threshold(kind, value, s, s_pos)
            entry = {"threshold": k / GRID, "met": ok, "show_rate": _ratio(int(s[k]), int(s[0]))}
            if s_pos is not None:
                entry["precision"] = _ratio(int(s_pos[k]), int(s[k]))
                entry["recall"] = _ratio(int(s_pos[k]), int(s_pos[0]))
            met[who] = entry
        out["meeting_target"] = {"rule": kind, "target": value, **met}

    if labeled:
        out["labels"] = _label_figures(tally, verdicts, ks)
    return out


def _rates(counts: np.ndarray, total: int) -> List[Optional[float]]:
    return [c / total if total else None for c in counts.tolist()]


def _label_figures(tally: Tally, verdicts: np.ndarray, ks: np.ndarray) -> Dict[str, Any]:
    cand = tally.candidate
    out: Dict[str, Any] = {
        "positives": int(cand[1].sum()), "negatives": int(cand[0].sum()),
        "positives_with_baseline": int(cand[1, :NONE].sum()),
        "negatives_with_baseline": int(cand[0, :NONE].sum()),
    }
    out["auc"] = {
        "candidate": auc(cand[1].sum(axis=0), cand[0].sum(axis=0)),
        "candidate_on_baseline_rows": auc(cand[1, :NONE].sum(axis=0), cand[0, :NONE].sum(axis=0)),
        "baseline": auc(tally.logged[1], tally.logged[0]),
    }

    def point(tp: int, fp: int, fn: int) -> Dict[str, Any]:
        return {"shown": tp + fp, "true_positives": tp, "false_positives": fp, "false_negatives": fn,
                "precision": _ratio(tp, tp + fp), "recall": _ratio(tp, tp + fn)}

    out["at_verdicts"] = {
        "candidate": point(int(verdicts[1, :, SHOWN].sum()), int(verdicts[0, :, SHOWN].sum()),
                           int(verdicts[1, :, HIDDEN].sum())),
        "candidate_on_baseline_rows": point(int(verdicts[1, :NONE, SHOWN].sum()),
                                            int(verdicts[0, :NONE, SHOWN].sum()),
                                            int(verdicts[1, :NONE, HIDDEN].sum())),
        "baseline": point(int(cand[1, SHOWN].sum()), int(cand[0, SHOWN].sum()), int(cand[1, HIDDEN].sum())),
    }
    curves = {}
    for who, pos, neg in (("candidate", cand[1].sum(axis=0), cand[0].sum(axis=0)),
                          ("baseline", tally.logged[1], tally.logged[0])):
        sp, sn = suffix_sums(pos), suffix_sums(neg)
        tp, fp = sp[ks], sn[ks]
        curves[who] = {"precision": [_ratio(a, a + b) for a, b in zip(tp.tolist(), fp.tolist())],
                       "recall": [_ratio(a, int(sp[0])) for a in tp.tolist()]}
    out["curves"] = curves
    return out


# ---------------------------------------------------------------- the report

def _finite(x: Any) -> Any:
    """The value with NaN and infinities as null (report.json is strict JSON)."""
    if isinstance(x, float):
        return x if math.isfinite(x) else None
    if isinstance(x, dict):
        return {k: _finite(v) for k, v in x.items()}
    if isinstance(x, (list, tuple)):
        return [_finite(v) for v in x]
    return x


def write_atomically(path: str, text: str) -> None:
    folder = os.path.dirname(path) or "."
    fd, tmp = tempfile.mkstemp(prefix=os.path.basename(path) + ".", dir=folder)
    try:
        with os.fdopen(fd, "w", encoding="utf-8") as f:
            f.write(text)
        os.chmod(tmp, 0o644)
        os.replace(tmp, path)
    except BaseException:
        if os.path.exists(tmp):
            os.unlink(tmp)
        raise


def report_json(data: Dict[str, Any]) -> str:
    return json.dumps(_finite(data), indent=1, allow_nan=False) + "\n"


# The colours of the two models in every chart.
CANDIDATE = "#1f5fa8"
BASELINE = "#c8501e"


def _svg(fig, name: str) -> str:
    """A figure as inline SVG markup, the same bytes for the same figure."""
    import matplotlib

    buf = io.StringIO()
    with matplotlib.rc_context({"svg.hashsalt": name, "svg.fonttype": "path"}):
        fig.savefig(buf, format="svg", metadata={"Date": None, "Creator": None})
    svg = buf.getvalue()
    return svg[svg.index("<svg"):]


def _figure(width: float = 9.0, height: float = 3.6):
    from matplotlib.figure import Figure

    fig = Figure(figsize=(width, height), layout="constrained")
    return fig, fig.subplots()


def _style(ax, xlabel: str, ylabel: str) -> None:
    ax.set_xlabel(xlabel)
    ax.set_ylabel(ylabel)
    ax.grid(True, color="#dddddd", linewidth=0.6)
    for side in ("top", "right"):
        ax.spines[side].set_visible(False)


def _score_chart(tally: Tally, data: Dict[str, Any]) -> str:
    fig, ax = _figure()
    edges = np.linspace(0.0, 1.0, DISPLAY_BINS + 1)
    h = data["histograms"]
    cand = np.array(h["candidate"], float)
    base = np.array(h["baseline"], float)
    if cand.sum():
        ax.stairs(cand / cand.sum(), edges, color=CANDIDATE, linewidth=1.4,
                  label=f"candidate ({int(cand.sum()):,} rows)")
    if base.sum():
        ax.stairs(base / base.sum(), edges, color=BASELINE, linewidth=1.4,
                  label=f"logged scores ({int(base.sum()):,} rows)")
    t = data["judged_at"]["threshold"]
    if t is not None:
        ax.axvline(t, color=CANDIDATE, linestyle="--", linewidth=1, label=f"candidate threshold {t:.4g}")
    for model in data["baseline"]["models"][:3]:
        ax.axvline(model["threshold"], color=BASELINE, linestyle=":", linewidth=1)
    ax.set_xlim(0, 1)
    _style(ax, "score", f"share of rows per bin of {1 / DISPLAY_BINS:.4g}")
    ax.legend(frameon=False, fontsize=8)
    return _svg(fig, "scores")


def _show_rate_chart(data: Dict[str, Any]) -> str:
    fig, ax = _figure()
    c = data["curves"]
    t = np.array(c["thresholds"])
    for who, colour, name in (("candidate", CANDIDATE, "candidate"), ("baseline", BASELINE, "logged scores")):
        rate = np.array([np.nan if v is None else v for v in c[who]["show_rate"]])
        if np.isfinite(rate).any():
            ax.plot(t, rate, color=colour, linewidth=1.4, label=name)
    j = data["judged_at"]
    if j["threshold"] is not None and data["show_rate"]["candidate"] is not None:
        ax.plot([j["threshold"]], [data["show_rate"]["candidate"]], "o", color=CANDIDATE,
                label="candidate as judged")
    if data["show_rate"]["baseline"] is not None:
        ax.axhline(data["show_rate"]["baseline"], color=BASELINE, linestyle=":", linewidth=1,
                   label="baseline as logged")
    ax.set_xlim(0, 1)
    ax.set_ylim(0, 1)
    _style(ax, "threshold (shown when the score is above it)", "show rate")
    ax.legend(frameon=False, fontsize=8)
    return _svg(fig, "show-rate")


def _thin(k: np.ndarray, limit: int = 1500) -> np.ndarray:
    return k if k.size <= limit else k[np.linspace(0, k.size - 1, limit).round().astype(int)]


def _roc_chart(tally: Tally, data: Dict[str, Any]) -> str:
    fig, ax = _figure(4.8, 4.6)
    cand = tally.candidate
    a = data["labels"]["auc"]
    for who, pos, neg, colour, name in (
            ("candidate", cand[1].sum(axis=0), cand[0].sum(axis=0), CANDIDATE, "candidate"),
            ("baseline", tally.logged[1], tally.logged[0], BASELINE, "logged scores")):
        if a[who] is None:
            continue
        sp, sn = suffix_sums(pos), suffix_sums(neg)
        ks = _thin(np.flatnonzero(np.diff(sp + sn, prepend=-1) != 0))
        ax.plot(sn[ks] / sn[0], sp[ks] / sp[0], color=colour, linewidth=1.4,
                label=f"{name}: AUC {a[who]['auc']:.4f}")
    ax.plot([0, 1], [0, 1], color="#999999", linewidth=0.8, linestyle="--")
    ax.set_xlim(0, 1)
    ax.set_ylim(0, 1)
    ax.set_aspect("equal")
    _style(ax, "false positive rate", "true positive rate")
    ax.legend(frameon=False, fontsize=8, loc="lower right")
    return _svg(fig, "roc")


def _precision_recall_chart(tally: Tally, data: Dict[str, Any]) -> str:
    fig, ax = _figure()
    cand = tally.candidate
    ks = np.arange(1, GRID, 16)
    for pos, neg, colour, name in ((cand[1].sum(axis=0), cand[0].sum(axis=0), CANDIDATE, "candidate"),
                                   (tally.logged[1], tally.logged[0], BASELINE, "logged scores")):
        sp, sn = suffix_sums(pos), suffix_sums(neg)
        if sp[0] == 0:
            continue
        shown = sp[ks] + sn[ks]
        keep = shown > 0
        t = ks[keep] / GRID
        ax.plot(t, sp[ks][keep] / shown[keep], color=colour, linewidth=1.4, label=f"{name} precision")
        ax.plot(ks / GRID, sp[ks] / sp[0], color=colour, linewidth=1.4, linestyle="--", label=f"{name} recall")
    lab = data["labels"]["at_verdicts"]
    t = data["judged_at"]["threshold"]
    if t is not None and lab["candidate"]["precision"] is not None:
        ax.plot([t], [lab["candidate"]["precision"]], "o", color=CANDIDATE)
        ax.plot([t], [lab["candidate"]["recall"]], "s", color=CANDIDATE, fillstyle="none")
    ax.set_xlim(0, 1)
    ax.set_ylim(0, 1.02)
    _style(ax, "threshold (shown when the score is above it)", "precision, recall")
    ax.legend(frameon=False, fontsize=8, ncol=2)
    return _svg(fig, "precision-recall")


def _pct(x: Optional[float]) -> str:
    return "–" if x is None else f"{100 * x:.2f}%"


def _num(x: Optional[float], digits: int = 4) -> str:
    return "–" if x is None else f"{x:.{digits}f}"


def _table(head: Sequence[str], rows: Sequence[Sequence[Any]]) -> str:
    th = "".join(f"<th>{html.escape(str(h))}</th>" for h in head)
    body = "".join("<tr>" + "".join(f"<td>{c}</td>" for c in r) + "</tr>" for r in rows)
    return f"<table><thead><tr>{th}</tr></thead><tbody>{body}</tbody></table>"


_STYLE = """
body { font: 15px/1.45 system-ui, -apple-system, "Segoe UI", sans-serif; color: #222; margin: 2em auto;
       max-width: 64em; padding: 0 1.5em; }
h1 { font-size: 1.5em; margin-bottom: 0.2em; } h2 { font-size: 1.15em; margin-top: 1.8em;
     border-bottom: 1px solid #ddd; padding-bottom: 0.2em; }
.sub { color: #666; margin-top: 0; }
table { border-collapse: collapse; margin: 0.6em 0; } th, td { padding: 0.25em 0.8em; text-align: right; }
th { background: #f3f3f3; font-weight: 600; } td:first-child, th:first-child { text-align: left; }
tr:nth-child(even) td { background: #fafafa; }
.cards { display: flex; flex-wrap: wrap; gap: 0.8em; margin: 1em 0; }
.card { border: 1px solid #ddd; border-radius: 6px; padding: 0.6em 1em; min-width: 10em; }
.card b { display: block; font-size: 1.4em; } .card span { color: #666; font-size: 0.9em; }
.chart svg { width: 100%; height: auto; display: block; margin: 0.8em 0; }
.chart.square svg { width: 48%; }
code, .mono { font-family: ui-monospace, "DejaVu Sans Mono", monospace; font-size: 0.9em; }
.note { color: #555; font-size: 0.92em; } .warn { color: #a33; }
"""


def report_html(data: Dict[str, Any], tally: Tally) -> str:
    e = html.escape
    logs, rates, flips, judged = data["logs"], data["show_rate"], data["flips"], data["judged_at"]
    if judged["rule"] == "logged thresholds":
        rule = "at each row's logged threshold"
    elif judged["rule"] == "threshold":
        rule = f"at the threshold {judged['threshold']:g}"
    else:
        what = "show rate" if judged["rule"] == "show_rate" else "precision"
        rule = (f"at {judged['threshold']:.6g}, the grid threshold that meets the {what} {judged['target']:g}"
                + ("" if judged["met"] else " <span class='warn'>(none meets it: the nearest)</span>"))
    parts = [f"<!DOCTYPE html><html lang='en'><head><meta charset='utf-8'>"
             f"<title>Replay of {e(data['candidate']['model'])}</title><style>{_STYLE}</style></head><body>",
             f"<h1>Replay of {e(data['candidate']['model'])}</h1>",
             f"<p class='sub'>{data['candidate']['trees']} trees over {data['candidate']['features']} features; "
             f"judged {rule}; {len(logs['files'])} log file(s).</p>"]
    cards = [("rows scored", f"{data['rows']['scored']:,}"),
             ("lines refused", f"{logs['refused']:,}"),
             ("candidate show rate", _pct(rates["candidate"])),
             ("baseline show rate", _pct(rates["baseline"])),
             ("shown → hidden", f"{flips['shown_to_hidden']:,}"),
             ("hidden → shown", f"{flips['hidden_to_shown']:,}")]
    if "labels" in data and data["labels"]["auc"]["candidate"]:
        cards.append(("candidate AUC", _num(data["labels"]["auc"]["candidate"]["auc"])))
    if "labels" in data and data["labels"]["auc"]["baseline"]:
        cards.append(("baseline AUC", _num(data["labels"]["auc"]["baseline"]["auc"])))
    parts.append("<div class='cards'>" + "".join(f"<div class='card'><b>{v}</b><span>{e(k)}</span></div>"
                                                 for k, v in cards) + "</div>")

    parts.append("<h2>Verdicts</h2>")
    compared = flips["rows_compared"]
    parts.append(_table(["", "rows", "share"], [
        ["rows with a logged verdict, judged by both", f"{compared:,}", ""],
        ["shown by the baseline, hidden by the candidate", f"{flips['shown_to_hidden']:,}",
         _pct(flips["shown_to_hidden"] / compared if compared else None)],
        ["hidden by the baseline, shown by the candidate", f"{flips['hidden_to_shown']:,}",
         _pct(flips["hidden_to_shown"] / compared if compared else None)],
        ["same verdict", f"{flips['unchanged']:,}", _pct(flips["unchanged"] / compared if compared else None)],
    ]))
    parts.append(_table(["show rate", "candidate", "baseline"], [
        ["rows with a baseline", _pct(rates["candidate_on_baseline_rows"]), _pct(rates["baseline"])],
        ["all rows judged", _pct(rates["candidate"]), ""]]))
    if judged["unjudged_rows"]:
        parts.append(f"<p class='note'>{judged['unjudged_rows']:,} bare feature rows have no logged threshold "
                     "to judge the candidate at; they count in the scores and curves only.</p>")
    examples = data["flips"].get("examples")
    if examples is None:
        parts.append("<p class='note'>Flipped rows are listed by line when the candidate's threshold is known "
                     "before the run (a fixed threshold, or the logged ones).</p>")
    if examples:
        for key, title in (("shown_to_hidden", "First rows shown by the baseline and hidden by the candidate"),
                           ("hidden_to_shown", "First rows hidden by the baseline and shown by the candidate")):
            if examples[key]:
                parts.append(f"<p class='note'>{title}:</p>" + _table(
                    ["line", "logged score", "logged threshold", "candidate score"],
                    [[f"<span class='mono'>{e(x['where'])}</span>", _num(x["logged_score"], 6),
                      f"{x['logged_threshold']:g}", _num(x["candidate_score"], 6)] for x in examples[key]]))

    parts.append("<h2>Scores</h2><div class='chart'>" + _score_chart(tally, data) + _show_rate_chart(data)
                 + "</div>")
    target = data.get("meeting_target")
    if target:
        what = "show rate" if target["rule"] == "show_rate" else "precision"
        rows = []
        for who in ("candidate", "baseline"):
            m = target[who]
            if m is None:
                continue
            rows.append([who, f"{m['threshold']:.6g}" + ("" if m["met"] else " (not met)"), _pct(m["show_rate"]),
                         _pct(m.get("precision")), _pct(m.get("recall"))])
        parts.append(f"<p>Thresholds that meet the {what} {target['target']:g}:</p>"
                     + _table(["scores", "threshold", "show rate", "precision", "recall"], rows))

    if "labels" in data:
        lab = data["labels"]
        parts.append(f"<h2>Labels (<code>{e(data['label'])}</code>)</h2>")
        parts.append(f"<p>{lab['positives']:,} positive and {lab['negatives']:,} negative rows "
                     f"({lab['positives_with_baseline']:,} and {lab['negatives_with_baseline']:,} with a baseline).</p>")
        rows = []
        shown_models = [("candidate", "candidate, all rows"),
                        ("candidate_on_baseline_rows", "candidate, rows with a baseline"),
                        ("baseline", "baseline (logged scores)")]
        if data["rows"]["bare"] == 0:
            del shown_models[1]  # the same rows
        for who, name in shown_models:
            a, p = lab["auc"][who], lab["at_verdicts"][who]
            rows.append([name, _num(a["auc"]) if a else "–", f"± {a['error_bound']:.2g}" if a else "–",
                         _pct(p["precision"]), _pct(p["recall"]), f"{p['shown']:,}"])
        parts.append(_table(["", "ROC AUC", "grid bound", "precision", "recall", "shown"], rows))
        parts.append("<p class='note'>Precision and recall are those of the verdicts above: the baseline's at "
                     "the logged thresholds, the candidate's as judged.</p>")
        parts.append("<div class='chart'>" + _precision_recall_chart(tally, data) + "</div><div class='chart "
                     "square'>" + _roc_chart(tally, data) + "</div>")

    base = data["baseline"]
    parts.append("<h2>Logged models and thresholds</h2>")
    if base["models"]:
        parts.append(_table(["model id", "threshold", "rows"],
                            [[f"<span class='mono'>{e(m['model_id'])}</span>", f"{m['threshold']:g}",
                              f"{m['rows']:,}"] for m in base["models"]]))
        if base["more_not_listed"]:
            parts.append(f"<p class='note'>More pairs were logged; the first {len(base['models'])} "
                         "by model id and threshold are listed.</p>")
    else:
        parts.append("<p>No row carries a logged classification (bare feature rows only).</p>")

    parts.append("<h2>Lines read</h2>")
    parts.append(_table(["file", "lines"], [[f"<span class='mono'>{e(f['path'])}</span>", f"{f['lines']:,}"]
                                            for f in logs["files"]]))
    parts.append(f"<p>{logs['lines_read']:,} lines that are not blank: {data['rows']['scored']:,} rows "
                 f"scored ({data['rows']['bare']:,} of them bare feature rows), {logs['refused']:,} refused.</p>")
    if logs["refusals"]:
        parts.append("<p>First lines refused:</p><ul>" + "".join(
            f"<li class='mono'>{e(r)}</li>" for r in logs["refusals"]) + "</ul>")

    grid = data["grid"]
    parts.append("<h2>Method</h2>")
    parts.append(f"<p class='note'>Scores are counted in {grid['bins']:,} bins of width 1/{grid['bins']:,} "
                 "over [0, 1]; every count is an exact integer, so the report does not depend on how the logs "
                 "were split. Curves and the thresholds that meet a target use the bins' edges. The AUC counts "
                 "pairs of a positive and a negative row in one bin as one half; "
                 "the AUC of the exact scores is within the bound given beside it "
                 f"(half the share of such pairs). {e(data['run']['summary'])}</p>")
    parts.append("</body></html>\n")
    return "".join(parts)
