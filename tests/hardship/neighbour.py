"""A hostile neighbour: swaps directories and packages of a device with links, as fast as it can, until it is told
to end. Prints how often it has.

    neighbour.py DEVICE TARGET SEED
"""

import os
import random
import signal
import sys


def swap(path, target):
    """A link stands in the place of what is there, for a moment."""
    moved = path + ".moved"
    try:
        os.rename(path, moved)
    except OSError:
        moved = None
    try:
        os.symlink(target, path)
    except OSError:
        if moved:
            os.rename(moved, path)
        return 0
    for _ in range(200):
        pass
    os.unlink(path)
    if moved:
        os.rename(moved, path)
    return 1


def main():
    device, target, seed = sys.argv[1:]
    choose = random.Random(int(seed))
    mobile = os.path.join(device, "root", "var", "mobile")
    staging = os.path.join(mobile, "Media", "PublicStaging")
    work = os.path.join(mobile, "Library", "ApplicationSync")
    places = [os.path.join(staging, "ApplicationSync"), os.path.join(staging, "ApplicationSync.new"),
              os.path.join(work, "VessikStuff"), os.path.join(work, "Icons"), os.path.join(mobile, "tmp"), staging]
    for number in range(3):
        identifier = "com.example.app%02d" % number
        places += [os.path.join(staging, identifier + ".zip"),
                   os.path.join(staging, "ApplicationSync", identifier),
                   os.path.join(staging, "ApplicationSync.new", identifier),
                   os.path.join(work, "VessikStuff", identifier),
                   os.path.join(mobile, "tmp", "com.korvu.trd.Apps", identifier + ".app")]
    ending = []
    signal.signal(signal.SIGTERM, lambda *_: ending.append(True))  # no link is left behind
    swaps = 0
    while not ending:
        try:
            swaps += swap(choose.choice(places), target)
        except OSError:
            pass
    print(swaps)


main()
