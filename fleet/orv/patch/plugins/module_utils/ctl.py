"""orvpatchctl on a host: its commands and the JSON documents that they print."""

from __future__ import absolute_import, division, print_function

__metaclass__ = type

import json

GOOD = 0
FINDINGS = 1


def arguments():
    """The options that say where a home is and with what it is read."""
    return {"home": {"type": "path", "required": True}, "orvpatchctl": {"type": "path", "default": "orvpatchctl"}}


def run_arguments():
    """The options of modules that change a home."""
    return dict(
        arguments(),
        state_dir={"type": "path", "default": "~/.orv_patch/runs"},
        timeout={"type": "int", "default": 0},
        files={"type": "bool", "default": True},
    )


class CtlError(Exception):
    """orvpatchctl could not judge, or refused without a document."""

    def __init__(self, message, status):
        super(CtlError, self).__init__(message)
        self.status = status


class Ctl:
    """orvpatchctl for one home."""

    def __init__(self, module):
        self._module = module
        self.home = module.params["home"].rstrip("/") or "/"
        self.program = module.params["orvpatchctl"]

    def find(self):
        """Looks for the program where it is given by its name alone."""
        if "/" not in self.program:
            self.program = self._found(self.program)
        return self

    def _found(self, name):
        found = self._module.get_bin_path(name, opt_dirs=["/usr/local/bin", "/usr/local/sbin"])
        if found is None:
            raise CtlError("%s is neither in PATH nor below /usr/local" % name, 2)
        return found

    def read(self, command, *words, **options):
        """The document of a command that only reads. Other statuses than `accepted` are errors."""
        accepted = options.get("accepted", (GOOD,))
        line = [self.program, command] + list(words) + ["--json"]
        status, out, err = self._module.run_command(line, environ_update={"LC_ALL": "C"}, cwd="/")
        if status not in accepted:
            raise CtlError(said(err) or "%s %s ended with status %d" % (self.program, command, status), status)
        return document(out, err, status)

    def status(self):
        return self.read("status", self.home)

    def history(self):
        return self.read("history", self.home)

    def show(self, patch):
        """The patches of a file or a directory, in the installer's order."""
        shown = self.read("show", patch)
        return shown if isinstance(shown, list) else [shown]

    def verify(self, patch):
        return self.read("verify", self.home, patch, accepted=(GOOD, FINDINGS))

    def check(self, patch, options):
        return self.read("check", self.home, patch, *options, accepted=(GOOD, FINDINGS))

    def plan(self, patch, options):
        return self.read("apply", self.home, patch, "--dry-run", *options, accepted=(GOOD, FINDINGS))


def document(out, err, status):
    """What was printed, as JSON; a status of 1 without a document is a refusal, told on standard error."""
    try:
        return json.loads(out)
    except ValueError:
        raise CtlError(said(err) or "no JSON document (status %d)" % status, status)


def said(err):
    """Messages of orvpatchctl without the program's name in front of each."""
    lines = [line.replace("orvpatchctl: ", "", 1) for line in err.splitlines()]
    return "; ".join(line for line in lines if line.strip())
