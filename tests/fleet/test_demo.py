"""scripts/demo --fleet: its announcements, and that nothing is left of it."""

import os
import re
import subprocess

import pytest

from modules import COLLECTION

DEMO = COLLECTION.parents[2] / "scripts/demo"


@pytest.mark.full
def test_the_demo_of_the_fleet_ends_as_announced_and_leaves_nothing(program, ctl_binary, scratch):
    done = subprocess.run(
        [DEMO, "--fleet", program.binary],
        env={**os.environ, "TMPDIR": str(scratch)},
        stdin=subprocess.DEVNULL,
        capture_output=True,
        text=True,
        timeout=1200,
        check=False,
    )
    assert (done.returncode, done.stderr) == (0, "")
    assert done.stdout.endswith("\n== Everything went as announced\n")
    statuses = re.findall(r"^    \(exit status (\d+)\)$", done.stdout, re.M)
    assert statuses == ["0", "0", "0", "2", "0", "0", "0", "0", "0"]
    assert re.search(r"^    \S+/reports/fleet\.html$", done.stdout, re.M)
    assert list(scratch.iterdir()) == []
