"""Pictures of sessions: what they tell, for devices and recordings, and that they need nothing from elsewhere."""

import html.parser
import json
import os
import pathlib
import re
import signal
import struct
import time
import xml.etree.ElementTree

import pytest

import packages
from conftest import Device

SVG = "{http://www.w3.org/2000/svg}"


@pytest.fixture
def library(tmp_path):
    folder = tmp_path / "library"
    packages.make_library(folder, 4)
    return folder


class Tables(html.parser.HTMLParser):
    """The rows of the tables of a page, and every address in it."""

    def __init__(self, text):
        super().__init__()
        self.rows, self.tags, self.addresses, self.open = [], set(), [], False
        self.feed(text)

    def handle_starttag(self, tag, attributes):
        self.tags.add(tag)
        self.addresses += [value for name, value in attributes if name in ("src", "href", "xlink:href", "data")]
        if tag == "tr":
            self.rows.append([])
        if tag in ("td", "th"):
            self.rows[-1].append("")
            self.open = True

    def handle_endtag(self, tag):
        if tag in ("td", "th"):
            self.open = False

    def handle_data(self, data):
        if self.open:
            self.rows[-1][-1] += data


def drawn(appsync, tmp_path, source, ending="html", *options, expect=0):
    picture = tmp_path / ("timeline." + ending)
    appsync("timeline", source, "--out", picture, *options, expect=expect)
    return picture.read_bytes() if ending == "png" else picture.read_text()


def lanes(page):
    """Identifier and outcome, as the page's first table has them."""
    rows = Tables(page).rows
    assert rows[0][:4] == ["application", "name", "version", "outcome"]
    ends = next((i for i, row in enumerate(rows[1:], 1) if row[0] in ("phase", "wait")), len(rows))
    return {row[0]: row[3] for row in rows[1:ends]}


def elements(svg):
    return list(xml.etree.ElementTree.fromstring(svg).iter())


def test_a_sync_is_drawn_in_each_form(appsync, tmp_path, library, coordination):
    device = Device(appsync, tmp_path / "device", coordination)
    device.sync(library)
    page = drawn(appsync, tmp_path, device.path)
    assert lanes(page) == {"com.example.app%02d" % i: "installed" for i in range(4)}
    svg = drawn(appsync, tmp_path, device.path, "svg")
    root = xml.etree.ElementTree.fromstring(svg)
    assert root.tag == SVG + "svg"
    assert root.find(SVG + "desc").text == "4 applications: 4 installed"
    titles = [each.text for each in root.iter(SVG + "title")]
    for kind in ("placeholder", "transfer", "install"):
        assert any("com.example.app03\n%s: " % kind in title for title in titles)
    png = drawn(appsync, tmp_path, device.path, "png")
    assert png.startswith(b"\x89PNG")
    size = struct.unpack(">II", png[16:24])
    assert size == (2 * float(root.get("width")), 2 * float(root.get("height")))


def test_pictures_need_nothing_from_elsewhere(appsync, tmp_path, library):
    device = Device(appsync, tmp_path / "device", "off")
    device.sync(library)
    svg, page = (drawn(appsync, tmp_path, device.path, ending) for ending in ("svg", "html"))
    for each in elements(svg):
        assert each.tag.removeprefix(SVG) not in ("script", "image", "use", "foreignObject", "a")
        assert not any("href" in name or name.startswith("on") for name in each.attrib)
    for text in (svg, page):
        assert set(re.findall(r"url\((.)", text)) <= {"#"}
        assert re.findall(r"[a-z]+://[^\"' <]*", text.replace("http://www.w3.org/2000/svg", "")) == []
        assert "@import" not in text
    tables = Tables(page)
    assert tables.addresses == []
    assert not tables.tags & {"script", "link", "img", "iframe", "object", "embed"}
    assert "default-src 'none'" in page


def test_recording_and_device_tell_the_same(appsync, tmp_path, library, coordination):
    packages.damage_contents(library / "com.example.app01.zip", "App01.app/Resources/data.bin")
    device = Device(appsync, tmp_path / "device", coordination)
    recording = tmp_path / "recording"
    appsync("sync", device.path, library, "--record", recording, expect=1)
    of_device = lanes(drawn(appsync, tmp_path, device.path))
    of_recording = lanes(drawn(appsync, tmp_path, recording))
    assert {each: text.split(":")[0] for each, text in of_device.items()} == {
        each: text.split(":")[0] for each, text in of_recording.items()}
    assert of_device["com.example.app01"].startswith("failed: ")
    assert of_device["com.example.app00"] == "installed"
    assert "calls of the host" in drawn(appsync, tmp_path, recording, "svg")


def test_a_removal_and_an_update_are_told(appsync, tmp_path, library, coordination):
    device = Device(appsync, tmp_path / "device", coordination)
    device.sync(library)
    packages.make_package(library, "com.example.app01", "2.0")
    device.sync(library, "--remove", "com.example.app00")
    assert lanes(drawn(appsync, tmp_path, device.path)) == {
        "com.example.app00": "removed", "com.example.app01": "installed"}
    assert len(lanes(drawn(appsync, tmp_path, device.path, "html", "--session", "2"))) == 4
    told = appsync("timeline", device.path, "--out", tmp_path / "p.svg", "--session", "3", expect=1).stderr
    assert "2 sessions: give --session a number from 1, the last, to 2" in told


def test_a_restore_leaves_placeholders(appsync, tmp_path, library, coordination):
    device = Device(appsync, tmp_path / "device", coordination)
    device.sync(library)
    appsync("backup", device.path, tmp_path / "backup")
    restored = Device(appsync, tmp_path / "restored", coordination)
    appsync("restore", restored.path, tmp_path / "backup")
    outcome = "waits for the store" if coordination == "on" else "placeholder restored"
    assert set(lanes(drawn(appsync, tmp_path, restored.path)).values()) == {outcome}


def test_what_waits_for_a_running_application_says_so(appsync, tmp_path, library, coordination):
    device = Device(appsync, tmp_path / "device", coordination)
    device.sync(library)
    appsync("run", device.path, "com.example.app02")
    packages.make_package(library, "com.example.app02", "2.0")
    appsync("sync", device.path, library, "--no-wait", expect=1)
    assert lanes(drawn(appsync, tmp_path, device.path))["com.example.app02"] == "waits, as it runs"
    assert "its own end, as it was running: com.example.app02" in drawn(appsync, tmp_path, device.path, "svg")


def test_a_recording_that_is_cut_off_is_drawn_to_its_end(appsync, tmp_path, library):
    device = Device(appsync, tmp_path / "device", "off")
    recording = tmp_path / "recording"
    device.sync(library, "--record", recording)
    lines = recording.read_bytes().splitlines(keepends=True)
    recording.write_bytes(b"".join(lines[:len(lines) * 2 // 3]) + b'{"t":1')
    said = appsync("timeline", recording, "--out", tmp_path / "cut.svg").stdout
    assert "The recording is cut off" in said
    assert "The recording is cut off" in (tmp_path / "cut.svg").read_text()
    assert "not over" in (tmp_path / "cut.svg").read_text()


@pytest.mark.parametrize("contents", [
    b"", b"no recording\n", b"\x00\xff\xfe" * 1000, b'{"recording":99}\n', b"[" * 100_000,
    b'{"recording":1,"plug-in":"1","process":"p","bundle":"b","anonymous":false}\n{"t":0,"w":7}\n',
], ids=["empty", "text", "bytes", "version", "deep", "thread"])
def test_what_is_no_recording_is_refused(appsync, tmp_path, contents):
    recording = tmp_path / "recording"
    recording.write_bytes(contents)
    done = appsync("timeline", recording, "--out", tmp_path / "out.svg", expect=3)
    assert len(done.stderr.splitlines()) == 1
    assert not (tmp_path / "out.svg").exists()


def test_where_nothing_is_both_are_asked_for(appsync, tmp_path):
    told = appsync("timeline", tmp_path / "nothing", "--out", tmp_path / "out.svg", expect=3).stderr
    assert "neither a device nor a recording" in told and str(tmp_path / "nothing") in told


def test_what_is_neither_a_directory_nor_a_file_is_taken_for_a_recording(appsync, tmp_path):
    os.mkfifo(tmp_path / "fifo")
    told = appsync("timeline", tmp_path / "fifo", "--out", tmp_path / "out.svg", expect=3).stderr
    assert "is not a regular file" in told and "device" not in told


def test_hostile_messages_in_a_recording_are_drawn_or_left_out(appsync, tmp_path):
    recording = tmp_path / "recording"
    header = {"recording": 1, "plug-in": "1", "process": "p", "bundle": "b", "anonymous": False}
    form = "%s|%{public}@ install succeeded"
    arguments = [[8, 0, form, [0, "<script>" + "\u202e" * 50]], [8, 0, form, [0]], [8, 0, form, [0, {"bytes": "gGE="}]],
                 [8, 0, form, [0, 7]], [8, 0, form, {}], [8, 0, 5, []], [], [8, 0, form, [0, {"bytes": 1}]],
                 [8, 0, form, [0, "x" * 4000]]]
    lines = [header, {"t": 0, "w": 1, "host": "makeClient"}]
    lines += [{"t": 1, "w": 1, "call": "LogFacility.write", "a": each} for each in arguments]
    recording.write_text("".join(json.dumps(each) + "\n" for each in lines))
    svg = drawn(appsync, tmp_path, recording, "svg")
    assert len(elements(svg)) > 10
    assert "<script" not in svg and "\u202e" not in svg and "x" * 400 not in svg
    page = drawn(appsync, tmp_path, recording)
    assert "script" not in Tables(page).tags


def test_names_of_applications_stay_text(appsync, tmp_path, library):
    packages.make_package(library, "com.example.evil", name="<script>alert(1)</script>\u05d0\u202e&" + "y" * 200)
    device = Device(appsync, tmp_path / "device", "off")
    appsync("sync", device.path, library, expect=None)
    page = drawn(appsync, tmp_path, device.path)
    tables = Tables(page)
    assert "script" not in tables.tags
    name = next(row[1] for row in tables.rows if row[0] == "com.example.evil")
    assert name.startswith("<script>alert(1)</script>\u05d0?")
    assert name.endswith("y")
    elements(drawn(appsync, tmp_path, device.path, "svg"))


def test_a_new_device_has_no_session(appsync, tmp_path):
    device = Device(appsync, tmp_path / "device", "off")
    done = appsync("timeline", device.path, "--out", tmp_path / "new.svg")
    assert "No session yet." in done.stdout
    assert "No session yet." in (tmp_path / "new.svg").read_text()


def test_other_endings_are_wrong_usage(appsync, tmp_path):
    device = Device(appsync, tmp_path / "device", "off")
    for name in ("out.pdf", "out", "out.SVG "):
        told = appsync("timeline", device.path, "--out", tmp_path / name, expect=2).stderr
        assert all(ending in told for ending in (".svg", ".png", ".html"))
        assert not (tmp_path / name).exists()
    assert "--out" in appsync("timeline", device.path, expect=2).stderr


def test_a_file_is_replaced_whole_or_not_at_all(appsync, tmp_path):
    device = Device(appsync, tmp_path / "device", "off")
    assert not appsync.json("timeline", device.path, "--out", tmp_path / "out.svg")["replaced"]
    assert appsync.json("timeline", device.path, "--out", tmp_path / "out.svg")["replaced"]
    before = (tmp_path / "out.svg").read_bytes()
    (tmp_path / "recording").write_text("rubbish\n")
    appsync("timeline", tmp_path / "recording", "--out", tmp_path / "out.svg", expect=3)
    assert (tmp_path / "out.svg").read_bytes() == before


def test_a_session_that_was_killed_says_so(appsync, tmp_path, library):
    device = Device(appsync, tmp_path / "device", "off")
    device.sync(library)
    appsync("run", device.path, "com.example.app02")
    packages.make_package(library, "com.example.app02", "2.0")
    process = appsync.start("sync", device.path, library)
    wait_until(lambda: appsync.json("why", device.path, "com.example.app02")["waitsFor"] is not None)
    goes_on = appsync("timeline", device.path, "--out", tmp_path / "live.svg").stdout
    process.send_signal(signal.SIGKILL)
    process.wait()
    assert "The session goes on." in goes_on
    page = drawn(appsync, tmp_path, device.path)
    assert "The session was interrupted." in page
    packages.make_package(library, "com.example.sent")
    appsync("send", device.path, "com.example.sent", library / "com.example.sent.zip")
    assert lanes(drawn(appsync, tmp_path, device.path)) == {"com.example.sent": "installed"}
    assert list(lanes(drawn(appsync, tmp_path, device.path, "html", "--session", "2"))) == ["com.example.app02"]


def test_what_a_killed_sync_was_transferring_is_sent_in_a_session_of_its_own(appsync, tmp_path, library):
    device = Device(appsync, tmp_path / "device", "off")
    log = pathlib.Path(device.path) / "log" / "system.log"
    log.parent.mkdir(exist_ok=True)
    log.write_text("".join(list(log_of(1))[:3]).replace("com.example.app00000", "com.example.app01"))
    assert lanes(drawn(appsync, tmp_path, device.path)) == {"com.example.app01": "waits for its turn"}
    appsync("send", device.path, "com.example.app01", library / "com.example.app01.zip")
    assert lanes(drawn(appsync, tmp_path, device.path)) == {"com.example.app01": "installed"}
    assert lanes(drawn(appsync, tmp_path, device.path, "html", "--session", "2")) == {"com.example.app01": "waits for its turn"}


def wait_until(holds, seconds=30):
    end = time.monotonic() + seconds
    while not holds():
        assert time.monotonic() < end
        time.sleep(0.05)


def line_of_log(micros, form, message):
    return json.dumps({
        "time": "2026-01-02T03:%02d:%02d.%06dZ" % (micros // 60_000_000, micros // 1_000_000 % 60, micros % 1_000_000),
        "category": 8, "level": "default", "message": "com.korvu.trd.appsync|" + message, "format": "%s|" + form,
    }, separators=(",", ":")) + "\n"


def log_of(count, failing=()):
    """What a sync of so many applications leaves, each with a millisecond of transfer and an install of 50."""
    yield line_of_log(0, "starting to reconcile sync with new anchor %{public}@", "starting to reconcile sync")
    yield line_of_log(1, "outstandingAssetTransfers starting with todoList %{public}@", "outstandingAssetTransfers")
    names = ["com.example.app%05d" % i for i in range(count)]
    for i, name in enumerate(names):
        yield line_of_log(
            100 + i * 100,
            "Asset %{public}@ (pretty=%{public}@, version=%{public}@) prepped with icon %{public}@, at %{public}@, "
            "meta at %{public}@, info at %{public}@, storePid=%lld, isRestore=%c",
            "Asset %s (pretty=App, version=1.0) prepped with icon i, at a, meta at m, info at n, storePid=0, isRestore=n"
            % name)
    end = 100 + count * 100
    for i, name in enumerate(names):
        yield line_of_log(end + i * 1000, "transfer for asset %{public}@ ended with success %c error %{public}@ "
                          "existingApp:%d", "transfer for asset %s ended with success y error (null) existingApp:0" % name)
        yield line_of_log(end + i * 1000 + 1, "Performing install for %{public}@", "Performing install for " + name)
        form = "%{public}@ install succeeded"
        if i in failing:
            form = "%{public}@ install failed unrecoverably: %{public}@"
        yield line_of_log(end + i * 1000 + 900, form, form.replace("%{public}@", name, 1).replace(
            "%{public}@", 'Error Domain=InstallerService Code=6 "it is damaged"'))
    yield line_of_log(end + count * 1000, "sync ended with success: %c", "sync ended with success: y")


def test_five_thousand_applications_stay_legible(appsync, tmp_path):
    device = Device(appsync, tmp_path / "device", "off")
    log = pathlib.Path(device.path) / "log" / "system.log"
    log.parent.mkdir(exist_ok=True)
    log.write_text("".join(log_of(5000, failing={7, 4321})))
    page = drawn(appsync, tmp_path, device.path)
    told = lanes(page)
    assert len(told) == 5000
    assert told["com.example.app04321"] == "failed: it is damaged"
    svg = drawn(appsync, tmp_path, device.path, "svg")
    root = xml.etree.ElementTree.fromstring(svg)
    assert float(root.get("height")) < 3000
    assert len(svg) < 2_000_000
    texts = ["".join(each.itertext()) for each in root.iter(SVG + "text")]
    assert any(text.startswith("com.example.app04321") for text in texts)
    assert sum(text == "it is damaged" or "failed: it is damaged" in text for text in texts) >= 2
    assert any("applications" in text and text[0].isdigit() for text in texts)


def test_a_log_that_lost_the_beginning_is_completed_from_the_history(appsync, tmp_path, library, coordination):
    device = Device(appsync, tmp_path / "device", coordination)
    device.sync(library)
    log = pathlib.Path(device.path) / "log" / "system.log"
    lines = log.read_text().splitlines(keepends=True)
    first = next(i for i, line in enumerate(lines) if "transfer for asset" in line)
    log.write_text("".join(lines[first:]))
    page = drawn(appsync, tmp_path, device.path)
    assert "lost the beginning" in page
    assert set(lanes(page).values()) == {"installed"} and len(lanes(page)) == 4
    log.unlink()
    page = drawn(appsync, tmp_path, device.path)
    assert "drawn is what the history has" in page
    assert set(lanes(page).values()) == {"installed"} and len(lanes(page)) == 4
