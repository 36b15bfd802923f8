"""Which calls are made to fail, with which errors, and the run of the program with one of them failing."""

from typing import NamedTuple

from .trace import read_trace

# Errors that a call can give in the conditions that hosts get into: closed permissions, files gone, full or
# broken disks, other file systems, read-only mounts, exhausted descriptors, processes and memory, signals.
_ERRORS = {
    "access": "EACCES ENOENT EIO",
    "brk": "ENOMEM",
    "chdir": "EACCES ENOENT EIO ENOMEM",
    "chmod": "EACCES EPERM EROFS EIO ENOENT",
    "chown": "EACCES EPERM EROFS EIO ENOENT",
    "clone": "EAGAIN ENOMEM",
    "close": "EIO EINTR ENOSPC",
    "connect": "EACCES EAGAIN",
    "fcntl": "EPERM",
    "fsync": "EIO ENOSPC",
    "getcwd": "EACCES ENOENT ENOMEM",
    "getdents64": "EIO ENOENT ENOMEM",
    "link": "EACCES ENOENT ENOSPC EIO EXDEV EMLINK EPERM EROFS ENOMEM",
    "lseek": "EIO",
    "mkdir": "EACCES ENOENT ENOSPC EIO EMLINK EPERM EROFS ENOMEM",
    "mmap": "ENOMEM",
    "newfstatat": "EACCES ENOENT EIO ENOMEM",
    "openat": "EACCES ENOENT EIO EMFILE EINTR ENOMEM",
    "pipe2": "EMFILE ENOMEM",
    "read": "EIO EINTR",
    "rmdir": "EACCES EIO EPERM EROFS",
    "socket": "EACCES EMFILE ENOMEM",
    "syncfs": "EIO ENOSPC",
    "uname": "EPERM",
    "unlink": "EACCES ENOENT EIO EPERM EROFS",
    "wait4": "EINTR",
    "write": "ENOSPC EIO EINTR",
}
_ERRORS_OF_NEW_FILES = "ENOSPC EPERM EROFS"
_ERRORS_OF_PIPES = "EAGAIN"
# Calls of these names cannot fail with the arguments that the program gives them.
INFALLIBLE = {"exit_group", "getpid", "getuid", "munmap", "rt_sigaction"}

# An interrupted call is repeated, so an interruption that never ends is no condition that exists.
_BURST = 3


class Injection(NamedTuple):
    """One fault: the call of this name and ordinal fails with this error, alone ("once") or with all of its
    name that follow ("on")."""

    scenario: str
    call: str
    ordinal: int
    error: str
    mode: str

    def __str__(self):
        return ":".join(map(str, self))

    @classmethod
    def parse(cls, text):
        scenario, call, ordinal, error, mode = text.split(":")
        return cls(scenario, call, int(ordinal), error, mode)

    @property
    def expression(self):
        when = str(self.ordinal)
        if self.mode == "on":
            when += f"..{self.ordinal + _BURST - 1}" if self.error == "EINTR" else "+"
        # brk itself returns no error but the old end of the heap, or anything else below the one asked for.
        outcome = "retval=0" if self.call == "brk" else f"error={self.error}"
        return f"inject={self.call}:{outcome}:when={when}"

    @property
    def spares_the_log(self):
        """Whether the log has to go elsewhere than to its file, since all later calls of this name fail."""
        return self.mode == "on" and self.call in ("openat", "close")


def injections_of(scenario, calls, spared_calls):
    """Every injection into a run that makes `calls`, or `spared_calls` when the log has to be spared."""
    return [injection for made, spared in ((calls, False), (spared_calls, True))
            for injection in _injections(scenario, made) if injection.spares_the_log == spared]


def _injections(scenario, calls):
    return [Injection(scenario, call.name, call.ordinal, error, mode)
            for call in calls if not call.is_log and call.name not in INFALLIBLE
            for error in errors_of(call) for mode in modes_of(call)]


def modes_of(call):
    """The end of the heap cannot be misreported for ever: the C library takes it for the truth."""
    return ("once",) if call.name == "brk" else ("once", "on")


def errors_of(call):
    errors = _ERRORS[call.name].split()
    if call.name == "openat" and ("O_WRONLY" in call.flags or "O_CREAT" in call.flags):
        errors += _ERRORS_OF_NEW_FILES.split()
    if call.name in ("read", "write") and not call.path.startswith("/"):
        errors += _ERRORS_OF_PIPES.split()
    return errors


def traced(program, arguments, cwd, trace, injection=None, spare_the_log=False):
    """Runs the program under strace, with a call failing when asked for; its result and its calls.

    A log that has to be spared goes to standard output line by line: its file could not be opened either.
    """
    wrapper, env = ["strace", "-y", "-s", "8192", "-o", str(trace)], {}
    if injection:
        wrapper += ["-e", injection.expression]
    if spare_the_log:
        wrapper, env = ["stdbuf", "-oL", *wrapper], {"PATCH_DEBUG": ""}
    result = program.run(*arguments, cwd=cwd, env=env, wrapper=wrapper, timeout=60)
    return result, read_trace(trace, str(cwd))
