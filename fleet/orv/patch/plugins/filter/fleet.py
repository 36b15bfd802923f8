"""From the results of the role's tasks to the document of the fleet."""

from __future__ import absolute_import, division, print_function

__metaclass__ = type

GOOD = ("applied", "unchanged", "checked", "untouched")
# The steps in their order, each with what the home is when the step fails and gives no verdict: what comes before the
# transaction has changed nothing, and what comes behind it leaves open whether the home is as it should be.
STEPS = (
    ("facts", "refused"),
    ("made", "refused"),
    ("staged", "refused"),
    ("check", "refused"),
    ("result", "failed"),
    ("verified", "incomplete"),
)


def entry(variables):
    """One host's entry of the document, from its variables: what the role has registered, step by step."""
    made = {
        "host": variables.get("inventory_hostname", ""),
        "home": variables.get("fixpack_home", ""),
        "batch": 0,
        "verdict": "untouched",
        "reason": "",
        "components": [],
        "levelsBefore": {},
        "levelsAfter": {},
        "transaction": None,
        "record": None,
    }
    for step, untold in STEPS:
        add(made, variables.get("fixpack_" + step) or {}, untold, step != "verified" or not is_bad(made))
    take_back(made, variables.get("fixpack_undone") or {})
    return timed(made, variables.get("fixpack_batch") or {}, variables.get("fixpack_batch_end") or {})


def add(made, result, untold, decides):
    """What one more task has told. One that does not decide adds its facts: the verdict and its reason stay."""
    if result.get("skipped"):
        return
    if decides:
        judge(made, result, untold)
    if "components" in result:
        made.update(home=result["home"], components=result["components"], levelsAfter=result["levels"])
        made["levelsBefore"] = made["levelsBefore"] or result["levels"]
    # A run that was cut off and found again has the levels before it; what was read now are those behind it.
    made["levelsBefore"] = dict(made["levelsBefore"], **result.get("levels_before", {}))
    if result.get("verification"):
        hold_against(made, result["verification"])
    for key in ("transaction", "record"):
        made[key] = result.get(key) or made[key]


def judge(made, result, untold):
    """The verdict of a task, and its reason."""
    if result.get("unreachable"):
        made.update(verdict="unreachable", reason=result.get("msg", ""))
    elif result.get("failed"):
        made.update(verdict=result.get("verdict", untold), reason=reason(result))
    elif result.get("verdict"):
        made.update(verdict=result["verdict"], reason="")


def hold_against(made, verification):
    """A home that differs from its patch is incomplete, whatever the transaction said."""
    differences = verification["differences"]
    if differences and made["verdict"] in GOOD:
        said = ["%(path)s: %(text)s" % one for one in differences[:5]]
        if len(differences) > 5:
            said.append("and %d more" % (len(differences) - 5))
        made.update(verdict="incomplete", reason="; ".join(said))


def take_back(made, result):
    """What the undo has told; why it was, and the record of what was taken back, stay."""
    if not result or result.get("skipped") or result.get("verdict") == "unchanged":
        return
    if result.get("unreachable") or result.get("failed"):
        said = [made["reason"], "not taken back: %s" % result.get("msg", "")]
        made.update(
            verdict="unreachable" if result.get("unreachable") else "incomplete",
            reason="; ".join(one for one in said if one),
        )
    else:
        made.update(
            verdict="undone",
            reason=made["reason"] or "taken back as was wanted",
            levelsAfter=dict(made["levelsAfter"], **result["levels_after"]),
            transaction=result["transaction"],
            record=made["record"] or result["record"],
        )


def timed(made, batch, end):
    """With the times of the transaction; where it has none, those of the batch."""
    record = made["record"] if made["verdict"] != "unchanged" else None
    reached = bool(batch.get("number"))
    made["batch"] = int(batch.get("number", 0))
    made["started"] = (record and record["started"]) or (batch["started"] if reached else None)
    made["ended"] = (record and record["ended"]) or (end.get("ended") if reached else None)
    return made


def reason(result):
    """Why a task failed; of a loop, what its items say."""
    said = [one.get("msg", "") for one in result.get("results", []) if one.get("failed")]
    return "; ".join(said) or result.get("msg", "")


def is_bad(made, undoing=False):
    """Whether an entry stops a rollout. One that was taken back does, unless that was what was wanted."""
    return made["verdict"] not in GOOD + (("undone",) if undoing else ())


def document(entries, patches, started, ended, rollout):
    """The document of all entries."""
    shown = [dict(made, **last_word(made, rollout)) for made in entries]
    return {"fleet": shown, "patches": patches, "started": started, "ended": ended, "rollout": bool(rollout)}


def last_word(made, rollout):
    """In a rollout, a host that no batch has reached is untouched, whatever its check said. Elsewhere, a home that was
    read, and with which there was nothing to do, is unchanged."""
    if rollout and not made["batch"] and not is_bad(made):
        return {"verdict": "untouched", "reason": ""}
    if not rollout and made["verdict"] == "untouched" and made["components"]:
        return {"verdict": "unchanged"}
    return {}


class FilterModule:
    """orv.patch.entry, orv.patch.is_bad, orv.patch.document"""

    def filters(self):
        return {"entry": entry, "is_bad": is_bad, "document": document}
