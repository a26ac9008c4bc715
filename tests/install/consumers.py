#!/usr/bin/env python3
"""What is installed, used as a stranger would use it: outside the project, by its CMake package, by
pkg-config, by add_subdirectory and by FetchContent.

usage: consumers.py STEP BUILD WORK CC CXX FLAGS
STEP: install (into WORK/prefix, which the next two need), package, pkgconfig, source"""

import gzip
import os
import pathlib
import shutil
import subprocess
import sys

HERE = pathlib.Path(__file__).resolve().parent
ROOT = HERE.parents[1]
RAM_VOLUME = "opened again: 1000 of 1000 records found\n"


class Step:
    def __init__(self, build, work, cc, cxx, flags):
        self.build, self.work = pathlib.Path(build), pathlib.Path(work)
        self.cc, self.cxx, self.flags = cc, cxx, flags
        self.prefix = self.work / "prefix"

    def run(self, *command, **variables):
        done = subprocess.run([str(word) for word in command], capture_output=True, text=True,
                              check=False, env={**os.environ, **variables})
        if done.returncode != 0:
            sys.exit(f"{' '.join(map(str, command))}\n{done.stdout}{done.stderr}")
        return done.stdout

    def image(self):
        path = self.work / "disk.img"
        path.write_bytes(gzip.decompress((ROOT / "tests/data/writable.img.gz").read_bytes()))
        return path

    def want(self, text, *command, **variables):
        have = self.run(*command, **variables)
        if text not in have:
            sys.exit(f"{' '.join(map(str, command))}: '{have}', wanted '{text}'")

    def configure(self, way, folder, target="all"):
        self.run("cmake", "-G", "Ninja", "-S", HERE / "consumer", "-B", folder, f"-DWAY={way}",
                 f"-DTREEHFS_SOURCE={ROOT}", f"-DEXAMPLES={ROOT / 'examples'}",
                 f"-DCMAKE_C_COMPILER={self.cc}", f"-DCMAKE_CXX_COMPILER={self.cxx}",
                 f"-DCMAKE_PREFIX_PATH={self.prefix}", "-DCMAKE_BUILD_TYPE=",
                 f"-DCMAKE_C_FLAGS={self.flags}", f"-DCMAKE_CXX_FLAGS={self.flags}")
        self.run("cmake", "--build", folder, "-j2", "--target", target)

    def install(self):
        shutil.rmtree(self.work, ignore_errors=True)
        self.work.mkdir(parents=True)
        self.run("cmake", "--install", self.build, "--prefix", self.prefix)
        found = {path.name for path in self.prefix.rglob("*") if not path.is_dir()}
        expected = {"treehfs.h", "libtreehfs.a", "libtreehfs.so", "libtreehfs.so.0", "treehfs.pc",
                    "treehfs-engine.pc", "treehfs-volume.pc", "treehfsConfig.cmake",
                    "treehfsConfigVersion.cmake", "fshfs.h", "image_volume.h", "key_text.h"}
        if expected - found:
            sys.exit(f"not installed: {sorted(expected - found)}")
        private = found & {"volume_state.h", "check_run.h", "node_search.h", "bytes.h"}
        if private:
            sys.exit(f"private, and installed: {sorted(private)}")

    def package(self):
        folder = self.work / "package"
        self.configure("package", folder)
        image = self.image()
        self.want("6 records, then not-found\n", folder / "in_c", image)
        self.want("6 records, then not-found\n", folder / "in_c_static", image)
        self.want("0 records, then cannot-open\n", folder / "in_c", self.work / "absent.img")
        self.want('2:"readme"\nnote: success\n', folder / "first", image)
        self.want(RAM_VOLUME, folder / "ram_volume")

    def pkgconfig(self):
        folder = next(self.prefix.glob("lib/**/pkgconfig"))
        image = self.image()

        def flags(name):
            return self.run("pkg-config", f"--define-variable=prefix={self.prefix}", "--cflags",
                            "--libs", name,
                            PKG_CONFIG_PATH=str(folder)).split()

        program = self.work / "by_pkgconfig"
        self.run(self.cc, *self.flags.split(), HERE / "consumer/list.c", "-o", program,
                 *flags("treehfs"))
        self.want("6 records, then not-found\n", program, image,
                  LD_LIBRARY_PATH=str(folder.parent))
        self.run(self.cxx, "-std=c++20", *self.flags.split(), ROOT / "examples/first/first.cpp",
                 "-o", program, *flags("treehfs-volume"))
        self.want('2:"readme"\nnote: success\n', program, image)

    def source(self):
        """Both ways in one folder, so that the engine is compiled once; and that engine in a
        program that has no library at all beneath it."""
        folder = self.work / "source"
        shutil.rmtree(folder, ignore_errors=True)
        self.flags = ""  # no sanitizer: that would be a library
        for way in ("subdirectory", "fetch"):
            self.configure(way, folder, "ram_volume")
            self.want(RAM_VOLUME, folder / "ram_volume")
        archives = folder / "_deps/treehfs-build/src"
        self.run(self.cxx, "-std=c++20", "-O1", "-ffreestanding", "-nostdlib", "-static",
                 "-fno-exceptions", "-fno-rtti", "-fno-stack-protector",
                 "-fno-threadsafe-statics", "-Wall", "-Wextra", "-Werror", f"-I{ROOT / 'src'}",
                 ROOT / "examples/driver/driver.cpp",
                 ROOT / "examples/ram_volume/ram_volume.cpp",
                 archives / "hfs/treehfs/libtreehfs_engine.a",
                 archives / "hfs/libtreehfs_convert.a",
                 archives / "hfs/libtreehfs_names.a", archives / "platform/libtreehfs_platform.a",
                 "-o", folder / "driver")
        self.want("", folder / "driver")


if __name__ == "__main__":
    getattr(Step(*sys.argv[2:]), sys.argv[1])()
