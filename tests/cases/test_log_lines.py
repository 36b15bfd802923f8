"""Whole runs in the log: level, component and message of every line, in order."""

import os

from support import Patch

from catalogue import text
from loglines import (Found, around, expect, info, joined, level, list_directory, look_up, parse_bad_descriptor,
                      parse_descriptor, parse_missing_ini, registry, run_command, start_agent, start_server,
                      stop_agent, trace)
from patchlines import (PACKAGE, PATCH, PatchLines, done, installing, nothing_happens, package, package_destroyed,
                        reported, run, single_file, sorted_processors)


# --- validation ----------------------------------------------------------------------------------------

def test_a_good_descriptor(site):
    path = site.descriptor(Patch("ox", exe="x", prereqs={"gl": "061000"}, dependents=["ul", "kyn"],
                                 post=["a"]).descriptor_text().replace("= kox", "= OX", 1))
    prefixed = {"2 letter pre-req, prepending a 'k'": "PreReqs",
                "read a two-letter dependent, prepending 'k' to it": "Dependents"}
    lines = parse_descriptor(path, "PreReqs", "Dependents", "PostCommands", skipped=(), two_letters=prefixed)
    after_entry = lines.index(("TRACE", "patchdescriptor.cpp", "PatchDescriptor::buildInfoSectionentry")) + 1
    lines[after_entry:after_entry] = trace(
        "patchdescriptor.cpp", "2 letter product code, prepending the letter k, result: kox")
    destroyed = trace("patchdescriptor.cpp", "PatchDescriptor::~PatchDescriptor entry")
    expect(site, ["-h", site.home.path, "-vi", path], lines + destroyed, 0)


def test_a_descriptor_that_is_not_there(site):
    path = site.patch_dir / "absent"
    lines = trace("patchdescriptor.cpp", f"PatchDescriptor::parseFile({path}) entry") + parse_missing_ini(path)
    expect(site, ["-h", site.home.path, "-vi", path], lines, 5)


def test_a_descriptor_without_its_section(site):
    path = site.descriptor("[Product]\n[PreReqs]\n")
    expect(site, ["-vi", path, "-h", site.home.path],
           parse_bad_descriptor(path, "Product", "PreReqs", missing="section"), 6)


def test_a_descriptor_without_a_property(site):
    path = site.descriptor("[PreReqs]\n[ProductInfo]\nproductCode = kox\n")
    lines = parse_bad_descriptor(path, "PreReqs", "ProductInfo", missing="property",
                                 skipped=("productBinArch", "productEXE"))
    expect(site, ["-vi", path, "-h", site.home.path], lines, 7)


# --- an installation -----------------------------------------------------------------------------------

def test_an_installation(site):
    """One patch with everything: scripts, dependents, a replaced and a new file, the OS agent."""
    home = site.home
    home.component("ox")
    home.component("yn", prereqs=["oxlpp266|none"])
    home.component("qa", filename="ynvms.ver")
    home.start("ox")
    home.start("yn", "north")
    home.write("bin/tool", "old")
    pids = {row.code: row.pid for row in home.rows()}
    patch = (Patch("yn", prereqs={"kox": "06.10.00", "kyn": "06100000"}, dependents=["kox", "kzz"])
             .file("bin/tool").file("bin/new/file").script("1.sh", "pre_patch", out="one").script("2.sh", "pre")
             .script("3a.sh", "post", err="three").script("3b.sh", "post"))
    path = site.target(patch)
    lines = PatchLines(home, path, "kyn")
    expect(site, ["-h", home.path, "-i", path], installing(
        path,
        package(path, home, single_file(path), loaded_yn(home, lines, pids)),
        run(lines.cleaned_up(), done("run", *applied_yn(home, lines)), lines.cleaned_up(directories=4)),
        package_destroyed(lines.destroyed())), 0)


def loaded_yn(home, lines, pids):
    required = joined(
        registry(home, {"oxlpp266.ver": Found((pids["ox"],)), "ynvms.ver": Found(None),
                        "ynlpp266.ver": Found((pids["yn"],), ["oxlpp266"])}),
        look_up(by_arch=True),
        trace(PATCH, "Check for prereq for kox"),
        trace("version.cpp", "Version string provided: 06.10.00. Will pad ff with 00."),
        trace(PATCH, "PatchProcessor::getArchFromPrereqs() entry",
              "PatchProcessor::getArchFromPrereqs returning = lpp266", "PatchProcessor::getArchFromPrereqs() exit"),
        look_up(by_arch=True),
        trace(PATCH, "Comparing installed version 06100000 to required version 06100000.", "Prereq verified.",
              "Check for prereq for kyn"),
        level("06100000"),
        trace(PATCH, "Prereq previously verified."))
    sections = ["PreReqs", "Dependents", "PrePatchCommands", "PreCommands", "PostCommands"]
    return lines.accepted(lines.initialized(*sections), done("checkPrereqs", required))


def applied_yn(home, lines):
    """The steps of the installation itself, one by one."""
    return [
        lines.extracted(),
        lines.scripts("runPrePatchScripts", ("1.sh", "one", "")),
        done("stopDependents",
             look_up(), lines.stopped("", "stop", "ox"), trace(PATCH, "Stopped 1 instance(s) of kox"),
             look_up(), trace(PATCH, "Dependent product not found: kzz"),
             look_up(), lines.stopped("north", "-o", "north", "stop", "yn"),
             trace(PATCH, "Stopped 1 instance(s) of kyn")),
        lines.scripts("runPreScripts", ("2.sh", "", "")),
        lines.moved_files(lines.directory(lines.directory(
            lines.directory(lines.file("bin/new/file"), made="bin/new"),
            lines.file("bin/tool", replaces=True)))),
        nothing_happens("updateProductEXEFiles"),
        lines.scripts("runPostScripts", ("3a.sh", "", "three"), ("3b.sh", "", "")),
        lines.version_updated(),
        done("startDependents", look_up(), look_up(), trace(PATCH, "Attempting to start instance [north]"),
             start_agent(home, "-o north start yn", "north")),
        lines.os_agent_restarted(start_agent(home, " start ox")),
        lines.recorded(),
    ]


def test_an_installation_with_all_as_dependents(site):
    home, names = site.home, {"ul": "UNIX Logs", "qa": "Server", "dk": "Client"}
    for code, name in names.items():
        home.component(code, desc=name)
    home.start("ul")
    path = site.target(Patch("ul", dependents=["all"]))
    lines = PatchLines(home, path, "kul")
    found = registry(home, {
        "ullpp266.ver": Found((home.pid("ul"),)), "qalpp266.ver": Found(), "dklpp266.ver": Found(None)})
    left_running = "Non-stoppable component, will not be added to the list of stopped agents"
    stops = {"ul": stop_agent(home, "stop", "ul") + trace(PATCH, "Stopped active instance  for product: kul, "),
             "qa": trace(PATCH, f"{left_running}: Server"), "dk": trace(PATCH, f"{left_running}: Client")}
    registered = [name[:2] for name in os.listdir(home.path / "registry")]
    expect(site, ["-i", path, "-h", home.path], installing(
        path,
        package(path, home, single_file(path),
                lines.accepted(lines.initialized("Dependents"), lines.prerequisites(found))),
        run(lines.cleaned_up(), done(
            "run", lines.extracted(), lines.scripts("runPrePatchScripts"),
            done("stopDependents", trace(PATCH, "Stopping ALL active instances"),
                 *[trace(PATCH, f"Processing instances for product: k{code}: {names[code]}") + stops[code]
                   for code in registered]),
            lines.scripts("runPreScripts"), lines.no_files(), nothing_happens("updateProductEXEFiles"),
            lines.scripts("runPostScripts"), lines.version_updated(),
            done("startDependents", look_up(), trace(PATCH, "Attempting to start instance []"),
                 start_agent(home, " start ul")),
            lines.os_agent(), lines.recorded()), lines.cleaned_up()),
        package_destroyed(lines.destroyed())), 0)


def test_an_installation_around_a_server(site):
    home = site.home
    home.component("yn")
    home.component("qa")
    home.start("qa")
    home.start("qa", "hub")
    path = site.target(Patch("yn", dependents=["kqa"]))
    lines = PatchLines(home, path, "kyn")
    found = registry(home, {"ynlpp266.ver": Found(), "qalpp266.ver": Found(tuple(row.pid for row in home.rows()))})
    expect(site, ["-i", path, "-h", home.path], installing(
        path,
        package(path, home, single_file(path),
                lines.accepted(lines.initialized("Dependents"), lines.prerequisites(found))),
        run(lines.cleaned_up(), done(
            "run", lines.extracted(), lines.scripts("runPrePatchScripts"),
            done("stopDependents", look_up(), lines.stopped(""), lines.stopped("hub"),
                 trace(PATCH, "Stopped 2 instance(s) of kqa"),
                 look_up(), trace(PATCH, "No running instances of kyn found")),
            lines.scripts("runPreScripts"), lines.no_files(), nothing_happens("updateProductEXEFiles"),
            lines.scripts("runPostScripts"), lines.version_updated(),
            done("startDependents", look_up(),
                 trace(PATCH, "Attempting to start instance []"), start_server(home),
                 trace(PATCH, "Attempting to start instance [hub]"), start_server(home, "hub")),
            lines.os_agent(), lines.recorded()), lines.cleaned_up()),
        package_destroyed(lines.destroyed())), 0)


# --- a report ------------------------------------------------------------------------------------------

def test_a_report_on_a_directory(site):
    home = site.home
    home.component("zt")
    home.component("ox")
    home.start("ox")
    (site.patch_dir / "readme").touch()
    folder = site.target(Patch("zt", target="vecm").file("bin/zt"),
                         Patch("ox", pre=["x"]).file("bin/lib/ox").file("bin/ox"))
    names = site.listed()
    patches = {name: PatchLines(home, folder / name, name[:3]) for name in names}
    first, second = [name for name in names if name != "readme"]
    found = registry(home, {"oxlpp266.ver": Found((home.pid("ox"),)), "ztlpp266.ver": Found(None)})

    def offered(name):
        return info(PACKAGE, text("DCFPP_PROCESS_PATCH", name)) + (
            patches[name].ignored() if name == "readme" else loaded(name))

    def loaded(name):
        lines = patches[name]
        sections, running = ((), console_looked_for(home)) if "zt" in name else (("PreCommands",), ())
        return lines.accepted(
            lines.initialized(*sections), lines.prerequisites(found if name == first else []),
            running=running, pushed="Patch pushback succeeded. success: 1")

    zt, ox = [patches[name] for name in sorted((first, second), reverse=True)]
    expect(site, ["-h", home.path, "-t", folder], joined(
        trace("main", "testPatch(entry)", f"Creating Package Processor object with path [{folder}]"),
        package(folder, home, info(PACKAGE, text("DCFPP_PROCESS_DIR", "patches")), list_directory(),
                *[offered(name) for name in names], sorted_processors(patches[first], patches[second])),
        trace(PACKAGE, "DCFPackageProcessor::testRun() entry"),
        reported(zt, zt.listed_instances(look_up(), trace(PATCH, "Dependent product not found: kzt")), 2, "bin/zt"),
        reported(ox, ox.listed_instances(look_up(), shown=1), 3, "bin/lib/ox", "bin/ox"),
        trace(PACKAGE, "DCFPackageProcessor::testRun() exit"),
        package_destroyed(zt.destroyed(), ox.destroyed()),
        trace("main", f"testPatch({folder}) = 0")), 0)


def console_looked_for(home):
    return run_command("/bin/sh", "-c", f"ps -ef | grep -v grep | grep -c {home.prefix}classes/wbt.jar")


def test_a_report_on_nothing(site):
    # KEEP(testpatch-entry): the first line has "entry" where the last one has the path.
    expect(site, ["-t", "/dev/null", "-h", site.home.path], joined(
        trace("main", "testPatch(entry)", "Creating Package Processor object with path [/dev/null]"),
        package("/dev/null", site.home),
        around(PACKAGE, "DCFPackageProcessor::testRun()", info(PACKAGE, text("DCFPP_TEST_NO_PATCH"))),
        package_destroyed(),
        trace("main", "testPatch(/dev/null) = 0")), 0)


