#!/usr/bin/env python3
"""Prints medians and ratios from a Google Benchmark JSON report.

Run the benchmarks with repetitions and interleaving, then name the pairs:

  build-release/bench/kivi_bench --benchmark_filter='Jobs|Sleepers' \\
      --benchmark_repetitions=5 --benchmark_enable_random_interleaving=true \\
      --benchmark_format=json > run.json
  scripts/bench_ratios.py run.json BM_SerialQueueJobs,BM_MinimalPoolJobs/threads:2

Each pair prints numerator / denominator of the median wall time and of the
median CPU time (the report's own median aggregate when it has one, else the
median of the repetitions).
"""
import json
import statistics
import sys


def medians(report):
    own, runs = {}, {}
    for b in report["benchmarks"]:
        name = b.get("run_name", b["name"])
        if b.get("run_type") == "aggregate":
            if b.get("aggregate_name") == "median":
                own[name] = (b["real_time"], b["cpu_time"], b["time_unit"])
        else:
            runs.setdefault(name, []).append((b["real_time"], b["cpu_time"], b["time_unit"]))
    for name, values in runs.items():
        if name not in own:
            own[name] = (statistics.median(v[0] for v in values),
                         statistics.median(v[1] for v in values), values[0][2])
    return own


def main(argv):
    if len(argv) < 2:
        sys.exit(__doc__)
    with open(argv[1]) as f:
        table = medians(json.load(f))
    for name, (real, cpu, unit) in sorted(table.items()):
        print(f"{name:60} wall {real:12.3f} {unit}   cpu {cpu:12.3f} {unit}")
    for pair in argv[2:]:
        num, den = pair.split(",", 1)
        if num not in table or den not in table:
            print(f"{pair}: not in the report")
            continue
        (nr, nc, _), (dr, dc, _) = table[num], table[den]
        print(f"{num} / {den}: wall {nr / dr:.2f}x, cpu {nc / dc:.2f}x")


if __name__ == "__main__":
    main(sys.argv)
