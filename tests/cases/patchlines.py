"""The log lines of patch processors and the package processor: continues loglines.py."""

import os

from catalogue import text
from loglines import (around, error, info, joined, link_into_place, list_directory, look_up, make_directory,
                      parse_descriptor, path_exists, read_lines, read_missing_lines, remove_tree, run_command,
                      stop_agent, stop_server, trace)
from productsite import SEARCH_PATH

PATCH = "patchprocessor"
PACKAGE = "dcfpackageprocessor"


def done(name, *body, result=1):
    """An operation of the patch processor that ends with its result."""
    return around(PATCH, f"PatchProcessor::{name}()", *body, end=f"PatchProcessor::{name}() = {result}")


class PatchLines:
    """The lines about one patch of a home: `archive` is its path as given, `product` its code."""

    def __init__(self, home, archive, product="kox", platform="lpp266"):
        self.site_home, self.home = home, home.prefix
        self.archive, self.product = str(archive), product
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

    def initialized(self, *sections, there=False, **facts):
        """`there`: the temporary directory need not be made."""
        parsed = parse_descriptor(f"{self.temp}/patch.ini", *sections, **facts)
        return self.initialization(self.extracted_ini(there), done("parsePatchDescriptor", parsed))

    def initialization(self, *body, result=1):
        return around(PATCH, "PatchProcessor::initialize()", *body,
                      end=f"PatchProcessor::initialize() retval [{result}]")

    def accepted(self, initialized, prerequisites, *, running=(), pushed="Patch pushback succeeded."):
        """From the applicable file to the processor in the list; `running`: how servers were looked for."""
        return joined(self.checked(initialized, prerequisites, running=running), trace(PACKAGE, pushed))

    def checked(self, initialized, prerequisites, *, running=()):
        return joined(self.made(), initialized, trace(PACKAGE, "Patch initialization succeeded"),
                      self.active_programs(running), prerequisites)

    def prerequisites(self, *checks):
        """All are met; `checks`: the registry where this is the first to ask it."""
        return done("checkPrereqs", *checks, look_up(by_arch=True))

    def ignored(self):
        """A file in a directory whose name is none of a patch."""
        name = os.path.basename(self.archive)
        return joined(
            self.applicable(
                trace("patchfilename", f"invalid patch file name: {name}"),
                trace(PACKAGE, f"Specified filename: {name}, is not a valid patch filename, therefore the "
                      "file is not an applicable patch."), result=0),
            info(PACKAGE, text("DCFPP_NOT_APPLICABLE", self.archive)))

    def not_initialized(self, failed, wording):
        return joined(self.initialization(failed, trace(PATCH, wording), result=0),
                      trace(PACKAGE, f"Error initializing patch: {self.archive}"))

    def arch_of_prereq(self, arch):
        name = "PatchProcessor::getArchFromPrereqs()"
        return around(PATCH, name, trace(PATCH, f"PatchProcessor::getArchFromPrereqs returning = {arch}"))

    def made(self, *checks):
        return joined(self.applicable(*checks), trace(PACKAGE, f"[{self.archive}] is applicable."), self.created(),
                      trace(PACKAGE, "Calling initialize "))

    def active_programs(self, found=(), result=1):
        return around(PATCH, "PatchProcessor::checkForActivePrograms()", found,
                      trace(PATCH, f"PatchProcessor::checkForActivePrograms() = {result}"))

    def destroyed(self, with_descriptor=True):
        descriptor = trace("patchdescriptor.cpp", "PatchDescriptor::~PatchDescriptor entry")
        return around(PATCH, "PatchProcessor::~PatchProcessor()", descriptor if with_descriptor else [])

    def filename_asked(self):
        name = "PatchProcessor::getPatchFilename()"
        return around(PATCH, name, end=f"{name} retval [{self.archive}]")

    # --- the archive and its temporary directory -------------------------------------------------------

    def extracted_ini(self, there=False):
        return self._extraction("extractINI", there, self.archive, "patch.ini")

    def extracted(self, there=False):
        return self._extraction("extract", there, self.archive)

    def _extraction(self, name, there, *words):
        made = [] if there else [f"{self.temp}/"]
        return done(name, make_directory(*made), run_command("tar", "-xf", *words),
                    trace(PATCH, "tar returned: 0", "stdout: ", "stderr: "))

    def cleaned_up(self, directories=1):
        return done("cleanUp", remove_tree(directories))

    def not_cleaned_up(self):
        """The temporary directory is a link to an empty directory: nothing in it is touched."""
        failed = f"Unable to delete directory [{self.temp}/]: rc = 20, Not a directory"
        return done("cleanUp", around("file.cpp", "File::rmdir", trace("file.cpp", failed), end="File::rmdir =0"),
                    error(PATCH, text("ERROR_PP_RM_DIR", self.temp)), result=0)

    # --- instances -------------------------------------------------------------------------------------

    def listed_instances(self, *found, shown=0):
        """A report looks for what runs (the lines `found`), then looks up each product that it shows."""
        name = "PatchProcessor::buildDependentsList"
        built = around(PATCH, f"{name}()", *found, end=f"{name} = 1")
        return around(PATCH, "PatchProcessor::printDependentsList()", built, *[look_up()] * shown,
                      end="PatchProcessor::printDependentsList = 1")

    def stopped(self, instance, *words):
        """`words`: arguments of the agents' control script; none for the server's."""
        stop = (stop_agent(self.site_home, *words, instance=instance) if words
                else stop_server(self.site_home, instance))
        return joined(trace(PATCH, f"Attempting to stop instance [{instance}]"), stop,
                      trace(PATCH, f"Adding instance [{instance}] to the list of stopped agents"))

    # --- command lists ---------------------------------------------------------------------------------

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

    def no_files(self):
        return joined(trace(PATCH, "PatchProcessor::moveFiles() entry"), path_exists(self.sources, there=False),
                      info(PATCH, text("PP_NO_FILES")))

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

    def not_moved(self, source, target, reason):
        """`reason` why it cannot be linked to a place that is taken by a directory."""
        relative = f"./{os.path.basename(target)}"
        return around(
            PATCH, "PatchProcessor::moveFile()",
            around("file.cpp", "moveFile", trace("file.cpp", f"deleting existing target: {target}",
                                                 f"unable to link: {relative} to {target}. {reason}")),
            error(PATCH, text("ERROR_PP_MOVE_FILE", source, target)))

    def not_made(self, target):
        return around(PATCH, "PatchProcessor::moveFile()", info(PATCH, text("PP_MAKE_DIR", target)),
                      make_directory(target, there=0), error(PATCH, text("ERROR_PP_MAKE_DIR", target)))

    def listed_files(self, directories, *paths):
        listing = [f"{self.sources}/{path} --> {self.home}{path}" for path in paths]
        return around(PATCH, "PatchProcessor::listFiles()", path_exists(self.sources),
                      info(PATCH, text("PP_LIST_FILES")), *[list_directory()] * directories,
                      info(PATCH, *listing))

    def steps_up_to_files(self):
        """Without scripts, and with nothing running."""
        return [
            self.extracted(), self.scripts("runPrePatchScripts"),
            done("stopDependents", look_up(), trace(PATCH, f"No running instances of {self.product} found")),
            self.scripts("runPreScripts")]

    # --- records and the OS agent ----------------------------------------------------------------------

    def version_updated(self):
        return done("updatePatchVerFile", read_lines(self.version_file))

    def version_not_updated(self):
        return joined(trace(PATCH, "PatchProcessor::updatePatchVerFile() entry"),
                      read_missing_lines(self.version_file),
                      error(PATCH, text("ERROR_PP_UPDATE_VRMF", self.version_file, "2")))

    def recorded(self, *problem):
        return around(PATCH, "PatchProcessor::updatePatchRegistry()", *problem)

    def os_agent(self, *restart, result=1):
        return done("startOSAgentIfNeeded", *restart, result=result)

    def os_agent_restarted(self, started, result=1):
        written = trace(PATCH, f"Writing out: {self.home}vmaorv6/agentdepot/rc.txt")
        return self.os_agent(written, look_up(), started, result=result)


def nothing_happens(name):
    """The two steps about copies of the product executable."""
    return done(name)


def _successful(command, out, err):
    return joined(run_command(command), info(PATCH, text("PP_SCRIPT_COMPLETE", command)),
                  trace(PATCH, f"stdOut: {out}", f"stdErr: {err}"))


def reported(lines, instances, directories, *files):
    """The package processor reports on one patch."""
    return joined(
        lines.cleaned_up(), lines.filename_asked(),
        done("testRun", instances, lines.extracted(), lines.listed_files(directories, *files),
             nothing_happens("listProductEXEFiles")),
        lines.cleaned_up(directories + 1))


# --- package -------------------------------------------------------------------------------------------

def package(path, home, *loading, result=1):
    """The package processor is made (or, with result 0, given up) for the path."""
    loaded = joined(
        trace(PACKAGE, "DCFPackageProcessor::load() entry", f"QUILLHOME=[{home.prefix}]"), *loading,
        trace(PACKAGE, f"DCFPackageProcessor::load() exit retval: [{result}]"))
    given_up = [] if result else joined(package_destroyed(), trace(PACKAGE, "Unable to load patch(s)"))
    name = f"DCFPackageProcessor::createProcessor({path}) -"
    return around(PACKAGE, name, loaded, given_up)


def package_destroyed(*processors):
    return around(PACKAGE, "DCFPackageProcessor::~DCFPackageProcessor()", *processors)


def single_file(path):
    return trace(PACKAGE, f"[{path}] is a file.")


def sorted_processors(*loaded):
    """`loaded`: the lines of all patches, in the order of loading; each is asked once for each kind."""
    kinds = 5
    return around(PACKAGE, "DCFPackageProcessor::sort() -",
                  trace(PACKAGE, f"Total number of eligible patch files to sort: {len(loaded)}"),
                  *[lines.filename_asked() for lines in loaded] * kinds)


def installing(path, *parts, status=0):
    """The action of the driver."""
    return joined(trace("main", f"installPatch({path}) entry"), *parts,
                  trace("main", f"installPatch({path}) = {status}"))


def run(*patches):
    """The package processor applies patches."""
    return around(PACKAGE, "DCFPackageProcessor::run()", *patches)
