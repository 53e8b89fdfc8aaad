"""What the tests of the TA's files read in an ELF file, by way of readelf."""
import re
import subprocess
import typing


class Section(typing.NamedTuple):
    kind: str
    address: int
    offset: int
    size: int
    flags: str


class Segment(typing.NamedTuple):
    kind: str
    offset: int
    address: int
    file_size: int
    memory_size: int
    flags: str


class Elf:
    """One file: bytes, sections and segments, symbols, relocations."""

    def __init__(self, path):
        self.path = path
        self.content = path.read_bytes()
        self.is_64_bit = "ELF64" in self.readelf("--file-header")
        self.word = 8 if self.is_64_bit else 4
        self.sections = self._sections()
        self.segments = self._segments()
        self.undefined, self.defined = self._symbols("--syms")

    def readelf(self, *options):
        return subprocess.run(["readelf", "--wide", *options, str(self.path)], check=True, capture_output=True,
                              text=True).stdout

    def dynamic_symbols(self):
        """The names that the file imports, and those that it exports."""
        return self._symbols("--dyn-syms")

    def bytes_of(self, section):
        found = self.sections[section]
        return self.content[found.offset:found.offset + found.size]

    def relocations(self, section):
        """What a loader or linker fills into the section: offset in it, to the symbol's name."""
        start, end = self.sections[section].address, self.sections[section].address + self.sections[section].size
        of_section, found = True, {}
        for line in self.readelf("--relocs").splitlines():
            heading = re.match(r"Relocation section '(\S+)'", line)
            if heading:  # those of a relocatable file stand in a section of their own, with offsets from its start
                of_section = heading.group(1) in (f".rel{section}", f".rela{section}", ".rel.dyn", ".rela.dyn")
            fields = line.split()
            if of_section and len(fields) >= 5 and re.fullmatch(r"[0-9a-f]+", fields[0]):
                place = int(fields[0], 16)
                if start <= place < end:
                    found[place - start] = fields[4]
        return found

    def _sections(self):
        found = {}
        for line in self.readelf("--section-headers").splitlines():
            match = re.match(r"\s*\[\s*\d+\]\s+(\S+)\s+(\S+)\s+([0-9a-f]+)\s+([0-9a-f]+)\s+([0-9a-f]+)\s+\S+\s+(\S*)",
                             line)
            if match:
                name, kind, address, offset, size, flags = match.groups()
                found[name] = Section(kind, int(address, 16), int(offset, 16), int(size, 16), flags)
        return found

    def _segments(self):
        pattern = re.compile(r"^\s*(\w+)\s+(0x\w+)\s+(0x\w+)\s+0x\w+\s+(0x\w+)\s+(0x\w+)\s+([RWE ]{3})\s+0x?\w+$",
                             re.MULTILINE)
        return [Segment(kind, int(offset, 16), int(address, 16), int(in_file, 16), int(in_memory, 16), flags)
                for kind, offset, address, in_file, in_memory, flags in
                pattern.findall(self.readelf("--program-headers"))]

    def _symbols(self, table):
        undefined, defined = set(), set()
        for line in self.readelf(table).splitlines():
            # Num: Value Size Type Bind Vis Ndx Name
            fields = line.split()
            if len(fields) < 8 or not fields[0].rstrip(":").isdigit() or fields[3] in ("SECTION", "FILE"):
                continue
            (undefined if fields[6] == "UND" else defined).add(fields[7].split("@")[0])
        return undefined, defined


# The sections of an image by what a device's memory is taken for. What only a loader of shared libraries reads is none
# of it: a device's image format has its own.
PARTS = {"code": (".text", ".plt"),
         "read-only data": (".ta_head", ".data.rel.ro", ".got", ".rodata"),
         "data": (".data",),
         "bss": (".bss",),
         None: (".dynamic", ".relocated_padding", ".hash", ".gnu.hash", ".dynsym", ".dynstr", ".rel.dyn", ".rel.plt")}


def parts(elf):
    """Code, read-only data, data and bss in bytes."""
    return {part: sum(elf.sections[name].size for name in names if name in elf.sections)
            for part, names in PARTS.items() if part is not None}
