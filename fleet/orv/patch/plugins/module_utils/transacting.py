"""What the modules that change a home have in common: the run that is found, waited for, and told."""

from __future__ import absolute_import, division, print_function

__metaclass__ = type

import json
from contextlib import contextmanager

from ansible_collections.orv.patch.plugins.module_utils import ctl, runs, transactions


class Transacting:
    """A module that brings about one job by a run of orvpatchctl."""

    def __init__(self, module):
        self.module = module
        self.program = ctl.Ctl(module)
        self.runs = runs.Runs(module.params["state_dir"], self.program.home)
        self.waited_for = None  # a run that another module had started

    def execute(self, work):
        """Calls `work`, and tells the engine what stops it."""
        try:
            self.program.find()
            work()
        except (ctl.CtlError, runs.StateError) as error:  # each arises before a run is started
            self.fail(str(error), "refused", resumed=False)
        except runs.Busy:
            self._fail_by_time("another module keeps the home to itself; nothing was begun", resumed=False)
        except runs.Lost:
            self.module.exit_json(changed=True, msg="the connection was lost; a run that was started goes on")

    def earlier(self, job):
        """The ended run of the same job that no module has told yet, or that this one has waited for; None when there
        is none. A run of another job is left alone."""
        run = self.waited_for or self.runs.find()
        if run is None:
            return None
        if same_job(run.job, job):
            return run
        self.module.warn("an earlier run was waited for: %s" % outcome(run))
        run.tell()
        return None

    @contextmanager
    def alone(self):
        """Waits for the runs at work on the home. Inside, no other module starts one, nor checks: a check while another
        controller's installation begins would refuse the home, or make that one refuse it."""
        while True:
            with self.runs.locked(self.module.params["timeout"], runs.is_listened):
                run = self.runs.find()
                if run is None or not run.is_alive:
                    yield
                    return
            self.wait(run)
            self.waited_for = run

    def start(self, job, words):
        """Starts the job; `wait` waits for its end. What no controller would hear of is not begun."""
        if not runs.is_listened():
            raise runs.Lost()
        return self.runs.start(job, [self.program.program] + words + ["--json"])

    def wait(self, run):
        if not run.wait(self.module.params["timeout"], runs.is_listened):
            self._fail_by_time("it goes on, and this task will find it", resumed=run.process is None)

    def _fail_by_time(self, text, resumed):
        message = "not ended after %d seconds: %s" % (self.module.params["timeout"], text)
        self.fail(message, "running", resumed=resumed)

    def record(self, run):
        """The record of an ended run, None when it has none."""
        try:
            return json.loads(run.out)
        except ValueError:
            return None

    def brief(self, record):
        return transactions.brief(record, self.module.params["files"])

    def fail(self, message, verdict="failed", record=None, **more):
        more.update(levels_of(record))
        self.module.fail_json(msg=message, verdict=verdict, record=self.brief(record), **more)

    def fail_as(self, record, run, resumed):
        """Tells an ended run that did not end well."""
        verdict = record["verdict"] if record else self._verdict_without_record()
        self.fail(reason(record, run.err), verdict, record, resumed=resumed)

    def _verdict_without_record(self):
        """Nothing was changed, unless a transaction was left open."""
        kept = transactions.records(self.program.home)
        return "refused" if all(transactions.has_ended(one) for one in kept) else "failed"

    def succeed(self, changed, verdict, record, **more):
        for key, value in levels_of(record).items():
            more.setdefault(key, value)
        if self.module._diff and changed and record is not None:
            more["diff"] = transactions.difference(record)
        self.module.exit_json(changed=changed, verdict=verdict, record=self.brief(record), **more)


def levels_of(record):
    patches = record["patches"] if record else []
    return {
        "transaction": record["id"] if record and not record["dryRun"] and record["verdict"] != "refused" else None,
        "levels_before": dict((one["product"], one["levelBefore"]) for one in patches),
        "levels_after": dict((one["product"], one["levelAfter"]) for one in patches),
    }


def same_job(one, other):
    return all(one.get(key) == value for key, value in other.items())


def outcome(run):
    """How a run ended, in words."""
    try:
        return json.loads(run.out)["verdict"]
    except (ValueError, KeyError, TypeError):
        return ctl.said(run.err) or "it was killed"


def reason(record, err):
    """Why it did not end well: what the record and standard error have to say."""
    said = []
    if record:
        said += ["%(rule)s: %(where)s %(text)s" % one for one in record["findings"] if one["severity"] == "error"]
        said += ["%(path)s: %(text)s" % one for one in record["differences"]]
        if record["installer"]["status"]:
            said.append(installer_said(record["installer"]))
        said += record["messages"]
    said.append(ctl.said(err))
    return "; ".join(one for one in said if one) or "no reason was given"


def installer_said(installer):
    text = installer["stderr"].strip() or installer["stdout"].strip()
    return "the installer ended with status %d: %s" % (installer["status"], " ".join(text.split()))
