"""What is to be copied from the controller to the hosts."""

from __future__ import absolute_import, division, print_function

__metaclass__ = type

DOCUMENTATION = r"""
name: source
short_description: A patch, or a directory of patches, on the controller
version_added: 1.0.0
description:
  - Tells which files go to the hosts, with their digests.
  - Of a directory these are all its files; of a patch file, the file itself, and C(SHA256SUMS) and C(SHA256SUMS.asc)
    beside it.
  - A file that C(SHA256SUMS) lists with another digest is an error.
author:
  - orvpatch maintainers (@orvpatch)
options:
  _terms:
    description: The patch file, or the directory of patches.
    required: true
  require_sums:
    description: Whether every patch must be listed in C(SHA256SUMS).
    type: bool
    default: false
"""

EXAMPLES = r"""
- name: Show what would be copied
  ansible.builtin.debug:
    msg: "{{ lookup('orv.patch.source', '/srv/fixpack2') }}"
"""

RETURN = r"""
_raw:
  description: One entry for each path.
  type: list
  elements: dict
  contains:
    files:
      description: The files, each with path, name and sha1, which is what the engine checks after a transfer.
      type: list
    digests:
      description: The SHA-256 of each file, by its name.
      type: dict
    patches:
      description: The names of the patches, without their companions.
      type: list
    is_directory:
      description: Whether the path is a directory.
      type: bool
    id:
      description: A name for exactly these contents.
      type: str
"""

import hashlib
import os

from ansible.errors import AnsibleLookupError
from ansible.module_utils.common.text.converters import to_text
from ansible.plugins.lookup import LookupBase

SUMS = "SHA256SUMS"
COMPANIONS = (SUMS, SUMS + ".asc")
KINDS = ("vema", "vems", "veps", "vepd", "vecm")


class LookupModule(LookupBase):
    """lookup('orv.patch.source', PATH)"""

    def run(self, terms, variables=None, **kwargs):
        self.set_options(var_options=variables, direct=kwargs)
        return [source(os.path.abspath(os.path.expanduser(term)), self.get_option("require_sums")) for term in terms]


def source(path, require_sums):
    """What goes to the hosts of one path."""
    try:
        names, folder = chosen(path)
        files = [described(os.path.join(folder, name)) for name in names]
    except (IOError, OSError) as error:
        raise AnsibleLookupError("cannot read %s: %s" % (error.filename, error.strerror))
    digests = dict((one["name"], one.pop("sha256")) for one in files)
    demand_sums(os.path.join(folder, SUMS), digests, require_sums)
    lines = "".join("%s  %s\n" % (digests[name], name) for name in sorted(digests))
    return {
        "files": files,
        "digests": digests,
        "patches": [name for name in names if is_patch(name)],
        "is_directory": os.path.isdir(path),
        "id": hashlib.sha256(lines.encode("utf-8", "surrogateescape")).hexdigest()[:16],
    }


def chosen(path):
    """The names to copy, and the folder in which they lie."""
    if os.path.isdir(path):
        names = [name for name in os.listdir(path) if not name.startswith(".")]
        return sorted(name for name in names if os.path.isfile(os.path.join(path, name))), path
    folder, name = os.path.split(os.path.abspath(path))
    return [name] + [one for one in COMPANIONS if os.path.isfile(os.path.join(folder, one))], folder


def is_patch(name):
    """By the name alone, as the installer decides: product_platform_kind_fixpack, with anything behind."""
    parts = name.split("_")
    return len(parts) == 4 and len(parts[0]) == 3 and parts[2] in KINDS


def described(path):
    sums = {"sha1": hashlib.sha1(), "sha256": hashlib.sha256()}
    with open(path, "rb") as stream:
        for block in iter(lambda: stream.read(1 << 20), b""):
            for one in sums.values():
                one.update(block)
    described = dict((kind, one.hexdigest()) for kind, one in sums.items())
    return dict(described, path=path, name=os.path.basename(path))


def demand_sums(path, digests, require_sums):
    """Holds the files against SHA256SUMS, where there is one."""
    listed = {}
    if os.path.isfile(path):
        with open(path, "rb") as stream:
            listed = dict(line for line in map(listed_digest, stream) if line)
    for name, digest in sorted(digests.items()):
        if listed.get(name, digest) != digest:
            raise AnsibleLookupError("%s is not the file that %s lists" % (name, path))
        if require_sums and is_patch(name) and name not in listed:
            raise AnsibleLookupError("%s does not list %s" % (path, name))


def listed_digest(line):
    digest, blank, name = to_text(line, errors="surrogateescape").rstrip("\r\n").partition(" ")
    return (name[1:], digest.lower()) if blank and name[:1] in (" ", "*") else None
