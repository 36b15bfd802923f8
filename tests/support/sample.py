"""The sample installation of the demo: a home with live agents and a monitoring server, and its patches."""

from pathlib import Path

from .archive import Patch
from .product import ProductHome

_COMPONENTS = {
    "ox": "Monitoring Agent for Linux OS",
    "um": "Monitoring Agent for Files and Sockets",
    "yn": "Monitoring Agent for Application Servers",
    "qa": "Veyra Enterprise Monitoring Server",
    "pt": "Veyra Enterprise Portal Server",
    "dk": "Veyra Enterprise Portal Desktop Client",
    "zt": "Command-Line Interface",
}
_RUNNING = (("ox", ""), ("um", ""), ("yn", "east"), ("yn", "west"), ("qa", ""))


class Sample:
    """<root>/home, and beside it <root>/fixpack2 (one patch of each target kind and two of agents),
    <root>/single (a back-level patch and one whose script fails) and <root>/patch.ini (a descriptor)."""

    def __init__(self, root):
        self.root = Path(root)

    def make(self):
        home = ProductHome(self.root / "home")
        for code, desc in _COMPONENTS.items():
            home.component(code, desc=desc, prereqs=["oxlpp266"] if code in ("um", "yn") else ["none"])
            home.write(f"lpp266/{code}/bin/k{code}", "level 06.10.00.00\n", 0o755)
        for code, instance in _RUNNING:
            home.start(code, instance)
        self._make_fixpack()
        self._make_single()
        home.detach()

    @property
    def home(self):
        return ProductHome.attach(self.root / "home")

    def instances(self):
        """The running instances, in the program's words, with the process id at the end."""
        return [
            f"{f'{row.name} instance of ' if row.name else ''}{_COMPONENTS[row.code]}, pid {row.pid}"
            for row in sorted(self.home.rows())
            if (row.code, row.name) in self.home.instances()
        ]

    def levels(self):
        """The level of every component."""
        return [f"{desc}: {self.home.level(code)}" for code, desc in _COMPONENTS.items()]

    def _make_fixpack(self):
        folder = self.root / "fixpack2"
        folder.mkdir()
        (folder / "readme.txt").write_text("Fix pack 2\n", encoding="utf-8")
        for code, target in (("zt", "vecm"), ("qa", "vems"), ("pt", "veps"), ("dk", "vepd"), ("ox", "vema")):
            _fix_pack(code, target).write(folder)
        agent = _fix_pack("yn", "vema", prereqs={"ox": "06.10.00"}, dependents=["um"])
        agent.file("lpp266/yn/doc/whatsnew.txt", "What is new in fix pack 2\n")
        agent.script("10_check_space.sh", when="pre_patch").script("20_save_settings.sh", when="pre")
        agent.script("30_restore_settings.sh", when="post")
        agent.write(folder)
        agent.write_descriptor(self.root / "patch.ini")

    def _make_single(self):
        folder = self.root / "single"
        folder.mkdir()
        _fix_pack("yn", "vema", fixpack="fp0001", level="06100001").write(folder)
        failing = _fix_pack("um", "vema", fixpack="fp0003", level="06100003", dependents=["ox"])
        failing.script("10_convert_data.sh", when="pre", status=3, err="no space left for the conversion\n")
        failing.write(folder)


def _fix_pack(code, target, *, fixpack="fp0002", level="06100002", **fields):
    dotted = ".".join(level[at : at + 2] for at in (0, 2, 4, 6))
    title = f"{_COMPONENTS[code]}, level {dotted}"
    patch = Patch(code, target=target, fixpack=fixpack, level=level, title=title, **fields)
    return patch.file(f"lpp266/{code}/bin/k{code}", f"level {dotted}\n", 0o755)
