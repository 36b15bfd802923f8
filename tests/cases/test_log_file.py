"""Where the log goes, its header, and runs that cannot write it."""

import os
import pwd
import re
from concurrent.futures import ThreadPoolExecutor

import pytest

from support import Patch
from support.catalogue import text

from golden import golden, words_of
from productsite import SUCCESS
from test_log_lines import DESCRIPTOR

VALID = DESCRIPTOR
RULE = "=" * 78
HEADER = re.compile(
    rf"{RULE}\n ORV Patch Log File\n   System Name: (.*)\n   User Name:   (.*)\n   Process ID:  (\d+)\n"
    rf"   Build Date:  ([1-9]\d?/[1-9]\d?/\d\d \d\d:\d\d:\d\d)\n{RULE}\n"
)
PREFIX = re.compile(r"^(ERROR|INFO |TRACE) \d\d:\d\d:\d\d \(([^,]+),\d+\): ", re.MULTILINE)
SHORT_LEVEL = {"ERROR": "ERROR", "INFO": "INFO ", "TRACE": "TRACE"}


def validation_lines(site, path):
    return golden("validation", **words_of(site, GIVEN=path))


def as_printed(lines):
    return "".join(f"{SHORT_LEVEL[level]} ({component}): {message}\n" for level, component, message in lines)


def without_times(printed):
    """What was printed, with neither time nor line number in the prefix, nor the address of a buffer."""
    return re.sub(r"\(0x[0-9a-f]+\) exit", "({BUFFER}) exit", PREFIX.sub(r"\1 (\2): ", printed))


def test_a_run_writes_a_header_and_its_lines(site):
    path = site.descriptor(VALID)
    site.validate(path)
    logged = site.home.read("patchlogs/orvpatch.log").decode()
    header = HEADER.match(logged)
    assert header.groups()[:2] == (os.uname().nodename.split(".")[0], pwd.getpwuid(os.getuid()).pw_name)
    assert without_times(logged[header.end() :]) == as_printed(validation_lines(site, path))


def test_the_header_names_the_process_of_the_run(site):
    result = site.validate(VALID, wrapper=["/bin/sh", "-c", 'echo $$; exec "$0" "$@"'])
    pid, _, rest = result.out.partition(b"\n")
    assert rest.endswith(SUCCESS.encode())
    assert site.home.log().headers[0].pid == int(pid)


def test_each_run_adds_to_the_same_file(site):
    path = site.descriptor(VALID)
    site.home.write("patchlogs/orvpatch.log", "an older line\n")
    site.validate(path)
    site.validate(path)
    log = site.home.log()
    assert log.preamble == "an older line\n"
    assert [len(run.lines) for run in log.runs] == [len(validation_lines(site, path))] * 2
    assert log.runs[0].header.pid != log.runs[1].header.pid


def test_lines_of_runs_side_by_side_stay_whole(site):
    path = site.descriptor(VALID)
    with ThreadPoolExecutor() as pool:
        results = [pool.submit(site.program.validate, site.home, path) for _ in range(6)]
    assert {result.result().status for result in results} == {0}
    logged = HEADER.sub("", site.home.read("patchlogs/orvpatch.log").decode())
    assert sorted(without_times(logged).splitlines()) == sorted(
        as_printed(validation_lines(site, path)).splitlines() * 6
    )


def test_a_missing_folder_is_made(site):
    site.home.remove("patchlogs")
    site.validate(VALID, wrapper=["/bin/sh", "-c", 'umask 022; exec "$0" "$@"'])
    assert site.home.tree()["patchlogs"][:2] == ("directory", 0o755)
    assert len(site.home.log().runs) == 1


@pytest.mark.parametrize("value", ["", "0", "yes"])
def test_patch_debug_sends_everything_to_standard_output(site, value):
    site.home.remove("patchlogs")
    path = site.descriptor(VALID)
    result = site.validate(path, env={"PATCH_DEBUG": value})
    header = HEADER.match(result.out.decode())
    *lines, verdict, end = validation_lines(site, path)
    expected = as_printed(lines) + f"\n{path} is valid\n\n" + as_printed([verdict]) + SUCCESS + as_printed([end])
    assert without_times(result.out[header.end() :].decode()) == expected
    assert (result.status, result.err) == (0, b"")
    assert site.changes() == []


def test_a_patch_is_applied_under_patch_debug_but_not_recorded_without_the_folder(site):
    site.home.remove("patchlogs")
    site.home.component("ox")
    result = site.install(Patch("ox").file("bin/tool"), env={"PATCH_DEBUG": ""})
    problem = text("ERROR_PP_UPDATE_HIST", f"{site.home.prefix}patchlogs/patches.hist", "No such file or directory")
    assert (result.status, result.err) == (0, b"")
    assert f"ERROR (patchprocessor): {problem}\n" in without_times(result.out.decode())
    assert site.changes() == ["+ bin/tool", "* registry/oxlpp266.ver"]


def test_under_patch_debug_the_report_stands_among_the_lines_of_its_steps(site):
    site.home.component("ox")
    result = site.report(Patch("ox").file("bin/tool"), env={"PATCH_DEBUG": ""})
    steps = [
        "TRACE (dcfpackageprocessor): DCFPackageProcessor::testRun() entry\n",
        "TRACE (patchprocessor): PatchProcessor::cleanUp() = 1\n",
        f"\n{'=' * 70}\n",
        "TRACE (patchprocessor): PatchProcessor::testRun() entry\n",
        "TRACE (patchprocessor): PatchProcessor::listFiles() entry\n",
        "/bin/tool",
        "\n\nTRACE (patchprocessor): PatchProcessor::listFiles() exit\n",
        "TRACE (patchprocessor): PatchProcessor::testRun() = 1\n",
    ]
    _, begin, rest = without_times(result.out.decode()).partition(steps[0])
    assert begin
    for step in steps[1:]:
        before, found, rest = rest.partition(step)
        assert found, f"{step!r} does not follow in its place:\n{before}"


def complaints(site, count):
    return (text("LOG_CANT_WRITE", f"{site.home.prefix}patchlogs/orvpatch.log") + "\n") * count


def folder_is_a_file(site):
    site.home.remove("patchlogs")
    site.home.write("patchlogs")


def folder_is_a_dangling_link(site):
    site.home.remove("patchlogs")
    (site.home.path / "patchlogs").symlink_to("nowhere")


def log_is_a_directory(site):
    site.home.mkdir("patchlogs/orvpatch.log")


def folder_is_read_only(site):
    site.as_ordinary_user()
    site.home.mkdir("patchlogs", 0o555)


UNWRITABLE = [folder_is_a_file, folder_is_a_dangling_link, log_is_a_directory, folder_is_read_only]


@pytest.mark.parametrize("spoil", UNWRITABLE)
def test_each_line_that_cannot_be_written_is_reported(site, spoil):
    path = site.descriptor(VALID)
    spoil(site)
    expected = complaints(site, 1 + len(validation_lines(site, path)))
    assert site.validate(path) == site.done(f"\n{path} is valid\n\n", expected)
    assert site.changes() == []


@pytest.mark.parametrize("spoil", UNWRITABLE)
def test_a_patch_is_applied_without_a_log(site, spoil):
    site.home.component("ox")
    patch = site.target(Patch("ox").file("bin/tool"))
    site.home.write("bin/tool")
    site.install(patch)
    lines = len(site.log())
    site.home.remove("patchlogs")
    site.home.mkdir("patchlogs")
    spoil(site)
    recorded = spoil is log_is_a_directory  # elsewhere the history fails too, which is one more line
    assert site.install(patch) == site.done(err=complaints(site, 1 + lines + (not recorded)))
    assert [change for change in site.changes() if "patchlogs" not in change] == []
    assert [entry.result for entry in site.home.history()] == ["PASS"] * recorded


def test_every_line_of_a_failing_run_is_reported_too(site):
    folder_is_a_file(site)
    missing = site.patch_dir / "absent"
    result = site.install(missing)
    assert result.status == 30
    assert result.out == site.failed(30, "").out
    message = f"\n{text('ERROR_DCFPP_PATH', missing)}\n\n".encode()
    before, _, after = result.err.partition(message)
    assert before.decode() == complaints(site, before.count(b"\n"))
    assert after.decode() == complaints(site, 3)  # action, verdict, end
