"""Archives that tar(1) would not make: written member by member, as an attacker can."""

import io
import tarfile
from pathlib import Path

from support import Patch

BLOCK = 512


class RawArchive:
    """A patch archive of any members in any order. Without `patch` it has no descriptor.

    RawArchive(Patch("ox")).file("updated_files/bin/a").link("updated_files/bin/b", "/etc/passwd").write(folder)
    """

    def __init__(self, patch=None, *, format=tarfile.GNU_FORMAT):
        self._filename = (patch or Patch("ox")).filename
        self._stream = io.BytesIO()
        self._tar = tarfile.open(fileobj=self._stream, mode="w", format=format)
        self.boundaries = [0]  # where a member begins, or the end of the archive
        if patch:
            self.file("patch.ini", patch.descriptor_text())

    def file(self, name, content=b"new\n", mode=0o644, **fields):
        data = content.encode() if isinstance(content, str) else content
        return self._add(name, tarfile.REGTYPE, data, mode=mode, size=len(data), **fields)

    def script(self, name, body, mode=0o755):
        return self.file(name, f"#!/bin/sh\n{body}\n", mode)

    def directory(self, name, mode=0o755, **fields):
        return self._add(name, tarfile.DIRTYPE, mode=mode, **fields)

    def link(self, name, destination):
        return self._add(name, tarfile.SYMTYPE, mode=0o777, linkname=destination)

    def hard_link(self, name, member):
        return self._add(name, tarfile.LNKTYPE, mode=0o644, linkname=member)

    def fifo(self, name, mode=0o644):
        return self._add(name, tarfile.FIFOTYPE, mode=mode)

    def device(self, name, major, minor, mode=0o600):
        return self._add(name, tarfile.CHRTYPE, mode=mode, devmajor=major, devminor=minor)

    @property
    def content(self):
        """All bytes, ended as an archive ends: by two empty blocks."""
        return self._stream.getvalue() + bytes(2 * BLOCK)

    def write(self, directory, filename=None, *, upto=None):
        """Writes the archive, or its first `upto` bytes; returns its path."""
        path = Path(directory) / (filename or self._filename)
        path.write_bytes(self.content[:upto])
        return path

    def _add(self, name, kind, data=b"", **fields):
        member = tarfile.TarInfo(name)
        member.type = kind
        for field, value in fields.items():
            setattr(member, field, value)
        return self.add(member, data)

    def add(self, member, data=b""):
        """A member of any fields at all."""
        self._tar.addfile(member, io.BytesIO(data))
        self.boundaries.append(self._stream.tell())
        return self
