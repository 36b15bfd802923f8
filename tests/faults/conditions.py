"""Real conditions that only root can make: mounts, quotas, immutable files."""

import contextlib
import subprocess

import pytest


@contextlib.contextmanager
def mounted(folder, *options):
    """A file system mounted on `folder` as long as the context lasts; skips where mounting is not allowed."""
    folder.mkdir(parents=True, exist_ok=True)
    done = subprocess.run(["mount", *options, str(folder)], capture_output=True, text=True, check=False)
    if done.returncode:
        pytest.skip(f"cannot mount here: {done.stderr.strip()}")
    try:
        yield folder
    finally:
        subprocess.run(["umount", "--lazy", str(folder)], check=True)


def small_disk(folder, kilobytes):
    return mounted(folder, "-t", "tmpfs", "-o", f"size={kilobytes}k,mode=755", "tmpfs")


def other_file_system(folder):
    return mounted(folder, "-t", "tmpfs", "-o", "size=1m,mode=755", "tmpfs")


@contextlib.contextmanager
def read_only(folder):
    with mounted(folder, "--bind", str(folder)):
        subprocess.run(["mount", "-o", "remount,bind,ro", str(folder)], check=True)
        yield


@contextlib.contextmanager
def immutable(path):
    done = subprocess.run(["chattr", "+i", str(path)], capture_output=True, text=True, check=False)
    if done.returncode:
        pytest.skip(f"the file system has no immutable files: {done.stderr.strip()}")
    try:
        yield
    finally:
        subprocess.run(["chattr", "-i", str(path)], check=True)


def fill(folder):
    """Takes all the room that is left on the disk."""
    filler = folder / "filler"
    with contextlib.suppress(OSError), open(filler, "wb", buffering=0) as file:
        while True:
            file.write(b"\0" * 4096)
    return filler
