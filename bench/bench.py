"""Measures orvpatch beside the floor of its design and beside common packagers.

Every payload is installed by all contenders in turn, in several rounds, each time into a fresh copy of the same
home in memory. The tables go to standard output, as in docs/performance.md, and progress to standard error.
"""

import argparse
import datetime
import os
import platform
import signal
import subprocess
import sys
import tempfile
from pathlib import Path

ROOT = Path(__file__).resolve().parents[1]
sys.path.insert(0, str(ROOT / "tests"))  # the sample home and the patch builder are those of the tests

import picture  # noqa: E402
from companion import companion_goals, companion_table  # noqa: E402
from measure import Meter  # noqa: E402
from memoryfs import memory_folder  # noqa: E402
from payloads import PAYLOADS  # noqa: E402
from rounds import Bench  # noqa: E402
from tables import goals_table, growth_table, system_call_table, table, trial_table  # noqa: E402

DOCUMENT = ROOT / "docs/performance.md"
MARK = "<!-- below: what scripts/bench --write has put here -->\n"
GROWTH = ("s1", "s10", "c")
COMPANION = ("a", "c")
PROGRAMS = ("cc", "tar", "dpkg", "rpm", "rsync")


def arguments():
    parser = argparse.ArgumentParser(description=__doc__.split("\n\n", maxsplit=1)[0])
    keys = [payload.key for payload in PAYLOADS]
    parser.add_argument("--payloads", default=",".join(keys), metavar="KEYS", help="only these, of %(default)s")
    parser.add_argument("--rounds", type=int, default=7, help="default: %(default)s")
    parser.add_argument("--tiny", action="store_true", help="payloads of a few files: shows only that all of it runs")
    parser.add_argument("--orvpatch", type=Path, default=ROOT / "build/release/orvpatch", help="default: %(default)s")
    parser.add_argument("--companion", action="store_true", help="measure orvpatchctl alone")
    parser.add_argument("--write", action="store_true", help="put the tables into docs/performance.md too")
    chosen = parser.parse_args()
    unknown = set(chosen.payloads.split(",")) - set(keys)
    if unknown or chosen.rounds < 1:
        parser.error(f"no such payload: {', '.join(sorted(unknown))}" if unknown else "no rounds")
    if not os.access(chosen.orvpatch, os.X_OK):
        parser.error(f"{chosen.orvpatch} has not been built")
    return chosen


def chosen_payloads(chosen):
    payloads = [payload for payload in PAYLOADS if payload.key in chosen.payloads.split(",")]
    return [payload.tiny() for payload in payloads] if chosen.tiny else payloads


def conditions(file_system, bench, rounds):
    """The conditions of the measurement, as the first table."""
    model = next(
        (
            line.split(":")[1].strip()
            for line in Path("/proc/cpuinfo").read_text().splitlines()
            if line.startswith(("model name", "cpu\t"))
        ),
        platform.machine(),
    )
    rows = [
        ("date", f"{datetime.date.today()}"),
        ("processor", f"{os.cpu_count()} x {model}"),
        ("kernel", f"{platform.system()} {platform.release()}"),
        ("file system", file_system),
        ("rounds", rounds),
        ("load before each run", f"{min(bench.loads):.2f} to {max(bench.loads):.2f}" if bench.loads else "unknown"),
        *((program, version_of(program)) for program in PROGRAMS),
    ]
    return "".join(f"| {name} | {value} |\n" for name, value in [("", ""), ("---", "---"), *rows])


def version_of(program):
    try:
        shown = subprocess.run([program, "--version"], capture_output=True, text=True, check=True).stdout
    except (OSError, subprocess.CalledProcessError):
        return "not installed"
    return shown.splitlines()[0]


def all_tables(first_table, trials):
    growth = [trials[key] for key in GROWTH if key in trials]
    return "\n".join(
        [
            first_table,
            f"### Goals\n\n{goals_table(trials)}",
            *map(trial_table, trials.values()),
            f"### System calls\n\n{system_call_table(list(trials.values()))}",
            *([f"### Growth\n\n{growth_table(growth)}"] if growth else []),
        ]
    )


def companion_tables(trials):
    if not trials:
        return ""
    rows = [goal.row() for goal in companion_goals(trials)]
    return "\n".join(
        [
            f"### Goals of orvpatchctl\n\n{table(['goal', 'at most', 'found', ''], rows)}",
            *map(companion_table, trials.values()),
        ]
    )


def write_into_document(tables):
    head = DOCUMENT.read_text(encoding="utf-8").partition(MARK)[0]
    DOCUMENT.write_text(f"{head}{MARK}\n{tables}", encoding="utf-8")


def progress(text):
    print(f"bench: {text}", file=sys.stderr)


def main():
    chosen = arguments()
    signal.signal(signal.SIGTERM, lambda *_: sys.exit("ended by SIGTERM"))  # through the clean-up below
    with memory_folder(256 if chosen.tiny else 4096) as (folder, file_system):
        progress(f"in memory: {file_system}")
        tempfile.tempdir = str(folder)
        bench = Bench(chosen.orvpatch.absolute(), folder, Meter(folder))
        payloads = chosen_payloads(chosen)
        trials = {
            payload.key: bench.trial(payload, chosen.rounds, progress) for payload in payloads if not chosen.companion
        }
        companions = {
            payload.key: bench.companion_trial(payload, chosen.rounds, progress)
            for payload in payloads
            if payload.key in COMPANION
        }
    first = conditions(file_system, bench, chosen.rounds)
    tables = "\n".join(
        filter(None, [first if chosen.companion else all_tables(first, trials), companion_tables(companions)])
    )
    print(tables, end="")
    if chosen.write:
        write_into_document(tables)
        if f"### {picture.PAYLOAD}" in tables:
            picture.main([])


if __name__ == "__main__":
    main()
