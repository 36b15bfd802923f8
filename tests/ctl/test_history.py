"""history: the attempts to install patches, and what was taken back."""

import json

import pytest

from support import Patch

RULE = "#" * 80 + "\n"
HEADER = RULE + "# Norvik Veyra Monitoring Patch History File\n#\n# Format\n" + RULE


def line(name="first", *, product="kyn", target="vema", result="PASS", time="03/09/2026 14:05:00"):
    return f"{product} | lpp266 | {target} | {name:20} | {result} | root            | {time}\n"


@pytest.fixture
def lines(home):
    """lines(*lines) writes the history of the home."""
    return lambda *records: home.write("patchlogs/patches.hist", HEADER + "".join(records))


@pytest.fixture
def transaction(home):
    """transaction(id, started, ended, ...) writes the record of a transaction."""

    def write(
        identifier,
        started="2026-03-09T14:00:00Z",
        ended="2026-03-09T14:10:00Z",
        *,
        products=("kyn",),
        target="vema",
        verdict="applied",
        **more,
    ):
        record = {
            "id": identifier,
            "started": started,
            "ended": ended,
            "verdict": verdict,
            "patches": [{"product": product, "target": target} for product in products],
            **more,
        }
        home.mkdir(f"patchlogs/transactions/{identifier}", 0o700)
        home.write(f"patchlogs/transactions/{identifier}/record.json", json.dumps(record), 0o600)

    return write


def names(ctl, home, *words):
    return [record["name"] for record in ctl.document("history", home, *words)["records"]]


def test_a_home_without_history(ctl, home):
    assert ctl.document("history", home) == {"records": [], "foreign": []}
    assert ctl.run("history", home).out == b"No records.\n"


def test_what_the_installer_wrote(ctl, home, program, write):
    home.component("yn")
    patch = write(Patch("yn", level="06100001", name="a name | with a bar").file("bin/tool"))
    assert program.install(home, patch).status == 0
    assert (
        program.install(
            home,
            write(
                Patch("yn", fixpack="fp0009", level="06100002", name="bad").script(
                    "fail.sh", when="pre_patch", status=1
                )
            ),
        ).status
        == 22
    )
    date = home.read("patchlogs/patches.hist").decode().splitlines()[5].split(" | ")[-1]
    records = ctl.document("history", home)["records"]
    assert [(record["name"], record["result"]) for record in records] == [
        ("a name | with a bar", "PASS"),
        ("bad", "FAIL"),
    ]
    assert records[0]["product"] == "kyn"
    assert records[0]["platform"] == "lpp266"
    assert records[0]["target"] == "vema"
    assert records[0]["time"] == date
    assert records[0]["line"] == 6
    assert records[0]["transaction"] is None
    assert records[0]["undone"] is False


def test_filters(ctl, home, lines):
    lines(
        line("a"),
        line("b", product="kox", result="FAIL", time="03/10/2026 00:00:00"),
        line("c", product="KYN", result="FAIL", time="12/31/2026 23:59:59"),
        line("d", time=""),
    )
    assert names(ctl, home) == ["a", "b", "c", "d"]
    assert names(ctl, home, "--failed") == ["b", "c"]
    assert names(ctl, home, "--product", "kyn") == ["a", "c", "d"]
    assert names(ctl, home, "--product", "OX") == ["b"]
    assert names(ctl, home, "--since", "2026-03-10") == ["b", "c"]
    assert names(ctl, home, "--since", "2026-03-10", "--product", "yn", "--failed") == ["c"]


@pytest.mark.parametrize("day", ("yesterday", "2026-3-9", "2026-02-30", "2026-03-09 ", ""))
def test_what_is_no_day_is_a_wrong_usage(ctl, home, day):
    result = ctl.run("history", home, "--since", day)
    assert result.status == 2
    assert result.out == b""


def test_what_is_no_record_is_shown_with_its_line(ctl, home, lines):
    lines(line("a"), "edited by hand\n", "\n", line("b"))
    document = ctl.document("history", home)
    assert document["foreign"] == [{"line": 7, "text": "edited by hand"}]
    assert [record["line"] for record in document["records"]] == [6, 9]
    assert b"line 7 is no record: edited by hand\n" in ctl.run("history", home).out


def test_the_transaction_that_made_the_attempt(ctl, home, lines, transaction):
    lines(
        line("before", time="03/09/2026 13:59:59"),
        line("in it"),
        line("other product", product="kox"),
        line("other target", target="vems"),
        line("after", time="03/09/2026 14:10:01"),
    )
    transaction("20260309T140000Z-1")
    found = {
        record["name"]: record["transaction"] for record in ctl.document("history", home, env={"TZ": "UTC0"})["records"]
    }
    assert found == {
        "before": None,
        "in it": "20260309T140000Z-1",
        "other product": None,
        "other target": None,
        "after": None,
    }


def test_times_of_the_history_are_local(ctl, home, lines, transaction):
    lines(line("in it", time="03/09/2026 09:05:00"))
    transaction("one")
    zone = {"TZ": "EST5"}
    assert ctl.document("history", home, env=zone)["records"][0]["transaction"] == "one"
    assert ctl.document("history", home, env={"TZ": "UTC0"})["records"][0]["transaction"] is None


def test_a_transaction_that_was_killed_has_no_end(ctl, home, lines, transaction):
    lines(line("first"), line("second", time="03/09/2026 15:05:00"))
    transaction("killed", ended=None, verdict=None)
    transaction("again", started="2026-03-09T15:00:00Z", ended="2026-03-09T15:10:00Z")
    found = [record["transaction"] for record in ctl.document("history", home, env={"TZ": "UTC0"})["records"]]
    assert found == ["killed", "again"]


def test_what_was_taken_back(ctl, home, lines, transaction):
    lines(line("by itself"), line("later", time="03/09/2026 15:05:00"), line("not", time="03/09/2026 16:05:00"))
    transaction("one", verdict="undone")
    transaction("two", started="2026-03-09T15:00:00Z", ended="2026-03-09T15:10:00Z")
    transaction("three", started="2026-03-09T16:00:00Z", ended="2026-03-09T16:10:00Z")
    transaction("four", started="2026-03-09T17:00:00Z", ended="2026-03-09T17:10:00Z", verdict="undone", undoes="two")
    transaction("five", started="2026-03-09T18:00:00Z", ended="2026-03-09T18:10:00Z", verdict="failed", undoes="three")
    records = ctl.document("history", home, env={"TZ": "UTC0"})["records"]
    assert [record["undone"] for record in records] == [True, True, False]
    assert b"PASS, undone" in ctl.run("history", home, env={"TZ": "UTC0"}).out


@pytest.mark.parametrize(
    "content",
    (
        b"",
        b"{",
        b"[]",
        b'{"id": 5}',
        b'{"id": "a", "started": "now"}',
        b"\xff\xfe",
        b'{"id": "a", "started": "2026-03-09T14:00:00Z", "patches": 7}',
        b'{"id": "a", "started": "2026-03-09T14:00:00Z", "patches": [0, {"product": 1}]}',
    ),
)
def test_a_damaged_record_is_passed_over(ctl, home, lines, content):
    lines(line("in it"))
    home.write("patchlogs/transactions/a/record.json", content)
    assert ctl.document("history", home, env={"TZ": "UTC0"})["records"][0]["transaction"] is None


def test_a_history_that_cannot_be_read_cannot_be_judged(ctl, home):
    home.mkdir("patchlogs/patches.hist")
    result = ctl.run("history", home, "--json")
    assert (result.status, result.out) == (2, b"")
    assert b"patches.hist" in result.err


def test_control_characters_reach_no_terminal(ctl, home, lines):
    lines(line("\x1b]0;title\x07"), "\x1b[2J\n")
    assert b"\x1b" not in ctl.run("history", home).out
