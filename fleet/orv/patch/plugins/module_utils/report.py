# What a run over a fleet came to, as a document for programs (JSON), for spreadsheets (CSV) and for people (HTML).
# Pure functions of the gathered document; nothing here reads or writes a file.

from __future__ import absolute_import, division, print_function

__metaclass__ = type

import csv
import io
import json
import re
import unicodedata
from datetime import datetime

# In the order of the report: what needs a hand comes first. Each with what it means and its kind.
VERDICTS = [
    ("failed", "bad", "The installation failed; what it did is still in place."),
    (
        "incomplete",
        "bad",
        "The home is not as the patches want it, could not be compared with them, or was not taken back whole.",
    ),
    ("refused", "bad", "Refused before anything was changed."),
    ("running", "bad", "The installation was still at work when the time was over; the next run finds its end."),
    ("unreachable", "bad", "The host did not answer, or stopped answering."),
    ("undone", "warn", "Taken back: the home is as it was before."),
    ("untouched", "soft", "Its turn did not come; nothing was changed."),
    ("checked", "good", "The check found nothing that stands in the way; nothing was changed."),
    ("applied", "good", "The patches are installed, and every file was verified."),
    ("unchanged", "good", "There was nothing to do; nothing was changed."),
]
KINDS = {name: kind for name, kind, _meaning in VERDICTS}
MEANINGS = {name: meaning for name, _kind, meaning in VERDICTS}
_ORDER = {verdict[0]: place for place, verdict in enumerate(VERDICTS)}

# The verdict of the whole run, when no home has another one than these.
_WHOLE = [
    ("empty", set()),
    ("unchanged", {"unchanged"}),
    ("undone", {"undone", "unchanged"}),  # but in a rollout, of which it is no good end
    ("applied", {"applied", "unchanged"}),
    ("checked", {"checked", "unchanged"}),
]
_COLUMNS = [
    "host",
    "home",
    "batch",
    "verdict",
    "reason",
    "product",
    "level_before",
    "level_after",
    "started",
    "ended",
    "seconds",
    "transaction",
]
_TIME = re.compile(r"(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d)(\.\d{1,6})?\d*(Z|[+-]\d\d:\d\d)$")


def visible(text):
    """A text from outside with nothing in it that moves a cursor, turns the direction of writing or is no
    character at all: the bytes of such are written as \\xHH, as orvpatchctl writes them."""
    return "".join(_bytes_of(c) if unicodedata.category(c) in ("Cc", "Cf", "Cs", "Zl", "Zp") else c for c in str(text))


def _bytes_of(character):
    errors = "surrogateescape" if "\udc80" <= character <= "\udcff" else "surrogatepass"
    return "".join("\\x%02X" % byte for byte in bytearray(character.encode("utf-8", errors)))


def moment(text):
    """Seconds since 1970 of an RFC 3339 time; None for anything else."""
    match = _TIME.match(str(text or ""))
    if not match:
        return None
    whole, fraction, zone = match.groups()
    try:
        seconds = (datetime.strptime(whole, "%Y-%m-%dT%H:%M:%S") - datetime(1970, 1, 1)).total_seconds()
    except ValueError:
        return None
    if zone != "Z":
        seconds -= (1 if zone[0] == "+" else -1) * (int(zone[1:3]) * 3600 + int(zone[4:6]) * 60)
    return seconds + float(fraction or 0)


def seconds_between(started, ended):
    """The seconds between two times, None when one of them is not known."""
    first, last = moment(started), moment(ended)
    return None if first is None or last is None else max(0, round(last - first, 3))


def kind_of(entry):
    return KINDS.get(entry["verdict"], "bad")


def in_order(fleet):
    """The homes in the order of the report: by verdict, the failed ones first, then by batch and host."""
    return sorted(
        (_filled(entry) for entry in fleet),
        key=lambda e: (_ORDER.get(e["verdict"], -1), e["batch"], e["host"], e["home"]),
    )


_EMPTY = {
    "host": "",
    "home": "",
    "batch": 0,
    "verdict": "untouched",
    "reason": "",
    "started": None,
    "ended": None,
    "components": [],
    "levelsBefore": {},
    "levelsAfter": {},
    "transaction": None,
    "record": None,
}


def _filled(entry):
    """An entry with every field, so that a home whose gathering broke off has a line as well; what a host made up, in
    place of a field of this type, counts as nothing."""
    found = dict(_EMPTY)
    for name, value in entry.items():
        expected = _EMPTY.get(name)
        if value is not None and (expected is None or isinstance(value, type(expected))):
            found[name] = value
    found["components"] = [part for part in found["components"] if isinstance(part, dict)]
    for name in ("levelsBefore", "levelsAfter"):
        found[name] = dict((str(product), str(level)) for product, level in found[name].items())
    return found


def levels_of(entry):
    """[(product, level before, level now)], sorted; a level that is not known is empty."""
    installed = {str(part.get("code", "")): str(part.get("level", "")) for part in entry["components"]}
    before = entry["levelsBefore"] or installed
    after = entry["levelsAfter"] or installed or before
    return [(product, before.get(product, ""), after.get(product, "")) for product in sorted(set(before) | set(after))]


def summary_of(document):
    """What the whole run came to: a verdict, the number of homes by verdict, the batches in order."""
    fleet = in_order(document.get("fleet") or [])
    return {
        "verdict": _verdict_of(fleet, document.get("rollout")),
        "homes": len(fleet),
        "hosts": len({entry["host"] for entry in fleet}),
        "counts": counts_of(fleet),
        "seconds": seconds_between(document.get("started"), document.get("ended")),
        "batches": [
            _batch(number, [entry for entry in fleet if entry["batch"] == number])
            for number in sorted({entry["batch"] for entry in fleet} - {0})
        ],
    }


def counts_of(fleet):
    """{verdict: number of homes} of those that occur, in the order of the report."""
    counts = {}
    for entry in fleet:
        counts[entry["verdict"]] = counts.get(entry["verdict"], 0) + 1
    return counts


def _verdict_of(fleet, is_rollout):
    found = {entry["verdict"] for entry in fleet}
    for verdict, allowed in _WHOLE:
        if found <= allowed and not (is_rollout and verdict == "undone"):
            return verdict
    if "refused" in found and not found & {"applied", "failed", "incomplete", "running", "undone"}:
        return "refused"
    return "unfinished" if found <= {"applied", "unchanged", "checked", "untouched"} else "stopped"


def _batch(number, entries):
    started = _extreme(min, [entry["started"] for entry in entries])
    ended = _extreme(max, [entry["ended"] for entry in entries])
    return {
        "batch": number,
        "homes": len(entries),
        "counts": counts_of(entries),
        "started": started,
        "ended": ended,
        "seconds": seconds_between(started, ended),
    }


def _extreme(choose, times):
    known = [time for time in times if moment(time) is not None]
    return choose(known, key=moment) if known else None


def as_json(document):
    """The document with its homes in order and a summary in front."""
    whole = {
        "summary": summary_of(document),
        "patches": document.get("patches") or [],
        "started": document.get("started"),
        "ended": document.get("ended"),
        "rollout": bool(document.get("rollout")),
        "fleet": in_order(document.get("fleet") or []),
    }
    return json.dumps(whole, indent=1, sort_keys=False) + "\n"


def as_csv(document):
    """A line for each product of each home; a home of which no product is known has one line."""
    target = io.StringIO()
    writer = csv.writer(target, lineterminator="\r\n")
    writer.writerow(_COLUMNS)
    for entry in in_order(document.get("fleet") or []):
        for product, before, after in levels_of(entry) or [("", "", "")]:
            seconds = seconds_between(entry["started"], entry["ended"])
            row = [
                entry["host"],
                entry["home"],
                entry["batch"],
                entry["verdict"],
                entry["reason"],
                product,
                before,
                after,
                entry["started"] or "",
                entry["ended"] or "",
                "" if seconds is None else seconds,
                entry["transaction"] or "",
            ]
            writer.writerow([_cell(value) for value in row])
    return target.getvalue()


def _cell(value):
    """Text stays text: a spreadsheet takes what begins like this for a formula."""
    text = visible(value)
    return "'" + text if text[:1] in ("=", "+", "-", "@") else text
