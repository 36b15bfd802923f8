"""The log lines of patch processors and the package processor: continues loglines.py."""

import os

from catalogue import text
from loglines import (around, error, info, joined, link_into_place, list_directory, look_up, make_directory,
                      parse_descriptor, path_exists, read_lines, remove_tree, run_command, trace)
from productsite import SEARCH_PATH

PATCH = "patchprocessor"
PACKAGE = "dcfpackageprocessor"


def done(name, *body, result=1):
    """An operation of the patch processor that ends with its result."""
    return around(PATCH, f"PatchProcessor::{name}()", *body, end=f"PatchProcessor::{name}() = {result}")


class PatchLines:
    """The lines about one patch of a home: `archive` is its path as given, `product` its code."""

    def __init__(self, home, archive, product="kox", platform="lpp266"):
        self.home, self.archive, self.product, self.platform = home.prefix, str(archive), product, platform
        self.temp = f"{self.home}tmp/{product}"
        self.sources = f"{self.temp}/updated_files"
        self.version_file = f"{self.home}registry/{product[1:]}{platform}.ver"

    # --- loading ---------------------------------------------------------------------------------------

    def applicable(self, *checks, result=1):
        """`checks`: what is looked up in the installation; the version file when nothing else is said."""
        name = os.path.basename(self.archive)
        return joined(
            trace(PACKAGE, f"DCFPackageProcessor::isApplicable('{self.home}','{name}')  entry"),
            *(checks or [path_exists(self.version_file)]),
            trace(PACKAGE, f"DCFPackageProcessor::isApplicable() retval: [{result}]"))

    def created(self):
        return around(PATCH, f"PatchProcessor::createProcessor({self.archive}, {self.home})")

    def initialized(self, *sections, **facts):
        parsed = parse_descriptor(f"{self.temp}/patch.ini", *sections, **facts)
        return self.initialization(self.extracted_ini(), done("parsePatchDescriptor", parsed))

    def initialization(self, *body, result=1):
        return around(PATCH, "PatchProcessor::initialize()", *body,
                      end=f"PatchProcessor::initialize() retval [{result}]")

    def accepted(self, initialized, prerequisites, pushed="Patch pushback succeeded."):
        """From the applicable file to the processor in the list."""
        return joined(self.made(), initialized, trace(PACKAGE, "Patch initialization succeeded"),
                      self.active_programs(), prerequisites, trace(PACKAGE, pushed))

    def made(self):
        return joined(self.applicable(), trace(PACKAGE, f"[{self.archive}] is applicable."), self.created(),
                      trace(PACKAGE, "Calling initialize "))

    def active_programs(self, *found, result=1):
        return around(PATCH, "PatchProcessor::checkForActivePrograms()", *found,
                      trace(PATCH, f"PatchProcessor::checkForActivePrograms() = {result}"))

    def destroyed(self, with_descriptor=True):
        descriptor = trace("patchdescriptor.cpp", "PatchDescriptor::~PatchDescriptor entry")
        return around(PATCH, "PatchProcessor::~PatchProcessor()", descriptor if with_descriptor else [])

    def filename_asked(self):
        name = "PatchProcessor::getPatchFilename()"
        return around(PATCH, name, end=f"{name} retval [{self.archive}]")

    # --- the archive and its temporary directory -------------------------------------------------------

    def extracted_ini(self):
        return self._extraction("extractINI", self.archive, "patch.ini")

    def extracted(self):
        return self._extraction("extract", self.archive)

    def _extraction(self, name, *words):
        return done(name, make_directory(f"{self.temp}/"), run_command("tar", "-xf", *words),
                    trace(PATCH, "tar returned: 0", "stdout: ", "stderr: "))

    def cleaned_up(self, directories=1):
        return done("cleanUp", remove_tree(directories))

    # --- command lists ---------------------------------------------------------------------------------

    def no_scripts(self, name):
        return self.scripts(name)

    def scripts(self, name, *commands, outcome=None):
        """The list `name` (runPrePatchScripts, runPreScripts, runPostScripts) with these (command, out,
        err), all successful but the last one where `outcome` gives the lines about it."""
        result = 0 if outcome else 1
        ran = self._ran_scripts(commands, outcome) if commands else []
        sign = " " if name == "runPostScripts" else " = "
        return around(PATCH, f"PatchProcessor::{name}()", ran, end=f"PatchProcessor::{name}(){sign}{result}")

    def _ran_scripts(self, commands, outcome):
        path = SEARCH_PATH
        last = len(commands) - 1
        return done(
            "runScripts", trace(PATCH, f"old PATH={path}", f"Setting PATH={self.temp}:{path}"),
            info(PATCH, text("PP_SCRIPT_COUNT", len(commands))),
            *[joined(info(PATCH, text("PP_PROCESS_SCRIPT", command)),
                     outcome if outcome and at == last else _successful(command, out, err))
              for at, (command, out, err) in enumerate(commands)],
            trace(PATCH, f"Restoring PATH={path}"), result=0 if outcome else 1)

    # --- files -----------------------------------------------------------------------------------------

    def moved_files(self, walk, result=1):
        return around(PATCH, "PatchProcessor::moveFiles()", path_exists(self.sources),
                      info(PATCH, text("PP_MOVE_FILES", self.sources, self.home)), walk,
                      end=f"PatchProcessor::moveFile() = {result}")

    def directory(self, *entries, made=None):
        """One directory of the walk; `made`: its path below the home where it had to be made."""
        new = []
        if made:
            new = info(PATCH, text("PP_MAKE_DIR", f"{self.home}./{made}/")) + make_directory(f"{self.home}./{made}/")
        return around(PATCH, "PatchProcessor::moveFile()", new, list_directory(), *entries)

    def file(self, path, replaces=False):
        target = f"{self.home}./{path}"
        return around(PATCH, "PatchProcessor::moveFile()", link_into_place(target if replaces else None),
                      info(PATCH, text("PP_MOVE_FILE", f"{self.sources}/./{path}", target)))

    def listed_files(self, directories, *paths):
        listing = [f"{self.sources}/{path} --> {self.home}{path}" for path in paths]
        return around(PATCH, "PatchProcessor::listFiles()", path_exists(self.sources),
                      info(PATCH, text("PP_LIST_FILES")), *[list_directory()] * directories,
                      info(PATCH, *listing))

    # --- records and the OS agent ----------------------------------------------------------------------

    def version_updated(self):
        return done("updatePatchVerFile", read_lines(self.version_file))

    def recorded(self, *problem):
        return around(PATCH, "PatchProcessor::updatePatchRegistry()", *problem)

    def os_agent(self, *restart, result=1):
        return done("startOSAgentIfNeeded", *restart, result=result)

    def os_agent_restarted(self, started):
        return self.os_agent(trace(PATCH, f"Writing out: {self.home}vmaorv6/agentdepot/rc.txt"), look_up(), started)


def nothing_happens(name):
    """The two steps about copies of the product executable."""
    return done(name)


def _successful(command, out, err):
    return joined(run_command(command), info(PATCH, text("PP_SCRIPT_COMPLETE", command)),
                  trace(PATCH, f"stdOut: {out}", f"stdErr: {err}"))


# --- package -------------------------------------------------------------------------------------------

def package(path, home, *loading, result=1, destroyed=()):
    """The package processor is made (or, with result 0, given up) for the path."""
    loaded = joined(
        trace(PACKAGE, "DCFPackageProcessor::load() entry", f"QUILLHOME=[{home.prefix}]"), *loading,
        trace(PACKAGE, f"DCFPackageProcessor::load() exit retval: [{result}]"))
    given_up = [] if result else joined(package_destroyed(*destroyed), trace(PACKAGE, "Unable to load patch(s)"))
    name = f"DCFPackageProcessor::createProcessor({path}) -"
    return around(PACKAGE, name, loaded, given_up)


def package_destroyed(*processors):
    return around(PACKAGE, "DCFPackageProcessor::~DCFPackageProcessor()", *processors)


def single_file(path):
    return trace(PACKAGE, f"[{path}] is a file.")


def failure(component, key, *arguments):
    return error(component, text(key, *arguments))
