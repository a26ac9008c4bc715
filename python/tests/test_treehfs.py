"""The Python package, on a small volume and on damaged copies of it."""

import datetime
import gzip
import json
import pathlib
import random
import subprocess
import sys

import pytest
import treehfs

ROOT = pathlib.Path(__file__).resolve().parents[2]
WHOLE = gzip.decompress((ROOT / "tests/data/writable.img.gz").read_bytes())
SMALL = gzip.decompress((ROOT / "tests/data/small.img.gz").read_bytes())


@pytest.fixture
def image(tmp_path):
    path = tmp_path / "disk.img"
    path.write_bytes(WHOLE)
    return path


@pytest.fixture
def small(tmp_path):
    path = tmp_path / "small.img"
    path.write_bytes(SMALL)
    return path


def test_records_in_key_order(image):
    with treehfs.open(image) as volume:
        keys = [record.key for record in volume.records("catalog")]
        assert keys == ['1:"Small"', '2:""', '2:"letters"', '2:"readme"', '16:""', '17:""']
        assert [record.key for record in volume] == keys
        behind = [record.key for record in volume.records("catalog", '2:"m"')]
        assert behind == ['2:"readme"', '16:""', '17:""']
        assert list(volume.records("attributes")) == []


def test_fields_of_a_record(image):
    with treehfs.open(image) as volume:
        root = volume.find('1:"Small"')
        assert (root.kind, root.id, root.parent, root.name) == ("folder", 2, 1, "Small")
        assert root["valence"] == 2 and root.get("size") is None
        assert root.created == datetime.datetime(2026, 11, 21, tzinfo=datetime.timezone.utc)
        assert root.modified is None
        assert len(root.raw) == 88 and root.raw[:2] == b"\0\1"
        assert root.raw_key == b"\0\x10\0\0\0\1\0\5" + "Small".encode("utf-16-be")
        assert json.loads(root.json)["raw"] == root.raw.hex()
        assert repr(root) == '<Record catalog 1:"Small" folder>'
        assert root == volume.find(root.raw_key) and hash(root) == hash(volume.find(root.raw_key))


def test_lookup_by_path_and_id(small):
    with treehfs.open(small) as volume:
        assert volume.lookup("/").key == '1:"Small"'
        assert volume.lookup("/letters/letter_7.txt").get("size") == 9
        assert volume.lookup("Gro\u0308\u00dfe") == volume.lookup("/Gr\u00f6\u00dfe")
        assert [record.name for record in volume.listdir("/letters")][:2] == [
            "letter_1.txt", "letter_10.txt"]
        assert volume.by_id(33).name == "readme.txt"
        for path in ("/nothing", "/readme.txt/x"):
            with pytest.raises(treehfs.NotFound) as caught:
                volume.lookup(path)
            assert path in str(caught.value)
        with pytest.raises(LookupError):
            volume.by_id(9999)


def test_volume_facts(small):
    with treehfs.open(small) as volume:
        assert volume.info.offset == 65536
        assert volume.info.file_count == 15 and "writable" not in volume.info.flags
        assert volume.trees == ["extents", "catalog"]
        assert volume.tree_info("catalog")["leaf_records"] == 38
        with pytest.raises(treehfs.Error) as caught:
            volume.tree_info("attributes")
        assert caught.value.name == "no-tree"
        with pytest.raises(ValueError, match="no tree is called 'katalog'"):
            volume.records("katalog")


def test_check(image, small):
    with treehfs.open(image) as volume:
        result = volume.check(full=True)
        assert result.is_sound and result.findings == [] and result.nodes > 0
    with treehfs.open(small) as volume:
        result = volume.check(full=True)
        assert [(finding.id, finding.severity) for finding in result.findings] == [("V05", "info")]
    damaged = bytearray(WHOLE)
    place = damaged.find("readme".encode("utf-16-be"))
    damaged[place:place + 2] = b"\0a"  # "aeadme" stands behind "letters"
    image.write_bytes(damaged)
    with treehfs.open(image) as volume:
        result = volume.check()
        assert not result.is_sound and result.errors >= 1
        assert "K02" in {finding.id for finding in result.findings}
        with pytest.raises(treehfs.Error) as caught:
            list(volume.records())
        assert caught.value.name == "corrupt"


def test_export_gives_the_lines_of_the_program(image):
    with treehfs.open(image) as volume:
        lines = list(volume.export("catalog"))
    assert len(lines) == 6
    assert lines[1] == ('{"key":{"parent":2,"name":""},"type":"thread-folder","parent":1,'
                        '"name":"Small","raw":"000300000000000100050053006d0061006c006c"}')


def test_transaction_keeps_or_drops(image):
    with treehfs.open(image, write=True) as volume:
        with pytest.raises(ZeroDivisionError):
            with volume.transaction():
                volume.insert('2:"gone"', 'inline{"ab"}', tree="attributes")
                raise ZeroDivisionError
        with pytest.raises(treehfs.NotFound):
            volume.find('2:"gone"', tree="attributes")
        with volume.transaction():
            volume.insert('2:"kept"', 'inline{"ab"}', tree="attributes")
            with pytest.raises(treehfs.Error) as caught:
                volume.insert('2:"kept"', 'inline{"cd"}', tree="attributes")
            assert caught.value.name == "exists"
            with pytest.raises(treehfs.Error, match="changes wait already"):
                with volume.transaction():
                    pass
            volume.update('2:"kept"', 'inline{"longer"}', tree="attributes")
    with treehfs.open(image) as volume:
        record = volume.find('2:"kept"', tree="attributes")
        assert record["text"] == "longer" and record.id == 2
        assert volume.check(full=True).errors == 0
        with pytest.raises(treehfs.Error) as caught:
            volume.delete('2:"kept"', tree="attributes")
        assert caught.value.name == "read-only"


def fill(volume):
    data = b"\0\0\0\x10" + bytes(8) + (3000).to_bytes(4, "big") + bytes(3000)
    for number in range(1000):
        volume.insert(f'{1000 + number}:"a"', data, tree="attributes")


def test_failed_change_drops_the_transaction(image):
    with treehfs.open(image, write=True) as volume:
        walk = volume.records("catalog")
        next(walk)
        with pytest.raises(treehfs.Error) as caught:
            with volume.transaction():
                fill(volume)
        assert caught.value.name == "no-space"
        assert list(volume.records("attributes")) == [] and len(list(walk)) == 5
        assert volume.check(full=True).is_sound
        with pytest.raises(treehfs.Error):
            fill(volume)
        for call in (volume.commit, volume.check, lambda: volume.delete('2:"readme"')):
            with pytest.raises(treehfs.Error, match="roll back"):
                call()
        volume.rollback()
        volume.delete('2:"readme"')
        volume.commit()
        assert len(list(volume)) == 5


def test_overlay_leaves_the_image_alone(image):
    with treehfs.open(image, overlay=True) as volume:
        volume.insert('2:"x"', b"\0\0\0\x10" + bytes(11) + b"\2ab", tree="attributes")
        volume.commit()
        assert volume.find('2:"x"', tree="attributes")["text"] == "ab"
    assert image.read_bytes() == WHOLE


def test_walk_goes_on_over_changes(image):
    with treehfs.open(image, overlay=True) as volume:
        walk = volume.records("catalog")
        next(walk)
        for number in range(100, 400):
            volume.insert(f'{number}:""', f'thread{{parent:2,name:"n{number}"}}')
        seen = [record.key for record in walk]
        assert seen[:2] == ['2:""', '2:"letters"'] and len(seen) == 305
        walk = volume.records("catalog", '200:""')
        assert next(walk).key == '200:""'
        volume.rollback()
        assert list(walk) == []


def test_misuse_is_an_exception(image):
    volume = treehfs.open(image)
    walk = volume.records()
    next(walk)
    volume.close()
    volume.close()
    assert volume.closed and repr(volume) == "<Volume, closed>"
    for call in (lambda: next(walk), volume.check, lambda: volume.info, volume.commit,
                 lambda: volume.find('2:""'), lambda: next(volume.records())):
        with pytest.raises(treehfs.Error) as caught:
            call()
        assert caught.value.name == "closed"
    with pytest.raises(treehfs.Error) as caught:
        treehfs.open(image.with_name("absent"))
    assert caught.value.name == "cannot-open" and "no such file" in str(caught.value)
    with pytest.raises(ValueError):
        treehfs.open(image, write=True, overlay=True)
    with treehfs.open(image) as volume:
        for key in ("", "nonsense", b"", b"\0\0", b"x" * 4000):
            with pytest.raises(treehfs.Error) as caught:
                volume.find(key)
            assert caught.value.name == "invalid"
        with pytest.raises(TypeError):
            volume.find(5)


def use(path):
    """Everything that reads; only treehfs.Error may come of it."""
    try:
        with treehfs.open(path, overlay=True) as volume:
            for tree in volume.trees:
                try:
                    for record in volume.records(tree):
                        record.fields, record.key, record.created, record.id
                except treehfs.Error:
                    pass
            volume.check(full=True)
            volume.lookup("/letters")
            with volume.transaction():
                volume.insert('2:"y"', 'inline{"y1"}', tree="attributes")
                volume.delete('2:"readme"')
    except treehfs.Error:
        pass


def test_hostile_images_raise_and_no_more(tmp_path):
    source = random.Random(5)
    path = tmp_path / "hostile.img"
    headers = [1024, *range(4096, 110000, 4096)]
    for _ in range(60):
        damaged = bytearray(WHOLE)
        for _ in range(source.randrange(1, 12)):
            start = source.choice(headers) + source.randrange(0, 256)
            damaged[start] = source.randrange(256)
        path.write_bytes(damaged[:source.choice([len(damaged)] * 4 + [70000, 2000])])
        use(path)


def test_example(image):
    shown = subprocess.run([sys.executable, ROOT / "examples/python/catalog.py", image],
                           capture_output=True, text=True, check=True).stdout
    assert shown == ("files: 1 folders: 1 flags: writable\n"
                     "folder     17 letters\nfile       16 readme\n"
                     '       0 bytes  2:"readme"  no date\n'
                     "sound (4 nodes)\nseen\n")
    assert image.read_bytes() == WHOLE


def test_version_and_names():
    assert treehfs.version().count(".") == 2
    assert set(treehfs.__all__) <= set(dir(treehfs))
