"""What only a device whose installs are coordinated does."""

import json
import os
import plistlib
import signal
import time

import pytest

import packages
from conftest import Device, names_of
from delivery import STAGING, deliver
from staging import install, remove, stage

A, B = "com.example.app00", "com.example.app01"


@pytest.fixture
def device(appsync, tmp_path):
    return Device(appsync, tmp_path / "device", "on")


@pytest.fixture(scope="module")
def large_package(tmp_path_factory):
    """A package of A that takes a while to send."""
    return packages.make_package(str(tmp_path_factory.mktemp("large")), A, payload=os.urandom(64 << 20))


@pytest.fixture
def large_library(tmp_path, large_package):
    library = str(tmp_path / "large")
    packages.make_package(library, B)
    os.link(large_package, os.path.join(library, A + ".zip"))
    return library


def coordinators(device):
    return {each["identifier"]: each for each in device.appsync.json("coordinator", device.path, "list")}


def wait_until(condition, limit=60):
    end = time.monotonic() + limit
    while not condition():
        assert time.monotonic() < end, "it never came"
        time.sleep(0.02)


def waits_for(appsync, device, identifier):
    return (appsync.json("why", device.path, identifier)["waitsFor"] or {}).get("what")


def operations(device):
    import plistlib

    path = device.inside("/var/mobile/Library/ApplicationSync/VessikStuff/ApplicationsSync.plist")
    with open(path, "rb") as file:
        return {entry["identifier"]: entry["operation"] for entry in plistlib.load(file)}


@pytest.fixture
def waiting_update(appsync, device, library):
    """A sync whose update of A waits, as A is running; everything else is done."""
    device.sync(library)
    packages.make_package(library, A, "2.0")
    appsync("run", device.path, A)
    sync = appsync.start("sync", device.path, library, "--json")
    wait_until(lambda: waits_for(appsync, device, A) == "termination")
    yield sync
    if sync.poll() is None:
        sync.kill()
    sync.communicate()


def test_coordinators_are_created_listed_and_cancelled(appsync, device):
    assert coordinators(device) == {}
    appsync("coordinator", device.path, "create", A)
    appsync("coordinator", device.path, "create", B, "--client", "1")
    assert coordinators(device)[A] == {
        "identifier": A, "kind": "initiating", "client": 2, "promises": [], "placeholder": False,
        "state": "client 2 has yet to hand in the install options"}
    assert coordinators(device)[B]["client"] == 1
    assert A in appsync("coordinator", device.path, "list").stdout
    appsync("coordinator", device.path, "create", A, expect=1)
    appsync("coordinator", device.path, "cancel", A)
    appsync("coordinator", device.path, "cancel", B, "--client", "3")
    assert coordinators(device) == {}
    appsync("coordinator", device.path, "cancel", A, expect=1)


def test_a_coordinator_of_an_installed_application_updates(appsync, device, library):
    device.sync(library)
    appsync("coordinator", device.path, "create", A)
    assert coordinators(device)[A]["kind"] == "updating"


@pytest.mark.parametrize("arguments", [
    ["create"], ["cancel"], ["create", "a/b"], ["cancel", ".."], ["list", A], ["nonsense"], [],
    ["create", A, "--client", "3"], ["create", A, "--client", "0"], ["create", A, "--client", "-1"],
    ["create", A, "--client", "two"], ["create", A, "--client", "99999999999999999999"],
    ["create", "x" * 256], ["create", ""], ["create", "a\nb"]])
def test_wrong_coordinator_command(appsync, device, arguments):
    done = appsync("coordinator", device.path, *arguments, expect=2)
    assert len(done.stderr.strip().splitlines()) == 1
    assert coordinators(device) == {}


def test_a_device_without_coordination_creates_none(appsync, tmp_path):
    device = Device(appsync, tmp_path / "direct")
    done = appsync("coordinator", device.path, "create", A, expect=1)
    assert "coordination=on" in done.stderr
    assert coordinators(device) == {}


def test_what_another_client_has_in_hand_is_skipped_and_named(appsync, device, library):
    appsync("coordinator", device.path, "create", A)
    plan = appsync.json("plan", device.path, library)
    assert names_of(plan["skipped"]) == [A] and A not in names_of(plan["install"])
    result = device.sync(library, expect=1)
    assert names_of(result["skipped"]) == [A] and "client 2" in result["skipped"][0]["why"]
    assert result["failed"] == [] and len(result["installed"]) == 4
    assert A not in device.apps() and coordinators(device)[A]["client"] == 2
    assert "client 2" in json.dumps(appsync.json("why", device.path, A)["waitsFor"])
    appsync("coordinator", device.path, "cancel", A)
    assert device.sync(library)["installed"] == [A]


def test_a_staged_list_skips_what_another_client_has_in_hand(appsync, device, library):
    appsync("coordinator", device.path, "create", A, "--client", "7")
    stage(device, [install(A), install(B)], side_files=[A, B])
    result = device.sync(library, "--staged", expect=1)
    assert result["installed"] == [B]
    assert names_of(result["skipped"]) == [A] and "client 7" in result["skipped"][0]["why"]


def test_an_install_that_another_client_cancels_fails_alone(appsync, device, library, waiting_update):
    appsync("coordinator", device.path, "cancel", A, "--client", "2")
    out, _ = waiting_update.communicate(timeout=60)
    assert waiting_update.returncode == 1
    (failed,) = json.loads(out)["failed"]
    assert failed["identifier"] == A and "client 2 cancelled" in failed["error"]
    assert device.versions()[A] == "1.0" and device.placeholders() == []
    assert coordinators(device) == {}


def test_a_transfer_that_the_device_cancels_stops(appsync, device, large_library):
    sync = appsync.start("sync", device.path, large_library, "--json-lines")
    for line in sync.stdout:
        event = json.loads(line)
        if event["identifier"] == A and event["event"] == "progress":
            break
    appsync("coordinator", device.path, "cancel", A)
    out, _ = sync.communicate(timeout=60)
    summary = json.loads(out.splitlines()[-1])
    assert sync.returncode == 1
    assert summary["installed"] == [B] and names_of(summary["failed"]) == [A]
    assert "client 2 cancelled" in summary["failed"][0]["error"]
    assert sorted(device.apps()) == [B] and device.placeholders() == []
    assert os.listdir(device.inside(STAGING)) == []
    assert device.sync(large_library)["installed"] == [A]


def test_a_package_that_disappears_before_its_install_fails_by_name(appsync, device, waiting_update):
    os.remove(os.path.join(device.inside(STAGING), A + ".zip"))
    appsync("quit", device.path, A)
    out, _ = waiting_update.communicate(timeout=60)
    assert waiting_update.returncode == 1
    result = json.loads(out)
    assert names_of(result["failed"]) == [A] and result["updated"] == []
    assert operations(device) == {A: "FAILED"}
    assert device.versions()[A] == "1.0" and device.placeholders() == []
    assert appsync.json("why", device.path, A)["lastError"]


def test_why_names_the_running_application(appsync, device, waiting_update):
    why = appsync.json("why", device.path, A)
    assert set(why) == {"identifier", "state", "waitsFor", "lastError"}
    assert why["waitsFor"]["who"] == A and why["waitsFor"]["nextTry"]
    assert "is running" in appsync("why", device.path, A).stdout


def test_an_update_that_waits_goes_on_in_the_next_session(appsync, device, library, waiting_update):
    waiting_update.kill()
    waiting_update.communicate()
    assert waits_for(appsync, device, A) in ("sync", "termination")
    appsync("quit", device.path, A)
    assert waits_for(appsync, device, A) == "sync"
    result = device.sync(library)
    assert result["requested"] == [] and result["updated"] == [A] and result["bytes"] == 0
    assert device.versions()[A] == "2.0" and operations(device) == {A: "INSTALLED"}
    assert device.placeholders() == [] and coordinators(device) == {}


def test_an_update_that_goes_on_beside_a_package_sent_is_an_update(
        appsync, device, library, waiting_update, tmp_path):
    waiting_update.kill()
    waiting_update.communicate()
    appsync("quit", device.path, A)
    package = packages.make_package(str(tmp_path / "sent"), B, "2.0")
    result = appsync.json("send", device.path, B, package)
    assert names_of(result["updated"]) == [A, B] and result["installed"] == []


def test_an_update_that_still_waits_is_not_asked_for_again(appsync, device, library, waiting_update):
    waiting_update.kill()
    waiting_update.communicate()
    sync = appsync.start("sync", device.path, library, "--json")
    wait_until(lambda: waits_for(appsync, device, A) == "termination")
    appsync("quit", device.path, A)
    result = json.loads(sync.communicate(timeout=60)[0])
    assert sync.returncode == 0
    assert result["requested"] == [] and result["updated"] == [A] and result["bytes"] == 0
    assert device.placeholders() == [] and coordinators(device) == {}


def test_a_library_that_has_changed_meanwhile_counts(appsync, device, library, waiting_update):
    waiting_update.kill()
    waiting_update.communicate()
    appsync("quit", device.path, A)
    packages.make_package(library, A, "3.0")
    assert device.sync(library)["updated"] == [A]
    assert device.versions()[A] == "3.0"


@pytest.fixture
def interrupted(appsync, device, large_library):
    """The library of a session that was killed amid the package of A; B was still to be sent."""
    sync = appsync.start("sync", device.path, large_library, "--json-lines")
    for line in sync.stdout:
        if json.loads(line)["event"] == "progress":
            break
    sync.kill()
    sync.communicate()
    assert sorted(coordinators(device)) == [A, B]
    return large_library


@pytest.fixture
def delivered(device, interrupted):
    """The same library; the package of B had arrived whole."""
    deliver(device, interrupted, B)
    return interrupted


def test_what_had_arrived_is_not_installed_when_it_is_to_be_removed(appsync, device, delivered):
    plan = appsync.json("plan", device.path, delivered, "--remove", B)
    assert names_of(plan["install"]) == [A] and plan["update"] == plan["remove"] == []
    result = device.sync(delivered, "--remove", B)
    assert result["installed"] == [A] and names_of(result["skipped"]) == [B]
    assert list(device.apps()) == [A] and device.placeholders() == [] and coordinators(device) == {}
    assert os.listdir(device.inside(STAGING)) == []


def test_a_mirror_does_not_install_what_had_arrived_and_the_library_lacks(device, delivered):
    os.remove(os.path.join(delivered, B + ".zip"))
    assert device.sync(delivered, "--mirror")["installed"] == [A]
    assert list(device.apps()) == [A] and device.placeholders() == [] and coordinators(device) == {}


def test_a_todo_list_that_removes_what_had_arrived_keeps_it_away(device, delivered):
    stage(device, [remove(B)])
    assert device.sync(delivered, "--staged")["installed"] == []
    assert device.apps() == {} and coordinators(device) == {}


def test_policy_keeps_what_had_arrived_from_being_installed(appsync, device, delivered):
    appsync("set", device.path, "installation=no")
    result = device.sync(delivered, expect=1)
    assert result["installed"] == [] and names_of(result["skipped"]) == [A, B]
    assert device.apps() == {} and device.placeholders() == [] and coordinators(device) == {}


def test_a_plan_counts_on_nothing_that_stands_where_coordination_was_turned_off(
        appsync, device, delivered):
    os.remove(os.path.join(delivered, B + ".zip"))
    appsync("set", device.path, "coordination=off")
    assert names_of(appsync.json("plan", device.path, delivered)["install"]) == [A]
    assert device.sync(delivered)["installed"] == [A]


def test_what_had_arrived_does_not_come_where_the_library_lacks_it(device, delivered):
    os.remove(os.path.join(delivered, B + ".zip"))
    assert names_of(device.sync(delivered)["installed"]) == [A]
    assert list(device.apps()) == [A] and device.placeholders() == [] and coordinators(device) == {}
    assert os.listdir(device.inside(STAGING)) == []


def test_why_names_the_promise_that_is_missing(appsync, device, interrupted):
    why = appsync.json("why", device.path, A)
    assert why["waitsFor"]["what"] == "sync" and why["waitsFor"]["who"] == "host"
    assert why["waitsFor"]["promise"] == A + "-Asset"
    assert A + "-Asset" in appsync("why", device.path, A).stdout


def test_why_names_the_policy_that_forbids(appsync, device, interrupted):
    appsync("set", device.path, "installation=no")
    why = appsync.json("why", device.path, A)
    assert why["waitsFor"]["what"] == "policy" and why["waitsFor"]["who"] == "device"


def test_coordinators_that_stand_are_taken_up(appsync, device, interrupted):
    result = device.sync(interrupted)
    assert names_of(result["requested"]) == names_of(result["installed"]) == [A, B]
    assert device.placeholders() == [] and coordinators(device) == {}


def test_coordinators_that_nobody_asks_for_any_more_go(appsync, device, interrupted):
    os.remove(os.path.join(interrupted, B + ".zip"))
    assert device.sync(interrupted)["installed"] == [A]
    assert device.placeholders() == [] and coordinators(device) == {}


def test_a_package_sent_unasked_leaves_an_interrupted_sync_alone(appsync, device, interrupted, library):
    other = "com.example.app03"
    appsync("send", device.path, other, os.path.join(library, other + ".zip"))
    assert sorted(device.apps()) == [other] and sorted(coordinators(device)) == [A, B]


def test_send_waits_for_a_staging_area_to_be_taken_over(appsync, device, library):
    stage(device, [install(A)], side_files=[A])
    done = appsync("send", device.path, B, os.path.join(library, B + ".zip"), expect=1)
    assert "--staged" in done.stderr
    assert device.sync(library, "--staged")["installed"] == [A]


def test_send_takes_the_place_of_a_staging_area_that_a_killed_command_has_left(appsync, device, library):
    area = stage(device, [install(A)], side_files=[A])
    with open(os.path.join(area, "Host session.plist"), "wb") as record:
        plistlib.dump("library", record)
    appsync("send", device.path, B, os.path.join(library, B + ".zip"))
    assert list(device.apps()) == [B] and not os.path.exists(area)


def test_send_waits_for_what_an_interrupted_staged_sync_has_left(appsync, device, library, large_library):
    stage(device, [install(A), install(B)], side_files=[A, B])
    sync = appsync.start("sync", device.path, large_library, "--staged", "--json-lines")
    for line in sync.stdout:
        if json.loads(line)["event"] == "progress":
            break
    sync.kill()
    sync.communicate()
    other = "com.example.app03"
    package = os.path.join(library, other + ".zip")
    assert "--staged" in appsync("send", device.path, other, package, expect=1).stderr
    assert names_of(device.sync(large_library, "--staged")["installed"]) == [A, B]
    appsync("send", device.path, other, package)
    assert sorted(device.apps()) == [A, B, other]


@pytest.mark.parametrize("entry", [{}, {"version": "0.9"}], ids=["no version", "another version"])
def test_a_staged_package_that_had_arrived_is_not_sent_again(appsync, device, large_library, entry):
    """Its version is that of the package, whatever the todo list says; no Info.plist stands in the area."""
    stage(device, [{"identifier": each, "operation": "install", **entry} for each in (A, B)])
    sync = appsync.start("sync", device.path, large_library, "--staged", "--json-lines")
    for line in sync.stdout:
        if json.loads(line)["event"] == "progress":
            break
    sync.kill()
    sync.communicate()
    deliver(device, large_library, B)
    result = device.sync(large_library, "--staged")
    assert names_of(result["requested"]) == [A] and names_of(result["installed"]) == [A, B]
    assert result["bytes"] == os.path.getsize(os.path.join(large_library, A + ".zip"))
    assert device.placeholders() == [] and coordinators(device) == {}


def test_turning_coordination_off_drops_what_stands_and_says_so(appsync, device, interrupted):
    told = appsync("set", device.path, "coordination=off").stdout
    assert "what has a coordinator: %s %s\n" % (A, B) in told
    assert appsync("set", device.path, "coordination=on").stdout.count("\n") == 1
    appsync("set", device.path, "coordination=off")
    assert names_of(device.sync(interrupted)["installed"]) == [A, B]
    assert device.placeholders() == [] and coordinators(device) == {}


def test_interrupt_while_a_coordinated_install_waits(appsync, device, library, waiting_update):
    waiting_update.send_signal(signal.SIGINT)
    out, err = waiting_update.communicate(timeout=60)
    assert waiting_update.returncode == 1
    assert "interrupted" in err and names_of(json.loads(out)["failed"]) == [A]
    appsync("quit", device.path, A)
    assert device.sync(library)["updated"] == [A]


@pytest.fixture(scope="module")
def stored_library(tmp_path_factory):
    """Six packages whose installs take a while."""
    library = str(tmp_path_factory.mktemp("stored"))
    for number in range(6):
        packages.make_package(library, "com.example.large%d" % number, payload=os.urandom(15 << 20))
    return library


@pytest.mark.parametrize("moment", [1, 2, 3])
def test_the_summary_of_an_interruption_is_what_the_device_holds(appsync, device, stored_library, moment):
    sync = appsync.start("sync", device.path, stored_library, "--json-lines")
    sent = 0
    for line in sync.stdout:
        event = json.loads(line)
        sent += event["event"] == "ended" and event["phase"] == "transfer"
        if sent == moment:
            break
    sync.send_signal(signal.SIGINT)
    out, _ = sync.communicate(timeout=60)
    summary = json.loads(out.splitlines()[-1])
    assert sync.returncode == 1
    assert names_of(summary["installed"]) == sorted(device.apps())
    assert not set(names_of(summary["failed"])) & set(device.apps())
    device.sync(stored_library)
    assert len(device.apps()) == 6 and device.placeholders() == []


def test_removals_are_done_when_the_sync_ends(appsync, device, library):
    device.sync(library)
    for identifier in (A, B):
        os.remove(os.path.join(library, identifier + ".zip"))
    assert names_of(device.sync(library, "--mirror")["removed"]) == [A, B]
    assert len(device.apps()) == 3
    assert appsync.json("inventory", device.path)["deleted"] == []


def test_removed_and_installed_anew_in_one_list(device, library):
    device.sync(library)
    packages.make_package(library, A, "2.0")
    stage(device, [remove(A), install(A, "2.0")], side_files=[A])
    result = device.sync(library, "--staged")
    assert result["removed"] == [A] and device.versions()[A] == "2.0"


def test_events_are_those_of_the_direct_path(appsync, device, library, tmp_path):
    direct = Device(appsync, tmp_path / "direct")

    def kinds(path):
        lines = appsync("sync", path, library, "--json-lines").stdout.splitlines()
        events = [json.loads(line) for line in lines[:-1]]
        return {(e["event"], e["phase"], e["identifier"], e["state"]) for e in events
                if e["event"] != "progress"}

    assert kinds(device.path) == kinds(direct.path)
