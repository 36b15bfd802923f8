"""Each fallible call of orvpatchctl itself made to fail, once and from then on.

A rotating sample in every run; ORVPATCH_FAULTS=all takes every call. ORVPATCH_SEED repeats a sample.
"""

import json
import os
import random
import re
import time
from collections import Counter
from typing import NamedTuple

from faults.calls import KINDS, kind_of
from faults.injection import expression_of

SEED = int(os.environ.get("ORVPATCH_SEED") or random.randrange(10**6))
ALL = os.environ.get("ORVPATCH_FAULTS") == "all"
# What the program does first; the calls before it are those of the dynamic loader.
_FIRST_OWN_CALL = "rt_sigaction(SIGCHLD, {sa_handler=SIG_DFL"
_CALL = re.compile(r"^(\w+)\(")
# No faults but answers: nothing is there, or this user may not see it.
_ANSWERS = {
    "look": {"ENOENT", "EACCES"},
    "open": {"ENOENT", "EACCES"},
    "list": {"ENOENT"},
    "link": {"ENOENT", "EXDEV"},
    "attributes": {"ENOENT"},
    "make": {"ENOENT"},
    "seek": {"EIO"},
}  # in a file that can be sought in, to a place that it has
# Each process of the host is looked at by the same calls: a few of them stand for all.
_PROCESS = re.compile(r"/proc/\d+")
_PROCESSES = 3
# Nothing fails the reading of a pipe whose writers have ended, but a signal.
_PIPE = re.compile(r"^read\(\d+<pipe:")


class Fault(NamedTuple):
    """The call of this name and ordinal fails with this error: once, or with all of its name that follow."""

    call: str
    ordinal: int
    error: str
    mode: str

    def __str__(self):
        return ":".join(map(str, self))

    @property
    def words(self):
        """What strace takes."""
        return ["-e", f"trace={self.call}", "-e", expression_of(*self)]


def strace(file, words=()):
    return ["strace", "-y", "-o", os.fspath(file), *words]


def faults_of(trace):
    """A fault of each call that the undisturbed run has made: its errors take turns from call to call."""
    counted, looked, own, faults = Counter(), Counter(), False, []
    for line in trace.read_text(errors="replace").splitlines():
        match = _CALL.match(line)
        if not match:
            continue
        own = own or line.startswith(_FIRST_OWN_CALL)
        counted[match[1]] += 1
        if not own:
            continue
        kind = kind_of(match[1])
        assert kind in KINDS, f"{kind}: say in tests/faults/calls.py how it fails"
        errors = [error for error in KINDS[kind].errors.split() if error not in _ANSWERS.get(kind, ())]
        if _PIPE.match(line):
            errors = [error for error in errors if error == "EINTR"]
        if not errors:
            continue
        if _PROCESS.search(line):
            looked[match[1]] += 1
            if looked[match[1]] > _PROCESSES:
                continue
        ordinal = counted[match[1]]
        for mode in ("once",) if kind == "heap" else ("once", "on"):
            faults.append(Fault(match[1], ordinal, errors[(ordinal + SEED) % len(errors)], mode))
    assert faults
    return faults


def chosen(faults, count):
    only = os.environ.get("ORVPATCH_FAULTS_ONLY")
    if only:
        return [
            Fault(call, int(ordinal), error, mode)
            for call, ordinal, error, mode in (name.split(":") for name in only.split(","))
        ]
    return random.Random(SEED).sample(faults, len(faults) if ALL else min(count, len(faults)))


def is_met(trace):
    """Whether the run has come to the call that was to fail. Takes the trace away: the next run has its own."""
    text = trace.read_text(errors="replace")
    trace.unlink()
    return "(INJECTED)" in text


def is_mute(fault):
    """What there is to say cannot be written either."""
    return fault.call == "write" and fault.mode == "on"


def try_each(name, faults, judge):
    """Judges every fault before it says which of them failed, and how. `judge` returns whether the fault was met: the
    calls of two runs are not quite the same, but most are."""
    failed = met = 0
    for number, fault in enumerate(faults):
        if number and number % 50 == 0:
            print(f"{name}: {number} of {len(faults)} faults, {failed} failed", flush=True)
        try:
            met += judge(fault)
        except AssertionError as error:
            failed += 1
            print(f"ORVPATCH_FAULTS_ONLY={fault}: {str(error)[:2000]}", flush=True)
    print(f"{name}: {len(faults)} faults, {met} met, {failed} failed")
    assert not failed, f"{failed} of {len(faults)} faults, see above"
    assert 2 * met >= len(faults), f"only {met} of {len(faults)} faults were met"


def document_of(result, fault=None):
    """What is on standard output; None for nothing, or for a document that was cut off. A control script that could
    be given no pipe has written before it, as it does in the installer (see pipes-always-true in docs/decisions.md)."""
    out = result.out
    if fault and kind_of(fault.call) == "pipe":
        out = out[max(out.find(b'{\n "'), out.find(b'{\n  "'), out.find(b'{"'), 0) :]
    try:
        return json.loads(out)
    except ValueError:
        return None


def outlived(run, seconds=120):
    """The result of run(), once no installer is at work that has outlived its caller."""
    limit = time.monotonic() + seconds
    while True:
        result = run()
        if b"at work" not in result.err and b"other-run" not in result.out:
            return result
        assert time.monotonic() < limit, result
        time.sleep(0.1)
