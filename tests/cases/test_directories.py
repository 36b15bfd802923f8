"""Directories of patches: which files are taken, in which order, and what a failure among them means."""

import os

import pytest

from support import Patch
from support.catalogue import text

KINDS = [("zt", "vecm"), ("qa", "vems"), ("pt", "veps"), ("dk", "vepd"), ("ox", "vema")]  # in order of application


@pytest.fixture
def site(site):
    for code, _ in KINDS:
        site.home.component(code)
    for code in ("yn", "ul", "gl"):  # more agents
        site.home.component(code)
    return site


def applied(site):
    """(product, target, result) of the history, in order."""
    return [(entry.product, entry.comp, entry.result) for entry in site.home.history()]


def marked(product, **facts):
    """A patch that journals that it is applied."""
    return Patch(product, **facts).script(f"{product}.sh", when="post")


def test_all_kinds_are_applied_in_their_fixed_order(site):
    patches = [marked(code, target=target) for code, target in KINDS]
    assert site.install(*reversed(patches)) == site.done()
    assert site.home.calls() == [f"{code}.sh" for code, _ in KINDS]
    assert applied(site) == [(f"k{code}", target, "PASS") for code, target in KINDS]
    assert site.changes() == sorted(
        ["+ patchlogs/patches.hist", *[f"* registry/{code}lpp266.ver" for code, _ in KINDS]], key=lambda line: line[2:]
    )


def test_within_a_kind_the_order_of_the_listing_is_kept(site):
    codes = ["ab", "cd", "ef", "gh", "ij"]
    for code in codes:
        site.home.component(code)
    site.install(marked("qa", target="vems"), *[marked(code) for code in codes])
    listed = [name[1:3] for name in site.listed() if name[1:3] in codes]
    assert site.home.calls() == ["qa.sh", *[f"{code}.sh" for code in listed]]


def test_the_reports_come_in_the_same_order(site):
    patches = [Patch(code, target=target).directory() for code, target in KINDS]
    result = site.report(*reversed(patches))
    shown = [line for line in result.out.decode().splitlines() if line.startswith("Processing")]
    assert shown == [text("DCFPP_PROCESS_PATCH", site.patch_dir / patch.filename) for patch in patches]
    assert result.err == b"" and site.changes() == []


def test_files_that_do_not_apply_are_passed_over(site):
    (site.patch_dir / "readme.txt").write_text("no patch")
    (site.patch_dir / "kox_lpp266_vema_fp0009").write_text("no extension")
    (site.patch_dir / "folder").mkdir()
    Patch("ox").write(site.patch_dir / "folder", "kyn_lpp266_vema_fp0001.tar")
    Patch("ox").write(site.patch_dir, "kox_li6243_vema_fp0001.tar")
    Patch("ho").write(site.patch_dir)
    Patch("yn").write(site.patch_dir)
    assert site.install(site.patch_dir) == site.done()
    assert applied(site) == [("kyn", "vema", "PASS")]
    ignored = [name for name in site.listed() if name not in ("folder", "kyn_lpp266_vema_fp0001.tar")]
    expected = [text("DCFPP_NOT_APPLICABLE", site.patch_dir / name) for name in ignored]
    assert [line for line in site.logged("INFO") if "will be ignored" in line] == expected


def test_the_extension_does_not_matter(site):
    Patch("yn").write(site.patch_dir, "kyn_lpp266_vema_fp0001.cab")
    assert site.install(site.patch_dir) == site.done()


def test_a_link_to_a_patch_is_a_patch(site):
    target = Patch("yn").write(site.home.path)
    (site.patch_dir / "kyn_lpp266_vema_fp0002.tar").symlink_to(target)
    assert site.install(site.patch_dir) == site.done()
    assert applied(site) == [("kyn", "vema", "PASS")]


# --- one of several cannot be loaded -------------------------------------------------------------------


def in_listing_order(site, *products):
    """Writes a good patch for each product; returns the products in the order of the listing."""
    for product in products:
        Patch(product).write(site.patch_dir)
    return [name[1:3] for name in site.listed()]


@pytest.mark.parametrize("action", ["-i", "-t"])
def test_the_first_that_fails_in_loading_is_reported_as_no_applicable_patch(site, action):
    # KEEP(no-applicable-overwrites)
    first, second = in_listing_order(site, "ox", "yn")
    Patch(first, prereqs={"ho": "06.10.00"}).write(site.patch_dir)
    message = text("ERROR_DCFPP_NO_APPLICABLE", site.patch_dir)
    assert site.run("-h", site.home, action, site.patch_dir) == site.failed(32, message)
    assert site.logged("ERROR") == [text("ERROR_PP_MISSING_PREREQ", "kho 06.10.00.00"), message]
    assert text("DCFPP_PROCESS_PATCH", f"k{second}_lpp266_vema_fp0001.tar") not in site.logged("INFO")
    assert site.changes() == [f"+ tmp/k{first}", f"+ tmp/k{first}/patch.ini"]


@pytest.mark.parametrize("action", ["-i", "-t"])
def test_a_later_one_that_fails_in_loading_keeps_its_own_code(site, action):
    first, second, third = in_listing_order(site, "ox", "yn", "ul")
    Patch(second, prereqs={"ho": "06.10.00"}).write(site.patch_dir)
    expected = site.failed(9, text("ERROR_PP_MISSING_PREREQ", "kho 06.10.00.00"))
    assert site.run("-h", site.home, action, site.patch_dir) == expected
    assert applied(site) == []
    assert not site.home.exists(f"tmp/k{third}")
    assert [change for change in site.changes() if "tmp" not in change] == []
    assert site.home.exists(f"tmp/k{first}/patch.ini")


def test_a_running_server_among_several_patches(site):
    site.home.start("qa")
    in_listing_order(site, "ox")
    path = Patch("qa", target="vems").write(site.patch_dir)
    explanation = f"\n\n{text('ERROR_VEMS_RUNNING', path)}\n"
    only = site.listed()[0] == path.name  # then no patch has been accepted before
    expected = (
        site.ended(32, "", f"{explanation}\n{text('ERROR_DCFPP_NO_APPLICABLE', site.patch_dir)}\n\n")
        if only
        else site.ended(35, "", f"{explanation}\n\n\n")
    )
    assert site.install(site.patch_dir) == expected


def test_nothing_is_applied_before_all_are_loaded(site):
    in_listing_order(site, "ox", "yn", "ul", "gl")
    (site.patch_dir / site.listed()[-1]).write_bytes(b"no archive")
    result = site.install(site.patch_dir)
    assert (result.status, applied(site)) == (3, [])


# --- one of several cannot be applied ------------------------------------------------------------------


def test_the_first_that_cannot_be_applied_ends_the_run(site):
    patches = [marked(code, target=target) for code, target in KINDS]
    patches[2].script("kpt.sh", when="pre", status=5)
    assert site.install(*patches) == site.failed(21, text("PROC_BAD_RC", "kpt.sh", 5))
    assert site.home.calls() == ["zt.sh", "qa.sh", "kpt.sh"]
    assert applied(site) == [("kzt", "vecm", "PASS"), ("kqa", "vems", "PASS"), ("kpt", "veps", "FAIL")]
    # Those that were not reached have left their descriptors, the failed one all that it extracted.
    assert sorted(os.listdir(site.home.path / "tmp")) == ["kdk", "kox", "kpt"]
    assert sorted(os.listdir(site.home.path / "tmp/kpt")) == ["kpt.sh", "patch.ini", "pt.sh"]
    assert os.listdir(site.home.path / "tmp/kox") == ["patch.ini"]


def test_a_report_that_fails_ends_the_reports(site):
    patches = [Patch("zt", target="vecm").directory(), Patch("qa", target="vems"), Patch("ox").directory()]
    result = site.report(*patches)
    assert result.status == 0 and result.err == b"\n"
    assert [line for line in result.out.decode().splitlines() if line.startswith("Processing")] == [
        text("DCFPP_PROCESS_PATCH", site.patch_dir / patch.filename) for patch in patches[:2]
    ]


def test_the_registry_is_read_once(site):
    # A second fix pack of the same product is compared with the level found at the start.
    levels = {"fp0001": "06100300", "fp0002": "06100200"}
    for fixpack, level in levels.items():
        marked("yn", fixpack=fixpack, level=level).write(site.patch_dir)
    assert site.install(site.patch_dir) == site.done()
    last = site.listed()[-1]
    assert site.home.level("yn") == levels[last.split("_")[-1].removesuffix(".tar")]
    # The first has removed the temporary directory that both share, so the second finds none to remove.
    assert site.logged("ERROR") == [text("ERROR_PP_RM_DIR", f"{site.home.prefix}tmp/kyn")]


def test_an_agent_is_stopped_and_started_for_each_patch(site):
    site.home.start("yn", "north")
    assert site.install(Patch("yn"), Patch("ox", dependents=["yn"])) == site.done()
    assert site.home.calls() == ["QuillAgent -o north stop yn", "QuillAgent -o north start yn"] * 2
    assert site.home.instances() == [("yn", "north")]
