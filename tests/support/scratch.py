"""Temporary folders that other users may enter, unlike pytest's own."""

import os
import subprocess
import tempfile
from pathlib import Path


def scratch_folder():
    """A new temporary folder. In its name there is nothing that is looked for in the output of ps: no digits, which
    could be taken for a process id, and no letters that make up "grep" or the code of a product."""
    while True:
        name = "".join("bcfhjmsv"[byte % 8] for byte in os.urandom(14))
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
