"""How texts are read, told once more in Python: what the expectations of hostile texts are computed from."""

BLANK = b"\r\n\t "


def lines_of(content):
    """The lines that the reader of all text files yields, as bytes."""
    *ended, last = content.split(b"\0", 1)[0].split(b"\n")
    return [line for line in (line.removesuffix(b"\r") for line in ended) if line] + [last]


def entry_names(content, section):
    """Names of the entries of one section of an INI text, in the order in which they are used."""
    names, current = set(), None
    for line in (line.strip(BLANK) for line in lines_of(content)):
        if not line or line.startswith(b"#"):
            continue
        if line.startswith(b"["):
            current = line[1:-1].strip(BLANK)
            names = set() if current == section else names
        elif current == section:
            names.add(line.split(b"=", 1)[0].strip(BLANK))
    return sorted(names)


def rewritten(content, level):
    """A version file after a patch of this level."""
    return b"".join((b"VRMF = " + level if line.startswith(b"VRMF") else line) + b"\n" for line in lines_of(content))
