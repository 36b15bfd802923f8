"""The listing of a home that an undo must give back, to the byte."""

import hashlib
import os
import stat

_LEFT_OUT = ("patchlogs", "journal", "control", "config/.ConfigData/RunInfo")


def listing(home):
    """path -> all that a file is: type, bytes or target, owner, group, mode, time, attributes, names.

    Times of directories are left out: they change with what a directory holds. ACL and capabilities are extended
    attributes. The names that share a file are told as a group.
    """
    root = os.fspath(home)
    found, names = {}, {}
    for folder, directories, files in os.walk(root):
        for name in directories + files:
            path = os.path.join(folder, name)
            relative = os.path.relpath(path, root)
            # A probe of the check that a kill has left: the next check removes it.
            if relative.startswith(_LEFT_OUT) or name.startswith(".orvpatchctl-probe"):
                continue
            status = os.lstat(path)
            found[relative] = _describe(path, status)
            names.setdefault((status.st_dev, status.st_ino), []).append(relative)
    for group in names.values():
        for relative in group:
            found[relative]["names"] = sorted(group)
    return found


def assert_taken_back(result, after, before):
    """An undo has ended well, or had nothing to do, and the home is as before; whether it had anything to do."""
    nothing = b"no transaction that could be undone" in result.err or b"nothing to undo" in result.err
    assert result.status == 0 or nothing, result
    assert after == before, result
    return result.status == 0


def _describe(path, status):
    is_directory = stat.S_ISDIR(status.st_mode)
    return {
        "type": stat.S_IFMT(status.st_mode),
        "mode": oct(stat.S_IMODE(status.st_mode)),
        "owner": (status.st_uid, status.st_gid),
        "time": None if is_directory else status.st_mtime_ns,
        "content": _content(path, status),
        "attributes": {
            name: os.getxattr(path, name, follow_symlinks=False)
            for name in sorted(os.listxattr(path, follow_symlinks=False))
        },
    }


def _content(path, status):
    if stat.S_ISLNK(status.st_mode):
        return os.readlink(path)
    if stat.S_ISREG(status.st_mode):
        with open(path, "rb") as file:
            return hashlib.sha256(file.read()).hexdigest()
    return None
