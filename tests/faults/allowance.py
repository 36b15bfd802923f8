"""What a failure may make of a run, by the step in which it strikes. Everything else has to be as ever.

A failure may end the run with one of the statuses of its step, or be one of those that the product takes in
silence; docs/recovery.md tells of the traces that these leave.
"""

# Step -> keys of the texts with which it can fail, by status. "loading" is all that precedes the first patch.
_TARS = {3: ("ERROR_PP_MAKE_DIR", "PROC_CANT_RUN", "PROC_BAD_RC"), 24: ("ERROR_PP_SET_CWD",)}
_COMMANDS = ("PROC_CANT_RUN", "PROC_BAD_RC", "ERROR_PP_SET_CWD")
_STARTS = {12: ("ERROR_START_AGENT",), 13: ("ERROR_START_INST",), 20: ("ERROR_START_CANT_SU",)}
ENDS = {
    "start": {2: ("ERROR_ORV_HOME",)},
    "load": {
        30: ("ERROR_DCFPP_PATH",),
        31: ("ERROR_DCFPP_NO_FILES",),
        32: ("ERROR_DCFPP_NO_APPLICABLE",),
        34: ("ERROR_DCFPP_NOT_APPLICABLE",),
    },
    "initialize": {**_TARS, 32: ("ERROR_DCFPP_NO_APPLICABLE",)},
    "descriptor": {5: ("ERROR_INIFILE_CANT_READ",), 32: ("ERROR_DCFPP_NO_APPLICABLE",)},
    "registry": {9: ("ERROR_PP_MISSING_PROD", "ERROR_PP_MISSING_PREREQ"), 32: ("ERROR_DCFPP_NO_APPLICABLE",)},
    "extract": _TARS,
    "pre_patch": {22: _COMMANDS},
    "stop": {14: ("ERROR_STOP_AGENT",), 15: ("ERROR_STOP_INST",)},
    "pre": {21: _COMMANDS},
    "move": {24: ("ERROR_PP_SET_CWD",), 25: ("ERROR_PP_MOVE_FILE",), 26: ("ERROR_PP_MAKE_DIR",)},
    "post": {23: _COMMANDS},
    "level": {28: ("ERROR_PP_UPDATE_VRMF",)},
    "restart": _STARTS,
    "osagent": _STARTS,
    "list": {24: ("ERROR_PP_SET_CWD",)},
}
LOADING = ("start", "load", "initialize", "descriptor", "registry")

# What a failure may change in silence, step by step.
_SILENT = {
    "load": {"left out"},  # a patch that cannot be seen is none
    "initialize": {"directory"},  # the working directory is not the one of the start any more
    "registry": {"unseen"},  # an instance that is not seen is neither stopped nor started
    "clean-up": {"leftover"},
    "extract": {"directory"},
    "pre_patch": {"directory"},
    "pre": {"directory"},
    "move": {"directory", "files"},
    "post": {"directory"},
    "list": {"directory", "files"},
    "level": {"level"},
    "osagent": {"result file"},
    "history": {"history"},
}


class Allowance:
    """What these faults together allow. A fault that strikes where the C library looks for itself, or at the
    program's output, changes nothing but the name of the user, and what was to be printed."""

    def __init__(self, faults):
        self.faults = list(faults)
        self.silent, self.steps = set(), set()
        for fault in self.faults:
            if fault.in_log:
                self.silent.add("log")
                continue
            if fault.stream:
                self.silent.add(fault.stream)
                continue
            if fault.command:  # without its pipe a child prints where the program does
                self.silent |= {"mixed"}
            if fault.in_system:
                self.silent |= {"user", "date"}
            if not fault.in_system or fault.in_users and fault.step in ("restart", "osagent"):
                self.silent |= _SILENT.get(fault.step, set())
                self.steps.add(fault.step)

    def __contains__(self, deviation):
        return deviation in self.silent

    def ends(self, step):
        """Texts with which the step may have failed, by status; none when no fault struck there."""
        return ENDS.get(step, {}) if step in self.steps else {}

    def touches(self, place, context_roots):
        """Whether a fault of the walk struck at this place under the home, or above it, or at none at all."""
        return any(
            self._touches(fault, place, context_roots) for fault in self.faults if fault.step in ("move", "list")
        )

    @staticmethod
    def _touches(fault, place, roots):
        if not fault.path.startswith("/"):
            return True
        struck = next(
            (fault.path[len(root) :].strip("/") for root in roots if f"{fault.path}/".startswith(root + "/")), None
        )
        if struck is None:
            return False
        return struck == "" or place == struck or place.startswith(struck + "/")
