"""Hostile property lists, given to `plist show`."""

import os
import struct

from build import array_of, binary_list, map_of, text
from entry import Entry


def xml(name, document, says, status=1):
    document = document if isinstance(document, bytes) else document.encode()
    return Entry("xml, " + name, lambda place: document, ("plist", "show", "{input}"), status, says,
                 device=None)


def binary(name, content, says, status=1):
    return Entry("binary, " + name, lambda place: content, ("plist", "show", "{input}"), status, says,
                 device=None)


def plist(inside, before=""):
    return before + '<plist version="1.0">' + inside + "</plist>"


def nested(depth, tag="array"):
    return plist(("<%s>" % tag) * depth + ("</%s>" % tag) * depth)


LAUGHS = "<!DOCTYPE lolz [<!ENTITY a0 'ha'>" + "".join(
    "<!ENTITY a%d '%s'>" % (n, ("&a%d;" % (n - 1)) * 10) for n in range(1, 10)) + "]>"
OUTSIDE = "<!DOCTYPE plist [<!ENTITY secret SYSTEM 'file:///etc/passwd'>]>"


def nested_maps(depth):
    return plist("<dict><key>a</key>" * depth + "<true/>" + "</dict>" * depth)


XML = [
    xml("empty", "", "no bytes at all"),
    xml("white space only", "  \n\t ", "line 2"),
    xml("text only", "hello", "line 1"),
    xml("other root", "<html></html>", "line 1"),
    xml("two roots", plist("<true/>") + plist("<true/>"), "line 1"),
    xml("two values", plist("<true/><false/>"), "line 1"),
    xml("no value", plist(""), "line 1"),
    xml("unknown tag", plist("<widget/>"), "widget"),
    xml("billion laughs", plist("<string>&a9;</string>", LAUGHS), "expected &lt;"),
    xml("quadratic blow-up", plist("<string>" + "&a;" * 100_000 + "</string>",
                                   "<!DOCTYPE p [<!ENTITY a '" + "x" * 10_000 + "'>]>"), "expected &lt;"),
    xml("external entity", plist("<string>&secret;</string>", OUTSIDE), "expected &lt;"),
    xml("parameter entity", plist("<string/>", "<!DOCTYPE p [<!ENTITY % x SYSTEM 'file:///etc/passwd'> %x;]>"),
        "", 0),
    xml("external declaration", plist("<true/>", '<!DOCTYPE plist SYSTEM "http://127.0.0.1:9/x.dtd">'),
        "", 0),
    xml("unclosed declaration", plist("<true/>", "<!DOCTYPE plist [<!ENTITY a 'b'"), "declaration"),
    xml("declaration nested deeply", plist("<true/>", "<!DOCTYPE a " + "[<!a " * 20_000), "declaration"),
    xml("unknown entity", plist("<string>&nbsp;</string>"), "expected &lt;"),
    xml("character reference beyond Unicode", plist("<string>&#x110000;</string>"), "line 1"),
    xml("character reference to NUL", plist("<string>&#0;</string>"), "line 1"),
    xml("character reference to half a pair", plist("<string>&#xD800;</string>"), "line 1"),
    xml("character reference of a million digits", plist("<string>&#" + "9" * 1_000_000 + ";</string>"), "line 1"),
    xml("nested 127 deep", nested(127), "", 0),
    xml("nested 128 deep", nested(128), "", 0),
    xml("nested 129 deep", nested(129), "128"),
    xml("nested 100,000 deep", nested(100_000), "128"),
    xml("nested 100,000 deep, unclosed", "<plist>" + "<array>" * 100_000, "line 1"),
    xml("maps nested 129 deep", nested_maps(129), "128"),
    xml("unknown tags nested 100,000 deep", nested(100_000, "x"), "line 1"),
    xml("bad base64", plist("<data>@@@@</data>"), "line 1"),
    xml("base64 cut off", plist("<data>QUJ</data>"), "line 1"),
    xml("base64 with padding inside", plist("<data>QQ==QUJD</data>"), "line 1"),
    xml("base64 of two megabytes", plist("<data>" + "QUJD" * 500_000 + "</data>"), "", 0),
    xml("date without a day", plist("<date>2024-01</date>"), "date"),
    xml("date that is none", plist("<date>2024-02-30T00:00:00Z</date>"), "date"),
    xml("date with a fraction", plist("<date>2024-02-29T12:30:09.25Z</date>"), "expected a date"),
    xml("date with letters", plist("<date>now</date>"), "date"),
    xml("date of a far year", plist("<date>99999999999-01-01T00:00:00Z</date>"), "date"),
    xml("integer of 65 bits", plist("<integer>18446744073709551616</integer>"), "integer"),
    xml("integer below 64 bits", plist("<integer>-9223372036854775809</integer>"), "integer"),
    xml("integer that is none", plist("<integer>12x</integer>"), "integer"),
    xml("integer without digits", plist("<integer></integer>"), "integer"),
    xml("integer of a million digits", plist("<integer>" + "1" * 1_000_000 + "</integer>"), "integer"),
    xml("real that is none", plist("<real>1.2.3</real>"), "line 1"),
    xml("real too large", plist("<real>1e999</real>"), "line 1"),
    xml("boolean with text", plist("<true>yes</true>"), "line 1"),
    xml("equal keys", plist("<dict><key>a</key><true/><key>a</key><false/></dict>"), "line 1"),
    xml("key without value", plist("<dict><key>a</key></dict>"), "line 1"),
    xml("value without key", plist("<dict><true/></dict>"), "key"),
    xml("two keys", plist("<dict><key>a</key><key>b</key><true/></dict>"), "line 1"),
    xml("text in an array", plist("<array>text</array>"), "line 1"),
    xml("tag in a string", plist("<string>a<b/></string>"), "line 1"),
    xml("unclosed", "<plist><dict><key>a</key>", "line 1"),
    xml("end tags crossed", "<plist><array><dict></array></dict></plist>", "line 1"),
    xml("text after the end", plist("<true/>") + "text", "line 1"),
    xml("NUL after the end", plist("<true/>").encode() + b"\0", "line 1"),
    xml("NUL inside", plist("<string>a\0b</string>"), "line 1"),
    xml("control character", plist("<string>a\x1b[2Jb</string>"), "line 1"),
    xml("not UTF-8", plist("<string>").encode()[:-8] + b"\xc3\x28</string></plist>", "UTF-8"),
    xml("UTF-8 that is overlong", b"<plist><string>\xc0\xae</string></plist>", "UTF-8"),
    xml("UTF-8 of half a pair", b"<plist><string>\xed\xa0\x80</string></plist>", "UTF-8"),
    xml("UTF-16 with a byte-order mark", b"\xff\xfe" + plist("<true/>").encode("utf-16-le"), "UTF-8"),
    xml("UTF-16 with the other byte-order mark", b"\xfe\xff" + plist("<true/>").encode("utf-16-be"), "UTF-8"),
    xml("UTF-32", plist("<true/>").encode("utf-32"), "UTF-8"),
    xml("byte-order mark twice", b"\xef\xbb\xbf\xef\xbb\xbf" + plist("<true/>").encode(), "line 1"),
    xml("unclosed comment", plist("<!-- <true/>"), "comment"),
    xml("unclosed CDATA section", plist("<string><![CDATA[a</string>"), "CDATA"),
    xml("unclosed processing instruction", "<?xml version='1.0'" + plist("<true/>"), "line 1"),
    xml("unclosed attribute", '<plist version="1.0><true/></plist>', "line 1"),
    xml("100,000 attributes", "<plist " + " ".join('a%d=""' % n for n in range(100_000)) + "><true/></plist>", "", 0),
    xml("100,000 keys", plist("<dict>" + "".join("<key>%d</key><true/>" % n for n in range(100_000)) + "</dict>"), "", 0),
    xml("70,000 equal keys", plist("<dict>" + "<key>a</key><true/>" * 70_000 + "</dict>"), "line 1"),
    xml("a million opening brackets", "<" * 1_000_000, "line 1"),
]

INTEGER = b"\x10\x07"

# Each array holds the next one twice: what is small here would be 2^40 values.
DOUBLED = binary_list([array_of(n + 1, n + 1) for n in range(40)] + [INTEGER])
SHARED_DATA = binary_list([array_of(*[1] * 60_000), b"\x4f\x12" + struct.pack(">I", 60_000) + bytes(60_000)],
                          offset_size=4)


def chain(depth):
    return binary_list([array_of(n + 1, width=2) for n in range(depth - 1)] + [b"\xa0"], references=2,
                       offset_size=4)


GOOD = binary_list([INTEGER])

BINARY = [
    binary("magic only", b"bplist00", "offset"),
    binary("other version", binary_list([INTEGER], magic=b"bplist99"), "offset"),
    binary("trailer cut off", GOOD[:-1], "offset"),
    binary("trailer alone", b"bplist00" + GOOD[-32:], "offset"),
    binary("an array in itself", binary_list([array_of(0)]), "itself"),
    binary("two arrays in each other", binary_list([array_of(1), array_of(0)]), "itself"),
    binary("a map in itself", binary_list([map_of([1], [0]), text(b"a")]), "itself"),
    binary("shared bomb of arrays", DOUBLED, "offset"),
    binary("shared bomb of data", SHARED_DATA, "", 0),
    binary("chain 128 deep", chain(128), "", 0),
    binary("chain 129 deep", chain(129), "128"),
    binary("chain 60,000 deep", chain(60_000), "128"),
    binary("offset table beyond the file", binary_list([INTEGER], table=10_000), "offset"),
    binary("offset table near 2^64", binary_list([INTEGER], table=2**64 - 1), "offset"),
    binary("offset table in the header", binary_list([INTEGER], table=0), "offset"),
    binary("offset of an object beyond the file", binary_list([INTEGER], offsets=[200]), "offset"),
    binary("offset of an object in the trailer", binary_list([INTEGER], offsets=[12]), "offset"),
    binary("no objects", binary_list([INTEGER], count=0), "offset"),
    binary("more objects than there are", binary_list([INTEGER], count=5), "offset"),
    binary("2^64 - 1 objects", binary_list([INTEGER], count=2**64 - 1), "offset"),
    binary("2^61 objects of eight bytes", binary_list([INTEGER], count=2**61, offset_size=8), "offset"),
    binary("top object beyond the others", binary_list([INTEGER], top=1), "offset"),
    binary("top object 2^64 - 1", binary_list([INTEGER], top=2**64 - 1), "offset"),
    binary("references of no bytes", binary_list([array_of(1), INTEGER], references=0), "offset"),
    binary("references of nine bytes", binary_list([array_of(1), INTEGER], references=9), "offset"),
    binary("offsets of no bytes", binary_list([INTEGER], offset_size=0), "offset"),
    binary("offsets of nine bytes", binary_list([INTEGER], offset_size=9), "offset"),
    binary("reference beyond the objects", binary_list([array_of(9)]), "offset"),
    binary("array of 2^63 elements", binary_list([b"\xaf\x13" + struct.pack(">Q", 2**63)]), "offset"),
    binary("map of 2^64 - 1 entries", binary_list([b"\xdf\x13" + b"\xff" * 8]), "offset"),
    binary("data of 2^62 bytes", binary_list([b"\x4f\x13" + struct.pack(">Q", 2**62)]), "offset"),
    binary("text of 2^63 halves", binary_list([b"\x6f\x13" + struct.pack(">Q", 2**63)]), "offset"),
    binary("negative size", binary_list([b"\x4f\x13" + struct.pack(">q", -1)]), "offset"),
    binary("size that is no integer", binary_list([b"\x4f\x51a"]), "offset"),
    binary("size of 128 bits", binary_list([b"\x4f\x14" + bytes(15) + b"\1a"]), "offset"),
    binary("integer of 32 bytes", binary_list([b"\x15" + bytes(32)]), "offset"),
    binary("integer of 128 bits", binary_list([b"\x14\1" + bytes(15)]), "offset"),
    binary("real of one byte", binary_list([b"\x20\0"]), "offset"),
    *[binary("date that is " + name, binary_list([b"\x33" + bits + bytes(6)]), "offset 8: expected a date")
      for name, bits in (("not a number", b"\x7f\xf8"), ("not a number, negative", b"\xff\xf8"),
                         ("infinite", b"\x7f\xf0"), ("infinitely long ago", b"\xff\xf0"))],
    binary("date in a far year", binary_list([b"\x33" + struct.pack(">d", 1e300)]), "", 0),
    binary("text that is not ASCII", binary_list([text(b"\xff\xfe")]), "offset"),
    binary("half a pair of UTF-16", binary_list([b"\x61\xd8\0"]), "offset"),
    binary("key that is no text", binary_list([map_of([1], [1]), INTEGER]), "offset"),
    binary("key that is a map", binary_list([map_of([1], [2]), b"\xd0", INTEGER]), "offset"),
    binary("equal keys", binary_list([map_of([1, 2], [3, 3]), text(b"a"), text(b"a"), INTEGER]), "offset"),
    binary("null object", binary_list([b"\0"]), "offset"),
    binary("UID object", binary_list([b"\x80\1"]), "offset"),
    binary("set object", binary_list([b"\xc1\1", INTEGER]), "offset"),
    binary("unknown object", binary_list([b"\x7f"]), "offset"),
    binary("URL object", binary_list([b"\x0c"]), "offset"),
    binary("a megabyte of zeros", b"bplist00" + bytes(1 << 20), "offset"),
    binary("a megabyte of ones", b"bplist00" + b"\xff" * (1 << 20), "offset"),
]

ENTRIES = XML + BINARY + [
    Entry("a directory", lambda place: place.input.mkdir(), ("plist", "show", "{input}"), 1, "regular file",
          device=None),
    Entry("no file", lambda place: None, ("plist", "show", "{input}"), 1, "No such file", device=None),
    Entry("a pipe", lambda place: os.mkfifo(place.input), ("plist", "show", "{input}"), 1,
          "regular file", device=None),
    Entry("500 GiB of nothing", lambda place: (place.device.mkdir(), (place.device / "big").touch(),
                                               os.truncate(place.device / "big", 500 << 30))[3:] or None,
          ("plist", "show", "{device}/big"), 1, "too large", device=None),
    Entry("binary date in a far year, converted",
          lambda place: binary_list([b"\x33" + struct.pack(">d", 1e300)]),
          ("plist", "convert", "{input}", "--to", "xml", "--out", "{out}"), 1,
          "XML cannot carry this date (years 0001 to 9999 only); write it as binary"),
    Entry("converted in its own place while damaged", lambda place: b"<plist>",
          ("plist", "convert", "{input}", "--to", "binary", "--out", "{input}"), 1, "line 1", device=None),
]
