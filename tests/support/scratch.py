"""Temporary folders that other users may enter, unlike pytest's own."""

import os
import shutil
import tempfile
from pathlib import Path


def scratch_folder():
    """A new temporary folder. Its name holds letters only: digits in a command line could be taken for a
    process id by whoever searches the output of ps for one."""
    while True:
        name = "".join(chr(ord("a") + byte % 26) for byte in os.urandom(10))
        folder = Path(tempfile.gettempdir()) / f"orvpatch-{name}"
        try:
            folder.mkdir()
        except FileExistsError:
            continue
        folder.chmod(0o755)
        return folder


def remove_tree(folder):
    """Removes a scratch folder, also where a test has closed a directory of it."""
    for directory, names, _ in os.walk(folder):
        for path in (os.path.join(directory, name) for name in names):
            if not os.path.islink(path):
                os.chmod(path, 0o755)
    shutil.rmtree(folder)
