"""Volumes of the HFS+ format, their B-trees and the records in them.

    import treehfs

    with treehfs.open("disk.img") as volume:
        for record in volume.records("catalog"):
            print(record.key, record.kind, record.get("size"))
        print(volume.check(full=True))

Volumes are opened read-only unless asked otherwise. Bytes are as they lie on disk. A volume and
what came out of it are used by one thread at a time.
"""

from __future__ import annotations

import contextlib
import json
import os
from dataclasses import dataclass, field
from datetime import datetime, timezone
from typing import Any, Iterator, Union

from . import _native
from ._errors import Error, NotFound

__all__ = ["CheckResult", "Error", "Finding", "NotFound", "Record", "TREES", "Volume",
           "VolumeInfo", "open", "version"]

TREES = {"extents": 3, "catalog": 4, "attributes": 8}

Key = Union[str, bytes]  # 2:"name", or the bytes of a key
Data = Union[str, bytes]  # folder{id:16}, or the bytes of a record

_ACCESS = {"read": 0, "overlay": 1, "write": 2}
_FORCE, _REPLAY, _BACKUP_HEADER = 2, 4, 8
_QUICK, _FULL, _KEEP_GOING = 1, 2, 4
_SEVERITIES = ("info", "warning", "error")
_FLAGS = ("hfsx", "journaled", "journal_pending", "truncated", "writable", "backup_header")
_MAC_EPOCH = 2082844800  # 1970 in seconds since 1904


def version() -> str:
    """The version of the library."""
    return _native.version()


def _tree_id(tree: str) -> int:
    try:
        return TREES[tree]
    except KeyError:
        raise ValueError(f"no tree is called {tree!r}: {', '.join(sorted(TREES))}") from None


def _key_bytes(tree: int, key: Key) -> bytes:
    return key if isinstance(key, bytes) else _native.key_parse(tree, key)


def _data_bytes(tree: int, data: Data) -> bytes:
    return data if isinstance(data, bytes) else _native.data_parse(tree, data)


def _date(seconds: int) -> datetime | None:
    if seconds == 0:
        return None
    return datetime.fromtimestamp(seconds - _MAC_EPOCH, timezone.utc)


class Record:
    """One record of a tree, copied out of its leaf.

    `tree`      "catalog", "extents" or "attributes"
    `raw_key`   the key as it lies on disk, its length field included
    `raw`       the data as it lies on disk
    `node`, `index`   where it lay
    """

    __slots__ = ("tree", "raw_key", "raw", "node", "index", "_fields")

    def __init__(self, tree: str, raw_key: bytes, raw: bytes, node: int, index: int) -> None:
        self.tree = tree
        self.raw_key = raw_key
        self.raw = raw
        self.node = node
        self.index = index
        self._fields: dict[str, Any] | None = None

    @property
    def json(self) -> str:
        """The record as the line that `treehfs export` writes."""
        return _native.record_json(TREES[self.tree], self.raw_key, self.raw)

    @property
    def fields(self) -> dict[str, Any]:
        """The fields of the data by name; those that are 0 are left out."""
        if self._fields is None:
            fields = json.loads(self.json)
            del fields["raw"]
            self._fields = fields
        return self._fields

    def __getitem__(self, name: str) -> Any:
        return self.fields[name]

    def get(self, name: str, default: Any = None) -> Any:
        return self.fields.get(name, default)

    @property
    def key(self) -> str:
        """The key as text, as in 2:"readme"."""
        return _native.key_text(TREES[self.tree], self.raw_key)

    @property
    def kind(self) -> str:
        """"folder", "file", "thread-folder", "extents", "inline", ...; "unknown" for others."""
        return self.fields["type"]

    @property
    def parent(self) -> int | None:
        """ID of the folder that a catalog record lies in."""
        return self.fields.get("key", {}).get("parent")

    @property
    def name(self) -> str | None:
        """The name in the key."""
        return self.fields.get("key", {}).get("name")

    @property
    def id(self) -> int | None:
        """ID of a folder or file; of other records the file ID in their key."""
        return self.fields.get("id", self.fields.get("key", {}).get("file"))

    def date(self, name: str) -> datetime | None:
        """A date by its field's name, as in "created"; None where it is not set."""
        text = self.fields.get(name)
        return None if text is None else datetime.fromisoformat(text.replace("Z", "+00:00"))

    @property
    def created(self) -> datetime | None:
        return self.date("created")

    @property
    def modified(self) -> datetime | None:
        return self.date("modified")

    @property
    def accessed(self) -> datetime | None:
        return self.date("accessed")

    def __repr__(self) -> str:
        return f"<Record {self.tree} {self.key} {self.kind}>"

    def __eq__(self, other: object) -> bool:
        return (isinstance(other, Record) and
                (self.tree, self.raw_key, self.raw) == (other.tree, other.raw_key, other.raw))

    def __hash__(self) -> int:
        return hash((self.tree, self.raw_key, self.raw))


@dataclass(frozen=True)
class VolumeInfo:
    offset: int  # of the volume in the image, bytes
    block_size: int  # bytes
    total_blocks: int
    free_blocks: int
    file_count: int
    folder_count: int
    next_id: int
    created: datetime | None  # local time of the volume, without a zone of its own
    modified: datetime | None
    backed_up: datetime | None
    checked: datetime | None
    flags: frozenset[str]  # "hfsx", "journaled", "truncated", "writable", ...


@dataclass(frozen=True)
class Finding:
    id: str  # "K03"
    severity: str  # "info", "warning", "error"
    where: str
    text: str
    tree: str | None
    node: int | None
    record: int | None
    offset: int | None  # byte of the image


@dataclass(frozen=True)
class CheckResult:
    errors: int
    warnings: int
    infos: int
    unreadable: int
    stopped: bool
    nodes: int
    bytes: int
    findings: list[Finding] = field(default_factory=list)

    @property
    def is_sound(self) -> bool:
        """Everything was looked at, and nothing is wrong."""
        return not (self.errors or self.warnings or self.unreadable or self.stopped)


def _finding(told: dict[str, Any]) -> Finding:
    names = {number: name for name, number in TREES.items()}
    return Finding(
        id=told["id"], severity=_SEVERITIES[told["severity"]], where=told["where"],
        text=told["text"], tree=names.get(told["tree"]),
        node=None if told["node"] < 0 else told["node"],
        record=None if told["record"] < 0 else told["record"],
        offset=None if told["offset"] == 2**64 - 1 else told["offset"])


class Volume:
    """A volume in an image. Use it in a `with` statement, or call `close`."""

    def __init__(self, native: _native.Volume) -> None:
        self._native = native

    @classmethod
    def open(cls, path: str | os.PathLike[str], write: bool = False, *, overlay: bool = False,
             offset: int | None = None, partition: int = 0, backup_header: bool = False,
             replay: bool = False, force: bool = False) -> "Volume":
        """Opens the volume in an image, disk image or block device.

        `write`: commits reach the image. `overlay`: changes stay in memory. `offset` (bytes) and
        `partition` (a number) say where the volume is; otherwise it is looked for.
        """
        if write and overlay:
            raise ValueError("write and overlay exclude each other")
        access = "write" if write else "overlay" if overlay else "read"
        flags = ((_FORCE if force else 0) | (_REPLAY if replay else 0) |
                 (_BACKUP_HEADER if backup_header else 0))
        return cls(_native.Volume(os.fspath(path), _ACCESS[access], offset, partition, flags))

    def __enter__(self) -> "Volume":
        return self

    def __exit__(self, *_: object) -> None:
        self.close()

    def close(self) -> None:
        """Ends the volume; changes that were not committed are gone. Safe to repeat."""
        self._native.close()

    @property
    def closed(self) -> bool:
        return not self._native.is_open()

    @property
    def info(self) -> VolumeInfo:
        raw = self._native.info()
        created = _date(raw["create_date"])
        return VolumeInfo(
            offset=raw["offset"], block_size=raw["block_size"], total_blocks=raw["total_blocks"],
            free_blocks=raw["free_blocks"], file_count=raw["file_count"],
            folder_count=raw["folder_count"], next_id=raw["next_id"],
            created=created.replace(tzinfo=None) if created else None,
            modified=_date(raw["modify_date"]), backed_up=_date(raw["backup_date"]),
            checked=_date(raw["checked_date"]),
            flags=frozenset(name for i, name in enumerate(_FLAGS) if raw["flags"] >> i & 1))

    @property
    def notes(self) -> list[str]:
        """Things worth knowing although the volume opened."""
        return self._native.notes()

    def tree_info(self, tree: str = "catalog") -> dict[str, int]:
        """The header of a tree: "node_size", "depth", "leaf_records", ..."""
        return self._native.tree_info(_tree_id(tree))

    @property
    def trees(self) -> list[str]:
        """The trees that can be opened."""
        found = []
        for name, number in TREES.items():
            with contextlib.suppress(Error):
                self._native.tree_info(number)
                found.append(name)
        return found

    # --- looking --------------------------------------------------------------------------------

    def records(self, tree: str = "catalog", start: Key | None = None) -> Iterator[Record]:
        """The records of a tree in key order, from the first one not below `start`.

        The tree may be changed meanwhile: the walk goes on behind the record delivered last.
        """
        number = _tree_id(tree)
        cursor = self._native.walk(number, None if start is None else _key_bytes(number, start))
        return self._walk(tree, cursor)

    @staticmethod
    def _walk(tree: str, cursor: _native.Cursor) -> Iterator[Record]:
        while (found := cursor.next()) is not None:
            yield Record(tree, *found)

    def __iter__(self) -> Iterator[Record]:
        return self.records()

    def find(self, key: Key, tree: str = "catalog") -> Record:
        """The record with this key. Raises NotFound."""
        number = _tree_id(tree)
        raw_key = _key_bytes(number, key)
        self._native.find(number, raw_key)
        record = next(self.records(tree, raw_key), None)
        if record is None:
            raise NotFound(f"no record {key!r} in the {tree} tree", "not-found", 0xA000010E)
        return record

    def by_id(self, number: int) -> Record:
        """The folder or file with this ID, by its thread. Raises NotFound."""
        thread = self.find(f'{number}:""')
        return self.find(f'{thread["parent"]}:{json.dumps(thread.get("name", ""))}')

    def lookup(self, path: str) -> Record:
        """The folder or file at a path from the volume's root. Raises NotFound.

        As in all paths, ":" stands for a slash in a name. Links are not followed.
        """
        record = self.by_id(2)
        for component in filter(None, path.split("/")):
            if record.kind != "folder":
                raise NotFound(f"{path}: {record.name!r} is no folder", "not-found", 0xA000010E)
            name = component.replace(":", "/")
            try:
                record = self.find(f"{record.id}:{json.dumps(name, ensure_ascii=False)}")
            except NotFound:
                raise NotFound(f"{path}: no {component!r} in there", "not-found",
                               0xA000010E) from None
        return record

    def listdir(self, path: str = "/") -> list[Record]:
        """The folders and files of a folder, in the order of the tree."""
        folder = self.lookup(path)
        if folder.kind != "folder":
            raise NotFound(f"{path}: no folder", "not-found", 0xA000010E)
        found = []
        for record in self.records("catalog", f'{folder.id}:""'):
            if record.parent != folder.id:
                break
            if record.name:
                found.append(record)
        return found

    def export(self, tree: str = "catalog") -> Iterator[str]:
        """The records of a tree as the lines that `treehfs export` writes for them."""
        for record in self.records(tree):
            yield record.json

    def check(self, *, quick: bool = False, full: bool = False, keep_going: bool = False,
              max_errors: int = 100) -> CheckResult:
        """Judges the volume by its bytes, independently of what reads its trees."""
        flags = ((_QUICK if quick else 0) | (_FULL if full else 0) |
                 (_KEEP_GOING if keep_going else 0))
        *counts, findings = self._native.check(flags, max_errors)
        return CheckResult(*counts, findings=[_finding(told) for told in findings])

    # --- changing -------------------------------------------------------------------------------

    @contextlib.contextmanager
    def transaction(self) -> Iterator["Volume"]:
        """Changes that are kept together at the end, or dropped together by an exception."""
        self._native.begin()
        try:
            yield self
        except BaseException:
            if not self.closed:
                self._native.rollback()
            raise
        try:
            self._native.commit()
        except Error:
            if not self.closed:
                self._native.rollback()
            raise

    def insert(self, key: Key, data: Data, tree: str = "catalog") -> None:
        number = _tree_id(tree)
        self._native.insert(number, _key_bytes(number, key), _data_bytes(number, data))

    def update(self, key: Key, data: Data, tree: str = "catalog") -> None:
        number = _tree_id(tree)
        self._native.update(number, _key_bytes(number, key), _data_bytes(number, data))

    def delete(self, key: Key, tree: str = "catalog") -> None:
        number = _tree_id(tree)
        self._native.delete(number, _key_bytes(number, key))

    def commit(self) -> None:
        """Keeps the changes made since the last commit or rollback."""
        self._native.commit()

    def rollback(self) -> None:
        """Drops the changes made since the last commit or rollback."""
        self._native.rollback()

    def __repr__(self) -> str:
        return "<Volume, closed>" if self.closed else f"<Volume {self.trees}>"


def open(path: str | os.PathLike[str], write: bool = False,  # pylint: disable=redefined-builtin
         **options: Any) -> Volume:
    """Volume.open, for short."""
    return Volume.open(path, write, **options)
