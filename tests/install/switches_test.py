#!/usr/bin/env python3
"""Every switch of the commands stands in the manual page and is offered by the completions, and no other is.

usage: switches_test.py SOURCE BUILD

What there is, the commands say themselves, with --help. The shells that are installed are asked for what they offer.
"""
import functools
import re
import shutil
import unittest

import install_case
from install_case import InstalledTest, run

SWITCH = re.compile(r"^  (-[^ ,]+(?:,-[^ ,]+)*)", re.MULTILINE)
SUB_COMMAND = re.compile(r"^  ([a-z][a-z-]*) ", re.MULTILINE)
IN_PAGE = re.compile(r"(?<![\w-])--?[a-z][\w-]*")
OVERSTRUCK = re.compile(r".\x08")


@functools.cache
def help_of(*words):
    return run(*words, "--help").stdout


def switches_of(text):
    return {name for names in SWITCH.findall(text) for name in names.split(",")}


def commands_of(text):
    _, found, rest = text.partition("\nSubcommands:\n")
    return SUB_COMMAND.findall(rest.partition("\n\n")[0] + "\n") if found else []


def tree_of(program, *words):
    """Every command line that a sub-command ends, each with the sub-commands below it and its switches."""
    text = help_of(program, *words)
    yield words, commands_of(text), switches_of(text)
    for command in commands_of(text):
        yield from tree_of(program, *words, command)


class Switches(InstalledTest):
    def installed(self):
        return sorted(path.name for path in (self.prefix / "bin").iterdir())

    def program(self, name):
        path = self.prefix / "bin" / name
        if not path.exists():
            self.skipTest(f"{name} is not installed")
        return path

    def tree(self, name):
        found = list(tree_of(self.program(name)))
        self.assertIn("--help", found[0][2], f"{name} --help is not understood")
        return found

    def page(self, name):
        """The manual page as a person reads it."""
        if shutil.which("man") is None:
            self.skipTest("man is not installed")
        file = next(self.prefix.glob(f"share/man/man?/{name}.?"))
        rendered = run("man", "-l", "-Tutf8", file, MANWIDTH="200", GROFF_NO_SGR="1").stdout
        return OVERSTRUCK.sub("", rendered).replace("\u2212", "-").replace("\u2010", "-")

    def section(self, page, title, level):
        """What stands below a heading, up to the next of its level."""
        indent = {1: "", 2: " {3}"}[level]
        found = re.search(rf"^{indent}{re.escape(title)}\n(.*?)(?=^{indent}\S|\Z)", page, re.MULTILINE | re.DOTALL)
        self.assertIsNotNone(found, f"the page has no {title}")
        return found.group(1)

    def listed_switches(self, section):
        """Those that an entry of a list begins with, with a value or without; examples and text don't count."""
        entry = re.compile(r"^ +(-[a-z-][\w-]*(?:, -[a-z-][\w-]*)*)(?: [A-Z][\w,.]*| {2,}.*)?$", re.MULTILINE)
        entries = entry.findall(section)
        return {name for entry in entries for name in entry.split(", ")}

    def test_the_page_of_kmctl_lists_every_switch_where_it_belongs_and_no_other(self):
        page = self.page("kmctl")
        for words, commands, switches in self.tree("kmctl"):
            if commands and words:
                continue  # a group has no switches of its own
            with self.subTest(command=words):
                section = (self.section(page, f"kmctl {' '.join(words)}", 2) if words
                           else self.section(page, "OPTIONS", 1))
                wanted = switches - {"-h", "--help"} if words else switches
                self.assertEqual(self.listed_switches(section), wanted)

    def test_the_page_of_kmctl_has_no_surplus_command(self):
        described = set(re.findall(r"^ {3}kmctl ([a-z][a-z -]*)$", self.page("kmctl"), re.MULTILINE))
        self.assertEqual(described, {" ".join(words) for words, commands, _ in self.tree("kmctl") if not commands})

    def test_the_pages_know_every_variable_and_exit_code(self):
        for name in self.installed():
            with self.subTest(program=name):
                page, text = self.page(name), help_of(self.program(name))
                variables = re.findall(r"^  ([A-Z][A-Z_]{5,}) ", text, re.MULTILINE)
                self.assertGreater(len(variables), 2)
                self.assertEqual([variable for variable in variables if variable not in page], [])
                told = re.findall(r"^  (\d)  (.*)$", text, re.MULTILINE)
                unwrapped = re.sub(r"\n +(?=[^\s\d])", " ", self.section(page, "EXIT STATUS", 1))
                shown = re.findall(r"^ +(\d) +(\S.*?) *$", unwrapped, re.MULTILINE)
                plain = [(code, words.lower().rstrip(".").replace(" (", ": ").rstrip(")")) for code, words in told]
                self.assertEqual([(code, words.lower().rstrip(".")) for code, words in shown], plain)

    def test_the_page_of_the_protocol_says_what_the_document_says(self):
        names = re.compile(r"\b(?:[A-Za-z]*_\w+|0x[0-9A-Fa-f]+)\b")
        document = (self.source / "docs/protocol.md").read_text(encoding="utf-8")
        text = re.sub(r"\]\([^)]*\)", "]", document)  # of links, the text
        wanted = set(names.findall(text))
        self.assertGreater(len(wanted), 100)
        self.assertEqual(wanted - set(names.findall(self.page("keymaster-protocol"))), set())

    def test_the_page_of_the_state_folder_names_every_file_and_setting(self):
        document = (self.source / "docs/hosted-tee.md").read_text(encoding="utf-8")
        chapter = document.partition("## The state folder\n")[2].partition("\n## ")[0]
        first_cells = re.findall(r"^\| (`[^|]*) \|", chapter, re.MULTILINE)
        names = {name for cell in first_cells for name in re.findall(r"`([^`]+)`", cell)}
        self.assertGreater(len(names), 12)
        page = self.page("keymaster-state")
        self.assertEqual({name for name in names if name not in page}, set())

    def test_the_page_of_teed_lists_every_switch_and_no_other(self):
        (_, _, switches), = self.tree("teed")
        self.assertEqual(self.listed_switches(self.section(self.page("teed"), "OPTIONS", 1)), switches)

    def test_the_pages_are_clean(self):
        pages = sorted(self.prefix.glob("share/man/man?/*"))
        self.assertGreaterEqual({page.name for page in pages}, {"kmctl.1", "keymaster-state.5", "keymaster-protocol.7"})
        for page in pages:
            warnings = run("man", "--warnings", "-l", "-Tutf8", page, MANWIDTH="80", LC_ALL="C.UTF-8").stdout
            self.assertEqual([line for line in warnings.splitlines() if "warning" in line], [], page.name)
            if shutil.which("mandoc"):
                self.assertEqual(run("mandoc", "-T", "lint", "-W", "warning", page, check=False).stdout, "", page.name)

    def offered_by_bash(self, program, *words):
        script = (f"source '{self.prefix}/share/bash-completion/completions/{program}'\n"
                  f"COMP_WORDS=({' '.join(repr(word) for word in (program, *words))})\nCOMP_CWORD={len(words)}\n"
                  f"compopt() {{ :; }}\n_{program}\n"
                  "printf '%s\\n' \"${COMPREPLY[@]}\"")
        return set(run("bash", "--norc", "-c", script, cwd=self.folder).stdout.split())

    def offered_by_fish(self, program, *words):
        script = (f"source {self.prefix}/share/fish/vendor_completions.d/{program}.fish\n"
                  f"complete -C '{' '.join((program, *words))}'")
        lines = run("fish", "--no-config", "-c", script, cwd=self.folder, HOME=str(self.folder)).stdout.splitlines()
        return {line.split("\t")[0] for line in lines}

    def offered_by_zsh(self, program, *words):
        """The entries that the function of a command hands to the shell."""
        function = "_" + "_".join((program, *words)).replace("-", "_")
        script = (f"source {self.prefix}/share/zsh/site-functions/_{program}\n"
                  "_arguments() { print -l -- \"$@\"; state=command }\n"
                  "_describe() { print -l -- \"${sub_commands[@]/#/=}\" }\n"
                  f"{function}")
        lines = run("zsh", "-f", "-c", script).stdout.splitlines()
        switches = {re.sub(r"^\([^)]*\)", "", line).partition("[")[0] for line in lines}
        return ({name for name in switches if name.startswith("-") and len(name) > 1 and name not in ("-C", "-s")},
                {line[1:].partition(":")[0] for line in lines if line.startswith("=")})

    def hold(self, name, offered):
        tree = self.tree(name)
        general = tree[0][2]
        for words, commands, switches in tree:
            with self.subTest(command=words):
                self.assertEqual(offered(name, *words, "-") | offered(name, *words, "--"), switches | general)
                if commands:
                    self.assertEqual(offered(name, *words, ""), set(commands))

    def test_bash_offers_every_switch_and_sub_command_and_no_other(self):
        for name in self.installed():
            with self.subTest(program=name):
                self.hold(name, self.offered_by_bash)

    @unittest.skipIf(shutil.which("fish") is None, "fish is not installed")
    def test_fish_offers_every_switch_and_sub_command_and_no_other(self):
        for name in self.installed():
            with self.subTest(program=name):
                self.hold(name, self.offered_by_fish)

    @unittest.skipIf(shutil.which("zsh") is None, "zsh is not installed")
    def test_zsh_is_told_of_every_switch_and_sub_command_and_no_other(self):
        for name in self.installed():
            with self.subTest(program=name):
                tree = self.tree(name)
                for words, commands, switches in tree:
                    offered, below = self.offered_by_zsh(name, *words)
                    self.assertEqual(offered, switches | tree[0][2], words)
                    self.assertEqual(below, set(commands), words)

    def test_the_words_and_files_that_a_switch_takes_are_offered(self):
        (self.folder / "key.blob").touch()
        (self.folder / "folder").mkdir()
        shells = [self.offered_by_bash] + ([self.offered_by_fish] if shutil.which("fish") else [])
        for offered in shells:
            with self.subTest(shell=offered.__name__):
                self.assertEqual(offered("kmctl", "generate", "--algorithm", ""), {"rsa", "ec", "aes", "hmac"})
                self.assertEqual(offered("kmctl", "--trace", "e"), {"error"})
                self.assertIn("sha-1,sha-512", offered("kmctl", "generate", "--digest", "sha-1,sha-5"))
                self.assertIn("key.blob", offered("kmctl", "sign", "k"))
                self.assertIn("key.blob", offered("kmctl", "sign", "key.blob", "--output", "k"))
                self.assertEqual({word.rstrip("/") for word in offered("kmctl", "--state", "")}, {"folder"})
                # The value of a switch is not a sub-command, and a switch behind a value is one.
                self.assertIn("--signer", offered("kmctl", "--state", "sign", "statement", "verify", "--sig"))
                self.assertEqual(offered("kmctl", "finger", "touch", "k"), set())


if __name__ == "__main__":
    install_case.main(__doc__)
