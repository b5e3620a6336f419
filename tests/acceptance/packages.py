"""Application packages and libraries for the tests, good and hostile, made from nothing."""

import os
import plistlib
import struct
import zipfile
import zlib

EPOCH = (2024, 1, 1, 0, 0, 0)


def png(width=64, height=64, colour=(200, 60, 60)):
    """A plain PNG picture."""

    def chunk(kind, data):
        body = kind + data
        return struct.pack(">I", len(data)) + body + struct.pack(">I", zlib.crc32(body))

    row = b"\0" + bytes(colour) * width
    header = struct.pack(">IIBBBBB", width, height, 8, 2, 0, 0, 0)
    return (
        b"\x89PNG\r\n\x1a\n"
        + chunk(b"IHDR", header)
        + chunk(b"IDAT", zlib.compress(row * height))
        + chunk(b"IEND", b"")
    )


def info(identifier, version="1.0", name=None, **more):
    result = {
        "BundleIdentifier": identifier,
        "BundleVersion": version,
        "BundleDisplayName": name or identifier.rsplit(".", 1)[-1].title(),
        "BundleExecutable": "main",
        "BundleIconFile": "Icon.png",
    }
    result.update(more)
    return result


def metadata(identifier, account="account-1"):
    return {
        "korvuId": account,
        "title": identifier,
        "com.korvu.VessikStore.downloadInfo": {
            "accountInfo": {"KorvuID": account, "QPPersonID": 7, "AltQPID": "alt-" + account}
        },
    }


def entries(identifier, version="1.0", payload=b"payload " * 64, fmt=plistlib.FMT_XML, **more):
    """What a good package holds: a list of (name, bytes)."""
    bundle = identifier.rsplit(".", 1)[-1].title() + ".app/"
    return [
        (bundle + "Info.plist", plistlib.dumps(info(identifier, version, **more), fmt=fmt)),
        (bundle + "Icon.png", png()),
        (bundle + "main", b"#!/bin/sh\n"),
        (bundle + "Resources/data.bin", payload),
        ("VessikMetadata.plist", plistlib.dumps(metadata(identifier), fmt=fmt)),
    ]


def entry(name, mode=0o100644, method=zipfile.ZIP_DEFLATED):
    result = zipfile.ZipInfo(name, EPOCH)
    result.external_attr = mode << 16
    result.compress_type = method
    return result


def write_zip(path, items):
    """Writes (name or ZipInfo, bytes) pairs as a zip archive."""
    with zipfile.ZipFile(path, "w", zipfile.ZIP_DEFLATED) as archive:
        for name, data in items:
            archive.writestr(name if isinstance(name, zipfile.ZipInfo) else entry(name), data)
    return path


def make_package(folder, identifier, version="1.0", file_name=None, **more):
    os.makedirs(folder, exist_ok=True)
    path = os.path.join(folder, file_name or identifier + ".zip")
    return write_zip(path, entries(identifier, version, **more))


def make_library(folder, count=5, version="1.0", prefix="com.example.app", **more):
    """A folder of `count` packages; returns their identifiers, sorted."""
    identifiers = ["%s%02d" % (prefix, number) for number in range(count)]
    for identifier in identifiers:
        make_package(folder, identifier, version, **more)
    return identifiers


def hostile_packages(folder, identifier="com.example.bad"):
    """Packages that must be refused, by what is wrong with them."""
    os.makedirs(folder, exist_ok=True)
    good = entries(identifier)
    bundle = good[0][0].split("/")[0] + "/"

    def save(label, items):
        return label, write_zip(os.path.join(folder, label + ".zip"), items)

    yield save("parent-name", good + [("../evil", b"x")])
    yield save("parent-inside", good + [(bundle + "../../evil", b"x")])
    yield save("absolute-name", good + [("/tmp/evil", b"x")])
    yield save("backslash-name", good + [(bundle + "a\\b", b"x")])
    yield save("link", good + [(entry(bundle + "link", 0o120777), b"/etc/passwd")])
    yield save("device", good + [(entry(bundle + "null", 0o020666), b"")])
    yield save("pipe", good + [(entry(bundle + "pipe", 0o010666), b"")])
    yield save("file-as-directory", good + [(bundle + "a", b"x"), (bundle + "a/b", b"y")])
    yield save("no-bundle", [("readme.txt", b"hello")])
    yield save("two-bundles", good + [("Other.app/Info.plist", good[0][1])])
    yield save("no-info", [item for item in good if not item[0].endswith("Info.plist")])
    yield save("damaged-info", [(bundle + "Info.plist", b"<plist><dict><key>")] + good[1:])
    yield save("info-not-a-map", [(bundle + "Info.plist", plistlib.dumps([1]))] + good[1:])
    yield save(
        "no-identifier",
        [(bundle + "Info.plist", plistlib.dumps({"BundleVersion": "1"}))] + good[1:],
    )
    for label, bad in (("dots-identifier", ".."), ("slash-identifier", "a/b"), ("long-identifier", "a" * 256)):
        yield save(label, [(bundle + "Info.plist", plistlib.dumps(info(bad)))] + good[1:])

    import warnings

    with warnings.catch_warnings():
        warnings.simplefilter("ignore")
        yield save("duplicate-entry", good + [good[3]])

    plain = write_zip(os.path.join(folder, "plain.tmp"), good)
    with open(plain, "rb") as file:
        whole = file.read()
    os.remove(plain)

    def raw(label, data):
        path = os.path.join(folder, label + ".zip")
        with open(path, "wb") as file:
            file.write(data)
        return label, path

    yield raw("empty", b"")
    yield raw("not-a-zip", b"this is no archive at all" * 10)
    yield raw("cut-off-end", whole[:-30])
    yield raw("cut-in-half", whole[: len(whole) // 2])
    yield raw("wrong-crc", _with_wrong_crc(whole))
    yield raw("names-differ", _with_other_local_name(whole))
    yield raw("false-count", _with_false_count(whole))
    yield raw("encrypted", _with_encryption_flag(whole))
    yield "bomb", write_zip(os.path.join(folder, "bomb.zip"), good + [(bundle + "bomb", bytes(500 << 20))])


def damage_contents(path, name):
    """Alters the packed bytes of an entry, and nothing that the archive says of itself."""
    with zipfile.ZipFile(path) as archive:
        found = archive.getinfo(name)
    with open(path, "r+b") as file:
        file.seek(found.header_offset + 26)
        lengths = struct.unpack("<HH", file.read(4))
        file.seek(sum(lengths) + found.compress_size // 2, os.SEEK_CUR)
        byte = file.read(1)[0]
        file.seek(-1, os.SEEK_CUR)
        file.write(bytes([byte ^ 0xFF]))
    return path


def _with_wrong_crc(data):
    """The CRC of the first entry, changed in both headers."""
    data = bytearray(data)
    data[14] ^= 0xFF
    start = data.find(b"PK\x01\x02")
    data[start + 16] ^= 0xFF
    return bytes(data)


def _with_other_local_name(data):
    data = bytearray(data)
    data[30] ^= 0x01
    return bytes(data)


def _with_false_count(data):
    data = bytearray(data)
    end = data.rfind(b"PK\x05\x06")
    for offset in (8, 10):
        count = struct.unpack_from("<H", data, end + offset)[0]
        struct.pack_into("<H", data, end + offset, count + 3)
    return bytes(data)


def _with_encryption_flag(data):
    data = bytearray(data)
    start = data.find(b"PK\x01\x02")
    data[6] |= 1
    data[start + 8] |= 1
    return bytes(data)
