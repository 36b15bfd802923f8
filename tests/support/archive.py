"""Patch archives, built by the real tar from a folder."""

import os
import shlex
import subprocess
import tempfile
from pathlib import Path

_COMMAND_SECTIONS = {"pre_patch": "PrePatchCommands", "pre": "PreCommands", "post": "PostCommands"}


class Patch:
    """One patch: its file name, its descriptor, the members of its archive.

    Patch("ox").file("bin/agent", "new\\n").script("10_stop.sh", when="pre").write(folder)

    The file name is <product>_<platform>_<target>_<fixpack>.tar. All that is not said has a default that
    makes a valid patch of level 06.10.01.00 for a component that `ProductHome.component` made by default.
    """

    def __init__(
        self,
        product="ox",
        *,
        level="06100100",
        platform="lpp266",
        target="vema",
        fixpack="fp0001",
        code=None,
        name=None,
        title=None,
        arch="lpp266",
        exe=None,
        prereqs=None,
        dependents=(),
        pre_patch=(),
        pre=(),
        post=(),
        descriptor=None,
    ):
        self.product = "k" + product if len(product) == 2 else product
        self.platform, self.target, self.fixpack = platform, target, fixpack
        self.level = level
        self.code = code or self.product
        self.name = name or f"{self.product}_{fixpack}"
        self.title = title or f"Fix pack {fixpack} for {self.product}"
        self.arch, self.exe = arch, exe
        self.prereqs = dict(prereqs or {})
        self.dependents = list(dependents)
        self.commands = {"pre_patch": list(pre_patch), "pre": list(pre), "post": list(post)}
        self.descriptor = descriptor
        self._members = {}  # archive path -> function that makes it at a path

    @property
    def filename(self):
        return f"{self.product}_{self.platform}_{self.target}_{self.fixpack}.tar"

    def file(self, path, content=b"new\n", mode=0o644):
        """A file under updated_files, that is, at `path` under the home."""
        return self.member(f"updated_files/{path}", content, mode)

    def directory(self, path="", mode=0o755):
        """A directory under updated_files; without a path the (perhaps empty) tree itself."""
        return self._add(f"updated_files/{path}".rstrip("/"), lambda at: _make_directory(at, mode))

    def member(self, path, content=b"", mode=0o644):
        """Any file at any place of the archive."""
        return self._add(path, lambda at: _make_file(at, content, mode))

    def symlink(self, path, destination):
        """A symbolic link at any place of the archive."""
        return self._add(path, lambda at: os.symlink(destination, at))

    def script(self, name, when=None, *, status=0, out="", err="", body="", mode=0o755):
        """A script at the top of the archive that journals its call, runs `body`, writes `out` and `err`
        and ends with `status`; `when` ("pre_patch", "pre", "post") also enters it in that command list."""
        if when:
            self.command(when, name)
        return self.member(name, _script_text(status, out, err, body), mode)

    def command(self, when, line):
        """An entry of a command list that needs no member of its own."""
        self.commands[when].append(line)
        return self

    def descriptor_text(self):
        if self.descriptor is not None:
            return self.descriptor
        sections = {
            "ProductInfo": self._product_info(),
            "PreReqs": [f"{code} = {level}" for code, level in self.prereqs.items()],
            "Dependents": self.dependents,
            **{title: self.commands[when] for when, title in _COMMAND_SECTIONS.items()},
        }
        return "\n".join(_section(title, lines) for title, lines in sections.items() if lines)

    def write_descriptor(self, path):
        """Writes the descriptor alone, for a validation; returns its path."""
        _make_file(Path(path), self.descriptor_text(), 0o644)
        return Path(path)

    def write(self, directory, filename=None, *, dotted=False):
        """Makes the archive in `directory` and returns its path. The members are named "patch.ini", not
        "./patch.ini", unless `dotted` is asked for; a descriptor of False leaves patch.ini out."""
        target = Path(directory) / (filename or self.filename)
        with tempfile.TemporaryDirectory(prefix="orvpatch-archive-") as folder:
            self._fill(Path(folder))
            members = ["."] if dotted else sorted(os.listdir(folder)) or ["--files-from=/dev/null"]
            subprocess.run(
                ["tar", "--owner=0", "--group=0", "-cf", target.absolute(), "-C", folder, *members], check=True
            )
        return target

    def _add(self, path, make):
        self._members[path] = make
        return self

    def _fill(self, folder):
        if self.descriptor is not False:
            _make_file(folder / "patch.ini", self.descriptor_text(), 0o644)
        for path, make in self._members.items():
            (folder / path).parent.mkdir(parents=True, exist_ok=True)
            make(folder / path)

    def _product_info(self):
        fields = {"productCode": self.code, "patchName": self.name, "patchDescriptiveName": self.title}
        fields.update(
            zip(
                ("productVer", "productRel", "productMod", "productLvl"),
                (self.level[at : at + 2] for at in (0, 2, 4, 6)),
            )
        )
        fields.update(productBinArch=self.arch, productEXE=self.exe)
        return [f"{key} = {value}" for key, value in fields.items() if value is not None]


def _section(title, lines):
    return "".join(f"{line}\n" for line in [f"[{title}]", *lines])


def _script_text(status, out, err, body):
    return (
        "#!/bin/sh\n"
        "quill_home=${QUILLHOME%/}\n"
        '. "$quill_home/bin/journal.sh"\n'
        'journal "${0##*/}" "$@"\n'
        f"{body}\n"
        f"printf %s {shlex.quote(out)}\n"
        f"printf %s {shlex.quote(err)} >&2\n"
        f"exit {status}\n"
    )


def _make_file(path, content, mode):
    path.write_bytes(content.encode("utf-8", "surrogateescape") if isinstance(content, str) else content)
    path.chmod(mode)


def _make_directory(path, mode):
    path.mkdir(exist_ok=True)
    path.chmod(mode)
