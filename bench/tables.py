"""The figures as the tables of docs/performance.md."""

import statistics
from typing import NamedTuple

from contenders import FLOOR, TOOL

_SHOWN_CALLS = ("openat", "write", "close", "newfstatat", "unlink", "link", "fchown", "fchmod", "getdents64", "rmdir")


def median(trial, name, quantity):
    return statistics.median(getattr(cost, quantity) for cost in trial.costs[name])


def ratio(trial, name, other, quantity):
    """Median of the rounds' ratios: other load disturbs both runs of a round alike."""
    pairs = zip(trial.costs[name], trial.costs[other])
    return statistics.median(getattr(one, quantity) / getattr(two, quantity) for one, two in pairs)


def calls_per_file(trial, name):
    return sum(trial.system_calls[name].values()) / trial.payload.files


def table(heads, rows):
    lines = [heads, ["---", *["---:"] * (len(heads) - 1)], *rows]
    return "".join(f"| {' | '.join(map(str, line))} |\n" for line in lines)


def trial_table(trial):
    rows = [
        [
            name,
            f"{median(trial, name, 'cpu'):.3f}",
            f"{ratio(trial, name, FLOOR, 'cpu'):.2f}",
            f"{median(trial, name, 'wall'):.3f}",
            f"{ratio(trial, name, TOOL, 'wall'):.2f}",
            f"{median(trial, name, 'peak'):.1f}",
        ]
        for name in trial.costs
    ]
    rows += [[name, reason, "", "", "", ""] for name, reason in trial.absent.items()]
    heads = ["", "CPU s", "of the floor's", "wall s", "of orvpatch's", "peak MiB"]
    return f"### ({trial.payload.key}) {trial.payload.title}\n\n{table(heads, rows)}"


def system_call_table(trials):
    heads = ["calls for each file", *(f"({trial.payload.key})" for trial in trials)]
    rows = [
        [call, *(f"{trial.system_calls[TOOL].get(call, 0) / trial.payload.files:.2f}" for trial in trials)]
        for call in _SHOWN_CALLS
    ]
    rows += [
        [f"**{name}: all**", *(f"{calls_per_file(trial, name):.2f}" for trial in trials)] for name in (TOOL, FLOOR)
    ]
    return table(heads, rows)


def growth_table(trials):
    heads = ["files", "CPU µs a file", "floor's", "peak MiB"]
    rows = [
        [
            f"{trial.payload.files:,}",
            *(f"{median(trial, name, 'cpu') / trial.payload.files * 1e6:.1f}" for name in (TOOL, FLOOR)),
            f"{median(trial, TOOL, 'peak'):.1f}",
        ]
        for trial in trials
    ]
    return table(heads, rows)


class Goal(NamedTuple):
    what: str
    limit: float
    found: float

    def row(self):
        met = round(self.found, 3) <= self.limit
        excess = f"{(self.found / self.limit - 1) * 100:.0f} %"
        verdict = "met" if met else f"**missed** by {excess}: [why](#the-goals-that-are-missed)"
        return [self.what, f"{self.limit:.3g}", f"{self.found:.3f}", verdict]


def goals(trials):
    """The goals for which the trials have a figure; trials by the key of their payload."""
    found = [
        Goal(f"CPU, times the floor's, on ({key})", limit, ratio(trials[key], TOOL, FLOOR, "cpu"))
        for key, limit in zip("abcde", (1.10, 1.05, 1.10, 1.10, 1.10))
        if key in trials
    ]
    found += [
        Goal(f"own system calls for each file on ({key})", limit, calls_per_file(trials[key], TOOL))
        for key, limit in (("a", 28), ("d", 60), ("e", 8))
        if key in trials
    ]
    if "a" in trials:
        found += [
            Goal(f"wall time on (a), of {name}'s", 0.667, ratio(trials["a"], TOOL, name, "wall"))
            for name in trials["a"].costs
            if name.startswith(("dpkg", "rpm"))
        ]
    if "c" in trials:
        found.append(Goal("peak memory on (c), MiB", 16, median(trials["c"], TOOL, "peak")))
    if "c" in trials and "s1" in trials:
        each = [median(trials[key], TOOL, "cpu") / trials[key].payload.files for key in ("c", "s1")]
        found.append(Goal("CPU for each file at 50,000 files, of that at 1,000", 1.10, each[0] / each[1]))
    return found


def goals_table(trials):
    return table(["goal", "at most", "found", ""], [goal.row() for goal in goals(trials)])
