#!/usr/bin/env python3
"""Turns Google Benchmark JSON into gnuplot SVG charts; scripts/charts.sh runs it.

usage: charts.py RESULTS.json OUTDIR [FILE.svg=REGEX[=TITLE] ...]

Each chart takes the benchmarks whose names match REGEX (re.search). A name
FAMILY/X/REST... gives one point: the line is FAMILY plus REST (say
BM_Scale_Remove/index:1), x is the first argument X (an "n:" style argument
name is dropped) and y is the CPU time per item when the benchmark counts
items (SetItemsProcessed), else per iteration, in nanoseconds. Both axes are
logarithmic. Repeated runs of one name are averaged; aggregates are ignored.
"""
import json
import math
import re
import subprocess
import sys
from collections import defaultdict

# The charts drawn when none are named on the command line.
DEFAULT_CHARTS = [
    ("scaling-random.svg", r"^BM_Scale_", "Random input: time per operation against size"),
    ("scaling-chains.svg", r"^BM_Chain_", "Chains (sorted input): time per operation against size"),
    ("loading.svg", r"^BM_Load(Plain|Balanced)(Sorted|SortedChain)?/", "Plain against balanced load: time per line"),
]

# Colours that read on white and stay apart from each other.
COLOURS = ["#1f77b4", "#d62728", "#2ca02c", "#ff7f0e", "#9467bd", "#8c564b", "#e377c2", "#17becf"]

NS_PER_UNIT = {"ns": 1.0, "us": 1e3, "ms": 1e6, "s": 1e9}


def points(benchmarks, pattern):
    """{line: {x: [ns, ...]}} for the runs whose name matches pattern."""
    lines = defaultdict(lambda: defaultdict(list))
    for b in benchmarks:
        name = b.get("run_name", b["name"])
        if b.get("run_type", "iteration") != "iteration" or not re.search(pattern, name):
            continue
        family, *args = name.split("/")
        # Flags such as real_time or min_time:0.1 are not arguments.
        args = [a for a in args if not re.match(r"(real|manual|min|cpu)_?time|iterations:|repeats:|threads:", a)]
        x = args[0].split(":")[-1] if args else ""
        if not re.fullmatch(r"-?\d+(\.\d+)?", x):
            continue
        if b.get("items_per_second"):
            ns = 1e9 / b["items_per_second"]
        else:
            ns = b["cpu_time"] * NS_PER_UNIT.get(b.get("time_unit", "ns"), 1.0)
        label = "/".join([family.removeprefix("BM_")] + args[1:])
        lines[label][float(x)].append(ns)
    return lines


def x_label(x):
    return f"{x:,.0f}"


def ns_label(ns):
    for unit, scale in (("s", 1e9), ("ms", 1e6), ("µs", 1e3)):
        if ns >= scale:
            return f"{ns / scale:g} {unit}"
    return f"{ns:g} ns"


def tics(low, high, label):
    """Gnuplot tics at the powers of ten from below low to above high."""
    power = 10 ** math.floor(math.log10(low))
    marks = []
    while power <= high * 10:
        marks.append(f'"{label(power)}" {power:g}')
        if power > high:
            break
        power *= 10
    return marks


def gnuplot_script(svg, title, lines):
    out = [
        'set terminal svg size 860,520 dynamic font "sans,12" background "white"',
        f'set output "{svg}"',
        f'set title "{title}"',
        "set logscale xy",
        'set xlabel "size (benchmark argument)"',
        'set ylabel "CPU time per operation"',
        "set grid",
        "set key outside right top noenhanced",
        "set pointsize 0.8",
    ]
    out += [f"set linetype {i + 1} lc rgb '{c}' lw 2" for i, c in enumerate(COLOURS)]
    xs = [x for by_x in lines.values() for x in by_x]
    ys = [sum(v) / len(v) for by_x in lines.values() for v in by_x.values()]
    out.append(f"set xrange [{min(xs) / 1.5:g}:{max(xs) * 1.5:g}]")
    # Every size measured gets its label unless they crowd the axis.
    x_tics = [f'"{x_label(x)}" {x:g}' for x in sorted(set(xs))]
    out.append(f"set xtics ({', '.join(x_tics if len(x_tics) <= 8 else tics(min(xs), max(xs), x_label))})")
    y_tics = tics(min(ys), max(ys), ns_label)
    out.append(f"set yrange [{y_tics[0].split()[-1]}:{y_tics[-1].split()[-1]}]")
    out.append(f"set ytics ({', '.join(y_tics)})")
    plots = []
    for i, (label, by_x) in enumerate(sorted(lines.items())):
        out.append(f"$d{i} << EOD")
        out += [f"{x:g} {sum(v) / len(v):g}" for x, v in sorted(by_x.items())]
        out.append("EOD")
        plots.append(f'$d{i} using 1:2 with linespoints pt 7 title "{label}"')
    out.append("plot " + ", \\\n  ".join(plots))
    return "\n".join(out) + "\n"


def main(argv):
    if len(argv) < 3:
        sys.exit(__doc__)
    with open(argv[1]) as f:
        benchmarks = json.load(f)["benchmarks"]
    charts = [tuple((c.split("=", 2) + [""])[:3]) for c in argv[3:]] or DEFAULT_CHARTS
    for file, pattern, title in charts:
        lines = points(benchmarks, pattern)
        if not lines:
            print(f"charts: no benchmark matches {pattern}, {file} not drawn", file=sys.stderr)
            continue
        svg = f"{argv[2]}/{file}"
        subprocess.run(["gnuplot"], input=gnuplot_script(svg, title or pattern, lines), text=True, check=True)
        print(f"charts: {svg} ({len(lines)} lines)")


if __name__ == "__main__":
    main(sys.argv)
