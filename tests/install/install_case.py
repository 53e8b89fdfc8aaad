"""What the tests of an installation share: a fresh prefix, moved away from where it was installed to."""

import os
import pathlib
import shutil
import subprocess
import sys
import tempfile
import unittest


def run(*command, cwd=None, check=True, **environment):
    """Runs a command as a user would who never saw the build: no variable of the project, no search path."""
    plain = {name: value for name, value in os.environ.items()
             if not name.startswith(("KEYMASTER_", "LD_", "PKG_CONFIG", "CMAKE_"))}
    done = subprocess.run([str(word) for word in command], cwd=cwd, env={**plain, **environment}, text=True,
                          check=False, stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
    if check and done.returncode != 0:
        raise AssertionError(f"{' '.join(str(word) for word in command)}: exit code {done.returncode}\n{done.stdout}")
    return done


class InstalledTest(unittest.TestCase):
    source = build = prefix = None  # the project, its build, and the installation

    def setUp(self):
        folder = tempfile.TemporaryDirectory(prefix="keymaster-outside-")
        self.addCleanup(folder.cleanup)
        self.folder = pathlib.Path(folder.name)

    @property
    def tee(self):
        """The name of a device of this test's own."""
        return f"embedded:{self.folder / 'state'}"


def install(build, prefix, *arguments):
    run("cmake", "--install", build, "--prefix", prefix, "--strip", *arguments)


def main(usage):
    """Runs the tests of the calling script: SCRIPT SOURCE BUILD [unittest arguments]."""
    if len(sys.argv) < 3:
        sys.exit(usage)
    InstalledTest.source, InstalledTest.build = pathlib.Path(sys.argv.pop(1)), pathlib.Path(sys.argv.pop(1))
    with tempfile.TemporaryDirectory(prefix="keymaster-install-") as folder:
        first = pathlib.Path(folder, "first")
        install(InstalledTest.build, first)
        InstalledTest.prefix = pathlib.Path(folder, "moved", "away")
        InstalledTest.prefix.parent.mkdir()
        shutil.move(first, InstalledTest.prefix)
        unittest.main(argv=sys.argv, verbosity=1)
