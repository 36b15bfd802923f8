"""What a run tells of itself in its log: which patches it came to, and how far it came with each."""

import re

from .steps import Context, step_after

# The steps of an installation and of a report: each one only when all before it have succeeded.
CHAIN = {"-i": ("extract", "pre_patch", "stop", "pre", "move", "post", "level", "restart"), "-t": ("extract", "list")}
_RESULT = re.compile(r"PatchProcessor::(run|testRun|startDependents|startOSAgentIfNeeded)\(\) = (\d)$")


class Story:
    def __init__(self, scenario, home, messages):
        context = Context(scenario, home)
        self.action = scenario.action
        self.accepted, self.applied, self.ended = context.accepted, [], False
        self._entered, self._results = {}, {}
        for message in messages:
            context.read(message)
            if message in ("PatchProcessor::run() entry", "PatchProcessor::testRun() entry"):
                self.applied.append(context.patch)
            result = _RESULT.match(message)
            if self.applied and result:
                self._results[self.applied[-1], result[1]] = result[2] == "1"
            step = step_after(message, None)
            if self.applied and step in (*CHAIN[self.action], "osagent", "history"):
                self._entered.setdefault(self.applied[-1], []).append(step)

    def entered(self, patch):
        return self._entered.get(patch, [])

    def extracted(self, patch):
        return len(self._chain(patch)) > 1

    def _chain(self, patch):
        return [step for step in self.entered(patch) if step in CHAIN[self.action]]

    def os_agent_done(self, patch):
        return self._results.get((patch, "startOSAgentIfNeeded"), False)

    def passed(self, patch):
        return self._results.get((patch, "run" if self.action == "-i" else "testRun"), False)

    def failed_step(self, patch, action):
        """The last step that was begun, when it did not succeed; the OS agent's after all others."""
        if action != self.action or patch not in self.applied:
            return None
        chain = self._chain(patch)
        if action == "-t":
            return None if self.passed(patch) else chain[-1]
        if self.os_agent_done(patch):
            done = self._results.get((patch, "startDependents"), False)
            return None if done and chain[-1] == "restart" else chain[-1]
        if self._results.get((patch, "startDependents"), False):
            return "osagent"
        return chain[-1]

    def contradictions(self, patch):
        wanted = list(CHAIN[self.action][: len(self._chain(patch))])
        if self.action == "-i":
            wanted += ["osagent", "history"]
            if self.passed(patch) != (self.failed_step(patch, "-i") is None):
                yield f"patch {patch}: failed at {self.failed_step(patch, '-i')}, and passed all the same"
        if wanted != self.entered(patch):
            yield f"steps of patch {patch}: expected {wanted}, found {self.entered(patch)}"
