"""Hosts that are none: each a network, process, mount and name space of its own with a real sshd, on one bridge.

The network of the machine is not touched: the bridge too lives in a space of its own. Every space ends with the test.
"""

import os
import shutil
import subprocess
import time
from pathlib import Path

from support import ProductHome, remove_tree, scratch_folder

_SUBNET = "10.77.0"
HOME = "/opt/orv"  # where the product lies on each host
PROGRAMS = "/opt/orvpatch/bin"

# The first process of the switch and of a host reaps what is left to it (bash does), and ends with its input.
_SWITCH = f"""
ip link set lo up
ip link add fleet type bridge
ip address add {_SUBNET}.1/24 dev fleet
ip link set fleet up
echo ready
read -r _
"""
_HOST = """
set -e
folder=$1 programs=$2 address=$3
hostname "$4"
ip link set lo up
ip link set eth0 up
ip address add "$address/24" dev eth0
mount -t tmpfs -o mode=755 tmpfs /run
mkdir -m 755 /run/sshd
mkdir -p "$folder/opt/orvpatch/bin"
mount --bind "$programs" "$folder/opt/orvpatch/bin"
for place in root etc/ssh opt var/tmp tmp; do
  mount --rbind "$folder/$place" "/$place"
done
cd /
/usr/sbin/sshd -E /etc/ssh/log
echo ready
read -r _
"""
_SSHD = """\
HostKey /etc/ssh/host_key
AuthorizedKeysFile /etc/ssh/authorized_keys
PidFile none
UsePAM no
StrictModes no
PasswordAuthentication no
PermitRootLogin prohibit-password
MaxStartups 100
Subsystem sftp internal-sftp
"""


def why_not():
    """Why this machine cannot make such hosts; empty where it can."""
    lacking = [name for name in ("ip", "unshare", "nsenter", "sshd", "ssh", "ansible") if not _found(name)]
    if lacking:
        return f"{', '.join(lacking)} missing: scripts/setup fleet"
    if os.geteuid() != 0:
        return "network namespaces need root"
    script = "ip link add one type bridge && ip link add two type veth peer name three && mount -t tmpfs none /run"
    tried = subprocess.run(
        ["unshare", "--net", "--mount", "--pid", "--fork", "--uts", "sh", "-c", script],
        capture_output=True,
        text=True,
        check=False,
    )
    return "" if tried.returncode == 0 else f"no namespaces here: {tried.stderr.strip()}"


def _found(name):
    return shutil.which(name, path=f"{os.environ['PATH']}:/usr/sbin:/sbin")


class _Space:
    """Processes in name spaces of their own, as long as this object is not closed."""

    def __init__(self, script, *words, under=()):
        self.process = subprocess.Popen(
            [
                *under,
                "unshare",
                "--net",
                "--pid",
                "--fork",
                "--kill-child",
                "--mount",
                "--mount-proc",
                "--uts",
                "bash",
                "-c",
                script,
                "first",
                *map(str, words),
            ],
            stdin=subprocess.PIPE,
            stdout=subprocess.PIPE,
            text=True,
            start_new_session=True,
        )
        self.pid = None

    def await_ready(self):
        """Waits until the script says so; knows the first process, as the machine numbers it, from then on."""
        line = self.process.stdout.readline()
        assert line == "ready\n", f"no {line!r} from {self.process.args}: {self.process.poll()}"
        self.pid = self._first()

    def _first(self):
        """unshare has one child, also when nsenter is in front: that is replaced by unshare."""
        children = Path(f"/proc/{self.process.pid}/task/{self.process.pid}/children").read_text().split()
        assert len(children) == 1, children
        return int(children[0])

    def enter(self, *kinds):
        """Command words that enter the space."""
        return ("nsenter", "-t", str(self.pid), *(f"--{kind}" for kind in kinds), "--")

    def close(self):
        self.process.stdin.close()
        self.process.kill()
        self.process.wait()
        self.process.stdout.close()


class Host:
    """One host of the fleet: `folder` holds what is its own of the file system, `home` is its product."""

    def __init__(self, fleet, number):
        self.fleet, self.number = fleet, number
        self.name, self.address = f"host{number}", f"{_SUBNET}.{number + 10}"
        self.folder = fleet.folder / self.name
        self.space = None
        for place in ("root", "etc/ssh", "opt", "var/tmp", "tmp"):
            (self.folder / place).mkdir(parents=True)
        (self.folder / "root").chmod(0o700)
        (self.folder / "tmp").chmod(0o1777)
        (self.folder / "var/tmp").chmod(0o1777)
        self._prepare_sshd()

    def _prepare_sshd(self):
        ssh = self.folder / "etc/ssh"
        _run("ssh-keygen", "-q", "-t", "ed25519", "-N", "", "-C", self.name, "-f", ssh / "host_key")
        (ssh / "sshd_config").write_text(_SSHD)
        shutil.copy(self.fleet.key.with_suffix(".pub"), ssh / "authorized_keys")

    def known_host(self):
        kind, key, _ = (self.folder / "etc/ssh/host_key.pub").read_text().split()
        return f"{self.address} {kind} {key}\n"

    @property
    def link(self):
        """The switch's end of the cable."""
        return f"port{self.number}"

    def boot(self):
        """Starts the host: its first process waits for the cable, which needs its process id."""
        words = (self.folder, self.fleet.programs, self.address, self.name)
        script = "until ip link show eth0 >/dev/null 2>&1; do sleep 0.02; done" + _HOST
        self.space = _Space(script, *words)
        limit = time.monotonic() + 20
        while self.space.pid is None:
            assert time.monotonic() < limit, "no first process"
            try:
                self.space.pid = self.space._first()
            except (AssertionError, FileNotFoundError):
                time.sleep(0.01)
        self._plug_in()

    def _plug_in(self):
        plug = ("ip", "link", "add", self.link, "master", "fleet", "type", "veth", "peer", "name", "eth0", "netns")
        while not self._has_own_network():
            time.sleep(0.01)
        self.fleet.on_switch(*plug, f"/proc/{self.space.pid}/ns/net")
        self.fleet.on_switch("ip", "link", "set", self.link, "up")

    def _has_own_network(self):
        return os.readlink(f"/proc/{self.space.pid}/ns/net") != os.readlink("/proc/self/ns/net")

    def await_ready(self):
        self.space.await_ready()

    def install(self):
        """A home with live agents, as on each host of the fleet."""
        self.home = HostHome(self)
        for code, name in (("ox", "Linux OS"), ("um", "Files and Sockets"), ("yn", "Application Servers")):
            self.home.component(code, desc=f"Monitoring Agent for {name}")
            self.home.write(f"lpp266/{code}/bin/k{code}", "level 06.10.00.00\n", 0o755)
        (self.home.path / "tmp").chmod(0o700)
        for code, instance in (("ox", ""), ("um", ""), ("yn", "east"), ("yn", "west")):
            self.home.start(code, instance)
        return self

    def run(self, *words, **options):
        """Runs a command on the host, past its network."""
        entered = [*self.space.enter("net", "pid", "mount", "uts"), *map(str, words)]
        return subprocess.run(entered, text=True, capture_output=True, **{"check": True, **options})

    def processes(self):
        """{process id on the host: command line}."""
        found = {}
        for folder in Path(f"/proc/{self.space.pid}/root/proc").iterdir():
            if folder.name.isdecimal():
                try:
                    found[int(folder.name)] = (folder / "cmdline").read_bytes().replace(b"\0", b" ").decode().strip()
                except (FileNotFoundError, ProcessLookupError):
                    pass
        return found

    def cut_sessions(self):
        """Ends every connection of the host as a network does that forgets it; returns how many."""
        sessions = self.sessions()
        for pid in sessions:
            self.run("kill", "-KILL", pid, check=False)
        return len(sessions)

    def sessions(self):
        """The connections that are open."""
        return [pid for pid, command in self.processes().items() if command.startswith("sshd: root")]

    def module_ages(self):
        """The seconds for which the engine's modules have been at work here."""
        pids = [str(pid) for pid, command in self.processes().items() if command == "/usr/bin/python3"]
        shown = self.run("ps", "-o", "etimes=", "-p", ",".join(pids), check=False).stdout if pids else ""
        return [int(age) for age in shown.split()]

    def unplug(self):
        self.fleet.on_switch("ip", "link", "set", self.link, "down")

    def plug_in_again(self):
        self.fleet.on_switch("ip", "link", "set", self.link, "up")

    def close(self):
        if self.space:
            self.space.close()


class HostHome(ProductHome):
    """The home of a host, seen from outside: files by their place on the machine, processes by the host's numbers."""

    def __init__(self, host):
        self.host = host
        super().__init__(Path(f"{host.folder}{HOME}"))
        self.detach()  # its processes end with the host

    def instances(self):
        living = self.host.processes()
        return sorted((row.code, row.name) for row in self.rows() if row.pid in living)

    def stop_all(self):
        raise NotImplementedError("the host's end is theirs")

    def _operate(self, words, user=None):
        assert user is None
        return self.host.run(
            "env", "QUILL_UNJOURNALED=1", *(word.replace(str(self.path), HOME) for word in words)
        ).stdout


class Network:
    """The switch, the controller's place on it, and the hosts."""

    def __init__(self, programs, hosts=8):
        self.folder = scratch_folder()
        self.key = self.folder / "key"
        _run("ssh-keygen", "-q", "-t", "ed25519", "-N", "", "-C", "controller", "-f", self.key)
        self.programs = self.folder / "programs"
        self.programs.mkdir()
        for program in programs:
            shutil.copy(program, self.programs)
        self.hosts, self.switch = [], None
        try:
            self.switch = _Space(_SWITCH)
            self.switch.await_ready()
            self._boot(hosts)
        except BaseException:
            self.close()
            raise

    def _boot(self, hosts):
        for number in range(1, hosts + 1):
            self.hosts.append(Host(self, number))
            self.hosts[-1].boot()
        for host in self.hosts:
            host.await_ready()
            host.install()

    def on_switch(self, *words):
        _run(*self.switch.enter("net"), *words)

    @property
    def prefix(self):
        """Command words that put a program on the switch, beside the controller's other programs."""
        return self.switch.enter("net", "pid", "mount")

    def inventory(self):
        lines = [f"{host.name} ansible_host={host.address}\n" for host in self.hosts]
        return "[fleet]\n{}[fleet:vars]\nansible_user=root\nansible_ssh_private_key_file={}\n".format(
            "".join(lines), self.key
        )

    def known_hosts(self):
        return "".join(host.known_host() for host in self.hosts)

    def close(self):
        for host in self.hosts:
            host.close()
        if self.switch:
            self.switch.close()
        remove_tree(self.folder)


def _run(*words):
    done = subprocess.run([*map(str, words)], capture_output=True, text=True, check=False)
    assert done.returncode == 0, (words, done.stderr)
