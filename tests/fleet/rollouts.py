"""A fix pack for the fleet, and rollouts of it over hosts with a real sshd each."""

import json
import re
import sys
import time

import jsonschema

from controller import COLLECTION
from network import HOME, PROGRAMS
from support import Patch

sys.path.insert(0, str(COLLECTION.parents[2] / "tests/ctl"))

from oracle import listing  # noqa: E402

BEFORE, AFTER = "06.10.00.00", "06.10.00.02"
AGENTS = [("ox", ""), ("um", ""), ("yn", "east"), ("yn", "west")]
_SCHEMA = COLLECTION / "docs/report.schema.json"

# The patch's command waits while a host is told to hold, and fails on a host that is told to.
_COMMAND = """
if [ -e "$quill_home/control/hold" ]; then
  : >"$quill_home/control/held"
  while [ -e "$quill_home/control/hold" ]; do sleep 0.05; done
fi
[ ! -e "$quill_home/control/broken" ] || exit 3
"""


def make_patch(folder):
    """A fix pack of one product whose agents are stopped, with one that depends on it."""
    patch = Patch("yn", level="06100002", fixpack="fp0002", dependents=["um"])
    patch.file("lpp266/yn/bin/kyn", f"level {AFTER}\n", 0o755).file("lpp266/yn/doc/new.txt", "What is new\n")
    patch.script("10_convert.sh", when="post", body=_COMMAND)
    folder.mkdir(exist_ok=True)
    return patch.write(folder)


class Fleet:
    """The hosts with their fix pack, and what the playbooks make of them."""

    def __init__(self, network):
        self.network, self.controller, self.hosts = network, network.controller, network.hosts
        self.patch = make_patch(network.folder / "patches")
        self.reports = network.folder / "reports"

    def variables(self, **more):
        return {
            "fixpack_home": HOME,
            "fixpack_source": str(self.patch),
            "fixpack_orvpatchctl": f"{PROGRAMS}/orvpatchctl",
            "fixpack_report": str(self.reports),
            **more,
        }

    def start(self, name, *words, controller=None, **more):
        """Starts a playbook."""
        words = ("ansible-playbook", f"orv.patch.{name}", *words)
        return (controller or self.controller).start(*words, variables=self.variables(**more))

    def play(self, name, *words, status=0, **more):
        """Runs a playbook to its end; returns its report, and what it printed as `printed`."""
        printed = self.controller.playbook(name, *words, status=status, variables=self.variables(**more))
        return self.report(printed, **more)

    def report(self, printed="", fixpack_report_name="fleet", **_):
        document = json.loads((self.reports / f"{fixpack_report_name}.json").read_text(encoding="utf-8"))
        schema = json.loads(_SCHEMA.read_text(encoding="utf-8"))
        jsonschema.Draft7Validator(schema).validate(document)
        assert sorted(one["host"] for one in document["fleet"]) == sorted(host.name for host in self.hosts)
        document["verdicts"] = {one["host"]: one["verdict"] for one in document["fleet"]}
        document["reasons"] = {one["host"]: one["reason"] for one in document["fleet"] if one["reason"]}
        document["printed"] = printed
        return document

    def listings(self):
        """All that the homes hold, but for their logs."""
        return {host.name: listing(host.home) for host in self.hosts}

    def trees(self):
        """The same with what the transactions and the history say."""
        return {host.name: (listing(host.home), host.home.tree()) for host in self.hosts}

    def levels(self):
        """{host: level of the patched product, as its version file has it}"""
        return {host.name: _dotted(host.home.level("yn")) for host in self.hosts}

    def attempts(self):
        """{host: results of all attempts, as its history has them}"""
        return {host.name: [line.result for line in host.home.history()] for host in self.hosts}

    def await_held(self, host):
        self.await_that(lambda: host.home.exists("control/held"), f"{host.name} does not come to its command")

    @staticmethod
    def await_that(holds, what, seconds=600):
        limit = time.monotonic() + seconds
        while not holds():
            assert time.monotonic() < limit, what
            time.sleep(0.05)


def hold(host):
    host.home.write("control/hold")


def release(host):
    host.home.remove("control/hold")


def break_command(host):
    host.home.write("control/broken")


def _dotted(level):
    return ".".join(level[at : at + 2] for at in (0, 2, 4, 6))


def recap(printed):
    """{host: {word of the recap: number}}"""
    lines = re.findall(r"^(\S+)\s+: (ok=\d+ .*)$", printed, re.M)
    return {
        host: {word: int(number) for word, number in (pair.split("=") for pair in text.split())} for host, text in lines
    }
