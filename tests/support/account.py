"""A second account, with a shell: agents run under it and `su` switches to it."""

import contextlib
import os
import subprocess
from pathlib import Path
from typing import NamedTuple

# Test processes that run side by side each have an account of their own. ps shows names of up to eight
# characters; digits in a name could be taken for a process id in the output of ps.
_NAME = "orv" + "".join(chr(ord("a") + os.getpid() // 26**place % 26) for place in range(5))
_UID = 60000 + os.getpid() % 5000


class Account(NamedTuple):
    """`wrapper` are the command words that make the account known to the command behind them:
    home.start("ox", user=account.uid); program.install(home, patch, wrapper=account.wrapper)."""

    name: str
    uid: int
    wrapper: tuple


@contextlib.contextmanager
def second_account(folder):
    """An account that exists for the duration of the context (needs root): in a private view of /etc/passwd,
    kept in `folder`, so that the machine stays as it is; in a container that allows no private view, for real."""
    private = _private_account(Path(folder))
    if _knows(private):
        yield private
        return
    subprocess.run(
        [
            "useradd",
            "--no-create-home",
            "--no-user-group",
            "--home-dir",
            "/",
            "--shell",
            "/bin/sh",
            "--uid",
            str(_UID),
            _NAME,
        ],
        check=True,
    )
    try:
        yield Account(_NAME, _UID, ())
    finally:
        subprocess.run(["userdel", "--force", _NAME], check=True)  # also while an agent still runs


def _private_account(folder):
    passwd = folder / "passwd"
    accounts = Path("/etc/passwd").read_bytes()
    passwd.write_bytes(accounts + f"{_NAME}:*:{_UID}:{_UID}::/:/bin/sh\n".encode())
    passwd.chmod(0o644)
    mount = 'mount --bind "$0" /etc/passwd && exec "$@"'
    return Account(_NAME, _UID, ("unshare", "--mount", "/bin/sh", "-c", mount, os.fspath(passwd)))


def _knows(account):
    found = subprocess.run([*account.wrapper, "id", "-u", account.name], capture_output=True, check=False)
    return found.stdout.split() == [str(account.uid).encode()]
