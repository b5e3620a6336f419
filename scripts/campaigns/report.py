"""What is seen of a campaign: a line that changes while it runs, and a page and a JSON file of what there is."""

import html
import json
import shutil
import sys
import time

WIDTH, HEIGHT, MARGIN = 720, 220, 40  # of the picture
RARELY = 60  # seconds between lines where there is no terminal


class Bar:
    """Units, rate, findings and what is left. Findings stay above it."""

    def __init__(self, kind, deadline_in=None, out=sys.stdout):
        self.kind = kind
        self.out = out
        self.begun = time.monotonic()
        self.deadline = self.begun + deadline_in if deadline_in else None
        self.units = self.tried = self.findings = 0
        self.shown = 0.0
        self.told = set()

    def add(self, unit, record):
        self.units += 1
        self.tried += record.tried
        self.findings += len(record.findings)
        for each in record.findings:
            self.say(f"FAILED {unit.kind} {unit.key}: {each.what}\n    {each.replay}")

    def say(self, text):
        if self.out.isatty():
            self.out.write("\r\033[K")
        print(text, file=self.out, flush=True)

    def tell_others(self, others, wanted):
        for address, offered in others.items():
            if address not in self.told:
                self.told.add(address)
                what = ", ".join(offered) or "nothing"
                self.say(f"the worker at {address} is refused: it offers {what}, and this campaign needs {wanted}")

    def show(self, left, workers):
        now = time.monotonic()
        if now - self.shown < (0.2 if self.out.isatty() else RARELY):
            return
        self.shown = now
        if self.out.isatty():
            self.out.write("\r\033[K" + self.line(left, workers)[: shutil.get_terminal_size().columns - 1])
            self.out.flush()
        else:
            print(self.line(left, workers), file=self.out, flush=True)

    def line(self, left, workers):
        seconds = max(time.monotonic() - self.begun, 0.001)
        to_come = []
        if left is not None:
            to_come.append(f"{left:,} units")
            if self.units:
                to_come.append(f"about {clock(left * seconds / self.units)}")
        if self.deadline is not None:
            to_come.append(f"{clock(max(0, self.deadline - time.monotonic()))} at most")
        parts = [
            f"{self.kind}: {self.units:,} units", f"{self.tried:,} tried", f"{self.tried / seconds:,.1f}/s",
            f"{self.findings} findings", f"{workers} workers", *([f"left: {', '.join(to_come)}"] if to_come else []),
        ]
        return "  ".join(parts)


def clock(seconds):
    seconds = int(seconds)
    return f"{seconds // 3600}:{seconds // 60 % 60:02}:{seconds % 60:02}"


def summary(sums):
    """What came of one kind at one commit, as the JSON file has it."""
    tried, failed, seconds, processor = (sums.sum_of(name) for name in ("tried", "failed", "seconds", "processor"))
    return {
        "kind": sums.kind,
        "commit": sums.commit,
        "units": sums.units,
        "tried": tried,
        "passed": tried - failed,
        "failed": failed,
        "covered": dict(sorted(sums.covered.items())),
        "seconds_of_workers": round(seconds, 1),
        "seconds_of_processors": round(processor, 1),
        "tried_per_core_hour": round(3600 * tried / processor) if processor else 0,
        "findings": [
            {"unit": key, "what": each.what, "replay": each.replay, "output": each.output} for key, each in sums.findings
        ],
    }


def in_all(totals):
    """A sentence for each kind that has several of these summaries."""
    for kind in dict.fromkeys(total["kind"] for total in totals):
        of_kind = [total for total in totals if total["kind"] == kind]
        if len(of_kind) > 1:
            units, tried, failed = (sum(total[name] for total in of_kind) for name in ("units", "tried", "failed"))
            yield f"{kind} at {len(of_kind)} commits: {units:,} units, {tried:,} tried, {failed:,} failed"


def sentence(total):
    covered = "".join(f", {number:,} {name}" for name, number in total["covered"].items())
    return (f"{total['kind']} at {total['commit'][:12]}: {total['units']:,} units, {total['tried']:,} tried, "
            f"{total['failed']:,} failed{covered}; {total['tried_per_core_hour']:,} for each hour of a processor")


def curve(points, end, most):
    """The picture's line through (when, how many), as stairs."""
    def at(when, number):
        x = MARGIN + (WIDTH - 2 * MARGIN) * (when / end if end else 0)
        y = HEIGHT - MARGIN - (HEIGHT - 2 * MARGIN) * (number / most if most else 0)
        return f"{x:.1f},{y:.1f}"

    places, number = [at(0, 0)], 0
    for when, following in points:
        places += [at(when, number), at(when, following)]
        number = following
    return " ".join([*places, at(end, number)])


def steps(results):
    """(when, units so far), (when, findings so far); thousands of them are thinned out."""
    units, findings, found = [], [], 0
    for number, result in enumerate(sorted(results.values(), key=lambda each: each.at), 1):
        units.append((result.at, number))
        if result.findings:
            found += len(result.findings)
            findings.append((result.at, found))
    every = max(1, len(units) // 500)
    return units[::every] + units[-1:], findings, found


def picture(results):
    units, findings, found = steps(results)
    end = units[-1][0] if units else 0
    lines = [(units, len(results), "#2060b0", "units", 0), (findings, found, "#c02020", "findings", 160)]
    drawn = "".join(
        f'<polyline fill="none" stroke="{color}" stroke-width="2" points="{curve(points, end, most)}"/>'
        f'<text x="{MARGIN + x}" y="24" fill="{color}">{most:,} {name}</text>'
        for points, most, color, name, x in lines
    )
    bottom = HEIGHT - MARGIN
    return (
        f'<svg viewBox="0 0 {WIDTH} {HEIGHT}" width="{WIDTH}" role="img" aria-label="units and findings over time">'
        f'<path d="M{MARGIN} {MARGIN}V{bottom}H{WIDTH - MARGIN}" fill="none" stroke="#888"/>{drawn}'
        f'<text x="{MARGIN}" y="{HEIGHT - 12}">0:00:00</text>'
        f'<text x="{WIDTH - MARGIN}" y="{HEIGHT - 12}" text-anchor="end">{clock(end)}</text></svg>'
    )


def section(total, results):
    rows = "".join(
        f"<tr><th>{html.escape(name.replace('_', ' '))}</th><td>{value:,}</td></tr>"
        for name, value in {**{key: total[key] for key in ("units", "tried", "passed", "failed")}, **total["covered"],
                            **{key: total[key] for key in ("seconds_of_workers", "seconds_of_processors",
                                                           "tried_per_core_hour")}}.items()
    )
    findings = "".join(
        f"<li><p>{html.escape(each['what'])}</p><pre>{html.escape(each['replay'])}</pre>"
        f"<details><summary>output</summary><pre>{html.escape(each['output'])}</pre></details></li>"
        for each in total["findings"]
    )
    return (f"<h1>{html.escape(total['kind'])}</h1><p>commit <code>{html.escape(total['commit'])}</code></p>"
            f"{picture(results) if results else ''}<table>{rows}</table><h2>Findings</h2>"
            + (f"<ol>{findings}</ol>" if findings else "<p>none</p>"))


STYLE = "body{font:15px sans-serif;max-width:760px;margin:2em auto}th{text-align:left;padding-right:2em}" \
        "td{text-align:right}pre{white-space:pre-wrap;word-break:break-all}svg text{font-size:13px}"


def write(stem, sums, campaigns):
    """STEM.html and STEM.json of (kind, commit) -> sums, with pictures of those whose results are in `campaigns`. Gives their
    summaries.
    """
    totals = [summary(each) for each in sums.values()]
    stem.with_suffix(".json").write_text(json.dumps(totals, indent=1) + "\n")
    body = "".join(section(total, campaigns.get(of, {})) for of, total in zip(sums, totals))
    stem.with_suffix(".html").write_text(
        f'<!doctype html><html lang="en"><meta charset="utf-8"><title>Campaign</title><style>{STYLE}</style>{body}</html>\n'
    )
    return totals
