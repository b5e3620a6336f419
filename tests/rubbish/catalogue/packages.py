"""Hostile packages: shown, and synced to a device."""

import os
import plistlib
import struct
import zlib

import packages
from build import Zip, descriptor, zeros, zip_of
from entry import Entry, both_are_there

BAD = "com.example.bad"
GOOD = packages.entries(BAD)
INFO = GOOD[0][1]
SHOW = ("package", "show", "{input}")


def shown(name, content, says, status=1, also=None):
    make = content if callable(content) else lambda place: content
    return Entry(name, make, SHOW, status, says, device=None, also=also)


def bundle(*more, info=INFO):
    """A good package, entry by entry, with more in it."""
    archive = Zip().add("Bad.app/Info.plist", info)
    for each in more:
        archive.add(**each) if isinstance(each, dict) else archive.add(*each)
    return archive


def with_info(**more):
    return zip_of([("Bad.app/Info.plist", plistlib.dumps({**packages.info(BAD), **more}))] + GOOD[1:])


def without(content, start, count):
    return content[:start] + content[start + count:]


WHOLE = zip_of(GOOD)
PLAIN = bundle().end()

NAMES = [
    shown("a name that climbs", bundle(("../evil", b"x")).end(), "evil"),
    shown("a name that climbs inside", bundle(("Bad.app/a/../../../evil", b"x")).end(), "evil"),
    shown("a name that climbs high", bundle(("Bad.app/" + "../" * 12 + "evil", b"x")).end(), "evil"),
    shown("a name with a dot", bundle(("Bad.app/./a", b"x")).end(), "Bad.app/./a"),
    shown("a name with two slashes", bundle(("Bad.app//a", b"x")).end(), "Bad.app//a"),
    shown("an absolute name",
          lambda place: bundle((str(place.outside / "evil"), b"x")).end(), "outside/evil"),
    shown("a name with a backslash", bundle(("Bad.app\\..\\..\\evil", b"x")).end(), "evil"),
    shown("a name with a drive", bundle(("C:/evil", b"x")).end(), "C:/evil"),
    shown("an empty name", bundle(("", b"x")).end(), "name"),
    shown("a slash for a name", bundle(("/", b"")).end(), "name"),
    shown("NUL in a name", bundle((b"Bad.app/a\0.txt", b"x")).end(), "name"),
    shown("a line break in a name", bundle(("Bad.app/a\nb", b"x")).end(), "\\x0a"),
    shown("an escape sequence in a name", bundle(("Bad.app/\x1b[2J", b"x")).end(), "\\x1b"),
    shown("a name that is not UTF-8", bundle((b"Bad.app/\xff\xfe", b"x")).end(), "\\xff"),
    shown("a name of 256 bytes", bundle(("Bad.app/" + "n" * 256, b"x")).end(), "too long"),
    shown("a name of 65,000 bytes", bundle(("Bad.app/" + "n" * 65_000, b"x")).end(), "name"),
    shown("a name as deep as names are long", bundle(("Bad.app/" + "d/" * 507 + "ff", b"x")).end(), "", 0),
    shown("a name deeper than names are long", bundle(("Bad.app/" + "d/" * 508 + "f", b"x")).end(), "too long"),
    shown("a name 30,000 deep", bundle(("Bad.app/" + "d/" * 30_000 + "f", b"x")).end(), "too long"),
    shown("the same name twice", bundle(("Bad.app/a", b"x"), ("Bad.app/a", b"y")).end(), "twice"),
    shown("the same directory and file", bundle(("Bad.app/a/", b""), ("Bad.app/a", b"y")).end(), "Bad.app/a"),
    shown("names that differ in case", bundle(("Bad.app/a", b"x"), ("Bad.app/A", b"y")).end(), "", 0),
    shown("a file as a directory", bundle(("Bad.app/a", b"x"), ("Bad.app/a/b", b"y")).end(), "Bad.app/a"),
    shown("a directory with contents", bundle(("Bad.app/a/", b"x")).end(), "Bad.app/a/"),
    shown("another name in the local header",
          bundle(dict(name="Bad.app/a", content=b"x", local_name=b"../../ev")).end(), "Bad.app/a"),
    shown("another name in the extra field",
          bundle(dict(name="Bad.app/a", content=b"x", extra=b"up" + struct.pack(
              "<HBI", 12, 1, zlib.crc32(b"Bad.app/a")) + b"../evil")).end(), ""),
]

KINDS = [
    shown("a link", bundle(dict(name="Bad.app/l", content=b"/etc/passwd", mode=0o120777)).end(), "Bad.app/l"),
    shown("a link that is written through",
          bundle(dict(name="Bad.app/l", content=b"../../../..", mode=0o120777), ("Bad.app/l/evil", b"x")).end(),
          "Bad.app/l"),
    shown("a device file", bundle(dict(name="Bad.app/d", mode=0o020666)).end(), "Bad.app/d"),
    shown("a pipe", bundle(dict(name="Bad.app/p", mode=0o010666)).end(), "Bad.app/p"),
    shown("a socket", bundle(dict(name="Bad.app/s", mode=0o140666)).end(), "Bad.app/s"),
    shown("a directory by its mode only", bundle(dict(name="Bad.app/x", content=b"x", mode=0o040755)).end(),
          "Bad.app/x"),
    shown("the bundle as a link", Zip().add("Bad.app", b"/tmp", mode=0o120777).add("Bad.app/Info.plist", INFO).end(),
          "Bad.app"),
]

ARCHIVES = [
    shown("empty", b"", "archive"),
    shown("not an archive", b"hello" * 100, "archive"),
    shown("the end alone", Zip().end(), "<Name>.app"),
    shown("the end cut off", WHOLE[:-10], "archive"),
    shown("cut in half", WHOLE[:len(WHOLE) // 2], "archive"),
    shown("a byte missing in front", without(WHOLE, 0, 1), ""),
    shown("four bytes missing in the middle", without(WHOLE, 200, 4), ""),
    shown("more in front than there should be", b"#!/bin/sh\n" + WHOLE, ""),
    shown("a tail after the end", WHOLE + b"tail", "archive"),
    shown("an encrypted entry", bundle(dict(name="Bad.app/e", content=b"x", flags=1)).end(), "encrypted"),
    shown("strong encryption", bundle(dict(name="Bad.app/e", content=b"x", flags=0x41)).end(), "encrypted"),
    shown("an unknown compression", bundle(dict(name="Bad.app/e", content=b"x", method=97)).end(), "Bad.app/e"),
    shown("a directory beyond the file", bundle().end(at=1 << 30), ""),
    shown("a directory of 2^32 - 1 bytes", bundle().end(size=0xFFFFFFFE), ""),
    shown("a directory smaller than it is", bundle(("Bad.app/a", b"x")).end(size=20), ""),
    shown("more entries told than there are", bundle().end(count=9), ""),
    shown("fewer entries told than there are", bundle(("Bad.app/a", b"x")).end(count=1), ""),
    shown("65,534 entries told", bundle().end(count=0xFFFE), ""),
    shown("no entries told", bundle().end(count=0), ""),
    shown("another disk", bundle().end(disk=3), ""),
    shown("2^64 - 1 entries told by the large end", bundle().end64(count=2**64 - 1), "more files than"),
    shown("2^40 entries told by the large end", bundle().end64(count=2**40), "more files than"),
    shown("a directory of 2^63 bytes told by the large end", bundle().end64(size=2**63), ""),
    shown("a directory at 2^64 - 1 told by the large end", bundle().end64(at=2**64 - 1), ""),
    shown("a comment that is an end", bundle().end(comment=Zip().end()), ""),
    shown("a comment longer than the file", PLAIN[:-2] + b"\xff\xff", ""),
    shown("an entry beyond the file", bundle(dict(name="Bad.app/a", content=b"x", offset=1 << 30)).end(), ""),
    shown("an entry in the directory", bundle(dict(name="Bad.app/a", offset=len(bundle().body))).end(), ""),
    shown("2,000 entries that are one", lambda place: overlapping(2000), ""),
    shown("an entry of 2^32 - 2 bytes", bundle(dict(name="Bad.app/a", content=b"x", size=0xFFFFFFFE)).end(), ""),
    shown("an entry packed in 2^32 - 2 bytes",
          bundle(dict(name="Bad.app/a", content=b"x", packed_size=0xFFFFFFFE)).end(), ""),
    shown("large sizes in the extra field",
          bundle(dict(name="Bad.app/a", content=b"x", size=0xFFFFFFFF, packed_size=0xFFFFFFFF,
                      extra=struct.pack("<HHQQ", 1, 16, 2**63, 2**63))).end(), ""),
    shown("an extra field cut off",
          bundle(dict(name="Bad.app/a", content=b"x", extra=struct.pack("<HH", 1, 400))).end(), ""),
    shown("100,001 entries", lambda place: many(100_001), "more files than"),
]


def streamed(after, **more):
    """An entry whose CRC and sizes stand after its contents."""
    return bundle({"name": "Bad.app/a", "content": b"x", "flags": 8, "local": (0, 0, 0), "after": after, **more},
                  ("Bad.app/b", b"y")).end()


def large(*sizes):
    return struct.pack("<HH%dQ" % len(sizes), 1, 8 * len(sizes), *sizes)


ELSEWHERE = 0xFFFFFFFF
FORMS = [("signed", {}), ("bare", {"signature": b""}), ("large and signed", {"width": "Q"}),
         ("large and bare", {"width": "Q", "signature": b""})]

HEADERS = [
    *[shown("a descriptor, " + form, streamed(descriptor(b"x", **more)), "", 0) for form, more in FORMS],
    *[shown("a descriptor, %s, with another %s" % (form, lie), streamed(descriptor(b"x", **more, **{lie: 7})), "Bad.app/a")
      for form, more in FORMS for lie in ("crc", "packed_size", "size")],
    shown("a descriptor that is not announced", bundle(
        dict(name="Bad.app/a", content=b"x", after=descriptor(b"x"))).end(), "belong to no entry"),
    shown("a descriptor that is missing", streamed(b""), "Bad.app/a"),
    shown("two descriptors", streamed(2 * descriptor(b"x")), "belong to no entry"),
    shown("another size beside a descriptor", streamed(descriptor(b"x"), local=(0, 0, 2)), "another size"),
    shown("another packed size beside a descriptor", streamed(descriptor(b"x"), local=(0, 9, 0)), "another packed size"),
    shown("another CRC beside a descriptor", streamed(descriptor(b"x"), local=(9, 0, 0)), "another CRC"),
    shown("no sizes and no descriptor", bundle(dict(name="Bad.app/a", content=b"x", local=(0, 0, 0))).end(), "Bad.app/a"),
    shown("large sizes that are not needed",
          bundle(dict(name="Bad.app/a", content=b"x", extra=large(1, 1))).end(), "", 0),
    shown("large sizes in the local header alone",
          bundle(dict(name="Bad.app/a", content=b"x", local=(zlib.crc32(b"x"), ELSEWHERE, ELSEWHERE),
                      local_extra=large(1, 1))).end(), "", 0),
    shown("large sizes that are not needed and not true",
          bundle(dict(name="Bad.app/a", content=b"x", extra=large(1, 2))).end(), "Bad.app/a"),
    shown("large sizes in the local header that are not true",
          bundle(dict(name="Bad.app/a", content=b"x", local=(zlib.crc32(b"x"), ELSEWHERE, ELSEWHERE),
                      local_extra=large(1 + 2**32, 1))).end(), "another size"),
    shown("large sizes twice", bundle(dict(name="Bad.app/a", content=b"x", size=ELSEWHERE, packed_size=ELSEWHERE,
                                           extra=large(1, 1) + large(9, 9))).end(), "Bad.app/a"),
    shown("large sizes that are missing",
          bundle(dict(name="Bad.app/a", content=b"x", size=ELSEWHERE)).end(), "Bad.app/a"),
    shown("extra fields of the local header alone",
          bundle(dict(name="Bad.app/a", content=b"x", local_extra=b"UT\5\0\1abcd")).end(), "", 0),
    shown("extra fields of the local header that are cut off",
          bundle(dict(name="Bad.app/a", content=b"x", local_extra=b"UT\5\0\1")).end(), "Bad.app/a"),
    shown("an entry that the directory hides",
          bundle(dict(name="Bad.app/hidden", content=b"x", listed=False), ("Bad.app/b", b"y")).end(), "belong to no entry"),
    shown("an entry that the directory hides at the end",
          bundle(dict(name="Bad.app/hidden", content=b"x", listed=False)).end(), "belong to no entry"),
    shown("an entry that the directory hides in front",
          Zip().add("Bad.app/hidden", b"x", listed=False).add("Bad.app/Info.plist", INFO).end(), "belong to no entry"),
    shown("an entry that reaches into the next",
          bundle(dict(name="Bad.app/a", content=b"x", packed_size=2, size=2), ("Bad.app/b", b"y")).end(), "overlaps"),
    shown("an entry that reaches into the directory",
          bundle(dict(name="Bad.app/a", content=b"x", packed_size=2, size=2)).end(), "overlaps"),
    shown("a gap before the end", bundle().end(before=b"gap"), ""),
]

BOMBS = [
    shown("a bomb of 256 MiB", lambda place: bomb(256 << 20), "bytes"),
    shown("an Info.plist that claims 1 GiB",
          Zip().add("Bad.app/Info.plist", INFO, size=1 << 30).end(), ""),
    shown("an Info.plist that is 32 MiB of zeros",
          Zip().add("Bad.app/Info.plist", bytes(32 << 20), packed=zeros(32 << 20), method=8).end(), "Info.plist"),
    shown("an Info.plist of 900 KiB nested deeply",
          zip_of([("Bad.app/Info.plist", b"<plist>" + b"<array>" * 130_000)]), "Info.plist"),
    shown("an Info.plist of 900 KiB of keys",
          zip_of([("Bad.app/Info.plist", b"<plist><dict>" + b"".join(
              b"<key>%d</key><true/>" % n for n in range(35_000)) + b"</dict></plist>")]), "BundleIdentifier"),
    shown("an Info.plist of equal keys", zip_of([("Bad.app/Info.plist", b"<plist><dict>" + b"<key>a</key><true/>"
                                                  * 40_000)]), "Info.plist"),
    shown("metadata of 32 MiB", zip_of(GOOD[:-1] + [("VessikMetadata.plist", bytes(32 << 20))]), "VessikMetadata"),
]

CONTENTS = [
    shown("no bundle", zip_of([("readme.txt", b"hello")]), "readme.txt"),
    shown("only metadata", zip_of([GOOD[-1]]), "<Name>.app"),
    shown("a file named like a bundle", zip_of([("Bad.app", b"x")]), "Bad.app"),
    shown("a bundle without a name", zip_of([(".app/Info.plist", INFO)]), ".app"),
    shown("two bundles", zip_of(GOOD + [("Other.app/Info.plist", INFO)]), "Other.app"),
    shown("something beside the bundle", zip_of(GOOD + [("readme.txt", b"x")]), "readme.txt"),
    shown("no Info.plist", zip_of(GOOD[1:]), "Info.plist"),
    shown("Info.plist as a directory", zip_of([("Bad.app/Info.plist/", b"")] + GOOD[1:]), "Info.plist"),
    shown("Info.plist in other letters", zip_of([("Bad.app/info.plist", INFO)] + GOOD[1:]), "Info.plist"),
    shown("Info.plist that is empty", zip_of([("Bad.app/Info.plist", b"")]), "Info.plist"),
    shown("Info.plist that is damaged", zip_of([("Bad.app/Info.plist", b"<plist><dict><key>")]), "line 1"),
    shown("Info.plist that is an array", zip_of([("Bad.app/Info.plist", plistlib.dumps([1]))]), "Info.plist"),
    shown("metadata as a directory", zip_of(GOOD[:-1] + [("VessikMetadata.plist/", b"")]), "VessikMetadata"),
    shown("a version that is a number", with_info(BundleVersion=7), "BundleVersion"),
    shown("a version that is a map", with_info(BundleVersion={"a": "b"}), "BundleVersion"),
    shown("a version of a million letters", with_info(BundleVersion="1" * 1_000_000), ""),
    shown("a version with a line break", with_info(BundleVersion="1\n2"), "BundleVersion"),
    shown("a name that is data", with_info(BundleDisplayName=b"x"), "BundleDisplayName"),
    shown("an icon that climbs", with_info(BundleIconFile="../../../secret"), "BundleIconFile"),
    shown("an icon that is absolute", with_info(BundleIconFile="/etc/passwd"), "BundleIconFile"),
    shown("an executable that climbs", with_info(BundleExecutable="../../../bin/sh"), "BundleExecutable"),
    *[shown("identifier " + repr(identifier)[:24], with_info(BundleIdentifier=identifier), "BundleIdentifier")
      for identifier in ("", ".", "..", "a/b", "../a", "a b", "a\\b", "\u00e9", "a" * 256, 7, ["a"])],
]


def overlapping(count):
    """Each entry is the same bytes: small here, and much when it is unpacked."""
    archive = Zip().add("Bad.app/Info.plist", INFO)
    at = len(archive.body)
    archive.add("Bad.app/0", bytes(100_000), packed=zeros(100_000), method=8)
    for number in range(1, count):
        archive.add("Bad.app/%d" % number, bytes(100_000), packed=zeros(100_000), method=8, offset=at)
    return archive.end()


def many(count):
    archive = Zip().add("Bad.app/Info.plist", INFO)
    names = [b"Bad.app/%d" % number for number in range(count - 1)]
    local = [struct.pack("<4sHHHHHIIIHH", b"PK\3\4", 20, 0, 0, 0, 0x21, 0, 0, 0, len(name), 0) + name
             for name in names]
    at = len(archive.body)
    directory = []
    for name, head in zip(names, local):
        directory.append(struct.pack("<4sBBHHHHHIIIHHHHHII", b"PK\1\2", 20, 3, 20, 0, 0, 0, 0x21, 0, 0, 0,
                                     len(name), 0, 0, 0, 0, 0o100644 << 16, at) + name)
        at += len(head)
    archive.body += b"".join(local)
    archive.directory += b"".join(directory)
    archive.count = count
    return archive.end64()


def bomb(size):
    packed = zeros(1 << 20)
    # The same block again and again: zeros pack into zeros.
    return Zip().add("Bad.app/Info.plist", INFO).add(
        "Bad.app/bomb", b"", packed=packed, method=8, size=size).end()


# On the device: the good one beside it is installed, the applications that were there stay.


def synced(name, content, identifier, says, also=both_are_there):
    def make(place):
        place.hostile.mkdir()
        (place.hostile / "bad.zip").write_bytes(content(place) if callable(content) else content)

    return Entry("sync, " + name, make, ("sync", "{device}", "{hostile}", "--json"), 1, says, identifier,
                 also=also)


def damaged_update(content):
    """An update of an application that is there."""
    entries = packages.entries("com.example.app00", "2.0")
    return content([(name, data) for name, data in entries])


def with_wrong_crc(items):
    archive = Zip()
    for name, data in items:
        archive.add(name, data, crc=7 if name.endswith("data.bin") else None)
    return archive.end()


def with_wrong_size(items):
    archive = Zip()
    for name, data in items:
        if name.endswith("data.bin"):
            archive.add(name, bytes(10), packed=zeros(5_000_000), method=8)
        else:
            archive.add(name, data)
    return archive.end()


def with_rubbish_inside(items):
    archive = Zip()
    for name, data in items:
        if name.endswith("data.bin"):
            archive.add(name, data, packed=b"\xff" * 100, method=8)
        else:
            archive.add(name, data)
    return archive.end()


def hostile_library(kind):
    def make(place):
        place.hostile.mkdir()
        packages.make_package(str(place.hostile), BAD)
        path = place.hostile / "odd.zip"
        if kind == "directory":
            path.mkdir()
        elif kind == "pipe":
            os.mkfifo(path)
        elif kind == "link to nothing":
            path.symlink_to("nowhere")
        elif kind == "link to a device file":
            path.symlink_to("/dev/zero")

    return make


def bad_is_there(place, done):
    assert done.json()["installed"] == [BAD]


SYNCED = [
    synced("a wrong CRC", damaged_update(with_wrong_crc), "com.example.app00", "data.bin"),
    synced("more bytes than told", damaged_update(with_wrong_size), "com.example.app00", "data.bin"),
    synced("packed bytes that are none", damaged_update(with_rubbish_inside), "com.example.app00", "data.bin"),
    synced("a name that climbs", bundle(("Bad.app/../../../../../evil", b"x")).end(), "bad.zip", "evil"),
    synced("a link that is written through",
           lambda place: bundle(dict(name="Bad.app/l", content=str(place.outside).encode(), mode=0o120777),
                                ("Bad.app/l/evil", b"x")).end(), "bad.zip", "Bad.app/l"),
    *[Entry("sync, a package that is a " + kind, hostile_library(kind), ("sync", "{device}", "{hostile}", "--json"), 1,
            says, "odd.zip", also=bad_is_there)
      for kind, says in (("directory", "regular file"), ("pipe", "regular file"),
                         ("link to nothing", "No such file"), ("link to a device file", "regular file"))],
    Entry("sync, a package of another application's name", lambda place: hostile_library("")(place) or (
        place.hostile / (BAD + ".zip")).rename(place.hostile / "com.example.app00.zip") and None,
          ("sync", "{device}", "{hostile}", "--json"), 0, also=bad_is_there),
    Entry("send, a package of another application",
          lambda place: zip_of(GOOD), ("send", "{device}", "com.example.app00", "{input}", "--json"), 1, BAD,
          "com.example.app00", also=both_are_there),
    Entry("send, what is no package", lambda place: b"PK\3\4", ("send", "{device}", "com.example.app00", "{input}", "--json"),
          1, "archive", "com.example.app00", also=both_are_there),
]

ENTRIES = NAMES + KINDS + ARCHIVES + HEADERS + BOMBS + CONTENTS + SYNCED
