"""Where units are run: Dask distributed, with a scheduler of its own on this machine or one at an address.

A worker offers, as a resource of the engine, the builds that it has and their commit; a unit asks for one of them. So a
worker of another commit gets nothing.
"""

import asyncio
import concurrent.futures
import logging
import os
import subprocess
import sys
import time

from campaigns.tree import BUILDS, ROOT, WORK, Refusal, build, tree_at
from campaigns.units import kill

# Before the engine is loaded, which reads them then; the workers inherit them.
os.environ.setdefault("DASK_CONFIG", str(WORK / "engine"))
os.environ.setdefault("DASK_TEMPORARY_DIRECTORY", str(WORK / "engine"))
os.environ.setdefault("DASK_LOGGING__DISTRIBUTED", "critical")
# A unit that ends its worker has ended two then; whoever kills workers hits the same unit twice now and then.
os.environ.setdefault("DASK_DISTRIBUTED__SCHEDULER__ALLOWED_FAILURES", "1")
(WORK / "engine").mkdir(parents=True, exist_ok=True)

try:
    import distributed
except ImportError as error:
    raise Refusal("python3-distributed is missing: scripts/setup --tests installs it") from error

logging.getLogger("asyncio").setLevel(logging.CRITICAL)  # what the engine leaves behind at its end

# How the engine says that the scheduler cannot be reached, or has lost what it was given.
AWAY = (OSError, TimeoutError)
LOST = (asyncio.CancelledError, concurrent.futures.CancelledError)
PAGES = "127.0.0.1:0"  # the engine's own pages are for this machine alone, and none of ours
CONNECT = 10  # seconds for one try
ASKED = "campaign"  # under this name the scheduler tells what is asked for


def resource(name, commit):
    return f"{name}@{commit}"


def local(count, resources):
    """A scheduler and so many workers, on this machine alone."""
    return distributed.LocalCluster(
        n_workers=count, threads_per_worker=1, host="127.0.0.1", memory_limit=0, dashboard_address=PAGES,
        worker_dashboard_address=PAGES, scheduler_kwargs={"dashboard": False},
        resources={each: 1 for each in resources},
    )


def connect(address):
    return distributed.Client(address, timeout=CONNECT, set_as_default=False)


def ask_for(client, name, commit):
    """Tells the workers that come what to build."""
    client.set_metadata(ASKED, {"build": name, "commit": commit})


def workers(client, wanted):
    """How many units can run at once, and the addresses of workers that cannot run any."""
    infos = client.scheduler_info()["workers"]
    fit = sum(info["nthreads"] for info in infos.values() if wanted in info.get("resources", {}))
    others = {address: info.get("resources", {}) for address, info in infos.items() if wanted not in info.get("resources", {})}
    return fit, others


def asked(address):
    """What the campaign at a scheduler asks for; nothing when there is none yet."""
    with connect(address) as client:
        return client.get_metadata(ASKED, default=None)


def work(address, count, patience, is_built=False, say=print):
    """Works for the campaigns at a scheduler, until it is away for `patience` seconds."""
    last = time.monotonic()
    while time.monotonic() - last < patience:
        try:
            wanted = asked(address)
        except AWAY:
            time.sleep(1)
            continue
        last = time.monotonic()
        if wanted is None:
            time.sleep(1)
            continue
        tree = ready(wanted, is_built, say)
        serve(address, count, tree, resource(wanted["build"], wanted["commit"]), say)
        last = time.monotonic()
    say(f"worker: no scheduler at {address} for {patience:g} s")


def ready(wanted, is_built, say):
    """The tree that the campaign asks for, built."""
    if wanted["build"] not in BUILDS:
        raise Refusal(f"the campaign asks for a build {wanted['build']} that this tree does not know")
    tree = tree_at(wanted["commit"])
    if is_built and tree != ROOT:
        raise Refusal(f"refused: the campaign asks for the commit {wanted['commit']}, and this tree is another")
    if not is_built:
        say(f"worker: building {wanted['build']} at {wanted['commit']}")
        build(wanted["build"], tree)
    return tree


def serve(address, count, tree, offered, say):
    """The engine's own workers, until they lose their scheduler."""
    command = [sys.executable, "-m", "distributed.cli.dask_worker", address, "--nworkers", str(count), "--nthreads", "1"]
    command += ["--memory-limit", "0", "--resources", f"{offered}=1", "--death-timeout", "30"]
    command += ["--no-dashboard", "--dashboard-address", PAGES]
    with connect(address) as client:
        process = subprocess.Popen(
            [*command, "--local-directory", str(WORK / "engine")], cwd=tree, stdin=subprocess.DEVNULL,
            stderr=subprocess.DEVNULL, start_new_session=True,
            env={**os.environ, "PYTHONPATH": str(tree / "scripts"), "PYTHONDONTWRITEBYTECODE": "1"},
        )
        try:
            say(f"worker: {count} at work for {address}, {offered}")
            # By themselves they would first finish units that nobody waits for any more.
            while client.status == "running" and process.poll() is None:
                time.sleep(0.5)
        finally:
            kill(process)
            process.wait()
