"""From results of tasks to the document of the fleet."""

from __future__ import absolute_import, division, print_function

__metaclass__ = type

GOOD = ("applied", "unchanged", "checked")
UNTOUCHED = {"verdict": "untouched", "reason": ""}


def outcome(result, before=None, **facts):
    """One host's entry of the document: what the entry was `before`, and the `result` of one more task."""
    entry = dict(
        {
            "batch": 0,
            "started": None,
            "ended": None,
            "components": [],
            "levelsBefore": {},
            "levelsAfter": {},
            "transaction": None,
            "record": None,
        },
        **UNTOUCHED
    )
    entry.update(before or {})
    entry.update(facts)
    if result.get("skipped"):
        return entry
    if result.get("unreachable"):
        return dict(entry, verdict="unreachable", reason=result.get("msg", ""))
    if "components" in result:
        entry.update(components=result["components"], levelsAfter=result.get("levels", {}))
        entry["levelsBefore"] = entry["levelsBefore"] or result.get("levels", {})
    if result.get("failed"):
        entry.update(verdict=result.get("verdict", "failed"), reason=reason(result))
    elif result.get("verdict"):
        entry.update(verdict=result["verdict"], reason="")
    if result.get("verification"):
        entry.update(verified(entry, result["verification"]))
    for key in ("transaction", "record"):
        entry[key] = result.get(key) or entry[key]
    return entry


def taken_back(result, before):
    """The entry of a host whose transaction was to be taken back: why it was stays, and so does its record."""
    if result.get("skipped") or result.get("verdict") == "unchanged":
        return before
    if result.get("unreachable") or result.get("failed"):
        verdict = "unreachable" if result.get("unreachable") else "incomplete"
        return dict(before, verdict=verdict, reason="not taken back: %s" % result.get("msg", ""))
    why = before["reason"] or "taken back with its batch"
    return dict(before, verdict="undone", reason=why, levelsAfter=result["levels_after"])


def reason(result):
    """Why a task failed; of a loop, what its items say."""
    said = [one.get("msg", "") for one in result.get("results", []) if one.get("failed")]
    return "; ".join(said) or result.get("msg", "")


def verified(entry, verification):
    """A home that differs from its patch is incomplete, whatever the transaction said."""
    differences = verification["differences"]
    if not differences or entry["verdict"] not in GOOD:
        return {}
    text = "; ".join("%(path)s: %(text)s" % one for one in differences[:5])
    more = "; and %d more" % (len(differences) - 5) if len(differences) > 5 else ""
    return {"verdict": "incomplete", "reason": text + more}


def is_bad(entry, undoing=False):
    """Whether an entry stops a rollout. One that was taken back does, unless that was what was wanted."""
    return entry["verdict"] not in GOOD + ("untouched",) + (("undone",) if undoing else ())


def fleet(entries, patches, started, ended, rollout):
    """The document. In a rollout, a host that no batch has reached is untouched, whatever its check said."""
    shown = []
    for entry in entries:
        if rollout and not entry["batch"] and entry["verdict"] in GOOD:
            entry = dict(entry, **UNTOUCHED)
        shown.append(entry)
    return {"fleet": shown, "patches": patches, "started": started, "ended": ended}


class FilterModule:
    """orv.patch.outcome, orv.patch.taken_back, orv.patch.is_bad, orv.patch.fleet"""

    def filters(self):
        return {"outcome": outcome, "taken_back": taken_back, "is_bad": is_bad, "fleet": fleet}
