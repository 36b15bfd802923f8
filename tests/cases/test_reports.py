"""The report of one patch and of several, byte for byte."""

import pytest

from support import Patch
from support.catalogue import text

OX, YN = "Monitoring Agent for Linux OS", "Yellow Net Agent"
RULE = "=" * 70
LEFT = ["+ tmp/kox", "+ tmp/kox/patch.ini"]
ALL_COMMANDS = {"pre_patch": ["b_first.sh", "a_first.sh"], "pre": ["stopped.sh"], "post": ["z", "10 --last"]}

NO_INSTANCES = text("PP_NO_RUNNING_INST") + "\n\n"
NO_PRE_PATCH = text("PP_TEST_NO_PREPATCHSCRIPT") + "\n\n"
NO_PRE = text("PP_TEST_NO_PRESCRIPT") + "\n"
NO_POST = text("PP_TEST_NO_POSTSCRIPT") + "\n\n"
STOPPED = text("PP_LIST_AGENT_INST") + "\n"
FILES = f"\n{text('PP_LIST_FILES')}\n"


def head(path, title="Fix pack fp0001 for kox"):
    return f"\n{RULE}\nProcessing patch file: {path}\n    {title}\n\n"


@pytest.fixture
def site(site):
    """Two agents are installed. No report changes anything in the home, but one that fails leaves what it
    has extracted."""
    site.home.component("ox", desc=OX)
    site.home.component("yn", desc=YN)
    yield site
    assert [change for change in site.changes() if not change.startswith("+ tmp/kox")] == []
    assert site.home.calls() == [] and site.home.history() == []


def test_the_least_report(site):
    path = site.target(Patch("ox").directory())
    assert site.report(path) == site.done(
        f"""
{RULE}
Processing patch file: {path}
    Fix pack fp0001 for kox

No commands to be executed before the agent instances are stopped.

No instances of running dependent agents to stop or restart.

No commands to be executed after stopping the agent instances.

The following files will be installed or replaced with new files:

No commands to be executed before starting the agent instances.

"""
    )
    assert site.changes() == []


def test_the_whole_report(site):
    site.home.start("ox")
    site.home.start("yn", "north")
    site.home.start("yn", "south")
    path = site.target(
        Patch("ox", title="Fix pack 1: 100%s", dependents=["yn"], **ALL_COMMANDS)
        .file("bin/lib/liba.so")
        .file("bin/tool")
        .file("readme")
    )
    home = site.home.path
    assert site.report(path) == site.done(
        f"""
{RULE}
Processing patch file: {path}
    Fix pack 1: 100%s

The following commands will be executed before agent instances are stopped:
    a_first.sh
    b_first.sh

The following agent instances will be stopped during the patch application and restarted afterwards:
    {OX}
    north instance of {YN}
    south instance of {YN}

The following commands will be executed after agent instances are stopped:
    stopped.sh

The following files will be installed or replaced with new files:
    {home}/bin/lib/liba.so
    {home}/bin/tool
    {home}/readme

The following commands will be executed before restarting any previously stopped agents:
    10 --last
    z

"""
    )
    assert site.changes() == []


@pytest.mark.parametrize(
    "when, shown",
    [
        ("pre_patch", (text("PP_TEST_PREPATCHSCRIPT") + "\n    go.sh\n\n", NO_PRE, NO_POST)),
        ("pre", (NO_PRE_PATCH, text("PP_TEST_PRESCRIPT") + "\n    go.sh\n", NO_POST)),
        ("post", (NO_PRE_PATCH, NO_PRE, text("PP_TEST_POSTSCRIPT") + "\n    go.sh\n\n")),
    ],
)
def test_one_command_list(site, when, shown):
    before, after, last = shown
    path = site.target(Patch("ox").file("readme").command(when, "go.sh"))
    assert site.report(path) == site.done(
        head(path) + before + NO_INSTANCES + after + FILES + f"    {site.home.path}/readme\n\n" + last
    )


def test_a_command_is_cut_at_its_equal_sign(site):
    path = site.target(Patch("ox", post=["run.sh x=1"]).directory())
    assert b"stopped agents:\n    run.sh x\n\n" in site.report(path).out


def test_without_files_the_report_ends_early_and_prints_an_empty_error(site):
    # KEEP(list-no-files-false) and KEEP(record-is-status): a failure that has no code ends with status 0.
    site.home.start("ox")
    path = site.target(Patch("ox", post=["never shown"]))
    expected = head(path) + NO_PRE_PATCH + STOPPED + f"    {OX}\n\n" + NO_PRE + "\n"
    assert site.report(path) == site.done(expected, err="\n")
    assert text("PP_NO_FILES") in site.logged("INFO")
    assert site.changes() == LEFT


def test_the_report_on_two_patches(site):
    site.home.start("yn", "north")
    first = Patch("ox", title="Patch of the OS agent").file("bin/ox")
    second = Patch("yn", title="Patch of Yellow Net", post=["go.sh"]).file("bin/yn")
    reports = {
        first.filename: head(site.patch_dir / first.filename, first.title)
        + NO_PRE_PATCH
        + NO_INSTANCES
        + NO_PRE
        + FILES
        + f"    {site.home.path}/bin/ox\n\n"
        + NO_POST,
        second.filename: head(site.patch_dir / second.filename, second.title)
        + NO_PRE_PATCH
        + STOPPED
        + f"    north instance of {YN}\n\n"
        + NO_PRE
        + FILES
        + f"    {site.home.path}/bin/yn\n\n"
        + text("PP_TEST_POSTSCRIPT")
        + "\n    go.sh\n\n",
    }
    folder = site.target(first, second)
    assert site.report(f"{folder}/") == site.done("".join(reports[name] for name in site.listed()))
    assert site.changes() == []


def test_a_file_that_stands_there_is_listed_like_a_new_one(site):
    site.home.write("bin/tool", "old")
    path = site.target(Patch("ox").file("bin/tool").directory("empty"))
    assert f"{FILES}    {site.home.path}/bin/tool\n\n".encode() in site.report(path).out


def test_the_log_tells_where_each_file_comes_from(site):
    site.report(Patch("ox").file("bin/tool"))
    shown = f"{site.home.prefix}tmp/kox/updated_files/bin/tool --> {site.home.prefix}bin/tool"
    assert site.logged("INFO") == [text("PP_LIST_FILES"), shown, text("MAIN_SUCCESSFUL")]


# --- which instances are listed ------------------------------------------------------------------------


def listed(site, *lines):
    """The part between the two command lists."""
    return (STOPPED + "".join(f"    {line}\n" for line in lines) + "\n" if lines else NO_INSTANCES) + NO_PRE


def test_instances_are_listed_in_the_order_of_product_codes(site):
    site.home.start("yn", "two")
    site.home.start("yn")
    site.home.start("ox")
    path = site.target(Patch("yn", dependents=["zz", "ox"]).directory())
    assert listed(site, OX, f"two instance of {YN}", YN).encode() in site.report(path).out


def test_the_universal_agent_keeps_its_inner_instances(site):
    site.home.component("wn", desc="Universal Agent")
    for name in ("hostkwnsnetd_1", "kwnstrap_", "north"):
        site.home.start("wn", name)
    path = site.target(Patch("ox", dependents=["wn"]).directory())
    assert listed(site, "north instance of Universal Agent").encode() in site.report(path).out


def test_an_agent_of_which_all_instances_are_skipped_leaves_an_empty_list(site):
    site.home.component("wn", desc="Universal Agent")
    site.home.start("wn", "kwnstrap_")
    path = site.target(Patch("ox", dependents=["wn"]).directory())
    assert f"{STOPPED}\n{NO_PRE}".encode() in site.report(path).out


def test_a_server_is_listed_when_it_is_named(site):
    site.home.component("qa", desc="Monitoring Server")
    site.home.start("qa")
    path = site.target(Patch("ox", dependents=["qa"]).directory())
    assert listed(site, "Monitoring Server").encode() in site.report(path).out


@pytest.mark.parametrize("word", ["all", "ALL", "All"])
def test_all_means_every_agent_but_no_server(site, word):
    site.home.component("qa", desc="Monitoring Server")
    site.home.component("wn", desc="Universal Agent")
    for code, name in [("qa", ""), ("wn", "kwnsnetd_"), ("ox", ""), ("yn", "north")]:
        site.home.start(code, name)
    path = site.target(Patch("ox", dependents=[word]).directory())
    assert listed(site, OX, f"north instance of {YN}").encode() in site.report(path).out


def test_all_counts_as_the_first_entry_only(site):
    # Sorted, "aaa" stands before it, and "all" then is a product code like any other.
    site.home.start("yn", "north")
    path = site.target(Patch("ox", dependents=["all", "aaa"]).directory())
    assert listed(site).encode() in site.report(path).out


def test_a_support_patch_lists_no_instances(site):
    site.home.component("dk", desc="Portal Client")
    site.home.start("yn")
    path = site.target(Patch("dk", target="vepd", dependents=["yn"]).directory())
    assert listed(site).encode() in site.report(path).out


# --- reports that fail ---------------------------------------------------------------------------------


def test_the_code_of_a_stray_line_is_that_of_a_report_without_files(site):
    # Nothing failed but the search for files, which leaves the record alone: it still holds the stray line.
    text_of_patch = "stray\n" + Patch("ox", exe="x").descriptor_text()
    path = site.target(Patch("ox", descriptor=text_of_patch))
    shown = head(path) + NO_PRE_PATCH + NO_INSTANCES + NO_PRE + "\n"
    assert site.report(path) == site.report_failed(4, text("ERROR_INIFILE_PROP"), shown)
    assert site.changes() == LEFT


def test_files_that_are_no_directory(site):
    # KEEP(testpatch-one-newline)
    path = site.target(Patch("ox").member("updated_files"))
    shown = head(path) + NO_PRE_PATCH + NO_INSTANCES + NO_PRE + "\n"
    message = text("ERROR_PP_SET_CWD", f"{site.home.prefix}tmp/kox/updated_files")
    assert site.report(path) == site.report_failed(24, message, shown)
    assert site.changes() == [*LEFT, "+ tmp/kox/updated_files"]


def test_the_code_of_a_clean_up_is_that_of_a_second_report_without_files(site):
    # After the first patch of a product there is nothing left that the next clean-up could remove.
    first, second = Patch("ox", fixpack="fp0001"), Patch("ox", fixpack="fp0002")
    folder = site.target(first.directory(), second.directory())
    assert site.report(folder).status == 0
    for patch in (first, second):
        Patch("ox", fixpack=patch.fixpack).write(folder)
    names = site.listed()
    Patch("ox", fixpack=names[0][-10:-4]).directory().write(folder)
    result = site.report(folder)
    assert (result.status, result.err) == (
        27,
        f"Unable to remove temporary directory: {site.home.prefix}tmp/kox\n".encode(),
    )
