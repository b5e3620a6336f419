"""The live page's server: what it answers, what it refuses, and what it survives."""

import contextlib
import http.client
import json
import os
import re
import signal
import socket
import sqlite3
import threading
import time
import urllib.parse

import pytest

import packages
from conftest import ON_ONE_PATH, Device

IDS = ["com.example.app%02d" % number for number in range(5)]
POLICY = "default-src 'none'"
LINE = '{"time":"2026-01-01T00:00:0%dZ","category":%d,"level":"%s","message":"%s","format":""}\n'


class Serving:
    def __init__(self, appsync, place, *options):
        self.process = appsync.start("serve", place, "--port", "0", *options)
        first = self.process.stdout.readline()
        found = re.fullmatch(r"Serving at http://127\.0\.0\.1:(\d+)/ - Ctrl-C ends it\.\n", first)
        assert found, (first, self.process.stderr.read() if not first else "")
        self.port = int(found[1])

    def ask(self, path, method="GET", body=None, **headers):
        """Status, headers and body."""
        connection = http.client.HTTPConnection("127.0.0.1", self.port, timeout=20)
        headers = {name.replace("_", "-"): value for name, value in headers.items()}
        with contextlib.closing(connection):
            connection.request(method, path, body=body, headers=headers)
            answer = connection.getresponse()
            return answer.status, answer.headers, answer.read()

    def json(self, path, expect=200):
        status, headers, body = self.ask(path)
        assert status == expect, (path, status, body)
        assert headers["Content-Type"] == "application/json"
        return json.loads(body)

    def view(self, name="device", **query):
        return self.json("/api/device/%s?%s" % (name, urllib.parse.urlencode(query)))

    def state(self, name="device"):
        return self.view(name)["state"]

    def raw(self, *pieces, timeout=20):
        """What is answered to these bytes, until the server closes."""
        with socket.create_connection(("127.0.0.1", self.port), timeout=timeout) as connection:
            for piece in pieces:
                connection.sendall(piece)
            received = b""
            while piece := connection.recv(65536):
                received += piece
            return received

    def head(self, path="/", extra=""):
        return ("GET %s HTTP/1.1\r\nHost: 127.0.0.1:%d\r\n%s\r\n" % (path, self.port, extra)).encode()

    def end(self, number=signal.SIGINT):
        begin = time.monotonic()
        self.process.send_signal(number)
        status = self.process.wait(timeout=20)
        return status, time.monotonic() - begin


class Events:
    """What comes on one stream of events."""

    def __init__(self, serving, path):
        self.connection = http.client.HTTPConnection("127.0.0.1", serving.port, timeout=30)
        self.connection.request("GET", path)
        self.answer = self.connection.getresponse()
        assert self.answer.status == 200 and self.answer.headers["Content-Type"] == "text/event-stream"

    def next(self):
        """The next event's data; None at the end."""
        while line := self.answer.readline():
            if line.startswith(b"data: "):
                return json.loads(line[6:])
        return None

    def soon(self):
        """The next event's data; None where the server has had none for so long that it says so."""
        while line := self.answer.readline():
            if line.startswith(b":"):
                return None
            if line.startswith(b"data: "):
                return json.loads(line[6:])
        return None

    def until(self, condition, most=400):
        for _ in range(most):
            event = self.next()
            assert event is not None
            if condition(event):
                return event
        raise AssertionError("it never came")


def eventually(condition, seconds=30):
    end = time.monotonic() + seconds
    while not (result := condition()):
        assert time.monotonic() < end
        time.sleep(0.05)
    return result


@pytest.fixture
def serving(appsync, device):
    return Serving(appsync, device.path)


def test_what_the_page_shows_is_what_the_commands_tell(appsync, device, library):
    device.sync(library)
    appsync("run", device.path, IDS[1])
    appsync("demote", device.path, IDS[2])
    serving = Serving(appsync, device.path)
    card = serving.json("/api/devices")
    assert (card["folder"], card["version"]) == (False, appsync("--version").stdout.split(",")[0].split()[1])
    [card] = card["devices"]
    assert (card["name"], card["path"], card["state"]) == ("device", device.path, "idle")
    assert (card["applications"], card["placeholders"], card["installing"]) == (4, 1, 0)
    view = serving.view()
    told = appsync.json("apps", device.path)
    assert [{key: each[key] for key in told[0]} for each in view["applications"]] == told
    assert (view["name"], view["whole"], view["gone"], view["message"]) == ("device", True, [], "")
    assert sorted(view["screen"]) == IDS
    assert view["status"] == {**appsync.json("status", device.path), "free": view["status"]["free"]}
    by_name = {each["identifier"]: each for each in view["applications"]}
    assert [name for name, each in by_name.items() if each["running"]] == [IDS[1]]
    why = serving.json("/api/device/device/why/" + IDS[2])
    waits = by_name[IDS[2]]["waitingFor"]
    assert why.pop("text") == appsync("why", device.path, IDS[2]).stdout
    assert why == appsync.json("why", device.path, IDS[2])
    assert waits.pop("sentence") in appsync("why", device.path, IDS[2]).stdout and waits == why["waitsFor"]
    history = appsync.json("history", device.path)
    assert serving.json("/api/device/device/history") == history
    assert serving.json("/api/device/device/history/" + IDS[0]) == [
        each for each in history if each["identifier"] == IDS[0]]
    serving.json("/api/device/device/why/com.nobody", expect=404)


@ON_ONE_PATH
def test_icons_are_pictures_that_may_be_kept(appsync, device, library, serving):
    packages.make_package(library, "com.example.plain", fmt=packages.plistlib.FMT_BINARY)
    device.sync(library)
    shown = {each["identifier"]: each["icon"] for each in serving.view()["applications"]}
    status, headers, body = serving.ask(shown[IDS[0]])
    assert (status, headers["Content-Type"]) == (200, "image/png") and body.startswith(b"\x89PNG")
    assert "max-age" in headers["Cache-Control"]
    assert serving.ask(shown[IDS[0]])[2] == body
    os.remove(os.path.join(device.container_of(IDS[1]), "App01.app", "Icon.png"))
    assert serving.ask(shown[IDS[1]])[::2] == (204, b"")
    assert serving.ask("/api/device/device/icon/com.nobody")[0] == 204
    packages.make_package(library, IDS[0], "2.0")
    device.sync(library)
    assert {each["identifier"]: each["icon"] for each in serving.view()["applications"]}[IDS[0]] != shown[IDS[0]]


def test_a_page_learns_only_what_has_changed(appsync, device, library, serving):
    device.sync(library)
    before = serving.view()
    assert serving.view(since=before["stamp"])["applications"] == []
    appsync("run", device.path, IDS[3])
    appsync("uninstall", device.path, IDS[4])
    after = serving.view(since=before["stamp"])
    assert (after["whole"], after["gone"]) == (False, [IDS[4]])
    assert [each["identifier"] for each in after["applications"]] == [IDS[3]]
    assert IDS[4] not in after["screen"] and "coordinators" not in after
    for unknown in (1, before["stamp"] + 10**9):
        assert serving.view(since=unknown)["whole"] is True


@ON_ONE_PATH
def test_the_log_by_what_is_wanted(appsync, device, serving):
    path = os.path.join(device.path, "log", "system.log")

    def write(number, level, message, category=8, mode="a", suffix=""):
        with open(path + suffix, mode) as file:
            file.write(LINE % (number, category, level, message))

    def messages(**query):
        answer = serving.json("/api/device/device/log?" + urllib.parse.urlencode(query))
        return [line["message"] for line in answer["lines"]], answer["next"]

    assert messages()[0] == []
    begin = messages()[1]
    write(1, "info", "One of com.a", mode="w", suffix=".1")
    write(2, "error", "two of com.a.b", mode="w")
    write(3, "fault", "<three>", category=9)
    assert messages()[0] == ["One of com.a", "two of com.a.b", "<three>"]
    assert messages(after=begin)[0] == messages()[0]
    assert messages(level="error")[0] == ["two of com.a.b", "<three>"]
    assert messages(category="9")[0] == ["<three>"]
    assert messages(app="com.a")[0] == ["One of com.a"]
    assert messages(text="ONE")[0] == ["One of com.a"]
    assert messages(limit="2")[0] == ["two of com.a.b", "<three>"]
    _, after = messages()
    assert messages(after=after) == ([], after)
    write(4, "info", "four")
    shown, after = messages(after=after)
    assert shown == ["four"]
    with open(path, "a") as file:
        file.write('{"time":"half')
    assert messages(after=after) == ([], after)
    os.replace(path, path + ".1")
    write(5, "info", "five", mode="w")
    assert messages(after=after)[0] == ["five"]
    for wrong in ("level=loud", "category=x", "limit=0", "limit=-1"):
        assert serving.ask("/api/device/device/log?" + wrong)[0] == 400
    for number in range(3000):
        write(number % 10, "info", "line %d %s" % (number, "x" * 300))
    assert messages(text="line 17 ")[0] == ["line 17 " + "x" * 300]
    assert len(messages(limit="5000")[0]) == 1000 and len(messages()[0]) == 200


@ON_ONE_PATH
def test_every_answer_is_for_this_page_alone(appsync, device, serving):
    for path, status in (("/", 200), ("/api/devices", 200), ("/api/device/device", 200), ("/favicon.ico", 204),
                         ("/none", 404), ("/api/device/none", 404), ("/api/none", 404), ("/api", 404)):
        found, headers, body = serving.ask(path)
        assert found == status, path
        assert headers["Content-Security-Policy"].startswith(POLICY)
        assert headers["X-Content-Type-Options"] == "nosniff" and headers["Referrer-Policy"] == "no-referrer"
        assert headers["Cross-Origin-Resource-Policy"] == "same-origin" and headers["Cache-Control"] == "no-store"
        assert status != 404 or json.loads(body)["message"]
        answer, _, body = serving.ask(path, "HEAD")
        assert (answer, body) == (status, b"")
    own = "http://localhost:%d" % serving.port
    for good in ("127.0.0.1:%d", "localhost:%d", "[::1]:%d"):
        assert serving.ask("/api/devices", Host=good % serving.port, Origin=own)[0] == 200
    for bad in ("evil.example", "evil.example:%d" % serving.port, "127.0.0.1", "127.0.0.1:1", "", "localhost"):
        assert serving.ask("/", Host=bad)[0] == 403, bad
    for bad in ("http://evil.example", "null", "https://localhost:%d" % serving.port, "http://localhost"):
        assert serving.ask("/", Origin=bad)[0] == 403, bad
    assert serving.raw(b"GET / HTTP/1.0\r\n\r\n").startswith(b"HTTP/1.1 403")
    double = "Host: 127.0.0.1:%d\r\nConnection: close\r\n" % serving.port
    assert serving.raw(serving.head("/", double)).startswith(b"HTTP/1.1 403")
    with socket.socket() as elsewhere, pytest.raises(OSError):
        elsewhere.connect((address_of_this_machine(), serving.port))


@ON_ONE_PATH
def test_the_port_that_addresses_leave_out(appsync, device):
    """A browser that opens http://127.0.0.1/ names no port."""
    with socket.socket() as probe:
        probe.setsockopt(socket.SOL_SOCKET, socket.SO_REUSEADDR, 1)
        try:
            probe.bind(("127.0.0.1", 80))
        except OSError as error:
            pytest.skip("port 80 of this machine is not to be had: %s" % error)
    process = appsync.start("serve", device.path, "--port", "80")
    assert process.stdout.readline() == "Serving at http://127.0.0.1:80/ - Ctrl-C ends it.\n"

    def status(host, **headers):
        connection = http.client.HTTPConnection("127.0.0.1", 80, timeout=20)
        with contextlib.closing(connection):
            connection.request("GET", "/api/devices", headers={"Host": host, **headers})
            return connection.getresponse().status

    for host in ("127.0.0.1", "localhost", "[::1]", "127.0.0.1:80"):
        assert status(host, Origin="http://" + host) == 200, host
    assert status("evil.example") == 403
    assert status("127.0.0.1", Origin="http://evil.example") == 403
    process.send_signal(signal.SIGINT)
    assert process.wait(timeout=20) == 0


def address_of_this_machine():
    """One that is not the loopback's; 127.0.0.2 where there is none, which is not served either."""
    with socket.socket(socket.AF_INET, socket.SOCK_DGRAM) as probe:
        with contextlib.suppress(OSError):
            probe.connect(("192.0.2.1", 9))
            return probe.getsockname()[0]
    return "127.0.0.2"


@ON_ONE_PATH
def test_hostile_requests_are_refused(appsync, device, serving):
    for path in ("/../etc/passwd", "/%2e%2e/etc/passwd", "/api/device/..", "/api/device/%2e%2e", "/a%00b",
                 "/api/device/device%2f..%2fdevice", "/api/device/device/icon/%00", "//", "/%zz", "/%4", "/a/"):
        assert serving.ask(path)[0] == 400, path
    for path in ("/api/device/device/icon/a%20b", "/api/device/device/why/" + "a" * 256, "/index.html/x"):
        assert serving.ask(path)[0] == 404, path
    for method in ("POST", "PUT", "DELETE", "PATCH", "OPTIONS"):
        assert serving.ask("/api/devices", method)[0] == 405, method
    assert serving.ask("/", "POST", body=b"x" * 100_000)[0] == 405
    assert serving.ask("/", "GET", body=b"x" * 100)[0] == 413
    chunked = serving.head("/", "Transfer-Encoding: chunked\r\n") + b"5\r\nGET /\r\n0\r\n\r\n"
    assert serving.raw(chunked).count(b"HTTP/1.1 ") == 1
    assert serving.raw(serving.head("/" + "a" * 9000)).startswith(b"HTTP/1.1 414")
    assert serving.raw(serving.head("/", "X: " + "a" * 20_000 + "\r\n")).startswith(b"HTTP/1.1 431")
    assert serving.raw(b"rubbish\r\n\r\n").startswith(b"HTTP/1.1 400")
    many = "Range: bytes=" + ",".join("%d-" % each for each in range(1500)) + "\r\nConnection: close\r\n"
    assert serving.raw(serving.head("/", many)).startswith((b"HTTP/1.1 200", b"HTTP/1.1 416"))
    packed = serving.ask("/", Accept_Encoding="gzip, br")
    assert packed[0] == 200 and "Content-Encoding" not in packed[1]
    assert serving.state() == "idle"


@ON_ONE_PATH
def test_slow_senders_are_cut_off_and_hold_nobody_up(appsync, device, serving):
    begin = time.monotonic()
    slow = [socket.create_connection(("127.0.0.1", serving.port), timeout=20) for _ in range(20)]
    for each in slow[:10]:
        each.sendall(b"GET / HTTP/1.1\r\nHost:")
    assert serving.state() == "idle"
    assert [each.recv(12) for each in slow] == [b"HTTP/1.1 408"] * 10 + [b""] * 10
    assert time.monotonic() - begin < 15
    for each in slow:
        each.close()


@ON_ONE_PATH
def test_200_connections_at_once(appsync, device, serving):
    idle = [socket.create_connection(("127.0.0.1", serving.port), timeout=20) for _ in range(100)]
    streams = [Events(serving, "/api/device/device/events") for _ in range(100)]
    assert serving.state() == "idle"
    assert all("applications" in each.next()["changed"] for each in streams)
    for each in idle:
        each.sendall(serving.head("/api/devices", "Connection: close\r\n"))
    assert all(each.recv(12) == b"HTTP/1.1 200" for each in idle)
    refused = []
    while len(streams) < 600 and not refused:
        try:
            streams.append(Events(serving, "/api/events"))
        except AssertionError:
            refused.append(serving.ask("/api/events"))
    assert refused and refused[0][0] == 503 and json.loads(refused[0][2])["message"]
    assert serving.state() == "idle"
    status, seconds = serving.end()
    assert status == 0 and seconds < 1 + 2 * is_slow()


def is_slow():
    return "san" in os.path.basename(os.path.dirname(os.path.abspath(os.environ["APPSYNC"])))


@ON_ONE_PATH
def test_a_reader_that_stops_holds_nothing_up(appsync, device, library, serving):
    readers = []
    for path in ("/api/device/device", "/api/device/device/events"):
        reader = socket.socket()
        reader.setsockopt(socket.SOL_SOCKET, socket.SO_RCVBUF, 1024)
        reader.connect(("127.0.0.1", serving.port))
        reader.sendall(serving.head(path) * 300)
        readers.append(reader)
    device.sync(library)
    assert eventually(lambda: len(serving.view()["applications"]) == 5)
    status, seconds = serving.end(signal.SIGTERM)
    assert status == 0 and seconds < 1 + 2 * is_slow()


def test_a_sync_is_seen_as_it_goes_on(appsync, device, library):
    device.sync(library)
    packages.make_library(library, 5, "2.0", payload=os.urandom(300_000))
    appsync("run", device.path, IDS[0])
    serving = Serving(appsync, device.path)
    events = Events(serving, "/api/device/device/events")
    assert set(events.next()["changed"]) >= {"applications", "session", "log", "state"}
    stamp = serving.view()["stamp"]
    sync = appsync.start("sync", device.path, library, "--json-lines")
    events.until(lambda event: "session" in event["changed"])
    waits = eventually(lambda: waiting(serving.view()), seconds=60)
    assert waits["what"] == "termination" and waits["who"] == IDS[0]
    view = serving.view()
    assert view["state"] == "syncing" and view["session"]["running"] and view["session"]["process"] == sync.pid
    assert view["session"]["total"] >= 1 and view["session"]["began"].endswith("Z")
    sync.kill()  # the next try may be half a minute away
    sync.wait()
    appsync("quit", device.path, IDS[0])
    device.sync(library)
    last = eventually(lambda: serving.view(since=stamp) if serving.state() == "idle" else None)
    told = appsync.json("apps", device.path)
    assert last["whole"] is False and last["session"] is None and {each["version"] for each in told} == {"2.0"}
    assert [{key: each[key] for key in told[0]} for each in last["applications"]] == told
    events.until(lambda event: "state" in event["changed"])


def waiting(view):
    """What the first application waits for that waits for one to end."""
    waits = [each["waitingFor"] for each in view["applications"] if each["waitingFor"]]
    return next((each for each in waits if each["what"] == "termination"), None)


@ON_ONE_PATH
def test_the_timeline_of_the_last_session_is_drawn(appsync, device, library, serving):
    assert serving.view()["timeline"] is None
    device.sync(library)
    address = serving.view()["timeline"]
    status, headers, body = serving.ask(address)
    assert (status, headers["Content-Type"]) == (200, "image/svg+xml") and body.startswith(b"<")
    assert all(each.encode() in body for each in IDS)
    assert headers.get_all("Content-Security-Policy") == [
        "default-src 'none'; style-src 'unsafe-inline'; sandbox"]
    packages.make_package(library, "com.example.later")
    device.sync(library)
    assert b"com.example.later" in serving.ask(address)[2]


@ON_ONE_PATH
def test_the_timeline_is_drawn_while_its_log_grows(appsync, device, library, serving):
    device.sync(library)
    path = os.path.join(device.path, "log", "system.log")
    stop = threading.Event()

    def grow():
        with open(path, "a", buffering=1) as log:
            while not stop.is_set() and log.tell() < 1 << 23:
                log.write(LINE % (1, 8, "info", "more" * 20))

    growing = threading.Thread(target=grow)
    growing.start()
    try:
        assert {serving.ask("/api/device/device/timeline.svg")[0] for _ in range(60)} == {200}
        appsync("timeline", device.path, "--out", device.path + ".svg")
    finally:
        stop.set()
        growing.join()


@ON_ONE_PATH
def test_the_timeline_of_a_session_that_has_ended_is_another(appsync, device, library, serving):
    device.sync(library)
    packages.make_library(library, 5, "2.0")
    appsync("run", device.path, IDS[0])
    address = serving.view()["timeline"]
    with open(os.path.join(device.path, "log", "system.log"), "a") as log:
        log.write(LINE % (1, 8, "info", "more" * 25) * 20_000)  # so that drawing takes a while

    def picture():
        return serving.ask(address)[2]

    def is_kept():
        """One that is drawn anew has grown."""
        return b"The session goes on." in picture() and picture() == picture()

    sync = appsync.start("sync", device.path, library)
    eventually(is_kept)
    sync.kill()
    sync.wait()
    eventually(lambda: serving.state() != "syncing")
    assert b"The session goes on." not in picture()


@ON_ONE_PATH
def test_events_come_four_times_a_second_at_most(appsync, device, serving):
    path = os.path.join(device.path, "log", "system.log")
    events = Events(serving, "/api/device/device/events")
    events.next()
    begin = time.monotonic()
    for _ in range(3):
        with open(path, "a") as file:
            file.write(LINE % (1, 8, "info", "more"))
        serving.view()  # who asks does not make it tell sooner
        assert events.next()["changed"] == ["log"]
    assert time.monotonic() - begin >= 0.7


@ON_ONE_PATH
def test_the_log_of_a_session_is_told_of_once_a_second(appsync, device, library):
    device.sync(library)
    packages.make_library(library, 1, "2.0")
    appsync("run", device.path, IDS[0])
    serving = Serving(appsync, device.path)
    sync = appsync.start("sync", device.path, library)
    eventually(lambda: waiting(serving.view()))
    events = Events(serving, "/api/device/device/events")
    events.next()
    begin = time.monotonic()
    for _ in range(3):
        with open(os.path.join(device.path, "log", "system.log"), "a") as file:
            file.write(LINE % (1, 8, "info", "more"))
        events.until(lambda event: "log" in event["changed"])
    assert time.monotonic() - begin >= 1.9
    sync.kill()
    sync.wait()


@ON_ONE_PATH
def test_a_killed_session_is_seen_though_no_file_changes(appsync, device, library):
    device.sync(library)
    packages.make_library(library, 1, "2.0")
    appsync("run", device.path, IDS[0])
    serving = Serving(appsync, device.path)
    sync = appsync.start("sync", device.path, library)
    eventually(lambda: waiting(serving.view()))
    events = Events(serving, "/api/device/device/events")
    events.next()
    sync.kill()
    sync.wait()
    events.until(lambda event: "state" in event["changed"])
    view = serving.view()
    assert view["state"] == "idle" and view["session"]["interrupted"] and not view["session"]["running"]


@ON_ONE_PATH
def test_a_device_that_is_removed_damaged_and_replaced(appsync, device, library, serving, tmp_path):
    device.sync(library)
    events = Events(serving, "/api/device/device/events")
    events.next()
    assert len(serving.view()["applications"]) == 5
    os.rename(device.path, tmp_path / "aside")
    events.until(lambda event: "state" in event["changed"])
    view = serving.view()
    assert view["state"] == "gone" and view["applications"] == view["screen"] == [] and view["message"]
    assert serving.ask("/api/device/device/why/" + IDS[0])[0] == 503
    appsync("create", device.path)
    events.until(lambda event: "state" in event["changed"])
    assert serving.view()["state"] == "idle" and serving.view()["applications"] == []
    with open(os.path.join(device.path, "device.db"), "r+b") as file:
        file.write(b"rubbish" * 1000)
    assert eventually(lambda: serving.state() == "damaged") and serving.view()["message"]
    os.rename(device.path, tmp_path / "damaged")
    os.rename(tmp_path / "aside", device.path)
    assert eventually(lambda: len(serving.view()["applications"]) == 5)
    assert serving.state() == "idle"


@ON_ONE_PATH
def test_a_device_whose_database_somebody_keeps_to_himself(appsync, device, library, serving):
    device.sync(library)
    assert len(serving.view()["applications"]) == 5
    holder = sqlite3.connect(os.path.join(device.path, "device.db"), isolation_level=None)
    holder.execute("PRAGMA locking_mode = EXCLUSIVE")
    holder.execute("BEGIN EXCLUSIVE")
    holder.execute("DELETE FROM running")
    os.utime(os.path.join(device.path, "device.db"))  # what has not changed is not read again
    eventually(lambda: serving.state() == "locked")
    assert len(serving.view()["applications"]) == 5 and serving.view()["message"]
    assert serving.ask("/")[0] == 200
    holder.execute("COMMIT")
    holder.close()
    assert eventually(lambda: serving.state() == "idle")


@ON_ONE_PATH
def test_a_reader_who_was_told_of_a_locked_device_learns_that_it_is_none(appsync, device, serving):
    assert serving.state() == "idle"
    events = Events(serving, "/api/device/device/events")
    events.next()
    holder = sqlite3.connect(os.path.join(device.path, "device.db"), isolation_level=None)
    holder.execute("PRAGMA locking_mode = EXCLUSIVE")
    holder.execute("BEGIN EXCLUSIVE")
    holder.execute("DELETE FROM running")
    os.utime(os.path.join(device.path, "device.db"))
    assert serving.state() == "locked"
    holder.execute("ROLLBACK")
    holder.close()
    told = iter(events.soon, None)
    assert any("state" in event["changed"] for event in told)
    assert serving.state() == "idle"


@ON_ONE_PATH
def test_ctrl_c_ends_it_while_a_device_cannot_be_read(appsync, device, serving):
    holder = sqlite3.connect(os.path.join(device.path, "device.db"), isolation_level=None)
    holder.execute("PRAGMA locking_mode = EXCLUSIVE")
    holder.execute("BEGIN EXCLUSIVE")
    holder.execute("DELETE FROM running")
    eventually(lambda: serving.state() == "locked")
    status, seconds = serving.end()
    assert status == 0 and seconds < 1 + 2 * is_slow()


@ON_ONE_PATH
def test_looking_leaves_the_device_as_it_is(appsync, device, library, serving):
    device.sync(library)

    def stands():
        return {path: (os.stat(os.path.join(device.path, path)).st_mtime_ns)
                for path in [*device.tree(), "device.db"]}

    before = stands()
    events = Events(serving, "/api/device/device/events")
    events.next()
    stamp = serving.view()["stamp"]
    for each in serving.view()["applications"]:
        serving.ask(each["icon"])
        serving.json("/api/device/device/why/" + each["identifier"])
    time.sleep(0.6)  # for what looking itself might set off
    later = serving.view(since=stamp)
    assert stands() == before and later["applications"] == [] and "screen" not in later
    assert sorted(os.listdir(device.path)) == ["device.db", "log", "root", "space.reserve"]


@ON_ONE_PATH
def test_a_folder_of_devices(appsync, device, library, tmp_path):
    folder = tmp_path / "many"
    folder.mkdir()
    (folder / "none").mkdir()
    Device(appsync, folder / "a b")
    names = ["a b", "<script>x", "50% & more?"]
    serving = Serving(appsync, str(folder))
    events = Events(serving, "/api/events")
    assert events.next()["changed"] == ["devices"]
    for name in names[1:]:
        Device(appsync, folder / name).sync(library)
        events.until(lambda event: event["changed"] == ["devices"])
    listed = serving.json("/api/devices")
    assert listed["folder"] is True and [each["name"] for each in listed["devices"]] == sorted(names)
    for name in names[1:]:
        view = serving.view(urllib.parse.quote(name, safe=""))
        assert view["name"] == name and len(view["applications"]) == 5
        assert serving.ask(view["applications"][0]["icon"])[0] == 200
    appsync("uninstall", folder / names[1], IDS[0])
    events.until(lambda event: event["name"] == names[1] and "applications" in event["changed"])
    os.rename(folder / names[1], tmp_path / "aside")
    events.until(lambda event: event["name"] == names[1] and "state" in event["changed"])
    states = {each["name"]: each["state"] for each in serving.json("/api/devices")["devices"]}
    assert states == {names[0]: "idle", names[1]: "gone", names[2]: "idle"}


def test_devices_beyond_the_most_that_are_served_are_told_of(appsync, tmp_path):
    folder = tmp_path / "many"
    for number in range(502):
        (folder / ("device%03d" % number)).mkdir(parents=True)
        (folder / ("device%03d" % number) / "device.db").write_bytes(b"")
    serving = Serving(appsync, str(folder))
    listed = serving.json("/api/devices")
    assert [each["name"] for each in listed["devices"]] == ["device%03d" % number for number in range(500)]
    assert listed["leftOut"] == 2
    events = Events(serving, "/api/events")
    events.until(lambda event: event["changed"] == ["devices"])
    (folder / "device501" / "device.db").unlink()
    events.until(lambda event: event["changed"] == ["devices"], most=2000)
    assert serving.json("/api/devices")["leftOut"] == 1
    serving.end()
    told = serving.process.stderr.read()
    assert "2 devices of" in told and "500" in told


@ON_ONE_PATH
def test_what_cannot_be_served_is_said(appsync, device, serving, tmp_path):
    (tmp_path / "empty").mkdir()
    (tmp_path / "file").write_text("x")
    for place, told in (("empty", "is neither a device nor a folder that holds one"),
                        ("file", "is neither a device nor a folder that holds one"),
                        ("missing", "No such file or directory")):
        assert told in appsync("serve", tmp_path / place, expect=3).stderr
    taken = appsync("serve", device.path, "--port", str(serving.port), expect=1).stderr
    assert "--port" in taken and str(serving.port) in taken
    for wrong in ("-1", "65536", "x", ""):
        assert "--port" in appsync("serve", device.path, "--port=" + wrong, expect=2).stderr
    assert serving.end(signal.SIGHUP)[0] == 0
