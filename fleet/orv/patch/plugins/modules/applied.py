#!/usr/bin/python
"""Brings a home to a patch."""

from __future__ import absolute_import, division, print_function

__metaclass__ = type

DOCUMENTATION = r"""
---
module: applied
short_description: Brings a home to a patch
version_added: 1.0.0
description:
  - Applies a patch, or a directory of patches, by C(orvpatchctl apply), a transaction that can be taken back.
  - A home is left alone when each product that the patches concern has their level, and the last attempt on it was
    this patch, passed, and was not taken back.
  - The transaction is not tied to the connection. When the connection is lost, it runs to its end. The next call for
    the same patches finds it, waits for it, and goes on from its verdict.
  - A verdict that is not good is told once. The call after that tries again.
author:
  - orvpatch maintainers (@orvpatch)
options:
  patch:
    description:
      - A patch file, or a directory of patches, on the host.
    type: path
    required: true
  digests:
    description:
      - The SHA-256 that files must have, by their names. They lie beside each other in the directory of I(patch).
      - A file with another digest, and a patch without any, is refused.
    type: dict
  keyring:
    description:
      - A keyring on the host. C(SHA256SUMS.asc) beside the patches must be a signature by one of its keys.
    type: path
  installer:
    description:
      - The installer to run, in place of the C(orvpatch) beside I(orvpatchctl) or in C(PATH).
    type: path
  search_path:
    description:
      - Where the installer's tools are looked for, separated by colons.
    type: str
  keep:
    description:
      - How many transactions are kept in the home.
    type: int
  undo_on_failure:
    description:
      - Whether to take everything back at once when the home does not end as the patch wants it.
    type: bool
    default: false
extends_documentation_fragment:
  - orv.patch.home
  - orv.patch.home.run
attributes:
  check_mode:
    description:
      - Runs C(orvpatchctl check), with the installer's own report, and fails where an installation would be refused.
        The home is not changed, but its log grows by the report.
      - A run for the same patches that is at work is waited for.
    support: full
  diff_mode:
    description: Shows levels, files and running instances before and after.
    support: full
seealso:
  - module: orv.patch.home_info
  - module: orv.patch.undone
"""

EXAMPLES = r"""
- name: See whether the fix pack would go through, and what it would change
  orv.patch.applied:
    home: /opt/orv
    patch: /var/cache/orv/fixpack2
  check_mode: true
  diff: true

- name: Apply a signed fix pack
  orv.patch.applied:
    home: /opt/orv
    patch: /var/cache/orv/fixpack2
    keyring: /etc/orv/keyring.gpg
    undo_on_failure: true
"""

RETURN = r"""
verdict:
  description:
    - C(applied) and C(unchanged) are good, C(checked) in check mode too.
    - C(refused) is before any change. After C(failed) and C(incomplete) the home is as the record says; after
      C(undone) it is as before.
    - C(running) when I(timeout) was over.
  returned: always
  type: str
  sample: applied
resumed:
  description: Whether the verdict is that of a run that an earlier call had started.
  returned: always
  type: bool
transaction:
  description: The transaction that brought the home where it is.
  returned: always
  type: str
  sample: 20260309T170412Z-4700
levels_before:
  description: The level of each product concerned, before.
  returned: always
  type: dict
  sample: {kyn: 06.10.00.00}
levels_after:
  description: The level that the patches bring to each product concerned.
  returned: always
  type: dict
  sample: {kyn: 06.10.00.02}
record:
  description:
    - The record of the transaction. In check mode the plan, where diff mode asks for it.
    - Beside the fields of C(orvpatchctl apply --json) there is I(record.counts).
  returned: always
  type: dict
  contains:
    verdict:
      description: How the transaction ended.
      type: str
    findings:
      description: What the check found.
      type: list
    steps:
      description: The steps, with their seconds.
      type: list
    counts:
      description: Numbers of new and replaced files.
      type: dict
check:
  description: What C(orvpatchctl check --json) found, with the installer's report.
  returned: in check mode
  type: dict
  contains:
    findings:
      description: Each finding with its rule, severity, text and remedy.
      type: list
    errors:
      description: How many are errors.
      type: int
    warnings:
      description: How many are warnings.
      type: int
    report:
      description: What the installer's report printed.
      type: dict
"""

from ansible.module_utils.basic import AnsibleModule

from ansible_collections.orv.patch.plugins.module_utils import ctl, patches, transacting, transactions

# Verdicts after which the home may be another one than before; a refusal is not worth telling twice.
ENDED_BADLY = ("failed", "incomplete", "undone")


class Applying:
    """One call of the module."""

    def __init__(self, module):
        self.module = module
        self.patch = module.params["patch"]
        self.transacting = transacting.Transacting(module)
        self.program = self.transacting.program

    def work(self):
        shown = self.program.show(self.patch)
        self._demand_digests([one["file"] for one in shown])
        job = {"action": "apply", "digests": patches.digests(self.patch, shown)}
        with self.transacting.alone():
            run = self._begin(job, shown)
        self.transacting.wait(run)
        self._tell(run, resumed=False)

    def _begin(self, job, shown):
        """Starts the run, unless there is nothing to do, or an earlier one has something to tell."""
        run = self.transacting.earlier(job)
        status = self.program.status()
        if transactions.in_place(shown, status, self.program.history()):
            self._unchanged(run, status, job["digests"])
        if run is not None:
            self._tell_bad_end(run)
        if self.module.check_mode:
            self._check()
        return self.transacting.start(job, ["apply", self.program.home, self.patch, "--yes"] + self._options())

    def _demand_digests(self, present):
        wanted = self.module.params["digests"]
        if wanted is None:
            return
        differing = sorted(
            name
            for name in set(wanted) | set(present)
            if patches.sha256(patches.path_of(self.patch, name)) != wanted.get(name)
        )
        if differing:
            self.transacting.fail("not what it should be: %s" % ", ".join(differing), "refused", resumed=False)

    def _unchanged(self, run, status, found):
        """Nothing is left to do. A run that was cut off has done it: that is a change of this playbook."""
        record = self.transacting.record(run) if run else None
        resumed = bool(record and record["verdict"] == "applied")
        if resumed and not self.module.check_mode:
            run.tell()
        levels = transactions.levels(status)
        record = record if resumed else self._record_of(found)
        products = [patch["product"] for patch in record["patches"]] if record else list(levels)
        now = dict((code, levels[code]) for code in products if code in levels)
        more = {} if resumed else {"levels_before": now, "levels_after": now}
        changed = resumed and not self.module.check_mode
        self.transacting.succeed(changed, "applied" if changed else "unchanged", record, resumed=resumed, **more)

    def _record_of(self, found):
        """The record of the transaction that brought these patches, while it is kept."""
        kept = transactions.applications(transactions.records(self.program.home))
        fitting = [
            one
            for one in kept
            if one["verdict"] == "applied" and set(transactions.digests(one).items()) <= set(found.items())
        ]
        return fitting[-1] if fitting else None

    def _tell_bad_end(self, run):
        record = self.transacting.record(run)
        if record and record["verdict"] in ENDED_BADLY:
            self._tell(run, resumed=True)
        run.tell()

    def _tell(self, run, resumed):
        record = self.transacting.record(run)
        run.tell()
        if record and record["verdict"] == "applied":
            self.transacting.succeed(True, "applied", record, resumed=resumed)
        if run.status is None:
            text = "the run was killed: the same task takes it back and starts anew"
            self.transacting.fail(text, resumed=resumed)
        self.transacting.fail_as(record, run, resumed)

    def _options(self):
        params = self.module.params
        options = self._check_options()
        if params["keep"] is not None:
            options += ["--keep", str(params["keep"])]
        if params["undo_on_failure"]:
            options.append("--undo-on-failure")
        return options

    def _check_options(self):
        named = (("keyring", "--keyring"), ("installer", "--installer"), ("search_path", "--path"))
        return [word for key, option in named if self.module.params[key] for word in (option, self.module.params[key])]

    def _check(self):
        options = self._check_options()
        check = self.program.check(self.patch, options)
        if check["errors"]:
            errors = [one for one in check["findings"] if one["severity"] == "error"]
            text = "; ".join("%(rule)s: %(where)s %(text)s" % one for one in errors)
            self.transacting.fail(text, "refused", check=check, resumed=False)
        plan = self.program.plan(self.patch, options) if self.module._diff else None
        self.transacting.succeed(True, "checked", plan, check=check, resumed=False)


def main():
    module = AnsibleModule(
        argument_spec=dict(
            ctl.run_arguments(),
            patch={"type": "path", "required": True},
            digests={"type": "dict"},
            keyring={"type": "path"},
            installer={"type": "path"},
            search_path={"type": "str"},
            keep={"type": "int"},
            undo_on_failure={"type": "bool", "default": False},
        ),
        supports_check_mode=True,
    )
    applying = Applying(module)
    applying.transacting.execute(applying.work)


if __name__ == "__main__":
    main()
