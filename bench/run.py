#!/usr/bin/env python3
"""Measures. First the engine's own benchmark, then listing and checking one volume of many names
against other programs that list it: interleaved runs, medians, ratios, peak memory.

usage: run.py --build BUILD_FOLDER [--names N] [--rounds N] [--engine-only | --listers-only]

Text goes to standard output, all figures to build/bench/results.json."""

import argparse
import json
import pathlib
import resource
import shutil
import statistics
import subprocess
import sys
import time

WORK = pathlib.Path(__file__).resolve().parents[1] / "build" / "bench"
NAMES_IN_A_FOLDER = 1000


def volume_of(names):
    """A disk image with an HFS+ volume of so many empty files that xorriso wrote; kept."""
    image = WORK / f"names-{names}.img"
    if image.exists():
        return image
    print(f"writing a volume of {names:,} names", flush=True)
    tree = WORK / f"names-{names}"
    shutil.rmtree(tree, ignore_errors=True)
    for number in range(names):
        folder = tree / f"folder_{number // NAMES_IN_A_FOLDER:04}"
        if number % NAMES_IN_A_FOLDER == 0:
            folder.mkdir(parents=True)
        (folder / f"file_{number:07}.dat").touch()
    part = image.with_suffix(".part")
    part.unlink(missing_ok=True)
    subprocess.run(["xorriso", "-as", "mkisofs", "-hfsplus", "-quiet", "-o", str(part), str(tree)],
                   check=True, stdin=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    shutil.rmtree(tree)
    part.rename(image)
    return image


def hfs_sector(image):
    """Where the volume starts, in sectors of 512 bytes, by the Apple partition map."""
    with open(image, "rb") as file:
        for number in range(1, 64):
            file.seek(number * 512)
            entry = file.read(512)
            if entry[:2] != b"PM":
                break
            if entry[48:80].rstrip(b"\0") == b"Apple_HFS":
                return int.from_bytes(entry[8:12], "big")
    sys.exit(f"bench: no HFS partition in {image}")


def run_once(command):
    """Wall time, processor time and peak memory (KiB) of one run, and the lines it printed. The
    memory comes from GNU time: a child of this process would start with its peak."""
    output, usage = WORK / "output.txt", WORK / "usage.txt"
    spent = resource.getrusage(resource.RUSAGE_CHILDREN)
    before = spent.ru_utime + spent.ru_stime
    with open(output, "wb") as sink:
        start = time.perf_counter()
        done = subprocess.run(["/usr/bin/time", "-q", "-o", str(usage), "-f", "%M", *command],
                              stdout=sink, stderr=subprocess.DEVNULL, stdin=subprocess.DEVNULL,
                              check=False)
        wall = time.perf_counter() - start
    spent = resource.getrusage(resource.RUSAGE_CHILDREN)
    cpu = spent.ru_utime + spent.ru_stime
    with open(output, "rb") as file:
        lines = sum(block.count(b"\n") for block in iter(lambda: file.read(1 << 20), b""))
    return {"wall": wall, "cpu": cpu - before, "kib": int(usage.read_text().split()[0]),
            "lines": lines, "status": done.returncode}


def measure(contestants, rounds):
    """Every contestant once in each round, so that a busy machine disturbs all alike."""
    runs = {name: [] for name in contestants}
    for _ in range(rounds):
        for name, command in contestants.items():
            runs[name].append(run_once(command))
    figures = {}
    for name, results in runs.items():
        if any(result["status"] != 0 for result in results):
            sys.exit(f"bench: {name} ended with status {results[0]['status']}")
        figures[name] = {key: statistics.median(result[key] for result in results)
                         for key in ("wall", "cpu", "kib", "lines")}
        figures[name]["kib"] = max(result["kib"] for result in results)
    return figures


def compare_listers(build, names, rounds):
    image, program = volume_of(names), str(build / "treehfs")
    contestants = {
        "treehfs ls -R": [program, "ls", "-R", str(image)],
        "treehfs check": [program, "check", str(image)],
    }
    if shutil.which("fls"):
        contestants["fls -r -p"] = ["fls", "-r", "-p", "-o", str(hfs_sector(image)), str(image)]
    if shutil.which("7z"):
        # An image with an ISO 9660 volume around opens as such; the volume alone as what it is.
        contestants["7z l -ba"] = ["7z", "l", "-ba", str(volume_alone(image))]
    figures = measure(contestants, rounds)
    print(f"\n{names:,} names, {rounds} interleaved rounds, medians")
    print(f"  {'':14} {'wall':>9} {'processor':>10} {'peak':>10} {'lines':>9}")
    for name, figure in figures.items():
        print(f"  {name:14} {figure['wall']:7.3f} s {figure['cpu']:8.3f} s "
              f"{figure['kib'] / 1024:6.1f} MiB {int(figure['lines']):9,}")
    ratios = ratios_of(figures)
    for text, (ratio, goal) in ratios.items():
        print(f"  {text}: {ratio:.1f} (goal {goal})")
    return {"names": names, "rounds": rounds, "programs": figures,
            "ratios": {text: ratio for text, (ratio, _) in ratios.items()}}


def ratios_of(figures):
    def ratio(slow, fast):
        return figures[slow]["wall"] / figures[fast]["wall"]
    ratios = {}
    if "fls -r -p" in figures:
        ratios["ls -R is faster than fls -r -p, times"] = (ratio("fls -r -p", "treehfs ls -R"), 10)
    if "7z l -ba" in figures:
        ratios["ls -R is faster than 7z l -ba, times"] = (ratio("7z l -ba", "treehfs ls -R"), 5)
        ratios["check is faster than 7z l -ba, times"] = (ratio("7z l -ba", "treehfs check"), 2)
    most = max(figures[name]["kib"] for name in ("treehfs ls -R", "treehfs check")) / 1024
    ratios["peak memory of ls -R and check, MiB"] = (most, "below 32")
    return ratios


def volume_alone(image):
    """The HFS+ volume cut out of its disk image."""
    alone = image.with_suffix(".hfs")
    if not alone.exists():
        part = alone.with_suffix(".part")
        with open(image, "rb") as source, open(part, "wb") as target:
            source.seek(hfs_sector(image) * 512 + 1024)
            header = source.read(512)
            size = int.from_bytes(header[40:44], "big") * int.from_bytes(header[44:48], "big")
            source.seek(hfs_sector(image) * 512)
            while size > 0:
                block = source.read(min(size, 1 << 20))
                if not block:
                    break
                target.write(block)
                size -= len(block)
        part.rename(alone)
    return alone


def engine(build):
    results = WORK / "engine.json"
    subprocess.run([str(build / "engine_bench"), "--json", str(results)], check=True)
    return json.loads(results.read_text(encoding="utf-8"))


def main():
    parser = argparse.ArgumentParser(description="measures the engine and the program")
    parser.add_argument("--build", type=pathlib.Path, required=True)
    parser.add_argument("--names", type=int, default=200_000)
    parser.add_argument("--rounds", type=int, default=5)
    parser.add_argument("--engine-only", action="store_true")
    parser.add_argument("--listers-only", action="store_true")
    options = parser.parse_args()
    build = options.build.resolve()
    WORK.mkdir(parents=True, exist_ok=True)
    results = {}
    if not options.listers_only:
        results["engine"] = engine(build)
    if not options.engine_only:
        results["listers"] = compare_listers(build, options.names, options.rounds)
    (WORK / "results.json").write_text(json.dumps(results, indent=2) + "\n", encoding="utf-8")
    print(f"figures: {WORK / 'results.json'}")


if __name__ == "__main__":
    main()
