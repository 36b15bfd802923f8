"""Where in its work the program is, as its own log tells, when it makes a call."""

import os
import re

# Log message -> the step that begins with it. What follows the end of a step belongs to no step: "between".
_STEPS = [
    (r"DCFPackageProcessor::load\(\) entry", "load"),
    (r"PatchProcessor::initialize\(\) entry", "initialize"),
    (r"PatchProcessor::parsePatchDescriptor\(\) entry", "descriptor"),
    (r"PatchProcessor::parsePatchDescriptor\(\) = ", "initialize"),
    (r"PatchProcessor::initialize\(\) retval", "load"),
    (r"ORVComponentRegistry::ORVComponentRegistry entry", "registry"),
    (r"ORVComponentRegistry::buildComponent\(", "component"),
    (r"ORVComponentRegistry::buildComponent exit|Could not read ", "registry"),
    (r"ORVComponentRegistry::ORVComponentRegistry exit", "load"),
    (r"PatchProcessor::extract\(\) entry", "extract"),
    (r"PatchProcessor::runPrePatchScripts\(\) entry", "pre_patch"),
    (r"PatchProcessor::stopDependents\(\) entry", "stop"),
    (r"PatchProcessor::runPreScripts\(\) entry", "pre"),
    (r"PatchProcessor::moveFiles\(\) entry", "move"),
    (r"PatchProcessor::updateProductEXEFiles\(\) entry", "between"),
    (r"PatchProcessor::runPostScripts\(\) entry", "post"),
    (r"PatchProcessor::updatePatchVerFile\(\) entry", "level"),
    (r"PatchProcessor::startDependents\(\) entry", "restart"),
    (r"PatchProcessor::startOSAgentIfNeeded\(\) entry", "osagent"),
    (r"PatchProcessor::updatePatchRegistry\(\) entry", "history"),
    (r"PatchProcessor::listFiles\(\) entry", "list"),
    (r"PatchProcessor::(extract|runPrePatchScripts|runPreScripts|runPostScripts|stopDependents|startDependents"
     r"|startOSAgentIfNeeded|updatePatchVerFile|cleanUp|run|testRun)\(\) =? ?\d", "between"),
    (r"PatchProcessor::(moveFile\(\) = |updatePatchRegistry\(\) exit|listFiles\(\) exit)", "between"),
]
_STEPS = [(re.compile(pattern), step) for pattern, step in _STEPS]
_CANDIDATE = re.compile(r"DCFPackageProcessor::isApplicable\('.*','(.*)'\)  entry")
_WORD = re.compile(r"cmdArray\[\d+\]: (.*)")


class Context:
    """Follows the calls of one run. `step` is the step of the road, `patch` the index of the patch that it is
    about, `command` the words of the child process that is being run or None, `ended` the number of this step's
    commands that have ended, `pids` the running instances by their process ids."""

    def __init__(self, scenario, home, pids, path):
        self.scenario, self.home, self.pids, self.path = scenario, home, pids, str(path)
        self.step, self.patch, self.when = "start", 0, ""
        self.command, self.ended, self.done_in_command = None, 0, []
        self.component = ""
        self.looked = False  # whether the given path has been looked at, which tells whether it is there
        self.temp_existed = False
        self.listed, self.made = set(), set()
        self.accepted, self.clean_ups, self.removed = [], 0, set()

    @property
    def facts(self):
        return self.scenario.patches[self.patch]

    @property
    def temp(self):
        return f"{self.home}/{self.facts.temp}"

    @property
    def source(self):
        return f"{self.temp}/updated_files"

    def after(self, call):
        """Takes note of a call when it has been judged."""
        for message in call.messages:
            self._read(message)
        path = os.path.normpath(call.path)
        if call.name == "newfstatat" and path == self.path:
            self.looked = True
        if call.name == "newfstatat" and path == self.temp and self.step in ("initialize", "extract"):
            self.temp_existed = self.temp_existed or not call.error
        if call.name == "mkdir" and not call.error:
            self.made.add(path)
        if call.name == "getdents64" and not call.error:
            self.listed.add(path)
        if self.command is not None and not call.is_log:
            self.done_in_command.append(call.name)

    def _read(self, message):
        self._follow_command(message)
        candidate = _CANDIDATE.match(message)
        if candidate:
            self._follow_candidate(candidate[1])
        if message.startswith("Patch pushback succeeded"):
            self.accepted.append(self.patch)
        if message == "PatchProcessor::cleanUp() entry":
            self._follow_clean_up()
        for pattern, step in _STEPS:
            if pattern.match(message):
                self._enter(step, message)

    def _enter(self, step, message):
        if step == "component":
            self.component = "k" + os.path.basename(message.split("(", 1)[1].rsplit(")", 1)[0])[:2]
        if step in ("initialize", "extract") and step != self.step and self.step != "descriptor":
            self.temp_existed = False
        self.step, self.ended = step, 0
        self.listed.clear()

    def _follow_command(self, message):
        word = _WORD.match(message)
        if message == "runCommand entry":
            self.command, self.done_in_command = [], []
        elif word and self.command is not None:
            self.command.append(word[1])
        elif message == "runCommand exit":
            self.command, self.ended = None, self.ended + 1
        elif message.startswith("Error calling fork"):
            self.command = None

    def _follow_candidate(self, name):
        names = [facts.patch.filename for facts in self.scenario.patches]
        if name in names:
            self.patch = names.index(name)

    def _follow_clean_up(self):
        """Each accepted patch is cleaned up before it is applied, and again when that succeeded."""
        order = sorted(self.accepted)
        self.patch, self.when = order[self.clean_ups // 2], ("before", "after")[self.clean_ups % 2]
        self.clean_ups += 1
        self._enter("clean-up", "")
