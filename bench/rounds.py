"""One payload: each contender installs it, once to check the result, then in rounds."""

import os
from dataclasses import dataclass, field

from companion import PEER, Companion
from contenders import FLOOR, FLOOR_AT, PEERS, TOOL
from payloads import Laid


@dataclass
class Trial:
    """The costs of one payload for each contender."""

    payload: object
    log_lines: int = 0
    log_bytes: int = 0
    costs: dict = field(default_factory=dict)  # contender -> its Cost in each round
    system_calls: dict = field(default_factory=dict)  # the tool and the floor -> system call -> number
    absent: dict = field(default_factory=dict)  # peer -> reason for its absence


class Bench:
    def __init__(self, tool, folder, meter):
        self._tool, self._folder, self._meter = tool, folder, meter
        self._floor = meter.build("floor")
        self._companion = Companion(tool.parent / "orvpatchctl", meter)
        self.loads = []  # the machine's load before each run

    def trial(self, payload, rounds, progress):
        """Makes the payload, measures each contender on it `rounds` times, and removes it."""
        trial = Trial(payload)
        laid = Laid(payload, self._folder)
        commands = self._commands(laid, trial)
        for name, command in commands.items():
            self._run(laid, command)
            laid.verify(name)
        for number in range(rounds):
            progress(f"({payload.key}) round {number + 1} of {rounds}")
            for name in _rotated(list(commands), number):
                trial.costs.setdefault(name, []).append(self._run(laid, commands[name]))
        for name in (TOOL, FLOOR):
            laid.refresh()
            trial.system_calls[name] = self._meter.system_calls(commands[name])
        laid.remove()
        return trial

    def companion_trial(self, payload, rounds, progress):
        """The same for orvpatchctl."""
        laid = Laid(payload, self._folder)
        commands = {TOOL: [self._tool, "-h", laid.home, "-i", laid.path]}
        peers = self._peer_commands(laid, Trial(payload))
        if PEER in peers:
            commands[PEER] = peers[PEER]
        trial = self._companion.trial(laid, commands, rounds, progress)
        laid.remove()
        return trial

    def _commands(self, laid, trial):
        """Contender -> the command that installs the payload."""
        peers = self._peer_commands(laid, trial) if trial.payload.peers else {}
        tool = [self._tool, "-h", laid.home, trial.payload.action, laid.path]
        self._run(laid, tool)
        trial.log_lines, trial.log_bytes = laid.log_size()
        return {TOOL: tool, **self._floor_commands(laid, trial), **peers}

    def _floor_commands(self, laid, trial):
        # The number and total size of the log lines that the tool has just written.
        words = [
            f"{laid.home}/",
            laid.version_file,
            trial.payload.files,
            trial.log_lines,
            trial.log_bytes,
            *laid.patches,
        ]
        actions = {FLOOR: "install", FLOOR_AT: "install-at"} if trial.payload.action == "-i" else {FLOOR: "report"}
        return {name: [self._floor, action, *map(str, words)] for name, action in actions.items()}

    @staticmethod
    def _peer_commands(laid, trial):
        commands = {}
        for peer in PEERS:
            obstacle = peer.obstacle()
            if obstacle:
                trial.absent[peer.name] = obstacle
            else:
                commands[peer.name] = peer.command(laid.home, laid.packages(peer.build))
                peer.prepare(laid.template)
        return commands

    def _run(self, laid, command):
        laid.refresh()
        self.loads.append(os.getloadavg()[0])
        return self._meter.cost(command)


def _rotated(names, by):
    """The order rotates by one each round, so that none always follows the same contender."""
    by %= len(names)
    return names[by:] + names[:by]
