"""A scenario's patches, written once, and runs of it on homes of their own."""

import itertools
import os
import tarfile
from datetime import datetime

from support import parse_log, remove_tree, scratch_folder
from support.snapshot import snapshot

from .allowance import Allowance
from .injection import injections_of, traced
from .judgement import problems
from .scenario import REPAIRED, RUNNING, SCENARIOS
from .steps import Context
from .story import Story


class Bench:
    """The patches of one scenario and its undisturbed run."""

    def __init__(self, program, name):
        self.program, self.scenario = program, SCENARIOS[name]
        self.folder = scratch_folder()
        self.start = self.folder / "start"
        self.start.mkdir()
        (self.folder / "patches").mkdir()
        self.path = self.scenario.write_patches(self.folder / "patches")
        self.healing_path = self._write_healing_patches()
        self.members = [self._members(facts.patch) for facts in self.scenario.patches]
        self.usual_report = None  # lines of the first run's standard output, to compare the others with
        self.undisturbed = [self._run_undisturbed(), self._run_undisturbed(spare_the_log=True)]
        self.injections = injections_of(name, *(run.calls_to_fail() for run in self.undisturbed))

    def close(self):
        remove_tree(self.folder)

    def _write_healing_patches(self):
        """The same patches without the command that fails."""
        if not any(facts.failing for facts in self.scenario.patches):
            return self.path
        (self.folder / "healing").mkdir()
        return REPAIRED.write_patches(self.folder / "healing")

    def _members(self, patch):
        """What the archive holds, by path."""
        folder = self.folder / patch.product
        with tarfile.open(self.folder / "patches" / patch.filename) as archive:
            archive.extractall(folder)
        return snapshot(folder)

    def _run_undisturbed(self, **options):
        run = Run(self, **options)
        self.usual_report = self.usual_report or self.normalised(run)
        run.judge()
        run.close()
        return run

    @staticmethod
    def normalised(run):
        """The lines of a report, without the name of the home, the files in an order of our own."""
        out = run.result.out.decode().replace(run.home.prefix, "HOME/")
        groups = itertools.groupby(out.split("\n"), key=lambda line: line.startswith("    HOME/"))
        return [line for is_file, lines in groups for line in (sorted(lines) if is_file else lines)]


class Run:
    """One run. `faults` are injections into the tool, `sabotage` what is wrong with its children, `on_start` is told
    the home and the file that will hold the process id of the run."""

    def __init__(self, bench, faults=(), sabotage=(), on_start=None, spare_the_log=False):
        self.bench, self.sabotage = bench, sabotage
        self.debug = spare_the_log or any(fault.spares_the_log for fault in faults)
        self.home = bench.scenario.make_home()
        env = {}
        for child in sabotage:
            env.update(child.prepare(self.home))
        self.search_path = env.get("PATH", os.environ["PATH"])
        self.before = self.home.tree()
        pid_file = self.home.path.parent / "pid"
        if on_start:
            on_start(self.home, pid_file)
        self.began = datetime.now()
        self.result, self.calls = self.again(faults, env, pid_file)
        self.ended = datetime.now()

    def again(self, faults, env=None, pid_file="/dev/null"):
        """The same command on the same home, with these faults; result and calls."""
        tell = ["/bin/sh", "-c", 'ulimit -c 0; echo $$ >"$0"; exec "$@"', str(pid_file)]
        return traced(
            self.bench.program,
            self.bench.scenario.arguments(self.home, self.bench.path),
            self.bench.start,
            self.home.path.parent / "trace",
            faults,
            self.debug,
            env=env or {},
            wrapper=tell,
        )

    def close(self):
        self.home.close()

    def new_context(self):
        return Context(self.bench.scenario, str(self.home.path))

    def log(self):
        there = self.home.exists("patchlogs/orvpatch.log")
        return parse_log(self.result.out if self.debug else self.home.read("patchlogs/orvpatch.log") if there else "")

    @property
    def log_lines(self):
        return sum("\n" in text for text in (call.text for call in self.calls))

    @property
    def messages(self):
        """What it logged, as far as it got to writing it: a line may have failed to reach the file."""
        return [message for call in self.calls for message in call.messages]

    @property
    def story(self):
        return Story(self.bench.scenario, str(self.home.path), self.messages)

    def calls_to_fail(self):
        """All but those by which the C library looks for the name of a user while an agent is started: what it
        makes of a failure is its own affair, and the unit tests let the name itself be missing."""
        context, found = self.new_context(), []
        for call in self.calls:
            if not (context.step in ("restart", "osagent") and context.fault(call).in_users):
                found.append(call)
            context.after(call)
        return found

    def struck(self):
        """The faults that were met, where and at what."""
        context, found = self.new_context(), [fault for child in self.sabotage for fault in child.faults]
        for call in self.calls:
            if call.injected:
                found.append(context.fault(call))
            context.after(call)
        return found

    def judge(self, faults=()):
        """Asserts that the run is one of those that these faults allow."""
        found = problems(self, Allowance(faults))
        assert not found, "; ".join(found)

    # --- what it must have called --------------------------------------------------------------------------

    def calls_of(self, index):
        """Every call that applying this patch takes: (step, its calls in order)."""
        facts = self.bench.scenario.patches[index]
        commands = {when: [(name,) for name in sorted(names)] for when, names in facts.patch.commands.items()}
        stops = [(code, name) for code in facts.dependents for name in RUNNING.get(code, ())]
        made = [stop for stop in stops if self._was_stopped(index, *stop)]
        starts = [(code, name) for code, name in sorted(made, key=lambda stop: stop[0]) if code != "kox"]
        os_agent = [("kox", "")] if ("kox", "") in made else []
        if self.bench.scenario.action == "-t":
            return []
        return [
            ("pre_patch", commands["pre_patch"]),
            ("stop", _controls("stop", stops)),
            ("pre", commands["pre"]),
            ("post", commands["post"]),
            ("restart", _controls("start", starts)),
            ("osagent", _controls("start", os_agent)),
        ]

    def _was_stopped(self, index, code, name):
        called = [(call.program, *call.args) for call in self.home.journal()]
        # A stop that fails counts where the instance then seems to be gone.
        believed = "stop" in self.story.entered(index) and self.story.failed_step(index, "-i") != "stop"
        return _control("stop", code, name) in called and (believed or not self._is_sabotaged("stop", code))

    def _is_sabotaged(self, verb, code):
        return any((verb, code[1:]) == child.control for child in self.sabotage)

    def running_by_the_journal(self):
        """The instances that have to run after these calls."""
        running = {(code[1:], name) for code, names in RUNNING.items() for name in names}
        for call in self.home.journal():
            if call.program == "QuillAgent":
                *_, verb, code = call.args
                instance = (code, call.args[1] if call.args[0] == "-o" else "")
                if not self._is_sabotaged(verb, f"k{code}"):
                    (running.discard if verb == "stop" else running.add)(instance)
        return running


def _controls(verb, instances):
    return [_control(verb, code, name) for code, name in instances]


def _control(verb, code, name):
    return ("QuillAgent", *(["-o", name] if name else []), verb, code[1:])
