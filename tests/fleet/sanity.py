#!/usr/bin/python3
"""ansible-test sanity without a network: what it would install by pip comes from Debian's packages.

sanity.py ARGUMENT...       those of `ansible-test sanity`, in a copy of the collection
"""

import sys
import venv

from ansible_test._internal import main
from ansible_test._internal.commands import sanity


def make_environment(_args, _python, path, **_options):
    venv.create(path, system_site_packages=True, with_pip=False, symlinks=True)
    return True


sanity.create_virtual_environment = make_environment
sanity.run_pip = lambda *_args, **_options: None
sys.argv = ["ansible-test", "sanity", *sys.argv[1:]]
main()
