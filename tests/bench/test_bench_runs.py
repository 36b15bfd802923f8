"""The benchmark runs to its end: on payloads of a few files, so that it is known to work when it is needed."""

import os
import re
import shutil
import subprocess
import sys
from pathlib import Path

import pytest

ROOT = Path(__file__).resolve().parents[2]
PAYLOADS = ["a", "b", "c", "d", "e", "s1", "s10"]
PEERS = {"tar -xf": "tar", "dpkg -i": "dpkg", "dpkg -i --force-unsafe-io": "dpkg", "rpm -U": "rpm", "rsync -a": "rsync"}
NEEDS_ROOT = ("dpkg", "rpm")


@pytest.fixture(scope="module")
def folder(tmp_path_factory):
    """Where the benchmark makes its temporary folders."""
    return tmp_path_factory.mktemp("bench")


@pytest.fixture(scope="module")
def printed(program, folder):
    """Every table that a run over all payloads prints, by its heading: contender -> the columns behind it."""
    done = subprocess.run(
        [sys.executable, ROOT / "bench/bench.py", "--tiny", "--rounds", "1", "--orvpatch", program.binary],
        env={**os.environ, "TMPDIR": str(folder)},
        capture_output=True,
        text=True,
        timeout=300,
        check=False,
    )
    assert done.returncode == 0, done.stderr
    return tables_of(done.stdout)


def tables_of(text):
    tables = {}
    rows = tables.setdefault("", {})
    for line in text.splitlines():
        if line.startswith("#"):
            rows = tables.setdefault(line.strip("# "), {})
        elif line.startswith("|") and not line.startswith("| ---"):
            name, *columns = [cell.strip() for cell in line.strip("|").split("|")]
            rows[name] = columns
    return tables


def payload_table(printed, key):
    return next(rows for heading, rows in printed.items() if heading.startswith(f"({key})"))


@pytest.mark.parametrize("key", PAYLOADS)
def test_tool_and_floor_are_measured_on_every_payload(printed, key):
    rows = payload_table(printed, key)
    for contender in ("orvpatch", "floor"):
        assert all(float(column) > 0 for column in rows[contender]), rows[contender]
    assert rows["floor"][1] == "1.00"  # CPU, of the floor's
    assert rows["orvpatch"][3] == "1.00"  # wall time, of orvpatch's


@pytest.mark.parametrize("key", ["a", "b", "c", "d"])
def test_every_peer_is_measured_or_said_to_be_absent(printed, key):
    rows = payload_table(printed, key)
    for peer, command in PEERS.items():
        if shutil.which(command) is None:
            assert rows[peer][0] == f"{command} is not installed"
        elif command in NEEDS_ROOT and os.geteuid() != 0:
            assert rows[peer][0] == "needs root"
        else:
            assert all(float(column) > 0 for column in rows[peer]), rows[peer]


def test_every_goal_is_told_met_or_missed(printed):
    goals = {name: columns for name, columns in printed["Goals"].items() if name != "goal"}
    assert len(goals) >= 10
    for limit, found, verdict in goals.values():
        assert re.fullmatch("met" if float(found) <= float(limit) else r"\*\*missed\*\* by \d+ %: .*", verdict)


def test_system_calls_are_counted(printed):
    counted = printed["System calls"]
    # One of each for every file of the six installations, none for the report.
    assert [float(column) for column in counted["link"]] == [1, 1, 1, 1, 0, 1, 1]
    for tool, floor in zip(counted["**orvpatch: all**"], counted["**floor: all**"]):
        assert float(tool) >= float(floor) > 0


def test_the_machine_is_described(printed):
    assert re.fullmatch(r"\d{4}-\d\d-\d\d", printed[""]["date"][0])
    assert printed[""]["file system"] and printed[""]["load before each run"]


def test_nothing_is_left_behind(printed, folder):
    assert printed and os.listdir(folder) == []
    assert str(folder) not in Path("/proc/mounts").read_text(encoding="utf-8")
