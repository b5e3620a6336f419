"""Property lists through pipes, and as JSON."""

import datetime
import json
import plistlib
import subprocess

import pytest

VALUE = {"text": "é\n", "yes": True, "no": False, "number": -5, "large": 2 ** 64 - 1, "real": 2.5, "whole real": 2.0,
         "data": b"\0\1\xff", "empty data": b"", "date": datetime.datetime(1999, 12, 31, 23, 59, 58),
         "list": [1, [], {}, "x"], "map": {"data": "no base64!", "date": "today"}}


def fed(appsync, text, *words, status=0):
    """Runs the command with that on its standard input; gives its standard output."""
    done = subprocess.run([appsync.program, "plist", *map(str, words)], input=text, capture_output=True)
    assert done.returncode == status, done.stderr
    return done.stdout if status == 0 else done.stderr.decode()


@pytest.mark.parametrize("encoding,fmt", [("xml", plistlib.FMT_XML), ("binary", plistlib.FMT_BINARY)])
def test_from_pipe_to_pipe(appsync, encoding, fmt):
    for source in (plistlib.FMT_XML, plistlib.FMT_BINARY):
        converted = fed(appsync, plistlib.dumps(VALUE, fmt=source), "convert", "-", "--to", encoding, "--out", "-")
        assert plistlib.loads(converted, fmt=fmt) == VALUE


def test_json_comes_back_as_it_was_shown(appsync, tmp_path):
    shown = fed(appsync, plistlib.dumps(VALUE), "show", "-", "--json")
    assert json.loads(shown)["date"] == {"date": "1999-12-31T23:59:58Z"}
    back = fed(appsync, shown, "convert", "-", "--to", "binary")
    assert plistlib.loads(back) == VALUE
    assert type(plistlib.loads(back)["whole real"]) is float
    assert fed(appsync, shown, "show", "-", "--json") == shown
    (tmp_path / "value.json").write_bytes(shown)
    appsync("plist", "convert", tmp_path / "value.json", "--to", "xml", "--out", tmp_path / "value.plist")
    assert plistlib.loads((tmp_path / "value.plist").read_bytes()) == VALUE


@pytest.mark.parametrize("text,says", [
    (b"{", "not JSON, at byte"), (b'{"a": }', "not JSON, at byte"), (b"[1,2", "not JSON"), (b"[1]\0", "at byte 4"),
    (b'{"a": 1, "a": 2}', "names something twice"), (b"[" * 200 + b"]" * 200, "nests too deep"),
    (b"", "standard input"), (b"5", "standard input"), (b"[null]", "null"),
    (b"[18446744073709551616]", "18446744073709551616 does not fit"), (b"[-9223372036854775809]", "does not fit")])
def test_rubbish_from_a_pipe_is_refused_in_one_line(appsync, text, says):
    told = fed(appsync, text, "convert", "-", "--to", "xml", status=1)
    assert says in told and told.count("\n") == 1
    assert ("write it as plist show --json does" in told) + ("correct it there" in told) == (says != "null")
    assert told.startswith("appsync: standard input: ")


def test_no_encoding_is_called_json(appsync):
    done = appsync("plist", "convert", "x", "--to", "json", expect=2)
    assert "plist show --json" in done.stderr
