#!/usr/bin/python

from __future__ import absolute_import, division, print_function

__metaclass__ = type

DOCUMENTATION = r"""
---
module: report
short_description: Writes the report of a fleet
version_added: "1.0.0"
description:
  - Writes what a run over a fleet came to, as one HTML page that stands alone, as JSON and as CSV.
  - Runs where the report shall lie, usually on the controller with C(delegate_to=localhost) and C(run_once=true).
options:
  document:
    description:
      - What was gathered, with the keys C(fleet) (a list of homes), C(patches), C(started), C(ended) and C(rollout)
        (whether homes were to be brought to the patches).
      - Given as JSON text, that is with C(to_json), it passes the engine much faster than as a structure, which the
        engine turns into text and back.
      - Each home has C(host), C(home), C(batch), C(verdict), C(reason), C(started), C(ended), C(components),
        C(levelsBefore), C(levelsAfter), C(transaction) and C(record).
    type: dict
    required: true
  dest:
    description: The directory for the files. It is made when it does not exist, its parents too.
    type: path
    required: true
  name:
    description: The name of the files, without a suffix.
    type: str
    default: fleet
  formats:
    description: Which files are written.
    type: list
    elements: str
    choices: [html, json, csv]
    default: [html, json, csv]
notes:
  - The files can be read by their owner alone, as the records of the homes can.
attributes:
  check_mode:
    description: Says whether the files would change, and writes nothing.
    support: full
  diff_mode:
    description: There is none; the report is new at each run.
    support: none
seealso:
  - module: orv.patch.applied
author:
  - ORV patch maintainers (@orv)
"""

EXAMPLES = r"""
- name: Write the report of the fleet
  orv.patch.report:
    document: "{{ fleet_document }}"
    dest: "{{ playbook_dir }}/reports"
    name: rollout
  delegate_to: localhost
  run_once: true
"""

RETURN = r"""
paths:
  description: The files, by format.
  returned: always
  type: dict
  sample: {"html": "/srv/reports/rollout.html", "json": "/srv/reports/rollout.json", "csv": "/srv/reports/rollout.csv"}
summary:
  description: The verdict of the whole run, the number of homes by verdict, and the batches with their times.
  returned: always
  type: dict
  sample: {"verdict": "applied", "homes": 8, "hosts": 8, "counts": {"applied": 8}, "seconds": 94.0, "batches": []}
"""

import os
import tempfile

from ansible.module_utils.basic import AnsibleModule
from ansible.module_utils.common.text.converters import to_bytes
from ansible_collections.orv.patch.plugins.module_utils.report import as_csv, as_json, summary_of
from ansible_collections.orv.patch.plugins.module_utils.report_page import as_page

WRITERS = {"html": as_page, "json": as_json, "csv": as_csv}


def replace(path, content):
    """Writes a file whole or not at all; at no moment others can read it."""
    handle, fresh = tempfile.mkstemp(dir=os.path.dirname(path), prefix=".")
    try:
        with os.fdopen(handle, "wb") as target:
            target.write(content)
        os.rename(fresh, path)
    except (IOError, OSError):
        os.unlink(fresh)
        raise


def is_same(path, content):
    try:
        with open(path, "rb") as present:
            return present.read() == content
    except (IOError, OSError):
        return False


def main():
    module = AnsibleModule(
        argument_spec=dict(
            document=dict(type="dict", required=True),
            dest=dict(type="path", required=True),
            name=dict(type="str", default="fleet"),
            formats=dict(type="list", elements="str", choices=["html", "json", "csv"], default=["html", "json", "csv"]),
        ),
        supports_check_mode=True,
        no_log=True,  # of thousands of homes the document has megabytes: none of it goes to the host's log
    )
    document, dest, name = module.params["document"], module.params["dest"], module.params["name"]
    if name in ("", ".", "..") or os.path.basename(name) != name:
        module.fail_json(msg="name must be the name of a file, without a directory: %s" % name)
    paths = {kind: os.path.join(dest, "%s.%s" % (name, kind)) for kind in module.params["formats"]}
    contents = {kind: to_bytes(WRITERS[kind](document)) for kind in paths}
    stale = [kind for kind in paths if not is_same(paths[kind], contents[kind])]
    if not module.check_mode:
        try:
            os.makedirs(dest, exist_ok=True)
            for kind in stale:
                replace(paths[kind], contents[kind])
        except (IOError, OSError) as error:
            module.fail_json(msg="the report cannot be written: %s" % error)
    # Nor does it go back with the answer.
    told = {"module_args": {"dest": dest, "name": name, "formats": module.params["formats"]}}
    module.exit_json(changed=bool(stale), paths=paths, summary=summary_of(document), invocation=told)


if __name__ == "__main__":
    main()
