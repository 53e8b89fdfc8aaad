#!/usr/bin/env python3
"""./test runs everything, fails when anything failed, and says so in its last lines."""
import os
import pathlib
import shutil
import subprocess
import sys
import tempfile
import unittest

PROJECT = pathlib.Path(sys.argv.pop(1))

# What ./test runs, each leaving a line in `calls`. A stand-in fails when its name is in FAILING.
STAND_IN = """#!/bin/sh
name=%(name)s
echo "$name $* vectors=$KEYMASTER_VECTORS" >>"$CALLS"
%(says)s
case " $FAILING " in *" $name "*) exit 1 ;; esac
"""

CTEST = """
name=$name-$2
case " $FAILING " in
  *" $name "*) printf '67%% tests passed, 1 tests failed out of 3\\n\\nThe following tests FAILED:\\n'
               printf '\\t  2 - %s_that_failed (Failed)\\nErrors while running CTest\\n' "$name" ;;
  *) echo '100% tests passed, 0 tests failed out of 3' ;;
esac
"""


class TestScript(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.tree = pathlib.Path(folder.name) / "tree"
        self.calls = pathlib.Path(folder.name) / "calls"
        self.programs = pathlib.Path(folder.name) / "bin"
        (self.tree / "tools").mkdir(parents=True)
        shutil.copy(PROJECT / "test", self.tree)
        shutil.copy(PROJECT / "tools" / "prepare.sh", self.tree / "tools")
        self.stand_in(self.programs / "dpkg-query", "printf installed")
        self.stand_in(self.programs / "cmake")
        self.stand_in(self.programs / "ctest", CTEST)
        self.benchmark = self.tree / "build/release/bench/keymaster_benchmark"
        self.stand_in(self.benchmark, "echo figures")
        self.stand_in(self.tree / "fuzz/run.sh")
        self.stand_in(self.tree / "tools/arm-sysroot")

    def stand_in(self, path, says=""):
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_text(STAND_IN % {"name": path.name, "says": says})
        path.chmod(0o755)

    def run_test(self, failing="", vectors="", cwd=None):
        environment = dict(os.environ, PATH=f"{self.programs}:{os.environ['PATH']}", CALLS=str(self.calls),
                           FAILING=failing, KEYMASTER_VECTORS=vectors)
        done = subprocess.run([self.tree / "test"], cwd=cwd, env=environment, capture_output=True, text=True)
        return done.returncode, done.stdout.split("== Outcome")[-1].splitlines()[1:]

    def called(self, name):
        return [line for line in self.calls.read_text().splitlines() if line.startswith(name + " ")]

    def test_everything_passes(self):
        status, outcome = self.run_test()
        self.assertEqual(status, 0)
        self.assertEqual(outcome, [
            "passed  Benchmarks, one round",
            "passed  Fuzzing",
            "passed  Tests of release: 100% tests passed, 0 tests failed out of 3",
            "passed  Load test of release: 100% tests passed, 0 tests failed out of 3",
            "passed  Tests of asan: 100% tests passed, 0 tests failed out of 3",
            "passed  Tests of tsan: 100% tests passed, 0 tests failed out of 3",
            "passed  Tests of arm, emulated: 100% tests passed, 0 tests failed out of 3",
            "skipped Published test vectors: KEYMASTER_VECTORS names no folder"])

    def test_a_failure_keeps_nothing_from_running(self):
        for failing, line in (("keymaster_benchmark", "FAILED  Benchmarks, one round"), ("run.sh", "FAILED  Fuzzing")):
            self.calls.unlink(missing_ok=True)
            status, outcome = self.run_test(failing)
            self.assertEqual(status, 1)
            self.assertIn(line, outcome)
            self.assertEqual(len(self.called("ctest")), 5)

    def test_libraries_for_arm_that_cannot_be_had_fail_the_run(self):
        status, outcome = self.run_test("arm-sysroot")
        self.assertEqual(status, 1)
        self.assertEqual(outcome[6], "FAILED  Tests of arm, emulated")
        self.assertEqual(len(self.called("ctest")), 4)

    def test_a_compiler_for_arm_that_cannot_be_installed_fails_the_run(self):
        self.stand_in(self.programs / "dpkg-query", 'case "$*" in *g++-arm*) exit 1 ;; esac; printf installed')
        self.stand_in(self.programs / "apt-get", "exit 100")
        self.stand_in(self.programs / "id", "echo 0")
        status, outcome = self.run_test()
        self.assertEqual(status, 1)
        self.assertEqual(outcome[6], "FAILED  Tests of arm: its compiler and emulator cannot be installed here")

    def test_failed_tests_are_named(self):
        status, outcome = self.run_test("ctest-release")
        self.assertEqual(status, 1)
        self.assertEqual(outcome[2:7], [
            "FAILED  Tests of release: 67% tests passed, 1 tests failed out of 3",
            "        2 - ctest-release_that_failed (Failed)",
            "FAILED  Load test of release: 67% tests passed, 1 tests failed out of 3",
            "        2 - ctest-release_that_failed (Failed)",
            "passed  Tests of asan: 100% tests passed, 0 tests failed out of 3"])

    def test_a_failed_check_of_a_benchmark_counts(self):
        self.stand_in(self.benchmark, "echo \"name ERROR OCCURRED: 'the two signatures differ'\"")
        status, outcome = self.run_test()
        self.assertEqual(status, 1)
        self.assertIn("FAILED  Benchmarks, one round", outcome)

    def test_the_folder_of_the_vectors_is_the_callers(self):
        status, outcome = self.run_test(vectors="my vectors", cwd=self.programs)
        self.assertEqual(status, 0)
        self.assertFalse([line for line in outcome if "vectors" in line])
        for line in self.called("ctest"):
            self.assertTrue(line.endswith(f"vectors={self.programs}/my vectors"), line)
        self.calls.unlink()
        self.run_test(vectors="/elsewhere")
        self.assertTrue(self.called("ctest")[0].endswith("vectors=/elsewhere"))


if __name__ == "__main__":
    unittest.main()
