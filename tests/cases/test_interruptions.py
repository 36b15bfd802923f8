"""Signals that end the program, and room that ends, at the places that no repetition could make good."""

import os
import random
import signal
import subprocess
import time

import pytest

from support import Patch

ENDING = [signal.SIGINT, signal.SIGTERM, signal.SIGHUP, signal.SIGQUIT]
COUNT = 400
RUNS = 60


def patch_of(version):
    patch = Patch("ox", fixpack=f"fp000{version}")
    for number in range(COUNT):
        patch.file(f"lib/file{number:03}", f"version {version}\n")
    return patch


def start(site, archive):
    return subprocess.Popen(
        [*site.program.argv, "-h", site.home, "-i", archive],
        stdin=subprocess.DEVNULL,
        stdout=subprocess.DEVNULL,
        stderr=subprocess.DEVNULL,
        cwd="/",
        start_new_session=True,
        preexec_fn=lambda: [signal.signal(number, signal.SIG_DFL) for number in ENDING],
    )


def end(running):
    """Its status, when none of the programs that it has started is left either."""
    status = running.wait(timeout=60)
    limit = time.monotonic() + 60
    while time.monotonic() < limit:
        try:
            os.killpg(running.pid, 0)
        except ProcessLookupError:
            return status
        time.sleep(0.01)
    raise AssertionError("a program that the run has started does not end")


def attributes(path):
    status = path.stat()
    return (status.st_uid, status.st_gid, status.st_mode & 0o7777, status.st_nlink)


def test_a_signal_leaves_no_file_without_its_owner_and_mode(site):
    # The move is the longest step here; a signal that comes in it acts when the last file is in place.
    seed = random.randrange(1 << 32)
    print(f"seed {seed}")
    chance = random.Random(seed)
    site.home.component("ox")
    owner = (1234, 4321) if os.geteuid() == 0 else (os.geteuid(), os.getegid())
    files = [site.home.path / f"lib/file{number:03}" for number in range(COUNT)]
    for path in files:
        os.chown(site.home.write(path.relative_to(site.home.path), "version 0\n", 0o640), *owner)
    archives = [patch_of(version).write(site.patch_dir) for version in (1, 2)]
    before = time.monotonic()
    assert end(start(site, archives[1])) == 0
    duration = time.monotonic() - before
    ended, mixed = set(), []
    for run in range(RUNS):
        running = start(site, archives[run % 2])
        time.sleep(chance.uniform(0.1, 1.1) * duration)
        running.send_signal(chance.choice(ENDING))
        ended.add(end(running))
        assert {attributes(path) for path in files} == {(*owner, 0o640, 1)}
        if len({path.read_text() for path in files}) > 1:
            mixed.append(run)
    assert mixed == [], "signals have ended the move between two files"
    assert ended <= {0, *(-number for number in ENDING)} and len(ended) > 1


@pytest.mark.parametrize("first", [True, False], ids=["level first", "level last"])
def test_a_disk_that_is_full_leaves_a_usable_level(site, first):
    # As on a full disk, what goes beyond the limit cannot be written; the log stays far below it.
    limit = 256 * 1024
    version_file = site.home.component("ox")
    comments = "".join(f"# {number} {'x' * 8000}\n" for number in range(60))
    level = version_file.read_text()
    version_file.write_text(level + comments if first else comments + level)
    size = version_file.stat().st_size
    assert size > limit
    patch = Patch("ox").file("bin/tool")
    result = site.install(patch, wrapper=["prlimit", f"--fsize={limit}"])
    assert result == site.done()  # KEEP(version-write-true)
    assert len([line for line in site.logged("ERROR") if "Could not update VRMF" in str(line)]) == 1
    assert version_file.stat().st_size == size
    assert site.home.level("ox") == ("06100100" if first else "06100000")
    assert site.install(patch) == site.done()
    assert site.home.level("ox") == "06100100"
