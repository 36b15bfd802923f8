"""Random combinations of two and three faults at once: calls of the tool that fail, children that fail, signals to
the whole process group, a kill of the tool, and then a kill of the repetition."""

import contextlib
import os
import random
import signal
import threading
import time

from support import stubs

from .kills import kills_of, settle
from .run import Run
from .states import Aftermath
from .steps import Fault

_SIGNALS = (signal.SIGINT, signal.SIGTERM, signal.SIGHUP, signal.SIGQUIT)
_TAR = (("write", "ENOSPC", 14), ("openat", "EACCES", 30), ("mkdirat", "EIO", 6), ("read", "EIO", 12))


class Child:
    """A child that fails: `control` a call of a control script, `stub` a program by the text that replaces it."""

    def __init__(self, name, steps, control=None, stub=None):
        self.name, self.control, self.stub = name, control, stub
        self.faults = [Fault(step, 0, "", "", (name,)) for step in steps]

    def prepare(self, home):
        """Returns what changes in the environment."""
        if self.control:
            home.fail(*self.control, status=4, err="sabotage")
            return {}
        folder = home.path.parent / "stubs"
        return {"PATH": stubs(folder, **self.stub)}

    def undo(self, home):
        if self.control:
            home.remove("control/{}-{}".format(*self.control))


def _tar(chance):
    call, error, last = chance.choice(_TAR)
    inject = f"inject={call}:error={error}:when={chance.randint(1, last)}"
    return Child(
        f"tar with {inject}",
        ("initialize", "descriptor", "extract"),
        stub={"tar": f'exec strace -o /dev/null -e {inject} /bin/tar "$@"'},
    )


def _ps(chance):
    return Child("ps", ("registry",), stub={"ps": chance.choice(["exit 1", "kill -9 $$", "echo nonsense"])})


def _control(chance):
    verb, code = chance.choice(["stop", "start"]), chance.choice(["yn", "ox"])
    step = "stop" if verb == "stop" else "osagent" if code == "ox" else "restart"
    return Child(f"{verb} {code}", (step,), control=(verb, code))


class Combination:
    """The combination of this number; the same number gives the same one."""

    def __init__(self, number):
        self.number, self.chance = number, random.Random(number)
        self.scenario = self.chance.choice(("install", "install", "failure", "report"))

    def __str__(self):
        return f"combination:{self.number}"

    def choose(self, bench):
        """Two or three faults, one of which may end the run; a third of the repetitions is killed too."""
        chance, count = self.chance, self.chance.choice((2, 3))
        ending = chance.choice((None, None, "kill", "signal"))
        self.signal = (chance.choice(_SIGNALS), chance.random()) if ending == "signal" else None
        self.sabotage = [chance.choice((_tar, _ps, _control))(chance)] if chance.random() < 0.5 else []
        self.faults, names = [], set()
        if ending == "kill":
            self._add(chance.choice(kills_of(bench)), names)
        while len(self.faults) + len(self.sabotage) + bool(self.signal) < count:
            self._add(chance.choice(bench.injections), names)
        self.second_kill = chance.choice(kills_of(bench)) if chance.random() < 1 / 3 else None

    def _add(self, fault, names):
        """One fault for calls of each name is what can be injected at a time.

        A close is left out: an injected failure keeps the descriptor open, which no real one does, so that a pipe
        with a second fault on it could be waited on for ever.
        """
        if fault.call not in names and fault.call != "close" and not fault.spares_the_log:
            self.faults.append(fault)
            names.add(fault.call)

    def described(self):
        children = [child.name for child in self.sabotage]
        return f"{self}: {', '.join(map(str, self.faults + children))}, {self.signal}, then {self.second_kill}"

    def check(self, bench):
        self.choose(bench)
        with _sender(bench, self.signal) as (on_start, sent):
            run = Run(bench, self.faults, self.sabotage, on_start)
        try:
            self._check_run(bench, run, sent)
        finally:
            run.close()

    def _check_run(self, bench, run, sent):
        settle(run.home)
        struck = run.struck()
        if run.result.status >= 0 and not sent and not any(fault.in_log for fault in struck):
            run.judge(struck)
        else:
            assert run.result.status >= 0 or -run.result.status in (signal.SIGKILL, *_SIGNALS)
        for child in self.sabotage:
            child.undo(run.home)
        aftermath = Aftermath(bench, run.home, run.before)
        aftermath.check()
        if self.second_kill:
            run.again([self.second_kill])
            settle(run.home)
            aftermath = Aftermath(bench, run.home, run.before)
            aftermath.check(repeated=True)
        aftermath.check_repetition()


@contextlib.contextmanager
def _sender(bench, chosen):
    """A hook that is told the home and the file with the process id of the run, and a list that holds the signal
    once it was sent: to the process group, when the log has got to a share of its lines."""
    sent, over, threads = [], threading.Event(), []

    def on_start(home, pid_file):
        if chosen:
            lines = int(chosen[1] * bench.undisturbed[0].log_lines)
            threads.append(threading.Thread(target=_send, args=(home, pid_file, lines, chosen[0], sent, over)))
            threads[-1].start()

    yield on_start, sent
    over.set()
    for thread in threads:
        thread.join()


def _send(home, pid_file, lines, number, sent, over):
    log = home.path / "patchlogs/orvpatch.log"
    while not over.is_set():
        if pid_file.exists() and log.exists() and log.read_bytes().count(b"\n") > lines:
            pid = int(pid_file.read_text(encoding="utf-8"))
            if _names(pid, home):  # a run that has ended may have left its number to others
                with contextlib.suppress(ProcessLookupError):
                    os.killpg(pid, number)
                    sent.append(number)
            return
        time.sleep(0.001)


def _names(pid, home):
    """Whether the command line of this process names the home."""
    with contextlib.suppress(OSError), open(f"/proc/{pid}/cmdline", "rb") as words:
        return os.fsencode(home) in words.read()
    return False
