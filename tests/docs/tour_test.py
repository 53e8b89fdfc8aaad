#!/usr/bin/env python3
"""The tour of README.md is real: every command in it is run, and prints what stands there.

usage: tour_test.py README KMCTL TEED

A command is a line that begins with "$ ", with the lines that a backslash continues. What follows up to the next one is
its output; a line "..." stands for any lines. Times and source lines may differ.
"""
import difflib
import os
import pathlib
import re
import subprocess
import sys
import tempfile

BLOCK = re.compile(r"^```\n(\$ .*?)^```$", re.MULTILINE | re.DOTALL)
END = "-- end of output --"


def steps_of(text):
    """The commands and their outputs, as pairs of a text and lines."""
    steps = []
    for block in BLOCK.findall(text):
        for line in block.splitlines():
            if line.startswith("$ "):
                steps.append((line[2:], []))
            elif steps[-1][0].endswith("\\") and not steps[-1][1]:
                steps[-1] = (f"{steps[-1][0]}\n{line}", [])
            else:
                steps[-1][1].append(line)
    return steps


def normal(line):
    line = re.sub(r"\b\d+\.\d+ s\b", "0.00 s", line)
    # A key's numbers are kept without leading zero bytes, so that one key in a few dozen makes a smaller blob.
    line = re.sub(r"(sealed in \S+) \([\d,]+ bytes\)", r"\1 (N bytes)", line)
    return re.sub(r"^(KEYMASTER \w+ \w+):\d+:", r"\1:0:", line)


def agree(documented, printed):
    """Whether the lines are the same, where "..." stands for any number of lines."""
    pattern = "".join(r"(?:.*\n)*" if line == "..." else re.escape(normal(line)) + r"\n" for line in documented)
    return re.fullmatch(pattern, "".join(normal(line) + "\n" for line in printed)) is not None


def run(steps, programs, folder):
    """What each command prints, standard error included, in one shell that goes through the whole tour."""
    environment = {name: value for name, value in os.environ.items() if not name.startswith("KEYMASTER_")
                   or name == "KEYMASTER_TA_PATH"}
    environment["PATH"] = ":".join([*(str(program.parent) for program in programs), environment["PATH"]])
    script = "".join(f"{command}\necho '{END}'\n" for command, _ in steps)
    done = subprocess.run(["bash"], input=script, cwd=folder, env=environment, text=True, check=False,
                          stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
    return [part.splitlines() for part in done.stdout.split(END + "\n")[:-1]]


def main():
    readme, *programs = (pathlib.Path(argument).resolve() for argument in sys.argv[1:])
    steps = steps_of(readme.read_text(encoding="utf-8"))
    with tempfile.TemporaryDirectory() as folder:
        outputs = run(steps, programs, folder)
    faults = 0 if steps and len(outputs) == len(steps) else 1
    for (command, documented), printed in zip(steps, outputs):
        if not agree(documented, printed):
            faults += 1
            print(f"$ {command}")
            print("\n".join(difflib.unified_diff(documented, printed, "documented", "printed", lineterm="")))
    print(f"{len(steps)} commands, {faults} faults")
    return 1 if faults else 0


if __name__ == "__main__":
    sys.exit(main())
