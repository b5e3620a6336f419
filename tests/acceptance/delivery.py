"""A package that has reached the device's coordination service, and is not installed yet."""

import os
import shutil
import sqlite3

STAGING = "/var/mobile/Media/PublicStaging"


def deliver(device, library, identifier, promise=None):
    """The package arrives as a session dies: its install has not begun. `promise`: the client that has only now
    promised it."""
    place = STAGING + "/" + identifier + ".zip"
    shutil.copyfile(os.path.join(library, identifier + ".zip"), device.inside(place))
    with sqlite3.connect(os.path.join(device.path, "device.db")) as database:
        if promise is not None:
            database.execute(
                "INSERT OR REPLACE INTO promises (coordinator, role, position, name, client, space, percent, complete, cancelled)"
                " SELECT id, 0, 0, ?, ?, 0, 0, 0, 0 FROM coordinators WHERE identifier = ?",
                (identifier + "-Asset", promise, identifier))
        changed = database.execute("UPDATE promises SET complete = 1, percent = 1000, path = ? WHERE name = ?",
                                   (place, identifier + "-Asset")).rowcount
    database.close()
    assert changed == 1
