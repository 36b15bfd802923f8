"""Judges what a run has left: status, streams, log, history, calls, processes and every file have to tell the same
story, and only what a fault may touch may differ from a run without one."""

import os
import pwd
import re
from datetime import datetime, timedelta

from support.catalogue import TEXTS, text

from .allowance import ENDS, LOADING
from .scenario import EXTRACTED_MODE, NEW_LEVEL, NEW_MODE, OLD_LEVEL, REPLACED_MODE, REPLACED_OWNER, old_content

HISTORY, LOG, RESULT_FILE = "patchlogs/patches.hist", "patchlogs/orvpatch.log", "vmaorv6/agentdepot/rc.txt"
_RUN_INFO = "config/.ConfigData/RunInfo"
_HISTORY_HEADER = [
    "#" * 80,
    "# Norvik Veyra Monitoring Patch History File",
    "#",
    "# Format: <Product Code> | <Architecture> | <Comp> | <Patch Name> | PASS/FAIL | <user> | <date>",
    "#" * 80,
]
_OPENED, _CLOSED = 0o777, (0o755, 0o700)
_BAD_HOME = 2  # the run ends before it has a log
_LEFTOVER_STATUS = 27  # of a clean-up that failed: it ends nothing, but is what the OS agent is told


def problems(run, allowed):
    """What is wrong with a run that ended by itself, one text each."""
    return list(_Judgement(run, allowed).problems())


class _Judgement:
    def __init__(self, run, allowed):
        self.run, self.allowed, self.story = run, allowed, run.story
        self.scenario, self.home, self.status = run.bench.scenario, run.home, run.result.status
        self.tree = run.home.tree()
        self.failed_at = self._failed_at()

    def problems(self):
        yield from self._status()
        if self.status == _BAD_HOME:
            yield from _compare(
                "output",
                (b"", (text("ERROR_ORV_HOME", self.home.prefix) + "\n").encode()),
                (self.run.result.out, self.run.result.err),
            )
        else:
            yield from self._streams()
            yield from self._log() if "log" not in self.allowed else ()
        yield from self._history()
        yield from self._calls()
        yield from self._processes()
        for index, facts in enumerate(self.scenario.patches):
            yield from self._files(index, facts)
            yield from self._level(index, facts)
            yield from self._temporary(index, facts)
        yield from self._result_file()
        yield from self._everything_else()

    # --- how it ended --------------------------------------------------------------------------------------

    def _failed_at(self):
        """(patch, step) where the run failed; patch None: before the first one; None: nowhere."""
        for index in self.story.applied:
            step = self.story.failed_step(index, self.scenario.action)
            if step:
                return index, step
        return None if self.status == 0 else (None, "loading")

    def _ends(self):
        """Texts that this run may have failed with, by status."""
        if self.failed_at is None:
            return {}
        index, step = self.failed_at
        if index is None:
            ends = [self.allowed.ends(step) for step in LOADING]
        elif step == self.scenario.patches[index].failing:
            ends = [ENDS[step]]
        else:
            ends = [self.allowed.ends(step)]
        if index is not None and self.scenario.action == "-i" and not self.story.os_agent_done(index):
            ends.append(self.allowed.ends("osagent"))
        found = {}
        for texts in ends:
            for status, keys in texts.items():
                found[status] = found.get(status, ()) + keys
        return found

    def _status(self):
        ends = self._ends()
        if self.failed_at is None or self._is_report_without_files():
            yield from _compare("status", 0, self.status)
        elif self.status not in ends:
            yield f"status {self.status}: expected one of {sorted(ends)}, failed at {self.failed_at}"
        for index in self.story.applied:
            yield from self.story.contradictions(index)
            if self.story.passed(index) and self.scenario.patches[index].failing:
                yield f"patch {index} passed: expected its {self.scenario.patches[index].failing} command to fail"
        skipped = set(range(len(self.scenario.patches))) - set(self.story.applied)
        if self.status == 0 and skipped and "left out" not in self.allowed:
            yield f"expected patches {sorted(skipped)} to be applied"

    def _is_report_without_files(self):
        return self.status == 0 and self.failed_at[1] == "list" and "files" in self.allowed

    # --- what it said --------------------------------------------------------------------------------------

    def _streams(self):
        verdict = (
            f"\n{text('MAIN_SUCCESSFUL')}\n\n"
            if self.status == 0
            else f"\n{text('MAIN_NOT_SUCCESSFUL', self.home.prefix + 'patchlogs/')}\n\n"
        )
        out, err = self.run.result.out.decode(), self.run.result.err.decode()
        if "out" not in self.allowed and not self.run.debug:
            yield from self._standard_output(out, verdict)
        if "log" in self.allowed:
            err = err.replace(text("LOG_CANT_WRITE", self.home.prefix + LOG) + "\n", "")
        if "err" not in self.allowed:
            yield from self._standard_error(err)

    def _standard_output(self, out, verdict):
        if not out.endswith(verdict):
            yield f"standard output: expected {verdict!r} at the end, found {out[-200:]!r}"
        if "mixed" in self.allowed:
            return
        if self.scenario.action == "-i" or not self.story.applied:
            yield from _compare("standard output", verdict, out)
            return
        usual, found = self.run.bench.usual_report, self.run.bench.normalised(self.run)
        if self.status == 0 and not {"unseen", "files"} & self.allowed.silent:
            yield from _compare("report", usual, found)
            return
        also = {text("PP_NO_RUNNING_INST"), "", *verdict.replace(self.home.prefix, "HOME/").split("\n")}
        told = [line for line in found if line not in also]
        strange = [line for line in told if line not in usual and not line.startswith("    HOME/")]
        known = [line for line in told if line in usual]
        order = sorted(known, key=usual.index)
        if strange or order != known:
            yield f"report: expected some of {usual}, found {found}"

    def _standard_error(self, err):
        ends, fits = self._ends().get(self.status, ()), False
        framed = self.scenario.action == "-i" or not self.story.applied
        if self.status == 0:
            fits = err == "" or err == "\n" and self.failed_at is not None
        for key in ends:
            pattern = _pattern(key)
            shape = f"{pattern}\n" if not framed else f"\n{pattern}\n\n"
            match = re.search(shape if "mixed" in self.allowed else f"^{shape}$(?![\n])", err)
            fits = fits or bool(match) and self._was_logged(match[0].strip("\n"))
        if not fits and not ("mixed" in self.allowed and self.status == 0):
            yield f"standard error: expected a text of {ends}, which the log has too, found {err!r}"

    def _was_logged(self, message):
        return message.split("\n")[0] in self.run.messages

    def _log(self):
        log = self.run.log()
        if len(log.runs) != 1 or log.preamble.strip() and not self.run.debug:
            yield f"log: expected one run, found {len(log.runs)} after {log.preamble!r}"
            return
        header, lines = log.runs[0].header, log.messages()
        yield from _compare("host in the log", os.uname().nodename.split(".")[0], header.host)
        if "user" not in self.allowed:
            yield from _compare("user in the log", _user(), header.user)
        wanted = ["main entry", f"main = {self.status}"]
        # Under the debug switch the verdict, which is no line of the log, follows the last one.
        yield from _compare("ends of the log", wanted, [lines[0], lines[-1].split("\n")[0]])

    def _history(self):
        found = self.home.read(HISTORY).decode().split("\n") if self.home.exists(HISTORY) else [""]
        dates = [line[-19:] for line in found if line and not line.startswith("#")]
        undated = [line if line.startswith("#") else line[:-19] for line in found]
        records = self._records()
        if "user" in self.allowed:
            records, undated = ([_without_user(line) for line in lines] for lines in (records, undated))
        if "history" in self.allowed:
            records = [line for line in records if line in undated]
        headless = "history" in self.allowed and found[0] != _HISTORY_HEADER[0]
        wanted = [*([] if headless else _HISTORY_HEADER), *records, ""] if records or found != [""] else [""]
        yield from _compare("history", wanted, undated)
        for date in dates if "date" not in self.allowed else ():
            moment = datetime.strptime(date, "%m/%d/%Y %H:%M:%S")
            if not self.run.began - timedelta(seconds=1) <= moment <= self.run.ended:
                yield f"history: expected a date between {self.run.began} and {self.run.ended}, found {date}"

    def _records(self):
        """The lines of the history but for their dates."""
        return [
            f"{facts.code} | {facts.patch.platform} | {facts.patch.target} | {facts.patch.name:20} | "
            f"{'PASS' if self.story.passed(index) else 'FAIL'} | {_user():15} | "
            for index, facts in enumerate(self.scenario.patches)
            if index in self.story.applied and self.scenario.action == "-i"
        ]

    # --- what it called ------------------------------------------------------------------------------------

    def _calls(self):
        journal = self.home.journal()
        rest = [(call.program, *call.args) for call in journal]
        for index in self.story.applied:
            for step, wanted in self.run.calls_of(index):
                made = [words for words in rest if words in wanted]
                if rest[: len(made)] != made or not self._is_enough(index, step, made, wanted):
                    yield f"calls of {step}: expected {wanted}, found {rest}"
                rest = rest[len(made) :]
        yield from _compare("further calls", [], rest)
        for call in journal:
            yield from self._call(call)

    def _is_enough(self, index, step, made, wanted):
        if step not in self.story.entered(index):
            return made == []
        if step == "osagent":
            done = self.story.os_agent_done(index)
        else:
            done = self.story.failed_step(index, "-i") != step
        if "unseen" in self.allowed and step == "stop":
            return not done or made == [words for words in wanted if words in made]
        return made == wanted if done else made == wanted[: len(made)]

    def _call(self, call):
        temp = next(
            (facts.temp for facts in self.scenario.patches if call.program in sum(facts.patch.commands.values(), [])),
            None,
        )
        folder = f"{self.home.path}/{temp}" if temp else str(self.run.bench.start)
        search = self.run.search_path
        yield from _compare(f"PATH of {call}", f"{folder}:{search}" if temp else search, call.path)
        yield from _compare(f"QUILLHOME of {call}", self.home.prefix, call.quillhome)
        if temp or "directory" not in self.allowed:
            yield from _compare(f"directory of {call}", folder, call.cwd)

    def _processes(self):
        found = sorted(self.home.instances())
        yield from _compare("running", sorted(self.run.running_by_the_journal()), found)
        first, *rows = self.home.run_info.split("\n")
        before = self.run.before[_RUN_INFO].content.decode().split("\n")
        own = {tuple(row.split("|")[:1] + row.split("|")[4:]) for row in before[1:-1]}
        strange = [row for row in rows[:-1] if tuple(row.split("|")[:1] + row.split("|")[4:]) not in own]
        recorded = sorted((row.code, row.name) for row in self.home.rows())
        if first != before[0] or strange or rows[-1] or recorded != found:
            yield f"run information: expected a row for each of {found}, found {self.home.run_info!r}"

    # --- the files -----------------------------------------------------------------------------------------

    def _moved(self, index):
        """Whether all files have been moved: None when the step failed."""
        if self.scenario.action == "-t" or "move" not in self.story.entered(index):
            return False
        return None if self.story.failed_step(index, "-i") == "move" else True

    def _files(self, index, facts):
        moved, odd = self._moved(index), 0
        for place in facts.replaced + facts.added:
            entry = self.tree.get(place)
            touched = moved is not False and "files" in self.allowed and self._is_touched(place, facts)
            if moved is not False and _is_new(entry, facts, place, exact=not touched):
                continue
            if moved is not True and _is_old(entry, facts, place):
                continue
            odd += 1
            if not (touched and (self._is_kept(entry, facts, place) or moved is None and odd == 1)):
                yield f"{place}: expected {'the new' if moved else 'the old'} one, found {entry}"
        for place in facts.directories:
            entry = self.tree.get(place)
            touched = "files" in self.allowed and self._is_touched(place, facts)
            modes = (_OPENED, *_CLOSED) if touched else (_OPENED,)
            if entry is None and (not moved or touched) or moved is not False and entry and entry.mode in modes:
                continue
            yield f"directory {place}: expected {'mode 0777' if moved else 'none'}, found {entry}"

    def _is_touched(self, place, facts):
        return self.allowed.touches(place, self._roots(facts))

    def _roots(self, facts):
        return f"{self.home.path}/{facts.temp}/updated_files", str(self.home.path)

    def _is_kept(self, entry, facts, place):
        """A place that the walk did not get to see, with its new file still waiting."""
        return (
            _is_old(entry, facts, place)
            and f"{facts.temp}/updated_files/{place}" in self.tree
            or _is_old(entry, facts, place)
            and self.story.passed(self.scenario.patches.index(facts))
        )

    def _level(self, index, facts):
        old = self.run.before[facts.version_file].content
        new = old.replace(OLD_LEVEL.encode(), NEW_LEVEL.encode(), 1) + b"\n"
        entered, failed = self.story.entered(index), self.story.failed_step(index, "-i")
        reached = self.scenario.action == "-i" and "level" in entered
        wanted = {new if reached and failed != "level" else old}
        if reached and "level" in self.allowed:
            wanted |= {old, new}
        entry = self.tree[facts.version_file]
        if entry.content not in wanted or entry[:1] + entry[1:4] != _facts(self.run.before[facts.version_file]):
            yield f"{facts.version_file}: expected {wanted}, found {entry}"

    def _result_file(self):
        before, entry = self.run.before.get(RESULT_FILE), self.tree.get(RESULT_FILE)
        wanted = {before.content if before else None}
        for index in self.story.applied:
            if ("start", "ox") in [
                call[-2:] for step, calls in self.run.calls_of(index) for call in calls if step == "osagent"
            ]:
                wanted = {str(status).encode() for status in self._told(index)}
        if "result file" in self.allowed:
            wanted |= {None, b""}
        found = entry.content if entry else None
        if found not in wanted:
            yield f"{RESULT_FILE}: expected one of {wanted}, found {found}"

    def _told(self, index):
        """What the OS agent may be told: the status so far."""
        failed = self.story.failed_step(index, "-i")
        if failed and failed != "osagent":
            return set(ENDS[failed]) if not self.story.os_agent_done(index) else {self.status}
        return {0, _LEFTOVER_STATUS} if "leftover" in self.allowed else {0}

    def _temporary(self, index, facts):
        top, members = facts.temp, self.run.bench.members[index]
        found = {path[len(top) + 1 :]: entry for path, entry in self.tree.items() if path.startswith(top + "/")}
        extracted = self.story.extracted(index)
        damaged = "leftover" in self.allowed or self.failed_at and self.failed_at[1] in ("extract", "loading")
        for path, entry in found.items():
            member = members.get(path)
            if member is None or member.kind != entry.kind or member.content != entry.content and not damaged:
                yield f"{top}/{path}: expected a member of the archive, found {entry}"
        if self._is_cleaned_up(index):
            if top in self.tree and "leftover" not in self.allowed:
                yield f"{top}: expected none after success, found {sorted(found)}"
        elif extracted:
            yield from self._missing(facts, found, members)
        elif index in self.story.accepted and "leftover" not in self.allowed and index not in self.story.applied:
            yield from _compare(f"{top} of a patch that was not applied", {"patch.ini"}, set(found))

    def _is_cleaned_up(self, index):
        return index in self.story.applied and self.story.passed(index)

    def _missing(self, facts, found, members):
        for path, member in members.items():
            place = path.removeprefix("updated_files/")
            moved = place != path and _is_new(self.tree.get(place), facts, place, exact=False)
            if path not in found and not moved:
                yield f"{facts.temp}/{path}: expected to wait after a failure"

    def _everything_else(self):
        wanted, found = self._untouched(self.run.before), self._untouched(self.tree)
        for path in sorted(wanted.keys() | found.keys()):
            yield from _compare(path, wanted.get(path), found.get(path))

    def _untouched(self, tree):
        own = {
            HISTORY,
            LOG,
            RESULT_FILE,
            _RUN_INFO,
            *(
                place
                for facts in self.scenario.patches
                for place in (*facts.replaced, *facts.added, *facts.directories, facts.version_file, facts.temp)
            ),
        }
        temps = tuple(f"{facts.temp}/" for facts in self.scenario.patches)
        return {path: entry for path, entry in tree.items() if path not in own and not path.startswith(temps)}


def _is_new(entry, facts, place, exact):
    """The new file; `exact`: with the mode and the owner that it has to get."""
    if entry is None or entry.content != facts.new_content(place):
        return False
    usual = REPLACED_MODE if place in facts.replaced else NEW_MODE
    owners = {REPLACED_OWNER if place in facts.replaced else (0, 0)} if os.geteuid() == 0 else {entry[2:4]}
    modes = {usual}
    if not exact:
        modes |= {NEW_MODE, EXTRACTED_MODE}
        owners |= {(0, 0)}
    return entry.mode in modes and (entry.uid, entry.gid) in owners


def _is_old(entry, facts, place):
    if place in facts.added:
        return entry is None
    return (
        entry is not None
        and entry.content == old_content(place)
        and entry.mode == REPLACED_MODE
        and (os.geteuid() != 0 or (entry.uid, entry.gid) == REPLACED_OWNER)
    )


def _facts(entry):
    return entry.kind, entry.mode, entry.uid, entry.gid


def _pattern(key):
    return re.sub(r"%[sd]", "(?s:.*?)", re.escape(TEXTS[key]))


def _without_user(line):
    return line if line.startswith("#") else re.sub(r"[^|]*\| $", "", line)


def _user():
    return pwd.getpwuid(os.getuid()).pw_name


def _compare(what, expected, found):
    if expected != found:
        yield f"{what}: expected {expected!r}, found {found!r}"
