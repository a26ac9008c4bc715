#!/usr/bin/env python3
"""The engine beside other ordered stores: the same records, the same operations, in turn.

usage: stores.py --build BUILD_FOLDER [--records N] [--rounds N] [--stores A,B,...] [--seed N]
                 [--open | --reads]

Prints operations a second and, beside each, the ratio to LMDB; all figures go to
build/bench/stores.json. With --reads: only a load and what reads, for many records. With --open:
what a fresh process pays that opens a store's file and looks 1,000 records up; these go to
build/bench/open.json. A store that answers wrongly ends the run."""

import argparse
import json
import pathlib
import shutil
import statistics
import subprocess
import sys

WORK = pathlib.Path(__file__).resolve().parents[1] / "build" / "bench"
STORES = "treehfs,lmdb,lmdb-append,bdb,sqlite,leveldb,absl"
FILE_STORES = "treehfs-image,lmdb,bdb,sqlite"
BASE = "lmdb"


def measure(program, store, options, round_number):
    folder = WORK / "stores"
    part = ["read"] if options.reads else []
    done = subprocess.run([program, store, str(options.records), str(options.seed), str(folder)]
                          + part,
                          capture_output=True, text=True, check=False)
    shutil.rmtree(folder, ignore_errors=True)
    if done.returncode != 0:
        sys.exit(f"{store}, round {round_number}: {done.stderr.strip()}")
    return json.loads(done.stdout)


def rate(results, operation):
    rates = [result["operations"][operation]["count"] / result["operations"][operation]["seconds"]
             for result in results]
    return statistics.median(rates), (max(rates) - min(rates)) / statistics.median(rates)


def table(figures, stores):
    operations = list(figures[stores[0]][0]["operations"])
    print(f"{'operations a second':24}" + "".join(f"{store:>18}" for store in stores))
    for operation in operations:
        base = rate(figures[BASE], operation)[0] if BASE in stores else None
        cells = []
        for store in stores:
            middle, _ = rate(figures[store], operation)
            ratio = f" {middle / base:6.2f}" if base else ""
            cells.append(f"{middle:>11,.0f}{ratio}")
        print(f"{operation:24}" + "".join(f"{cell:>18}" for cell in cells))
    sizes = (("peak memory, MiB", "peakKiB", 1 << 10), ("size, MiB", "bytes", 1 << 20))
    for title, key, unit in sizes:
        values = (statistics.median(result[key] for result in figures[store]) / unit
                  for store in stores)
        print(f"{title:24}" + "".join(f"{value:>18,.0f}" for value in values))


def called(*words):
    done = subprocess.run(words, capture_output=True, text=True, check=False)
    if done.returncode != 0:
        sys.exit(f"{' '.join(map(str, words))}: {done.stderr.strip()}")
    return done.stdout


def measure_opening(program, stores, options):
    """Each store is filled once; then fresh processes open them in turn."""
    folders = {store: WORK / ("open-" + store) for store in stores}
    for store in stores:
        called(program, "fill", store, str(options.records), str(options.seed), folders[store])
    figures = {store: [] for store in stores}
    for round_number in range(options.rounds + 1):
        for store in stores:
            figure = json.loads(called(program, "look", store, folders[store]))
            if round_number > 0:  # the first one brought what was missing into the page cache
                figures[store].append(figure)
    for folder in folders.values():
        shutil.rmtree(folder)
    return figures


def opening_table(figures):
    def middle(store, key):
        return statistics.median(figure[key] for figure in figures[store])

    print(f"{'milliseconds':16}{'open':>8}{'lookups':>9}{'both':>8}{'to lmdb':>9}{'peak MiB':>10}")
    for store in figures:
        ratio = middle(BASE, "seconds") / middle(store, "seconds") if BASE in figures else 0
        print(f"{store:16}{middle(store, 'open') * 1e3:>8.2f}{middle(store, 'lookups') * 1e3:>9.2f}"
              f"{middle(store, 'seconds') * 1e3:>8.2f}{ratio:>9.2f}"
              f"{middle(store, 'peakKiB') / 1024:>10.1f}")


def keep(options, name, figures):
    with open(options.json or WORK / name, "w", encoding="utf-8") as file:
        json.dump({"records": options.records, "seed": options.seed, "stores": figures}, file,
                  indent=1)


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    parser.add_argument("--build", required=True)
    parser.add_argument("--records", type=int, default=1000000)
    parser.add_argument("--rounds", type=int, default=3)
    parser.add_argument("--stores")
    parser.add_argument("--open", action="store_true")
    parser.add_argument("--reads", action="store_true")
    parser.add_argument("--seed", type=int, default=1)
    parser.add_argument("--json", help="where the figures go, build/bench/stores.json by default")
    options = parser.parse_args()
    stores = (options.stores or (FILE_STORES if options.open else STORES)).split(",")
    WORK.mkdir(parents=True, exist_ok=True)
    if options.open:
        figures = measure_opening(pathlib.Path(options.build) / "open_store", stores, options)
        opening_table(figures)
        keep(options, "open.json", figures)
        return
    program = pathlib.Path(options.build) / "run_store"
    figures = {store: [] for store in stores}
    for round_number in range(1, options.rounds + 1):
        for store in stores:
            figures[store].append(measure(program, store, options, round_number))
    table(figures, stores)
    keep(options, "stores.json", figures)


if __name__ == "__main__":
    main()
