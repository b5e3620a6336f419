"""Packages as archivers of every kind write them, and what must not hide in them."""

import os
import shutil
import struct
import subprocess
import zipfile
import zlib

import pytest

import packages
from conftest import ON_ONE_PATH, names_of

IDENTIFIER = "com.example.made"
BUNDLE = "Made.app"


class Unseekable:
    """A file that Python's zipfile can only write to, as to a pipe."""

    def __init__(self, file):
        self.file = file

    def write(self, data):
        return self.file.write(data)

    def flush(self):
        self.file.flush()


def shell(command):
    def make(out, folder):
        subprocess.run(["bash", "-c", "set -o pipefail; umask 022; " + command.format(out=out)], cwd=folder,
                       check=True, stdout=subprocess.DEVNULL)

    return make


def streamed(method, large=False):
    def make(out, folder):
        with open(out, "wb") as file, zipfile.ZipFile(Unseekable(file), "w", method) as archive:
            for base, _, files in os.walk(folder):
                for name in sorted(files):
                    path = os.path.join(base, name)
                    entry = packages.entry(os.path.relpath(path, folder), method=method)
                    with open(path, "rb") as source, archive.open(entry, "w", force_zip64=large) as target:
                        shutil.copyfileobj(source, target)

    return make


def as_jar_writes(out, folder):
    """An extra field of its own on the first entry, directories, no modes, sizes in descriptors."""
    body, directory, count = b"", b"", 0
    names = sorted(os.path.relpath(os.path.join(base, name), folder) + ("/" if name in folders else "")
                   for base, folders, files in os.walk(folder) for name in folders + files)
    for each in names:
        name, data = each.encode(), b""
        if not each.endswith("/"):
            with open(os.path.join(folder, each), "rb") as file:
                data = file.read()
        packer = zlib.compressobj(wbits=-15)
        packed = packer.compress(data) + packer.flush() if data else b""
        flags, method = (0x808, 8) if data else (0x800, 0)
        extra = b"\xfe\xca\0\0" if not count else b""
        numbers = struct.pack("<III", zlib.crc32(data), len(packed), len(data))
        head = struct.pack("<HHHHH", 20 if data else 10, flags, method, 0, 0x21)
        sizes = struct.pack("<HH", len(name), len(extra))
        directory += (b"PK\1\2" + struct.pack("<H", 20) + head + numbers + sizes
                      + struct.pack("<HHHII", 0, 0, 0, 0, len(body)) + name + extra)
        body += b"PK\3\4" + head + (bytes(12) if data else numbers) + sizes + name + extra + packed
        body += b"PK\7\10" + numbers if data else b""
        count += 1
    with open(out, "wb") as file:
        file.write(body + directory + struct.pack("<4sHHHHIIH", b"PK\5\6", 0, 0, count, count, len(directory),
                                                  len(body), 0))


ARCHIVERS = {
    "zip": shell("zip -qr {out} ."),
    "zip, streamed": shell("zip -qr - * | cat > {out}"),
    "zip, stored and streamed": shell("zip -q0r - * | cat > {out}"),
    "zip, large sizes": shell("zip -qr -fz {out} *"),
    "zip, descriptors": shell("zip -qr -fd {out} *"),
    "zip, no extra fields": shell("zip -qrX {out} *"),
    "bsdtar": shell("bsdtar -c --format zip -f {out} *"),
    "bsdtar, stored": shell("bsdtar -c --format zip --options zip:compression=store -f {out} *"),
    "bsdtar, large sizes": shell("bsdtar -c --format zip --options zip:zip64 -f {out} *"),
    "bsdtar, into a pipe": shell("bsdtar -c --format zip -f - * | cat > {out}"),
    "7z": shell("7z a -tzip {out} *"),
    "as jar writes": as_jar_writes,
    # A whole JDK brings it, which nobody has to install for this.
    **({"jar": shell("jar -cMf {out} *")} if shutil.which("jar") else {}),
    "Python, streamed": streamed(zipfile.ZIP_DEFLATED),
    "Python, stored and streamed": streamed(zipfile.ZIP_STORED),
    "Python, streamed with large sizes": streamed(zipfile.ZIP_DEFLATED, large=True),
}


@pytest.fixture
def folder(tmp_path):
    """A package's contents: files of every size, letters of every kind."""
    top = tmp_path / "folder"
    more = [("Made.app/empty", b""), ("Made.app/Gr\u00fc\u00dfe.txt", b"hello"),
            ("Made.app/zeros", bytes(300_000))]
    for name, data in packages.entries(IDENTIFIER, payload=os.urandom(150_000)) + more:
        path = top / name
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_bytes(data)
    return top


def contents_of(folder):
    return {str(path.relative_to(folder)): path.read_bytes() for path in folder.rglob("*") if path.is_file()}


def archive(name, folder, out):
    out.parent.mkdir(exist_ok=True)
    ARCHIVERS[name](str(out), str(folder))
    return out


@ON_ONE_PATH
@pytest.mark.parametrize("name", ARCHIVERS)
def test_package_is_installed_as_the_archiver_took_it(device, folder, tmp_path, name):
    archive(name, folder, tmp_path / "library" / "made.zip")
    result = device.sync(tmp_path / "library")
    assert names_of(result["installed"]) == [IDENTIFIER]
    container = tmp_path / "device" / "root" / device.apps()[IDENTIFIER]["container"].lstrip("/")
    expected = contents_of(folder)
    found = contents_of(container)
    assert {path: found.get(path) == data for path, data in expected.items()} == dict.fromkeys(expected, True)


def parts_of(data):
    """The offset of the central directory, its headers, and their offsets in the file."""
    end = data.rfind(b"PK\5\6")
    size, at = struct.unpack_from("<II", data, end + 12)
    headers = []
    place = at
    while place < at + size:
        length = 46 + sum(struct.unpack_from("<HHH", data, place + 28))
        headers.append(data[place:place + length])
        place += length
    return at, headers


def with_directory(body, headers):
    directory = b"".join(headers)
    return body + directory + struct.pack("<4sHHHHIIH", b"PK\5\6", 0, 0, len(headers), len(headers),
                                          len(directory), len(body), 0)


def hidden_entry(data):
    at, headers = parts_of(data)
    return with_directory(data[:at], [header for header in headers if b"data.bin" not in header])


def other_descriptor(data):
    """A false CRC in the last descriptor of the archive."""
    at = data.rfind(b"PK\7\10")
    return data[:at + 4] + bytes([data[at + 4] ^ 1]) + data[at + 5:]


def other_name(data):
    at = data.find(b"PK\3\4", 1)
    return data[:at + 30] + b"X" + data[at + 31:]


def other_method(data):
    at, _ = parts_of(data)
    local = struct.unpack_from("<I", data, at + 42)[0]
    return data[:local + 8] + b"\x0c" + data[local + 9:]


def junk_in_front(data):
    return b"#!/bin/sh\n" + data


def junk_in_front_that_offsets_know(data):
    at, headers = parts_of(data)
    moved = [header[:42] + struct.pack("<I", struct.unpack_from("<I", header, 42)[0] + 10) + header[46:]
             for header in headers]
    return with_directory(b"#!/bin/sh\n" + data[:at], moved)


def junk_behind(data):
    return data + b"junk"


LIES = [hidden_entry, other_descriptor, other_name, other_method, junk_in_front, junk_in_front_that_offsets_know,
        junk_behind]


@pytest.mark.parametrize("lie", LIES, ids=lambda lie: lie.__name__)
@pytest.mark.parametrize("name", ["zip, streamed", "bsdtar", "as jar writes", "Python, streamed"])
def test_package_of_an_archiver_that_was_tampered_with_is_refused(appsync, folder, tmp_path, name, lie):
    path = archive(name, folder, tmp_path / "library" / "made.zip")
    good = path.read_bytes()
    appsync("package", "show", path)
    path.write_bytes(lie(good))
    assert path.read_bytes() != good
    done = appsync("package", "show", path, expect=1)
    assert done.stderr.count("\n") == 1


# Directories in directories.


def deepest(folder):
    """A file under the longest and deepest name that a package may have."""
    name = "Made.app/" + "d/" * 507 + "f"
    path = folder / name
    path.parent.mkdir(parents=True)
    path.write_bytes(b"deep")
    return name


def test_deepest_package_is_made_installed_updated_and_removed(appsync, device, folder, tmp_path):
    name = deepest(folder)
    assert len(name) == 1024
    (tmp_path / "library").mkdir()
    made = tmp_path / "library" / "made.zip"
    for version in ("1.0", "2.0"):
        (folder / "Made.app/Info.plist").write_bytes(packages.entries(IDENTIFIER, version)[0][1])
        appsync("package", "make", folder, made)
        device.sync(tmp_path / "library")
        assert device.versions() == {IDENTIFIER: version}
        with open(os.path.join(device.container_of(IDENTIFIER), name), "rb") as file:
            assert file.read() == b"deep"
    appsync("uninstall", device.path, IDENTIFIER)
    assert device.apps() == {}
    assert os.listdir(device.inside("/var/containers/Bundle/Application")) == []


@ON_ONE_PATH
@pytest.mark.parametrize("name", ["zip", "bsdtar", "7z"])
def test_forty_levels_of_an_archiver_are_installed(device, folder, tmp_path, name):
    deep = "Made.app/" + "d/" * 40 + "deep"
    (folder / deep).parent.mkdir(parents=True)
    (folder / deep).write_bytes(b"40 levels deep")
    archive(name, folder, tmp_path / "library" / "made.zip")
    device.sync(tmp_path / "library")
    with open(os.path.join(device.container_of(IDENTIFIER), deep), "rb") as file:
        assert file.read() == b"40 levels deep"


def test_folder_that_lies_deeper_than_names_are_long_is_no_package(appsync, folder, tmp_path):
    name = deepest(folder)
    (folder / name).unlink()
    (folder / name).mkdir()
    (folder / name / "f").write_bytes(b"too deep")
    done = appsync("package", "make", folder, tmp_path / "out.zip", expect=1)
    assert "has a name that is too long" in done.stderr


@ON_ONE_PATH
def test_data_that_lies_deep_is_backed_up_and_restored(appsync, device, tmp_path):
    packages.make_package(str(tmp_path / "library"), IDENTIFIER)
    device.sync(tmp_path / "library")
    name = "d/" * 700 + "letter"
    letter = os.path.join(device.inside("/var/mobile/Containers/Data/" + IDENTIFIER), name)
    os.makedirs(os.path.dirname(letter))
    with open(letter, "wb") as file:
        file.write(b"Dear")
    appsync("backup", device.path, tmp_path / "backup")
    appsync("backup", "--check", tmp_path / "backup")
    other = str(tmp_path / "other")
    appsync("create", other)
    appsync("restore", other, tmp_path / "backup")
    appsync("send", other, IDENTIFIER, tmp_path / "library" / (IDENTIFIER + ".zip"), "--restore", "--parts", "3")
    with open(os.path.join(other, "root/var/mobile/Containers/Data", IDENTIFIER, name), "rb") as file:
        assert file.read() == b"Dear"
