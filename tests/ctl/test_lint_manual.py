"""The list of rules in the manual is the one that the program explains."""

import subprocess
from pathlib import Path

CHECKOUT = Path(__file__).resolve().parents[2]


def test_the_manual_lists_the_rules_of_the_program(ctl):
    made = subprocess.run(
        [CHECKOUT / "scripts/manual-rules", "--print", ctl.program.binary],
        check=True,
        text=True,
        stdout=subprocess.PIPE,
    ).stdout
    page = (CHECKOUT / "man/orvpatchctl.8").read_text(encoding="utf-8")
    listed = page.split('.\\" rules of lint', 1)[1].split("\n", 1)[1].split('.\\" end of the rules of lint', 1)[0]
    assert listed == made, "run: scripts/manual-rules build/dev/orvpatchctl"
    assert listed.count(".It Sy ") > 40
