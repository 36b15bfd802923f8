"""Runs a scenario with one injected fault and compares all that it leaves with what it has to be."""

import os
import re

from support import scratch_folder, remove_tree

from .context import Context
from .faults import Faults
from .injection import INFALLIBLE, errors_of, injections_of, traced
from .prediction import Road
from .rules import apply_rules
from .scenario import OLD_LEVEL, REPLACED_OWNER, SCENARIOS

_MOVED = re.compile(r"Successfully moved file from .* to (.*)")
_MADE = re.compile(r"Creating new directory: (.*)")
_LISTED = re.compile(r".*/updated_files/(.*) --> .*")
_DUE_TO_CHANGE = ("patchlogs", "config/.ConfigData/RunInfo", "vmaorv6/agentdepot/rc.txt")


class Bench:
    """The patches of one scenario, written once, and its undisturbed run."""

    def __init__(self, program, name):
        self.program, self.scenario = program, SCENARIOS[name]
        self.folder = scratch_folder()
        (self.folder / "patches").mkdir()
        (self.folder / "start").mkdir()
        self.path = self.scenario.write_patches(self.folder / "patches")
        self.listing = self.scenario.listing(self.path)
        self.walks = {}
        self.undisturbed = [self._run_undisturbed(), self._run_undisturbed(spare_the_log=True)]
        self.injections = injections_of(name, *(run.calls for run in self.undisturbed))

    def close(self):
        remove_tree(self.folder)

    def _run_undisturbed(self, **options):
        run = Run(self, **options)
        self.walks = self.walks or self._walks(run)
        run.judge()
        run.close()
        return run

    def _walks(self, run):
        """By patch, what the walk through updated_files meets, in the system's order: taken from the log of
        the undisturbed run."""
        walks, prefix = {}, f"{run.home.path}/./"
        places = []
        for message in (text for call in run.calls for text in call.messages):
            for pattern, kind in ((_MOVED, "file"), (_MADE, "directory"), (_LISTED, "file")):
                match = pattern.fullmatch(message)
                if match:
                    places.append((kind, match[1].removeprefix(prefix).rstrip("/")))
        for index, facts in enumerate(self.scenario.patches):
            own = {*facts.replaced, *facts.added, *facts.directories}
            walks[index] = [place for place in places if place[1] in own]
            met = {place for kind, place in walks[index] if kind == "file"}
            assert met == {*facts.replaced, *facts.added}, f"the walk met {sorted(met)}"
        return walks


def replayed(bench):
    """The rule of every call of an undisturbed run and each of its errors."""
    for run in bench.undisturbed:
        context = run.new_context()
        for call in run.calls:
            if not call.is_log and call.name not in INFALLIBLE:
                for error in errors_of(call):
                    yield apply_rules(context, call._replace(error=error, injected=True), Faults())
            context.after(call)


class Run:
    """One run on a home of its own."""

    def __init__(self, bench, injection=None, spare_the_log=False):
        self.bench, self.injection = bench, injection
        self.debug = spare_the_log or bool(injection and injection.spares_the_log)
        self.home = bench.scenario.make_home()
        self.before = self.home.tree()
        self.pids = {str(row.pid): (f"k{row.code}", row.name) for row in self.home.rows()}
        self.context = self.new_context()
        trace = self.home.path.parent / "trace"
        self.result, self.calls = traced(bench.program, bench.scenario.arguments(self.home, bench.path),
                                         bench.folder / "start", trace, injection, self.debug)

    def new_context(self):
        return Context(self.bench.scenario, str(self.home.path), self.pids, self.bench.path)

    def close(self):
        self.home.close()

    def judge(self):
        """Asserts that the run is one of those that its faults allow."""
        faults = self._faults()
        problems = []
        for variant in faults.variants():
            expected = Road(self.bench.scenario, self.bench.listing, self.bench.walks, variant, self.home,
                            self.bench.path).expected()
            found = list(self._differences(expected, variant))
            if not found:
                return
            problems.append(found)
        raise AssertionError("; ".join(min(problems, key=len)))

    def _faults(self):
        faults, hit = Faults(), self.injection is None
        left_over = set()
        for call in self.calls:
            if call.injected and not call.is_log:
                hit = True
                apply_rules(self.context, call, faults)
            self.context.after(call)
            self._follow_clean_up(call, left_over)
        assert hit, "the call to fail was not made"
        faults.leftover = left_over
        return faults

    def _follow_clean_up(self, call, left_over):
        context = self.context
        if context.step != "clean-up":
            return
        left_over.add((context.patch, context.when))
        if call.name == "rmdir" and not call.error and os.path.normpath(call.path) == context.temp:
            context.removed.add((context.patch, context.when))
        left_over -= context.removed

    # --- comparisons ---------------------------------------------------------------------------------------

    def _differences(self, expected, faults):
        yield from _compare("status", expected.status, self.result.status)
        if "err" not in faults.unchecked:
            yield from _compare("standard error", expected.err, self.result.err.decode())
        if "out" not in faults.unchecked and not self.debug:
            yield from _compare("standard output", sorted(expected.out.split("\n")),
                                sorted(self.result.out.decode().split("\n")))
        yield from self._journal_differences(expected, faults)
        yield from _compare("history", expected.history, self._history())
        yield from _compare("running", sorted(expected.running),
                            [(f"k{code}", name) for code, name in self.home.instances()])
        yield from self._file_differences(expected)
        yield from self._other_differences(expected)

    def _journal_differences(self, expected, faults):
        journal = self.home.journal()
        yield from _compare("journal", [words for words, _ in expected.journal],
                            [(call.program, *call.args) for call in journal])
        for call, (words, temp) in zip(journal, expected.journal):
            folder = f"{self.home.path}/{temp}" if temp else str(self.bench.folder / "start")
            path = f"{folder}:{os.environ['PATH']}" if temp else os.environ["PATH"]
            yield from _compare(f"PATH of {words}", path, call.path)
            yield from _compare(f"QUILLHOME of {words}", self.home.prefix, call.quillhome)
            if temp or not faults.directory_lost:
                yield from _compare(f"directory of {words}", folder, call.cwd)

    def _history(self):
        if not self.home.exists("patchlogs/patches.hist"):
            return []
        text = self.home.read("patchlogs/patches.hist").decode()
        records = [(line.product, line.result) for line in self.home.history()]
        return records if text.startswith("#") or not text else ["no header", *records]

    def _file_differences(self, expected):
        tree = self.home.tree()
        for place, wanted in expected.files.items():
            yield from _compare(place, _as_far_as_seen(wanted), self._found(tree.get(place)))
        for place, index in expected.in_temp.items():
            facts = self.bench.scenario.patches[index]
            entry = tree.get(f"{facts.temp}/updated_files/{place}")
            yield from _compare(f"{place} in tmp", facts.new_content(place), entry and entry.content)
        made = {place for facts in self.bench.scenario.patches for place in facts.directories}
        found = {place: tree[place].mode for place in made if place in tree}
        yield from _compare("directories", expected.directories, found)

    @staticmethod
    def _found(entry):
        if entry is None:
            return None
        owner = (entry.uid, entry.gid) == REPLACED_OWNER if os.geteuid() == 0 else None
        return (entry.content, entry.mode, owner)

    def _other_differences(self, expected):
        """The version files, the OS agent's result file, and all that no run may touch."""
        for facts in self.bench.scenario.patches:
            file = facts.version_file
            yield from _compare(file, self._level_text(expected, facts), self.home.read(file))
        rc = self.home.read(_DUE_TO_CHANGE[2]) if self.home.exists(_DUE_TO_CHANGE[2]) else None
        yield from _compare("rc.txt", expected.rc, rc)
        yield from _compare("untouched", self._untouched(self.before), self._untouched(self.home.tree()))

    def _level_text(self, expected, facts):
        old = self.before[facts.version_file].content
        level = expected.levels.get(facts.version_file)
        if level is None or level == b"":
            return old if level is None else b""
        return old.replace(OLD_LEVEL.encode(), level.encode(), 1) + b"\n"

    def _untouched(self, tree):
        own = {place for facts in self.bench.scenario.patches
               for place in (*facts.replaced, *facts.added, *facts.directories, facts.version_file)}
        return {path: entry for path, entry in tree.items()
                if path not in own and not path.startswith(_DUE_TO_CHANGE) and not path.startswith("tmp/")}


def _as_far_as_seen(file):
    """An ordinary user owns all files, replaced and new."""
    return file if file is None or os.geteuid() == 0 else (*file[:2], None)


def _compare(what, expected, found):
    if expected != found:
        yield f"{what}: expected {expected!r}, found {found!r}"
