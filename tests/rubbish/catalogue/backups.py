"""Hostile backups: manifests, restore information, demoted lists, icon orders, archives of data."""

import json
import os
import plistlib
import shutil

from build import Zip, array_of, binary_list, descriptor, text, zeros, zip_of
from conftest import APPS
from entry import Entry

A, B = APPS
RESTORE = ("restore", "{device}", "{backup}", "--json")
GOOD_METADATA = plistlib.dumps({"title": "Shown", "bundleVersion": "1.0"}, fmt=plistlib.FMT_BINARY)


def nothing_was_restored(place, done):
    assert not place.inside("/var/mobile/Media/VessikRestore/RestoreApplications.plist").exists()
    assert os.listdir(place.inside("/var/containers/Bundle/Application")) == []


def both_came(place, done):
    assert sorted(done.json()["restored"]) == APPS


def a_came(place, done):
    assert A in done.json()["restored"]


def manifest(name, content, says, status=3):
    """The manifest's bytes, or what becomes of its text or value."""
    def make(place):
        place.use_backup()
        path = place.backup / "manifest.json"
        if isinstance(content, bytes):
            path.write_bytes(content)
        else:
            value = json.loads(path.read_text())
            path.write_text(json.dumps(content(value) or value))

    return Entry("manifest, " + name, make, RESTORE, status, says, device="empty-direct",
                 also=nothing_was_restored)


def with_file(name, entry):
    def change(value):
        value["files"][name] = entry

    return change


def with_application(**changes):
    def change(value):
        value["applications"][0].update(changes)

    return change


SUM = {"size": 1, "sha256": "0" * 64}

MANIFESTS = [
    manifest("empty", b"", "not JSON"),
    manifest("not JSON", b"{'a': 1}", "not JSON"),
    manifest("cut off", b'{"format": 1, "files": {', "not JSON"),
    manifest("not UTF-8", b'{"format": "\xff\xfe"}', "not JSON"),
    manifest("NUL after the end", b'{"format": 1}\0', "not JSON"),
    manifest("an array", b"[1, 2]", "no format"),
    manifest("an empty map", b"{}", "no format"),
    manifest("a format that is text", b'{"format": "1"}', "no format"),
    manifest("a format that is newer", b'{"format": 2}', "format 2"),
    manifest("a format of 64 bits and more", b'{"format": 18446744073709551617}', "format"),
    manifest("a format of 2^64 + 1 as a real", b'{"format": 1.8446744073709552e19}', "no format"),
    manifest("nested a million deep", b"[" * 1_000_000, "nests deeper"),
    manifest("nested 200,000 deep and closed", b"[" * 200_000 + b"]" * 200_000, "nests deeper"),
    manifest("maps nested 100,000 deep", b'{"a":' * 100_000 + b"1" + b"}" * 100_000, "nests deeper"),
    manifest("nested deeply in a format", b'{"format":' + b"[" * 100_000 + b"]" * 100_000 + b"}", "nests deeper"),
    manifest("a format that is an array", b'{"format":[1]}', "no format"),
    manifest("a number of a million digits", b'{"format":' + b"9" * 1_000_000 + b"}", "not JSON"),
    manifest("a million zeros", b'{"format": 1, "x": [' + b"0," * 500_000 + b"0]}", "no applications"),
    manifest("200,000 equal keys", b"{" + b'"made":1,' * 200_000 + b'"format":2}', "names something twice"),
    manifest("200,000 equal keys that nobody knows", b"{" + b'"a":1,' * 200_000 + b'"format":2}', "format 2"),
    manifest("50,000 other keys", json.dumps({"k%d" % n: n for n in range(50_000)}).encode(), "no format"),
    manifest("50,000 applications", json.dumps({"format": 1, "applications": [
        {"identifier": "n%d" % n, "data": False} for n in range(50_000)]}).encode(), "no files"),
    manifest("20,000 files", json.dumps({"format": 1, "applications": [], "files": {
        "data/n%d.zip" % n: SUM for n in range(20_000)}}).encode(), "restore information"),
    manifest("a file twice", b'{"format": 1, "applications": [], "files": {"IconOrder.plist":'
             + json.dumps(SUM).encode() + b', "IconOrder.plist":' + json.dumps(SUM).encode() + b"}}",
             "names something twice"),
    manifest("a sum twice", b'{"format": 1, "applications": [], "files": {"IconOrder.plist": {"size": 1, "size": 2}}}',
             "names something twice"),
    manifest("files that are an array", b'{"format": 1, "applications": [], "files": [1]}', "no files"),
    manifest("applications that are a map", b'{"format": 1, "applications": {}, "files": {}}', "no applications"),
    manifest("no applications", b'{"format": 1}', "applications"),
    manifest("no files", b'{"format": 1, "applications": []}', "files"),
    manifest("an application that is a number", lambda value: value.update(applications=[7]), "application"),
    manifest("an application that is an array", lambda value: value.update(applications=[[]]), "application"),
    manifest("a file that is an array", with_file("DemotedApps.plist", []), "DemotedApps"),
    manifest("an identifier that is an array", with_application(identifier=[]), "application"),
    manifest("an identifier that climbs", with_application(identifier="../../x"), "application"),
    manifest("an identifier with NUL", with_application(identifier="a\0b"), "application"),
    manifest("data that is not yes or no", with_application(data="yes"), "application"),
    *[manifest("a file " + repr(name), with_file(name, SUM), "file")
      for name in ("../x", "data/../../x.zip", "data/.zip", "/etc/passwd", "data/a/b.zip", "data/a.zip/", "\n", "")],
    manifest("a negative size", with_file("DemotedApps.plist", {**SUM, "size": -1}), "DemotedApps"),
    manifest("a size that is a real", with_file("DemotedApps.plist", {**SUM, "size": 1.5}), "DemotedApps"),
    manifest("a sum that is short", with_file("DemotedApps.plist", {**SUM, "sha256": "00"}), "DemotedApps"),
    manifest("a sum of other letters", with_file("DemotedApps.plist", {**SUM, "sha256": "x" * 64}), "DemotedApps"),
    manifest("the restore information not named", lambda value: value["files"].pop("RestoreApplications.plist") and None,
             "restore information"),
    manifest("the restore information altered", with_file("RestoreApplications.plist", SUM), "altered"),
]


def odd_manifest(kind):
    def make(place):
        place.use_backup()
        path = place.backup / "manifest.json"
        path.unlink()
        if kind == "directory":
            path.mkdir()
        elif kind == "pipe":
            os.mkfifo(path)
        elif kind == "endless":
            path.symlink_to("/dev/zero")

    return make


MANIFESTS += [Entry("manifest, a " + kind, odd_manifest(kind), RESTORE, 3, says, device="empty-direct",
                    also=nothing_was_restored)
              for kind, says in (("directory", "regular file"), ("pipe", "regular file"), ("missing one", "cut off"),
                                 ("endless", "it is a link"))]


def restored(name, file, content, status=0, identifier=None, says="", also=both_came, device="empty-direct",
             command=RESTORE):
    """A backup with other content in one file, whose manifest is true."""
    def make(place):
        place.use_backup()
        data = content(place) if callable(content) else content
        (place.backup / file).write_bytes(
            data if isinstance(data, bytes) else plistlib.dumps(data, fmt=plistlib.FMT_BINARY))
        place.resign()

    return Entry(name, make, command, status, says, identifier, device, also)


def info(name, content, also, **more):
    """On both paths."""
    return direct_info(name, content, also, **more) + coordinated_info(name, content, also, **more)


def direct_info(name, content, also, **more):
    return [restored("restore information, " + name, "RestoreApplications.plist", content, also=also, **more)]


def coordinated_info(name, content, also, **more):
    return [restored("restore information, " + name + ", coordinated", "RestoreApplications.plist", content, also=also,
                     device="empty-coordinated", **more)]


def titled(title, version="1"):
    return entry_with(VessikMetadata=plistlib.dumps({"title": title, "bundleVersion": version}))


def entry_with(**parts):
    return {A: {"VessikMetadata": GOOD_METADATA}, B: {"VessikMetadata": GOOD_METADATA, **parts}}


RESTORE_INFOS = [
    *info("not a property list", b"hello", None, status=1, identifier=A, says="is no map"),
    *info("empty", b"", None, status=1, identifier=A, says="is no map"),
    *info("an array", [1, 2], None, status=1, identifier=A, says="is no map"),
    *info("a map in itself", binary_list([b"\xd1\1\0", text(b"a")]), None, status=1, identifier=A),
    *info("a shared bomb", binary_list([array_of(n + 1, n + 1) for n in range(40)] + [b"\x51a"]), None, status=1,
          identifier=A),
    *info("nested 100,000 deep", b"<plist>" + b"<dict><key>a</key>" * 100_000, None, status=1, identifier=A),
    *info("an application that is a number", {A: {"VessikMetadata": GOOD_METADATA}, B: 7}, a_came, status=1,
          identifier=B),
    *info("an application that is empty", {A: {"VessikMetadata": GOOD_METADATA}, B: {}}, a_came, status=1, identifier=B),
    *info("metadata that is text", entry_with(VessikMetadata="text"), a_came, status=1, identifier=B),
    *info("metadata that is damaged", entry_with(VessikMetadata=b"<plist>"), a_came, status=1, identifier=B),
    *info("metadata that is an array", entry_with(VessikMetadata=plistlib.dumps([1])), a_came, status=1, identifier=B),
    *info("metadata nested deeply", entry_with(VessikMetadata=b"<plist>" + b"<dict><key>a</key>" * 10_000), a_came,
          status=1, identifier=B),
    # Directly the title names a placeholder's bundle, and must be fit for that.
    *direct_info("a title that is a number", titled(7), a_came, status=1, identifier=B),
    *coordinated_info("a title that is a number", titled(7), both_came),
    *direct_info("a title of a megabyte", titled("x" * 1_000_000), a_came, status=1, identifier=B),
    *coordinated_info("a title of a megabyte", titled("x" * 1_000_000), both_came),
    *info("a title that climbs", titled("../../../evil", "../../x"), both_came),
    *info("an icon that is no picture", entry_with(PlaceholderIcon=b"\xff" * 1000), both_came),
    *info("an icon that is text", entry_with(PlaceholderIcon="text"), both_came),
    *info("an icon of eight megabytes", entry_with(PlaceholderIcon=bytes(8 << 20)), both_came),
    *info("SINF data of four megabytes", entry_with(ApplicationSINF=bytes(4 << 20)), both_came),
    *[each for identifier in ("../../x", "../" * 12 + "evil", "/etc/passwd", "", "..", "a\nb", "x" * 300)
      for each in info("identifier " + repr(identifier)[:24],
                       {A: {"VessikMetadata": GOOD_METADATA}, identifier: {"VessikMetadata": GOOD_METADATA}}, a_came,
                       status=1, identifier=identifier)],
]

LISTS = [
    *[restored("demoted list, " + name, "DemotedApps.plist", content, status=1, identifier="DemotedApps.plist",
               says=says, device=device)
      for name, content, says, device in (
          ("empty", b"", "no property list", "empty-coordinated"),
          ("not a property list", b"\0" * 50, "no property list", "empty-coordinated"),
          ("an array", [A], "no map", "empty-coordinated"),
          ("lists that are text", {"AutomaticDowngrades": A}, "is no list", "empty-coordinated"),
          ("lists of odd things", {"AutomaticDowngrades": [1, {}, b"x"], "IntentionalDowngrades": {"a": 1}},
           "is no list", "empty-coordinated"),
          ("a map in itself", binary_list([b"\xd1\1\0", text(b"a")]), "no property list", "empty-direct"))],
    *[restored("demoted list, " + name, "DemotedApps.plist", content, device=device)
      for name, content, device in (
          ("identifiers that climb", {"AutomaticDowngrades": ["../../x", ""]}, "empty-coordinated"),
          ("50,000 identifiers", {"AutomaticDowngrades": ["n%d" % n for n in range(50_000)]}, "empty-coordinated"))],
    *[restored("icon order, " + name, "IconOrder.plist", content, status=1, identifier="IconOrder.plist")
      for name, content in (("empty", b""), ("not a property list", b"\xff" * 50), ("a map", {"a": 1}))],
    *[restored("icon order, " + name, "IconOrder.plist", content)
      for name, content in (("odd things", [1, [A], {}]), ("identifiers that climb", ["../../x", "", "a\n", A]),
                            ("50,000 of one", [A] * 50_000))],
]


def data(name, content, says="", identifier=A, status=1):
    """An archive of data, unpacked with the install of an application whose package is sent."""
    def make(place):
        place.write_inside("/var/mobile/Media/VessikRestore/Data/%s.zip" % A,
                           content(place) if callable(content) else content)

    def data_is_untouched(place, done):
        folder = place.inside("/var/mobile/Containers/Data/" + A)
        if status == 1:
            assert not folder.exists()

    return Entry("data, " + name, make,
                 ("send", "{device}", A, "{library}/%s.zip" % A, "--restore", "--parts", "3", "--json"), status, says,
                 identifier if status == 1 else None, "empty-direct", data_is_untouched)


DATA = [
    data("good", zip_of([("letter", b"Dear")]), status=0),
    data("empty", b""),
    data("not an archive", b"hello" * 50),
    data("cut off", zip_of([("letter", b"Dear")])[:-5]),
    data("a name that climbs", Zip().add("../../evil", b"x").end(), "evil"),
    data("a name that climbs high", Zip().add("a/" + "../" * 14 + "evil", b"x").end(), "evil"),
    data("an absolute name", lambda place: Zip().add(str(place.outside / "evil"), b"x").end(), "evil"),
    data("a link", Zip().add("l", b"/etc/passwd", mode=0o120777).end(), "l"),
    data("a link that is written through",
         lambda place: Zip().add("l", str(place.outside).encode(), mode=0o120777).add("l/evil", b"x").end(), "l"),
    data("a device file", Zip().add("d", mode=0o020666).end(), "d"),
    data("the same name twice", Zip().add("a", b"x").add("a", b"y").end(), "twice"),
    data("a file as a directory", Zip().add("a", b"x").add("a/b", b"y").end(), "a"),
    data("a wrong CRC", Zip().add("a", b"x", crc=1).end(), "a"),
    data("streamed", Zip().add("a", b"x", flags=8, local=(0, 0, 0), after=descriptor(b"x")).end(), status=0),
    data("another CRC in the descriptor",
         Zip().add("a", b"x", flags=8, local=(0, 0, 0), after=descriptor(b"x", crc=7)).end(), "'a'"),
    data("an entry that the directory hides", Zip().add("a", b"x").add("b", b"y", listed=False).end(), "no entry"),
    data("encrypted", Zip().add("a", b"x", flags=1).end(), "encrypted"),
    data("more bytes than told", Zip().add("a", bytes(10), packed=zeros(1 << 20), method=8).end(), "a"),
    data("more bytes than there is room for",
         Zip().add("a", b"x", packed=zeros(1 << 20), method=8, size=0xFFFFFFF0).add(
             "b", b"x", packed=zeros(1 << 20), method=8, size=0xFFFFFFF0).end(), ""),
    data("16 MiB of zeros in 16 KiB", Zip().add("a", bytes(16 << 20), packed=zeros(16 << 20), method=8).end(), status=0),
    data("2^64 - 1 entries told", Zip().add("a", b"x").end64(count=2**64 - 1)),
    data("NUL in a name", Zip().add(b"a\0b", b"x").end()),
    data("a name of 300 bytes", Zip().add("n" * 300, b"x").end()),
    data("a name 400 deep", Zip().add("d/" * 400 + "f", b"x").end(), status=0),
    data("a name longer than any path", Zip().add("d/" * 2001 + "f", b"x").end()),
    data("setuid", Zip().add("a", b"x", mode=0o104777).end(), status=0),
]


def state(name, content):
    """RestoreState.plist, on a device that is synced."""
    return Entry("restore state, " + name, lambda place: place.write_inside(
        "/var/mobile/Library/ApplicationSync/RestoreState.plist",
        content if isinstance(content, bytes) else plistlib.dumps(content)),
                 ("sync", "{device}", "{library}", "--json"), 0, device="empty-direct", also=both_were_installed)


def both_were_installed(place, done):
    assert sorted(done.json()["installed"]) == APPS


STATES = [
    state("empty", b""),
    state("not a property list", b"\xff" * 100),
    state("an array", [1]),
    state("odd things", {A: 7, B: {"1.0": [1]}}),
    state("paths that climb", {A: {"1.0": {"path": "../../../../etc/passwd"}}, B: {"1.0": {"path": 5}}}),
    state("absolute paths", {A: {"1.0": {"path": "/var/mobile/Library"}}, B: {"1.0": {"path": "/"}}}),
]


def checked(name, change, says):
    """`backup --check`: each fault is named, nothing is changed."""
    def make(place):
        place.use_backup()
        change(place)

    return Entry("check, " + name, make, ("backup", "--check", "{backup}"), 1, says, device=None)


CHECKS = [
    checked("a link instead of a list", lambda place: ((place.backup / "IconOrder.plist").unlink(), (
        place.backup / "IconOrder.plist").symlink_to("/dev/zero")), "IconOrder"),
    checked("a pipe instead of an archive", lambda place: ((place.backup / "data" / (A + ".zip")).unlink(), os.mkfifo(
        place.backup / "data" / (A + ".zip"))), A),
    checked("a directory instead of a list", lambda place: ((place.backup / "DemotedApps.plist").unlink(), (
        place.backup / "DemotedApps.plist").mkdir()), "DemotedApps"),
    checked("a link to the folder in itself", lambda place: (place.backup / "loop").symlink_to("."), "loop"),
    checked("no data", lambda place: shutil.rmtree(place.backup / "data"), A),
    checked("a folder 300 deep", lambda place: os.makedirs(str(place.backup) + "/d" * 300 + "/f") or (
        open(str(place.backup) + "/d" * 300 + "/g", "w").close()), "d/d"),
]

ENTRIES = MANIFESTS + RESTORE_INFOS + LISTS + DATA + STATES + CHECKS
