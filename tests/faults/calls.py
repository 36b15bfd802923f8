"""What system calls are for, and how they fail: the one place that knows their names.

Everything else asks for the kind of a call. A program that does the same by another call of the family changes
nothing here.
"""

from typing import NamedTuple


class Kind(NamedTuple):
    names: str
    errors: str  # in the conditions that hosts get into: closed permissions, files gone, full or broken disks
    changes: bool = False  # whether such a call may change the home


KINDS = {
    "look": Kind(
        "access faccessat faccessat2 stat lstat fstat newfstatat statx fstatfs statfs readlink readlinkat "
        "llistxattr",
        "EACCES ENOENT EIO ENOMEM",
    ),
    "open": Kind("open openat openat2", "EACCES ENOENT EIO EMFILE EINTR ENOMEM"),
    "list": Kind("getdents getdents64", "EIO ENOENT ENOMEM"),
    "read": Kind("read readv pread64", "EIO EINTR"),
    "write": Kind("write writev pwrite64", "ENOSPC EIO EINTR", changes=True),
    "seek": Kind("lseek", "EIO"),
    "cut": Kind("ftruncate truncate fallocate", "EIO ENOSPC", changes=True),
    "flush": Kind("fsync fdatasync syncfs sync_file_range", "EIO ENOSPC"),
    "close": Kind("close", "EIO EINTR ENOSPC"),
    "make": Kind("mkdir mkdirat", "EACCES ENOENT ENOSPC EIO EMLINK EPERM EROFS ENOMEM", changes=True),
    "remove": Kind("unlink unlinkat rmdir", "EACCES EIO EPERM EROFS", changes=True),
    "link": Kind(
        "link linkat rename renameat renameat2",
        "EACCES ENOENT ENOSPC EIO EXDEV EMLINK EPERM EROFS ENOMEM",
        changes=True,
    ),
    "attributes": Kind(
        "chmod fchmod fchmodat fchmodat2 chown fchown lchown fchownat utimensat",
        "EACCES EPERM EROFS EIO ENOENT",
        changes=True,
    ),
    "enter": Kind("chdir fchdir", "EACCES ENOENT EIO ENOMEM"),
    "where": Kind("getcwd", "EACCES ENOENT ENOMEM"),
    "child": Kind("clone clone3 fork vfork", "EAGAIN ENOMEM", changes=True),
    "wait": Kind("wait4 waitid", "EINTR", changes=True),
    "pipe": Kind("pipe pipe2", "EMFILE ENOMEM"),
    "descriptor": Kind("fcntl dup dup2 dup3", "EPERM"),
    "memory": Kind("mmap", "ENOMEM"),
    "heap": Kind("brk", "ENOMEM"),
    "memory file": Kind("memfd_create", "EMFILE ENOMEM"),
    "lock": Kind("flock", "ENOLCK EINTR"),
    "flags": Kind("ioctl", "EIO"),
    "socket": Kind("socket connect", "EACCES EMFILE ENOMEM"),
    "host": Kind("uname", "EPERM"),
    # With the arguments that the program gives them these cannot fail.
    "infallible": Kind(
        "exit_group getpid getppid getuid geteuid getgid getegid munmap rt_sigaction rt_sigprocmask "
        "rt_sigreturn kill umask time clock_gettime clock_nanosleep prlimit64 getrandom setsid madvise "
        "mprotect futex sysinfo restart_syscall",
        "",
    ),
}
_KIND_OF = {name: kind for kind, facts in KINDS.items() for name in facts.names.split()}
_FLAGS_OF_WRITING = ("O_WRONLY", "O_RDWR", "O_CREAT")


def kind_of(name):
    """An unknown call has to be entered above: nothing is known of how it fails."""
    return _KIND_OF.get(name, f"unknown call {name}")


def opens_for_writing(call):
    return call.kind == "open" and any(flag in call.flags for flag in _FLAGS_OF_WRITING)


def changes_something(call):
    return KINDS[call.kind].changes or opens_for_writing(call)


def errors_of(call):
    """The errors that a call can give where it stands."""
    errors = KINDS[call.kind].errors.split()
    if opens_for_writing(call):
        errors += ["ENOSPC", "EPERM", "EROFS"]
    if call.kind in ("read", "write") and not call.path.startswith("/"):
        errors += ["EAGAIN"]
    return errors
