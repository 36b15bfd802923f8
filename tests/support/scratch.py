"""Temporary folders that other users may enter, unlike pytest's own."""

import os
import subprocess
import tempfile
from pathlib import Path


def scratch_folder():
    """A new temporary folder. Its name holds letters only: digits in a command line could be taken for a
    process id in the output of ps."""
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
    """Removes a scratch folder, also where a test has closed a directory or made a tree so deep that only
    programs that walk it step by step get to its end."""
    subprocess.run(["chmod", "-R", "u+rwx", folder], stderr=subprocess.DEVNULL, check=False)
    subprocess.run(["rm", "-rf", folder], check=True)
