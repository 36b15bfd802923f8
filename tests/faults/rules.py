"""What must become of a run when one of its calls fails: a rule for every call of every step.

The first rule that matches a call decides. A call without a rule is an error of these tests: whoever adds a
call to the program has to say here what its failure means.
"""

import os
from typing import NamedTuple

from . import effects


class Rule(NamedTuple):
    steps: str     # names of steps, or "*"
    calls: str     # names of calls
    place: object  # function of context and call: whether the rule is about this one
    effect: object


def apply_rules(context, call, faults):
    for rule in RULES:
        if (rule.steps == "*" or context.step in rule.steps.split()) and call.name in rule.calls.split() \
                and rule.place(context, call):
            rule.effect(context, call, faults)
            return rule
    raise LookupError(f"no rule for {call.name} of {call.given} in step {context.step}")


# --- places --------------------------------------------------------------------------------------------------


def anywhere(_, __):
    return True


def _normal(call):
    return os.path.normpath(call.path)


def at_home(context, call):
    return _normal(call) == context.home


def at_given_path(context, call):
    return _normal(call) == context.path


def decided(context, _):
    return context.looked


def below_given_path(context, call):
    return _normal(call).startswith(context.path + "/")


def in_temp(context, call):
    return _normal(call) == context.temp


def in_source(context, call):
    return _normal(call) == context.source


def in_descriptor(context, call):
    return _normal(call) == f"{context.temp}/patch.ini"


def in_registry(context, call):
    return _normal(call) == f"{context.home}/registry"


def in_run_info(context, call):
    return _normal(call) == f"{context.home}/config/.ConfigData/RunInfo"


def in_system_files(_, call):
    """What the C library reads on its own: time zone, user data base and the switch of its sources."""
    return call.path == "/" or call.path.startswith(("/etc/", "/usr/", "/lib/", "/var/run/"))


def in_users(_, call):
    return call.path in ("/etc/passwd", "/etc/nsswitch.conf", "/")


def in_pipe(_, call):
    return call.path.startswith("pipe:")


def is_output(_, call):
    return call.descriptor in (1, 2)


def in_descriptor_of(step_file):
    return lambda context, call: _normal(call) == f"{context.home}/{step_file(context)}"


in_version_file = in_descriptor_of(lambda context: context.facts.version_file)
in_result_file = in_descriptor_of(lambda _: "vmaorv6/agentdepot/rc.txt")
in_history = in_descriptor_of(lambda _: "patchlogs/patches.hist")


def opened_for_writing(place):
    return lambda context, call: place(context, call) and "O_WRONLY" in call.flags


def command(*words):
    return lambda context, _: context.command is not None and context.command[:len(words)] == list(words)


def first_of_command(*words):
    """The first call of this name for a child process: the pipe of its standard output comes first."""
    return lambda context, call: command(*words)(context, call) and call.name not in context.done_in_command


def interrupted(_, call):
    return call.error == "EINTR"


def flush(_, call):
    return call.given == (".",) and "O_DIRECTORY" in call.flags


def from_source(context, call):
    """Asked while the walk goes through updated_files."""
    return call.cwd == context.source


def walked(context, call):
    """A place in updated_files."""
    return call.path.startswith(context.source)


def walked_link(context, call):
    """The look at whether a place in updated_files is a link."""
    return walked(context, call) and "AT_SYMLINK_NOFOLLOW" in call.flags


def already_listed(context, call):
    return _normal(call) in context.listed


def at_target(context, call):
    """A place under the home where the walk puts a file or a directory."""
    return f"{_normal(call)}/".startswith(context.home + "/") and not walked(context, call)


def known_target(context, call):
    return at_target(context, call) and effects.place_of(context, call) in context.facts.replaced


def existing_prefix(context, call):
    """One of the directories that have been there before: all but the one that is about to be made."""
    return call.injected and effects.was_there(context, call)


# --- the rules -----------------------------------------------------------------------------------------------

SILENT = effects.nothing
_SCRIPTS = "pre_patch pre post"
_CONTROL = "stop restart osagent"

RULES = [
    # Whatever the step
    Rule("*", "close fcntl brk mmap socket connect uname fsync syncfs", anywhere, SILENT),
    Rule("*", "write", is_output, effects.output_lost),
    Rule("*", "newfstatat", is_output, SILENT),
    Rule("restart osagent", "openat newfstatat lseek read", in_users, effects.user_unknown),
    Rule("*", "openat newfstatat lseek read", in_system_files, SILENT),
    Rule("*", "wait4 read write", interrupted, SILENT),

    Rule("start", "openat", lambda _, call: call.path == "/dev/null", SILENT),
    Rule("start", "access", at_home, effects.bad_home),
    Rule("start", "mkdir", anywhere, SILENT),

    # Which patches there are
    Rule("load", "newfstatat", lambda _, call: call.descriptor is not None, effects.nothing_listed),
    Rule("load", "newfstatat", decided, SILENT),
    Rule("load", "newfstatat", at_given_path, effects.path_missing),
    Rule("load", "openat", at_given_path, effects.nothing_listed),
    Rule("load", "getdents64", already_listed, SILENT),
    Rule("load", "getdents64", at_given_path, effects.nothing_listed),
    Rule("load", "access", anywhere, effects.not_applicable),

    # Extraction: of the descriptor in "initialize", of everything in "extract"
    Rule("initialize extract", "newfstatat chmod", anywhere, SILENT),
    Rule("initialize extract", "access", existing_prefix, effects.cannot_make_temp),
    Rule("initialize extract", "access", anywhere, SILENT),
    Rule("initialize extract", "mkdir", anywhere, effects.cannot_make_temp),
    Rule("initialize extract", "getcwd", anywhere, effects.directory_lost),
    Rule("initialize extract", "chdir", in_temp, effects.cannot_enter_temp),
    Rule("initialize extract", "chdir", anywhere, effects.directory_lost),
    Rule("initialize extract", "clone", command("tar", "-xf"), effects.cannot_run_tar),
    Rule("initialize extract", "pipe2", command("tar", "-xf"), effects.output_unread),
    Rule("initialize extract", "read", in_pipe, SILENT),
    Rule("descriptor", "newfstatat", at_given_path, SILENT),
    Rule("descriptor", "newfstatat", below_given_path, SILENT),
    Rule("descriptor", "openat lseek", in_descriptor, effects.descriptor_invalid),
    Rule("descriptor", "newfstatat read", in_descriptor, effects.descriptor_unreadable),

    # What is installed and runs
    Rule("registry", "newfstatat openat lseek read", in_run_info, effects.nothing_runs),
    Rule("registry", "getdents64", already_listed, SILENT),
    Rule("registry", "newfstatat openat getdents64", in_registry, effects.nothing_installed),
    Rule("registry", "newfstatat", anywhere, SILENT),
    Rule("component", "clone", command("ps", "-p"), effects.instance_not_seen),
    Rule("component", "pipe2 read", first_of_command("ps", "-p"), effects.instance_not_seen),
    Rule("component", "pipe2", anywhere, effects.output_unread),
    Rule("component", "clone read", command(), SILENT),
    Rule("component", "newfstatat openat lseek read", anywhere, effects.component_missing),

    # The steps of an installation
    Rule("clean-up", "newfstatat openat getdents64 unlink rmdir", anywhere, SILENT),  # seen by what is left
    Rule(_SCRIPTS, "chdir", in_temp, effects.cannot_enter_scripts),
    Rule(_SCRIPTS, "chdir getcwd", anywhere, effects.cannot_leave_scripts),
    Rule(_SCRIPTS, "clone", anywhere, effects.cannot_run_script),
    Rule(_SCRIPTS, "pipe2", anywhere, effects.output_unread),
    Rule(_SCRIPTS, "read", in_pipe, SILENT),
    Rule("stop", "clone", anywhere, effects.cannot_stop),
    Rule("restart osagent", "clone", anywhere, effects.cannot_start),
    Rule(_CONTROL, "pipe2", anywhere, effects.output_unread),
    Rule(_CONTROL, "read", in_pipe, SILENT),
    Rule(_CONTROL, "newfstatat", at_given_path, SILENT),
    Rule(_CONTROL, "newfstatat", below_given_path, SILENT),
    Rule("osagent", "openat", in_result_file, effects.result_file_kept),
    Rule("osagent", "write", in_result_file, effects.result_file_emptied),

    Rule("move", "access", in_source, effects.no_files),
    Rule("move", "chdir", in_source, effects.cannot_enter_source),
    Rule("move", "chdir", anywhere, effects.cannot_leave_source),
    Rule("move", "getcwd", from_source, SILENT),
    Rule("move", "getcwd", anywhere, effects.cannot_leave_source),
    Rule("move", "openat", flush, SILENT),
    Rule("move list", "openat getdents64", already_listed, SILENT),
    Rule("move", "openat getdents64", walked, effects.directory_unopened),
    Rule("move", "newfstatat", lambda _, call: call.descriptor is not None, effects.directory_unopened),
    Rule("move", "newfstatat", walked_link, SILENT),
    Rule("move", "newfstatat", walked, effects.entry_unseen),
    Rule("move", "newfstatat", known_target, effects.attributes_lost),
    Rule("move", "newfstatat", at_target, effects.new_directory_mode),
    Rule("move", "access", existing_prefix, effects.cannot_make_target),
    Rule("move", "access", anywhere, SILENT),
    Rule("move", "mkdir", at_target, effects.cannot_make_target),
    Rule("move", "unlink", at_target, effects.move_failed("kept")),
    Rule("move", "link", anywhere, effects.move_failed("missing")),
    Rule("move", "unlink", walked, effects.move_failed("both")),
    Rule("move", "chown", at_target, effects.move_failed("in place")),
    Rule("move", "chmod", at_target, effects.mode_kept),

    Rule("level", "newfstatat", below_given_path, SILENT),
    Rule("level", "openat", opened_for_writing(in_version_file), effects.level_unwritable),
    Rule("level", "openat lseek", in_version_file, effects.level_invalid),
    Rule("level", "newfstatat read", in_version_file, effects.level_unreadable),
    Rule("level", "write", in_version_file, effects.level_emptied),

    Rule("history", "newfstatat", anywhere, SILENT),
    Rule("history", "openat write", in_history, effects.history_absent),
    Rule("history", "lseek", in_history, effects.history_without_header),

    # The report
    Rule("between", "newfstatat", at_given_path, SILENT),
    Rule("list", "access", in_source, effects.no_files),
    Rule("list", "chdir", in_source, effects.cannot_enter_source),
    Rule("list", "chdir", anywhere, effects.cannot_leave_source),
    Rule("list", "getcwd", from_source, SILENT),
    Rule("list", "getcwd", anywhere, effects.cannot_leave_source),
    Rule("list", "openat getdents64", walked, effects.directory_unopened),
    Rule("list", "newfstatat", lambda _, call: call.descriptor is not None, effects.directory_unopened),
    Rule("list", "newfstatat", walked_link, SILENT),
    Rule("list", "newfstatat", walked, effects.entry_unseen),
]
