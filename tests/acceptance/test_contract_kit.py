"""The contract kit, run over ports that crash, hang, throw and say what is not so."""

import json
import pathlib
import subprocess

import pytest

TESTS = "AppRegistryContract.AnEmptyDevice*:AppRegistryContract.APackageBecomes*:AppRegistryContract.AnUpdate*"
ASKED = "Whether there is anything under the identifier: an application or a placeholder."


@pytest.fixture
def kit(appsync):
    program = pathlib.Path(appsync.program).resolve().parent / "tests" / "test_contract"

    def run(*arguments):
        return subprocess.run([program, *arguments], capture_output=True, text=True, timeout=100)

    return run


def broken(port):
    return {each["sentence"]: [seen["what"] for seen in each["seen"]] for each in port["broken"]}


def test_a_service_that_ends_badly_fails_one_test_and_the_kit_goes_on(kit, tmp_path):
    report = tmp_path / "report.json"
    done = kit("--kit-over-bad-ports", "--filter", TESTS, "--time-limit", "2", "--json", str(report))
    assert done.returncode == 1
    ports = {port["port"]: port for port in json.loads(report.read_text())["ports"]}
    assert {name: port["tests"] for name, port in ports.items()} == dict.fromkeys(ports, 3)
    late = "no end within 2000 ms"
    for name, what in (("Crashes", "ended by signal 6"), ("Hangs", late), ("HangsInSilence", late),
                       ("Throws", "out of order")):
        assert list(broken(ports[name])) == [ASKED], name
        assert what in broken(ports[name])[ASKED][0], name
        assert len(ports[name]["kept"]) == 2
    assert "Hangs: 2 sentences kept, 1 broken\n" in done.stdout
    assert ASKED in " ".join(done.stdout.split())


def test_nothing_is_left_behind(kit, tmp_path, monkeypatch):
    monkeypatch.setenv("TMPDIR", str(tmp_path))
    kit("--kit-over-bad-ports", "--filter", TESTS, "--time-limit", "1")
    assert list(tmp_path.iterdir()) == []


def test_our_own_device_is_proven(kit):
    done = kit("--kit", "--filter", "*SessionContract*/Reference")
    assert done.returncode == 0, done.stdout
    assert "Reference: 1 sentence kept, 0 broken\n" in done.stdout


@pytest.mark.parametrize("arguments", [
    ["--filter"], ["--jobs", "0"], ["--time-limit", "soon"], ["--unknown", "1"], ["--filter", "NoSuchTest"]])
def test_arguments_that_are_none_get_a_sentence(kit, arguments):
    done = kit("--kit", *arguments)
    assert done.returncode == 2
    assert done.stderr.count("\n") == 1 and done.stdout == ""
