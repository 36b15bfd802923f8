"""Validation of descriptors: what is accepted, and which problem is reported."""

import pytest

from support import Patch
from support.catalogue import text

INFO = (
    "[ProductInfo]\nproductCode = kox\npatchName = N\npatchDescriptiveName = T\nproductVer = 06\n"
    "productRel = 10\nproductMod = 00\nproductLvl = 01\n"
)
OPTIONAL = "productBinArch = lpp266\nproductEXE = kox.exe\n"
FULL = INFO + OPTIONAL

ACCEPTED = {
    "everything": Patch(
        "ox", exe="x", prereqs={"gl": "06.10.00.00"}, dependents=["all"], pre_patch=["a"], pre=["b"], post=["c"]
    ).descriptor_text(),
    "only what is required": INFO,
    "white space, comments, DOS line ends": " # comment\r\n\r\n" + FULL.replace("\n", " \t\r\n").replace(" = ", "="),
    "header without a closing bracket keeps all but its last character": FULL.replace("[ProductInfo]", "[ProductInfo?"),
    "unknown sections and keys": FULL + "colour = red\n[Unknown]\nx\n",
    "no end of line at the end": FULL.removesuffix("\n"),
    "empty values": INFO.replace("patchName = N", "patchName ="),
    "a NUL ends the text": FULL + "\0[",
    "stray lines first": "stray\nlines = two\n" + FULL,
    "a repeated section starts again": "[ProductInfo]\npatchName = N\n" + FULL,
}


@pytest.mark.parametrize("content", ACCEPTED.values(), ids=ACCEPTED)
def test_accepted(site, content):
    path = site.descriptor(content)
    assert site.validate(path) == site.done(f"\n{path} is valid\n\n")


def without(key, content):
    return "".join(line for line in content.splitlines(True) if not line.startswith(key))


def property_missing(key):
    return 7, text("ERROR_PATCH_MISSING_PROP", key)


NO_SECTION = 6, text("ERROR_PATCH_MISSING_SECTION", "ProductInfo")
REQUIRED = ("productCode", "patchName", "patchDescriptiveName", "productVer", "productRel", "productMod", "productLvl")

REFUSED = {
    "empty file": ("", NO_SECTION),
    "no ProductInfo": ("[Other]\nproductCode = kox\n", NO_SECTION),
    "case of a section matters": (FULL.replace("ProductInfo", "productinfo"), NO_SECTION),
    "a stray line is forgotten for a missing section": ("stray\n", NO_SECTION),
    "case of a key matters": (FULL.replace("productCode", "productcode"), property_missing("productCode")),
    "a repeated section forgets the first": (FULL + "[ProductInfo]\n", property_missing("productEXE")),
    **{f"no {key}": (without(key, FULL), property_missing(key)) for key in REQUIRED},
    "of several, the last required one": (
        without("patchName", without("productCode", FULL)),
        property_missing("patchName"),
    ),
    "a missing productBinArch hides it": (
        without("productBinArch", without("productVer", FULL)),
        property_missing("productBinArch"),
    ),
    "a missing productEXE hides it": (
        without("productEXE", without("productVer", FULL)),
        property_missing("productEXE"),
    ),
    "and productBinArch too": (without("productVer", INFO), property_missing("productEXE")),
}


@pytest.mark.parametrize("content, problem", REFUSED.values(), ids=REFUSED)
def test_refused(site, content, problem):
    assert site.validate(site.descriptor(content)) == site.failed(*problem)
    assert site.logged("ERROR")[-1] == text("ERROR_PATCH_PARSE")
    assert site.changes() == []


def test_a_descriptor_that_is_not_there(site):
    path = site.patch_dir / "absent.ini"
    expected = text("ERROR_INIFILE_CANT_READ", path, "No such file or directory")
    assert site.validate(path) == site.failed(5, expected)
    assert site.logged("ERROR") == [f"unable to stat file: {path}", expected, text("ERROR_INIFILE_PARSE", path)]


def test_a_directory_is_no_descriptor(site):
    expected = text("ERROR_INIFILE_CANT_READ", site.patch_dir, "Invalid argument")
    assert site.validate(site.patch_dir) == site.failed(5, expected)
    assert site.logged("ERROR") == [expected, text("ERROR_INIFILE_PARSE", site.patch_dir)]


def test_a_descriptor_that_cannot_be_opened(site):
    site.as_ordinary_user()
    path = site.descriptor(FULL)
    path.chmod(0)
    expected = text("ERROR_INIFILE_CANT_READ", path, "Invalid argument")
    assert site.validate(path) == site.failed(5, expected)
    assert site.logged("ERROR") == [f"unable to open file: {path}", expected, text("ERROR_INIFILE_PARSE", path)]


def test_a_stray_line_is_reported_in_the_log_alone(site):
    path = site.descriptor("stray\n" + FULL)
    assert site.validate(path) == site.done(f"\n{path} is valid\n\n")
    assert site.logged("ERROR") == [text("ERROR_INIFILE_PROP")]


def test_any_directory_serves_as_home(site, scratch):
    path = site.descriptor(FULL)
    folder = scratch / "any"
    folder.mkdir()
    assert site.run("-h", folder, "-vi", path) == site.done(f"\n{path} is valid\n\n")
    assert [entry.name for entry in folder.iterdir()] == ["patchlogs"]
