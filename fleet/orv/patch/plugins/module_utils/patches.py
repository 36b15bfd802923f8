"""The files of patches on a host."""

from __future__ import absolute_import, division, print_function

__metaclass__ = type

import errno
import hashlib
import os

from ansible_collections.orv.patch.plugins.module_utils import ctl


def path_of(patch, name):
    """Where a file lies that belongs to a patch file, or to a directory of patches."""
    return os.path.join(patch if os.path.isdir(patch) else os.path.dirname(patch), name)


def digests(patch, shown):
    """File name -> SHA-256, of the patches that orvpatchctl shows of this file or directory."""
    return dict((one["file"], sha256(path_of(patch, one["file"]))) for one in shown)


def sha256(path):
    """The digest of a file; empty when there is none."""
    digest = hashlib.sha256()
    try:
        with open(path, "rb") as stream:
            for block in iter(lambda: stream.read(1 << 20), b""):
                digest.update(block)
    except (IOError, OSError) as error:
        if error.errno == errno.ENOENT:
            return ""
        raise ctl.CtlError("cannot read %s: %s" % (path, error.strerror), 2)
    return digest.hexdigest()
