"""What the source checks share: which files there are, and their text without what a compiler would not see."""
import os
import pathlib
import re

CODE_SUFFIXES = {".c", ".cpp", ".h"}

_TOKEN = re.compile(
    r"""//[^\n]*|/\*.*?\*/|"(?:\\.|[^"\\\n])*"|'(?:\\.|[^'\\\n])*'""", re.DOTALL)


def code_files(root, *folders):
    """The C and C++ files below the given folders of `root`, as paths relative to it, sorted."""
    found = []
    for folder in folders:
        for place, _, names in os.walk(root / folder):
            found += [pathlib.Path(place, name).relative_to(root) for name in names
                      if pathlib.Path(name).suffix in CODE_SUFFIXES]
    return sorted(found)


def _blank(match):
    text = match.group(0)
    quote = text[0] if text[0] in "\"'" else ""
    return quote + re.sub(r"[^\n]", " ", text[1:-1] if quote else text) + quote


def without_comments_and_literals(text):
    """The text with every comment and the inside of every literal replaced by blanks; lines stay where they are.
    A digit separator (1'000) looks like a literal's quote and is taken out first."""
    return _TOKEN.sub(_blank, re.sub(r"(?<=[0-9A-Fa-f])'(?=[0-9A-Fa-f])", "_", text))
