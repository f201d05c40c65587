"""What a soak counts and finds wrong, and the figures of a process."""
import collections
import os
import threading
import time


class Report:
    """Counts what was done, and keeps what went wrong. Thread-safe."""

    def __init__(self):
        self.start, self.lock = time.monotonic(), threading.Lock()
        self.counts, self.failures = collections.Counter(), []

    def say(self, line):
        seconds = int(time.monotonic() - self.start)
        print(f"{seconds // 60:3}:{seconds % 60:02} {line}", flush=True)

    def count(self, what, times=1):
        with self.lock:
            self.counts[what] += times

    def fail(self, what):
        with self.lock:
            self.failures.append(what)
            isMany = len(self.failures) > 100
        if not isMany:
            self.say(f"FAILED: {what}")


def memory(process):
    """In KiB: private and proportional memory, and the part of the private one that was written to. The rest is code: it
    counts as private or shared by what other processes run."""
    with open(f"/proc/{process}/smaps_rollup") as rollup:
        sizes = {line.split()[0]: int(line.split()[1]) for line in rollup if line.endswith("kB\n")}
    return {"written": sizes["Private_Dirty:"], "private": sizes["Private_Dirty:"] + sizes["Private_Clean:"],
            "PSS": sizes["Pss:"]}


def wakes(process):
    """How often the threads of a process have run."""
    total = 0
    for thread in os.listdir(f"/proc/{process}/task"):
        with open(f"/proc/{process}/task/{thread}/status") as status:
            total += sum(int(line.split()[1]) for line in status if "ctxt_switches" in line)
    return total


def figures(process):
    return {**memory(process), "descriptors": len(os.listdir(f"/proc/{process}/fd")),
            "threads": len(os.listdir(f"/proc/{process}/task"))}
