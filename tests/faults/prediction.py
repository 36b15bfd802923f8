"""The road of a run with faults: what it must leave behind, print and return.

Written from what the program promises, step by step, and not from its sources: every step runs only when all
before it succeeded, and the history and the OS agent's restart follow whatever happened.
"""

from dataclasses import dataclass, field

from cases.catalogue import text

from .faults import Failure
from .scenario import (EXTRACTED_MODE, NEW_LEVEL, NEW_MODE, REPLACED_MODE, RUNNING, description, old_content)

_SCRIPT_CODES = {"pre_patch": 22, "pre": 21, "post": 23}


@dataclass
class Expected:
    status: int = 0
    out: str = ""
    err: str = ""
    journal: list = field(default_factory=list)    # (words, is a script of the patch whose temporary directory)
    history: list = field(default_factory=list)    # (code, "PASS" or "FAIL"), or "no header"
    files: dict = field(default_factory=dict)      # place -> (content, mode, takes over the owner) or None
    in_temp: dict = field(default_factory=dict)    # place -> patch whose updated_files must still hold it
    directories: dict = field(default_factory=dict)  # place -> mode
    levels: dict = field(default_factory=dict)     # version file -> level, or b"" for an empty file
    rc: bytes = None
    running: set = field(default_factory=set)


class Road:
    """`walks` are, by patch, the places of updated_files in the order of the walk: ("file" or "directory", place)."""

    def __init__(self, scenario, listing, walks, faults, home, path):
        self.scenario, self.listing, self.walks, self.faults = scenario, listing, walks, faults
        self.home, self.path = str(home.path), str(path)
        self.record = Failure(0, "")
        self.done = Expected(running={(code, name) for code, names in RUNNING.items() for name in names})
        self.stopped = {}
        for facts in scenario.patches:
            self.done.files.update({place: (old_content(place), REPLACED_MODE, True) for place in facts.replaced})
            self.done.files.update(dict.fromkeys(facts.added))

    def expected(self):
        done = self.done
        if self.faults.bad_home:
            done.status, done.err = 2, text("ERROR_ORV_HOME", self.home + "/") + "\n"
            return done
        accepted = self._load()
        if accepted is not None:
            action = self._report if self.scenario.action == "-t" else self._install
            passed = all(action(index) for index in sorted(accepted))
        framed = self.scenario.action == "-i" or accepted is None
        if accepted is None or not passed:
            done.status = self.record.code
            done.err = f"\n{self.record.text}\n\n" if framed else f"{self.record.text}\n"
        done.out += self._verdict()
        return done

    def _verdict(self):
        if self.done.status == 0:
            return f"\n{text('MAIN_SUCCESSFUL')}\n\n"
        return f"\n{text('MAIN_NOT_SUCCESSFUL', self.home + '/patchlogs/')}\n\n"

    # --- loading -------------------------------------------------------------------------------------------

    def _load(self):
        """The patches that may be applied, or None when nothing is."""
        if self.faults.load:
            self.record = self.faults.load
            return None
        accepted, failure = [], None
        for index in self.listing:
            if index not in self.faults.not_applicable:
                failure = self.faults.initialize.get(index) or self._unmet(index)
                if failure:
                    break
                accepted.append(index)
        if self.scenario.directory and not accepted:
            failure = Failure(32, text("ERROR_DCFPP_NO_APPLICABLE", self.path))
        elif not accepted and not failure:
            failure = Failure(34, text("ERROR_DCFPP_NOT_APPLICABLE", self.path))
        self.record = failure or self.record
        return None if failure else accepted

    def _unmet(self, index):
        facts = self.scenario.patches[index]
        if facts.code in self.faults.missing:
            return Failure(9, text("ERROR_PP_MISSING_PROD", facts.code))
        for code in facts.patch.prereqs:
            if f"k{code}" in self.faults.missing:
                return Failure(9, text("ERROR_PP_MISSING_PREREQ", f"k{code} 06.10.00.00"))
        return None

    # --- the report ----------------------------------------------------------------------------------------

    def _report(self, index):
        facts = self.scenario.patches[index]
        self._clean_up(index, "before")
        title = *_indented([facts.patch.title]), ""
        self.done.out += (_lines("", "=" * 70, text("DCFPP_PROCESS_PATCH", self.path), *title)
                          + self._commands(facts, "pre_patch") + "\n" + self._dependents(facts)
                          + self._commands(facts, "pre"))
        if not (self._step(index, "extract") and self._list(index)):
            return False
        self.done.out += self._commands(facts, "post") + "\n"
        self._clean_up(index, "after")
        return True

    @staticmethod
    def _commands(facts, when):
        keys = {"pre_patch": "PP_TEST_PREPATCHSCRIPT", "pre": "PP_TEST_PRESCRIPT", "post": "PP_TEST_POSTSCRIPT"}
        return _lines(text(keys[when]), *_indented(facts.patch.commands[when]))

    def _dependents(self, facts):
        found = [(code, name) for code in sorted(self._dependent_codes(facts)) for name in self._running(code)]
        if not found:
            return _lines(text("PP_NO_RUNNING_INST"), "")
        shown = [f"{name} instance of {description(code)}" if name else description(code) for code, name in found]
        return _lines(text("PP_LIST_AGENT_INST"), *_indented(shown), "")

    def _list(self, index):
        if "no tree" in self.faults.unseen.get(index, ()):
            self.done.out += "\n"
            return False
        if not self._step(index, "enter list"):
            self.done.out += "\n"
            return False
        self.done.out += "\n" + _lines(text("PP_LIST_FILES"))
        unseen = self.faults.unseen.get(index, set())
        for place in [*sorted(unseen), *self._visited(index, "file")]:
            self.done.out += f"    {self.home}/{place or '.'}\n"
        self.done.out += "\n"
        return self._leave(index, "list")

    # --- the installation ----------------------------------------------------------------------------------

    def _install(self, index):
        self._clean_up(index, "before")
        passed = all(step(index) for step in (
            lambda i: self._step(i, "extract"), lambda i: self._scripts(i, "pre_patch"), self._stop,
            lambda i: self._scripts(i, "pre"), self._move, lambda i: self._scripts(i, "post"), self._level,
            self._restart))
        passed = self._os_agent(index) and passed
        self._history(index, passed)
        self.stopped = {}
        if passed:
            self._clean_up(index, "after")
        return passed

    def _clean_up(self, index, when):
        """A clean-up that fails stops nothing, but leaves its record."""
        if (index, when) in self.faults.leftover:
            temp = f"{self.home}/{self.scenario.patches[index].temp}"
            self.record = Failure(27, text("ERROR_PP_RM_DIR", temp))

    def _step(self, index, step):
        failure = self.faults.steps.get((index, step))
        self.record = failure or self.record
        return failure is None

    def _leave(self, index, step):
        failure = self.faults.leave.get((index, step))
        self.record = failure or self.record
        return failure is None

    def _scripts(self, index, when):
        facts = self.scenario.patches[index]
        commands = sorted(facts.patch.commands[when])
        failure = self.faults.steps.get((index, when))
        if not commands:
            return True
        if failure and failure.text == text("ERROR_PP_SET_CWD", f"{self.home}/{facts.temp}"):
            return self._step(index, when)  # the directory could not be entered
        for command in commands[:failure.done if failure else None]:
            self.done.journal.append(((command,), facts.temp))
        if failure:
            self.record = failure
        elif facts.failing == when:
            failure = self.record = Failure(_SCRIPT_CODES[when], text("PROC_BAD_RC", commands[-1], facts.status))
        return self._leave(index, when) and failure is None

    def _dependent_codes(self, facts):
        codes = [f"k{code}" if len(code) == 2 else code for code in facts.patch.dependents]
        return codes + [facts.code] * (facts.code not in codes)

    def _running(self, code):
        if code in self.faults.missing:
            return []
        return [name for name in RUNNING.get(code, ()) if (code, name) not in self.faults.not_running]

    def _stop(self, index):
        failure = self.faults.steps.get((index, "stop"))
        left = failure.done if failure else None
        for code in self._dependent_codes(self.scenario.patches[index]):
            names = self._running(code)
            for name in names:
                if left == 0:
                    return self._step(index, "stop")
                left = None if left is None else left - 1
                self._control("stop", code, name)
            if names:
                self.stopped[code] = names
        return True

    def _control(self, verb, code, name):
        words = ("QuillAgent", "-o", name, verb, code[1:]) if name else ("QuillAgent", verb, code[1:])
        self.done.journal.append((words, None))
        (self.done.running.discard if verb == "stop" else self.done.running.add)((code, name))

    def _restart(self, index):
        failure = self.faults.steps.get((index, "restart"))
        left = failure.done if failure else None
        for code in sorted(self.stopped):
            for name in self.stopped[code] if code != "kox" else ():
                if left == 0:
                    return self._step(index, "restart")
                left = None if left is None else left - 1
                self._control("start", code, name)
        return True

    def _os_agent(self, index):
        if not self.stopped.get("kox"):
            return True
        content = self.faults.rc.get(index, str(self.record.code).encode())
        self.done.rc = self.done.rc if content is None else content
        if not self._step(index, "osagent"):
            return False
        self._control("start", "kox", "")
        return True

    def _level(self, index):
        if not self._step(index, "level"):
            return False
        content = self.faults.level.get(index, NEW_LEVEL)
        self.done.levels[self.scenario.patches[index].version_file] = content
        return True

    def _history(self, index, passed):
        how = self.faults.history.get(index)
        if how != "absent":
            self.done.history.append((self.scenario.patches[index].code, "PASS" if passed else "FAIL"))
        if how == "no header" and len(self.done.history) == 1:
            self.done.history.insert(0, "no header")

    # --- the files -----------------------------------------------------------------------------------------

    def _move(self, index):
        if "no tree" in self.faults.unseen.get(index, ()):
            return True
        if not self._step(index, "enter move"):
            return False
        failing = self.faults.move.get(index)
        for kind, place in self._walk(index):
            if failing and failing[0] == place:
                self._left_behind(index, *failing)
                break
            if kind == "directory":
                self.done.directories[place] = self.faults.modes.get(place, 0o777)
            else:
                self._moved(index, place)
        return self._leave(index, "move") and self._step(index, "move")

    def _walk(self, index):
        """What the walk meets: not what stands below a directory that could not be opened, nor an entry that
        could not be looked at, which counts as a file that is not there any more."""
        closed, unseen = self.faults.unopened.get(index, ()), self.faults.unseen.get(index, ())
        return [(kind, place) for kind, place in self.walks[index]
                if not any(_is_below(place, top) for top in closed)
                and not any(place == top or _is_below(place, top) for top in unseen)]

    def _visited(self, index, wanted):
        return [place for kind, place in self._walk(index) if kind == wanted]

    def _moved(self, index, place):
        usual = REPLACED_MODE if place in self.scenario.patches[index].replaced else NEW_MODE
        takes_over = usual == REPLACED_MODE and place not in self.faults.keeps_owner
        content = self.scenario.patches[index].new_content(place)
        self.done.files[place] = (content, self.faults.modes.get(place, usual), takes_over)

    def _left_behind(self, index, place, state):
        content = self.scenario.patches[index].new_content(place)
        if state in ("missing", "kept", "both"):
            self.done.in_temp[place] = index
        if state == "missing":
            self.done.files[place] = None
        elif state in ("both", "in place"):
            self.done.files[place] = (content, EXTRACTED_MODE, False)


def _is_below(place, top):
    return not top or place.startswith(top + "/")


def _lines(*lines):
    return "".join(f"{line}\n" for line in lines)


def _indented(lines):
    return [f"    {line}" for line in lines]

