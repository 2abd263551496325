#!/usr/bin/python3
"""Replaying logs on Dask: rows per second with one worker and with two, and
the driver's memory as the logs grow.

    PYTHONPATH=build/python /usr/bin/python3 bench/replay_bench.py [--models DIR] [--lines N] [--work DIR]

Generates N (default 2,000,000) logged classification lines, as
`reliqa classify` prints them, with m500_d6's 74 features (DIR, default
build/xgboost-bench-models: build the target xgboost_bench_models first),
in two uncompressed JSON Lines files of N/2 lines under --work (default
build/replay-bench, kept for the next run). Feature values are drawn as the
model was trained and written as a phone writes doubles: a third rounded to
two decimals, a third to five, a third in full. The logged
score is the model's with noise, so that verdicts flip; the label follows the
model's probability.

Then, with a LocalCluster started beforehand (its start is not timed):
  - the native reader alone (one block, one thread), the ceiling of a core;
  - replay() with 1 worker and with 2 over all N lines: rows/s, the ratio, and
    rows per CPU second that the workers used (which other jobs on the
    machine change less than they change the time);
  - the driver's peak resident memory, each in a fresh process, replaying one
    file (N/2 lines) and both (N lines) on a LocalCluster of 2.
Prints one table per part, headed by the CPU flags.
"""

import argparse
import json
import math
import os
import resource
import subprocess
import sys
import time

import numpy as np

import reliqa

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from python_bench import cpu_flags, cpu_model  # noqa: E402

FEATURES = 74
CHUNK = 20_000


def write_logs(model, path, lines, seed):
    """`lines` logged results with feature vectors in the phone's texts."""
    rng = np.random.default_rng(seed)
    keys = [f'\\"{i}\\":' for i in range(1, FEATURES + 1)]
    style = np.arange(FEATURES) % 3  # 0: two decimals, 1: five, 2: in full
    tmp = path + ".tmp"
    with open(tmp, "w") as f:
        for start in range(0, lines, CHUNK):
            n = min(CHUNK, lines - start)
            X = rng.normal(size=(n, FEATURES))
            X[:, style == 0] = np.round(X[:, style == 0], 2)
            X[:, style == 1] = np.round(X[:, style == 1], 5)
            p = model.predict(X)
            logit = np.log(p / (1 - p)) + rng.normal(scale=1.0, size=n)
            logged = 1 / (1 + np.exp(-logit))
            label = rng.random(n) < p
            old = rng.random(n) < 0.1  # a tenth still on the model before
            columns = [[repr(v) for v in X[:, j].tolist()] for j in range(FEATURES)]
            out = []
            for r in range(n):
                fv = "{" + ",".join([k + c[r] for k, c in zip(keys, columns)]) + "}"
                s = repr(float(logged[r]))
                threshold = "0.45" if old[r] else "0.5"
                out.append('{"score":%s,"isOverThreshold":%s,"loggingData":{"score":"%s","model_id":"%s",'
                           '"feature_vector":"%s","threshold":"%s"},"user":"u%d","opened":%s}\n'
                           % (s, "true" if logged[r] > float(threshold) else "false", s,
                              "m500-v0" if old[r] else "m500-v1", fv, threshold, start + r,
                              "true" if label[r] else "false"))
            f.write("".join(out))
    os.replace(tmp, path)


def ensure_logs(model, work, lines):
    os.makedirs(work, exist_ok=True)
    half = lines // 2
    paths = [os.path.join(work, f"logs-{half}-{i}.jsonl") for i in (1, 2)]
    for i, path in enumerate(paths):
        if not os.path.exists(path):
            started = time.perf_counter()
            write_logs(model, path, half, seed=100 + i)
            print(f"generated {path} in {time.perf_counter() - started:.0f} s", file=sys.stderr)
    return paths


def native_rate(model, path, lines=200_000):
    """Rows/s of the native reader and scorer alone, one thread, one block."""
    with open(path, "rb") as f:
        data = b"".join(f.readline() for _ in range(lines))
    best = math.inf
    for _ in range(3):
        started = time.perf_counter()
        rows = model._native.replay_block(data, "opened", 1, 1 << 20, 10)
        best = min(best, time.perf_counter() - started)
    return rows["candidate"].size / best


# The peak is the process's VmHWM: ru_maxrss would start from the resident
# size of the process that started it (Linux carries it across exec).
def _cpu_seconds():
    usage = resource.getrusage(resource.RUSAGE_SELF)
    return usage.ru_utime + usage.ru_stime


def worker_cpu(client):
    """CPU seconds that the worker processes have used so far, in all."""
    return sum(client.run(_cpu_seconds).values())


PEAK_RSS_CHILD = """
import json, sys, reliqa
logs = json.loads(sys.argv[2])
report = reliqa.replay(logs, sys.argv[1], label="opened", workers=2)
with open("/proc/self/status") as f:
    peak = next(int(line.split()[1]) for line in f if line.startswith("VmHWM:"))
print(report.data["logs"]["lines_read"], peak)
"""


def main():
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--models", default="build/xgboost-bench-models")
    parser.add_argument("--lines", type=int, default=2_000_000)
    parser.add_argument("--work", default="build/replay-bench")
    parser.add_argument("--repeat", type=int, default=2)
    args = parser.parse_args()

    import logging
    from distributed import Client, LocalCluster

    model_path = os.path.join(args.models, "m500_d6.txt")
    model = reliqa.Model.load(model_path)
    paths = ensure_logs(model, args.work, args.lines)
    size = sum(os.path.getsize(p) for p in paths)
    print(f"CPU: {cpu_model()}, {os.cpu_count()} cores; flags: {cpu_flags()}")
    print(f"logs: {len(paths)} files, {args.lines:,} lines, {size / 1e9:.2f} GB ({size / args.lines:.0f} bytes "
          f"per line); model m500_d6 ({model.num_trees} trees over {len(model.feature_ids)} features); "
          f"label 'opened'; best of {args.repeat}\n")

    print(f"native reader and scorer alone, one thread: {native_rate(model, paths[0]):,.0f} rows/s\n")

    print("| run | workers | seconds | rows/s | rows/s per worker | rows per CPU second of the workers |")
    print("|---|---:|---:|---:|---:|---:|")
    rates = {}
    reports = {}
    for workers in (1, 2):
        with LocalCluster(n_workers=workers, threads_per_worker=1, processes=True, dashboard_address=None,
                          silence_logs=logging.ERROR) as cluster, Client(cluster) as client:
            reliqa.replay(paths[0], model, label="opened", client=client, blocksize=8 << 20)  # warm up
            best = cpu = math.inf
            for _ in range(args.repeat):
                started, cpu_before = time.perf_counter(), worker_cpu(client)
                reports[workers] = reliqa.replay(paths, model, label="opened", client=client)
                best = min(best, time.perf_counter() - started)
                cpu = min(cpu, worker_cpu(client) - cpu_before)
        rows = reports[workers].data["logs"]["lines_read"]
        rates[workers] = rows / best
        print(f"| LocalCluster | {workers} | {best:.2f} | {rates[workers]:,.0f} | {rates[workers] / workers:,.0f} "
              f"| {rows / cpu:,.0f} |")
    same = json.dumps({k: v for k, v in reports[1].data.items() if k != "run"}) == \
        json.dumps({k: v for k, v in reports[2].data.items() if k != "run"})
    print(f"\ntwo workers over one: {rates[2] / rates[1]:.2f}x; the two reports are "
          f"{'the same' if same else 'DIFFERENT'}\n")

    print("| driver (LocalCluster of 2) | lines | peak RSS |")
    print("|---|---:|---:|")
    for logs in ([paths[0]], paths):
        child = subprocess.run([sys.executable, "-c", PEAK_RSS_CHILD, model_path, json.dumps(logs)],
                               capture_output=True, text=True, check=True, env=os.environ)
        lines, peak = (int(v) for v in child.stdout.split())
        print(f"| replay() | {lines:,} | {peak / 1024:.0f} MiB |")


if __name__ == "__main__":
    main()
