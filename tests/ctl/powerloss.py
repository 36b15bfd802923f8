"""A file system that loses its power: an image on loop, copied while it is written to.

The image lies on a file system that copies by reference, so that a copy is that of one moment: what the kernel has
written until then, and nothing of what it still holds in memory.
"""

import contextlib
import ctypes
import os
import shutil
import subprocess
import tempfile
from pathlib import Path

import pytest

from support.scratch import remove_tree, scratch_folder

MAKE = {"ext4": ["mkfs.ext4", "-q", "-F"], "xfs": ["mkfs.xfs", "-q", "-f"], "btrfs": ["mkfs.btrfs", "-q", "-f"]}
_MEBIBYTES = 384  # xfs takes no fewer than 300
_OUTER = 4096
_NEW_MOUNTS = 0x20000  # CLONE_NEWNS


def _run(*words):
    subprocess.run([os.fspath(word) for word in words], check=True, stdout=subprocess.DEVNULL, stderr=subprocess.PIPE)


def _sparse(path, mebibytes):
    with open(path, "wb") as file:
        file.truncate(mebibytes << 20)


class PowerSupply:
    """`point` is where the file system is mounted; copies are those of one moment, and bear a name."""

    def __init__(self, folder, point, kind):
        self.folder, self.point, self.kind = folder, point, kind
        _sparse(self.at("image"), _MEBIBYTES)
        _run(*MAKE[kind], self.at("image"))

    def at(self, name):
        return self.folder / name

    def copy(self, source, target):
        _run("cp", "--reflink=always", self.at(source), self.at(target))

    def remove(self, name):
        self.at(name).unlink()

    @contextlib.contextmanager
    def mounted(self, name):
        """The copy as after the next start of the system."""
        _run("mount", "-o", "loop", self.at(name), self.point)
        try:
            yield self.point
        finally:
            _run("umount", self.point)


@contextlib.contextmanager
def private_mounts():
    """What is mounted meanwhile is seen by this process and its children alone: the copy of a mount in another
    name space would keep it busy. Skips where that is not allowed."""
    here, before = os.getcwd(), os.open("/proc/thread-self/ns/mnt", os.O_RDONLY | os.O_CLOEXEC)
    library = ctypes.CDLL(None, use_errno=True)
    try:
        if library.unshare(_NEW_MOUNTS) != 0:
            pytest.skip(f"no mounts of its own: {os.strerror(ctypes.get_errno())}")
        try:
            _run("mount", "--make-rprivate", "/")
            yield
        finally:
            assert library.setns(before, _NEW_MOUNTS) == 0
            os.chdir(here)
    finally:
        os.close(before)


@contextlib.contextmanager
def power_supply(kind):
    """Skips where it cannot be made: for ordinary users, in a container, without the programs."""
    for program in ("mkfs.btrfs", MAKE[kind][0]):
        if shutil.which(program) is None:
            pytest.skip(f"{program} is not installed")
    memory = "/dev/shm" if _has_room("/dev/shm") else None
    with contextlib.ExitStack() as stack:
        stack.enter_context(private_mounts())
        top = scratch_folder()
        stack.callback(remove_tree, top)
        image = (top if memory is None else stack.enter_context(_temporary(memory))) / "outer"
        folder, point = top / "outer", top / "mounted"
        folder.mkdir()
        point.mkdir()
        _sparse(image, _OUTER)
        try:
            _run("mkfs.btrfs", "-q", "-f", image)
            _run("mount", "-o", "loop", image, folder)
        except subprocess.CalledProcessError as error:
            pytest.skip(f"cannot mount here: {error.stderr.decode().strip()}")
        stack.callback(_run, "umount", folder)
        yield PowerSupply(folder, point, kind)


def _has_room(folder):
    """Whether the images fit: a container may have given its memory file system few MiB."""
    return os.path.isdir(folder) and shutil.disk_usage(folder).free > _OUTER << 20


@contextlib.contextmanager
def _temporary(parent):
    with tempfile.TemporaryDirectory(prefix="orvpatch-", dir=parent) as folder:
        yield Path(folder)
