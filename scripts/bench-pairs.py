#!/usr/bin/env python3
"""Puts each adversarial benchmark beside its fresh random counterpart.

Usage: scripts/bench-pairs.py bench.json [more.json ...]

Reads Google Benchmark JSON output of the BM_Adv_ families (medians when the
run has repetitions, otherwise the median of the runs of each name) and
prints Markdown tables: time per operation of each family and of its fresh
random tree of the same size, their ratio (bold above 2), and how the family's time grows
from the smallest size to the largest against the counterpart's; then the
IndexOf / Contains pairs and the memory rows.
"""
import json
import statistics
import sys
from collections import defaultdict


def load(paths):
    runs = defaultdict(list)
    medians = {}
    for path in paths:
        with open(path) as f:
            for b in json.load(f)["benchmarks"]:
                if b.get("error_occurred"):
                    print(f"error: {b['name']}: {b.get('error_message')}", file=sys.stderr)
                    continue
                name = b["run_name"]
                if b.get("run_type") == "aggregate":
                    if b.get("aggregate_name") == "median":
                        medians[name] = b
                else:
                    runs[name].append(b)
    out = dict(medians)
    for name, entries in runs.items():
        if name in medians:
            continue
        merged = dict(entries[0])
        for key in entries[0]:
            if isinstance(entries[0][key], (int, float)) and not isinstance(entries[0][key], bool):
                merged[key] = statistics.median(e[key] for e in entries)
        out[name] = merged
    return out


def split(name):
    parts = name.split("/")
    args = dict(p.split(":", 1) for p in parts[1:] if ":" in p)
    args.pop("iterations", None)
    args.pop("repeats", None)
    return parts[0], args


def ns(seconds):
    v = seconds * 1e9
    return f"{v:.0f} ns" if v >= 100 else f"{v:.1f} ns"


def short(size):
    return f"10^{len(str(size)) - 1}" if str(size).strip("0") == "1" else f"{size:,}"


def main(paths):
    results = load(paths)
    families = defaultdict(dict)  # (family, variant) -> size -> (adv, fresh)
    pairs, memory = [], []
    for name, b in sorted(results.items()):
        family, args = split(name)
        if not family.startswith("BM_Adv_"):
            continue
        if family == "BM_Adv_IndexOfAgainstContains":
            pairs.append((int(args["n"]), args["removed"], b))
            continue
        if family == "BM_Adv_Memory":
            memory.append((args, b))
            continue
        if "per_op" not in b:
            continue
        size_key = "n" if "n" in args else "batch"
        size = int(args.pop(size_key))
        fresh = args.pop("fresh") == "1"
        variant = " ".join(f"{k}:{v}" for k, v in args.items())
        slot = families[(family[len("BM_Adv_"):], variant)].setdefault(size, [None, None])
        slot[1 if fresh else 0] = b["per_op"]

    # One row per family and variant: its sizes, then per size the family's
    # time per operation, the fresh tree's and their ratio; last, how both
    # grow from the smallest size to the largest.
    print("| family | variant | sizes | per op, fresh, ratio at each size | growth: family / fresh |")
    print("|---|---|---|---|---|")
    for (family, variant), by_size in sorted(families.items()):
        cells = []
        for size, (adv, fresh) in sorted(by_size.items()):
            ratio = f"**{adv / fresh:.2f}**" if adv and fresh and adv / fresh > 2 else (
                f"{adv / fresh:.2f}" if adv and fresh else "—")
            cells.append(f"{ns(adv) if adv else '—'} / {ns(fresh) if fresh else '—'} / {ratio}")
        sizes = sorted(s for s, (a, f) in by_size.items() if a and f)
        growth = "—"
        if len(sizes) >= 2:
            lo, hi = sizes[0], sizes[-1]
            growth = f"{by_size[hi][0] / by_size[lo][0]:.1f}× / {by_size[hi][1] / by_size[lo][1]:.1f}×"
        names = ", ".join(short(x) for x in sorted(by_size))
        print(f"| {family} | {variant} | {names} | {' · '.join(cells)} | {growth} |")

    if pairs:
        print()
        print("| n | removed % | IndexOf | Contains, same values, same tree | ratio |")
        print("|---|---|---|---|---|")
        for n, removed, b in sorted(pairs):
            print(f"| {n:,} | {removed} | {b['indexof_ns']:.0f} ns | {b['contains_ns']:.0f} ns | {b['ratio']:.2f} |")

    if memory:
        print()
        print("| pattern | removed % | index | n | held | bytes per value | fresh, same survivors | ratio |")
        print("|---|---|---|---|---|---|---|---|")
        names = {"0": "random", "1": "deep (sorted)", "2": "thinned", "3": "peak, cleared, 100 new"}
        for args, b in sorted(memory, key=lambda m: (m[0]["pattern"], int(m[0]["removed"]), m[0]["index"],
                                                      int(m[0]["n"]))):
            print(f"| {names[args['pattern']]} | {args['removed']} | {args['index']} | {int(args['n']):,} | "
                  f"{b['held']:,.0f} | {b['bytes_per_value']:.1f} | {b['fresh_bytes_per_value']:.1f} | "
                  f"{b['ratio']:.2f} |")


if __name__ == "__main__":
    if len(sys.argv) < 2:
        sys.exit(__doc__)
    main(sys.argv[1:])
