"""The calls that a set of objects makes, and the stack that they take: what GCC says of each function
(-fcallgraph-info=su,da, a .ci file beside the object), what the objects' relocations and instructions add to it, and
who may be behind a pointer. For tools/stack-budget.
"""
import collections
import fnmatch
import re
import subprocess

NODE = re.compile(r'^node: \{ title: "([^"]*)" label: "([^"]*)"')
EDGE = re.compile(r'^edge: \{ sourcename: "([^"]*)" targetname: "([^"]*)"(?: label: "([^"]*)")?')
FRAME = re.compile(r"(?:^|\\n)(\d+) bytes \(([^)]*)\)")
DYNAMIC_OBJECTS = re.compile(r"(?:^|\\n)([1-9]\d*) dynamic objects")
INDIRECT = "__indirect_call"
CALL_RELOCATIONS = re.compile(r"R_ARM_(?:THM_)?(?:CALL|JUMP\d+|PC24|XPC22)|R_X86_64_PLT32")
FUNCTION_LABEL = re.compile(r"^[0-9a-f]+ <(.+)>:$")
INSTRUCTION = re.compile(r"^\s*[0-9a-f]+:\t[0-9a-f ]+\t(\S+)\s*(.*)$")
# Sections that speak of functions and call none: for debuggers and unwinders.
DESCRIPTIVE = re.compile(r"\.(?:debug|eh_frame|ARM\.ex)")


class Fault(Exception):
    """What keeps the stack from being bounded."""


Site = collections.namedtuple("Site", "place line")  # "src/ta/begin.cpp", 72


def lines_of(path, *command):
    """What a program says of an object file."""
    done = subprocess.run([*command, str(path)], check=False, capture_output=True, text=True)
    if done.returncode != 0:
        raise Fault(f"{command[0]} cannot read {path.name}")
    return done.stdout.splitlines()


def pushed(mnemonic, operands):
    """By how many bytes an instruction lowers the stack pointer: ARM, Thumb-2, x86-64."""
    name = mnemonic.split(".")[0]
    if name in ("push", "vpush") and operands.startswith("{"):
        return register_bytes(operands)
    if name in ("stmdb", "stmfd") and operands.startswith("sp!"):
        return register_bytes(operands)
    if name == "push":
        return 8
    if name in ("sub", "subw") and (match := re.match(r"(?:sp, )*(?:sp, )?#(\d+)|\$(0x[0-9a-f]+),%rsp$", operands)):
        return int(match.group(1) or match.group(2), 0) if operands.startswith("sp") or match.group(2) else 0
    if name in ("str", "strd") and (match := re.search(r"\[sp, #-(\d+)\]!", operands)):
        return int(match.group(1))
    return 0


def register_bytes(operands):
    """The size of a register list: {r4, r5, lr}, {d8-d11}."""
    size, listed = 0, operands.partition("{")[2]
    for kind, first, last in re.findall(r"\b(?:([ds])(\d+)|[a-z]+\d*)\b(?:-[ds](\d+))?", listed):
        size += (int(last) - int(first) + 1 if last else 1) * (8 if kind == "d" else 4)
    return size


class Function:
    def __init__(self, title):
        self.title = title
        self.frame = None  # bytes; None: not compiled here, and so the platform's or the compiler's
        self.dynamic = False
        self.calls = set()
        self.indirect = set()  # sites


class CallGraph:
    """Functions by title: the assembler name, with the source file in front where the name is the file's own."""

    def __init__(self, root):
        self.root, self.functions, self.taken, self.weak = root, {}, set(), set()
        self._names = None

    def function(self, title):
        return self.functions.setdefault(title, Function(title))

    def relative(self, path):
        return path.removeprefix(f"{self.root}/")

    def title(self, written):
        """GCC writes paths as they came to its command line."""
        return self.relative(written) if written.startswith("/") else written

    def read_compiler_graph(self, path):
        for text in path.read_text(encoding="utf-8").splitlines():
            if match := NODE.match(text):
                self._read_node(*match.groups())
            elif match := EDGE.match(text):
                self._read_edge(*match.groups())

    def _read_node(self, title, label):
        if title == INDIRECT:
            return
        function = self.function(self.title(title))
        if frame := FRAME.search(label):
            function.frame = max(int(frame.group(1)), function.frame or 0)
            function.dynamic |= frame.group(2) != "static" or DYNAMIC_OBJECTS.search(label) is not None

    def _read_edge(self, source, target, label):
        caller = self.function(self.title(source))
        if target != INDIRECT:
            caller.calls.add(self.function(self.title(target)).title)
            return
        place, line = (label or "?:0:0").split(":")[:2]
        caller.indirect.add(Site(self.relative(place), int(line)))

    def read_relocations(self, path, source):
        """Adds the calls that GCC's graph leaves out, such as those of helpers, and notes whose address is taken."""
        section = None
        for text in lines_of(path, "readelf", "--wide", "--relocs"):
            if match := re.match(r"Relocation section '\.rela?(\.[^']*)'", text):
                section = match.group(1)
                continue
            fields = text.split()
            if len(fields) < 5 or not fields[2].startswith("R_") or section is None or DESCRIPTIVE.match(section):
                continue
            target = self._local_or_global(fields[4], source)
            calls = self._calls_of(section, source)
            if CALL_RELOCATIONS.fullmatch(fields[2]):
                if calls is None:
                    raise Fault(f"{path.name}: {target} is called from {section}, which is no function's")
                calls.add(self.function(target).title)
            elif fields[2] != "R_X86_64_PC32" or target not in (calls or ()):  # x86 has it for both
                self.taken.add(target)

    def read_instructions(self, path, source, objdump):
        """GCC's figure for a function leaves out where it spills arguments that came in registers. What the
        instructions take off the stack pointer, all branches summed up, is at least the whole frame."""
        title, taken = None, {}
        for text in lines_of(path, objdump, "--disassemble"):
            if match := FUNCTION_LABEL.match(text):
                title = self._local_or_global(match.group(1), source)
            elif match := INSTRUCTION.match(text):
                taken[title] = taken.get(title, 0) + pushed(*match.groups())
        for title, size in taken.items():
            function = self.functions.get(title)
            if function is not None and function.frame is not None:
                function.frame = max(function.frame, size)

    def read_weak(self, path):
        """Notes the inline functions: each object that needs one has a copy, and the linker chooses among them."""
        for text in lines_of(path, "readelf", "--wide", "--syms"):
            fields = text.split()
            if len(fields) >= 8 and fields[3] == "FUNC" and fields[4] == "WEAK":
                self.weak.add(fields[7])

    def merge_weak(self):
        """Takes every copy of an inline function for the worst of them."""
        copies = collections.defaultdict(list)
        for title, function in self.functions.items():
            if (name := title.rpartition(":")[2]) in self.weak and function.frame is not None:
                copies[name].append(function)
        for functions in copies.values():
            frame, dynamic = max(one.frame for one in functions), any(one.dynamic for one in functions)
            calls = set().union(*(one.calls for one in functions))
            indirect = set().union(*(one.indirect for one in functions))
            for one in functions:
                one.frame, one.dynamic, one.calls, one.indirect = frame, dynamic, calls, indirect

    def _local_or_global(self, symbol, source):
        symbol = re.sub(r"^\.text\.(?:(?:unlikely|hot|startup)\.)?", "", symbol)  # some assemblers name the section
        local = f"{source}:{symbol}"
        return local if local in self.functions else symbol

    def _calls_of(self, section, source):
        """The calls of a section's function; each has one to itself (-ffunction-sections). None: a section of data."""
        title = self._local_or_global(section, source)
        return self.functions[title].calls if title in self.functions else None

    def names(self):
        """The short name of each title."""
        if self._names is None:
            titles = sorted(self.functions)
            symbols = "\n".join(title.rpartition(":")[2] for title in titles)
            plain = subprocess.run(["c++filt"], input=symbols, check=True, capture_output=True, text=True).stdout
            self._names = {title: short_name(name) for title, name in zip(titles, plain.splitlines(), strict=True)}
        return self._names

    def name(self, title):
        return self.names()[title]

    def defined(self, pattern):
        """The compiled functions that a pattern names: `name`, or `file:name` where that is not enough. The name may
        hold wildcards, and need not tell the arguments of a template that has but one instance."""
        match = re.fullmatch(r"(?:(\S+\.\w+):)?([^:].*)", pattern)
        place, name = match.groups()
        found = [title for title, known in self.names().items()
                 if self.functions[title].frame is not None and fnmatch.fnmatchcase(known, name)]
        return sorted(title for title in found if place is None or title.rpartition(":")[0] == place)


def short_name(name):
    """What people call a function: no namespace, parameters or return type, nothing that GCC appends to clones.

    unsigned int keymaster::(anonymous namespace)::step<&(keymaster::begin(unsigned int))>(TEE_Param*) -> step<begin>
    """
    name = re.sub(r" \[clone [^]]*\]", "", name).replace("(anonymous namespace)::", "").replace("keymaster::", "")
    name = re.sub(r"&\(([\w~]+)\((?:[^()]|\([^()]*\))*\)\)", r"\1", name)
    name = re.sub(r"\(.*", "", name).replace("&", "")
    head, bracket, arguments = name.partition("<")
    return head.rpartition(" ")[2] + bracket + arguments


class Resolver:
    """Who may be behind the pointer at a call site: the rules of a table, each of which has to be of use."""

    def __init__(self, graph, rules, platform):
        self.graph, self.rules, self.platform = graph, rules, platform
        self.used = set()
        self.targets = {}
        for rule in rules:
            for pattern in rule["targets"]:
                self.targets[pattern] = self._targets(pattern)

    def _targets(self, pattern):
        found = self.graph.defined(pattern)
        if not found and self.platform.fullmatch(pattern):
            return [self.graph.function(pattern).title]
        if not found:
            raise Fault(f"the table names {pattern}, and there is no such function")
        return found

    def resolve(self, site):
        """The functions that may be called at `site`: those of the rule whose text stands in that line."""
        lines = (self.graph.root / site.place).read_text(encoding="utf-8").splitlines()
        text = lines[site.line - 1] if 0 < site.line <= len(lines) else ""
        for index, rule in enumerate(self.rules):
            if rule["file"] == site.place and rule["call"] in text:
                self.used.add(index)
                return [title for pattern in rule["targets"] for title in self.targets[pattern]]
        raise Fault(f"{site.place}:{site.line}: nobody says what this calls: {text.strip()}")

    def check_completeness(self, entry_points):
        """Every function whose address is taken must be somebody's target, and every rule must have been needed."""
        named = {title for titles in self.targets.values() for title in titles} | set(entry_points)
        for title in sorted(self.graph.taken - named):
            function = self.graph.functions.get(title)
            if function is not None and function.frame is not None:
                raise Fault(f"the address of {self.graph.name(title)} is taken, and the table has nobody who calls it")
        for index, rule in enumerate(self.rules):
            if index not in self.used:
                raise Fault(f"{rule['file']}: no call by a pointer reads {rule['call']}")


class StackPaths:
    """The deepest path from a function down to where the platform, or nobody, is called."""

    def __init__(self, graph, resolver):
        self.graph, self.resolver = graph, resolver
        self.known = {}

    def deepest(self, title):
        """(bytes, the functions on the way) of the deepest path that begins with `title`."""
        return self._walk(title, [])

    def through(self, titles):
        """The same for a path whose first functions are given; each calls the next."""
        depth, path = self.deepest(titles[-1])
        for title in reversed(titles[:-1]):
            depth, path = depth + self._frame(title), [title] + path
        return depth, path

    def _frame(self, title):
        function = self.graph.functions[title]
        if function.dynamic:
            raise Fault(f"the frame of {self.graph.name(title)} has no fixed size: an array of variable length, alloca")
        return function.frame

    def _walk(self, title, above):
        if title in above:
            circle = above[above.index(title):] + [title]
            raise Fault("recursion: " + " -> ".join(self.graph.name(name) for name in circle))
        if title in self.known:
            return self.known[title]
        function = self.graph.functions[title]
        if function.frame is None:
            if not self.resolver.platform.fullmatch(title):
                caller = self.graph.name(above[-1])
                raise Fault(f"nobody knows the stack of {self.graph.name(title)}, which {caller} calls")
            return 0, []
        deepest = (0, [])
        for callee in sorted(self.callees(function)):
            deepest = max(deepest, self._walk(callee, above + [title]), key=lambda found: found[0])
        self.known[title] = self._frame(title) + deepest[0], [title] + deepest[1]
        return self.known[title]

    def callees(self, function):
        behind_pointers = {title for site in function.indirect for title in self.resolver.resolve(site)}
        return function.calls | behind_pointers
