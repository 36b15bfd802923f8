"""A product home with live processes, like one on a customer's machine."""

import atexit
import os
import pwd
import shutil
import signal
import stat
import subprocess
import time
from pathlib import Path
from typing import NamedTuple

from .logfile import parse_log
from .program import identity
from .scratch import remove_tree, scratch_folder
from .snapshot import snapshot

_SCRIPTS = Path(__file__).resolve().parent / "quill"
_OWN_RECORDS = ("journal", "control")  # the sample's book-keeping, no part of the product
_RUN_INFO = "config/.ConfigData/RunInfo"


class Call(NamedTuple):
    """One line of the journal: a control script or a patch script was called."""

    program: str
    args: tuple
    user: str
    cwd: str
    path: str  # PATH
    quillhome: str  # QUILLHOME, empty when it was not set
    seen: dict  # watched file -> its content at the moment of the call; absent when it was not there

    def __str__(self):
        return " ".join([self.program, *(argument or "''" for argument in self.args)])


class HistoryLine(NamedTuple):
    product: str
    arch: str
    comp: str
    name: str
    result: str
    user: str
    date: str


class Instance(NamedTuple):
    code: str
    name: str
    pid: int


class ProductHome:
    """A product home. Without `root` it is made in a scratch folder, which `close` removes.

    with ProductHome() as home:
        home.component("ox", desc="Monitoring Agent for Linux OS")
        home.start("ox")
    """

    def __init__(self, root=None):
        self._scratch = None if root else scratch_folder()
        self.path = Path(root or self._scratch / "home").absolute()
        self._lay_out()
        atexit.register(self.close)

    @classmethod
    def attach(cls, root):
        """The home that another process made at `root`; its processes live on when this process ends."""
        home = cls.__new__(cls)
        home._scratch, home.path = None, Path(root).absolute()
        return home

    def detach(self):
        """Leaves the home's processes running when this process ends; `attach` finds them again."""
        atexit.unregister(self.close)

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.close()

    def __fspath__(self):
        return str(self.path)

    @property
    def prefix(self):
        """The home as QUILLHOME holds it: with the trailing "/"."""
        return f"{self.path}/"

    # --- files -----------------------------------------------------------------------------------------

    def write(self, path, content=b"", mode=0o644):
        """Writes a file under the home, making its directories; returns its path."""
        target = self.path / path
        target.parent.mkdir(parents=True, exist_ok=True)
        target.write_bytes(content.encode() if isinstance(content, str) else content)
        target.chmod(mode)
        return target

    def read(self, path):
        return (self.path / path).read_bytes()

    def exists(self, path):
        return os.path.lexists(self.path / path)

    def mkdir(self, path, mode=0o755):
        target = self.path / path
        target.mkdir(parents=True, exist_ok=True)
        target.chmod(mode)
        return target

    def remove(self, path):
        """Removes a file, a link, or a directory with all that it holds."""
        target = self.path / path
        if target.is_dir() and not target.is_symlink():
            shutil.rmtree(target)
        else:
            target.unlink()

    def give_to(self, user):
        """Makes `user` the owner of everything in the home (needs root)."""
        account = pwd.getpwnam(user)
        for path in [self.path, *self.path.rglob("*")]:
            os.chown(path, account.pw_uid, account.pw_gid, follow_symlinks=False)

    def tree(self, top=""):
        """Snapshot of the home, or of a directory in it: path relative to the home -> Entry."""
        return snapshot(self.path, top, without=_OWN_RECORDS)

    # --- installed components --------------------------------------------------------------------------

    def component(self, code, level="06100000", desc=None, prereqs=(), arch="lpp266", *, filename=None):
        """Installs a component: writes registry/<code><arch>.ver (or `filename`, for example oxvms.ver)."""
        lines = [f"desc = {desc or f'Sample product {code}'}", f"VRMF = {level}"]
        lines += [f"preReqALL = {prereq}" for prereq in prereqs]
        return self.write(f"registry/{filename or f'{code}{arch}.ver'}", "".join(f"{line}\n" for line in lines))

    def level(self, code, arch="lpp266", *, filename=None):
        """The current VRMF of the version file."""
        text = self.read(f"registry/{filename or f'{code}{arch}.ver'}").decode()
        return next(line.split("=", 1)[1].strip() for line in text.splitlines() if line.startswith("VRMF"))

    # --- running instances -----------------------------------------------------------------------------

    def start(self, code, instance="", user=None):
        """Starts an instance by the product's own script, like an operator, without a journal line."""
        self._control("start", code, instance, user)

    def stop(self, code, instance="", user=None):
        self._control("stop", code, instance, user)

    def process(self, file, user=None):
        """Starts a process that names `file` (under the home) in its command line and that the run
        information does not know; returns its process id."""
        if not self.exists(file):
            self.write(file)
        script = 'quill_home=$1; . "$1/bin/process.sh"; spawn "$2"'
        printed = self._operate(["/bin/sh", "-c", script, "sh", str(self.path), str(self.path / file)], user)
        with open(self.path / "control/started", "ab") as started:
            started.write(printed)
        return int(printed.split()[0])

    def start_console(self):
        """Starts the management console; returns its process id."""
        return self.process("classes/wbt.jar")

    def kill(self, pid):
        """Kills a process of this home and waits until it has left the process table."""
        assert self._is_ours(pid), f"{pid} is no process of {self.path}"
        os.kill(pid, signal.SIGKILL)
        _await_end(pid)

    def add_row(self, code, pid, instance="None", host=None, rest="sample"):
        """Adds a row to the run information, whether the process exists or not."""
        fields = [host or os.uname().nodename, code, str(pid), instance, rest]
        self.run_info += self._separator().join(fields) + "\n"

    @property
    def run_info(self):
        return os.fsdecode(self.read(_RUN_INFO))

    @run_info.setter
    def run_info(self, text):
        self.write(_RUN_INFO, os.fsencode(text), 0o666)

    def rows(self):
        """The well-formed rows of the run information as Instance tuples in file order, live or not."""
        separator = self._separator()
        fields = [row.split(separator) for row in self.run_info.split("\n")[1:]] if separator else []
        return [
            Instance(row[1], "" if row[3] == "None" else row[3], int(row[2]))
            for row in fields
            if len(row) >= 5 and row[2].isdecimal()
        ]

    def instances(self):
        """(code, instance) of all rows whose process lives, sorted; the default instance is ""."""
        return sorted((row.code, row.name) for row in self.rows() if self._is_ours(row.pid))

    def pid(self, code, instance=""):
        return next(row.pid for row in self.rows() if (row.code, row.name) == (code, instance))

    def fail(self, verb, code, instance=None, *, status=1, out="", err="", effective=False):
        """From now on `verb` ("start" or "stop") of this instance (of every instance, when None) prints
        `out` and `err` and ends with `status`, without doing anything unless `effective`. Status 0 is good
        for a success with chosen output."""
        suffix = "" if instance is None else f"-{(instance or 'None').replace('/', '_')}"
        switch = f"control/{verb}-{code}{suffix}"
        self.write(f"{switch}/status", str(status))
        self.write(f"{switch}/out", out)
        self.write(f"{switch}/err", err)
        if effective:
            self.write(f"{switch}/effective")

    # --- what has happened -----------------------------------------------------------------------------

    def watch(self, *paths):
        """Every later journal entry keeps the content of these files at that moment."""
        with open(self.path / "control/watch", "a", encoding="utf-8") as watched:
            watched.writelines(f"{path}\n" for path in paths)

    def journal(self):
        lines = os.fsdecode(self.read("journal")).split("\n")[:-1]
        return [self._call(number, line) for number, line in enumerate(lines, 1)]

    def calls(self):
        """The journal in short: program and arguments of each call, an empty argument as ''."""
        return [str(call) for call in self.journal()]

    def log(self):
        return parse_log(self.read("patchlogs/orvpatch.log"))

    def history(self):
        """The records of the patch history, in order, without padding; empty when there is no file."""
        if not self.exists("patchlogs/patches.hist"):
            return []
        lines = os.fsdecode(self.read("patchlogs/patches.hist")).split("\n")[:-1]
        return [
            HistoryLine(*(field.strip() for field in line.split(" | "))) for line in lines if not line.startswith("#")
        ]

    # --- the end ---------------------------------------------------------------------------------------

    def stop_all(self):
        """Ends every process that was ever started in this home."""
        if not self.exists("control/started"):
            return
        # Keepers are not killed: each ends as soon as it has reaped its process.
        pids = [int(line.split()[0]) for line in self.read("control/started").splitlines()]
        living = [pid for pid in pids if self._is_ours(pid)]
        for pid in living:
            os.kill(pid, signal.SIGKILL)
        for pid in living:
            _await_end(pid)

    def close(self):
        """Ends all processes and removes the scratch folder, if this object made one."""
        atexit.unregister(self.close)
        self.stop_all()
        if self._scratch and self._scratch.exists():
            remove_tree(self._scratch)

    # --- internals -------------------------------------------------------------------------------------

    def _lay_out(self):
        for folder in ("registry", "config/.ConfigData", "tmp", "patchlogs", "vmaorv6/agentdepot", "classes"):
            self.mkdir(folder)
        for folder in ("control", "control/processes", "control/seen"):
            self.mkdir(folder, 0o777)
        for script in _SCRIPTS.iterdir():
            self.write(f"bin/{script.name}", script.read_bytes(), stat.S_IMODE(script.stat().st_mode))
        self.write("config/.ConfigData/kqaenv", "KQA_HOST=localhost\n")
        self.run_info = "FIELDSEP=|\n"
        for record in ("journal", "control/started"):
            self.write(record, mode=0o666)

    def _separator(self):
        return self.run_info.split("\n", 1)[0].partition("=")[2]

    def _control(self, verb, code, instance, user):
        if code == "qa":
            words = ["QuillServer", verb, instance]
        elif instance:
            words = ["QuillAgent", "-p" if code == "wn" else "-o", instance, verb, code]
        else:
            words = ["QuillAgent", verb, code]
        self._operate([str(self.path / "bin" / words[0]), *words[1:]], user)

    def _operate(self, words, user=None):
        environment = {**os.environ, "QUILL_UNJOURNALED": "1"}
        done = subprocess.run(
            words,
            env=environment,
            cwd="/",
            check=True,
            stdin=subprocess.DEVNULL,
            stdout=subprocess.PIPE,
            **identity(user),
        )
        return done.stdout

    def _call(self, number, line):
        program, user, cwd, path, quillhome, *args = line.split("\x1f")
        folder = self.path / "control/seen" / str(number)
        seen = {str(file.relative_to(folder)): file.read_bytes() for file in folder.rglob("*") if file.is_file()}
        return Call(program, tuple(args), user, cwd, path, quillhome, seen)

    def _is_ours(self, pid):
        """Whether this process is still one of this home: process ids are reused. It may have been started by
        another name of the home."""
        try:
            words = os.fsdecode(Path(f"/proc/{pid}/cmdline").read_bytes()).split("\0")
        except OSError:
            return False
        return any(
            os.path.realpath(word).startswith(os.path.realpath(self.path) + "/") for word in words if "/" in word
        )


def _is_alive(pid):
    return os.path.isdir(f"/proc/{pid}")


def _await_end(pid, seconds=60):
    limit = time.monotonic() + seconds
    while _is_alive(pid):
        if time.monotonic() > limit:
            raise TimeoutError(f"process {pid} does not end")
        time.sleep(0.01)
