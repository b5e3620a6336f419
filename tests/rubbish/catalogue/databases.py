"""Hostile databases of a device."""

import contextlib
import os
import random
import shutil
import sqlite3

from conftest import APPS
from entry import Entry

A, B = APPS
LOOKS = (("apps", "{device}", "--json"), ("history", "{device}", "--json"), ("why", "{device}", A, "--json"),
         ("inventory", "{device}", "--json"), ("coordinator", "{device}", "list", "--json"))
SYNC = ("sync", "{device}", "{library}", "--json")
LARGEST, SMALLEST = 2**63 - 1, -(2**63)
# What each session clears: the work area and what is there for a while.
PASSING = ("var/mobile/Library/ApplicationSync/", "var/mobile/tmp/")
# Where damage lies in what the command reads it is refused; else it is not seen. Which, the content decides.
SEEN_OR_NOT = (0, 3)


def unharmed(place, done, but=()):
    """Nothing of the device's files has gone or changed, but for what lies below some paths."""
    now = place.device_tree()
    lost = sorted(path for path, what in place.before.items()
                  if now.get(path) != what and not path.startswith((*PASSING, *but)))
    assert lost == [], lost


def unusable(name, make, says, command=SYNC, status=3, also=unharmed):
    return Entry(name, make, command, status, says, also=also)


def written(content):
    """Another file in the place of the database."""
    def make(place):
        path = place.device / "device.db"
        for each in place.device.glob("device.db*"):
            each.unlink()
        if callable(content):
            content(path, place)
        else:
            path.write_bytes(content)

    return make


def changed(change):
    """The bytes of the database changed in its place."""
    def make(place):
        path = place.device / "device.db"
        with contextlib.closing(sqlite3.connect(path)) as database:
            database.execute("PRAGMA wal_checkpoint(TRUNCATE)")
        for each in ("device.db-wal", "device.db-shm"):
            if (place.device / each).exists():
                (place.device / each).unlink()
        content = bytearray(path.read_bytes())
        path.write_bytes(change(content) or content)

    return make


def altered(*statements):
    return lambda place: place.alter(*statements)


def rewritten(*statements):
    """The schema itself, where SQLite allows it only to who asks for it."""
    return altered("PRAGMA writable_schema = ON", *statements)


def other_database(path, place):
    with contextlib.closing(sqlite3.connect(path)) as database:
        database.execute("CREATE TABLE t (a)")
        database.commit()


def put(offset, content):
    def change(whole):
        whole[offset:offset + len(content)] = content

    return change


FILES = [
    unusable("empty", written(b""), "holds nothing"),
    unusable("not a database", written(b"hello" * 1000), "damaged"),
    unusable("a header alone", written(b"SQLite format 3\0"), "damaged"),
    unusable("another program's database", written(other_database), "not that of a device"),
    unusable("a directory", written(lambda path, place: path.mkdir()), "not a file"),
    unusable("a pipe", written(lambda path, place: os.mkfifo(path)), "not a file"),
    unusable("a link out of the device", written(lambda path, place: path.symlink_to(place.outside / "secret")),
             "not a file"),
    unusable("missing", written(lambda path, place: None), "device.db"),
    unusable("cut in half", changed(lambda whole: whole[:len(whole) // 2]), "damaged"),
    unusable("cut off in a page", changed(lambda whole: whole[:-1000]), "", status=SEEN_OR_NOT),
    unusable("one page", changed(lambda whole: whole[:4096]), "damaged"),
    unusable("zeros after the first page", changed(lambda whole: whole[:4096] + bytes(len(whole) - 4096)), "damaged"),
    unusable("a page size of 3", changed(put(16, b"\0\3")), "damaged"),
    unusable("a format of a far future", changed(put(18, b"\x09\x09")), ""),
    unusable("2^32 - 1 pages", changed(put(28, b"\xff" * 4)), ""),
    unusable("a free list that goes in a circle", changed(put(32, b"\0\0\0\1\0\0\0\xff")), ""),
    unusable("text as UTF-16", changed(put(56, b"\0\0\0\3")), ""),
    unusable("a wal of rubbish", lambda place: (place.device / "device.db-wal").write_bytes(b"\xff" * 10_000) and None,
             "", status=0),
    unusable("a journal that is not its own",
             lambda place: (place.device / "device.db-journal").write_bytes(b"\xd9\xd5\x05\xf9 \xa1c\xd7" + bytes(600))
             and None, "", status=0),
    unusable("a wal that is a link out of the device", lambda place: [
        (place.device / each).unlink() for each in ("device.db-wal", "device.db-shm")
        if (place.device / each).exists()] and None or (place.device / "device.db-wal").symlink_to(
            place.outside / "secret"), ""),
]


def flipped(number):
    """Some pages turned to rubbish, always the same ones."""
    def change(whole):
        choose = random.Random(number)
        for _ in range(3):
            page = choose.randrange(1, len(whole) // 4096) * 4096
            whole[page:page + 64] = choose.randbytes(64)

    return changed(change)


PAGES = [unusable("pages of rubbish, choice %d" % number, flipped(number), "", command, SEEN_OR_NOT)
         for number, command in enumerate((SYNC,) * 4 + LOOKS)]

SCHEMAS = [
    unusable("a version of the far future", altered("PRAGMA user_version = 99"), "version 99"),
    unusable("no version", altered("PRAGMA user_version = 0"), "schema version"),
    unusable("a negative version", altered("PRAGMA user_version = -1"), "schema version"),
    unusable("another program's mark", altered("PRAGMA application_id = 7"), "not that of a device"),
    *[unusable("no table %s, %s" % (table, command[0]), altered("PRAGMA foreign_keys = OFF", "DROP TABLE " + table), table, command)
      for table, command in (("applications", SYNC), ("settings", SYNC), ("history", SYNC),
                             ("applications", LOOKS[0]), ("coordinators", LOOKS[4]))],
    unusable("a table without a column", altered("ALTER TABLE applications DROP COLUMN version"), "applications"),
    unusable("a table with another column", altered("ALTER TABLE settings ADD COLUMN extra TEXT"), "settings"),
    unusable("another table", altered("CREATE TABLE extra (a)"), "extra"),
    unusable("a view in the place of a table",
             altered("ALTER TABLE applications RENAME TO real_ones",
                     "CREATE VIEW applications AS SELECT * FROM real_ones"), "not that of a device", LOOKS[0]),
    unusable("a view that never ends",
             altered("DROP TABLE settings", "CREATE VIEW settings AS WITH RECURSIVE n(name, value) AS (SELECT 'a', 1"
                     " UNION ALL SELECT name, value + 1 FROM n) SELECT * FROM n"), "settings", LOOKS[0]),
    unusable("a trigger that removes applications",
             altered("CREATE TRIGGER t AFTER INSERT ON session BEGIN DELETE FROM applications; END"), "trigger 't'"),
    unusable("a trigger that fills the disk",
             altered("CREATE TRIGGER t AFTER INSERT ON session BEGIN INSERT INTO failures WITH RECURSIVE n(i) AS"
                     " (SELECT 1 UNION ALL SELECT i + 1 FROM n) SELECT i, 1, 'x', 1, 'x' FROM n; END"), "trigger 't'"),
    unusable("an index that takes memory",
             altered("CREATE INDEX i ON history (length(printf('%.*c', 1000000, 'x')))"), "index 'i'"),
    unusable("a table whose text is no SQL",
             rewritten("UPDATE sqlite_schema SET sql = 'CREATE rubbish' WHERE name = 'failures'"), "damaged"),
    unusable("two tables on one page",
             rewritten("UPDATE sqlite_schema SET rootpage = (SELECT rootpage FROM sqlite_schema WHERE name ="
                       " 'applications') WHERE name = 'settings'"), ""),
    unusable("a table on a page beyond the file",
             rewritten("UPDATE sqlite_schema SET rootpage = 99999 WHERE name = 'applications'"), "damaged"),
]


def container(value):
    """A's record names another container than its own, which no record names then."""
    def make(place):
        place.forgotten = os.path.relpath(place.container_of(A), place.device / "root")
        place.alter(("UPDATE applications SET container = ? WHERE identifier = ?", (value, A)))

    return make


def unharmed_but_the_forgotten_container(place, done):
    unharmed(place, done, [place.forgotten])


def unharmed_but_the_data_of_a(place, done):
    unharmed(place, done, ["var/mobile/Containers/Data/" + A])


def with_bytes_that_are_no_text(column):
    return altered("UPDATE applications SET %s = CAST(X'fffe41' AS TEXT)" % column)


KEPT = ("INSERT OR REPLACE INTO kept (id, identifier, version, install_type, container, bundle, icon, bytes)"
        " VALUES (1, '%s', '0.9', 4, ?, ?, '', 1)" % A)
ROLLBACK = ("rollback", "{device}", A)


def kept(container, bundle="App00.app"):
    return altered((KEPT, (container, bundle)))


def own_container_kept(place):
    """What is kept and what is installed stand in one container."""
    place.alter((KEPT, (place.container_of(A).name, "App00.app")))


def kept_with(lay_out, bundle="App00.app"):
    """A container that is kept, as `lay_out` makes it."""
    def make(place):
        (place.device / "kept").mkdir()
        lay_out(place, place.device / "kept" / "OLD")
        place.alter((KEPT, ("OLD", bundle)))

    return make


def still_installed(place, done):
    unharmed(place, done)
    assert (place.container_of(A) / "App00.app" / "main").exists()


VALUES = [
    *[Entry("a kept container %r, %s" % (value[:20], command[0]), kept(value), command, status, also=still_installed)
      for value in ("../../../mobile", "..", ".", "", "/", "a\0b", "../../../../../../../../outside")
      for command, status in ((ROLLBACK, 1), (SYNC, 0))],
    *[Entry("a kept container that is the installed one, " + command[0], own_container_kept, command, status,
            also=still_installed) for command, status in ((ROLLBACK, 1), (SYNC, 0), (LOOKS[0], 0))],
    *[Entry("a kept bundle %r" % value, kept_with(lambda place, path: path.mkdir(), value), ROLLBACK, 1, also=still_installed)
      for value in ("../" * 14 + "outside", "../../../../mobile", "..", "")],
    Entry("a kept container that is a link", kept_with(lambda place, path: path.symlink_to(place.outside)), ROLLBACK, 1,
          also=still_installed),
    Entry("a kept container that is a file", kept_with(lambda place, path: path.write_bytes(b"x")), ROLLBACK, 1,
          also=still_installed),
    *[Entry("a container %r, %s" % (value[:20], command[0]), container(value), command, 0, also=also)
      for value in ("../../../mobile", "..", ".", "", "/", "../../../../../../../../outside")
      for command, also in ((("uninstall", "{device}", A), unharmed_but_the_data_of_a),
                            (SYNC, unharmed_but_the_forgotten_container), (("apps", "{device}"), unharmed))],
    Entry("a bundle that climbs, backup", altered(("UPDATE applications SET bundle = ?", ("../" * 14 + "outside",))),
          ("backup", "{device}", "{device}/backup"), 3, also=unharmed),
    Entry("an icon that climbs, screen", altered(("UPDATE applications SET icon = ?", ("../" * 14 + "outside/secret",))),
          ("screen", "{device}", "{out}"), 0, also=unharmed),
    Entry("an icon that is absolute, screen", altered("UPDATE applications SET icon = '/etc/passwd'"),
          ("screen", "{device}", "{out}"), 0, also=unharmed),
    Entry("a name of a megabyte, screen", altered(("UPDATE applications SET name = ?", ("\u00e9" * 500_000,))),
          ("screen", "{device}", "{out}"), 0),
    Entry("an identifier that climbs, uninstall", altered("UPDATE applications SET identifier = '../../mobile'"
                                                          " WHERE identifier = '%s'" % A), SYNC, 0, also=unharmed),
    *[Entry("%s of bytes that are no text, %s" % (column, " ".join(command[::2])), with_bytes_that_are_no_text(column), command, 0)
      for column in ("name", "version", "type") for command in (LOOKS[0], ("apps", "{device}"))],
    Entry("a name that takes over the terminal", altered("UPDATE applications SET name = char(27) || '[2J' || char(10)"),
          ("apps", "{device}"), 0, also=lambda place, done: both_lines(done)),
    Entry("a type that nobody knows", altered("UPDATE applications SET type = 'x'"), SYNC, 0),
]


def both_lines(done):
    assert "\x1b" not in done.out and len(done.out.splitlines()) == 3


TABLES = {
    "applications": ("install_type", "bytes", "arrived"),
    "kept": ("id", "install_type", "bytes"),
    "sums": ("sum",),
    "settings": ("value",),
    "history": ("time", "kind", "step", "party", "phase", "success"),
    "session": ("process", "started", "last_uninstall"),
    "failures": ("time", "code"),
    "denials": ("time", "next_try"),
    "uninstalled": ("time",),
    "coordinators": ("kind", "client", "created", "responsible", "placeholder"),
    "promises": ("role", "position", "client", "space", "percent"),
}

ROWS = ("INSERT OR IGNORE INTO session VALUES (1, 1, 1, 0)",
        "INSERT OR IGNORE INTO failures VALUES ('%s', 1, 'x', 1, 'x')" % A,
        "INSERT OR IGNORE INTO denials VALUES ('%s', 1, 1)" % A,
        "INSERT OR IGNORE INTO running VALUES ('%s')" % A,
        "INSERT OR IGNORE INTO kept VALUES (1, '%s', '0.9', 'x', 4, 'OLD', 'App00.app', '', 1)" % A,
        "INSERT OR IGNORE INTO sums VALUES ('OLD', 1)",
        "INSERT OR IGNORE INTO uninstalled VALUES (1, 'com.example.gone', '1', 1)",
        "INSERT OR IGNORE INTO coordinators (id, identifier, kind, client, created) VALUES (1, '%s', 1, 2, 1)" % A,
        "INSERT OR IGNORE INTO promises VALUES (1, 0, 0, 'x', 2, NULL, 1, 1, 0, 0)")


def numbers(table, value, command, device):
    sets = ", ".join("%s = %d" % (column, value) for column in TABLES[table])
    return Entry("%s full of %d, %s%s" % (table, value, command[0], "" if device == "used-direct" else ", coordinated"),
                 altered(*ROWS, "UPDATE OR IGNORE %s SET %s" % (table, sets)), command, 0, device=device, also=unharmed)


NUMBERS = [numbers(table, value, command, device)
           for table, command, device in (
               ("applications", SYNC, "used-direct"), ("applications", LOOKS[0], "used-direct"),
               ("applications", LOOKS[3], "used-direct"), ("kept", LOOKS[0], "used-direct"),
               ("kept", ("status", "{device}", "--json"), "used-direct"), ("kept", SYNC, "used-direct"),
               ("sums", SYNC, "used-direct"), ("settings", SYNC, "used-direct"),
               ("history", LOOKS[1], "used-direct"), ("session", SYNC, "used-direct"),
               ("failures", LOOKS[2], "used-direct"), ("denials", LOOKS[2], "used-direct"),
               ("uninstalled", LOOKS[3], "used-direct"), ("coordinators", LOOKS[4], "used-coordinated"),
               ("coordinators", LOOKS[2], "used-coordinated"), ("coordinators", SYNC, "used-coordinated"),
               ("promises", LOOKS[4], "used-coordinated"), ("promises", SYNC, "used-coordinated"))
           for value in (LARGEST, SMALLEST)]

BLOBS = [
    Entry("an icon layout of rubbish", altered(("INSERT OR REPLACE INTO icon_layout VALUES (1, ?)", (b"\xff" * 100,))),
          SYNC, 0, also=unharmed),
    Entry("an icon layout of rubbish, screen",
          altered(("INSERT OR REPLACE INTO icon_layout VALUES (1, ?)", (b"bplist00" + b"\xff" * 100,))),
          ("screen", "{device}", "{out}"), 0),
    Entry("install options of rubbish", altered(*ROWS, ("UPDATE coordinators SET options = ?", (b"bplist00\xff",))),
          SYNC, 0, device="used-coordinated", also=unharmed),
    Entry("the path of a promise that climbs",
          altered(*ROWS, ("UPDATE promises SET path = ?, complete = 1", ("../" * 14 + "outside/secret",)),
                  "UPDATE coordinators SET options = X'62706c697374', initial_assets = 1, placeholder = 2"),
          SYNC, 0, device="used-coordinated", also=unharmed),
    Entry("the path of a promise to a file of the device",
          altered(*ROWS, ("UPDATE promises SET path = ?, complete = 1", ("/var/mobile/Media/PublicStaging",)),
                  "UPDATE coordinators SET options = X'62706c697374', initial_assets = 1, placeholder = 2"),
          SYNC, 0, device="used-coordinated", also=unharmed),
]


def tree_with(change):
    """Something else in the device's directory."""
    return lambda place: change(place) and None


ROOTS = [
    unusable("the root is a link out of the device", tree_with(lambda place: (
        shutil.rmtree(place.device / "root"), (place.device / "root").symlink_to(place.outside))), "root", also=None),
    unusable("the root is a file", tree_with(lambda place: (
        shutil.rmtree(place.device / "root"), (place.device / "root").write_bytes(b""))), "root", also=None),
    unusable("the containers are a link out of the device", tree_with(lambda place: (
        shutil.rmtree(place.inside("/var/containers/Bundle/Application")),
        place.inside("/var/containers/Bundle/Application").symlink_to(place.outside))), "", also=None),
    Entry("what is kept is a link out of the device", tree_with(lambda place: (place.device / "kept").symlink_to(
        place.outside)), SYNC, 0, also=unharmed),
    Entry("what is kept is a file", tree_with(lambda place: (place.device / "kept").touch()), SYNC, 0, also=unharmed),
    Entry("what is kept is a link, and something is", tree_with(lambda place: (
        (place.device / "kept").symlink_to(place.outside), place.alter((KEPT, ("secret", "App00.app"))))), ROLLBACK, 1,
        also=still_installed),
    Entry("the log is a link out of the device", tree_with(lambda place: (
        (place.device / "log/system.log").unlink(), (place.device / "log/system.log").symlink_to(
            place.outside / "secret"))), SYNC, 3),
    Entry("the log's directory is a link out of the device", tree_with(lambda place: (
        shutil.rmtree(place.device / "log"), (place.device / "log").symlink_to(place.outside))), SYNC, 3),
    Entry("the log is a directory", tree_with(lambda place: (
        (place.device / "log/system.log").unlink(), (place.device / "log/system.log").mkdir())), SYNC, 3),
    Entry("the log is a pipe", tree_with(lambda place: (
        (place.device / "log/system.log").unlink(), os.mkfifo(place.device / "log/system.log"))), SYNC, 3),
    Entry("the log is a pipe, log", tree_with(lambda place: (
        (place.device / "log/system.log").unlink(), os.mkfifo(place.device / "log/system.log"))), ("log", "{device}"), 3),
]


def log(name, content, says="", shown=0):
    """The log holds that; so many of its lines are shown."""
    def also(place, done):
        assert done.out.count("\n") == shown and "\x1b" not in done.out

    return Entry("the log holds " + name, tree_with(lambda place: (place.device / "log/system.log").write_bytes(content)),
                 ("log", "{device}"), 0, says, also=also)


def members(count):
    return b"{" + b",".join(b'"k%d":%d' % (n, n) for n in range(count)) + b"}\n"


LOGS = [
    log("rubbish", b"\xff\0\n" * 1000),
    log("lines cut off", b'{"time": "x", "cat\n{"message'),
    log("a category nested 100,000 deep", b'{"category":' + b"[" * 100_000 + b"]" * 100_000 + b"}\n", shown=1),
    log("a category of bytes that are no text", b'{"category":"\xff\xfe","message":"a"}\n'),
    log("a line of four megabytes", b'{"message":"' + b"x" * (4 << 20) + b'"}\n{"message":"a"}\n', "line 1 of", 1),
    log("a line of nearly a megabyte", b'{"message":"' + b"x" * 1_000_000 + b'"}\n', shown=1),
    log("sixteen megabytes without a line end", b"x" * (16 << 20)),
    log("a line of 60,000 members", members(60_000), shown=1),
    log("numbers everywhere", b'{"time":1,"level":2,"category":1,"message":[]}\n', shown=1),
    log("a number beyond all numbers", b'{"category":1e999,"message":"a"}\n'),
    log("what takes over the terminal", b'{"message":"\\u001b[2J\\u0007","time":"\\u001b","level":"\\u001b"}\n', shown=1),
    log("lists and texts instead of maps", b'[{"message":"a"}]\n"message"\n7\n{"a":[{"message":"b"}]}\n', shown=1),
]

ENTRIES = FILES + PAGES + SCHEMAS + VALUES + NUMBERS + BLOBS + ROOTS + LOGS
