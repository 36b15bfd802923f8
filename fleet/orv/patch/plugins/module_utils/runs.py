"""Runs of orvpatchctl that no connection ends.

A run is a process in a session of its own; what it prints, and its status, go to files in a private folder. A module
waits for it. When the connection is lost the run goes on, and the next module that is called for the same home finds
it: `find` gives the newest run whose end no module has told.
"""

from __future__ import absolute_import, division, print_function

__metaclass__ = type

import datetime
import errno
import fcntl
import hashlib
import json
import os
import select
import shutil
import stat
import subprocess
import time
from contextlib import contextmanager

KEPT = 5  # ended runs of a home

# The shell is the leader of the session, and all that waits for the program's status.
SUPERVISOR = """umask 022
folder=$1
shift
echo "$$" >"$folder/pid"
"$@" >"$folder/out" 2>"$folder/err" </dev/null
echo "$?" >"$folder/status.new"
mv "$folder/status.new" "$folder/status"
exit 0 # behind the last command, which a shell may run in its own place
"""


class StateError(Exception):
    """The folder of runs cannot be trusted or used."""


class Lost(Exception):
    """Nothing waits for the module any more."""


class Busy(Exception):
    """Another module has kept the home to itself for too long."""


class Run:
    """One run, by its folder."""

    def __init__(self, folder):
        self.folder = folder
        self.process = None  # of a run that this module started
        try:
            self.job = json.loads(self._read("run.json"))
        except ValueError:
            self.job = {}

    @property
    def status(self):
        """Exit status, or None as long as there is none."""
        text = self._read("status").strip()
        return int(text) if text else None

    @property
    def out(self):
        return self._read("out")

    @property
    def err(self):
        return self._read("err")

    @property
    def is_alive(self):
        return self.status is None and supervises(self._read("pid").strip(), self.folder)

    @property
    def is_told(self):
        return os.path.exists(os.path.join(self.folder, "told"))

    def tell(self):
        """Notes that its end was told: no later module tells it again."""
        _write(os.path.join(self.folder, "told"), "")

    def wait(self, seconds, is_listened):
        """Waits for the end; False when it has not come in time (0: no limit). Lost when nothing listens any more."""
        return await_that(lambda: not self.is_alive, seconds, is_listened)

    def _read(self, name):
        try:
            with open(os.path.join(self.folder, name), "rb") as stream:
                return stream.read().decode("utf-8", "replace")
        except OSError:
            return ""


class Runs:
    """The runs of one home."""

    def __init__(self, root, home):
        key = hashlib.sha256(os.path.realpath(home).encode("utf-8", "surrogateescape")).hexdigest()[:16]
        self._root = root
        self._folder = os.path.join(root, key)

    @contextmanager
    def locked(self, seconds=0, is_listened=lambda: True):
        """One module at a time looks for a run and starts one; it waits for its turn as `wait` does."""
        make_private(self._root)
        make_private(self._folder)
        with usable(self._folder):
            lock = open(os.path.join(self._folder, "lock"), "a")
        with lock:
            if not await_that(lambda: is_mine(lock), seconds, is_listened):
                raise Busy()
            yield

    def find(self):
        """The newest run that is at work, or whose end was not told; None when there is none."""
        runs = self._all()
        if runs and (runs[-1].is_alive or not runs[-1].is_told):
            return runs[-1]
        return None

    def start(self, job, line):
        """Starts a run of this command line; `job` says what it is for."""
        name = "%s-%d" % (datetime.datetime.utcnow().strftime("%Y%m%dT%H%M%S.%fZ"), os.getpid())
        folder = os.path.join(self._folder, name)
        with usable(folder):
            self._make(folder, json.dumps(dict(job, line=line)))
        with open(os.devnull, "r+b") as null:
            process = subprocess.Popen(
                ["/bin/sh", "-c", SUPERVISOR, "sh", folder] + line,
                stdin=null,
                stdout=null,
                stderr=null,
                cwd="/",
                close_fds=True,
                start_new_session=True,
            )
        run = Run(folder)
        while not run.is_alive and process.poll() is None and run.status is None:
            time.sleep(0.01)  # until the shell has written its number
        run.process = process
        self._remove_old()
        return run

    @staticmethod
    def _make(folder, job):
        """The whole folder or none: one without its job would be found as a run."""
        os.mkdir(folder, 0o700)
        try:
            _write(os.path.join(folder, "run.json"), job)
        except OSError:
            shutil.rmtree(folder, ignore_errors=True)
            raise

    def _all(self):
        try:
            names = sorted(os.listdir(self._folder))
        except OSError:
            return []
        return [Run(os.path.join(self._folder, name)) for name in names if name != "lock"]

    def _remove_old(self):
        for run in self._all()[:-KEPT]:
            if not run.is_alive:
                for name in os.listdir(run.folder):
                    os.unlink(os.path.join(run.folder, name))
                os.rmdir(run.folder)


def await_that(holds, seconds, is_listened):
    """Whether it comes to hold in time (0: no limit). Lost when nothing listens any more."""
    limit = time.time() + seconds
    pause = 0.05
    while not holds():
        if not is_listened():
            raise Lost()
        if seconds and time.time() > limit:
            return False
        time.sleep(pause)
        pause = min(pause * 1.5, 1.0)
    return True


def is_mine(lock):
    """Takes a lock when it is free."""
    try:
        fcntl.flock(lock, fcntl.LOCK_EX | fcntl.LOCK_NB)
    except OSError as error:
        if error.errno not in (errno.EAGAIN, errno.EACCES, errno.EINTR):
            raise StateError("cannot lock %s: %s" % (lock.name, error.strerror))
        return False
    return True


@contextmanager
def usable(folder):
    """What cannot be written for a run that has not begun is told as such."""
    try:
        yield
    except OSError as error:
        raise StateError("cannot use %s: %s" % (folder, error.strerror))


def supervises(pid, folder):
    """Whether this process is the shell of the run in this folder: numbers of processes are used again."""
    try:
        with open("/proc/%s/cmdline" % pid, "rb") as stream:
            return folder.encode("utf-8", "surrogateescape") in stream.read().split(b"\0")
    except OSError:
        return False


def make_private(folder):
    """Makes a folder that is the user's alone, or demands that it is."""
    try:
        os.makedirs(folder, 0o700)
    except OSError as error:
        if error.errno != errno.EEXIST:
            raise StateError("cannot make %s: %s" % (folder, error.strerror))
    status = os.lstat(folder)
    if not stat.S_ISDIR(status.st_mode) or status.st_uid != os.geteuid() or status.st_mode & 0o077:
        raise StateError("%s is no directory that is closed to other users" % folder)


def is_listened(descriptor=1):
    """Whether something still reads what the module will print."""
    poll = select.poll()
    poll.register(descriptor, 0)
    ended = select.POLLERR | select.POLLHUP | select.POLLNVAL
    return not any(event & ended for fd, event in poll.poll(0))


def _write(path, text):
    """The whole file or none; two modules may write the same one."""
    fresh = "%s.%d" % (path, os.getpid())
    with open(fresh, "w") as stream:
        os.fchmod(stream.fileno(), 0o600)
        stream.write(text)
        stream.flush()
        os.fsync(stream.fileno())
    os.rename(fresh, path)
