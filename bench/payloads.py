"""The payloads, and the form in which each contender takes them from disk."""

import random
import shutil
import subprocess
from dataclasses import dataclass, replace
from pathlib import Path

from support import Patch, ProductHome

SMALL = (64, 1024)  # bytes of a file, from and to
MIDDLE = (1024, 16384)
MEBIBYTE = (1 << 20, 1 << 20)


@dataclass(frozen=True)
class Payload:
    """`files` new files, 20 to a directory, in `patches` patches; the share `existing` of them is already in the
    home, with other content. `peers`: whether the peers install it too."""

    key: str
    title: str
    files: int
    sizes: tuple
    patches: int = 1
    existing: float = 0.0
    action: str = "-i"
    peers: bool = True

    def tiny(self):
        """The same in the smallest shape that still has everything, to test that it runs."""
        return replace(
            self, title=f"40 files in the place of: {self.title}", files=40, sizes=SMALL, patches=min(self.patches, 2)
        )

    def codes(self):
        """The product code of each patch; each patch is for another product."""
        return ["ox"] if self.patches == 1 else [f"{chr(97 + n // 10)}{n % 10}" for n in range(self.patches)]


PAYLOADS = (
    Payload(
        "a",
        "10,000 files of 1 to 16 KiB in 500 directories, half of them replacing existing files",
        10_000,
        MIDDLE,
        existing=0.5,
    ),
    Payload("b", "200 files of 1 MiB", 200, MEBIBYTE),
    Payload("c", "50,000 files of 64 to 1,024 bytes", 50_000, SMALL),
    Payload("d", "a directory of 100 patches of 20 files of 1 to 16 KiB", 2_000, MIDDLE, patches=100),
    Payload("e", "the report on (a): `-t` instead of `-i`", 10_000, MIDDLE, existing=0.5, action="-t", peers=False),
    Payload("s1", "1,000 files, otherwise as (c)", 1_000, SMALL, peers=False),
    Payload("s10", "10,000 files, otherwise as (c)", 10_000, SMALL, peers=False),
)


class Laid:
    """A payload on disk:

    home/               the home of one run: a copy of the template; not far from the root, as homes are
    payload/template/   the home before the installation
    payload/patches/    the patch files
    payload/trees/NNN/  the files of each patch, as under the home
    payload/packages/   what the peers take
    """

    def __init__(self, payload, folder):
        self.payload, self.folder = payload, Path(folder, "payload")
        self.template, self.home = self.folder / "template", Path(folder, "home")
        self.patches, self.trees, self._packages = [], [], {}
        self._lay_out_template()
        self._write_patches()
        self._write_trees()

    @property
    def path(self):
        """The tool's argument: the patch file, or the directory of several."""
        return self.patches[0] if len(self.patches) == 1 else self.patches[0].parent

    @property
    def version_file(self):
        return self.home / f"registry/{self.payload.codes()[0]}lpp266.ver"

    def packages(self, build):
        """The packages that `build` makes of the trees, made once for all peers of the same kind."""
        if build not in self._packages:
            folder = self.folder / "packages"
            folder.mkdir(exist_ok=True)
            self._packages[build] = [build(tree, folder) for tree in self.trees]
        return self._packages[build]

    def log_size(self):
        """Lines and bytes of the log of the last run."""
        home = ProductHome.attach(self.home)
        log = home.log()
        return len(log.headers) + len(log.lines), len(home.read("patchlogs/orvpatch.log"))

    def refresh(self):
        """Makes the home anew, and waits until everything is on disk."""
        shutil.rmtree(self.home, ignore_errors=True)
        subprocess.run(["cp", "-a", self.template, self.home], check=True)
        subprocess.run(["sync", "-f", self.home], check=True)

    def verify(self, contender):
        """Raises an error unless the home holds just the files of the payload after this contender's run."""
        expected = {path: data for tree in self.trees for path, data in _contents(tree)}
        if self.payload.action == "-t":
            expected = dict(_contents(self.template))
        if dict(_contents(self.home)) != expected:
            raise RuntimeError(f"{contender}: the home does not hold the payload ({self.payload.key})")

    def verify_untouched(self, contender):
        """Raises an error unless the home holds the files that it held before any run."""
        if dict(_contents(self.home)) != dict(_contents(self.template)):
            raise RuntimeError(f"{contender}: the home is not the one before ({self.payload.key})")

    def remove(self):
        shutil.rmtree(self.folder)
        shutil.rmtree(self.home)

    def _lay_out_template(self):
        home = ProductHome(self.template)
        home.detach()
        (home.path / "tmp").chmod(0o700)  # as orvpatchctl asks for
        for code in self.payload.codes():
            home.component(code)

    def _write_patches(self):
        chosen = random.Random(self.payload.files)  # the same bytes in every run
        folder = self.folder / "patches"
        folder.mkdir(parents=True)
        each = self.payload.files // self.payload.patches
        for number, code in enumerate(self.payload.codes()):
            patch = Patch(code)
            for path in self._paths(number * each, each):
                patch.file(path, chosen.randbytes(chosen.randint(*self.payload.sizes)))
            self.patches.append(patch.write(folder))

    def _write_trees(self):
        for number, patch in enumerate(self.patches):
            tree = self.folder / "trees" / f"{number:03}"
            tree.mkdir(parents=True)
            subprocess.run(["tar", "-xf", patch, "-C", tree, "--strip-components=1", "updated_files"], check=True)
            self.trees.append(tree)
        for path in self._paths(0, int(self.payload.files * self.payload.existing)):
            target = self.template / path
            target.parent.mkdir(parents=True, exist_ok=True)
            target.write_bytes(b"old\n")

    @staticmethod
    def _paths(first, count):
        return [f"lib/d{number // 20:04}/f{number % 20:02}.dat" for number in range(first, first + count)]


def _contents(top):
    """(path relative to `top`, content) of every file of the payload under it."""
    return [(path.relative_to(top), path.read_bytes()) for path in Path(top, "lib").rglob("*") if path.is_file()]
