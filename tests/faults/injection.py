"""Which calls are made to fail, with which errors, and the run of the program with one of them failing."""

from typing import NamedTuple

from .calls import KINDS, errors_of, kind_of
from .trace import read_trace

# An interrupted call is repeated, so an interruption that never ends is no condition that exists.
_BURST = 3


def expression_of(call, ordinal, error, mode):
    """What strace takes to let the call of this name and ordinal fail, "once" or with all that follow ("on")."""
    when = str(ordinal)
    if mode == "on":
        when += f"..{ordinal + _BURST - 1}" if error == "EINTR" else "+"
    # The end of the heap is told without an error: a failure gives the old end, or another below the new one.
    outcome = "retval=0" if kind_of(call) == "heap" else f"error={error}"
    return f"inject={call}:{outcome}:when={when}"


class Injection(NamedTuple):
    """One fault: the call of this name and ordinal fails with this error, alone ("once") or with all of its
    name that follow ("on")."""

    scenario: str
    call: str
    ordinal: int
    error: str
    mode: str

    def __str__(self):
        return ":".join(map(str, self))

    @classmethod
    def parse(cls, text):
        scenario, call, ordinal, error, mode = text.split(":")
        return cls(scenario, call, int(ordinal), error, mode)

    @property
    def expression(self):
        return expression_of(self.call, self.ordinal, self.error, self.mode)

    @property
    def spares_the_log(self):
        """Whether the log has to go elsewhere than to its file, since all later calls of this name fail."""
        return self.mode == "on" and kind_of(self.call) in ("open", "close")


def injections_of(scenario, calls, spared_calls):
    """Every injection into a run that makes `calls`, or `spared_calls` when the log has to be spared."""
    return [
        injection
        for made, spared in ((calls, False), (spared_calls, True))
        for injection in _injections(scenario, made)
        if injection.spares_the_log == spared
    ]


def _injections(scenario, calls):
    return [
        Injection(scenario, call.name, call.ordinal, error, mode)
        for call in calls
        if not call.is_log and KINDS[call.kind].errors
        for error in errors_of(call)
        for mode in modes_of(call)
    ]


def modes_of(call):
    """The end of the heap cannot be misreported for ever: the C library takes it for the truth."""
    return ("once",) if call.kind == "heap" else ("once", "on")


def traced(program, arguments, cwd, trace, faults=(), spare_the_log=False, env=None, wrapper=()):
    """Runs the program under strace, with all these faults (their `expression` is what strace takes); its result
    and its calls.

    A log that has to be spared goes to standard output line by line: its file could not be opened either.
    """
    wrapper, env = [*wrapper, "strace", "-y", "-s", "8192", "-o", str(trace)], env or {}
    for fault in faults:
        wrapper += ["-e", fault.expression]
    if spare_the_log:
        wrapper, env = ["stdbuf", "-oL", *wrapper], {**env, "PATCH_DEBUG": ""}
    result = program.run(*arguments, cwd=cwd, env=env, wrapper=wrapper, timeout=60)
    return result, read_trace(trace, str(cwd))
