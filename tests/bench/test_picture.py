"""The picture of README is drawn from the figures of docs/performance.md."""

import re
import subprocess
import xml.etree.ElementTree as ElementTree
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]
PICTURE = ROOT / "docs/picture.svg"


def test_the_picture_is_that_of_the_figures():
    done = subprocess.run([ROOT / "bench/picture.py", "--check"], capture_output=True, text=True, check=False)
    assert (done.returncode, done.stderr) == (0, "")


def test_every_contender_is_shown_with_its_seconds():
    page = (ROOT / "docs/performance.md").read_text()
    rows = page.partition("\n### (a) ")[2].partition("\n### ")[0]
    seconds = dict(re.findall(r"^\| ([^|]+?) \| [\d.]+ \| [\d.]+ \| ([\d.]+) ", rows, re.M))
    words = [element.text for element in ElementTree.parse(PICTURE).iter() if element.tag.endswith("}text")]
    for name in ("orvpatch", "dpkg -i", "dpkg -i --force-unsafe-io", "rpm -U", "rsync -a", "tar -xf"):
        assert words[words.index(name) + 1] == f"{float(seconds[name]):.2f}"


def test_each_colour_is_given_for_light_and_for_dark():
    style = next(element.text for element in ElementTree.parse(PICTURE).iter() if element.tag.endswith("}style"))
    light, dark = (re.findall(r"(--\w+):", scheme) for scheme in re.findall(r"svg \{ (.*?) \}", style, re.S))
    assert light == dark
    assert set(re.findall(r"var\((--\w+)\)", style)) == set(light)
