"""A staging area on a device, as a desktop host leaves it."""

import os
import plistlib

import packages

AREA = "/var/mobile/Media/PublicStaging/ApplicationSync"


def stage(device, todo, fmt=plistlib.FMT_XML, order=None, side_files=()):
    """Writes the area; `todo` is a list of entries, or the file's bytes."""
    area = device.inside(AREA)
    os.makedirs(area, exist_ok=True)
    data = todo if isinstance(todo, bytes) else plistlib.dumps(todo, fmt=fmt)
    with open(os.path.join(area, "ApplicationsSync.plist"), "wb") as file:
        file.write(data)
    if order is not None:
        with open(os.path.join(area, "DeskoraIconState.plist"), "wb") as file:
            plistlib.dump(order, file)
    for identifier in side_files:
        side = os.path.join(area, identifier)
        os.makedirs(side, exist_ok=True)
        for name, content in (("Info.plist", plistlib.dumps(packages.info(identifier))),
                              ("VessikMetadata.plist", plistlib.dumps(packages.metadata(identifier))),
                              ("VessikArtwork", packages.png()), ("Icon.png", packages.png())):
            with open(os.path.join(side, name), "wb") as file:
                file.write(content)
    return area


def install(identifier, version="1.0"):
    return {"identifier": identifier, "operation": "install", "version": version,
            "name": identifier.rsplit(".", 1)[-1]}


def remove(identifier):
    return {"identifier": identifier, "operation": "remove"}
