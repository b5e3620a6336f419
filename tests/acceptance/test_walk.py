"""Days of random use: every command, in an order that a seed decides, held against what must always be so.

APPSYNC_WALKS=50 walks fifty days on each path instead of four, APPSYNC_FIRST_WALK=1000 begins at that seed; a day that
fails names its seed and its commands.
"""

import json
import os
import random
import shutil

import pytest

import packages
from conftest import Device, names_of

FIRST_DAY = int(os.environ.get("APPSYNC_FIRST_WALK", "0"))
DAYS = int(os.environ.get("APPSYNC_WALKS", "4"))
STEPS = 40
IDS = ["com.example.app%d" % number for number in range(6)]
DATA = "root/var/mobile/Containers/Data"
CONTAINERS = "root/var/containers/Bundle/Application"


class Walk:
    """A device, a library, and what is known of both without asking the command."""

    def __init__(self, appsync, folder, coordination, seed):
        self.appsync = appsync
        self.folder = folder
        self.numbers = random.Random(seed)
        self.device = Device(appsync, folder / "device", coordination)
        self.library = str(folder / "library")
        self.versions = {}
        self.done = []
        self.count = 0
        for identifier in IDS:
            self.put(identifier, "1.0")

    def put(self, identifier, version):
        packages.make_package(self.library, identifier, version)
        self.versions[identifier] = version

    def new(self, name):
        self.count += 1
        return str(self.folder / ("%s%d" % (name, self.count)))

    def run(self, *words):
        """A command in which nothing is wrong: it is done, or says what did not happen."""
        self.done.append(" ".join(map(str, words)))
        done = self.appsync(*words, expect=None)
        assert done.returncode in (0, 1), (self.done, done.stdout, done.stderr)
        assert done.returncode == 0 or done.stderr or done.stdout, self.done
        return done

    def json(self, *words):
        return json.loads(self.run(*words, "--json").stdout)

    # What a person does.

    def release(self, identifier):
        self.put(identifier, "%d.%d" % (self.numbers.randrange(1, 4), self.numbers.randrange(3)))

    def withdraw(self, identifier):
        path = os.path.join(self.library, identifier + ".zip")
        if len(self.versions) > 1 and os.path.exists(path):
            os.remove(path)
            del self.versions[identifier]

    def sync(self, identifier):
        options = self.numbers.choice([[], ["--mirror"], ["--remove", identifier], ["--only", identifier]])
        plan = self.json("plan", self.device.path, self.library, *options)
        result = self.json("sync", self.device.path, self.library, *options, "--no-wait")
        running = self.json("status", self.device.path)["running"]
        if not running:
            assert names_of(plan["install"]) == sorted(result["installed"]), self.done
            assert names_of(plan["update"]) == sorted(result["updated"]), self.done
            assert names_of(plan["remove"]) == sorted(result["removed"]), self.done
        if not options:
            self.is_in_step(result)

    def is_in_step(self, result):
        """What the library holds is on the device, or the sync has said why not."""
        told = set(names_of(result["failed"]) + names_of(result["skipped"]))
        present = self.device.versions()
        for identifier, version in self.versions.items():
            assert present.get(identifier) == version or identifier in told, (self.done, identifier, result)
        again = self.json("plan", self.device.path, self.library)
        assert not set(names_of(again["install"] + again["update"])) - told, (self.done, again)

    def stage(self, identifier):
        self.run("stage", self.device.path, self.library, "--force")
        self.json("sync", self.device.path, self.library, "--staged", "--no-wait")

    def start(self, identifier):
        self.run("run", self.device.path, identifier)

    def stop(self, identifier):
        for running in self.json("status", self.device.path)["running"]:
            self.run("quit", self.device.path, running)

    def uninstall(self, identifier):
        self.run("uninstall", self.device.path, identifier)

    def demote(self, identifier):
        self.run("demote", self.device.path, identifier, "--by", self.numbers.choice(["person", "system"]))

    def roll_back(self, identifier):
        before = {app["identifier"]: app for app in self.json("apps", self.device.path) if app["state"] == "installed"}
        done = self.run("rollback", self.device.path, identifier)
        if done.returncode != 0:
            return
        after = self.device.apps()
        assert after[identifier]["version"] == before[identifier]["kept"]["version"], self.done
        assert after[identifier]["kept"]["version"] == before[identifier]["version"], self.done

    def change_settings(self, identifier):
        name = self.numbers.choice(["installation", "removal", "coordination"])
        values = ["on", "off"] if name == "coordination" else ["yes", "no", "unset"]
        self.run("set", self.device.path, "%s=%s" % (name, self.numbers.choice(values)))

    def allow(self, identifier):
        self.run("set", self.device.path, "installation=unset", "removal=unset")

    def send(self, identifier):
        self.stop(identifier)  # it would wait for that
        if identifier in self.versions:
            self.run("send", self.device.path, identifier, os.path.join(self.library, identifier + ".zip"), "--json")

    def play_client(self, identifier):
        self.run("coordinator", self.device.path, self.numbers.choice(["create", "cancel"]), identifier)

    def back_up_and_restore(self, identifier):
        backup = self.new("backup")
        self.json("backup", self.device.path, backup)
        assert self.json("backup", "--check", backup)["whole"], self.done
        self.run("diff", self.device.path, backup)
        self.json("restore", self.device.path, backup)
        shutil.rmtree(backup)

    def store(self, identifier):
        self.stop(identifier)
        self.run("store", self.device.path, self.library)

    def reset(self, identifier):
        self.run("reset", self.device.path)

    def exchange_data(self, identifier):
        place, text = self.new("data"), str(self.numbers.random())
        os.mkdir(place)
        with open(os.path.join(place, "file"), "w") as file:
            file.write(text)
        if self.run("data", "push", self.device.path, identifier, place, "--yes").returncode == 0:
            out = self.new("out")
            self.run("data", "pull", self.device.path, identifier, out)
            with open(os.path.join(out, "file")) as file:
                assert file.read() == text, self.done

    def look(self, identifier):
        for words in (["inventory"], ["history"], ["history", "--app", identifier], ["coordinator"], ["log", "--last", "5"]):
            command, rest = words[0], words[1:] if words[0] != "coordinator" else ["list"]
            self.run(command, self.device.path, *rest, "--json")
        self.run("diff", self.device.path, self.library)
        self.run("screen", self.device.path, self.new("screen") + ".png")

    # What must always be so.

    def check(self):
        apps = self.json("apps", self.device.path)
        status = self.json("status", self.device.path)
        states = [app["placeholder"] or app["state"] for app in apps]
        assert {name: status[name] for name in ("installed", "offloaded", "restored", "arriving")} == {
            name: states.count(name) for name in ("installed", "offloaded", "restored", "arriving")}, self.done
        # Without a wait, a session with a running application ends as one that is interrupted.
        assert status["session"] != "under way" and status["process"] is None, self.done
        folders = os.path.join(self.device.path, CONTAINERS)
        there = set(os.listdir(folders)) if os.path.isdir(folders) else set()
        assert there == {os.path.basename(app["container"]) for app in apps if app["container"]}, self.done
        folder = os.path.join(self.device.path, "kept")
        kept = os.listdir(folder) if os.path.isdir(folder) else []
        assert len(kept) == len([app for app in apps if app["kept"]]) == status["kept"], self.done
        for identifier in {app["identifier"] for app in apps}:
            # An update's placeholder covers what is installed.
            shown = sorted(app["state"] for app in apps if app["identifier"] == identifier)
            assert self.json("why", self.device.path, identifier)["state"] == shown[0], self.done

    def data(self):
        """The data that is there, by application."""
        folder = os.path.join(self.device.path, DATA)
        return {name for name in os.listdir(folder) if os.listdir(os.path.join(folder, name))} if os.path.isdir(folder) else set()


ACTIONS = (
    ["sync"] * 8 + ["release"] * 5 + ["withdraw"] * 2 + ["stage"] * 2 + ["start", "stop", "stop", "uninstall"] + ["demote"] * 2
    + ["roll_back"] * 3 + ["change_settings"] * 2 + ["allow"] * 2 + ["send", "play_client", "back_up_and_restore", "store", "reset"]
    + ["exchange_data"] * 2 + ["look"]
)
# Nothing else may lose data.
LOSING = {"sync", "stage", "uninstall"}


@pytest.mark.parametrize("seed", range(FIRST_DAY, FIRST_DAY + DAYS))
def test_a_day_of_random_use(appsync, tmp_path, coordination, seed):
    walk = Walk(appsync, tmp_path, coordination, seed)
    for _ in range(STEPS):
        before = walk.data()
        identifier, action = walk.numbers.choice(IDS), walk.numbers.choice(ACTIONS)
        getattr(walk, action)(identifier)
        walk.check()
        if action not in LOSING:
            assert before <= walk.data(), walk.done
    walk.allow(None)
    walk.stop(None)
    walk.is_in_step(walk.json("sync", walk.device.path, walk.library))
