"""Snapshots of a directory tree, to compare the state before and after a run."""

import hashlib
import os
import stat
from pathlib import Path
from typing import NamedTuple

_WHOLE_CONTENT_LIMIT = 64 * 1024
_KINDS = {stat.S_IFREG: "file", stat.S_IFDIR: "directory", stat.S_IFLNK: "link"}


class Entry(NamedTuple):
    """One path. `content` is a file's bytes (of a large file their SHA-256) or a link's destination;
    `links` is a file's number of hard links, 1 for everything else."""

    kind: str  # "file", "directory", "link", "other"
    mode: int
    uid: int
    gid: int
    content: bytes
    links: int


def snapshot(root, top="", without=()):
    """Path relative to `root` -> Entry, for everything below root/top but the names `without` at the root."""
    found = {}
    for folder, folders, files in os.walk(Path(root) / top):
        if Path(folder) == Path(root):
            folders[:] = [name for name in folders if name not in without]
            files = [name for name in files if name not in without]
        for path in (Path(folder) / name for name in folders + files):
            found[str(path.relative_to(root))] = _entry(path)
    return found


def _entry(path):
    status = path.lstat()
    kind = _KINDS.get(stat.S_IFMT(status.st_mode), "other")
    links = status.st_nlink if kind == "file" else 1
    return Entry(kind, stat.S_IMODE(status.st_mode), status.st_uid, status.st_gid, _content(path, kind), links)


def _content(path, kind):
    if kind == "link":
        return os.fsencode(os.readlink(path))
    if kind != "file":
        return b""
    content = path.read_bytes()
    return content if len(content) <= _WHOLE_CONTENT_LIMIT else hashlib.sha256(content).digest()
