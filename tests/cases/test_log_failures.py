"""Runs that fail, in the log: level, component and message of every line, a failure of each layer."""

import pytest

from support import Patch, stubs

from catalogue import text
from loglines import (Found, called, error, expect, info, is_running, joined, list_directory, look_up,
                      make_directory, parse_bad_descriptor, path_exists, registry, run_command,
                      run_missing_command, start_agent, stop_agent, trace)
from patchlines import (PACKAGE, PATCH, PatchLines, done, installing, nothing_happens, package, package_destroyed,
                        run, single_file)


def not_loaded(site, path, *loading, status):
    """The installation ends before anything is applied."""
    lines = installing(path, package(path, site.home, *loading, result=0), status=status)
    expect(site, ["-h", site.home.path, "-i", path], lines, status)


# --- package -------------------------------------------------------------------------------------------

def test_a_path_that_is_not_there(site):
    path = site.patch_dir / "absent"
    not_loaded(site, path, error(PACKAGE, text("ERROR_DCFPP_PATH", path)), status=30)


def test_a_directory_without_files(site):
    not_loaded(site, site.patch_dir, info(PACKAGE, text("DCFPP_PROCESS_DIR", "patches")), list_directory(),
               error(PACKAGE, text("ERROR_DCFPP_NO_FILES", site.patch_dir)), status=31)


def test_a_directory_without_patches(site):
    path = site.patch_dir / "readme"
    path.touch()
    not_loaded(site, site.patch_dir, info(PACKAGE, text("DCFPP_PROCESS_DIR", "patches")), list_directory(),
               info(PACKAGE, text("DCFPP_PROCESS_PATCH", "readme")), PatchLines(site.home, path).ignored(),
               trace(PACKAGE, "_patchProcessors empty. No patches to install"),
               error(PACKAGE, text("ERROR_DCFPP_NO_APPLICABLE", site.patch_dir)), status=32)


def not_applicable(site, path, *checks):
    not_loaded(site, path, single_file(path), PatchLines(site.home, path).applicable(*checks, result=0),
               error(PACKAGE, text("ERROR_DCFPP_NOT_APPLICABLE", path)), status=34)


@pytest.mark.parametrize("name, problem", {
    "kox.tar": "invalid patch file name: kox.tar",
    "kx_lpp_vema_1.tar": "invalid product in patch file name: kx",
    "kox_ia64_vema_1.tar": "invalid platform architecture in patch file name: ia64",
    "kox_lpp_vemx_1.tar": "Invalid target: vemx",
    "kox_lpp_vema_1": "invalid fixpack level in patch file name: 1",
}.items())
def test_a_name_that_is_none_of_a_patch(site, name, problem):
    path = Patch("ox").write(site.patch_dir, name)
    not_applicable(site, path, trace("patchfilename", problem), trace(
        PACKAGE, f"Specified filename: {name}, is not a valid patch filename, therefore the file is not an "
        "applicable patch."))


def test_a_patch_of_another_platform(site):
    path = Patch("ox").write(site.patch_dir, "kox_lia266_vema_1.tar")
    not_applicable(site, path, trace(
        PACKAGE, "Platform specified in patch filename: li, does not match current platform: lpp. Patch is not "
        "applicable."))


SERVER, PORTAL, CLIENT = "config/.ConfigData/kqaenv", "registry/ptlpp266.ver", "registry/dklpp266.ver"


@pytest.mark.parametrize("product, target, present, absent, wording", [
    ("qa", "vems", SERVER, "registry/qalpp266.ver", "VEMS"),
    ("xe", "vems", SERVER, "registry/xevms.ver", "VEMS"),
    ("xe", "veps", PORTAL, "registry/xevps.ver", "VEPS"),
    ("xe", "vepd", CLIENT, "registry/xevpd.ver", "VEPS"),  # KEEP(vepd-veps-words): the portal's
    ("xe", "vema", None, "registry/xelpp266.ver", "VEMA"),
    ("XE", "vecm", None, "registry/xelpp266.ver", "VECM"),
    ("pt", "veps", None, PORTAL, None),
    ("dk", "vepd", None, CLIENT, None),
])
def test_a_component_that_is_not_installed(site, product, target, present, absent, wording):
    found = []
    if present:
        site.home.write(present)
        found.append(path_exists(f"{site.home.prefix}{present}"))
    message = trace(PACKAGE, f"{wording} support not installed for: k{product}") if wording else []
    path = site.target(Patch(product, target=target))
    not_applicable(site, path, *found, path_exists(f"{site.home.prefix}{absent}", there=False), message)


# --- archive and descriptor ----------------------------------------------------------------------------

@pytest.fixture
def patched(site):
    """A function that makes the archive and the log lines of a patch for the installed "yn"."""
    site.home.component("yn", desc="Yellow Net")

    def make(patch, product="kyn"):
        path = site.target(patch)
        return path, PatchLines(site.home, path, product)
    return make


def test_an_archive_that_cannot_be_unpacked(site, patched):
    path, lines = patched(Patch("yn"))
    site.env["PATH"] = stubs(site.patch_dir / "stubs", tar="echo out; echo err >&2; exit 2")
    failed = done("extractINI", make_directory(f"{lines.temp}/"), run_command("tar", "-xf", path, "patch.ini"),
                  trace(PATCH, "tar returned: 2", "stdout: out\n", "stderr: err\n"),
                  error(PATCH, text("PROC_BAD_RC", "tar -xf", 2)), result=0)
    not_loaded(site, path, single_file(path), lines.made(), lines.not_initialized(
        failed, f"Unable to extract patch contents for: {path}"), lines.destroyed(with_descriptor=False), status=3)


def test_a_temporary_directory_that_cannot_be_made(site, patched):
    path, lines = patched(Patch("yn"))
    site.home.remove("tmp")
    site.home.write("tmp")
    failed = joined(trace(PATCH, "PatchProcessor::extractINI() entry"),
                    make_directory(f"{site.home.prefix}tmp/", there=0),
                    error(PATCH, text("ERROR_PP_MAKE_DIR", lines.temp)))
    not_loaded(site, path, single_file(path), lines.made(), lines.not_initialized(
        failed, f"Unable to extract patch contents for: {path}"), lines.destroyed(with_descriptor=False), status=3)


def test_an_incomplete_descriptor(site, patched):
    path, lines = patched(Patch("yn", descriptor="[PreReqs]\n"))
    parsed = parse_bad_descriptor(f"{lines.temp}/patch.ini", "PreReqs", missing="section")
    failed = joined(lines.extracted_ini(), done("parsePatchDescriptor", parsed, result=0))
    not_loaded(site, path, single_file(path), lines.made(), lines.not_initialized(
        failed, f"Unable to load patch.ini contents for: {path}"), lines.destroyed(with_descriptor=False), status=6)


# --- activity and prerequisites ------------------------------------------------------------------------

def test_a_running_server(site, patched):
    site.home.component("qa")
    site.home.start("qa")
    path, lines = patched(Patch("qa", target="vems"), "kqa")
    found = registry(site.home, {"qalpp266.ver": Found((site.home.pid("qa"),)), "ynlpp266.ver": Found()})
    active = lines.active_programs(joined(
        found, look_up(),
        trace(PATCH, f"Found a running instance of the VEMS server. Aborting installation of {path}."),
        error(PATCH, text("ERROR_VEMS_RUNNING", path))), result=0)
    server = [path_exists(f"{site.home.prefix}{SERVER}"), path_exists(lines.version_file)]
    not_loaded(site, path, single_file(path), lines.made(*server), lines.initialized(),
               trace(PACKAGE, "Patch initialization succeeded"), active,
               trace(PACKAGE, "Patch installation terminated because of an active server."),
               lines.destroyed(), status=35)


def not_met(site, path, lines, *checks, sections=(), status):
    found = registry(site.home, {"ynlpp266.ver": Found()})
    refused = done("checkPrereqs", found, look_up(by_arch=True), *checks, result=0)
    not_loaded(site, path, single_file(path), lines.checked(lines.initialized(*sections), refused),
               trace(PACKAGE, f"Missing prereqs for patch: {path}"), lines.destroyed(), status=status)


def test_a_product_that_is_not_installed(site, patched):
    path, lines = patched(Patch("yn", code="kgl"))
    not_met(site, path, lines, error(PATCH, text("ERROR_PP_MISSING_PROD", "kgl")), status=9)


def test_a_back_level_patch(site, patched):
    path, lines = patched(Patch("yn", level="06099999"))
    message = text("ERROR_PP_OLD_PATCH", "06.09.99.99", "06.10.00.00")
    not_met(site, path, lines, error(PATCH, message), status=11)


def test_a_missing_prerequisite(site, patched):
    path, lines = patched(Patch("yn", prereqs={"khv": "6.1"}))
    default = "Unrecognized VVRRMMFF version string format provided: 6.1. Defaulting to 06100000"
    not_met(site, path, lines, trace(PATCH, "Check for prereq for khv"), trace("version.cpp", default),
            lines.arch_of_prereq(""), look_up(), error(PATCH, text("ERROR_PP_MISSING_PREREQ", "khv 06.10.00.00")),
            sections=["PreReqs"], status=9)


# --- the steps of an installation ----------------------------------------------------------------------

def not_applied(site, path, lines, *steps, status, sections=()):
    """The patch is loaded as usual; then its steps, up to the failing one, and what always follows."""
    pids = tuple(row.pid for row in site.home.rows())
    found = registry(site.home, {"ynlpp266.ver": Found(pids)})
    expect(site, ["-h", site.home.path, "-i", path], installing(
        path,
        package(path, site.home, single_file(path),
                lines.accepted(lines.initialized(*sections), lines.prerequisites(found))),
        run(lines.cleaned_up(), done("run", *steps, lines.os_agent(), lines.recorded(), result=0),
            trace(PACKAGE, "Unable to apply patch: Fix pack fp0001 for kyn")),
        package_destroyed(lines.destroyed()), status=status), status)


def test_a_command_that_fails(site, patched):
    path, lines = patched(Patch("yn").script("a.sh", "pre_patch").script("b.sh", "pre_patch", status=3, out="o"))
    outcome = joined(run_command("b.sh"), error(PATCH, text("PROC_BAD_RC", "b.sh", 3), "stdOut: o", "stdErr: "))
    not_applied(site, path, lines, lines.extracted(),
                lines.scripts("runPrePatchScripts", ("a.sh", "", ""), ("b.sh", "", ""), outcome=outcome),
                sections=["PrePatchCommands"], status=22)


def test_a_command_that_is_not_there(site, patched):
    path, lines = patched(Patch("yn", pre_patch=["a b"]))
    outcome = joined(run_missing_command("a b"),
                     error(PATCH, text("PROC_BAD_RC", "a b", 2), "stdOut: ", "stdErr: "))
    not_applied(site, path, lines, lines.extracted(),
                lines.scripts("runPrePatchScripts", ("a b", "", ""), outcome=outcome),
                sections=["PrePatchCommands"], status=22)


def test_an_instance_that_does_not_stop(site, patched):
    path, lines = patched(Patch("yn"))
    site.home.start("yn", "north")
    site.home.fail("stop", "yn", status=4, err="no")
    message = text("ERROR_STOP_INST", "north", "Yellow Net", "Yellow Net")
    outcome = joined(called(4, "", "no"), is_running(site.home.pid("yn", "north")), error("orvcomponent", message))
    not_applied(site, path, lines, lines.extracted(), lines.scripts("runPrePatchScripts"),
                trace(PATCH, "PatchProcessor::stopDependents() entry"), look_up(),
                trace(PATCH, "Attempting to stop instance [north]"),
                stop_agent(site.home, "-o", "north", "stop", "yn", instance="north", outcome=outcome),
                trace(PATCH, "stop failed, exiting method prematurely"), status=15)


def test_a_file_that_cannot_be_moved(site, patched):
    path, lines = patched(Patch("yn").file("tool"))
    site.home.mkdir("tool")
    # KEEP(movefiles-exit-name): the last line of the step names moveFile, like those of its entries.
    target, source = f"{site.home.prefix}./tool", f"{lines.sources}/./tool"
    not_applied(site, path, lines, *lines.steps_up_to_files(),
                lines.moved_files(lines.directory(lines.not_moved(source, target, "File exists")), result=0),
                status=25)


def test_a_directory_that_cannot_be_made(site, patched):
    path, lines = patched(Patch("yn").directory("new"))
    (site.home.path / "new").symlink_to("nowhere")
    target = f"{site.home.prefix}./new/"
    not_applied(site, path, lines, *lines.steps_up_to_files(),
                lines.moved_files(lines.directory(lines.not_made(target)), result=0), status=26)


def test_a_version_file_that_has_gone(site, patched):
    path, lines = patched(Patch("yn").script("a.sh", "post", body='rm "$QUILLHOME/registry/ynlpp266.ver"'))
    not_applied(site, path, lines, *lines.steps_up_to_files(), lines.no_files(),
                nothing_happens("updateProductEXEFiles"), lines.scripts("runPostScripts", ("a.sh", "", "")),
                lines.version_not_updated(), sections=["PostCommands"], status=28)


def test_an_instance_that_does_not_start(site, patched):
    path, lines = patched(Patch("yn"))
    site.home.start("yn")
    site.home.fail("start", "yn", status=9)
    outcome = called(9) + error("orvcomponent", text("ERROR_START_AGENT", "Yellow Net"))
    not_applied(site, path, lines, lines.extracted(), lines.scripts("runPrePatchScripts"),
                done("stopDependents", look_up(), lines.stopped("", "stop", "yn"),
                     trace(PATCH, "Stopped 1 instance(s) of kyn")),
                lines.scripts("runPreScripts"), lines.no_files(), nothing_happens("updateProductEXEFiles"),
                lines.scripts("runPostScripts"), lines.version_updated(),
                done("startDependents", look_up(), trace(PATCH, "Attempting to start instance []"),
                     start_agent(site.home, " start yn", outcome=outcome),
                     trace(PATCH, "start failed, exiting method prematurely"), result=0), status=12)


def test_an_os_agent_that_does_not_start(site):
    site.home.component("ox", desc="Linux OS")
    site.home.start("ox")
    site.home.fail("start", "ox", err="no")
    path = site.target(Patch("ox"))
    lines = PatchLines(site.home, path, "kox")
    outcome = called(1, "", "no") + error("orvcomponent", text("ERROR_START_AGENT", "Linux OS"))
    wording = "Patch seems to be successfully applied. However, the OS agent could not be restarted"
    found = registry(site.home, {"oxlpp266.ver": Found((site.home.pid("ox"),))})
    expect(site, ["-h", site.home.path, "-i", path], installing(
        path,
        package(path, site.home, single_file(path), lines.accepted(lines.initialized(), lines.prerequisites(found))),
        run(lines.cleaned_up(),
            done("run", lines.extracted(), lines.scripts("runPrePatchScripts"),
                 done("stopDependents", look_up(), lines.stopped("", "stop", "ox"),
                      trace(PATCH, "Stopped 1 instance(s) of kox")),
                 lines.scripts("runPreScripts"), lines.no_files(), nothing_happens("updateProductEXEFiles"),
                 lines.scripts("runPostScripts"), lines.version_updated(), done("startDependents", look_up()),
                 lines.os_agent_restarted(start_agent(site.home, " start ox", outcome=outcome), result=0),
                 trace(PATCH, wording), lines.recorded(), result=0),
            trace(PACKAGE, "Unable to apply patch: Fix pack fp0001 for kox")),
        package_destroyed(lines.destroyed()), status=12), 12)


def test_a_clean_up_and_a_history_that_fail_without_failing_the_patch(site, patched):
    """The temporary directory is a link; the place of the history is taken by a directory."""
    elsewhere = site.patch_dir / "elsewhere"
    elsewhere.mkdir()
    path, lines = patched(Patch("yn"))
    (site.home.path / "tmp/kyn").symlink_to(elsewhere)
    site.home.mkdir("patchlogs/patches.hist")
    history = text("ERROR_PP_UPDATE_HIST", f"{site.home.prefix}patchlogs/patches.hist", "Is a directory")
    found = registry(site.home, {"ynlpp266.ver": Found()})
    kept = lines.not_cleaned_up()
    expect(site, ["-h", site.home.path, "-i", path], installing(
        path,
        package(path, site.home, single_file(path),
                lines.accepted(lines.initialized(there=True), lines.prerequisites(found))),
        run(kept, done("run", lines.extracted(there=True), *lines.steps_up_to_files()[1:], lines.no_files(),
                       nothing_happens("updateProductEXEFiles"), lines.scripts("runPostScripts"),
                       lines.version_updated(), done("startDependents"), lines.os_agent(),
                       lines.recorded(error(PATCH, history))), kept),
        package_destroyed(lines.destroyed())), 0)
