"""What the Python benchmarks share: the machine's description and timing."""

import time

FLAGS = ("fma", "sse4_2", "avx2", "bmi2", "avx512f")


def cpu_flags():
    """The CPU flags that pick kernels, as /proc/cpuinfo lists them."""
    with open("/proc/cpuinfo") as f:
        for line in f:
            if line.startswith("flags"):
                have = set(line.split(":", 1)[1].split())
                return " ".join(f for f in FLAGS if f in have) or "(none of " + " ".join(FLAGS) + ")"
    return "unknown"


def cpu_model():
    with open("/proc/cpuinfo") as f:
        for line in f:
            if line.startswith("model name"):
                return line.split(":", 1)[1].strip()
    return "unknown"


def best_time(fn, repeat):
    """The best wall time of `repeat` calls of fn, in seconds."""
    best = float("inf")
    for _ in range(repeat):
        start = time.perf_counter()
        fn()
        best = min(best, time.perf_counter() - start)
    return best
