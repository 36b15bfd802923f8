"""What the failures of a run's calls amount to: filled by the rules, read by the prediction."""

import copy
import itertools
from typing import NamedTuple


class Failure(NamedTuple):
    """The record of a failed step, and how many of the step's commands had ended before it failed."""

    code: int
    text: str
    done: int = 0


class Faults:
    """Everything that differs from an undisturbed run. Patches go by their index in the scenario."""

    def __init__(self):
        self.bad_home = False
        self.load = None              # Failure of looking at the path that was given
        self.not_applicable = set()   # patches that seem not to apply
        self.initialize = {}          # patch -> Failure
        self.missing = set()          # product codes that the registry does not know
        self.not_running = set()      # (code, instance) that seem not to run
        self.leftover = set()         # (patch, "before" or "after"): the temporary directory was not removed
        self.steps = {}               # (patch, step) -> Failure
        self.leave = {}               # (patch, step) -> Failure of going back to the directory before the step
        self.unseen = {}              # patch -> places in updated_files that the walk does not see
        self.unopened = {}            # patch -> directories in updated_files whose content the walk does not see
        self.move = {}                # patch -> (place in updated_files, state in which it is left)
        self.modes = {}               # path under the home -> mode that it gets instead of the usual one
        self.keeps_owner = set()      # files that do not take over the owner of the file that they replace
        self.rc = {}                  # patch -> content of the OS agent's result file, None when not written
        self.level = {}               # patch -> content of the version file
        self.history = {}             # patch -> "absent" or "no header"
        self.directory_lost = False   # the working directory is not the one of the start any more
        self.possible = {}            # (patch, step) -> Failures, one of which the C library may have made of it
        self.unchecked = set()        # "out", "err": streams that have lost something

    def variants(self):
        """These faults with each selection of the possible failures: none or one in each step."""
        for chosen in itertools.product(*([None, *failures] for failures in self.possible.values())):
            variant = copy.deepcopy(self)
            for place, failure in zip(self.possible, chosen):
                if failure:
                    variant.fail(*place, failure)
            yield variant

    def fail(self, patch, step, failure):
        self.steps.setdefault((patch, step), failure)
