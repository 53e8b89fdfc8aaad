#!/usr/bin/env python3
"""The first client does what it says, and says what went wrong.

usage: example_test.py FIRST_CLIENT TEED
"""
import os
import pathlib
import subprocess
import sys
import tempfile
import time
import unittest


class FirstClient(unittest.TestCase):
    program = teed = ""

    def setUp(self):
        folder = tempfile.TemporaryDirectory(prefix="first-client-")
        self.addCleanup(folder.cleanup)
        self.folder = pathlib.Path(folder.name)
        self.message = self.folder / "message"
        self.message.write_bytes(b"Dear reader,\n" * 20000)

    def environment(self, tee=None):
        kept = {name: value for name, value in os.environ.items() if not name.startswith("KEYMASTER_")
                or name == "KEYMASTER_TA_PATH"}
        return {**kept, "KEYMASTER_TEE": tee or f"embedded:{self.folder / 'state'}", "ASAN_OPTIONS": "exitcode=99"}

    def run_client(self, *arguments, tee=None):
        return subprocess.run([self.program, *(str(word) for word in arguments)], env=self.environment(tee), text=True,
                              capture_output=True, check=False, cwd=self.folder)

    def assert_verified(self, signature, public_key):
        judge = subprocess.run(["openssl", "dgst", "-sha256", "-verify", public_key, "-keyform", "DER", "-signature",
                                signature, "message"], cwd=self.folder, check=False, stdout=subprocess.DEVNULL)
        self.assertEqual(judge.returncode, 0)

    def assert_fails(self, words, *arguments, tee=None):
        told = self.run_client(*arguments, tee=tee)
        self.assertEqual(told.returncode, 1, told.stderr)
        self.assertRegex(told.stderr, f"^first_client: {words}")

    def test_openssl_verifies_what_it_signed(self):
        for content in (self.message.read_bytes(), b"", bytes(65536), bytes(65537)):
            self.message.write_bytes(content)
            told = self.run_client("message", "signature", "public.der")
            self.assertEqual((told.returncode, told.stderr), (0, ""))
            self.assertRegex(told.stdout, r"^algorithms: 1 32 3 128\na key, sealed: \d{4} bytes\n"
                                          r"signature: 256 bytes\npublic.der: 294 bytes\n$")
            self.assert_verified("signature", "public.der")

    def test_several_at_once_do_the_same_through_a_server(self):
        place = self.folder / "tee.sock"
        server = subprocess.Popen([self.teed, "--state", self.folder / "state", "--socket", place],
                                  env=self.environment(), stderr=subprocess.DEVNULL)
        self.addCleanup(server.kill)
        while not place.exists():
            self.assertIsNone(server.poll(), "the server has ended")
            time.sleep(0.01)
        numbers = range(6)
        clients = [subprocess.Popen([self.program, "message", f"signature{i}", f"public{i}.der"], cwd=self.folder, text=True,
                                    env=self.environment(f"unix:{place}"), stdout=subprocess.PIPE,
                                    stderr=subprocess.STDOUT) for i in numbers]
        for i, client in zip(numbers, clients):
            told, _ = client.communicate()
            self.assertEqual(client.returncode, 0, told)
            self.assertIn(f"signature{i}: 256 bytes\n", told)
            self.assert_verified(f"signature{i}", f"public{i}.der")
        server.terminate()
        self.assertEqual(server.wait(), 0)

    def test_it_says_what_it_cannot_read_or_write(self):
        self.assert_fails("usage: first_client FILE SIGNATURE PUBLIC_KEY\n")
        self.assert_fails("missing can't be read\n", "missing", "signature", "public.der")
        self.assert_fails("no/signature can't be written\n", "message", "no/signature", "public.der")

    def test_it_says_why_there_is_no_tee(self):
        self.assert_fails("no TEE: result 0xffff0006", "message", "signature", "public.der", tee="elsewhere:state")

    def test_it_says_who_has_no_such_ta(self):
        os.environ["KEYMASTER_TA_PATH"], before = str(self.folder), os.environ.get("KEYMASTER_TA_PATH")
        try:
            self.assert_fails("no session: result 0xffff0008 from origin 3\n", "message", "signature", "public.der")
        finally:
            os.environ.pop("KEYMASTER_TA_PATH")
            if before is not None:
                os.environ["KEYMASTER_TA_PATH"] = before


if __name__ == "__main__":
    FirstClient.program, FirstClient.teed = os.path.abspath(sys.argv.pop(1)), os.path.abspath(sys.argv.pop(1))
    unittest.main(verbosity=1)
