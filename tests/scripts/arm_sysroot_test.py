"""Runs tools/arm-sysroot with stand-ins for apt-get and the cross compiler: what it leaves alone, and what it says.

usage: arm_sysroot_test.py TOOL
"""
import os
import pathlib
import re
import subprocess
import sys
import tempfile
import unittest


class ArmSysroot(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.root = pathlib.Path(folder.name)
        self.sysroot, self.programs = self.root / "sysroot", self.root / "bin"
        self.programs.mkdir()
        self.stand_in("arm-linux-gnueabihf-gcc", f"echo {self.root}/toolchain/libc.so.6")
        self.stand_in("apt-get", "exit 1")

    def stand_in(self, name, says):
        program = self.programs / name
        program.write_text(f'#!/bin/sh\necho "{name} $*" >>{self.root}/calls\n{says}\n')
        program.chmod(0o755)

    def run_tool(self, *arguments):
        return subprocess.run([TOOL, *arguments], env={**os.environ, "PATH": f"{self.programs}:{os.environ['PATH']}"},
                              capture_output=True, text=True, check=False)

    def calls(self):
        file = self.root / "calls"
        return file.read_text() if file.exists() else ""

    def test_a_folder_that_holds_something_else_is_left_alone(self):
        self.sysroot.mkdir()
        (self.sysroot / "letter").write_text("Dear Mary")
        result = self.run_tool(str(self.sysroot))
        self.assertEqual((result.returncode, result.stdout), (1, ""))
        self.assertIn("holds something else: nothing is changed.", result.stderr)
        self.assertEqual((self.sysroot / "letter").read_text(), "Dear Mary")
        self.assertEqual(self.calls(), "")

    def test_a_complete_folder_asks_nobody(self):
        listed = re.search(r"packages=\(\n(.*?)\n\)", pathlib.Path(TOOL).read_text(), re.DOTALL).group(1).split()
        self.sysroot.mkdir()
        (self.sysroot / "packages").write_text(" ".join(listed) + "\n")
        self.assertEqual(self.run_tool(str(self.sysroot)).returncode, 0)
        self.assertEqual(self.calls(), "")

    def test_what_cannot_be_fetched_is_told_and_leaves_nothing(self):
        result = self.run_tool(str(self.sysroot))
        self.assertEqual(result.returncode, 1)
        self.assertIn("The ARM packages cannot be fetched.", result.stderr)
        self.assertEqual(sorted(path.name for path in self.root.iterdir()), ["bin", "calls"])

    def test_what_is_fetched_is_unpacked_without_the_systems_apt(self):
        self.stand_in("apt-get", 'case " $* " in *" download "*) : >a.deb ;; esac')
        self.stand_in("dpkg", 'mkdir -p "$3/usr" && : >"$3/usr/unpacked"')
        (self.root / "toolchain").mkdir()
        (self.root / "toolchain/ld-linux-armhf.so.3").touch()
        result = self.run_tool(str(self.sysroot))
        self.assertEqual((result.returncode, result.stderr), (0, ""))
        self.assertTrue((self.sysroot / "usr/unpacked").exists())
        self.assertTrue((self.sysroot / "lib/ld-linux-armhf.so.3").is_symlink())
        for call in self.calls().splitlines():
            if call.startswith("apt-get"):
                self.assertIn("APT::Architecture=armhf", call)
                self.assertIn(f"Dir::State={self.root}/sysroot.", call)
                self.assertIn(f"Dir::Cache={self.root}/sysroot.", call)
        self.assertEqual(self.run_tool(str(self.sysroot)).returncode, 0)
        self.assertEqual(self.calls().count("apt-get"), 2, "the second time nobody is asked")


if __name__ == "__main__":
    TOOL = str(pathlib.Path(sys.argv[1]).resolve())
    unittest.main(argv=sys.argv[:1], verbosity=2)
