"""Hostile staging areas: todo lists, identifiers in them, icon orders."""

import os
import plistlib
import shutil

import staging
from build import array_of, binary_list
from conftest import APPS
from entry import Entry, both_are_there
from staging import AREA, install, remove

LIST = AREA + "/ApplicationsSync.plist"
ORDER = AREA + "/DeskoraIconState.plist"
STAGED = ("sync", "{device}", "{library}", "--staged", "--json")
A, B = APPS


def staged(name, content, status=1, identifier=None, says="", also=both_are_there, device="used-direct",
           order=None):
    """A todo list: bytes, or a value."""
    def make(place):
        place.write_inside(LIST, content if isinstance(content, bytes)
                           else plistlib.dumps(content, fmt=plistlib.FMT_BINARY))
        if order is not None:
            place.write_inside(ORDER, order)

    return Entry(name, make, STAGED, status, says, identifier, device, also)


def nothing_was_done(place, done):
    both_are_there(place, done)
    told = done.json()
    assert told["installed"] == told["updated"] == told["removed"] == []


def removed_first(place, done):
    """Removals come first, whatever the order, so that it is installed afterwards."""
    both_are_there(place, done)
    assert done.json()["failed"] == []


def on_both(name, content, **more):
    return [staged(name, content, **more),
            staged(name + ", coordinated", content, device="used-coordinated", **more)]


UNUSABLE = [
    *[entry for name, content, says in (
        ("not a property list", b"hello", "XML"),
        ("zeros", bytes(100), "XML"),
        ("XML cut off", b"<plist><array><dict>", "line 1"),
        ("binary cut off", plistlib.dumps([install(A)], fmt=plistlib.FMT_BINARY)[:-9], "offset"),
        ("a map", {"a": 1}, "not a list"),
        ("a string", "text", "not a list"),
        ("nested 200 deep", b"<plist>" + b"<array>" * 200, "line 1"),
        ("an array in itself", binary_list([array_of(0)]), "itself"),
    ) for entry in on_both(name, content, identifier="ApplicationsSync.plist", says=says, also=nothing_was_done)],
    *on_both("empty", b"", identifier="ApplicationsSync.plist", also=nothing_was_done),
    staged("60,000 installs", [{"identifier": "com.example.n%d" % n, "operation": "install"}
                               for n in range(60_000)], identifier="ApplicationsSync.plist", says="60000 installs",
           also=nothing_was_done),
    staged("100,000 entries that say nothing", [{}] * 100_000, identifier="ApplicationsSync.plist",
           says="100000 entries", also=nothing_was_done),
    staged("10,000 entries that say nothing", [{}] * 10_000, identifier="entry 10000 of the todo list",
           says="no operation", also=nothing_was_done),
    staged("60,000 removals of what is not there",
           [{"identifier": "n%d" % n, "operation": "remove"} for n in range(60_000)],
           identifier="ApplicationsSync.plist", says="60000 entries", also=nothing_was_done),
    staged("3,000 removals of what is not there",
           [{"identifier": "n%d" % (n % 100), "operation": "remove"} for n in range(3_000)], status=0,
           also=nothing_was_done),
    staged("15,000 entries that are done",
           [{"identifier": "n%d" % n, "operation": "INSTALLED"} for n in range(15_000)], status=0,
           also=nothing_was_done),
    staged("one entry of a megabyte", [{"identifier": "x" * 1_000_000, "operation": "install"}]),
]

ENTRIES_OF_LISTS = [
    *[staged("an entry that is " + name, [entry, remove("com.example.absent")], status=status,
             identifier=identifier, also=nothing_was_done)
      for name, entry, status, identifier in (
          ("a string", "text", 1, "entry 1 of the todo list"), ("a number", 7, 1, "entry 1 of the todo list"), ("an array", [], 1, "entry 1 of the todo list"), ("a date", plistlib.datetime.datetime(2024, 1, 1), 1, "entry 1 of the todo list"),
          ("an empty map", {}, 1, "entry 1 of the todo list"), ("of an unknown operation", {"identifier": A, "operation": "format"}, 0, None),
          ("of an operation in capitals", {"identifier": A, "operation": "REMOVE"}, 0, None),
          ("of an operation that is a number", {"identifier": A, "operation": 1}, 1, "entry 1 of the todo list"),
          ("without an operation", {"identifier": A}, 1, "entry 1 of the todo list"),
          ("without an identifier", {"operation": "install"}, 1, "entry 1 of the todo list"),
          ("of an identifier that is a number", {"identifier": 5, "operation": "install"}, 1,
           "entry 1 of the todo list"),
          ("of an identifier that is data", {"identifier": b"x", "operation": "install"}, 1,
           "entry 1 of the todo list"))],
    staged("a version that is a map", [{**install(A), "version": {"a": 1}}], status=0, also=None),
    staged("a name that is an array", [{**install(A), "name": [1]}], status=0, also=None),
    staged("the same install a thousand times", [install(A)] * 1000, status=0, also=None),
    staged("removal and install of one application", [remove(A), install(A)], status=0, also=removed_first),
    staged("install and removal of one application", [install(A), remove(A)], status=0, also=removed_first),
    staged("a thousand removals of one application", [remove(A)] * 1000, status=0, also=None),
    staged("marks that only the device makes", [{**install(A), "operation": each} for each in
                                                ("SENT", "DOWNLOADED", "INSTALLED", "FAILED")], status=0,
           also=nothing_was_done),
]

HOSTILE = ["", ".", "..", "/..", "/etc", "a/b", "../x", "a/../../b", "../" * 12 + "evil", "a\\b", "a\nb", "a b",
           "\x1b[2J", "\u00e9", "x" * 256, "%s%n", "-rf", "'; DROP TABLE applications; --"]
LEGAL = ["-rf"]

IDENTIFIERS = [
    *[staged("install of " + repr(each)[:30], [install(each)], also=nothing_was_done) for each in HOSTILE],
    *[staged("removal of " + repr(each)[:30], [remove(each)], status=0 if each in LEGAL else 1, also=nothing_was_done)
      for each in HOSTILE],
    staged("install of an identifier with NUL", [install(A + "\0x")], also=nothing_was_done),
    staged("removal of an identifier with NUL", [remove(A + "\0x")], also=nothing_was_done),
    *[Entry("%s %r" % (words[0], words[-1]), lambda place: None, words, 2, "identifier", also=both_are_there)
      for each in ("../x", "a/b", "..", "x" * 256, "a\x1bb")
      for words in (("uninstall", "{device}", each), ("run", "{device}", each), ("why", "{device}", each))],
    Entry("sync --remove ../x", lambda place: None, ("sync", "{device}", "{library}", "--remove", "../x"), 2,
          "identifier", also=both_are_there),
    Entry("send ../x", lambda place: b"PK", ("send", "{device}", "../x", "{input}"), 2, "identifier"),
    Entry("coordinator cancel ../x", lambda place: None, ("coordinator", "{device}", "cancel", "../x"), 2, "identifier"),
]


def order(name, content):
    return staged("icon order, " + name, [install(A)], status=0, order=content, also=installs_or_keeps)


def installs_or_keeps(place, done):
    both_are_there(place, done)


ORDERS = [
    order("empty", b""),
    order("not a property list", b"\xff" * 100),
    order("a map", plistlib.dumps({"a": 1})),
    order("numbers", plistlib.dumps([1, 2.5, True])),
    order("arrays in arrays", plistlib.dumps([[A], [[B]]])),
    order("the same application 50,000 times", plistlib.dumps([A] * 50_000, fmt=plistlib.FMT_BINARY)),
    order("30,000 applications that are not there", plistlib.dumps(["n%d" % n for n in range(30_000)],
                                                                   fmt=plistlib.FMT_BINARY)),
    order("identifiers that climb", plistlib.dumps(["../../x", "/etc/passwd", "", "a\n", A])),
    order("a shared bomb", binary_list([array_of(n + 1, n + 1) for n in range(40)] + [b"\x51a"])),
    Entry("icon order in a library, a map",
          lambda place: (place.hostile.mkdir(), (place.hostile / "IconOrder.plist").write_bytes(
              plistlib.dumps({"a": 1})))[2:] or None,
          ("sync", "{device}", "{hostile}", "--json"), 1, "not a list", "IconOrder.plist", also=both_are_there),
    Entry("icon order in a library, a pipe",
          lambda place: (place.hostile.mkdir(), os.mkfifo(place.hostile / "IconOrder.plist"))[2:] or None,
          ("sync", "{device}", "{hostile}", "--json"), 1, "regular file", "IconOrder.plist", also=both_are_there),
]


def linked(name, link, target, status, also=both_are_there):
    """Part of the staging area is a link that leads out of the device."""
    def make(place):
        path = place.inside(link)
        path.parent.mkdir(parents=True, exist_ok=True)
        if path.is_dir():
            shutil.rmtree(path)
        path.symlink_to(target(place))

    return Entry("link, " + name, make, STAGED, status, also=also)


def area_outside(place):
    area = place.outside / "area"
    area.mkdir()
    (area / "ApplicationsSync.plist").write_bytes(plistlib.dumps([remove(A)]))
    return area


LINKS = [
    linked("the todo list is one that leads outside", LIST, lambda place: area_outside(place) / "ApplicationsSync.plist",
           1),
    linked("the staging area is one that leads outside", AREA, area_outside, 1),
    linked("the public staging directory is one that leads outside", "/var/mobile/Media/PublicStaging",
           lambda place: place.outside, 0),
    linked("the work area is one that leads outside", "/var/mobile/Library/ApplicationSync",
           lambda place: place.outside, 1),
    linked("the todo list is one to itself", LIST, lambda place: "ApplicationsSync.plist", 1),
]

ENTRIES = UNUSABLE + ENTRIES_OF_LISTS + IDENTIFIERS + ORDERS + LINKS
