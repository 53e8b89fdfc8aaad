"""Holds the tables of the documents to what the ARM build really takes of a device, or writes them anew.

usage: budget_tables.py SOURCES [--write]

SOURCES is a JSON file of the build: `documents` with tables between `<!-- measured: NAME -->` and `<!-- end -->`,
`image` (the file `<uuid>.ta`), `stack` and `heap` (commands that print tables), and `reports` (the folder where the
test programs of this build left what their commands took of the heap, see KEYMASTER_HEAP_REPORT).

All tables but one must be exactly what is measured. The most heap over all tests depends on which of them ran, and on
keys and signatures whose numbers are longer one time than another: there the documents' figure is a ceiling, and at most
twice what was seen. Programs whose requests are a matter of chance report nothing.
"""
import json
import pathlib
import re
import subprocess
import sys

sys.dont_write_bytecode = True
sys.path.insert(0, str(pathlib.Path(__file__).resolve().parent.parent / "image"))
from elf import Elf, parts

LIMIT_OF_IMAGE, LIMIT_OF_STACK, LIMIT_OF_HEAP = 64 * 1024, 4 * 1024, 512 * 1024
SUITE = "most heap over all tests"
MARGIN = 512  # for numbers that are longer another time
MARKED = re.compile(r"(<!-- measured: (?P<name>[^\n]+) -->\n)(?P<table>.*?)(<!-- end -->)", re.DOTALL)


def row(*cells):
    return "| " + " | ".join(cells) + " |"


def number(value):
    return f"{value:,}"


def tables_of(command):
    """The Markdown tables that a command prints, each under the first cell of its heading."""
    output = subprocess.run(command, check=True, capture_output=True, text=True).stdout
    output = re.sub(r"(?<=\| )\d{4,}(?= \|)", lambda size: number(int(size.group())), output)
    found = {}
    for lines in re.findall(r"(?:^\|.*\n)+", output, re.MULTILINE):
        found[lines.split("|")[1].strip()] = lines
    return found


def image_table(image):
    sizes = parts(Elf(image))
    total = sizes["code"] + sizes["read-only data"]
    lines = [row("part of the image", "bytes"), "|---|---:|",
             *(row(name, number(size)) for name, size in sizes.items()),
             row(f"code and read-only data, of {number(LIMIT_OF_IMAGE)}", number(total))]
    return "\n".join(lines) + "\n"


class SuiteHeap:
    """What the tests' programs reported, command by command."""

    def __init__(self, folder, image, commands):
        self.names = commands
        self.peaks = {}
        for report in folder.glob("*.txt"):
            for line in report.read_text(encoding="utf-8").splitlines():
                uuid, command, size = line.split()
                if uuid == image.stem:
                    self.peaks[int(command)] = max(self.peaks.get(int(command), 0), int(size))

    def table(self):
        lines = [row("command", f"most heap bytes, of {number(LIMIT_OF_HEAP)}"), "|---|---:|"]
        for command, shown in self.names.items():
            size = -(-(self.peaks[command] + MARGIN) // 1024) * 1024
            lines.append(row(f"`{shown}`", number(min(size, LIMIT_OF_HEAP))))
        return "\n".join(lines) + "\n"

    def faults(self, written):
        for command, shown in self.names.items():
            seen = self.peaks.get(command)
            stated = re.search(rf"^\| `{shown}` \| ([\d,]+) \|$", written, re.MULTILINE)
            if seen is None:
                yield f"no test reported the heap of {shown}: run all tests first"
            elif stated is None:
                yield f"no row for {shown}"
            elif not seen <= int(stated.group(1).replace(",", "")) <= 2 * seen + 1024:
                yield f"{shown} took {seen} bytes, the document says {stated.group(1)}"


def commands_of(stack_table):
    """The commands by number, as the table of the stack shows them."""
    return {int(shown.split()[0], 0): shown for shown in re.findall(r"^\| `(\w+ \w+)`", stack_table, re.MULTILINE)}


def largest(table, cells):
    """The last of the rows with the largest figure: (figure, what). `cells` finds both in a row."""
    rows = [(int(size.replace(",", "")), what) for what, size in re.findall(cells, table, re.MULTILINE)]
    return max(reversed(rows), key=lambda found: found[0])


def summary(tables):
    """A few figures for the first page."""
    stack, deepest = largest(tables["entry point, command"], r"^\| (`.*?`) \| ([\d,]+) \|")
    held, operation = largest(tables["operation"], r"^\| (.*?) \|.*\| ([\d,]+) \|$")
    idle = re.search(r"a fresh instance \| ([\d,]+)", tables["what"]).group(1)
    total = re.search(r"code and read-only data.*\| ([\d,]+) \|", tables["part of the image"]).group(1)
    return "\n".join([
        row("what the TA takes", "bytes", "of"), "|---|---:|---:|",
        row("code and read-only data", total, number(LIMIT_OF_IMAGE)),
        row(f"stack of its own functions, at most ({deepest})", number(stack), number(LIMIT_OF_STACK)),
        row("heap of an idle instance", idle, number(LIMIT_OF_HEAP)),
        row(f"heap of 16 live operations, at most ({operation})", number(held), number(LIMIT_OF_HEAP))]) + "\n"


def measure(sources):
    tables = {"part of the image": image_table(pathlib.Path(sources["image"]))}
    tables.update(tables_of(sources["stack"]))
    tables.update(tables_of(sources["heap"]))
    suite = SuiteHeap(pathlib.Path(sources["reports"]), pathlib.Path(sources["image"]),
                      commands_of(tables["entry point, command"]))
    tables["summary"] = summary(tables)
    return tables, suite


def faults_of(text, tables, suite):
    for found in MARKED.finditer(text):
        name, table = found["name"], found["table"]
        if name == SUITE:
            yield from suite.faults(table)
        elif name not in tables:
            yield f"nothing measures {name}"
        elif table != tables[name]:
            yield f"the table {name} should read\n{tables[name]}"


def main(arguments):
    sources = json.loads(pathlib.Path(arguments[0]).read_text(encoding="utf-8"))
    tables, suite = measure(sources)
    if "--write" in arguments:
        tables[SUITE] = suite.table()
    faults, shown = [], set()
    for document in map(pathlib.Path, sources["documents"]):
        text = document.read_text(encoding="utf-8")
        if "--write" in arguments:
            text = MARKED.sub(lambda found: found[1] + tables[found["name"]] + found[4], text)
            document.write_text(text, encoding="utf-8")
        shown |= {found["name"] for found in MARKED.finditer(text)}
        faults += [f"{document.name}: {fault}" for fault in faults_of(text, tables, suite)]
    faults += [f"no document shows the table {name}" for name in sorted({*tables, SUITE} - shown)]
    print("\n".join(faults) if faults else f"{len(shown)} tables are as measured")
    return 1 if faults else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
