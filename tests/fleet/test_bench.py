"""bench/fleet measures a rollout over homes of this machine."""

import re
import subprocess
from pathlib import Path

import pytest

ROOT = Path(__file__).resolve().parents[2]


@pytest.mark.full
def test_a_small_measurement(program, ctl_binary):
    assert Path(ctl_binary).parent == program.binary.parent
    words = ["--homes", "2", "--forks", "2", "--megabytes", "0", "--programs", program.binary.parent]
    done = subprocess.run([ROOT / "bench/fleet", *words], capture_output=True, text=True, timeout=1200, check=False)
    assert done.returncode == 0, done.stderr
    rows = [line.strip("| \n").split(" | ") for line in done.stdout.splitlines()]
    measured = [row for row in rows if row[0] == "2"]
    assert [row[2] for row in measured] == ["check", "rollout", "second"]
    for row in measured:
        assert all(float(cell) > 0 for cell in row[3:11]), row
        assert int(row[9]) >= 2  # the first process and a worker
    assert re.search(r"^\| 5000 homes \| \d+ \|", done.stdout, re.M)
