"""Where in its work the program is, as its own log tells, when it makes a call."""

import os
import re
from typing import NamedTuple

# Log message -> the step that begins with it. What follows the end of a step belongs to no step: "between".
_STEPS = [
    (re.compile(pattern), step)
    for pattern, step in (
        (r"DCFPackageProcessor::load\(\) entry", "load"),
        (r"PatchProcessor::initialize\(\) entry", "initialize"),
        (r"PatchProcessor::parsePatchDescriptor\(\) entry", "descriptor"),
        (r"PatchProcessor::parsePatchDescriptor\(\) = ", "initialize"),
        (r"PatchProcessor::initialize\(\) retval", "load"),
        (r"ORVComponentRegistry::ORVComponentRegistry entry", "registry"),
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
        (r"PatchProcessor::cleanUp\(\) entry", "clean-up"),
        (
            r"PatchProcessor::(extract|runPrePatchScripts|runPreScripts|runPostScripts|stopDependents|startDependents"
            r"|startOSAgentIfNeeded|updatePatchVerFile|cleanUp|run|testRun)\(\) =? ?\d",
            "between",
        ),
        (r"PatchProcessor::(moveFile\(\) = |updatePatchRegistry\(\) exit|listFiles\(\) exit)", "between"),
    )
]
_CANDIDATE = re.compile(r"DCFPackageProcessor::isApplicable\('.*','(.*)'\)  entry")
_WORD = re.compile(r"cmdArray\[\d+\]: (.*)")


def step_after(message, step):
    """The step that the program is in when it has logged this line in `step`."""
    return next((begun for pattern, begun in _STEPS if pattern.match(message)), step)


class Fault(NamedTuple):
    """A call that failed, without its name: where in the work and at what."""

    step: str
    patch: int  # index in the scenario
    path: str  # normalised; of a descriptor that which it stands for; "" without one
    error: str
    command: tuple  # words of the child process that the call serves, or of the one that failed itself
    stream: str = ""  # "out" or "err" when the call prints
    in_log: bool = False

    @property
    def in_users(self):
        """At what the C library asks for the name of a user."""
        return self.path in ("/etc/passwd", "/etc/nsswitch.conf", "/", "/etc")

    @property
    def in_system(self):
        return self.in_users or self.path.startswith(("/etc/", "/usr/", "/lib/", "/var/run/", "/dev/"))


class Context:
    """Follows the calls of one run: `step` is the step of the road, `patch` the index of the patch that it is
    about, `command` the words of the child process that is being run or None."""

    def __init__(self, scenario, home):
        self.scenario, self.home = scenario, home
        self.step, self.patch, self.command = "start", 0, None
        self.accepted, self._clean_ups = [], 0

    @property
    def facts(self):
        return self.scenario.patches[self.patch]

    def fault(self, call):
        # A link's place is its last path: the first one may be anywhere.
        path = os.path.normpath(call.paths[-1]) if call.paths else ""
        stream = {1: "out", 2: "err"}.get(call.descriptor, "") if call.kind in ("write", "look") else ""
        return Fault(self.step, self.patch, path, call.error, tuple(self.command or ()), stream, call.is_log)

    def after(self, call):
        """Takes note of a call when it has been judged."""
        for message in call.messages:
            self.read(message)

    def read(self, message):
        word, candidate = _WORD.match(message), _CANDIDATE.match(message)
        if message == "runCommand entry":
            self.command = []
        elif word and self.command is not None:
            self.command.append(word[1])
        elif message == "runCommand exit" or message.startswith("Error calling fork"):
            self.command = None
        elif candidate:
            names = [facts.patch.filename for facts in self.scenario.patches]
            self.patch = names.index(candidate[1]) if candidate[1] in names else self.patch
        elif message.startswith("Patch pushback succeeded"):
            self.accepted.append(self.patch)
        elif message == "PatchProcessor::cleanUp() entry":
            # Each accepted patch is cleaned up before it is applied, and again when that succeeded.
            self.patch = sorted(self.accepted)[self._clean_ups // 2]
            self._clean_ups += 1
        self.step = step_after(message, self.step)
