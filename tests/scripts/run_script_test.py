#!/usr/bin/env python3
"""./run builds and shows kmctl at work on the right file, and tools/prepare.sh installs what is missing."""
import os
import pathlib
import shutil
import subprocess
import sys
import tempfile
import unittest

PROJECT = pathlib.Path(sys.argv.pop(1))

# What the script runs, each leaving a line in `calls`.
STAND_IN = """#!/bin/sh
name=%(name)s
echo "$name $*" >>"$CALLS"
%(says)s
case " $FAILING " in *" $name "*) echo "$name is broken" >&2; exit 1 ;; esac
"""

# A package is installed when it is listed in INSTALLED, or when everything is.
DPKG = """
for package; do :; done
case " $INSTALLED " in *" $package "*|*" everything "*) printf installed ;; *) exit 1 ;; esac
"""

# The first configuration leaves this file behind.
CMAKE = """
case "$*" in *--preset\\ *\\ -D*) mkdir -p "build/$2" && : >"build/$2/build.ninja" ;; esac
"""

# The tools that the scripts take from the system: a PATH of these alone has no apt-get, sudo or network client.
SYSTEM_TOOLS = ("bash", "sh", "cat", "dirname", "readlink", "mktemp", "rm", "mkdir", "tr", "env", "id")


class ScriptTest(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.folder = pathlib.Path(folder.name).resolve()
        self.tree = self.folder / "the tree"
        self.calls = self.folder / "calls"
        self.programs = self.folder / "bin"
        (self.tree / "tools").mkdir(parents=True)
        shutil.copy(PROJECT / "run", self.tree)
        shutil.copy(PROJECT / "tools" / "prepare.sh", self.tree / "tools")
        (self.tree / "README.md").write_text("read me")
        self.programs.mkdir()
        for tool in SYSTEM_TOOLS:
            (self.programs / tool).symlink_to(shutil.which(tool))
        self.stand_in(self.programs / "dpkg-query", DPKG)
        self.stand_in(self.programs / "cmake", CMAKE)
        self.stand_in(self.programs / "apt-get")
        self.stand_in(self.programs / "id", "echo ${USER_ID:-0}")
        self.stand_in(self.tree / "build/release/client/kmctl/kmctl", "echo shown")
        self.stand_in(self.tree / "build/arm/emulated/kmctl", "echo shown on ARM")
        self.stand_in(self.tree / "tools/arm-sysroot")

    def stand_in(self, path, says=""):
        path.parent.mkdir(parents=True, exist_ok=True)
        path.unlink(missing_ok=True)
        path.write_text(STAND_IN % {"name": path.name, "says": says})
        path.chmod(0o755)

    def start(self, *command, cwd=None, installed="everything", failing="", user=0):
        self.calls.write_text("")
        environment = dict(PATH=str(self.programs), CALLS=str(self.calls), FAILING=failing, INSTALLED=installed,
                           USER_ID=str(user), TMPDIR=str(self.folder))
        return subprocess.run(command, cwd=cwd or self.tree, env=environment, capture_output=True, text=True, check=False)

    def called(self, name):
        return [line for line in self.calls.read_text().splitlines() if line.startswith(name + " ")]


class RunScript(ScriptTest):
    def demo(self, *arguments, cwd=None):
        """Runs ./run to a good end, and gives FOLDER and FILE of the demo."""
        result = self.start(self.tree / "run", *arguments, cwd=cwd)
        self.assertEqual((result.returncode, result.stderr), (0, ""))
        self.assertTrue(result.stdout.endswith("shown\n"))
        words = self.called("kmctl")[0].removeprefix("kmctl demo --force --output ")
        return tuple(words.split(" -- "))

    def test_the_file_is_the_readme_unless_one_is_named(self):
        self.assertEqual(self.demo(), ("build/demo", "README.md"))
        (self.tree / "letter").write_text("Dear Mary")
        self.assertEqual(self.demo("letter"), ("build/demo", "letter"))
        self.assertEqual(self.demo(str(self.tree / "letter")), ("build/demo", str(self.tree / "letter")))

    def test_from_another_folder_every_path_is_good_there(self):
        elsewhere = self.folder / "else where"
        elsewhere.mkdir()
        (elsewhere / "letter").write_text("Dear Mary")
        demo = str(self.tree / "build/demo")
        self.assertEqual(self.demo(cwd=elsewhere), (demo, str(self.tree / "README.md")))
        self.assertEqual(self.demo("letter", cwd=elsewhere), (demo, str(elsewhere / "letter")))
        self.assertEqual(self.demo(str(elsewhere / "letter"), cwd=elsewhere), (demo, str(elsewhere / "letter")))

    def test_a_link_to_the_script_finds_the_tree(self):
        (self.folder / "link").symlink_to(self.tree / "run")
        result = self.start(self.folder / "link", cwd=self.folder)
        self.assertEqual(result.returncode, 0, result.stderr)

    def test_a_name_that_looks_like_an_option_is_a_file(self):
        (self.tree / "-x").write_text("odd")
        self.assertEqual(self.demo("-x"), ("build/demo", "-x"))

    def test_a_file_that_is_not_there_is_told_before_anything_is_built(self):
        for name in ("none", "/none", "."):
            result = self.start(self.tree / "run", name)
            self.assertEqual((result.returncode, result.stdout), (1, ""))
            self.assertIn(f"{name} is not a file that can be read\n", result.stderr)
            self.assertEqual(self.calls.read_text(), "")

    def test_help_and_wrong_usage(self):
        for arguments, status in ((["--help"], 0), (["-h"], 0), (["a", "b"], 2)):
            result = self.start(self.tree / "run", *arguments)
            self.assertEqual(result.returncode, status)
            self.assertTrue(result.stdout.startswith("usage: ./run [--arm] [FILE]\n"))
            self.assertEqual(self.calls.read_text(), "")

    def test_it_is_configured_once_and_built_each_time(self):
        self.demo()
        self.assertEqual(self.called("cmake"), [
            "cmake --preset release -DKEYMASTER_TESTS=OFF -DKEYMASTER_BENCH=OFF",
            "cmake --build --preset release --target kmctl trusted_applications"])
        self.demo()
        self.assertEqual(self.called("cmake"), ["cmake --build --preset release --target kmctl trusted_applications"])
        self.assertEqual(self.called("apt-get"), [])

    def test_on_arm_it_takes_the_libraries_the_build_and_the_folder_of_arm(self):
        result = self.start(self.tree / "run", "--arm")
        self.assertEqual((result.returncode, result.stderr), (0, ""))
        self.assertTrue(result.stdout.endswith("shown on ARM\n"))
        self.assertEqual(len(self.called("arm-sysroot")), 1)
        self.assertEqual(self.called("cmake"), [
            "cmake --preset arm -DKEYMASTER_TESTS=OFF -DKEYMASTER_BENCH=OFF",
            "cmake --build --preset arm --target kmctl trusted_applications"])
        self.assertEqual(self.called("kmctl"), ["kmctl demo --force --output build/demo-arm -- README.md"])
        (self.tree / "letter").write_text("Dear Mary")
        self.start(self.tree / "run", "--arm", "letter")
        self.assertEqual(self.called("kmctl"), ["kmctl demo --force --output build/demo-arm -- letter"])

    def test_a_failure_stops_it_and_is_shown(self):
        for failing in ("cmake", "kmctl"):
            result = self.start(self.tree / "run", failing=failing)
            self.assertEqual(result.returncode, 1)
            self.assertIn(f"{failing} is broken", result.stderr)
            self.assertEqual(len(self.called("kmctl")), 1 if failing == "kmctl" else 0)

    def test_nothing_is_built_when_a_package_cannot_be_had(self):
        result = self.start(self.tree / "run", installed="", failing="apt-get")
        self.assertEqual(result.returncode, 1)
        self.assertIn("Nothing was built.\n", result.stderr)
        self.assertEqual(self.called("cmake") + self.called("kmctl"), [])


class Prepare(ScriptTest):
    def install(self, *packages, function="install_packages", **how):
        script = "set -euo pipefail; source tools/prepare.sh; function=$1; shift; $function \"$@\"; echo done"
        return self.start(self.programs / "bash", "-c", script, "bash", function, *packages, **how)

    def test_what_is_installed_needs_no_network(self):
        result = self.install("one", "two", installed="one two", user=1000)
        self.assertEqual((result.returncode, result.stdout), (0, "done\n"))
        self.assertEqual(self.called("apt-get"), [])

    def test_only_what_is_missing_is_installed(self):
        result = self.install("one", "two", "three", installed="two")
        self.assertEqual((result.returncode, result.stdout), (0, "Installing: one three\ndone\n"))
        update, install = self.called("apt-get")
        self.assertTrue(update.endswith(" update"))
        self.assertTrue(install.endswith(" install --no-install-recommends -y one three"))

    def test_root_is_asked_of_sudo(self):
        self.stand_in(self.programs / "sudo", 'shift; "$@" || exit')
        self.assertEqual(self.install("one", installed="", user=1000).returncode, 0)
        self.assertEqual(len(self.called("sudo")), 2)
        self.assertEqual(len(self.called("apt-get")), 2)

    def test_without_sudo_the_command_is_told(self):
        result = self.install("one", "two", installed="", user=1000)
        self.assertEqual(result.returncode, 1)
        self.assertIn("As root, run:\n  apt-get install --no-install-recommends one two\n", result.stderr)
        self.assertIn("Nothing was built.\n", result.stderr)
        self.assertEqual(self.called("apt-get"), [])

    def test_another_system_is_told_what_it_needs(self):
        (self.programs / "apt-get").unlink()
        result = self.install("one", installed="")
        self.assertEqual(result.returncode, 1)
        self.assertIn("Not a Debian system. Install these yourself: one\n", result.stderr)

    def test_a_package_manager_is_heard_when_it_fails(self):
        self.stand_in(self.programs / "apt-get", 'case "$*" in *install*) echo "no such package"; exit 100 ;; esac')
        result = self.install("one", installed="")
        self.assertEqual(result.returncode, 1)
        self.assertIn("no such package", result.stderr)
        tried = self.install("one", installed="", function="! try_install_packages")
        self.assertNotIn("Nothing was built", tried.stderr)

    def test_nothing_stays_in_the_temporary_folder(self):
        self.install("one", installed="")
        self.install("one", installed="", failing="apt-get")
        self.assertEqual(sorted(p.name for p in self.folder.iterdir()), ["bin", "calls", "the tree"])


if __name__ == "__main__":
    unittest.main()
