#!/usr/bin/env python3
"""Writes the tables and plots of docs/benchmarks.md from the figures in docs/benchmarks/.

usage: page.py

Between the markers of the page stands what this writes; the text around them is written by hand."""

import json
import math
import pathlib
import re
import statistics

from stores import rate

DOCS = pathlib.Path(__file__).resolve().parents[1] / "docs"
FIGURES = DOCS / "benchmarks"
PICTURES = DOCS / "pictures"
GOALS = {"load in key order": 0.9, "load in random order": 1.1, "lookup, existing": 1.15,
         "lookup, absent": 1.15, "full scan": 1.4, "folder listing": 1.4, "update in place": 1.3,
         "delete half": 1.4, "delete the rest": 1.4, "delete all": 1.4}
# What nodes of several blocks may lose, wherever these lie in memory.
BLOCK_LIMITS = {"treehfs-2blocks": 0.15, "treehfs-8blocks": 0.40,
                "treehfs-2apart": 0.15, "treehfs-8apart": 0.40}
COLOURS = ("#1f4e79", "#b04a2f", "#4d7d3a", "#7a5195", "#8a6d1d")


def read(name):
    return json.loads((FIGURES / name).read_text(encoding="utf-8"))


def stores_table(name):
    stores = read(name)["stores"]
    lines = ["| Operations a second | " + " | ".join(stores) + " | ratio to lmdb | goal |",
             "|---|" + "---:|" * (len(stores) + 2)]
    measured = next(iter(stores.values()))[0]["operations"]
    for operation, goal in GOALS.items():
        if operation not in measured:
            continue
        cells = []
        for results in stores.values():
            middle, spread = rate(results, operation)
            cells.append(f"{middle:,.0f}" + (f" ±{spread / 2:.0%}" if len(results) > 1 else ""))
        ratio = rate(stores["treehfs"], operation)[0] / rate(stores["lmdb"], operation)[0]
        mark = "" if ratio >= goal else " (missed)"
        lines.append(f"| {operation} | " + " | ".join(cells) + f" | {ratio:.2f} | {goal}{mark} |")
    sizes = (("peak memory, MiB", "peakKiB", 1 << 10), ("size, MiB", "bytes", 1 << 20))
    for title, key, unit in sizes:
        cells = (f"{statistics.median(result[key] for result in results) / unit:,.0f}"
                 for results in stores.values())
        lines.append(f"| {title} | " + " | ".join(cells) + " | | |")
    return "\n".join(lines)


def blocks_table(names):
    """What nodes of several blocks lose of what nodes of one do, in percent."""
    figures = [read(name) for name in names]
    kinds = [store for store in figures[0]["stores"] if store != "treehfs"]
    lines = ["| Lost, percent | " + " | ".join(f"{kind.removeprefix('treehfs-')}, "
                                               f"{one['records']:,}"
                                               for one in figures for kind in kinds) + " |",
             "|---|" + "---:|" * (len(kinds) * len(figures))]
    for operation in GOALS:
        cells = []
        for one in figures:
            base = rate(one["stores"]["treehfs"], operation)[0]
            for kind in kinds:
                lost = 1 - rate(one["stores"][kind], operation)[0] / base
                limit = BLOCK_LIMITS[kind]
                cells.append(f"{100 * lost:.0f}" + (" (missed)" if lost > limit else ""))
        lines.append(f"| {operation} | " + " | ".join(cells) + " |")
    return "\n".join(lines)


def opening_table(names):
    lines = ["| Records | Store | open, ms | 1,000 lookups, ms | both, ms | ratio to lmdb "
             "| peak memory, MiB |", "|---:|---|" + "---:|" * 5]
    for name in names:
        figures = read(name)

        def middle(store, key, stores=figures["stores"]):
            return statistics.median(result[key] for result in stores[store])

        for store in figures["stores"]:
            ratio = middle("lmdb", "seconds") / middle(store, "seconds")
            lines.append(f"| {figures['records']:,} | {store} | {middle(store, 'open') * 1e3:.2f} "
                         f"| {middle(store, 'lookups') * 1e3:.2f} "
                         f"| {middle(store, 'seconds') * 1e3:.2f} | {ratio:.2f} "
                         f"| {middle(store, 'peakKiB') / 1024:.0f} |")
    return "\n".join(lines)


def engine_table(name, column):
    rows = read(name)
    operations = ["insert", "find", "find absent", "iterate", "delete half"]
    lines = [f"| {column} | depth | " + " | ".join(operations) + " | memory |",
             "|---:|---:|" + "---:|" * (len(operations) + 1)]
    for row in rows:
        key = row["records"] if column == "records" else row["node"]
        lines.append(f"| {key:,} | {row['depth']} | "
                     + " | ".join(f"{row[operation]:,.0f}" for operation in operations)
                     + f" | {row['memory']:.2f} |")
    return "\n".join(lines)


def plot(name, key, title):
    """Nanoseconds an operation against `key`, both axes logarithmic."""
    rows = read(name)
    operations = ["insert", "find", "find absent", "iterate", "delete half"]
    width, height, left, bottom = 560, 300, 60, 40
    low, high = math.log(100), math.log(10000)
    keys = [math.log(row[key]) for row in rows]

    def place(x, value):
        return (left + (x - keys[0]) / (keys[-1] - keys[0]) * (width - left - 110),
                height - bottom - (math.log(value) - low) / (high - low) * (height - bottom - 30))

    parts = [f'<svg xmlns="http://www.w3.org/2000/svg" viewBox="0 0 {width} {height}" '
             'font-family="sans-serif" font-size="11">',
             f'<rect width="{width}" height="{height}" fill="#fff"/>',
             f'<text x="{left}" y="18" font-size="13">{title}</text>']
    for value in (100, 200, 500, 1000, 2000, 5000, 10000):
        _, y = place(keys[0], value)
        parts.append(f'<path d="M{left} {y:.1f}H{width - 110}" stroke="#ddd"/>'
                     f'<text x="{left - 6}" y="{y + 4:.1f}" text-anchor="end">{value:,}</text>')
    for row, x in zip(rows, keys):
        parts.append(f'<text x="{place(x, 100)[0]:.1f}" y="{height - 18}" text-anchor="middle">'
                     f'{row[key]:,}</text>')
    for colour, operation in zip(COLOURS, operations):
        points = [place(x, row[operation]) for row, x in zip(rows, keys)]
        parts.append(f'<polyline fill="none" stroke="{colour}" stroke-width="2" points="'
                     + " ".join(f"{x:.1f},{y:.1f}" for x, y in points) + '"/>'
                     f'<text x="{width - 104}" y="{points[-1][1] + 4:.1f}" fill="{colour}">'
                     f'{operation}</text>')
    (PICTURES / name.replace(".json", ".svg")).write_text("\n".join(parts) + "\n</svg>\n",
                                                         encoding="utf-8")


def main():
    plot("engine-records.json", "records",
         "nanoseconds an operation, by records (4,096-byte nodes)")
    plot("engine-nodes.json", "node", "nanoseconds an operation, by node size (100,000 records)")
    parts = {"stores-1000000": stores_table("stores-1000000.json"),
             "stores-100000": stores_table("stores-100000.json"),
             "stores-10000000": stores_table("stores-10000000.json"),
             "blocks": blocks_table(("blocks-100000.json", "blocks-1000000.json")),
             "open": opening_table(("open-100000.json", "open-1000000.json")),
             "engine-records": engine_table("engine-records.json", "records"),
             "engine-nodes": engine_table("engine-nodes.json", "node size")}
    page = DOCS / "benchmarks.md"
    text = page.read_text(encoding="utf-8")
    for name, table in parts.items():
        text = re.sub(rf"(<!-- {name} -->\n).*?(<!-- end -->)", rf"\g<1>{table}\n\g<2>", text,
                      flags=re.S)
    page.write_text(text, encoding="utf-8")


if __name__ == "__main__":
    main()
