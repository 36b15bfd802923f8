# The report of a fleet as one HTML page that stands alone: no script, no request, nothing from outside is markup.

from __future__ import absolute_import, division, print_function

__metaclass__ = type

from .report import (
    KINDS,
    MEANINGS,
    counts_of,
    in_order,
    kind_of,
    levels_of,
    moment,
    seconds_between,
    summary_of,
    visible,
)
from .report_style import STYLE

# What is beyond these stands in the JSON document alone: a page of a million lines is not read.
MOST_RECORDS = 100
MOST_LINES = 200
MOST_OUTPUT = 16 * 1024

_HEAD = """<!DOCTYPE html>
<html lang="en">
<head>
<meta charset="utf-8">
<meta http-equiv="Content-Security-Policy" content="default-src 'none'; style-src 'unsafe-inline'; img-src data:">
<meta name="viewport" content="width=device-width, initial-scale=1">
<link rel="icon" href="data:,">
<title>%s</title>
<style>%s</style>
</head>
<body>
"""
_SENTENCES = {
    "applied": "Every home has the patches.",
    "checked": "Nothing stands in the way on any home; nothing was changed.",
    "unchanged": "Nothing was changed on any home.",
    "undone": "The patches were taken back wherever they were the last.",
    "refused": "At least one home refuses; nothing was changed anywhere.",
    "stopped": "Not every home has the patches. What was not reached is as it was.",
    "unfinished": "The turn of some homes did not come.",
    "empty": "There is no home in this run.",
}
_MARKS = {"good": "✓", "bad": "✗", "warn": "↶", "soft": "·"}


def as_page(document):
    """The whole page as text."""
    fleet, summary = in_order(document.get("fleet") or []), summary_of(document)
    for number, entry in enumerate(fleet, 1):
        entry["anchor"] = "home-%d" % number
    told = _told(fleet)
    parts = [
        _HEAD % (_escaped("Fleet: " + summary["verdict"]), STYLE),
        _header(summary),
        "<main>\n",
        _facts(document, summary),
        _attention(told),
        _grid(fleet),
        _batches(summary),
        _products(fleet),
        _homes(fleet, {entry["anchor"] for entry in told[:MOST_RECORDS]}),
        "</main>\n</body>\n</html>\n",
    ]
    return "".join(parts)


# --- small parts -----------------------------------------------------------------------------------------------


def _escaped(text):
    text = visible(text)
    for character, name in (("&", "amp"), ("<", "lt"), (">", "gt"), ('"', "quot"), ("'", "#39")):
        text = text.replace(character, "&%s;" % name)
    return text


def _lines(text, separator="\n"):
    return separator.join(_escaped(line) for line in str(text).split("\n"))


def _code(text):
    return "<code>%s</code>" % _escaped(text)


def _counted(number, what):
    return "%d %s%s" % (number, what, "" if number == 1 else "s")


def _span(seconds):
    """A duration in words, "" when it is not known."""
    if not isinstance(seconds, (int, float)):
        return ""
    if seconds < 60:
        return "%.3g s" % seconds if seconds < 10 else "%d s" % seconds
    whole = int(round(seconds))
    if whole < 3600:
        return "%d min %02d s" % (whole // 60, whole % 60)
    return "%d h %02d min" % (whole // 3600, whole % 3600 // 60)


def _counts(counts):
    return ", ".join(
        '<span class="%s">%d %s</span>' % (KINDS.get(name, "bad"), number, _escaped(name))
        for name, number in counts.items()
    )


def _verdict(entry):
    return '<span class="%s">%s</span>' % (kind_of(entry), _escaped(entry["verdict"]))


def _cell(name, html, kind=""):
    return '<td%s data-name="%s">%s</td>' % (kind and ' class="%s"' % kind, name, html)


def _table(kind, names, rows):
    head = "".join("<th>%s</th>" % name for name in names)
    return '<table class="%s">\n<thead><tr>%s</tr></thead>\n<tbody>\n%s</tbody>\n</table>\n' % (
        kind,
        head,
        "".join(rows),
    )


def _level(before, now):
    if before == now or not before:
        return _escaped(now)
    return "%s → %s" % (_escaped(before), _escaped(now))


# --- the parts of the page -------------------------------------------------------------------------------------


def _header(summary):
    kind = "good" if summary["verdict"] in ("applied", "checked", "unchanged", "undone") else "bad"
    return '<header class="%s">\n<h1 class="%s">%s</h1>\n<p>%s</p>\n<p>%s on %s: %s</p>\n</header>\n' % (
        kind,
        kind,
        _escaped(summary["verdict"]),
        _SENTENCES[summary["verdict"]],
        _counted(summary["homes"], "home"),
        _counted(summary["hosts"], "host"),
        _counts(summary["counts"]) or "none",
    )


def _facts(document, summary):
    facts = [
        ("Patches", "<br>".join(_code(patch) for patch in document.get("patches") or []) or "none"),
        ("Started", _escaped(document.get("started") or "not known")),
        ("Ended", _escaped(document.get("ended") or "not known")),
        ("Took", _span(summary["seconds"]) or "not known"),
    ]
    return "<dl>\n%s</dl>\n" % "".join("<dt>%s</dt><dd>%s</dd>\n" % fact for fact in facts)


def _told(fleet):
    """The homes of which the reason and the record are told."""
    return [entry for entry in fleet if kind_of(entry) == "bad" or (entry["verdict"] == "undone" and entry["reason"])]


def _attention(told):
    if not told:
        return ""
    parts = ["<h2>%s to look at</h2>\n" % _counted(len(told), "home")]
    parts += [_article(entry) for entry in told[:MOST_RECORDS]]
    if len(told) > MOST_RECORDS:
        parts.append('<p class="soft">The first %d; the JSON document has all.</p>\n' % MOST_RECORDS)
    return "".join(parts)


def _article(entry):
    where = ["batch %d" % entry["batch"] if entry["batch"] else "not reached"]
    where += ["transaction " + _code(entry["transaction"])] if entry["transaction"] else []
    where += ["%s %s" % (_escaped(product), _level(before, now)) for product, before, now in levels_of(entry)]
    record = entry["record"] if isinstance(entry["record"], dict) else {}
    return (
        '<article id="%s" class="%s">\n<h3>%s %s</h3>\n<p>%s: %s</p>\n<p class="reason">%s</p>\n<p class="soft">%s</p>\n'
        "%s</article>\n"
        % (
            entry["anchor"],
            kind_of(entry),
            _escaped(entry["host"]),
            _code(entry["home"]),
            _verdict(entry),
            _escaped(MEANINGS.get(entry["verdict"], "")),
            _lines(entry["reason"], "<br>"),
            " · ".join(where),
            _record(record),
        )
    )


def _record(record):
    installer = record.get("installer") if isinstance(record.get("installer"), dict) else {}
    return "".join(
        [
            _list("Patches", [_patch(one) for one in _dicts(record, "patches")]),
            _list("Steps", [_step(one) for one in _dicts(record, "steps")] + _status(installer)),
            _list("Differences", [_difference(one) for one in _dicts(record, "differences")]),
            _list("Messages", [_code(line) for line in _items(record, "messages")]),
            _list("Findings", [_finding(one) for one in _dicts(record, "findings")]),
            _output("Errors of the installer", installer.get("stderr")),
            _output("Output of the installer", installer.get("stdout")),
        ]
    )


def _patch(one):
    levels = _level(one.get("levelBefore", ""), one.get("levelAfter", ""))
    return "%s %s: %s" % (_code(one.get("file", "")), levels, _escaped(one.get("result") or "not tried"))


def _step(one):
    result = one.get("result", "")
    said = "" if result == "ok" else " " + _bad(result)
    return "%s %s%s" % (_escaped(one.get("step", "")), _span(one.get("seconds")), said)


def _status(installer):
    status = installer.get("status")
    return [] if status is None else ["installer: status %s" % _escaped(status)]


def _difference(one):
    return "%s %s: %s" % (_bad(one.get("kind", "")), _code(one.get("path", "")), _escaped(one.get("text", "")))


def _finding(one):
    severity = _bad("error") if one.get("severity") == "error" else '<span class="warn">warning</span>'
    place = _code(one["where"]) if one.get("where") else ""
    texts = (_escaped(one.get("text", "")), _escaped(one.get("remedy", "")))
    return "%s %s %s<br>%s<br><small>%s</small>" % ((severity, _code(one.get("rule", "")), place) + texts)


def _dicts(record, name):
    return [one for one in _items(record, name) if isinstance(one, dict)]


def _items(record, name):
    return record[name] if isinstance(record.get(name), list) else []


def _bad(text):
    return '<span class="bad">%s</span>' % _escaped(text)


def _list(name, items):
    if not items:
        return ""
    more = '<li class="soft">%d more; the JSON document has all.</li>\n' % (len(items) - MOST_LINES)
    return "<h4>%s</h4>\n<ul>\n%s%s</ul>\n" % (
        name,
        "".join("<li>%s</li>\n" % item for item in items[:MOST_LINES]),
        more if len(items) > MOST_LINES else "",
    )


def _output(name, text):
    if not text:
        return ""
    text, note = str(text), ""
    if len(text) > MOST_OUTPUT:
        note = '<p class="soft">The end of it; the JSON document has all.</p>\n'
    return "<h4>%s</h4>\n%s<pre>%s</pre>\n" % (name, note, _lines(text[-MOST_OUTPUT:]))


def _grid(fleet):
    """A tile for each home, by verdict."""
    parts = ["<h2>Homes by verdict</h2>\n"]
    hosts = counts_by_host(fleet)
    for name, number in counts_of(fleet).items():
        kind = KINDS.get(name, "bad")
        parts.append('<h3><span class="%s">%s</span> %d</h3>\n<ul class="tiles">\n' % (kind, _escaped(name), number))
        for entry in fleet:
            if entry["verdict"] == name:
                home = " <small>%s</small>" % _escaped(entry["home"]) if hosts[entry["host"]] > 1 else ""
                parts.append(
                    '<li class="%s"><a href="#%s"><span>%s</span> <span>%s%s</span></a></li>\n'
                    % (kind, entry["anchor"], _MARKS[kind], _escaped(entry["host"]), home)
                )
        parts.append("</ul>\n")
    return "".join(parts)


def counts_by_host(fleet):
    """{host: number of its homes}."""
    hosts = {}
    for entry in fleet:
        hosts[entry["host"]] = hosts.get(entry["host"], 0) + 1
    return hosts


def _batches(summary):
    """A line for each batch, and a bar at the time when it ran."""
    batches = summary["batches"]
    if not batches:
        return ""
    timed = [batch for batch in batches if batch["seconds"] is not None]
    names = ["Batch", "Homes", "Verdicts", "Started", "Took"]
    table = _table("batches", names, [_batch_row(batch) for batch in batches])
    return "<h2>Batches</h2>\n" + _timeline(timed) + table


def _batch_row(batch):
    canary = " <small>canary</small>" if batch["batch"] == 1 and batch["homes"] == 1 else ""
    cells = [
        _cell("Batch", str(batch["batch"]) + canary, "short"),
        _cell("Homes", str(batch["homes"]), "short"),
        _cell("Verdicts", _counts(batch["counts"])),
        _cell("Started", _escaped(batch["started"] or "not known"), "short"),
        _cell("Took", _span(batch["seconds"]) or "not known", "short"),
    ]
    return "<tr>%s</tr>\n" % "".join(cells)


def _timeline(batches):
    if not batches:
        return ""
    first = min(moment(batch["started"]) for batch in batches)
    total = max(max(moment(batch["ended"]) for batch in batches) - first, 0.001)
    head = '<svg role="img" width="100%%" height="%d" aria-label="Timeline of the batches, %s">\n'
    bars = [_bar(batch, 40 * row, first, total) for row, batch in enumerate(batches)]
    return head % (40 * len(batches), _span(total)) + "".join(bars) + "</svg>\n"


def _bar(batch, top, first, total):
    kind = "failed" if any(KINDS.get(name, "bad") == "bad" for name in batch["counts"]) else "ok"
    start = 100 * (moment(batch["started"]) - first) / total
    width = "%.3f%%" % (100 * batch["seconds"] / total)
    # What takes no time is seen too: a mark of two pixels.
    shapes = [("rail", 0, "100%"), (kind, start, width), (kind, min(start, 99.5), "2")]
    text = '<text x="0" y="%d">batch %d: %s</text>\n' % (top + 15, batch["batch"], _span(batch["seconds"]))
    rect = '<rect class="%s" height="10" x="%.3f%%" y="' + str(top + 20) + '" width="%s"/>\n'
    return text + "".join(rect % shape for shape in shapes)


def _products(fleet):
    """On how many homes each product went from which level to which."""
    counts, names = {}, {}
    for entry in fleet:
        names.update({str(part.get("code", "")): part.get("name", "") for part in entry["components"]})
        for levels in levels_of(entry):
            counts[levels] = counts.get(levels, 0) + 1
    if not counts:
        return ""
    rows = [
        "<tr>%s%s%s</tr>\n"
        % (
            _cell("Product", "%s <small>%s</small>" % (_code(product), _escaped(names.get(product, "")))),
            _cell("Level", _level(before, now), "short"),
            _cell("Homes", str(number), "short"),
        )
        for (product, before, now), number in sorted(counts.items())
    ]
    return "<h2>Products and levels</h2>\n" + _table("products", ["Product", "Level", "Homes"], rows)


def _homes(fleet, anchors):
    """A line for each home; the anchor of one that is told above is there."""
    if not fleet:
        return ""
    names = ["Host", "Verdict", "Batch", "Levels", "Took"]
    return "<h2>All homes</h2>\n" + _table("homes", names, [_row(entry, anchors) for entry in fleet])


def _row(entry, anchors):
    levels = ["%s %s" % (_code(product), _level(before, now)) for product, before, now in levels_of(entry)]
    anchor = "" if entry["anchor"] in anchors else ' id="%s"' % entry["anchor"]
    cells = [
        _cell("Host", _named(entry)),
        _cell("Verdict", _verdict(entry), "short"),
        _cell("Batch", str(entry["batch"] or "–"), "short"),
        _cell("Levels", "<br>".join(levels) or "not known"),
        _cell("Took", _span(seconds_between(entry["started"], entry["ended"])) or "–", "short"),
    ]
    return "<tr%s>%s</tr>\n" % (anchor, "".join(cells))


def _named(entry):
    return "%s<br><small>%s</small>" % (_escaped(entry["host"]), _code(entry["home"]))
