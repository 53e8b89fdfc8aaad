"""What the tests of kmctl share: a folder and a device for each test, kmctl and openssl as functions."""

import json
import os
import subprocess
import sys
import tempfile
import time
import unittest

DONE, FAILURE, USAGE, TEE_ERROR, KEYMASTER, NO_CONNECTION, INVALID = range(7)

# Whether kmctl runs under emulation, where 2048 bits take three seconds and 4096 half a minute: then fewer keys are
# made, and shorter ones.
EMULATED = "KEYMASTER_EMULATED" in os.environ
LONG_KEY = "2048" if EMULATED else "4096"  # the size of an RSA key whose generation takes a while
ANY_KEY = ["--size", "1024"] if EMULATED else []  # options for an RSA key whose size does not matter

# The words of kmctl and of openssl for the same digest.
DIGESTS = {"md5": "md5", "sha-1": "sha1", "sha-224": "sha224", "sha-256": "sha256", "sha-384": "sha384",
           "sha-512": "sha512"}


def openssl(*arguments, data=None, check=True):
    return subprocess.run(["openssl", *arguments], input=data, capture_output=True, check=check)


class Servers:
    """One teed for each device, where tests are to meet their devices through servers."""

    program = os.environ.get("KMCTL_THROUGH")  # teed

    def __init__(self, folder):
        self.folder = folder
        self.started, self.sockets = {}, 0
        self.ended_well = True

    def socket_of(self, state):
        """The socket of a device's server, which is started when it is first asked for."""
        if state not in self.started:
            self.sockets += 1
            socket = os.path.join(self.folder, f"{self.sockets}.sock")
            server = subprocess.Popen([self.program, "--state", state, "--socket", socket], stdout=subprocess.DEVNULL,
                                      stderr=subprocess.DEVNULL)
            self.started[state] = server, socket
            while not os.path.exists(socket) and server.poll() is None:
                time.sleep(0.01)
        return self.started[state][1]

    def end_below(self, folder):
        """Ends the servers of devices below a folder, which is to be removed; of all devices when it is empty."""
        for state in [state for state in self.started if state.startswith(folder + os.sep)]:
            server, _ = self.started.pop(state)
            server.terminate()
            self.ended_well = server.wait() == 0 and self.ended_well


embedded_only = unittest.skipIf(Servers.program, "about the state folder, which is the server's")


class KmctlTest(unittest.TestCase):
    program = ""  # kmctl
    servers = None  # if devices are met through servers
    shared_state = None  # a device that tests may share which only need some device

    def setUp(self):
        folder = tempfile.TemporaryDirectory(prefix="kmctl-test-")
        self.addCleanup(folder.cleanup)
        self.folder = folder.name
        if self.servers:
            self.addCleanup(self.servers.end_below, self.folder)
        self.state = self.shared_state
        self.data = self.write("letter.txt", b"Dear reader,\n" * 20000)  # several chunks of 64 KiB

    def path(self, name):
        return os.path.join(self.folder, name)

    def write(self, name, content):
        with open(self.path(name), "wb") as file:
            file.write(content)
        return self.path(name)

    def read(self, name):
        with open(self.path(name), "rb") as file:
            return file.read()

    def environment(self, **extra):
        kept = {k: v for k, v in os.environ.items() if not k.startswith("KEYMASTER_") or k == "KEYMASTER_TA_PATH"}
        # A sanitizer's finding must not pass for an exit code of kmctl.
        findings = {"ASAN_OPTIONS": "exitcode=99", "UBSAN_OPTIONS": "exitcode=99", "LSAN_OPTIONS": "exitcode=99"}
        device = {"KEYMASTER_STATE": self.state}
        if self.servers:
            device = {"KEYMASTER_TEE": "unix:" + self.servers.socket_of(self.state)}
        return {**kept, **findings, **device, **extra}

    def kmctl(self, *arguments, expect=DONE, data=b"", **extra):
        """Runs kmctl and asserts its exit code."""
        result = subprocess.run([self.program, *arguments], input=data, capture_output=True, env=self.environment(**extra),
                                cwd=self.folder, check=False)
        self.assertEqual(result.returncode, expect, f"kmctl {arguments}: {result.stdout!r} {result.stderr!r}")
        if expect not in (DONE,) and "--json" not in arguments:
            self.assertTrue(result.stderr, f"kmctl {arguments} failed without a word")
        return result

    def json(self, *arguments, **how):
        return json.loads(self.kmctl(*arguments, "--json", **how).stdout)

    def generate(self, *arguments, name="key.blob"):
        own_choice = {"--algorithm", "--size", "--soter"} & set(arguments)
        self.kmctl("generate", *([] if own_choice else ANY_KEY), *arguments, self.path(name))
        return self.path(name)

    def public_key(self, blob, name="public.pem"):
        self.kmctl("export", blob, "-o", self.path(name))
        return self.path(name)

    def flipped(self, source, offset, name):
        content = bytearray(self.read(source))
        content[offset] ^= 1
        return self.write(name, bytes(content))

    def assert_folder_holds(self, *names):
        """Nothing is left behind but these, and what setUp made."""
        self.assertEqual(sorted(os.listdir(self.folder)), sorted([*names, "letter.txt"]))

    def assert_no_device(self, why=None):
        """Nothing has asked for the device yet. A server is there before it is asked."""
        if not self.servers:
            self.assertFalse(os.path.exists(self.state), why)


def main(usage):
    """Runs the tests of the calling script: SCRIPT KMCTL [unittest arguments]."""
    if len(sys.argv) < 2:
        sys.exit(usage)
    KmctlTest.program = os.path.abspath(sys.argv.pop(1))
    with tempfile.TemporaryDirectory(prefix="kmctl-device-") as folder:
        KmctlTest.shared_state = os.path.join(folder, "state")
        KmctlTest.servers = Servers(folder) if Servers.program else None
        result = unittest.main(argv=sys.argv, verbosity=1, exit=False).result
        if KmctlTest.servers:
            KmctlTest.servers.end_below("")
            if not KmctlTest.servers.ended_well:
                sys.exit("a server did not end as it should")
        sys.exit(not result.wasSuccessful())
