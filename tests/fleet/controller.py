"""The controller of a fleet: Debian's ansible-core with this collection, a configuration and a HOME of its own."""

import json
import os
import re
import subprocess
import tempfile
from pathlib import Path

COLLECTION = Path(__file__).resolve().parents[2] / "fleet/orv/patch"

_CONFIGURATION = """\
[defaults]
inventory = {folder}/inventory.ini
collections_path = {folder}/collections
local_tmp = {folder}/local
host_key_checking = True
interpreter_python = /usr/bin/python3
forks = 8
timeout = 10
nocows = True
retry_files_enabled = False
[ssh_connection]
pipelining = True
control_path_dir = {folder}/ssh
ssh_args = -F none -o ControlMaster=auto -o ControlPersist=60s -o UserKnownHostsFile={folder}/known_hosts
    -o StrictHostKeyChecking=yes -o ServerAliveInterval=1 -o ServerAliveCountMax=4
"""


class Controller:
    """`prefix` are command words put in front of everything: those that enter the fleet's network."""

    def __init__(self, folder, prefix=()):
        self.folder, self.prefix = Path(folder), tuple(prefix)
        self.folder.mkdir(parents=True, exist_ok=True)
        for name in ("collections/ansible_collections/orv", "local", "ssh", "home"):
            (self.folder / name).mkdir(parents=True)
        (self.folder / "collections/ansible_collections/orv/patch").symlink_to(COLLECTION)
        self.configure()
        self.inventory("localhost ansible_connection=local\n")

    @classmethod
    def of(cls, network, name):
        """A controller on the switch of a network, which knows the keys of its hosts."""
        made = cls(network.folder / name, network.prefix)
        made.inventory(network.inventory())
        (made.folder / "known_hosts").write_text(network.known_hosts(), encoding="utf-8")
        return made

    def configure(self, **lines):
        """Writes the configuration; lines(forks="50") puts others in place of some."""
        text = _CONFIGURATION.format(folder=self.folder)
        for name, value in lines.items():
            text, count = re.subn(rf"(?m)^{name} = .*$", f"{name} = {value}", text)
            assert count == 1, name
        (self.folder / "ansible.cfg").write_text(text, encoding="utf-8")

    def inventory(self, text):
        (self.folder / "inventory.ini").write_text(text, encoding="utf-8")

    def start(self, program, *words, variables=None, **options):
        """Starts ansible or ansible-playbook, in a process group of its own."""
        words = [*self.prefix, f"/usr/bin/{program}", *map(str, words)]
        if variables is not None:
            words += ["--extra-vars", json.dumps(variables)]
        streams = {"stdin": subprocess.DEVNULL, "stdout": subprocess.PIPE, "stderr": subprocess.STDOUT}
        return subprocess.Popen(
            words, env=self._environment(), cwd=self.folder, text=True, start_new_session=True, **{**streams, **options}
        )

    def run(self, program, *words, timeout=1200, **options):
        """(exit status, what it printed)."""
        process = self.start(program, *words, **options)
        try:
            printed, _ = process.communicate(timeout=timeout)
        except subprocess.TimeoutExpired:
            os.killpg(process.pid, 9)
            raise AssertionError(f"no end after {timeout} s:\n{process.communicate()[0]}") from None
        return process.returncode, printed

    def modules(self, pattern, module, arguments="", *words, status=0):
        """What a module answers, by host."""
        given = ["-a", arguments] if arguments else []
        with tempfile.TemporaryDirectory(dir=self.folder) as tree:
            found, printed = self.run("ansible", pattern, "--tree", tree, "-m", module, *given, *words)
            assert found == status, (found, printed)
            return {file.name: json.loads(file.read_text(encoding="utf-8")) for file in Path(tree).iterdir()}

    def module(self, host, *words, **options):
        return self.modules(host, *words, **options)[host]

    def playbook(self, name, *words, status=0, **options):
        """Runs a playbook of the collection; returns what it printed."""
        found, printed = self.run("ansible-playbook", f"orv.patch.{name}", *words, **options)
        assert found == status, (found, printed)
        return printed

    def _environment(self):
        kept = {name: value for name, value in os.environ.items() if not name.startswith(("ANSIBLE_", "SSH_"))}
        return {
            **kept,
            "HOME": str(self.folder / "home"),
            "ANSIBLE_CONFIG": str(self.folder / "ansible.cfg"),
            "LC_ALL": "C.UTF-8",
            "PYTHONDONTWRITEBYTECODE": "1",
        }
