"""What a home's documents say about its patches: which are in place, and which transactions there are."""

from __future__ import absolute_import, division, print_function

__metaclass__ = type

import json
import os

CLOSED = "closed"


def levels(status):
    """Product code -> level, of all components."""
    return dict((component["code"], component["level"]) for component in status["components"])


def in_place(shown, status, history):
    """Whether every patch that concerns this home is installed: its product has its level, and the last attempt on
    that product was this patch, passed, and was not taken back."""
    installed = levels(status)
    concerned = [patch for patch in shown if patch["product"] in installed]
    if not concerned:
        return False
    return all(
        patch["level"] == installed[patch["product"]] and is_last_pass(patch, history["records"]) for patch in concerned
    )


def is_last_pass(patch, records):
    attempts = [
        record for record in records if record["product"] == patch["product"] and record["target"] == patch["target"]
    ]
    if not attempts:
        return False
    last = attempts[-1]
    return last["result"] == "PASS" and not last["undone"] and last["name"] == patch["name"].strip()


def records(home):
    """The records of the transactions that are kept, oldest first; empty where the user may not read them."""
    root = os.path.join(home, "patchlogs", "transactions")
    found = []
    try:
        names = sorted(os.listdir(root))
    except OSError:
        return found
    for name in names:
        try:
            with open(os.path.join(root, name, "record.json"), "rb") as stream:
                found.append(json.loads(stream.read().decode("utf-8")))
        except (OSError, ValueError):  # killed before there was a record: it has changed nothing
            continue
    return found


def is_undone(record, others):
    """Whether a transaction was taken back, by itself or by a later one."""
    return record["verdict"] == "undone" or any(
        other["undoes"] == record["id"] and other["verdict"] == "undone" for other in others
    )


def has_ended(record):
    return record["phase"] == CLOSED


def applications(found):
    """The transactions that applied patches, oldest first."""
    return [record for record in found if record["action"] == "apply" and record["verdict"] != "refused"]


def digests(record):
    """File name -> SHA-256, of the patches of a transaction."""
    return dict((patch["file"], patch["sha256"]) for patch in record["patches"])


def brief(record, with_files):
    """A record for the controller: of thousands of files the numbers, unless the list is wanted."""
    if record is None:
        return None
    shortened = dict(record)
    shortened["counts"] = {
        "new": sum(1 for one in record["files"] if one["change"] == "new"),
        "replaced": sum(1 for one in record["files"] if one["change"] == "replaced"),
    }
    if not with_files:
        for key in ("files", "rewritten", "directories", "temporary", "otherChanges"):
            shortened[key] = []
    return shortened


def summary(record):
    """The few fields of a record that facts hold."""
    return {
        "id": record["id"],
        "action": record["action"],
        "undoes": record["undoes"],
        "verdict": record["verdict"],
        "phase": record["phase"],
        "started": record["started"],
        "ended": record["ended"],
        "patches": record["patches"],
    }


def difference(record):
    """Levels, files and instances before and after a record's patches are applied, for --diff."""
    replaced, new = changed_files(record)
    return [
        _part("levels", level_lines(record, "levelBefore"), level_lines(record, "levelAfter")),
        _part("files", replaced, marked(replaced, "replaced") + marked(new, "new")),
        _part("running instances", stopped(record), marked(stopped(record), "stopped and started again")),
    ]


def difference_of_undo(record):
    """The same of a record that is taken back."""
    replaced, new = changed_files(record)
    return [
        _part("levels", level_lines(record, "levelAfter"), level_lines(record, "levelBefore")),
        _part("files", replaced + new, marked(replaced, "put back")),
        _part("running instances", stopped(record), marked(stopped(record), "stopped and started again")),
    ]


def level_lines(record, key):
    return ["%s %s" % (patch["product"], patch[key]) for patch in record["patches"]]


def changed_files(record):
    """Paths of replaced files, and of new ones."""
    return [sorted(one["path"] for one in record["files"] if one["change"] == kind) for kind in ("replaced", "new")]


def stopped(record):
    """The running instances of the products that the patches concern."""
    running = [one for one in record["instances"]["before"] if one["product"] in record["dependents"]]
    return [("%s %s" % (one["product"], one["name"])).strip() for one in running]


def marked(names, word):
    return ["%s (%s)" % (name, word) for name in names]


def _part(name, before, after):
    return {
        "before_header": name,
        "after_header": name,
        "before": "".join("%s\n" % line for line in before),
        "after": "".join("%s\n" % line for line in after),
    }
