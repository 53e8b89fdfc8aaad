#!/usr/bin/env python3
"""The units of teed are sound, their sandbox is as tight as the documents say, and the hosted TEE runs in it.

usage: units_test.py SOURCE KMCTL TEED
"""
import ctypes
import os
import pathlib
import re
import shutil
import subprocess
import sys
import tempfile
import unittest

PR_SET_MDWE, PR_MDWE_REFUSE_EXEC_GAIN = 65, 1
SCORE = re.compile(r"Overall exposure level for teed\.service: (\d+\.\d+)")


def refuse_executable_memory():
    """What MemoryDenyWriteExecute= does, as the kernel itself offers it."""
    if ctypes.CDLL(None, use_errno=True).prctl(PR_SET_MDWE, PR_MDWE_REFUSE_EXEC_GAIN, 0, 0, 0) != 0:
        raise OSError(ctypes.get_errno(), "PR_SET_MDWE")


def kernel_can_refuse():
    child = os.fork()
    if child == 0:
        try:
            refuse_executable_memory()
        except OSError:
            os._exit(1)
        os._exit(0)
    return os.waitpid(child, 0)[1] == 0


class Units(unittest.TestCase):
    source = kmctl = teed = None

    def setUp(self):
        folder = tempfile.TemporaryDirectory(prefix="keymaster-units-")
        self.addCleanup(folder.cleanup)
        self.folder = pathlib.Path(folder.name)
        units = self.source / "packaging/systemd"
        service = (units / "teed.service.in").read_text(encoding="utf-8")
        service = re.sub(r"@CMAKE_INSTALL_FULL_BINDIR@/teed", "/bin/true", service)
        service = service.replace("@CMAKE_INSTALL_FULL_LIBDIR@", "/usr/lib")
        self.assertFalse("@CMAKE" in service, "a place of the template is not filled")
        (self.folder / "teed.service").write_text(service, encoding="utf-8")
        shutil.copy(units / "teed.socket", self.folder)

    def analyze(self, *arguments):
        return subprocess.run(["systemd-analyze", *arguments], text=True, check=False, stdout=subprocess.PIPE,
                              stderr=subprocess.STDOUT)

    @unittest.skipIf(shutil.which("systemd-analyze") is None, "systemd is not installed")
    def test_systemd_finds_no_fault_in_the_units(self):
        told = self.analyze("verify", "--man=no", self.folder / "teed.socket", self.folder / "teed.service")
        self.assertEqual((told.returncode, told.stdout), (0, ""))

    def test_whatever_names_the_socket_names_the_one_of_the_unit(self):
        place = re.search(r"^ListenSequentialPacket=(.*)$", (self.folder / "teed.socket").read_text(encoding="utf-8"),
                          re.MULTILINE).group(1)
        named = set()
        for file in (*self.source.glob("docs/*.md"), *self.source.glob("packaging/man/*"),
                     *self.source.glob("client/kmctl/*.cpp"), self.source / "README.md"):
            named.update(re.findall(r"/run/keymaster/[\w.]*\w", file.read_text(encoding="utf-8")))
        self.assertEqual(named, {place})

    @unittest.skipIf(shutil.which("systemd-analyze") is None, "systemd is not installed")
    def test_the_exposure_is_what_the_document_says(self):
        told = self.analyze("security", "--offline=true", "--threshold=10", self.folder / "teed.service")
        self.assertEqual(told.returncode, 0, told.stdout)
        score = SCORE.search(told.stdout).group(1)
        document = (self.source / "docs/installing.md").read_text(encoding="utf-8")
        self.assertEqual(re.findall(r"exposure level of \*\*(\d+\.\d+)\*\*", document), [score], told.stdout)

    def test_clients_cannot_share_so_much_that_the_service_is_killed_for_it(self):
        service = (self.folder / "teed.service").read_text(encoding="utf-8")
        command = re.search(r"^ExecStart=(.*)$", service, re.MULTILINE).group(1)
        self.assertNotIn("--max-", command, "the usual limits are what counts below")
        allowed = int(re.search(r"^MemoryMax=(\d+)G$", service, re.MULTILINE).group(1)) * 1024
        told = " ".join(subprocess.run([self.teed, "--help"], text=True, check=True, stdout=subprocess.PIPE).stdout.split())
        shared = re.search(r"--max-memory \S+ [^()]*all together have four times as much \(default: (\d+)\)", told)
        connections = re.search(r"--max-connections \S+ [^()]*\(default: (\d+)\)", told)
        used = 4 * int(shared.group(1)) + int(connections.group(1)) // 2  # a connection costs less than 512 KiB
        self.assertLessEqual(used + 256, allowed)  # and the program with its trusted applications

    @unittest.skipIf(not kernel_can_refuse(), "the kernel has no PR_SET_MDWE")
    def test_images_are_loaded_where_no_memory_may_become_executable(self):
        for words in (("generate", "--algorithm", "ec", self.folder / "key"), ("device", "status")):
            told = subprocess.run([self.kmctl, "--state", self.folder / "state", *words], text=True, check=False,
                                  stdout=subprocess.PIPE, stderr=subprocess.STDOUT, preexec_fn=refuse_executable_memory)
            self.assertEqual(told.returncode, 0, told.stdout)
        writes_and_runs = "import mmap; mmap.mmap(-1, 4096, prot=mmap.PROT_WRITE | mmap.PROT_EXEC)"
        with self.assertRaises(subprocess.CalledProcessError):  # and the refusal is a real one
            subprocess.run([sys.executable, "-c", writes_and_runs], check=True, stderr=subprocess.DEVNULL,
                           preexec_fn=refuse_executable_memory)


if __name__ == "__main__":
    if len(sys.argv) < 4:
        sys.exit(__doc__)
    Units.source, Units.kmctl, Units.teed = pathlib.Path(sys.argv[1]), sys.argv[2], sys.argv[3]
    unittest.main(argv=[sys.argv[0], *sys.argv[4:]], verbosity=1)
