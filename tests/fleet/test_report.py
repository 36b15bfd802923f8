"""The report of a fleet: one HTML page that stands alone, in a real browser, and the same as JSON and CSV."""

import csv
import io
import json
import os
import random
import re
import stat
import sys
import unicodedata
from pathlib import Path

import jsonschema
import pytest

COLLECTION = Path(__file__).resolve().parents[2] / "fleet/orv/patch"
sys.path.insert(0, str(COLLECTION / "plugins"))

from module_utils.report import MEANINGS, as_csv, as_json, summary_of  # noqa: E402
from module_utils.report_page import as_page  # noqa: E402

HOSTILE = [
    "<script>console.error('ran')</script>",
    "<img src=x onerror=console.error(1)>",
    "a\"onload='x' b",
    "&lt;b&gt;",
    "</pre></main><h1>applied</h1>",
    "\x1b[31mred",
    "https://example.invalid/a.png",
    "\u202egnp.txt",
    "url(https://example.invalid/b)",
    "]]><!--",
    "=1+1",
    "line\nbreak",
    "\udcff",
]
# What is to be done comes first, then what did not happen, then what is good.
ORDER = [
    "failed",
    "incomplete",
    "refused",
    "running",
    "unreachable",
    "undone",
    "untouched",
    "checked",
    "applied",
    "unchanged",
]


def shown(text):
    """How a text stands on the page: the bytes of characters that are not seen made visible."""
    return "".join(
        "".join(f"\\x{byte:02X}" for byte in c.encode("utf-8", "surrogateescape"))
        if unicodedata.category(c) in ("Cc", "Cf", "Cs")
        else c
        for c in text
    )


def entry(host, verdict="applied", batch=1, **changes):
    """A home whose agent goes from 06.10.00.00 to 06.10.00.02 within ten seconds of its batch's minute."""
    reached = batch > 0
    after = "06.10.00.02" if verdict in ("applied", "unchanged") else "06.10.00.00"
    return {
        "host": host,
        "home": "/opt/orv",
        "batch": batch,
        "verdict": verdict,
        "reason": "",
        "started": f"2026-03-09T14:{batch:02}:00Z" if reached else None,
        "ended": f"2026-03-09T14:{batch:02}:10Z" if reached else None,
        "components": [{"code": "kyn", "name": "Application Servers", "level": after}],
        "levelsBefore": {"kyn": "06.10.00.00"},
        "levelsAfter": {"kyn": after},
        "transaction": "20260309T140500Z-77" if reached else None,
        "record": None,
        **changes,
    }


def record(text="status", **changes):
    """The record of an installation that failed; `text` stands wherever something from outside may stand."""
    return {
        "patches": [{"file": text, "levelBefore": text, "levelAfter": text, "result": "FAIL"}],
        "steps": [{"step": text, "seconds": 4.25, "result": text}],
        "findings": [{"rule": text, "severity": "error", "where": text, "text": text, "remedy": text}],
        "differences": [{"path": text, "kind": "missing", "text": text}],
        "messages": [text],
        "installer": {"status": 23, "stdout": f"out {text}", "stderr": f"err {text}"},
        **changes,
    }


def document(*fleet, **changes):
    return {
        "fleet": list(fleet),
        "patches": ["kyn_lpp266_vema_fp0002.tar"],
        "started": "2026-03-09T14:00:00Z",
        "ended": "2026-03-09T14:05:30Z",
        **changes,
    }


def a_stopped_rollout():
    """Eight homes: the canary went through, one of the second batch failed, one was lost."""
    return document(
        *(entry(f"web{number}", "untouched", 0) for number in range(5, 9)),
        entry("web1"),
        entry("web4", "unreachable", 2, reason="Connection timed out"),
        entry("web3", "failed", 2, reason="status 23: Bad return code", record=record("convert.sh")),
        entry("web2", "applied", 2),
    )


def hostile():
    fleet = [
        entry(text, ORDER[place % 3], 1, home=text, reason=text, record=record(text), transaction=text)
        for place, text in enumerate(HOSTILE)
    ]
    fleet[0]["levelsBefore"] = {text: text for text in HOSTILE}
    fleet[0]["components"] = [{"code": text, "name": text, "level": text} for text in HOSTILE]
    fleet[1]["verdict"] = HOSTILE[0]
    return document(*fleet, patches=HOSTILE, started=HOSTILE[0], ended=HOSTILE[1])


@pytest.fixture(name="shows")
def shows_fixture(browser, tmp_path):
    """shows(document) loads its page and returns the file."""

    def show(content, **options):
        path = tmp_path / "fleet.html"
        path.write_text(as_page(content), encoding="utf-8")
        browser.show(path, **options)
        return path

    return show


# --- the page --------------------------------------------------------------------------------------------------


def test_hostile_names_stay_text(shows, browser):
    path = shows(hostile())
    names = browser.run("[...new Set([...document.querySelectorAll('*')].map(e => e.localName))].sort()")
    assert names == sorted(
        """html head meta link title style body header main article h1 h2 h3 h4 p dl dt dd br code span small
           ul li a pre svg text rect table thead tbody tr th td""".split()
    )
    assert browser.texts("h1") == ["stopped"]
    assert sorted(browser.texts("p.reason")) == sorted(shown(text).replace("\\x0A", "") for text in HOSTILE)
    assert sorted(browser.texts("table.homes td small")) == sorted(map(shown, HOSTILE))
    assert browser.texts("dd")[0] == "".join(map(shown, HOSTILE))
    attributes = browser.run(
        "[...document.querySelectorAll('body *')].flatMap(e => [...e.attributes].map(a => a.name))"
    )
    assert not [name for name in attributes if name.startswith("on") or name == "src"]
    assert browser.requests == [path.as_uri(), "data:,"][: len(browser.requests)]
    assert browser.complaints == []


def test_the_page_asks_for_nothing(shows, browser):
    text = shows(a_stopped_rollout()).read_text(encoding="utf-8")
    assert browser.complaints == []
    assert not re.search(r"<script|@import|url\(|\bsrc=|https?:", text)
    assert "default-src 'none'" in text
    assert browser.run("[...document.links].every(a => a.getAttribute('href').startsWith('#'))")
    assert browser.run("[...document.links].every(a => document.querySelector(a.getAttribute('href')))")
    assert (
        browser.run("(ids => ids.length - new Set(ids).size)([...document.querySelectorAll('[id]')].map(e => e.id))")
        == 0
    )


def test_the_failed_ones_come_first_with_reason_and_record(shows, browser):
    shows(a_stopped_rollout())
    assert browser.texts("h1") == ["stopped"]
    assert browser.texts("header p")[1] == "8 homes on 8 hosts: 1 failed, 1 unreachable, 4 untouched, 2 applied"
    assert browser.texts("h2") == [
        "2 homes to look at",
        "Homes by verdict",
        "Batches",
        "Products and levels",
        "All homes",
    ]
    assert browser.texts("article h3") == ["web3 /opt/orv", "web4 /opt/orv"]
    assert browser.texts("article p.reason") == ["status 23: Bad return code", "Connection timed out"]
    assert browser.texts("article:first-of-type h4") == [
        "Patches",
        "Steps",
        "Differences",
        "Messages",
        "Findings",
        "Errors of the installer",
        "Output of the installer",
    ]
    assert browser.texts("article pre") == ["err convert.sh", "out convert.sh"]
    assert "installer: status 23" in browser.texts("article li")


def test_a_tile_for_each_home_by_verdict(shows, browser):
    fleet = [entry(f"host{number}", verdict) for number, verdict in enumerate(ORDER)]
    random.Random(7).shuffle(fleet)
    shows(document(*fleet))
    assert browser.texts("h2 ~ h3") == [f"{verdict} 1" for verdict in ORDER]
    tiles = browser.texts("ul.tiles a span:last-child")
    assert tiles == [f"host{number}" for number in range(len(ORDER))]


def test_of_a_host_with_several_homes_each_tile_names_the_home(shows, browser):
    shows(document(entry("one", home="/opt/a"), entry("one", home="/opt/b"), entry("two", home="/opt/a")))
    assert browser.texts("ul.tiles a span:last-child") == ["one /opt/a", "one /opt/b", "two"]
    assert browser.texts("header p")[1] == "3 homes on 2 hosts: 3 applied"


def test_a_batch_stands_where_and_as_long_as_it_ran(shows, browser):
    shows(a_stopped_rollout())
    assert browser.texts("svg text") == ["batch 1: 10 s", "batch 2: 10 s"]
    bars = browser.run(
        """(() => {
        const whole = document.querySelector('svg').getBoundingClientRect();
        return [...document.querySelectorAll('svg rect.ok, svg rect.failed')]
            .filter(bar => bar.getAttribute('width') != '2')
            .map(bar => [bar, bar.getBoundingClientRect()])
            .map(([bar, at]) => [bar.className.baseVal, (at.left - whole.left) / whole.width,
                                 at.width / whole.width]); })()"""
    )
    assert [bar[0] for bar in bars] == ["ok", "failed"]
    for (_, left, width), begin in zip(bars, [0, 60], strict=True):  # 14:01:00 to 14:02:10 is the whole
        assert left == pytest.approx(begin / 70, abs=0.002)
        assert width == pytest.approx(10 / 70, abs=0.002)
    rows = browser.texts("table.batches tbody td")
    assert rows[:5] == ["1 canary", "1", "1 applied", "2026-03-09T14:01:00Z", "10 s"]
    assert rows[5:8] == ["2", "3", "1 failed, 1 unreachable, 1 applied"]


def test_products_are_counted_by_their_levels(shows, browser):
    shows(a_stopped_rollout())
    assert browser.texts("table.products tbody td") == [
        *("kyn Application Servers", "06.10.00.00", "6"),
        *("kyn Application Servers", "06.10.00.00 → 06.10.00.02", "2"),
    ]


@pytest.mark.parametrize("scheme", ["light", "dark"])
@pytest.mark.parametrize("width", [360, 1200])
def test_nothing_runs_out_of_the_window(shows, browser, tmp_path, width, scheme):
    content = hostile()
    content["fleet"].append(entry("a-name-without-any-blank-" + "x" * 200, "failed", 2, reason="y" * 500))
    shows(content, width=width, scheme=scheme)
    folder = Path(os.environ.get("ORVPATCH_PICTURES") or tmp_path)
    browser.picture(folder / f"fleet-{width}-{scheme}.png")
    assert browser.run("document.documentElement.scrollWidth") <= width
    text, back = browser.brightness()
    assert (text < back) == (scheme == "light")
    assert abs(text - back) > 500


def test_paper_is_white_even_where_the_screen_is_dark(shows, browser):
    shows(a_stopped_rollout(), scheme="dark", media="print")
    assert browser.run("getComputedStyle(document.body).backgroundColor") == "rgb(255, 255, 255)"


def test_what_is_too_long_is_cut_and_says_so(shows, browser):
    output = "".join(f"line {number}\n" for number in range(20000))
    whole = record(installer={"status": 1, "stdout": output, "stderr": ""}, messages=[f"m{n}" for n in range(300)])
    shows(document(*(entry(f"host{number:03}", "failed", record=whole) for number in range(150))))
    assert len(browser.texts("article")) == 100
    assert len(browser.texts("ul.tiles li")) == len(browser.texts("table.homes tbody tr")) == 150
    assert "The first 100; the JSON document has all." in browser.texts("p.soft")
    assert "The end of it; the JSON document has all." in browser.texts("article:first-of-type p.soft")
    assert "100 more; the JSON document has all." in browser.texts("article:first-of-type li.soft")
    assert browser.texts("pre")[0].endswith("line 19999\n")
    assert len(browser.texts("pre")[0]) <= 16 * 1024


def test_five_thousand_homes_are_one_page(shows, browser):
    path = shows(document(*(entry(f"host{number:04}", batch=number % 3 + 1) for number in range(5000))))
    assert len(browser.texts("ul.tiles li")) == 5000
    assert browser.texts("header p")[1] == "5000 homes on 5000 hosts: 5000 applied"
    assert path.stat().st_size < 4 << 20


MADE_UP = [7, "text", ["list"], {"a": {"b": []}}, [None], True]


@pytest.mark.parametrize("value", MADE_UP, ids=repr)
def test_what_a_host_makes_up_spoils_no_report(value):
    """A host sends what it likes: the others of the fleet are told all the same."""
    fields = ["components", "levelsBefore", "levelsAfter", "transaction", "record", "reason", "started", "batch"]
    broken = [{**entry(name, "failed"), name: value} for name in fields]
    broken += [entry(f"r-{name}", "failed", record=record(**{name: value})) for name in record()]
    broken += [entry("component", components=[{"code": value, "level": value}])]
    content = document(entry("good"), *broken)
    for text in (as_page(content), as_json(content), as_csv(content)):
        assert all(one["host"] in text for one in content["fleet"])


# --- the verdict of the whole ----------------------------------------------------------------------------------


@pytest.mark.parametrize(
    "found, verdict",
    [
        ("", "empty"),
        ("applied applied", "applied"),
        ("applied unchanged", "applied"),
        ("unchanged", "unchanged"),
        ("checked checked", "checked"),
        ("checked unchanged", "checked"),
        ("undone undone", "undone"),
        ("undone unchanged", "undone"),
        ("refused running", "stopped"),
        ("checked refused", "refused"),
        ("untouched refused unreachable", "refused"),
        ("applied refused", "stopped"),
        ("applied failed untouched", "stopped"),
        ("applied undone untouched", "stopped"),
        ("unreachable", "stopped"),
        ("incomplete", "stopped"),
        ("applied untouched", "unfinished"),
        ("untouched", "unfinished"),
        ("applied surprise", "stopped"),
    ],
)
def test_verdict_of_the_whole(found, verdict):
    fleet = [entry(f"host{place}", word) for place, word in enumerate(found.split())]
    assert summary_of(document(*fleet))["verdict"] == verdict


@pytest.mark.parametrize(
    "found, verdict",
    [
        ("undone undone", "stopped"),
        ("undone unchanged", "stopped"),
        ("unchanged unchanged", "unchanged"),
        ("", "empty"),
    ],
)
def test_a_rollout_that_was_taken_back_is_no_good_end(shows, browser, found, verdict):
    fleet = [entry(f"host{place}", word) for place, word in enumerate(found.split())]
    content = document(*fleet, rollout=True)
    assert json.loads(as_json(content))["rollout"] is True
    shows(content)
    assert browser.texts("h1") == [verdict]
    assert browser.run("document.querySelector('header').className") == ("good" if verdict == "unchanged" else "bad")


def test_an_undo_that_finds_some_homes_without_the_patches_is_a_good_end(shows, browser):
    shows(document(entry("one", "undone"), entry("two", "unchanged")))
    assert browser.texts("h1") == ["undone"]
    assert browser.run("document.querySelector('header').className") == "good"


def test_what_was_only_read_is_not_told_to_have_patches(shows, browser):
    """Check, undo and report leave a home unchanged, too."""
    shows(document(entry("one", "unchanged", 0), patches=[]))
    assert browser.texts("header p")[0] == "Nothing was changed on any home."
    assert "patches" not in MEANINGS["unchanged"]


def test_the_batches_of_the_summary():
    summary = summary_of(a_stopped_rollout())
    assert summary["counts"] == {"failed": 1, "unreachable": 1, "untouched": 4, "applied": 2}
    assert summary["seconds"] == 330
    assert [(batch["batch"], batch["homes"], batch["seconds"]) for batch in summary["batches"]] == [
        (1, 1, 10),
        (2, 3, 10),
    ]


@pytest.mark.parametrize(
    "started, ended, seconds",
    [
        ("2026-03-09T14:00:00Z", "2026-03-09T14:00:01.500Z", 1.5),
        ("2026-03-09T14:00:00+02:00", "2026-03-09T12:00:03Z", 3),
        ("2026-03-09T14:00:00.1234567Z", "2026-03-09T14:00:01.123456Z", 1),
        ("2026-03-09T14:00:05Z", "2026-03-09T14:00:00Z", 0),
        ("2026-02-30T14:00:00Z", "2026-03-09T14:00:00Z", None),
        (None, "2026-03-09T14:00:00Z", None),
        ("yesterday", "today", None),
    ],
)
def test_durations(started, ended, seconds):
    assert summary_of(document(started=started, ended=ended))["seconds"] == seconds


# --- JSON and CSV ----------------------------------------------------------------------------------------------


@pytest.mark.parametrize("content", [a_stopped_rollout(), hostile(), document(), document({"host": "bare"})])
def test_the_json_document_has_all_in_order(content):
    whole = json.loads(as_json(content))
    schema = json.loads((COLLECTION / "docs/report.schema.json").read_text(encoding="utf-8"))
    jsonschema.Draft7Validator(schema).validate(whole)
    assert sorted(map(repr, (one["host"] for one in whole["fleet"]))) == sorted(
        map(repr, (one["host"] for one in content["fleet"]))
    )
    given = {one["host"]: one for one in content["fleet"]}
    for one in whole["fleet"]:
        wanted = {name: value for name, value in given[one["host"]].items() if value is not None}
        assert {name: one[name] for name in wanted} == wanted
    places = [ORDER.index(one["verdict"]) for one in whole["fleet"] if one["verdict"] in ORDER]
    assert places == sorted(places)


def lines_of(content):
    return list(csv.DictReader(io.StringIO(as_csv(content), newline="")))


def test_the_table_has_a_line_for_each_product():
    levels = {"kum": "06.10.00.00", "kyn": "06.10.00.00"}
    content = document(
        entry("two", levelsBefore=levels, levelsAfter={**levels, "kyn": "06.10.00.02"}),
        entry("none", "unreachable", 0, levelsBefore=None, levelsAfter=None, components=None),
    )
    keys = ("host", "verdict", "product", "level_before", "level_after", "seconds")
    assert [tuple(line[key] for key in keys) for line in lines_of(content)] == [
        ("none", "unreachable", "", "", "", ""),
        ("two", "applied", "kum", "06.10.00.00", "06.10.00.00", "10.0"),
        ("two", "applied", "kyn", "06.10.00.00", "06.10.00.02", "10.0"),
    ]


def test_no_cell_of_the_table_is_a_formula_or_breaks_a_line():
    texts = [*HOSTILE, "+1", "-1", "@sum(a1)", "\t=1", '"quoted", comma']
    content = document(*(entry(text, reason=text) for text in texts))
    lines = lines_of(content)
    assert sorted(line["reason"] for line in lines) == sorted(
        f"'{text}" if text[0] in "=+-@" else shown(text) for text in texts
    )
    assert len(as_csv(content).split("\r\n")) == len(texts) + 2
    assert not [line for line in lines for cell in line.values() if cell.startswith(("=", "+", "-", "@", "\t"))]


# --- the module ------------------------------------------------------------------------------------------------


@pytest.fixture(name="write")
def write_fixture(controller, tmp_path):
    """write(content) runs the module on this machine and returns what it answers."""

    def write(content, *options, status=0, **changes):
        arguments = json.dumps({"document": content, "dest": str(tmp_path / "a/b"), **changes})
        return controller.module("localhost", "orv.patch.report", arguments, *options, status=status)

    return write


def test_the_module_writes_what_is_new(write, tmp_path):
    folder = tmp_path / "a/b"
    answer = write(a_stopped_rollout(), "--check")
    assert answer["changed"] and not folder.exists()
    answer = write(a_stopped_rollout())
    assert answer["changed"] and answer["summary"]["verdict"] == "stopped"
    assert answer["paths"] == {kind: str(folder / f"fleet.{kind}") for kind in ("html", "json", "csv")}
    contents = {kind: (folder / f"fleet.{kind}").read_bytes().decode() for kind in ("html", "json", "csv")}
    assert contents == {
        "html": as_page(a_stopped_rollout()),
        "json": as_json(a_stopped_rollout()),
        "csv": as_csv(a_stopped_rollout()),
    }
    assert {stat.S_IMODE(path.stat().st_mode) for path in folder.iterdir()} == {0o600}
    assert not write(a_stopped_rollout())["changed"]
    assert write(document(entry("other")), formats=["csv"])["paths"] == {"csv": str(folder / "fleet.csv")}
    assert json.loads((folder / "fleet.json").read_text())["summary"]["verdict"] == "stopped"


def test_others_can_read_the_report_at_no_moment(part, tmp_path, monkeypatch):
    """Whatever the umask: what is renamed is private already, and lies in the same directory."""
    path, seen = tmp_path / "fleet.html", []
    rename = os.rename
    path.write_text("before\n")
    path.chmod(0o644)

    def watch(source, target):
        seen.append((os.path.dirname(source), stat.S_IMODE(os.stat(source).st_mode), target))
        rename(source, target)

    monkeypatch.setattr(os, "rename", watch)
    kept = os.umask(0)
    try:
        part("modules.report").replace(str(path), b"new")
    finally:
        os.umask(kept)
    assert seen == [(str(tmp_path), 0o600, str(path))]
    assert (path.read_bytes(), stat.S_IMODE(path.stat().st_mode)) == (b"new", 0o600)


def test_a_report_that_cannot_be_written_leaves_nothing(write, tmp_path):
    (tmp_path / "a/b/fleet.html").mkdir(parents=True)
    assert "the report cannot be written" in write(a_stopped_rollout(), status=2)["msg"]
    assert [path.name for path in (tmp_path / "a/b").iterdir()] == ["fleet.html"]


@pytest.mark.parametrize("name", ["../x", "", "..", "a/b"])
def test_a_name_with_a_directory_is_refused(write, tmp_path, name):
    assert "name must be" in write(document(), status=2, name=name)["msg"]
    assert not (tmp_path / "a").exists()


def test_a_folder_that_cannot_be_made_is_told(write, tmp_path):
    (tmp_path / "a").write_text("a file\n")
    assert "the report cannot be written" in write(document(), status=2)["msg"]
