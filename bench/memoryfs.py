"""A folder in memory to measure in, so that no disk affects the figures."""

import contextlib
import os
import shutil
import subprocess
import tempfile
from pathlib import Path

SHARED_MEMORY = Path("/dev/shm")


@contextlib.contextmanager
def memory_folder(mebibytes):
    """Gives (folder, what kind of file system it is on). As root an ext4 image on loop within a tmpfs: a real
    file system, with a journal, for which the syncs of the contenders mean what they mean on a disk. Where
    that cannot be mounted a tmpfs, on which a sync costs nothing."""
    with contextlib.ExitStack() as stack:
        try:
            folder = _mount_image(stack, mebibytes)
            kind = "ext4 in an image on loop, the image in a tmpfs"
        except (OSError, subprocess.CalledProcessError):
            folder = Path(stack.enter_context(tempfile.TemporaryDirectory(dir=_any_tmpfs())))
            kind = f"{_type_of(folder)} ({folder.parent}); an image could not be mounted"
        folder.chmod(0o755)
        yield folder, kind


def _mount_image(stack, mebibytes):
    if os.geteuid() != 0:
        raise PermissionError("mounting needs root")
    memory, folder = (
        Path(stack.enter_context(tempfile.TemporaryDirectory(prefix="orvpatch-bench-"))) for _ in range(2)
    )
    _mount(stack, memory, "-t", "tmpfs", "-o", f"size={mebibytes + 64}m", "tmpfs")
    image = memory / "image"
    with image.open("wb") as file:
        file.truncate(mebibytes << 20)
    # The kernel has nothing left to initialise during the measurement.
    _run("mkfs.ext4", "-q", "-F", "-i", "8192", "-E", "lazy_itable_init=0,lazy_journal_init=0", image)
    _mount(stack, folder, "-o", "loop", image)
    return folder


def _mount(stack, target, *words):
    _run("mount", *words, target)
    stack.callback(subprocess.run, ["umount", "-l", target], check=True)


def _run(*words):
    subprocess.run(words, check=True, stdout=subprocess.DEVNULL, stderr=subprocess.PIPE)


def _any_tmpfs():
    return SHARED_MEMORY if SHARED_MEMORY.is_dir() and shutil.disk_usage(SHARED_MEMORY).free else None


def _type_of(folder):
    found = subprocess.run(["stat", "-f", "-c", "%T", folder], check=True, capture_output=True, text=True)
    return found.stdout.strip()
