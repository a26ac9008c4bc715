#!/usr/bin/env python3
"""The engine beside other ordered stores: the same records, the same operations, in turn.

usage: stores.py --build BUILD_FOLDER [--records N] [--rounds N] [--stores A,B,...] [--seed N]

Prints operations a second and, below each, the ratio to LMDB; all figures go to
build/bench/stores.json. A store that answers wrongly ends the run."""

import argparse
import json
import pathlib
import shutil
import statistics
import subprocess
import sys

WORK = pathlib.Path(__file__).resolve().parents[1] / "build" / "bench"
STORES = "treehfs,lmdb,bdb,sqlite,leveldb,absl"
BASE = "lmdb"


def measure(program, store, options, round_number):
    folder = WORK / "stores"
    done = subprocess.run([program, store, str(options.records), str(options.seed), str(folder)],
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


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    parser.add_argument("--build", required=True)
    parser.add_argument("--records", type=int, default=1000000)
    parser.add_argument("--rounds", type=int, default=3)
    parser.add_argument("--stores", default=STORES)
    parser.add_argument("--seed", type=int, default=1)
    parser.add_argument("--json", help="where the figures go, build/bench/stores.json by default")
    options = parser.parse_args()
    stores = options.stores.split(",")
    WORK.mkdir(parents=True, exist_ok=True)
    program = pathlib.Path(options.build) / "run_store"
    figures = {store: [] for store in stores}
    for round_number in range(1, options.rounds + 1):
        for store in stores:
            figures[store].append(measure(program, store, options, round_number))
    table(figures, stores)
    with open(options.json or WORK / "stores.json", "w", encoding="utf-8") as file:
        json.dump({"records": options.records, "seed": options.seed, "stores": figures}, file,
                  indent=1)


if __name__ == "__main__":
    main()
