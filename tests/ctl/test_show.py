"""show: it tells of a patch what the installer tells of it in its report, its log and its history."""

import os
import random
import re

import pytest

from support import Patch

COUNT = 500 if os.environ.get("ORVPATCH_FULL") == "1" else 40
CODES = ["ox", "yn", "um", "ax"]
HEADINGS = {
    "prePatch": "The following commands will be executed before agent instances are stopped:",
    "pre": "The following commands will be executed after agent instances are stopped:",
    "post": "The following commands will be executed before restarting any previously stopped agents:",
}
FILES = "The following files will be installed or replaced with new files:"
HIGHEST = "zzzzzzzz"  # above every level of digits and letters


class RandomPatch:
    """A patch of which every part is drawn: spelling, order, sections that come again, odd levels, odd lines."""

    def __init__(self, seed):
        self.draw = random.Random(seed)
        self.code = self.draw.choice(CODES)
        text = self.text()
        self.patch = Patch(self.code, descriptor=text)
        for name in self.commands:
            self.patch.script(name)
        self.patch.directory()
        for number in range(self.draw.randrange(6)):
            folder = self.draw.choice(["bin", "lib/deep/er", "doc", "a b", "%s"])
            self.patch.file(f"{folder}/{number}", "x" * self.draw.randrange(3000), self.draw.choice([0o644, 0o755]))

    def text(self):
        self.commands = sorted({self.name() for _ in range(6)})
        sections = [("ProductInfo", self.info()), ("PreReqs", self.prereqs()), ("Dependents", self.dependents())]
        sections += [(name, self.some(self.commands)) for name in ("PrePatchCommands", "PreCommands", "PostCommands")]
        sections += [("Unknown", ["ignored = 1"])]
        self.draw.shuffle(sections)
        sections += self.draw.choices(sections, k=self.draw.randrange(2))
        lines = self.draw.choice([[], ["# comment"], ["stray"]])
        for title, entries in sections:
            if title == "ProductInfo" or self.draw.random() < 0.8:
                lines += [self.padded(f"[{title}]"), *map(self.padded, entries), ""]
        return self.draw.choice(["\n", "\r\n"]).join(lines)

    def info(self):
        level = self.draw.choice([["06", "10", "00", "02"], ["06", "10", "1", "0"], ["0612", "10", "00", "ab"]])
        values = {
            "productCode": self.spelled(self.code),
            "patchName": self.draw.choice(["fix", "a fix # 1", "x=y"]),
            "patchDescriptiveName": self.draw.choice(["Fix pack", "100 % of it", '"quoted"']),
            **dict(zip(["productVer", "productRel", "productMod", "productLvl"], level)),
            "productBinArch": "lpp266",
        }
        if self.draw.random() < 0.15:
            values.pop(self.draw.choice(list(values)))
        lines = [f"{key}{self.draw.choice(['=', ' = '])}{value}" for key, value in values.items()]
        self.draw.shuffle(lines)
        return lines + self.draw.choice([[], ["patchName = again"]])

    def prereqs(self):
        levels = ["061000", "06.10.00", "06100002", "06.10.00.02", "6.1", "", "0610000x", "06.1.0.0.0.0"]
        return [f"{self.spelled(code)} = {self.draw.choice(levels)}" for code in self.some(CODES)]

    def dependents(self):
        return [self.spelled(code) for code in self.some([*CODES, "zz"])] + self.draw.choice([[], [], ["all"]])

    def name(self):
        return self.draw.choice(["", "10", "9-", "Z", "a b"]) + self.draw.choice(["run", "stop", "copy.sh"])

    def spelled(self, code):
        return self.draw.choice([code, f"k{code}", code.upper()])

    def some(self, items):
        return self.draw.choices(items, k=self.draw.randrange(len(items) + 1))

    def padded(self, line):
        return self.draw.choice(["", "", " ", "\t"]) + line + self.draw.choice(["", "", " "])


def block(lines, heading):
    """The indented lines below a heading."""
    if heading not in lines:
        return []
    below = lines[lines.index(heading) + 1 :]
    return [line[4:] for line in below[: next(at for at, line in enumerate(below) if not line.startswith("    "))]]


def told_dependents(messages, product):
    """As the report looks for them: all, or one by one, and the patch's own product last."""
    if "Processing ALL active instances" in messages:
        return ["all"]
    looked_for = [
        found[1]
        for message in messages
        if (
            found := re.fullmatch(
                "(?:No running instances of|Dependent product not found:) ([^ ]*)(?: found)?", message
            )
        )
    ]
    assert looked_for.pop() == product
    return looked_for


def told_prerequisites(messages, product):
    """The product's own level is verified in another way, and not told."""
    codes = [
        message.removeprefix("Check for prereq for ")
        for message in messages
        if message.startswith("Check for prereq for ")
    ]
    levels = [
        found[1]
        for message in messages
        if (found := re.fullmatch(f"Comparing installed version {HIGHEST} to required version (.*)\\.", message))
    ]
    return dict(zip([code for code in codes if code != product], levels)), codes


def undotted(level):
    return level.replace(".", "")


@pytest.mark.parametrize("seed", range(COUNT))
def test_it_agrees_with_the_installer(ctl, home, program, write, seed):
    made = RandomPatch(seed)
    path = write(made.patch)
    for code in CODES:
        home.component(code, HIGHEST)
    refusal = program.report(home, path)
    if refusal.status == 7:  # the descriptor lacks something
        shown = ctl.run("show", path, "--json")
        assert (shown.status, shown.out) == (2, b"")
        assert shown.err == b"orvpatchctl: " + path.name.encode() + b": " + refusal.err.strip() + b"\n"
        return
    shown = ctl.document("show", path)
    level = re.search(rb"backlevel patch version: (.*)\. Installed", refusal.err)[1].decode()
    assert shown["level"] == level

    home.component(made.code, "06100000")  # the lowest level of the release of all of them
    result = program.report(home, path)
    assert result.status == 0, result.err
    lines = os.fsdecode(result.out).split("\n")
    messages = [line.message for line in home.log().runs[-1].lines]
    assert {when: block(lines, heading) for when, heading in HEADINGS.items()} == shown["commands"]
    files = [line.removeprefix(home.prefix) for line in block(lines, FILES)]
    assert sorted(files) == sorted(file["path"] for file in shown["files"])
    assert shown["description"] == lines[3].strip()
    assert told_dependents(messages, shown["product"]) == shown["dependents"]
    levels, codes = told_prerequisites(messages, shown["product"])
    assert [entry["product"] for entry in shown["prerequisites"]] == codes
    assert {
        entry["product"]: undotted(entry["level"])
        for entry in shown["prerequisites"]
        if entry["product"] != shown["product"]
    } == levels

    assert program.install(home, path).status == 0
    record = home.history()[-1]
    assert (record.product, record.arch, record.comp, record.name) == (
        shown["product"],
        shown["platform"],
        shown["target"],
        shown["name"],
    )
    assert home.level(made.code) == undotted(shown["level"])
    assert [call.program for call in home.journal()] == [
        command for when in ("prePatch", "pre", "post") for command in shown["commands"][when]
    ]
    for file in shown["files"]:
        assert len(home.read(file["path"])) == file["size"]


def test_a_directory_comes_in_the_order_of_the_kinds(ctl, write, patch_dir):
    for code, target in (("ox", "vema"), ("dk", "vepd"), ("qa", "vems"), ("zt", "vecm"), ("pt", "veps")):
        write(Patch(code, target=target).file("bin/tool", mode=0o755))
    shown = ctl.document("show", patch_dir)
    assert [patch["target"] for patch in shown] == ["vecm", "vems", "veps", "vepd", "vema"]
    assert shown[0]["files"] == [{"path": "bin/tool", "size": 4, "mode": "0755"}]


def test_a_directory_of_one_patch_is_a_list(ctl, write, patch_dir):
    path = write(Patch("ox").file("bin/tool"))
    assert ctl.document("show", patch_dir) == [ctl.document("show", path)]


def test_a_terminal_gets_the_same(ctl, write):
    path = write(
        Patch("yn", prereqs={"ox": "06.10.00"}, dependents=["um"]).file("bin/tool").script("10.sh", when="pre")
    )
    lines = ctl.run("show", path).out.decode().splitlines()
    assert lines[0] == path.name
    assert {line[2:16].strip(): line[18:] for line in lines[1:-1]} == {
        "Product": "kyn on lpp266",
        "Kind": "vema, agent",
        "Name": "kyn_fp0001",
        "Description": "Fix pack fp0001 for kyn",
        "Level": "06.10.01.00",
        "Prerequisites": "kox from 06.10.00.00",
        "Dependents": "kum",
        "Before stops": "none",
        "Before files": "10.sh",
        "Before starts": "none",
        "Files": "1, 4 bytes",
    }
    assert lines[-1].split() == ["0644", "4", "bin/tool"]


@pytest.mark.parametrize("content", [b"", b"no archive", b"\x1f\x8b\x08cut"])
def test_what_is_no_patch_cannot_be_shown(ctl, patch_dir, content):
    path = patch_dir / Patch("ox").filename
    path.write_bytes(content)
    result = ctl.run("show", path)
    assert (result.status, result.out, result.err) == (
        2,
        b"",
        b"orvpatchctl: " + path.name.encode() + b": no member patch.ini\n",
    )
