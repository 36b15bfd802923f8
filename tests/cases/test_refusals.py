"""Patches that are refused before anything is applied: status, message, and what stands in the home afterwards.

A row is what is installed, what is given, and the problem; an install and a report refuse alike.
"""

import pytest

from support import Patch, stubs
from support.catalogue import text

LOADED = ["+ tmp/kox", "+ tmp/kox/patch.ini"]  # the descriptor stays in the temporary directory
ACTIONS = ["-i", "-t"]


def refused(site, action, target, status, message):
    assert site.run("-h", site.home, action, target) == site.failed(status, message)
    assert message in site.logged("ERROR")
    assert site.home.calls() == [] and site.home.history() == []


# --- the path and the name -----------------------------------------------------------------------------


@pytest.mark.parametrize("action", ACTIONS)
def test_a_path_that_is_not_there(site, action):
    path = site.patch_dir / "absent"
    refused(site, action, path, 30, text("ERROR_DCFPP_PATH", path))
    assert site.changes() == []


@pytest.mark.parametrize("action", ACTIONS)
@pytest.mark.parametrize("content", [(), ("folder",)])
def test_a_directory_without_files(site, action, content):
    for name in content:
        (site.patch_dir / name).mkdir()
    refused(site, action, site.patch_dir, 31, text("ERROR_DCFPP_NO_FILES", site.patch_dir))
    assert site.changes() == []


@pytest.mark.parametrize("action", ACTIONS)
def test_a_directory_without_applicable_files(site, action):
    site.home.component("ox")
    (site.patch_dir / "readme").write_text("no patch")
    Patch("yn").write(site.patch_dir)
    refused(site, action, site.patch_dir, 32, text("ERROR_DCFPP_NO_APPLICABLE", site.patch_dir))
    assert site.logged("INFO")[:-1] == [
        text("DCFPP_PROCESS_DIR", "patches"),
        *[
            line
            for name in site.listed()
            for line in (text("DCFPP_PROCESS_PATCH", name), text("DCFPP_NOT_APPLICABLE", site.patch_dir / name))
        ],
    ]
    assert site.changes() == []


NAMES = [
    "readme.txt",
    "kox_lpp266_vema_fp0001",
    "kox_lpp266_vemx_fp0001.tar",
    "kox_lpp266_VEMA_fp0001.tar",
    "kx_lpp266_vema_fp0001.tar",
    "kox_lpp_266_vema_fp0001.tar",
    "KOX_LPP266_VEMA_FP0001.TAR",
    "kox_ia64_vema_fp0001.tar",  # no platform
    "kox_li6243_vema_fp0001.tar",
    "kox_winnt_vema_fp0001.tar",  # other platforms
    "kox_lpp264_vema_fp0001.tar",
    "kox_unix_vema_fp0001.tar",  # no version file of that platform
    "kyn_lpp266_vema_fp0001.tar",
    "kyn_lpp266_vecm_fp0001.tar",  # not installed
    "kox_lpp266_veps_fp0001.tar",
    "kox_lpp266_vepd_fp0001.tar",  # no portal, no client
    "kox_lpp266_vems_fp0001.tar",
    "kqa_lpp266_vems_fp0001.tar",  # no server support, no server
]


@pytest.mark.parametrize("name", NAMES)
@pytest.mark.parametrize("action", ACTIONS)
def test_a_single_file_that_does_not_apply(site, action, name):
    site.home.component("ox")
    site.home.component("ox", arch="li6243")
    path = Patch("ox").write(site.patch_dir, name)
    refused(site, action, path, 34, text("ERROR_DCFPP_NOT_APPLICABLE", path))
    assert site.changes() == []


def test_a_server_patch_needs_the_server_itself(site):
    site.home.component("qa")
    site.home.remove("config/.ConfigData/kqaenv")
    path = site.target(Patch("qa", target="vems"))
    refused(site, "-i", path, 34, text("ERROR_DCFPP_NOT_APPLICABLE", path))


def test_nothing_is_loaded_from_a_device(site):
    assert site.report("/dev/null") == site.done(f"\n{text('DCFPP_TEST_NO_PATCH')}\n\n")
    assert site.logged("INFO") == [text("DCFPP_TEST_NO_PATCH"), text("MAIN_SUCCESSFUL")]
    assert site.install("/dev/null") == site.done()
    assert site.changes() == []


# --- the archive and its descriptor --------------------------------------------------------------------

ARCHIVES = {"no tar archive": b"no archive", "empty file": b"", "archive without a descriptor": None}


@pytest.mark.parametrize("content", ARCHIVES.values(), ids=ARCHIVES)
@pytest.mark.parametrize("action", ACTIONS)
def test_an_archive_that_tar_refuses(site, action, content):
    site.home.component("ox")
    path = Patch("ox", descriptor=False).member("other").write(site.patch_dir)
    if content is not None:
        path.write_bytes(content)
    refused(site, action, path, 3, text("PROC_BAD_RC", "tar -xf", 2))
    assert site.changes() == ["+ tmp/kox"]


def test_tar_that_is_not_there(site):
    site.home.component("ox")
    path = site.target(Patch("ox"))
    expected = site.failed(3, text("PROC_BAD_RC", "tar -xf", 2))  # the child's error number is its status
    assert site.install(path, env={"PATH": "/nonexistent"}) == expected
    assert "error calling execvp = 2: No such file or directory" in site.logged("ERROR")


def test_tar_that_fails_after_its_work(site):
    site.home.component("ox")
    path = site.target(Patch("ox"))
    tar = stubs(site.patch_dir / "stubs", tar='PATH=${PATH#*:} tar "$@"; exit 7')
    assert site.install(path, env={"PATH": tar}) == site.failed(3, text("PROC_BAD_RC", "tar -xf", 7))
    assert site.changes() == LOADED


def test_no_process_can_be_made(site):
    if site.program.runner:
        pytest.skip("an emulator needs threads of its own")
    site.env["ASAN_OPTIONS"] = "detect_leaks=0"  # so does the search for leaks
    site.home.component("ox")
    path = site.target(Patch("ox"))
    site.as_ordinary_user()
    assert site.install(path, wrapper=["prlimit", "--nproc=0"]) == site.failed(3, text("PROC_CANT_RUN", "tar -xf"))
    assert site.logged("ERROR") == ["Error calling fork - exiting prematurely", text("PROC_CANT_RUN", "tar -xf")]


def temporary_area_is_a_file(site):
    site.home.remove("tmp")
    site.home.write("tmp")


def temporary_directory_is_a_dangling_link(site):
    (site.home.path / "tmp/kox").symlink_to("nowhere")


def temporary_area_is_closed(site):
    site.as_ordinary_user()
    site.home.mkdir("tmp", 0o555)


@pytest.mark.parametrize(
    "spoil", [temporary_area_is_a_file, temporary_directory_is_a_dangling_link, temporary_area_is_closed]
)
def test_a_temporary_directory_that_cannot_be_made(site, spoil):
    site.home.component("ox")
    path = site.target(Patch("ox"))
    spoil(site)
    refused(site, "-i", path, 3, text("ERROR_PP_MAKE_DIR", f"{site.home.prefix}tmp/kox"))
    assert site.changes() == []


def temporary_directory_is_a_file(site):
    site.home.write("tmp/kox")


def temporary_directory_is_closed(site):
    site.as_ordinary_user()
    site.home.mkdir("tmp/kox", 0o666)


@pytest.mark.parametrize("spoil", [temporary_directory_is_a_file, temporary_directory_is_closed])
def test_a_temporary_directory_that_cannot_be_entered(site, spoil):
    site.home.component("ox")
    path = site.target(Patch("ox"))
    spoil(site)
    refused(site, "-i", path, 24, text("ERROR_PP_SET_CWD", f"{site.home.prefix}tmp/kox"))
    assert site.changes() == []


DESCRIPTORS = {
    "no ProductInfo": ("[Other]\n", 6, text("ERROR_PATCH_MISSING_SECTION", "ProductInfo")),
    "a property is missing": (
        "[ProductInfo]\nproductBinArch = x\nproductEXE = x\n",
        7,
        text("ERROR_PATCH_MISSING_PROP", "productLvl"),
    ),
}


@pytest.mark.parametrize("content, status, message", DESCRIPTORS.values(), ids=DESCRIPTORS)
@pytest.mark.parametrize("action", ACTIONS)
def test_a_descriptor_that_is_incomplete(site, action, content, status, message):
    site.home.component("ox")
    path = site.target(Patch("ox", descriptor=content))
    assert site.run("-h", site.home, action, path) == site.failed(status, message)
    assert site.logged("ERROR") == [text("ERROR_PATCH_PARSE")]
    assert site.changes() == LOADED


@pytest.mark.parametrize("action", ACTIONS)
def test_a_descriptor_that_cannot_be_read(site, action):
    site.home.component("ox")
    path = site.target(Patch("ox", descriptor=False).member("patch.ini/inside"))
    descriptor = f"{site.home.prefix}tmp/kox/patch.ini"
    refused(site, action, path, 5, text("ERROR_INIFILE_CANT_READ", descriptor, "Invalid argument"))


# --- what is installed ---------------------------------------------------------------------------------


def old(patch, installed):
    return 11, text("ERROR_PP_OLD_PATCH", patch, installed)


def wrong(code, installed, required):
    return 10, text("ERROR_PP_PREREQ_VER", code, installed, required)


def missing(*prerequisite):
    return 9, text("ERROR_PP_MISSING_PREREQ", " ".join(prerequisite))


def unknown(code):
    return 9, text("ERROR_PP_MISSING_PROD", code)


LEVELS = {  # installed level, the patch, the problem
    "older version": ("07100000", Patch("ox", level="06990000"), old("06.99.00.00", "07.10.00.00")),
    "older release": ("06200000", Patch("ox", level="06100000"), old("06.10.00.00", "06.20.00.00")),
    "older modification": ("06100100", Patch("ox", level="06100005"), old("06.10.00.05", "06.10.01.00")),
    "older fix level": ("06100005", Patch("ox", level="06100004"), old("06.10.00.04", "06.10.00.05")),
    "a newer release is another product": (
        "06100005",
        Patch("ox", level="06200001"),
        wrong("kox", "06.10.00.05", "06.20.00.00"),
    ),
    "a newer version too": ("06.10.00", Patch("ox", level="07100001"), wrong("kox", "06.10.00.00", "07.10.00.00")),
    "another product than the name says": ("06100000", Patch("ox", code="gl"), unknown("kgl")),
    "a version file without a level": ("", Patch("ox"), unknown("kox")),
}


@pytest.mark.parametrize("installed, patch, problem", LEVELS.values(), ids=LEVELS)
@pytest.mark.parametrize("action", ACTIONS)
def test_a_level_that_does_not_fit(site, action, installed, patch, problem):
    site.home.component("ox", installed)
    refused(site, action, site.target(patch), *problem)
    assert site.changes() == LOADED


def test_support_for_a_server_is_never_found(site):
    # The support's version file names no platform, the patch does: by that they never meet.
    site.home.component("ox", filename="oxvms.ver")
    refused(site, "-i", site.target(Patch("ox", target="vems")), *unknown("kox"))


REQUIRED = {  # prerequisites, the problem; installed are kgl 06.10.00.05 (lpp266) and kul 06.20.03.00 (lpp263)
    "not installed": ({"ho": "06.10.00.00"}, missing("kho", "06.10.00.00")),
    "fix level too low": ({"gl": "06.10.00.06"}, wrong("kgl", "06.10.00.05", "06.10.00.06")),
    "three parts": ({"gl": "06.20.00"}, wrong("kgl", "06.10.00.05", "06.20.00.00")),
    "digits": ({"KGL": "062000"}, wrong("kgl", "06.10.00.05", "06.20.00.00")),
    "eight digits": ({"gl": "06100105"}, wrong("kgl", "06.10.00.05", "06.10.01.05")),
    "the first that fails, in the order of codes": (
        {"zz": "06.10.00.00", "gl": "06.20.00.00"},
        wrong("kgl", "06.10.00.05", "06.20.00.00"),
    ),
    "of the platform that the component asks for": ({"ul": "06.20.04"}, wrong("kul", "06.20.03.00", "06.20.04.00")),
    "a platform of none is looked up": ({"ne": "06.10.00"}, missing("kne", "06.10.00.00")),
    "the console's command line is another kind": ({"zt": "06.10.00"}, missing("kzt", "06.10.00.00")),
    "a level that cannot be read counts as the first": ({"ho": "new"}, missing("kho", "06.10.00.00")),
}


@pytest.mark.parametrize("prereqs, problem", REQUIRED.values(), ids=REQUIRED)
def test_a_prerequisite_that_is_not_met(site, prereqs, problem):
    site.home.component("ox", prereqs=["none", "ullpp263|gllpp266"])
    site.home.component("gl", "06100005")
    site.home.component("ul", "06.20.03", arch="lpp263")
    site.home.component("ne", "06100000")
    refused(site, "-i", site.target(Patch("ox", prereqs=prereqs)), *problem)
    assert site.changes() == LOADED


def test_prerequisites_that_are_met(site):
    site.home.component("ox", prereqs=["ullpp263|gllpp266"])
    site.home.component("gl", "06100005")
    site.home.component("ul", "06.20.03", arch="lpp263")
    site.home.component("zt", "06100000")
    prereqs = {"gl": "06.10.00.05", "UL": "062003", "zt": "06.10.00", "ox": "09.00.00"}
    assert site.install(Patch("ox", prereqs=prereqs)) == site.done()
    assert "Prereq previously verified." in site.logged("TRACE")  # its own level has been settled


# --- what is running -----------------------------------------------------------------------------------


def refused_as_running(site, patch, status, key):
    """The explanation is printed at once, the error record then holds an empty text."""
    path = site.target(patch)
    expected = site.ended(status, "", f"\n\n{text(key, path)}\n" "\n\n\n")
    assert site.install(path) == expected
    assert site.report(path) == expected
    assert site.logged("ERROR") == [text(key, path)]
    assert site.home.calls() == []


def test_a_server_patch_while_the_server_runs(site):
    site.home.component("qa")
    site.home.start("qa")
    refused_as_running(site, Patch("qa", target="vems"), 35, "ERROR_VEMS_RUNNING")
    assert site.home.instances() == [("qa", "")]


def test_a_portal_patch_while_the_portal_runs(site):
    site.home.component("pt")
    site.home.start("pt")
    refused_as_running(site, Patch("pt", target="veps"), 36, "ERROR_VEPS_RUNNING")


def test_a_command_line_patch_while_the_console_runs(site):
    site.home.component("zt")
    site.home.start_console()
    refused_as_running(site, Patch("zt", target="vecm"), 37, "ERROR_MVEMS_RUNNING")
