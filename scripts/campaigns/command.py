"""The command scripts/campaign."""

import argparse
import os
import pathlib
import re
import signal
import sys

from campaigns import kept, kinds, report, state
from campaigns.tree import WORK, Refusal, commit_of
from campaigns.units import LIMIT

USAGE = """Searches for failures with as many processes and machines as there are, for as long as it is told.

    campaign KIND --local 2 --for 1h        on this machine
    campaign KIND --scheduler tcp://HOST:8786 --units 10000
    campaign worker --scheduler tcp://HOST:8786
                                            one machine more: builds the commit that the campaign asks for, and works
    campaign keep STATE...                  adds what was done to docs/campaigns/KIND.json and docs/reliability.md, to be
                                            committed: later campaigns begin behind it; if none is named, only the table
    campaign sum [STATE...] [--page PAGE]   states and kept files, added up; what two of them hold counts once. All that is
                                            kept, if none is named
    campaign kinds                          what there is, and whether it can be run here

The state is an SQLite file (build/campaign/KIND.db). A campaign that was stopped or killed goes on with it where it
was. Beside it are, at the end, a page (.html) and its figures (.json). The scheduler is the engine's own:
dask-scheduler. Exits with 1 when anything failed.
"""


def duration(text):
    """Seconds, from 90, 90s, 15m, 8h, 2d."""
    match = re.fullmatch(r"(\d+(?:\.\d+)?)([smhd]?)", text)
    if not match or float(match[1]) == 0:
        raise argparse.ArgumentTypeError(f"{text} is no duration, such as 90s, 15m, 8h or 2d")
    return float(match[1]) * {"": 1, "s": 1, "m": 60, "h": 3600, "d": 86400}[match[2]]


def number(text):
    if not text.isdigit() or int(text) == 0:
        raise argparse.ArgumentTypeError(f"{text} is no number of at least 1")
    return int(text)


def options_of(arguments):
    parser = argparse.ArgumentParser(
        prog="campaign", description=USAGE, formatter_class=argparse.RawDescriptionHelpFormatter, allow_abbrev=False,
        epilog="kinds:\n" + "\n".join(f"  {kind.name:<15}{kind.says}" for kind in kinds.KINDS.values()),
    )
    parser.add_argument("what", metavar="KIND|worker|keep|sum|kinds", choices=[*kinds.KINDS, "worker", "keep", "sum", "kinds"])
    parser.add_argument("states", nargs="*", type=pathlib.Path, metavar="STATE", help="keep, sum: the states")
    parser.add_argument("--scheduler", metavar="ADDRESS", help="where the scheduler is")
    parser.add_argument("--local", type=number, metavar="N", help="so many workers here, with a scheduler of their own (2)")
    parser.add_argument("--for", dest="seconds", type=duration, metavar="DURATION", help="how long: 90s, 15m, 8h, 2d")
    parser.add_argument("--units", type=number, metavar="N", help="until the state has so many units")
    parser.add_argument("--state", type=pathlib.Path, metavar="FILE", help="build/campaign/KIND.db if nothing is said")
    parser.add_argument("--first", type=int, metavar="N", help="the seed to begin with (behind those that are kept in "
                        "the tree, of whatever commit); the range that holds it is the first")
    parser.add_argument("--limit", type=duration, metavar="DURATION", default=LIMIT, help="after which a unit hangs (10m)")
    parser.add_argument("--processes", type=number, metavar="N", default=os.cpu_count(), help="worker: how many (one for "
                        "each processor)")
    parser.add_argument("--patience", type=duration, metavar="DURATION", default=600.0, help="worker: how long it waits for "
                        "a scheduler that is away (10m)")
    parser.add_argument("--built", action="store_true", help="worker: build nothing; refused if this is another commit")
    parser.add_argument("--page", type=pathlib.Path, metavar="FILE", help="sum: writes FILE.html and FILE.json")
    options = parser.parse_args(arguments)
    if options.states and options.what not in ("keep", "sum"):
        parser.error("only keep and sum take states")
    if options.what == "worker" and not options.scheduler:
        parser.error("worker: which --scheduler?")
    if options.scheduler and options.local:
        parser.error("--scheduler or --local, not both")
    return options


def list_kinds():
    for kind in kinds.KINDS.values():
        missing = kind.missing()
        print(f"{kind.name:<15}{kind.says}" + (f" (missing: {missing})" if missing else ""))
    return 0


def add_up(options):
    paths = options.states or sorted(kept.FOLDER.glob("*.json"))
    if not paths:
        raise Refusal("sum: which states? Nothing is kept in docs/campaigns")
    campaigns = state.added_up([path for path in paths if path.suffix != ".json"])
    sums = kept.together([path for path in paths if path.suffix == ".json"], campaigns)
    totals = report.write(options.page, sums, campaigns) if options.page else [report.summary(each) for each in sums.values()]
    for line in (*map(report.sentence, totals), *report.in_all(totals)):
        print(line)
    return 1 if any(total["findings"] for total in totals) else 0


def keep(options):
    for path in options.states:
        sums, added = kept.keep(*state.read(path))
        print(f"{path}: {added:,} units more; {report.sentence(report.summary(sums))}")
    kept.write_table()
    return 0


def work(options):
    from campaigns import engine  # which takes a second to load

    def end(*_):
        raise SystemExit(0)

    signal.signal(signal.SIGTERM, end)
    engine.work(options.scheduler, options.processes, options.patience, options.built, lambda text: print(text, flush=True))
    return 0


def run(options):
    kind = kinds.KINDS[options.what]
    if kind.missing():
        raise Refusal(f"{kind.name} cannot be run: {kind.missing()}; it is of the build {kind.build}")
    path = options.state or WORK / f"{kind.name}.db"
    path.parent.mkdir(parents=True, exist_ok=True)
    commit = commit_of()
    book = state.State(path)
    try:
        begins = book.belong_to(kind.name, commit, options.first, kept.begin_of(kind.name))
        print(f"campaign: {kind.name} at {commit}, begins at {begins}, state {path}", flush=True)
        sit(kind, book, commit, options)
        campaigns = {(kind.name, commit): book.results()}
        totals = report.write(path, kept.together([], campaigns), campaigns)
    finally:
        book.close()
    print(report.sentence(totals[0]))
    print(f"{path.with_suffix('.html')}")
    return 1 if totals[0]["findings"] else 0


def sit(kind, book, commit, options):
    """One sitting of the campaign."""
    from campaigns import driver, engine

    bar = report.Bar(kind.name, options.seconds)
    if options.scheduler:
        go(driver.Campaign(kind, book, commit, bar, options.scheduler, options.units, options.seconds, options.limit))
        return
    with engine.local(options.local or 2, [engine.resource(kind.build, commit)]) as cluster:
        go(driver.Campaign(kind, book, commit, bar, cluster.scheduler_address, options.units, options.seconds, options.limit))


def go(campaign):
    """Ctrl-C and SIGTERM end the sitting; what was done stays."""
    before = {each: signal.signal(each, lambda *_: campaign.stop()) for each in (signal.SIGINT, signal.SIGTERM)}
    try:
        campaign.go()
    finally:
        for each, handler in before.items():
            signal.signal(each, handler)


def main(arguments=None):
    options = options_of(sys.argv[1:] if arguments is None else arguments)
    tasks = {"worker": work, "sum": add_up, "keep": keep, "kinds": lambda _: list_kinds()}
    try:
        return tasks.get(options.what, run)(options)
    except Refusal as refusal:
        print(f"campaign: {refusal}", file=sys.stderr)
        return 2
    except KeyboardInterrupt:
        return 130
