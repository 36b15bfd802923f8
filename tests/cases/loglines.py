"""The log lines that an operation writes, in order, as (level, component, message): driver, foundation,
components and descriptor. patchlines.py has those of patches and packages.

A function bears the name of what it traces; its arguments are the facts of the case.
"""

import os
import re
from typing import NamedTuple

from catalogue import text

REGISTRY = "orvcomponentregistry"
_FIXED_POINTER = re.compile(r"\(0x[0-9a-f]+\) exit$")


def trace(component, *messages):
    return [("TRACE", component, message) for message in messages]


def info(component, *messages):
    return [("INFO", component, message) for message in messages]


def error(component, *messages):
    return [("ERROR", component, message) for message in messages]


def joined(*parts):
    return [line for part in parts for line in part]


def around(component, name, *body, end=None):
    """`name` with "entry", what happens in between, and `name` with "exit" or, if given, the line `end`."""
    return joined(trace(component, f"{name} entry"), *body, trace(component, end or f"{name} exit"))


def normalised(lines):
    """Logged lines with every address of a buffer, which no case can foretell, replaced by a word."""
    return [(level, component, _FIXED_POINTER.sub("(BUFFER) exit", message))
            for level, component, message in lines]


# --- driver --------------------------------------------------------------------------------------------

def driver(argv, action, status, log_folder=None):
    """A whole run of the program: its words, what the action writes, the verdict."""
    verdict = text("MAIN_SUCCESSFUL") if status == 0 else text("MAIN_NOT_SUCCESSFUL", log_folder)
    return joined(
        trace("main", "main entry", *[f"arg[{at}]: {word}" for at, word in enumerate(argv)]),
        action, info("main", verdict), trace("main", f"main = {status}"))


def expect(site, words, action, status):
    """Runs the program with these words: the log must hold just these lines, the status must be this."""
    result = site.run(*words)
    argv = [*site.program.argv[-1:], *words]
    assert normalised(site.log()) == driver(argv, action, status, f"{site.home.prefix}patchlogs/")
    assert result.status == status


# --- foundation ----------------------------------------------------------------------------------------

def run_command(*argv):
    return around("process.cpp", "runCommand",
                  trace("process.cpp", *[f"cmdArray[{at}]: {word}" for at, word in enumerate(argv)]))


def run_missing_command(*argv):
    """A program that is not there: its child says so before the parent goes on."""
    lines = run_command(*argv)
    return lines[:-1] + error("process.cpp", "error calling execvp = 2: No such file or directory") + lines[-1:]


def path_exists(path, there=True):
    missing = [] if there else trace("utilities.cpp", f"Path does not exist: {path}")
    return around("utilities.cpp", f"Util::pathExists({path})", missing)


def read_file(path):
    return around("utilities.cpp", f"Util::readFile({path})", end=f"Util::readFile({path})=0(BUFFER) exit")


def read_missing_file(path):
    return around("utilities.cpp", f"Util::readFile({path})",
                  error("utilities.cpp", f"unable to stat file: {path}"),
                  end=f"Util::readFile({path})=2((nil)) exit")


def read_lines(path):
    return around("utilities.cpp", f"Util::readFileByLines({path})", read_file(path))


def read_missing_lines(path):
    return trace("utilities.cpp", f"Util::readFileByLines({path}) entry") + read_missing_file(path)


def make_directory(*made, there=1):
    """`made`: the directories, each with its trailing "/", that were missing."""
    return around("file.cpp", "File::mkdir", trace("file.cpp", *[f"creating dir: {path}" for path in made]),
                  end=f"File::mkdir = {there}")


def list_directory():
    return around("file.cpp", "loadDir()")


def remove_tree(directories):
    """A tree of so many directories goes."""
    return around("file.cpp", "File::rmdir", *[list_directory()] * directories, end="File::rmdir =1")


def link_into_place(replaced=None):
    old = trace("file.cpp", f"deleting existing target: {replaced}") if replaced else []
    return around("file.cpp", "moveFile", old)


def level(digits):
    return trace("version.cpp", f"Version string provided: {digits}.")


# --- installed components ------------------------------------------------------------------------------

class Found(NamedTuple):
    """What the registry learns about one version file."""

    pids: tuple = ()       # process ids of its rows in the run information; None: its rows are not read
    prereqs: tuple = ()
    level: str = "06100000"


def registry(home, found):
    """The registry is built; `found`: name of a version file -> Found."""
    listed = [name for name in os.listdir(home.path / "registry") if name in found]
    run_info = joined(
        trace(REGISTRY, "ORVComponentRegistry::getCInfo_Running entry"),
        read_file(f"{home.prefix}config/.ConfigData/RunInfo"),
        trace(REGISTRY, "ORVComponentRegistry::getCInfo exit"))
    components = around(
        REGISTRY, "ORVComponentRegistry::buildComponents", run_info, list_directory(),
        *[_component(f"{home.prefix}registry/{name}", name[:2], found[name]) for name in listed])
    return around(REGISTRY, "ORVComponentRegistry::ORVComponentRegistry", components)


def look_up(by_arch=False):
    return around(REGISTRY, f"ORVComponentRegistry::getInstalledComponent{'ByArch' if by_arch else ''}")


def is_running(pid):
    return joined(run_command("ps", "-p", pid),
                  run_command("/bin/sh", "-c", f"ps -ef | grep -v grep | grep {pid}"))


def start_agent(home, words, instance="", outcome=()):
    """`words`: all that follows the script's name and one blank; `outcome`: the lines after the call."""
    return around("orvcomponent", f"startInstance({instance})",
                  run_command("/bin/sh", "-c", f"{home.prefix}bin/QuillAgent {words}"), outcome or called())


def stop_agent(home, *words, instance="", outcome=()):
    return around("orvcomponent", f"stopInstance({instance})",
                  run_command(f"{home.prefix}bin/QuillAgent", *words), outcome or called())


def start_server(home, instance="", outcome=()):
    return _run_server(home, "start", instance, outcome)


def stop_server(home, instance="", outcome=()):
    return _run_server(home, "stop", instance, outcome)


def _run_server(home, verb, instance, outcome):
    return around("orvcomponent", f"{verb}Instance({instance})",
                  run_command(f"{home.prefix}bin/QuillServer", verb, instance), outcome or called())


def called(status=0, out="", err=""):
    return trace("orvcomponent", f"return code: {status}", f"stdout: {out}", f"stderr: {err}")


def _component(path, code, found):
    prereqs = trace(REGISTRY, *[f"Added preReqALL value = {prereq}" for prereq in found.prereqs])
    rows = [] if found.pids is None else joined(
        trace("orvcomponent", "ORVComponent::intialize entry", "FIELDSEP= |"),
        *[is_running(pid) for pid in found.pids],
        trace("orvcomponent", "ORVComponent::initialize exit"))
    made = joined(trace("orvcomponent", f"ORVComponent::ORVComponent({code}) entry"), level(found.level), rows,
                  trace("orvcomponent", "ORVComponent::ORVComponent() exit"))
    return joined(trace(REGISTRY, f"ORVComponentRegistry::buildComponent({path}) entry"), read_lines(path),
                  prereqs, made, trace(REGISTRY, "ORVComponentRegistry::buildComponent exit"))


# --- descriptor ----------------------------------------------------------------------------------------

_OPTIONAL_SECTIONS = {  # title: what its builder writes first, what last, what when it is not there
    "PreReqs": ("buildPreReqsSectionentry", "buildPreReqsSection = 1", "PreReqs"),
    "Dependents": ("buildDependentsSectionentry", "buildDependentsSection = 1", "Dependents"),
    "PrePatchCommands": ("buildPrePatchCmdsSectionentry", "buildPrePatchCmdsSection = 1", "PreCommands"),
    "PreCommands": ("buildPreCmdsSectionentry", "buildPreCmdsSection = 1", "PreCommands"),
    "PostCommands": ("buildPostCmdsSection entry", "buildPostCmdsSection = 1", "PostCommands"),
}


def parse_ini(path, *sections, strays=0):
    """`sections`: the titles in the order of the file; `strays`: lines before the first of them."""
    content = joined(error("inifile.cpp", *[text("ERROR_INIFILE_PROP")] * strays),
                     trace("inifile.cpp", *[f"Created section: {title}" for title in sections]))
    return around("inifile.cpp", f"IniFile::parse({path})",
                  trace("inifile.cpp", "IniFile::parse()"), read_lines(path), content,
                  trace("inifile.cpp", "IniFile::parse()"))


def parse_missing_ini(path):
    return around("inifile.cpp", f"IniFile::parse({path})",
                  trace("inifile.cpp", "IniFile::parse()"), read_missing_lines(path),
                  error("inifile.cpp", text("ERROR_INIFILE_CANT_READ", path, "No such file or directory")),
                  trace("inifile.cpp", "IniFile::parse()"),
                  error("inifile.cpp", text("ERROR_INIFILE_PARSE", path)),
                  trace("inifile.cpp", "IniFile::~IniFile()"))


def parse_descriptor(path, *sections, skipped=("productEXE",), strays=0, two_letters=None):
    """A good descriptor. `sections`: those beside ProductInfo, in the usual order; `skipped`: optional
    properties that are not there; `two_letters`: the line for a short code -> the section that holds it."""
    return around(
        "patchdescriptor.cpp", f"PatchDescriptor::parseFile({path})",
        parse_ini(path, "ProductInfo", *sections, strays=strays),
        around("patchdescriptor.cpp", "PatchDescriptor::parse",
               info_section(skipped=skipped), *_optional_sections(sections, two_letters or {}),
               end="PatchDescriptor::parse = 1"),
        trace("inifile.cpp", "IniFile::~IniFile()"))


def parse_bad_descriptor(path, *sections, missing, skipped=()):
    """A descriptor whose ProductInfo section is `missing` or (with "property") lacks something."""
    body = []
    if missing == "property":
        absent = [wording for _, _, wording in _OPTIONAL_SECTIONS.values()]
        body = info_section(0, skipped) + trace(
            "patchdescriptor.cpp", *[f"No {title} section found" for title in absent])
    return around(
        "patchdescriptor.cpp", f"PatchDescriptor::parseFile({path})",
        parse_ini(path, *sections),
        around("patchdescriptor.cpp", "PatchDescriptor::parse", body, end="PatchDescriptor::parse = 0"),
        error("patchdescriptor.cpp", text("ERROR_PATCH_PARSE")),
        trace("patchdescriptor.cpp", "PatchDescriptor::~PatchDescriptor entry"),
        trace("inifile.cpp", "IniFile::~IniFile()"))


def info_section(result=1, skipped=()):
    name = "PatchDescriptor::buildInfoSection"
    optional = [f"skipping optional property {key}" for key in skipped]
    return trace("patchdescriptor.cpp", f"{name}entry", *optional, f"{name} = {result}")


def _optional_sections(present, two_letters):
    for title, (entry, result, absent) in _OPTIONAL_SECTIONS.items():
        if title not in present:
            yield trace("patchdescriptor.cpp", f"No {absent} section found")
            continue
        prefixed = [line for line, section in two_letters.items() if section == title]
        yield trace("patchdescriptor.cpp", f"PatchDescriptor::{entry}", *prefixed, f"PatchDescriptor::{result}")
