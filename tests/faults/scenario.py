"""The runs that faults are injected into: a home, patches, a command, and what the tests need to know of them."""

import os
from pathlib import Path
from typing import NamedTuple

from support import Patch, ProductHome

OLD_LEVEL, NEW_LEVEL = "06100000", "06100100"
_OLD_MODE, _ARCHIVE_MODE = 0o750, 0o640
_DESCRIPTIONS = {"kox": "Monitoring Agent for Linux OS", "kyn": "Sample Agent", "kqa": "Sample Server"}
# The owner and group of the files that a patch replaces; numbers that need no account.
_OWNER = (4711, 4712)


class PatchFacts(NamedTuple):
    patch: Patch
    replaced: tuple  # files under the home that the patch replaces
    added: tuple  # files that it brings to a new place
    directories: tuple  # directories that it makes
    failing: str = ""  # the step whose script fails: "pre_patch", "pre", "post", or none
    status: int = 0  # that script's exit status

    @property
    def code(self):
        return self.patch.code

    @property
    def dependents(self):
        """Product codes in the order in which their instances are stopped."""
        codes = [f"k{code}" for code in self.patch.dependents]
        return codes + [self.code] * (self.code not in codes)

    @property
    def temp(self):
        return f"tmp/{self.patch.product}"

    @property
    def version_file(self):
        return f"registry/{self.code[1:]}{self.patch.platform}.ver"

    def new_content(self, file):
        return f"new {self.code} {file}\n".encode()


def old_content(file):
    return f"old {file}\n".encode()


def _agent_patch(fail_status=0):
    patch = Patch("yn", level=NEW_LEVEL, prereqs={"ox": OLD_LEVEL}, dependents=["ox"])
    patch.script("10_check.sh", "pre_patch").script("20_save.sh", "pre").script("21_more.sh", "pre")
    patch.script("30_post.sh", "post", status=fail_status, out="some output", err="some error")
    return _with_files(
        PatchFacts(
            patch,
            ("bin/yn", "config/yn.conf"),
            ("bin/ynhelper", "lib/yn/deep/data"),
            ("lib", "lib/yn", "lib/yn/deep"),
            "post" if fail_status else "",
            fail_status,
        )
    )


def _server_patch():
    patch = Patch("qa", level=NEW_LEVEL, target="vems")
    return _with_files(PatchFacts(patch, ("bin/qa",), (), ()))


def _with_files(facts):
    for file in facts.replaced + facts.added:
        facts.patch.file(file, facts.new_content(file), _ARCHIVE_MODE)
    return facts


class Scenario:
    """One command on one kind of home. `patches` are in the order in which they are applied."""

    def __init__(self, name, action, patches, directory):
        self.name, self.action, self.patches, self.directory = name, action, patches, directory

    def write_patches(self, folder):
        """Writes the patch files; returns the path to give to the program."""
        paths = [facts.patch.write(folder) for facts in self.patches]
        if not self.directory:
            return paths[0]
        (Path(folder) / "readme.txt").write_text("no patch\n", encoding="utf-8")
        return Path(folder)

    def listing(self, path):
        """Indices of the patches in the order in which the program meets them."""
        if not self.directory:
            return [0]
        names = [facts.patch.filename for facts in self.patches]
        return [names.index(name) for name in os.listdir(path) if name in names]

    def arguments(self, home, path):
        return ["-h", home, self.action, path]

    def make_home(self):
        home = ProductHome()
        home.component("ox", OLD_LEVEL, _DESCRIPTIONS["kox"])
        home.component("qa", OLD_LEVEL, _DESCRIPTIONS["kqa"])
        home.component("yn", OLD_LEVEL, _DESCRIPTIONS["kyn"], prereqs=["oxlpp266"])
        for file in (file for facts in self.patches for file in facts.replaced):
            written = home.write(file, old_content(file), _OLD_MODE)
            if os.geteuid() == 0:
                os.chown(written, *_OWNER)
        for code, instance in (("ox", ""), ("yn", "one"), ("yn", "two")):
            home.start(code, instance)
        return home


def description(code):
    return _DESCRIPTIONS[code]


# All that runs, in the order of the run information, and the files of the home that a patch replaces.
RUNNING = {"kox": ("",), "kyn": ("one", "two")}
INSTALLED = ("kox", "kqa", "kyn")
REPLACED_MODE, NEW_MODE, EXTRACTED_MODE = _OLD_MODE, 0o755, _ARCHIVE_MODE
REPLACED_OWNER = _OWNER

SCENARIOS = {
    scenario.name: scenario
    for scenario in (
        Scenario("install", "-i", [_server_patch(), _agent_patch()], directory=True),
        Scenario("report", "-t", [_agent_patch()], directory=False),
        Scenario("failure", "-i", [_agent_patch(fail_status=3)], directory=False),
    )
}
# The patch of the failure once its command is right.
REPAIRED = Scenario("repaired", "-i", [_agent_patch()], directory=False)
