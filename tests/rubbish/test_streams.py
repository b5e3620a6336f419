"""What is printed goes nowhere else when there is no standard stream for it."""

import os
import subprocess
import time

import packages
from conftest import APPS
from entry import Place


def test_no_file_takes_the_number_of_a_closed_stream(appsync, templates, scratch):
    place = Place(scratch / "streams", templates, "used-direct")
    packages.make_package(str(place.hostile), APPS[0], "2.0")
    appsync.good("run", place.device, APPS[0])  # so that the sync waits
    process = subprocess.Popen([appsync.program, "sync", str(place.device), str(place.hostile)],
                               preexec_fn=lambda: os.closerange(0, 3))
    try:
        streams = "/proc/%d/fd" % process.pid
        late = time.monotonic() + 30
        while len(os.listdir(streams)) < 8 and time.monotonic() < late:
            time.sleep(0.01)
        assert [os.readlink("%s/%d" % (streams, number)) for number in range(3)] == ["/dev/null"] * 3
    finally:
        process.kill()
        process.wait()
