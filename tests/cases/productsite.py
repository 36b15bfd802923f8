"""What a case works with: a product home, a folder of patches, the program, and the shapes of its output."""

import os
import signal
import subprocess
import time

from support import Patch, Result
from support.catalogue import text

USAGE = (
    "\nUsage: orvpatch -h <ORV home> [OPTIONS]\n\n"
    "   orvpatch -h <ORV home> -i { <patch_file_directory> | <patch_file> }\n"
    "   orvpatch -h <ORV home> -t { <patch_file_directory> | <patch_file> }\n\n"
    "   where\n\n"
    "   -h  Specifies the ORV installation directory\n"
    "   -i  Specifies the path to the directory or patch file to be installed\n"
    "   -t  Generates a report of the actions to be taken by the patch\n\n\n"
)
SUCCESS = f"\n{text('MAIN_SUCCESSFUL')}\n\n"
NOTHING = ""  # on this stream
SEARCH_PATH = "/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin:/sbin:/bin"  # every user may search it

# Written by every run, or by the sample's own scripts: no case tells them as a change of the home.
_BOOKKEEPING = ("patchlogs/orvpatch.log", "config/.ConfigData/RunInfo")


class Site:
    """One product home with its patches.

    site.home.component("ox")
    assert site.install(Patch("ox").file("bin/tool")) == site.done()
    assert site.changes() == ["+ bin/tool", ...]
    """

    def __init__(self, home, program, patch_dir):
        self.home, self.program, self.patch_dir = home, program, patch_dir
        self.user = None  # login name that the program runs as; None: that of the tests
        self.env = {"PATH": SEARCH_PATH}  # variables to set for the program
        self._before = None

    # --- actions: each returns the Result of the program -----------------------------------------------

    def install(self, *what, **options):
        return self.run("-h", self.home, "-i", self.target(*what), **options)

    def report(self, *what, **options):
        return self.run("-h", self.home, "-t", self.target(*what), **options)

    def validate(self, descriptor, **options):
        """`descriptor`: a path, or the text of a descriptor that is written first."""
        path = self.descriptor(descriptor) if "\n" in str(descriptor) else descriptor
        return self.run("-h", self.home, "-vi", path, **options)

    def run(self, *words, env=(), **options):
        self._before = self.home.tree()
        return self.program.run(*words, env={**self.env, **dict(env)}, **{"user": self.user, **options})

    def target(self, *what):
        """The path that stands for these patches: one file, or (for several) their folder; other paths
        are taken as they are."""
        paths = [item.write(self.patch_dir) if isinstance(item, Patch) else item for item in what]
        return paths[0] if len(paths) == 1 else self.patch_dir

    def descriptor(self, content):
        path = self.patch_dir / "patch.ini"
        path.write_bytes(content if isinstance(content, bytes) else content.encode())
        return path

    def listed(self):
        """The names in the folder of patches, in the order in which the system lists them."""
        return os.listdir(self.patch_dir)

    # --- expected results ------------------------------------------------------------------------------

    def done(self, out=NOTHING, err=NOTHING):
        """Status 0: this output, then the verdict of success."""
        return _result(0, out + SUCCESS, err)

    def failed(self, status, message, out=NOTHING):
        """This status: the output, the verdict that names the log's folder, the message between blank lines."""
        return self.ended(status, out, f"\n{message}\n\n")

    def report_failed(self, status, message, out):
        """The same of a report that had begun: its message has no blank lines around it."""
        return self.ended(status, out, f"{message}\n")

    def ended(self, status, out, err):
        """Neither 0: this output and the verdict of a failure, this error output."""
        verdict = text("MAIN_NOT_SUCCESSFUL", f"{self.home.prefix}patchlogs/")
        return _result(status, f"{out}\n{verdict}\n\n", err)

    # --- what the last action has changed --------------------------------------------------------------

    def changes(self):
        """Paths under the home that are new ("+ path"), gone ("- path") or different ("* path"), sorted."""
        now, before = self.home.tree(), self._before
        paths = sorted((now.keys() | before.keys()) - set(_BOOKKEEPING))
        return [
            f"{_mark(before.get(path), now.get(path))} {path}" for path in paths if before.get(path) != now.get(path)
        ]

    def log(self):
        """(level, component, message) of every line of the last run."""
        return [(line.level, line.component, line.message) for line in self.home.log().runs[-1].lines]

    def logged(self, level):
        """The messages of the last run at one level."""
        return [message for line_level, _, message in self.log() if line_level == level]

    # --- people ----------------------------------------------------------------------------------------

    def as_ordinary_user(self):
        """From now on the program runs as a user to whom permission bits apply: an account that gets
        the home when the tests run as root, their own user otherwise."""
        if os.geteuid() == 0:
            self.user = "nobody"
            self.home.give_to(self.user)


_WAIT = 'touch "$QUILLHOME/waiting-{0}"; while [ ! -e "$QUILLHOME/go-{0}" ]; do sleep 0.02; done'


def _take_signals():
    """Some are ignored where the tests run in the background, or without a terminal."""
    for number in (signal.SIGINT, signal.SIGQUIT, signal.SIGHUP):
        signal.signal(number, signal.SIG_DFL)


class Running:
    """An installation under way: a command of its patch waits until `finish` lets it go."""

    def __init__(self, site, code, **fields):
        self.home, self.code = site.home, code
        patch = Patch(code, **fields).file(f"bin/{code}").script("a.sh", "pre", body=_WAIT.format(code))
        command = [*site.program.argv, "-h", site.home, "-i", patch.write(site.patch_dir)]
        self.process = subprocess.Popen(
            command,
            env={**os.environ, **site.env},
            start_new_session=True,
            stdin=subprocess.DEVNULL,
            stdout=subprocess.DEVNULL,
            preexec_fn=_take_signals,
        )
        limit = time.monotonic() + 30
        while not site.home.exists(f"waiting-{code}"):
            assert time.monotonic() < limit
            time.sleep(0.01)

    def finish(self):
        self.home.write(f"go-{self.code}")
        return self.process.wait(timeout=30)

    def interrupt(self, sign=signal.SIGINT):
        """Signals the program and its children, as a terminal does."""
        os.killpg(self.process.pid, sign)
        return self.process.wait(timeout=30)

    def kill(self):
        """Kills the program alone; its child lives on."""
        self.process.kill()
        return self.process.wait(timeout=30)


def usage():
    return _result(1, USAGE, NOTHING)


def bad_home(path):
    return _result(2, NOTHING, f"{text('ERROR_ORV_HOME', path)}\n")


def _result(status, out, err):
    return Result(status, os.fsencode(out), os.fsencode(err))


def _mark(before, now):
    if before is None:
        return "+"
    return "-" if now is None else "*"
