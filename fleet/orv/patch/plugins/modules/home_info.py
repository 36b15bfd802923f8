#!/usr/bin/python
"""Facts of a product home."""

from __future__ import absolute_import, division, print_function

__metaclass__ = type

DOCUMENTATION = r"""
---
module: home_info
short_description: Facts of a product home
version_added: 1.0.0
description:
  - Tells what is installed in a home, what runs, which patches were tried, and which transactions are kept.
  - With I(patch), also how the home differs from what a patch brings.
author:
  - orvpatch maintainers (@orvpatch)
options:
  patch:
    description:
      - A patch file, or a directory of patches, on the host.
      - The home is compared with it, file by file, by C(orvpatchctl verify).
    type: path
extends_documentation_fragment:
  - orv.patch.home
attributes:
  check_mode:
    description: Changes nothing, so that check mode makes no difference.
    support: full
  diff_mode:
    description: Changes nothing, so that there is no difference to show.
    support: none
seealso:
  - module: orv.patch.applied
  - module: orv.patch.undone
"""

EXAMPLES = r"""
- name: Read the home
  orv.patch.home_info:
    home: /opt/orv
  register: facts

- name: Show the levels
  ansible.builtin.debug:
    var: facts.levels

- name: Compare the home with a fix pack
  orv.patch.home_info:
    home: /opt/orv
    patch: /var/cache/orv/fixpack2
  register: compared
  failed_when: compared.verification.differences | length > 0
"""

RETURN = r"""
components:
  description: What is installed, as C(orvpatchctl status --json) tells it.
  returned: success
  type: list
  elements: dict
  sample:
    - code: kyn
      name: Monitoring Agent for Application Servers
      kind: agent
      level: 06.10.00.02
      platform: lpp266
      instances: [{name: east, pid: 4711, user: orv}]
      lastPatch: {name: kyn_fp0002, result: PASS, time: 03/09/2026 17:04:55}
levels:
  description: The level of each product.
  returned: success
  type: dict
  sample: {kyn: 06.10.00.02}
instances:
  description: The instances that run.
  returned: success
  type: list
  elements: dict
  sample: [{product: kyn, name: east, pid: 4711, user: orv}]
leftovers:
  description: Temporary directories of patches that are still there, relative to the home.
  returned: success
  type: list
  elements: str
history:
  description: The attempts to install patches, oldest first, as C(orvpatchctl history --json) tells them.
  returned: success
  type: list
  elements: dict
transactions:
  description: The transactions that are kept, oldest first. Empty where the user may not read them.
  returned: success
  type: list
  elements: dict
  sample:
    - id: 20260309T170412Z-4700
      action: apply
      undoes: null
      verdict: applied
      phase: closed
      started: '2026-03-09T17:04:12Z'
      ended: '2026-03-09T17:04:55Z'
      patches: []
open_transactions:
  description: The transactions that have not ended, because they are at work or were killed.
  returned: success
  type: list
  elements: str
verification:
  description: How the home differs from I(patch), as C(orvpatchctl verify --json) tells it.
  returned: when I(patch) is given
  type: dict
  sample: {differences: [], files: 812}
"""

from ansible.module_utils.basic import AnsibleModule

from ansible_collections.orv.patch.plugins.module_utils import ctl, transactions


def facts(program, patch):
    status = program.status()
    kept = transactions.records(program.home)
    found = {
        "home": program.home,
        "components": status["components"],
        "levels": transactions.levels(status),
        "instances": [
            dict(instance, product=component["code"])
            for component in status["components"]
            for instance in component["instances"]
        ],
        "leftovers": status["leftovers"],
        "history": program.history()["records"],
        "transactions": [transactions.summary(record) for record in kept],
        "open_transactions": [record["id"] for record in kept if not transactions.has_ended(record)],
    }
    if patch:
        found["verification"] = program.verify(patch)
    return found


def main():
    module = AnsibleModule(argument_spec=dict(ctl.arguments(), patch={"type": "path"}), supports_check_mode=True)
    try:
        found = facts(ctl.Ctl(module).find(), module.params["patch"])
    except ctl.CtlError as error:
        module.fail_json(msg=str(error))
    module.exit_json(changed=False, **found)


if __name__ == "__main__":
    main()
