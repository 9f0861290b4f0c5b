#!/usr/bin/env python3
"""Times two builds of ftpconfig-report in turn on one root.

This machine's speed drifts within minutes, so runs of two builds taken one
after the other compare better than runs taken in blocks. Prints, for each
build and format, the median and least wall time and the median CPU time
(user and system, from wait4) in milliseconds.

Usage: compare_report.py BEFORE AFTER ROOT [RUNS]
(ROOT: a root kept by benchreport through BENCH_ROOT)
"""
import os
import statistics
import subprocess
import sys
import time

if len(sys.argv) < 4:
    sys.exit(__doc__)
programs = {"before": sys.argv[1], "after": sys.argv[2]}
root = sys.argv[3]
runs = int(sys.argv[4]) if len(sys.argv) > 4 else 8
times = {}
for _ in range(runs):
    for build, program in programs.items():
        for form in ("text", "json"):
            arguments = [program, "--root", root] + (["--json"] if form == "json" else [])
            start = time.perf_counter()
            child = subprocess.Popen(arguments, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
            _, _, usage = os.wait4(child.pid, 0)
            wall = (time.perf_counter() - start) * 1000
            cpu = (usage.ru_utime + usage.ru_stime) * 1000
            times.setdefault((build, form), []).append((wall, cpu))
for (build, form), values in times.items():
    walls = [wall for wall, _ in values]
    cpus = [cpu for _, cpu in values]
    print(f"{build:6} {form:4}  wall median {statistics.median(walls):.0f} min {min(walls):.0f}"
          f"  cpu median {statistics.median(cpus):.0f}")
