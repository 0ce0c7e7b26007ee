#!/usr/bin/python3
"""Prints one table from Google Benchmark JSON files, one file per benchmark
program: every figure of every benchmark beside the same figure of its
program's baseline, and their ratio.

A program's baseline is its benchmark whose name holds "Baseline", or else
the last one it registers. The figures are the real time per iteration and
each counter the benchmark reports. Exits 1 when a benchmark reported an
error.

Usage: bench_table.py RESULT.json...
"""
import json
import os
import sys


def load(path):
    with open(path) as f:
        data = json.load(f)
    runs = [b for b in data.get("benchmarks", []) if b.get("run_type", "iteration") == "iteration"]
    return os.path.basename(path).rsplit(".", 1)[0], runs


def baseline_of(runs):
    for run in runs:
        if "baseline" in run["name"].lower():
            return run
    return runs[-1] if runs else None


STANDARD_FIELDS = {
    "name", "family_index", "per_family_instance_index", "run_name", "run_type",
    "repetitions", "repetition_index", "threads", "iterations", "real_time", "cpu_time",
    "time_unit", "error_occurred", "error_message", "label", "aggregate_name",
    "aggregate_unit",
}


def figures(run):
    """(metric, value) pairs of one benchmark run, time first."""
    unit = run.get("time_unit", "ns")
    yield "time/" + unit, run.get("real_time")
    for key in sorted(run):
        if key not in STANDARD_FIELDS and isinstance(run[key], (int, float)):
            yield key, run[key]


def short(name):
    name = name.split("/")[0]
    return name[3:] if name.startswith("BM_") else name


def number(value):
    if value is None:
        return "-"
    magnitude = abs(value)
    if magnitude >= 1e6 or (0 < magnitude < 1e-3):
        return "%.3g" % value
    if magnitude >= 100:
        return "%.0f" % value
    return "%.3g" % value


def main(paths):
    rows = [("program", "benchmark", "figure", "value", "baseline", "baseline value", "ratio")]
    failed = False
    for path in paths:
        program, runs = load(path)
        baseline = baseline_of(runs)
        base = dict(figures(baseline)) if baseline else {}
        # The baseline closes its program's rows.
        runs = [run for run in runs if run is not baseline] + ([baseline] if baseline else [])
        for run in runs:
            if run.get("error_occurred"):
                failed = True
                rows.append((program, short(run["name"]), "ERROR", run.get("error_message", ""),
                             "", "", ""))
                continue
            is_baseline = run is baseline
            for metric, value in figures(run):
                other = None if is_baseline else base.get(metric)
                ratio = "%.2f" % (value / other) if other else "-"
                rows.append((program, short(run["name"]), metric, number(value),
                             "(baseline)" if is_baseline else short(baseline["name"]),
                             number(other), ratio))
    # A program's and a benchmark's name stand only on their first row.
    for index in range(len(rows) - 1, 1, -1):
        if rows[index][0] == rows[index - 1][0]:
            same_benchmark = rows[index][1] == rows[index - 1][1]
            rows[index] = ("", "" if same_benchmark else rows[index][1]) + rows[index][2:]
    widths = [max(len(str(row[i])) for row in rows) for i in range(len(rows[0]))]
    for index, row in enumerate(rows):
        print("  ".join(str(cell).ljust(width) for cell, width in zip(row, widths)).rstrip())
        if index == 0:
            print("  ".join("-" * width for width in widths))
    return 1 if failed else 0


if __name__ == "__main__":
    if len(sys.argv) < 2:
        sys.exit(__doc__)
    sys.exit(main(sys.argv[1:]))
