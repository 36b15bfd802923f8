"""What a failed call does to the run: each effect enters it into the Faults. All take the context of the call,
the call and the Faults."""

import errno
import os
import pwd

from cases.catalogue import text

from .faults import Failure
from .scenario import EXTRACTED_MODE, INSTALLED, NEW_MODE, RUNNING, description

_SCRIPT_CODES = {"pre_patch": 22, "pre": 21, "post": 23}
_STOP = (14, "ERROR_STOP_AGENT"), (15, "ERROR_STOP_INST")
_START = (12, "ERROR_START_AGENT"), (13, "ERROR_START_INST")


def nothing(_, __, ___):
    """The specified silence."""


def output_lost(_, call, faults):
    faults.unchecked.add({1: "out", 2: "err"}[call.descriptor])


def output_unread(_, __, faults):
    """Without its pipe a child writes to the program's own output."""
    faults.unchecked.update(("out", "err"))


def user_unknown(context, _, faults):
    """Without a name the user is not the owner of the instance, and not root either."""
    failure = Failure(20, text("ERROR_START_CANT_SU", pwd.getpwuid(os.getuid()).pw_name), context.ended)
    failures = faults.possible.setdefault((context.patch, context.step), [])
    if failure not in failures:
        failures.append(failure)


def directory_lost(_, __, faults):
    faults.directory_lost = True


def bad_home(_, __, faults):
    faults.bad_home = True


def _system_text(error):
    """The system's text for the error of this name."""
    return os.strerror(getattr(errno, error))


# --- which patches there are ---------------------------------------------------------------------------------


def path_missing(context, _, faults):
    faults.load = faults.load or Failure(30, text("ERROR_DCFPP_PATH", context.path))


def nothing_listed(context, _, faults):
    faults.load = faults.load or Failure(31, text("ERROR_DCFPP_NO_FILES", context.path))


def not_applicable(context, _, faults):
    faults.not_applicable.add(context.patch)


# --- extraction ----------------------------------------------------------------------------------------------


def _fail_extraction(context, faults, failure):
    if context.step == "extract":
        faults.fail(context.patch, "extract", failure)
    else:
        faults.initialize.setdefault(context.patch, failure)


def cannot_make_temp(context, _, faults):
    # A directory that was there before counts as made, whatever fails on the way to it.
    if not context.temp_existed:
        _fail_extraction(context, faults, Failure(3, text("ERROR_PP_MAKE_DIR", context.temp)))


def cannot_enter_temp(context, _, faults):
    _fail_extraction(context, faults, Failure(24, text("ERROR_PP_SET_CWD", context.temp)))


def cannot_run_tar(context, _, faults):
    _fail_extraction(context, faults, Failure(3, text("PROC_CANT_RUN", "tar -xf")))


def descriptor_invalid(context, _, faults):
    _descriptor_fails(context, faults, _system_text("EINVAL"))


def descriptor_unreadable(context, call, faults):
    _descriptor_fails(context, faults, _system_text(call.error))


def _descriptor_fails(context, faults, reason):
    path = f"{context.temp}/patch.ini"
    faults.initialize.setdefault(context.patch, Failure(5, text("ERROR_INIFILE_CANT_READ", path, reason)))


# --- what is installed and runs ------------------------------------------------------------------------------


def nothing_runs(_, __, faults):
    faults.not_running.update((code, name) for code, names in RUNNING.items() for name in names)


def nothing_installed(_, __, faults):
    faults.missing.update(INSTALLED)


def component_missing(context, _, faults):
    faults.missing.add(context.component)


def instance_not_seen(context, call, faults):
    faults.not_running.add(context.pids[context.command[2]])
    if call.name == "pipe2":
        output_unread(context, call, faults)


# --- commands ------------------------------------------------------------------------------------------------


def cannot_enter_scripts(context, _, faults):
    failure = Failure(_SCRIPT_CODES[context.step], text("ERROR_PP_SET_CWD", context.temp))
    faults.fail(context.patch, context.step, failure)


def cannot_leave_scripts(context, call, faults):
    """The directory to go back to is unknown when it could not be asked for."""
    back = "" if call.name == "getcwd" else call.path
    failure = Failure(_SCRIPT_CODES[context.step], text("ERROR_PP_SET_CWD", back))
    faults.leave[context.patch, context.step] = failure
    faults.directory_lost = True


def cannot_run_script(context, _, faults):
    script = context.command[0]
    faults.fail(context.patch, context.step,
                Failure(_SCRIPT_CODES[context.step], text("PROC_CANT_RUN", script), context.ended))


def _control_failure(code, instance, failures, names):
    """`failures` are the record's code and key for the default instance and for a named one; their texts name
    the product so many times."""
    record, key = failures[bool(instance)]
    return record, text(key, *([instance] if instance else []), *[description(code)] * names)


def cannot_stop(context, _, faults):
    *_, code = context.command
    instance = context.command[2] if len(context.command) > 3 else ""
    faults.fail(context.patch, "stop",
                Failure(*_control_failure(f"k{code}", instance, _STOP, 2), context.ended))


def cannot_start(context, _, faults):
    words = context.command[-1].split()
    instance = words[2] if words[1] == "-o" else ""
    faults.fail(context.patch, context.step,
                Failure(*_control_failure(f"k{words[-1]}", instance, _START, 1), context.ended))


def result_file_kept(context, _, faults):
    faults.rc[context.patch] = None


def result_file_emptied(context, _, faults):
    faults.rc[context.patch] = b""


# --- the files -----------------------------------------------------------------------------------------------


def place_of(context, call):
    """A walked or target path as the place in updated_files, which is that under the home."""
    path = os.path.normpath(call.paths[-1])
    for top in (context.source, context.home):
        if path == top:
            return ""
        if path.startswith(top + "/"):
            return path[len(top) + 1:]
    raise LookupError(f"{path} is no place of a patch")


def was_there(context, call):
    path = os.path.normpath(call.path)
    if context.step == "move":
        made = path in context.made
        return made or path.removeprefix(context.home + "/") not in context.facts.directories
    return path != context.temp


def no_files(context, _, faults):
    faults.unseen.setdefault(context.patch, set()).add("no tree")


def cannot_enter_source(context, _, faults):
    faults.fail(context.patch, "enter " + context.step, Failure(24, text("ERROR_PP_SET_CWD", context.source)))


def cannot_leave_source(context, call, faults):
    back = "" if call.name == "getcwd" else call.path
    faults.leave[context.patch, context.step] = Failure(24, text("ERROR_PP_SET_CWD", back))
    faults.directory_lost = True


def directory_unopened(context, call, faults):
    faults.unopened.setdefault(context.patch, set()).add(place_of(context, call))


def entry_unseen(context, call, faults):
    faults.unseen.setdefault(context.patch, set()).add(place_of(context, call))


def attributes_lost(context, call, faults):
    """The look at the file to be replaced also tells whether there is one: without it, nothing is removed."""
    if call.error == "ENOENT":
        move_failed("kept")(context, call, faults)
        return
    place = place_of(context, call)
    faults.modes[place] = NEW_MODE
    faults.keeps_owner.add(place)


def new_directory_mode(context, call, faults):
    if call.path.endswith("/"):  # asked after it was made, to open it to everybody
        faults.modes[place_of(context, call)] = 0o755


def mode_kept(context, call, faults):
    place = place_of(context, call)
    faults.modes[place] = 0o755 if place in context.facts.directories else EXTRACTED_MODE


def cannot_make_target(context, call, faults):
    wanted = _directory_about_to_be_made(context)
    failure = Failure(26, text("ERROR_PP_MAKE_DIR", f"{context.home}/./{wanted}/"))
    faults.fail(context.patch, "move", failure)
    faults.move.setdefault(context.patch, (wanted, "not made"))


def _directory_about_to_be_made(context):
    return next(place for place in context.facts.directories if f"{context.home}/{place}" not in context.made)


def move_failed(state):
    """The move of a file fails and leaves it `kept` (as it was), `missing` (the old one is gone, the new one
    still in tmp), under `both` names, or `in place` without its attributes."""

    def effect(context, call, faults):
        place = place_of(context, call)
        if place not in context.facts.replaced and state == "missing":
            return _fail_move(context, faults, place, "kept")
        return _fail_move(context, faults, place, state)

    return effect


def _fail_move(context, faults, place, state):
    source, target = f"{context.source}/./{place}", f"{context.home}/./{place}"
    faults.fail(context.patch, "move", Failure(25, text("ERROR_PP_MOVE_FILE", source, target)))
    faults.move.setdefault(context.patch, (place, state))


# --- the records ---------------------------------------------------------------------------------------------


def _level_fails(context, faults, reason):
    path = f"{context.home}/{context.facts.version_file}"
    faults.fail(context.patch, "level", Failure(28, text("ERROR_PP_UPDATE_VRMF", path, reason)))


def level_unwritable(context, call, faults):
    _level_fails(context, faults, _system_text(call.error))


def level_invalid(context, _, faults):
    _level_fails(context, faults, _number("EINVAL"))


def level_unreadable(context, call, faults):
    _level_fails(context, faults, _number(call.error))


def _number(error):
    return str(getattr(errno, error))


def level_emptied(context, _, faults):
    faults.level[context.patch] = b""


def history_absent(context, _, faults):
    faults.history[context.patch] = "absent"


def history_without_header(context, _, faults):
    faults.history[context.patch] = "no header"
