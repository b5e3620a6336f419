"""What a restore leaves on the device for later is on disk before its name stands for it, and so is the name."""

import pytest

TEMPORARY = "/root/var/mobile/tmp/Arriving0"
FOLDER = "/root/var/mobile/Media/VessikRestore/Data"


@pytest.mark.parametrize("name", ["restore", "coordinated-restore"])
def test_the_data_of_a_restore_is_durable(meddling, prepared, name):
    scenario, _ = prepared(name)
    calls = scenario.meddled("--list", "--calls", "fsync,rename,renameat,renameat2").calls
    made = [(call, path[len(scenario.device):]) for call, path in calls if path.endswith((TEMPORARY, FOLDER))]
    assert made == [("fsync", TEMPORARY), ("renameat", TEMPORARY), ("fsync", FOLDER)]
