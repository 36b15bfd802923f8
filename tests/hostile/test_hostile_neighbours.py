"""Another user of the host, who races a run of root for what it makes and moves. He may win none of the races."""

import os
import selectors
import stat
import subprocess
import time

import pytest

from rawarchive import RawArchive
from support import Patch, remove_tree
from verdicts import INSTALLED

pytestmark = pytest.mark.needs_root

NOBODY = 65534
RUNS = int(os.environ.get("ORVPATCH_NEIGHBOUR_RUNS", "10"))
COUNT = 200

# Puts a link in the place of each entry as soon as it is there. The order in which the run comes to the entries is
# known: it is that of the extracted directory.
FOLLOW = f"""
import ctypes, os, sys
extracted, target, aside, foreign = sys.argv[1:]
def listed(folder):
    try:
        return os.listdir(folder)
    except OSError:
        return []
def replace(name):
    while True:
        try:
            os.rename(f"{{target}}/{{name}}", f"{{target}}/old-{{name}}")
            break
        except OSError:
            pass
    os.symlink(foreign, f"{{target}}/{{name}}")
def exchange(name):
    link, entry = f"{{aside}}/{{name}}".encode(), f"{{target}}/{{name}}".encode()
    while renameat2(-100, link, -100, entry, 2) != 0:
        pass
renameat2 = ctypes.CDLL(None).renameat2
for number in range({COUNT}):
    os.symlink(foreign, f"{{aside}}/entry{{number:03}}")
print("begun", flush=True)
names = []
while len(names) < {COUNT}:
    names = max(listed(extracted), listed(target), key=len)
for name in names:
    METHOD(name)
    if name == names[0]:
        print("acted", flush=True)
"""
REPLACE = FOLLOW.replace("METHOD", "replace")  # quicker, where the name may be missing for a moment
EXCHANGE = FOLLOW.replace("METHOD", "exchange")  # in one step

# Takes the names of the files in the new directory before they come, with bits that are worth inheriting.
TAKE = f"""
import os, sys
target = sys.argv[2]
print("begun", flush=True)
names = [f"entry{{number:03}}" for number in range({COUNT})] + ["acted"]
while "acted" in names:
    for name in list(names):
        try:
            descriptor = os.open(f"{{target}}/{{name}}", os.O_CREAT | os.O_EXCL | os.O_WRONLY)
            os.fchmod(descriptor, 0o6777)
            os.close(descriptor)
            names.remove(name)
        except FileExistsError:
            names.remove(name)
        except OSError:
            break
print("acted", flush=True)
"""


class Neighbour:
    """A process of an ordinary user that goes on until it is stopped; it says when it begins and when it could act."""

    def __init__(self, script, *arguments):
        self._process = subprocess.Popen(
            ["/usr/bin/python3", "-c", script, *map(str, arguments)],
            cwd="/",
            user="nobody",
            group=NOBODY,
            extra_groups=[],
            stdin=subprocess.DEVNULL,
            stdout=subprocess.PIPE,
        )

    def __enter__(self):
        self.expect(b"begun\n")
        return self

    def expect(self, line, seconds=60):
        limit = time.monotonic() + seconds
        with selectors.DefaultSelector() as selector:
            selector.register(self._process.stdout, selectors.EVENT_READ)
            assert selector.select(limit - time.monotonic()), f"the neighbour does not say {line}"
        assert self._process.stdout.readline() == line

    def __exit__(self, *_):
        self._process.kill()
        self._process.wait()
        self._process.stdout.close()


def race(program, product, archive, script, foreign, is_open):
    """One run against one neighbour; how it ended. The neighbour must have been able to act in the end: all that the
    run has made is open to him then."""
    target = product.path / "new"
    if target.exists():
        remove_tree(target)
    if is_open:
        target.mkdir()
        target.chmod(0o777)
    aside = product.path / "aside"
    if aside.exists():
        remove_tree(aside)
    aside.mkdir()
    aside.chmod(0o777)
    with Neighbour(script, product.path / "tmp/kox/updated_files/new", target, aside, foreign) as neighbour:
        result = program.install(product, archive)
        neighbour.expect(b"acted\n")
    return result


def test_no_foreign_directory_is_opened_in_the_place_of_a_new_one(program, product, patch_dir, scratch):
    foreign = scratch / "foreign"
    foreign.mkdir()
    patch = RawArchive(Patch("ox"))
    for number in range(COUNT):
        patch.directory(f"updated_files/new/entry{number:03}")
    archive = patch.write(patch_dir)
    lost = 0
    for run in range(RUNS):
        foreign.chmod(0o700)
        race(program, product, archive, REPLACE, foreign, is_open=run % 2)
        lost += stat.S_IMODE(foreign.stat().st_mode) != 0o700
    assert lost == 0, f"{lost} of {RUNS} runs have opened a directory that they did not make"


def test_no_foreign_file_is_opened_in_the_place_of_a_moved_one(program, product, patch_dir, scratch):
    foreign = scratch / "foreign"
    foreign.write_text("secret\n")
    archive = many_files().write(patch_dir)
    lost = 0
    for run in range(RUNS):
        foreign.chmod(0o600)
        race(program, product, archive, EXCHANGE, foreign, is_open=run % 2)
        lost += stat.S_IMODE(foreign.stat().st_mode) != 0o600
    assert lost == 0, f"{lost} of {RUNS} runs have opened a file that they did not move"


def test_no_file_of_a_new_directory_takes_over_owner_and_mode_of_another_user(program, product, patch_dir, scratch):
    archive = many_files().write(patch_dir)
    lost = 0
    for _ in range(RUNS):
        result = race(program, product, archive, TAKE, scratch, is_open=False)
        entries = [path.stat() for path in (product.path / "new").glob("entry*")]
        attributes = {(entry.st_uid, stat.S_IMODE(entry.st_mode)) for entry in entries}
        lost += (result, len(entries), attributes) != (INSTALLED, COUNT, {(0, 0o755)})
    assert lost == 0, f"{lost} of {RUNS} runs have let another user in before the files were in place"


def many_files():
    patch = Patch("ox")
    for number in range(COUNT):
        patch.file(f"new/entry{number:03}")
    return patch
