#!/usr/bin/python
"""Takes the last transaction of a home back."""

from __future__ import absolute_import, division, print_function

__metaclass__ = type

DOCUMENTATION = r"""
---
module: undone
short_description: Takes the last transaction of a home back
version_added: 1.0.0
description:
  - Takes the last transaction that applied patches back, by C(orvpatchctl undo).
  - When that transaction was taken back already, nothing is done. The one before it is not touched.
  - Like M(orv.patch.applied), it is not tied to the connection.
author:
  - orvpatch maintainers (@orvpatch)
options:
  transaction:
    description:
      - The transaction to take back, in place of the last one.
    type: str
  digests:
    description:
      - File names of patches with their SHA-256. A last transaction that applied anything else is left alone.
      - Not together with I(patch).
    type: dict
  patch:
    description:
      - A patch file, or a directory of patches, on the host. A last transaction that applied anything else is left
        alone.
      - Not together with I(digests).
    type: path
extends_documentation_fragment:
  - orv.patch.home
  - orv.patch.home.run
attributes:
  check_mode:
    description: Tells which transaction would be taken back.
    support: full
  diff_mode:
    description: Shows levels, files and running instances before and after.
    support: full
seealso:
  - module: orv.patch.applied
"""

EXAMPLES = r"""
- name: Take the last fix pack back
  orv.patch.undone:
    home: /opt/orv

- name: Take back what this playbook has applied
  orv.patch.undone:
    home: /opt/orv
    transaction: "{{ result.transaction }}"
"""

RETURN = r"""
verdict:
  description:
    - C(undone), or C(unchanged) when there is nothing to take back.
    - C(incomplete) when something stood in the way, which I(record.messages) names. C(refused) is before any change.
    - C(failed) when the undo broke off. C(running) when I(timeout) was over.
  returned: always
  type: str
resumed:
  description: Whether the verdict is that of a run that an earlier call had started.
  returned: always
  type: bool
transaction:
  description: The transaction that was taken back.
  returned: always
  type: str
  sample: 20260309T170412Z-4700
levels_before:
  description: The level of each product concerned, before.
  returned: always
  type: dict
  sample: {kyn: 06.10.00.02}
levels_after:
  description: The level of each product concerned, after.
  returned: always
  type: dict
  sample: {kyn: 06.10.00.00}
record:
  description: The record of the undo, which is a transaction of its own. In check mode the record to be undone.
  returned: always
  type: dict
"""

from ansible.module_utils.basic import AnsibleModule

from ansible_collections.orv.patch.plugins.module_utils import ctl, patches, transacting, transactions


class Undoing:
    """One call of the module."""

    def __init__(self, module):
        self.module = module
        self.transacting = transacting.Transacting(module)
        self.home = self.transacting.program.home
        self.wanted = None

    def work(self):
        self.wanted = self._wanted()
        with self.transacting.alone():
            run, target = self._begin()
        self.transacting.wait(run)
        self._tell(run, target, False)

    def _wanted(self):
        """The digests of the patches that may be taken back; None when they may be any."""
        patch = self.module.params["patch"]
        if patch is None or self.module.params["transaction"]:
            return self.module.params["digests"]
        return patches.digests(patch, self.transacting.program.show(patch))

    def _begin(self):
        """Starts the undo of a transaction, unless there is nothing to do, or an earlier one has something to tell."""
        self._finish_earlier()
        kept = transactions.records(self.home)
        target = self._choose(transactions.applications(kept))
        if target is None or transactions.is_undone(target, kept):
            self._succeed(False, "unchanged", None, target)
        if self.module.check_mode:
            self._succeed(True, "undone", target, target)
        job = {"action": "undo", "transaction": target["id"]}
        return self.transacting.start(job, ["undo", self.home, target["id"]]), target

    def _finish_earlier(self):
        """An undo that was cut off is waited for, and told."""
        run = self.transacting.earlier({"action": "undo"})
        if run is None:
            return
        targets = [one for one in transactions.records(self.home) if one["id"] == run.job.get("transaction")]
        if targets and self._fits(targets[0]) and not self.module.check_mode:
            self._tell(run, targets[0], True)

    def _choose(self, applied):
        named = self.module.params["transaction"]
        fitting = [one for one in (applied if named else applied[-1:]) if self._fits(one)]
        if named and not fitting:
            self.transacting.fail("no transaction %s" % named, "refused", resumed=False)
        return fitting[0] if fitting else None

    def _fits(self, record):
        """Whether this may be taken back: the named transaction, or one that applied nothing but what is wanted."""
        named = self.module.params["transaction"]
        if named:
            return record["id"] == named
        return self.wanted is None or set(transactions.digests(record).items()) <= set(self.wanted.items())

    def _tell(self, run, target, resumed):
        record = self.transacting.record(run)
        run.tell()
        if record and record["verdict"] == "undone":
            self._succeed(True, "undone", record, target, resumed)
        if run.status is None:
            self.transacting.fail("the undo was killed: the same task goes on with it", resumed=resumed)
        self.transacting.fail_as(record, run, resumed)

    def _succeed(self, changed, verdict, record, target, resumed=False):
        levels = transacting.levels_of(target)
        shown = {
            "levels_before": levels["levels_after"] if changed else levels["levels_before"],
            "levels_after": levels["levels_before"],
            "transaction": target["id"] if target else None,
        }
        if self.module._diff and changed:
            shown["diff"] = transactions.difference_of_undo(target)
        self.module.exit_json(
            changed=changed, verdict=verdict, record=self.transacting.brief(record), resumed=resumed, **shown
        )


def main():
    module = AnsibleModule(
        argument_spec=dict(
            ctl.run_arguments(), transaction={"type": "str"}, digests={"type": "dict"}, patch={"type": "path"}
        ),
        mutually_exclusive=[("digests", "patch")],
        supports_check_mode=True,
    )
    undoing = Undoing(module)
    undoing.transacting.execute(undoing.work)


if __name__ == "__main__":
    main()
