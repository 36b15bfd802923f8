"""Power that fails at random moments of apply and undo: after the next start `undo` gives back the home.

In every run a few moments on ext4; ORVPATCH_FULL=1 takes 50 on each file system. ORVPATCH_SEED repeats the choice.
"""

import os
import random
import subprocess
import time

import pytest

from oracle import assert_taken_back, listing
from powerloss import MAKE, power_supply
from support import Patch, ProductHome

FULL = os.environ.get("ORVPATCH_FULL") == "1"
SEED = int(os.environ.get("ORVPATCH_SEED") or random.randrange(10**6))
MOMENTS = 50 if FULL else 4
A_RUN = 5  # moments of one run

pytestmark = [pytest.mark.needs_root]


def lay_out(point):
    home = ProductHome(point / "home")
    home.component("yn")
    (home.path / "tmp").chmod(0o700)
    for number in range(40):
        home.write(f"lib/{number}", f"old {number}\n" * 50, 0o640)
    home.detach()
    return home


def a_patch(folder):
    patch = Patch("yn").script("10_go.sh", when="post")
    for number in range(60):
        patch.file(f"lib/{number}" if number < 40 else f"fresh/{number % 5}/{number}", f"new {number}\n" * 50)
    return patch.write(folder)


class Trial:
    def __init__(self, ctl, supply, patch, rng):
        self.ctl, self.supply, self.patch, self.rng = ctl, supply, patch, rng
        with supply.mounted("image") as point:
            self.home = lay_out(point).path
            self.before = listing(self.home)
        supply.copy("image", "start")

    def command(self, name):
        words = ["apply", self.home, self.patch, "--yes"] if name == "apply" else ["undo", self.home]
        return [*self.ctl.program.argv, *map(str, words)]

    def install(self):
        """The start of an undo is a home with the patch."""
        self.supply.copy("start", "image")
        with self.supply.mounted("image"):
            subprocess.run(self.command("apply"), check=True, capture_output=True)
        self.supply.copy("image", "start")

    def copies(self, name, seconds, count):
        """Runs the command, and copies the image at random moments of it; names of the copies."""
        self.supply.copy("start", "image")
        moments = sorted(self.rng.uniform(0, seconds) for _ in range(count))
        with self.supply.mounted("image"):
            process = subprocess.Popen(self.command(name), stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
            began = time.monotonic()
            for number, moment in enumerate(moments):
                time.sleep(max(0, began + moment - time.monotonic()))
                if self.rng.random() < 0.3:  # the kernel writes when it wants to
                    subprocess.run(["sync", "-f", self.home], check=True)
                self.supply.copy("image", f"copy{number}")
            out = process.communicate(timeout=120)[0]
            assert process.returncode == 0, out
        return [f"copy{number}" for number in range(count)]

    def duration(self, name):
        self.supply.copy("start", "image")
        with self.supply.mounted("image"):
            began = time.monotonic()
            subprocess.run(self.command(name), check=True, capture_output=True)
            return time.monotonic() - began

    def judge(self, copy):
        """After the power is back; whether there was anything to take back."""
        with self.supply.mounted(copy):
            result = self.ctl.run("undo", self.home)
            undone = assert_taken_back(result, listing(self.home), self.before)
        self.supply.remove(copy)
        return undone


@pytest.mark.parametrize("name", ["apply", "undo"])
@pytest.mark.parametrize("kind", MAKE if FULL else ["ext4"])
def test_power_fails(ctl, patch_dir, kind, name):
    print(f"ORVPATCH_SEED={SEED}")
    with power_supply(kind) as supply:
        trial = Trial(ctl, supply, a_patch(patch_dir), random.Random(f"{SEED} {kind} {name}"))
        if name == "undo":
            trial.install()
        seconds, taken, undone = trial.duration(name), 0, 0
        while taken < MOMENTS:
            copies = trial.copies(name, seconds, min(A_RUN, MOMENTS - taken))
            taken += len(copies)
            undone += sum([trial.judge(copy) for copy in copies])
        print(f"{kind}, {name}: {taken} moments, {undone} of them with something to take back")
        assert undone or not FULL  # a few moments may all lie before the first change
