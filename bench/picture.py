#!/usr/bin/python3
"""Draws docs/picture.svg from the figures of docs/performance.md: the road of an install, and what it costs.

bench/picture.py            writes it
bench/picture.py --check    fails when the picture is not that of the figures
"""

import re
import sys
from pathlib import Path

DOCS = Path(__file__).resolve().parents[1] / "docs"
PAYLOAD = "(a)"
# The contenders that are shown; True: all files are on disk when it ends.
SHOWN = {
    "orvpatch": True,
    "dpkg -i": True,
    "dpkg -i --force-unsafe-io": False,
    "rpm -U": False,
    "rsync -a": False,
    "tar -xf": False,
}
ROAD = [
    ["choose and check|the patches", "unpack|below tmp", "pre-patch|commands", "stop|the instances", "pre|commands"],
    ["move|the files", "post|commands", "write|the level", "start|the instances", "OS agent,|history"],
]

WIDTH, EDGE = 860, 24
BOX_WIDTH, BOX_HEIGHT, BOX_STEP = 140, 50, 168
ROW_STEP, FIRST_ROW = 84, 52
BAR_LEFT, BAR_HEIGHT, BAR_STEP = 216, 18, 28

STYLE = """
  svg { --page: #ffffff; --text: #1f2328; --muted: #59636e; --line: #8b949e;
        --box: #f3f5f7; --own: #0f62ab; --other: #818b96 }
  @media (prefers-color-scheme: dark) {
    svg { --page: #0d1117; --text: #e6edf3; --muted: #9da7b1; --line: #6e7681;
          --box: #1b222b; --own: #58a6ff; --other: #7d8590 }
  }
  .page { fill: var(--page) }
  text { font: 13px system-ui, sans-serif; fill: var(--text) }
  .title { font-weight: 600; font-size: 15px }
  .note { fill: var(--muted) }
  .box { fill: var(--box); stroke: var(--line) }
  .always { stroke: var(--own); stroke-width: 2 }
  .way { fill: none; stroke: var(--line); stroke-width: 1.5; marker-end: url(#tip) }
  .tip { fill: var(--line) }
  .own { fill: var(--own); stroke: var(--own) }
  .other { fill: var(--other); stroke: var(--other) }
  .open { fill-opacity: 0.25 }
"""


def figures():
    """(title of the payload, contender -> seconds), from the page's table."""
    page = (DOCS / "performance.md").read_text()
    title, rows = re.search(rf"^### {re.escape(PAYLOAD)} (.*)\n\n((?:\|.*\n)+)", page, re.M).groups()
    heads, _, *lines = [[cell.strip() for cell in row.strip("|").split("|")] for row in rows.splitlines()]
    column = heads.index("wall s")
    found = {line[0]: float(line[column]) for line in lines}
    return title, {name: found[name] for name in SHOWN if name in found}


def text(x, y, content, style="", anchor="start"):
    return f'<text x="{x}" y="{y}" class="{style}" text-anchor="{anchor}">{content}</text>'


def box(column, row, words):
    x, y = EDGE + column * BOX_STEP, FIRST_ROW + row * ROW_STEP
    always = " always" if (row, column) == (len(ROAD) - 1, len(ROAD[-1]) - 1) else ""
    lines = words.split("|")
    parts = [f'<rect x="{x}" y="{y}" width="{BOX_WIDTH}" height="{BOX_HEIGHT}" rx="6" class="box{always}"/>']
    parts += [text(x + BOX_WIDTH // 2, y + 21 + 17 * at, line, anchor="middle") for at, line in enumerate(lines)]
    if column:
        parts.append(f'<path d="M{x - BOX_STEP + BOX_WIDTH} {y + BOX_HEIGHT // 2} H{x - 2}" class="way"/>')
    elif row:
        last, middle = EDGE + (len(ROAD[0]) - 1) * BOX_STEP + BOX_WIDTH // 2, y - (ROW_STEP - BOX_HEIGHT) // 2
        down = f"M{last} {y - ROW_STEP + BOX_HEIGHT} V{middle} H{x + BOX_WIDTH // 2} V{y - 2}"
        parts.append(f'<path d="{down}" class="way"/>')
    return parts


def road():
    places = [(column, row, words) for row, steps in enumerate(ROAD) for column, words in enumerate(steps)]
    boxes = [part for place in places for part in box(*place)]
    below = FIRST_ROW + len(ROAD) * ROW_STEP - 10
    return [
        text(EDGE, 32, "The road of an install", "title"),
        *boxes,
        text(
            EDGE,
            below,
            "Once unpacking has begun, the first step that fails leads straight to the last box. " "Nothing is undone.",
            "note",
        ),
    ], below


def bars(top):
    title, seconds = figures()
    scale = (WIDTH - BAR_LEFT - 80) / max(seconds.values())
    parts = [text(EDGE, top, "What it costs", "title"), text(EDGE, top + 22, f"Seconds for {title}", "note")]
    for at, (name, found) in enumerate(seconds.items()):
        y, length = top + 38 + at * BAR_STEP, round(found * scale)
        style = ("own" if name == "orvpatch" else "other") + ("" if SHOWN[name] else " open")
        parts += [
            text(BAR_LEFT - 12, y + 14, name, anchor="end"),
            f'<rect x="{BAR_LEFT}" y="{y}" width="{length}" height="{BAR_HEIGHT}" rx="2" class="{style}"/>',
            text(BAR_LEFT + length + 8, y + 14, f"{found:.2f}"),
        ]
    below = top + 38 + len(seconds) * BAR_STEP + 18
    parts.append(
        text(
            EDGE,
            below,
            "Full bars: all files are on disk at the end. Pale bars: the system writes them later. "
            "Figures and conditions: performance.md",
            "note",
        )
    )
    return parts, below


def picture():
    first, middle = road()
    second, end = bars(middle + 46)
    head = (
        f'<svg xmlns="http://www.w3.org/2000/svg" viewBox="0 0 {WIDTH} {end + EDGE}" width="{WIDTH}" role="img">\n'
        "<title>The road of an install, and what it costs beside other tools</title>\n"
        f"<style>{STYLE}</style>\n"
        '<defs><marker id="tip" markerWidth="7" markerHeight="8" refX="5" refY="4" orient="auto">'
        '<path d="M0 0 L7 4 L0 8 Z" class="tip"/></marker></defs>\n'
        f'<rect width="{WIDTH}" height="{end + EDGE}" rx="8" class="page"/>\n'
    )
    return head + "\n".join(first + second) + "\n</svg>\n"


def main(options):
    path = DOCS / "picture.svg"
    if options == ["--check"]:
        same = path.read_text() == picture()
        return 0 if same else "docs/picture.svg is not that of the figures: run bench/picture.py"
    if options:
        return __doc__
    path.write_text(picture())
    return 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
