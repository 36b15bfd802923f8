"""An account beside root's that may log in: agents run under it and `su` switches to it."""

import contextlib
import os
import subprocess
from pathlib import Path
from typing import NamedTuple

_NAME = "orvagent"  # ps shows names of up to eight characters
_UID = 64321
_ENTRY = f"{_NAME}:*:{_UID}:{_UID}::/:/bin/sh\n"


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
    subprocess.run(["useradd", "--no-create-home", "--home-dir", "/", "--shell", "/bin/sh", "--uid", str(_UID),
                    _NAME], check=True)
    try:
        yield Account(_NAME, _UID, ())
    finally:
        subprocess.run(["userdel", _NAME], check=True)


def _private_account(folder):
    passwd = folder / "passwd"
    passwd.write_text(Path("/etc/passwd").read_text(encoding="utf-8") + _ENTRY, encoding="utf-8")
    passwd.chmod(0o644)
    mount = 'mount --bind "$0" /etc/passwd && exec "$@"'
    return Account(_NAME, _UID, ("unshare", "--mount", "/bin/sh", "-c", mount, os.fspath(passwd)))


def _knows(account):
    found = subprocess.run([*account.wrapper, "id", "-u", account.name], capture_output=True, check=False)
    return found.stdout.split() == [str(account.uid).encode()]
