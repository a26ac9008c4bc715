"""Packs the module that CMake built, and the Python files around it, into a wheel: ./dev wheel."""

import os

from setuptools import Distribution, setup


class Built(Distribution):
    """A distribution that holds a binary, so that its wheel is for one kind of machine."""

    def has_ext_modules(self):
        return True


setup(
    name="treehfs",
    version=os.environ["TREEHFS_VERSION"],
    description="B-trees of HFS+ volumes: read, check and change their records",
    license="MIT",
    python_requires=">=3.9",
    packages=["treehfs"],
    package_data={"treehfs": ["_native*.so", "_native.pyi", "py.typed"]},
    distclass=Built,
)
