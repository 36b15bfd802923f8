"""Options that the modules share."""

from __future__ import absolute_import, division, print_function

__metaclass__ = type


class ModuleDocFragment:
    """Where a home is, and with what it is read; and how long runs are waited for."""

    DOCUMENTATION = r"""
options:
  home:
    description:
      - The directory in which the product is installed.
    type: path
    required: true
  orvpatchctl:
    description:
      - The program to use. A name without a slash is looked for in C(PATH) and in C(/usr/local).
    type: path
    default: orvpatchctl
requirements:
  - orvpatchctl on the host
"""

    RUN = r"""
options:
  state_dir:
    description:
      - A directory of the user alone, in which the output of running transactions is kept.
      - It is made when it is missing. A run is found again by the user who started it; for other users the home is
        locked until the run ends.
    type: path
    default: ~/.orv_patch/runs
  timeout:
    description:
      - How many seconds to wait for the end; C(0) is without a limit.
      - Nothing is ended when the time is over. The task fails, and the same task goes on from there the next time.
    type: int
    default: 0
  files:
    description:
      - Whether the record lists each file. Thousands of files of thousands of hosts fill the controller's memory;
        the numbers are always in I(record.counts).
    type: bool
    default: true
"""
