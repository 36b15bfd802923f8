"""orvpatchctl beside the installer that it runs, and beside what others take for the same files."""

import json
import shutil
import statistics
from dataclasses import dataclass, field

from contenders import TOOL
from tables import Goal, table

APPLY, UNDO, VERIFY, LINT = (f"orvpatchctl {command}" for command in ("apply", "undo", "verify", "lint"))
LIST, EXTRACT, PEER = "tar -tf", "tar -xf, to an empty folder", "dpkg -i"


@dataclass
class CompanionTrial:
    """The costs of each command on one payload, and how long `apply` took to save what it would replace."""

    payload: object
    costs: dict = field(default_factory=dict)  # command -> its Cost in each round
    saved: list = field(default_factory=list)  # seconds in each round

    def ratio(self, name, other, quantity="wall"):
        """Median of the rounds' ratios: other load disturbs both runs of a round alike."""
        pairs = zip(self.costs[name], self.costs[other])
        return statistics.median(getattr(one, quantity) / getattr(two, quantity) for one, two in pairs)

    def saving(self):
        """What saving takes of the installer's time."""
        return statistics.median(seconds / cost.wall for seconds, cost in zip(self.saved, self.costs[TOOL]))

    def peak(self, name):
        return max(cost.peak for cost in self.costs[name])


class Companion:
    def __init__(self, program, meter):
        self._program, self._meter = program, meter

    def trial(self, laid, installers, rounds, progress):
        """`installers`: the words of the installer and of a peer, by name."""
        trial = CompanionTrial(laid.payload)
        for number in range(rounds):
            progress(f"({laid.payload.key}) orvpatchctl, round {number + 1} of {rounds}")
            for name, command in installers.items():
                laid.refresh()
                self._note(trial, name, command)
            self._round(laid, trial)
        return trial

    def _note(self, trial, name, command):
        trial.costs.setdefault(name, []).append(self._meter.cost(command))

    def _round(self, laid, trial):
        laid.refresh()
        self._note(trial, APPLY, [self._program, "apply", laid.home, laid.path, "--yes"])
        laid.verify(APPLY)
        trial.saved.append(_seconds_of(laid.home, "save"))
        self._note(trial, VERIFY, [self._program, "verify", laid.home, laid.path])
        self._note(trial, LINT, [self._program, "lint", laid.path])
        self._note(trial, UNDO, [self._program, "undo", laid.home])
        laid.verify_untouched(UNDO)
        self._note(trial, LIST, ["tar", "-tf", laid.path])
        empty = laid.folder / "extracted"
        empty.mkdir()
        self._note(trial, EXTRACT, ["tar", "-xf", laid.path, "-C", empty])
        shutil.rmtree(empty)


def _seconds_of(home, step):
    record = next(home.glob("patchlogs/transactions/*/record.json"))
    return next(one["seconds"] for one in json.loads(record.read_text())["steps"] if one["step"] == step)


def companion_table(trial):
    rows = []
    for name, costs in trial.costs.items():
        wall, cpu = (statistics.median(getattr(cost, quantity) for cost in costs) for quantity in ("wall", "cpu"))
        rows.append([name, f"{cpu:.3f}", f"{wall:.3f}", f"{trial.ratio(name, TOOL):.2f}", f"{trial.peak(name):.1f}"])
    heads = ["", "CPU s", "wall s", "of orvpatch's", "peak MiB"]
    return f"### orvpatchctl on ({trial.payload.key})\n\n{table(heads, rows)}"


def companion_goals(trials):
    """Those for which the trials have a figure; trials by the key of their payload."""
    found = []
    if "a" in trials:
        trial = trials["a"]
        found += [
            Goal("wall time of apply on (a), of orvpatch -i's", 1.4, trial.ratio(APPLY, TOOL)),
            Goal("saving on (a), of orvpatch -i's time", 0.1, trial.saving()),
            Goal("wall time of undo on (a), of orvpatch -i's", 1, trial.ratio(UNDO, TOOL)),
            Goal("wall time of verify on (a), of orvpatch -i's", 0.5, trial.ratio(VERIFY, TOOL)),
            Goal("wall time of lint on (a), of tar -tf's", 2, trial.ratio(LINT, LIST)),
            Goal("wall time of lint on (a), of tar -xf's", 2, trial.ratio(LINT, EXTRACT)),
        ]
        if PEER in trial.costs:
            found.append(Goal("wall time of apply on (a), of dpkg -i's", 1, trial.ratio(APPLY, PEER)))
    if "c" in trials:
        found += [
            Goal(f"peak memory of {name} on (c), MiB", 64, trials["c"].peak(name))
            for name in (APPLY, UNDO, VERIFY, LINT)
        ]
    return found
