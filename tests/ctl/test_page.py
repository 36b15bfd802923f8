"""record.html: one file that stands alone, in a real browser."""

import json
import os
import re
import stat
import unicodedata
from pathlib import Path

import pytest

ID = "20260309T140500Z-77"
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
]


def shown(text):
    """How a text stands on the page: the bytes of control characters made visible, a backslash as two."""
    return "".join(
        "".join(f"\\x{byte:02X}" for byte in c.encode())
        if unicodedata.category(c) in ("Cc", "Cf")
        else "\\\\"
        if c == "\\"
        else c
        for c in text
    )


def state(**changes):
    return {
        "type": 0o100000,
        "mode": "0644",
        "user": 0,
        "group": 0,
        "size": 3,
        "seconds": 1,
        "nanoseconds": 2,
        "device": 3,
        "inode": 4,
        **changes,
    }


def record_of(home, texts, **changes):
    """A record of an installation that failed; `texts` stand wherever something from outside may stand."""
    steps = [("take", 0.01), ("check", 0.5), ("save", 0.0), ("install", 12.25), ("verify", 0.75), ("start", 2.0)]
    patches = [
        {
            "file": f"{text}.tar",
            "sha256": "0" * 64,
            "product": text[:40],
            "target": "vema",
            "name": text,
            "levelBefore": "06.10.00.00",
            "levelAfter": "06.10.01.00",
            "result": "FAIL",
            "versionFile": "registry/ynlpp266.ver",
        }
        for text in texts[:3]
    ]
    files = [{"path": f"gone/{text}", "change": "new", "saved": "", "before": None, "after": None} for text in texts]
    files += [
        {"path": f"old/{text}", "change": "replaced", "saved": str(number), "before": state(), "after": None}
        for number, text in enumerate(texts)
        if len(text) < 200
    ]  # names that a file can have
    running = [{"product": "kyn", "name": text, "pid": "1", "user": text} for text in texts[:3]]
    return {
        "id": ID,
        "action": "apply",
        "undoes": None,
        "home": f"{home.path}/",
        "user": texts[0],
        "started": "2026-03-09T14:05:00Z",
        "ended": "2026-03-09T14:05:16Z",
        "verdict": "failed",
        "phase": "closed",
        "dryRun": False,
        "patches": patches,
        "findings": [
            {"rule": "odd-name", "severity": "warning", "patch": text, "where": text, "text": text, "remedy": text}
            for text in texts
        ],
        "steps": [
            {"step": step, "seconds": seconds, "result": "failed" if step == "install" else "ok"}
            for step, seconds in steps
        ],
        "files": files,
        "rewritten": [],
        "directories": [],
        "temporary": [],
        "setAside": [],
        "dependents": [],
        "otherChanges": texts,
        "instances": {"before": [], "after": running},
        "installer": {"status": 23, "stdout": "\n".join(texts), "stderr": "\n".join(texts)},
        "differences": [{"path": text, "kind": "missing", "text": text} for text in texts],
        "messages": texts,
        **changes,
    }


def save(home, folder, record):
    """Makes the saved files of a record, and the directories that they come from."""
    (folder / "before").mkdir()
    for file in record["files"]:
        if file["change"] == "replaced":
            (home.path / file["path"]).parent.mkdir(parents=True, exist_ok=True)
            (folder / "before" / file["saved"]).write_text("old", encoding="utf-8")


@pytest.fixture(name="page")
def page_fixture(ctl, home):
    """page(texts) makes the record, has it undone, and returns the page that it has then."""

    def make(texts, **changes):
        folder = home.path / "patchlogs/transactions" / ID
        folder.mkdir(parents=True)
        folder.parent.chmod(0o700)
        record = record_of(home, texts, **changes)
        save(home, folder, record)
        (folder / "record.json").write_text(json.dumps(record), encoding="utf-8")
        assert ctl.run("undo", home).status == 0
        return folder / "record.html"

    return make


def only_itself_was_asked_for(browser, path):
    """The answer to a later question comes behind what the page has asked for until then."""
    browser.run("new Promise(resolve => setTimeout(resolve, 300))")
    return browser.requests[:1] == [path.as_uri()] and set(browser.requests[1:]) <= {"data:,"}


def test_hostile_names_stay_text(page, browser):
    path = page(HOSTILE)
    browser.show(path)
    assert browser.run("[...new Set([...document.querySelectorAll('*')].map(e => e.localName))].sort()") == sorted(
        [
            "html",
            "head",
            "meta",
            "link",
            "title",
            "style",
            "body",
            "header",
            "h1",
            "p",
            "main",
            "dl",
            "dt",
            "dd",
            "h2",
            "h3",
            "table",
            "thead",
            "tbody",
            "tr",
            "th",
            "td",
            "code",
            "small",
            "br",
            "span",
            "svg",
            "text",
            "rect",
            "ul",
            "li",
            "pre",
        ]
    )
    assert browser.texts("h1") == ["undone"]
    assert browser.texts("ul.files li") == [shown(f"{place}/{text}") for place in ("gone", "old") for text in HOSTILE]
    assert browser.texts("pre") == ["".join(f"{shown(text)}\n" for text in HOSTILE)] * 2
    assert only_itself_was_asked_for(browser, path)
    assert browser.complaints == []


def test_the_page_asks_for_nothing(page, browser):
    path = page(["plain"])
    text = path.read_text(encoding="utf-8")
    browser.show(path)
    assert only_itself_was_asked_for(browser, path)
    assert browser.complaints == []
    assert not re.search(r"<script|@import|url\(|\bsrc=|https?:", text)
    assert "default-src 'none'" in text
    assert stat.S_IMODE(path.stat().st_mode) == 0o600


def test_the_verdict_comes_first_and_all_of_the_record_follows(page, browser):
    browser.show(page(["one", "two"]))
    assert browser.run("document.body.firstElementChild.firstElementChild.textContent") == "undone"
    assert browser.texts("h2") == [
        "Products",
        "Steps",
        "2 differences",
        "2 messages",
        "2 findings",
        "Instances",
        "4 files",
        "2 other changes",
        "Output of the installer",
        "Errors of the installer",
    ]
    cells = browser.run(
        "Object.fromEntries([...document.querySelector('table tbody tr').children]"
        ".map(cell => [cell.dataset.name, cell.textContent]))"
    )
    assert cells == {
        "Product": "one vema",
        "Patch": "oneone.tar" + "0" * 64,
        "Level": "06.10.00.00 → 06.10.01.00",
        "Result": "FAIL",
    }


def test_the_timeline_shows_each_step_where_and_as_long_as_it_ran(page, browser):
    browser.show(page(["one"]))
    total = 15.51
    assert browser.texts("svg text") == [
        "take  0.01 s",
        "check  0.50 s",
        "save  0.00 s",
        "install  12.25 s  failed",
        "verify  0.75 s",
        "start  2.00 s",
    ]
    bars = browser.run(
        """(() => {
        const whole = document.querySelector('svg').getBoundingClientRect();
        return [...document.querySelectorAll('svg rect.ok, svg rect.failed')]
            .filter(bar => bar.getAttribute('width') != '2')
            .map(bar => bar.getBoundingClientRect())
            .map(bar => [(bar.left - whole.left) / whole.width, bar.width / whole.width]); })()"""
    )
    begins = [0, 0.01, 0.51, 0.51, 12.76, 13.51]
    for (left, width), begin, seconds in zip(bars, begins, [0.01, 0.5, 0, 12.25, 0.75, 2.0], strict=True):
        assert left == pytest.approx(begin / total, abs=0.002)
        assert width == pytest.approx(seconds / total, abs=0.002)


@pytest.mark.parametrize("scheme", ["light", "dark"])
@pytest.mark.parametrize("width", [360, 1200])
def test_nothing_runs_out_of_the_window(page, browser, tmp_path, width, scheme):
    browser.show(page(["a-name-without-any-blank-" + "x" * 200, "lib/short", *HOSTILE]), width, scheme)
    assert browser.run("document.documentElement.scrollWidth") <= width
    folder = Path(os.environ.get("ORVPATCH_PICTURES") or tmp_path)
    browser.picture(folder / f"record-{width}-{scheme}.png")
    text, back = browser.brightness()
    assert (text < back) == (scheme == "light")
    assert abs(text - back) > 500


def test_paper_is_white_even_where_the_screen_is_dark(page, browser):
    browser.show(page(["one"]), scheme="dark", media="print")
    assert browser.run("getComputedStyle(document.body).backgroundColor") == "rgb(255, 255, 255)"


def test_long_lists_and_outputs_are_cut_and_say_so(page, browser):
    names = [f"file{number:05}" for number in range(3000)]
    output = "".join(f"line {number}\n" for number in range(20000))
    browser.show(
        page(
            ["one"],
            files=[{"path": name, "change": "new", "saved": "", "before": None, "after": None} for name in names],
            installer={"status": 0, "stdout": output, "stderr": ""},
        )
    )
    assert browser.texts("ul.files li") == names[:2000]
    assert "New (3000)" in browser.texts("h3")
    text = browser.texts("pre")[0]
    assert text.endswith("line 19999\n") and len(text) < 70000
    assert browser.texts("p.soft") == [
        "The first 2000; record.json has all.",
        "Commands of the patches, or others, did that; an undo leaves it.",
        "The end of it; record.json has all.",
    ]


def test_an_undo_has_a_page_of_its_own(page, home, browser):
    page(["one"])
    own = [path for path in (home.path / "patchlogs/transactions").iterdir() if path.name != ID]
    browser.show(own[0] / "record.html")
    assert browser.texts("h1") == ["undone"]
    assert ID in browser.texts("dd")


def test_a_page_that_cannot_be_written_is_told_in_the_record(ctl, home):
    folder = home.path / "patchlogs/transactions" / ID
    (folder / "record.html/kept").mkdir(parents=True)  # what is there cannot be replaced by a file
    folder.parent.chmod(0o700)
    record = record_of(home, ["one"], messages=[])
    save(home, folder, record)
    (folder / "record.json").write_text(json.dumps(record), encoding="utf-8")
    assert ctl.run("undo", home).status == 0
    record = json.loads((folder / "record.json").read_text(encoding="utf-8"))
    assert record["verdict"] == "undone"
    assert [message for message in record["messages"] if message.startswith("record.html cannot be written: ")]
