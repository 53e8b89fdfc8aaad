#!/usr/bin/env python3
"""One device, two processors: what kmctl of one build makes on a state folder, kmctl of the other uses.

usage: cross_test.py KMCTL OTHER_KMCTL

The state folder holds the secrets that blobs are sealed under, so it is what the two have in common. Each kmctl takes
the TA of its own build. Exits with 77 when there is no OTHER_KMCTL, and so nothing to compare with.
"""
import os
import struct
import subprocess
import sys
import tempfile
import unittest

DONE, TEE_ERROR, INVALID = 0, 3, 6
UID = "1000"

# Options of generate, for keys that sign or encrypt.
SIGNING = {
    "rsa": ["--size", "1024"],
    "rsa_pss": ["--size", "1024", "--padding", "pss"],
    "ec_256": ["--algorithm", "ec"],
    "ec_521": ["--algorithm", "ec", "--size", "521"],
    "hmac": ["--algorithm", "hmac"],
}
ENCRYPTING = {
    "aes_gcm": ["--algorithm", "aes"],
    "aes_cbc": ["--algorithm", "aes", "--block-mode", "cbc", "--padding", "pkcs7"],
    "aes_ctr": ["--algorithm", "aes", "--block-mode", "ctr"],
}


class Kmctl:
    def __init__(self, name, program):
        self.name, self.program, self.state = name, program, ""

    def run(self, *arguments, expect=DONE):
        environment = {name: value for name, value in os.environ.items() if not name.startswith("KEYMASTER_")}
        done = subprocess.run([self.program, *arguments], env={**environment, "KEYMASTER_STATE": self.state},
                              capture_output=True, check=False)
        if done.returncode != expect:
            raise AssertionError(f"{self.name}: kmctl {arguments}: {done.returncode}, {done.stderr.decode()}")
        return done.stdout


class Cross(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory(prefix="cross-test-")
        self.addCleanup(folder.cleanup)
        self.folder = folder.name
        self.both = [Kmctl("this build", sys.argv[1]), Kmctl("the other build", sys.argv[2])]
        for kmctl in self.both:
            kmctl.state = self.path("state")
        self.letter = self.write("letter.txt", b"Dear reader,\n" * 20000)

    def path(self, name):
        return os.path.join(self.folder, name)

    def write(self, name, content):
        with open(self.path(name), "wb") as file:
            file.write(content)
        return self.path(name)

    def read(self, path):
        with open(path, "rb") as file:
            return file.read()

    def flipped(self, path, offset):
        content = bytearray(self.read(path))
        content[offset] ^= 1
        return self.write("flipped", bytes(content))

    def ways(self, kinds):
        """A new key of each kind in both directions: the kmctl that made it, the other one, and the blob."""
        for name, options in kinds.items():
            for maker, taker in (self.both, self.both[::-1]):
                blob = self.path(f"{name}.blob")
                maker.run("generate", "--force", *options, blob)
                yield maker, taker, blob

    def test_a_blob_tells_both_the_same(self):
        for maker, taker, blob in self.ways({**SIGNING, **ENCRYPTING}):
            self.assertEqual(taker.run("characteristics", "--json", blob), maker.run("characteristics", "--json", blob))

    def test_what_one_signs_the_other_verifies_with_the_same_blob(self):
        for maker, taker, blob in self.ways(SIGNING):
            signature = self.path("signature")
            for signer, verifier in ((maker, taker), (taker, maker)):
                signer.run("sign", blob, self.letter, "-o", signature)
                verifier.run("verify", blob, signature, self.letter)
                verifier.run("verify", blob, self.flipped(signature, -1), self.letter, expect=INVALID)

    def test_both_export_the_same_public_key_and_openssl_accepts_the_signatures_of_both(self):
        for maker, taker, blob in self.ways({name: SIGNING[name] for name in ("rsa", "ec_256", "ec_521")}):
            public, signature = self.path("public.pem"), self.path("signature")
            maker.run("export", blob, "-o", public)
            self.assertEqual(taker.run("export", blob), self.read(public))
            taker.run("sign", blob, self.letter, "-o", signature)
            subprocess.run(["openssl", "dgst", "-sha256", "-verify", public, "-signature", signature, self.letter],
                           check=True, capture_output=True)

    def test_what_one_encrypts_the_other_decrypts_with_the_same_blob(self):
        for maker, taker, blob in self.ways(ENCRYPTING):
            for sender, receiver in ((maker, taker), (taker, maker)):
                sender.run("encrypt", blob, self.letter, "-o", self.path("ciphertext"))
                receiver.run("decrypt", blob, self.path("ciphertext"), "-o", self.path("text"))
                self.assertEqual(self.read(self.path("text")), self.read(self.letter))

    def test_a_changed_blob_is_refused_on_either_side(self):
        for _, taker, blob in self.ways({"ec_256": SIGNING["ec_256"]}):
            taker.run("export", self.flipped(blob, -1), expect=TEE_ERROR)

    def test_a_blob_does_not_open_on_another_device(self):
        for _, taker, blob in self.ways({"ec_256": SIGNING["ec_256"]}):
            taker.run("export", blob)
            taker.state = self.path("other")
            taker.run("export", blob, expect=TEE_ERROR)
            taker.state = self.path("state")

    def test_a_statement_of_one_is_believed_by_the_other_and_their_counter_is_one(self):
        record = self.path("record.json")
        self.both[0].run("device", "provision", "--record", record)
        counters = []
        for maker, taker, blob in self.ways({"attested": ["--soter", "--counted", "--uid", UID]}):
            self.assertEqual(taker.run("attest", "export-attk"), maker.run("attest", "export-attk"))
            for teller, believer in ((maker, taker), (taker, maker)):
                statement = self.path("key.statement")
                teller.run("export", "--statement", blob, "-o", statement)
                believer.run("statement", "verify", "--export", "--record", record, "--uid", UID, statement)
                believer.run("statement", "verify", "--export", "--record", record, "--uid", UID,
                             self.flipped(statement, 10), expect=INVALID)
                counters.append(self.counter(statement))
        self.assertEqual(counters, list(range(counters[0], counters[0] + len(counters))))

    def test_a_signed_challenge_of_one_is_believed_by_the_other(self):
        record, challenge = self.path("record.json"), self.write("challenge.txt", b"pay 10 to Mary, nonce 5bd1")
        self.both[0].run("device", "provision", "--record", record)
        self.both[1].run("finger", "enrol", "1234567890")
        signed = self.path("sign.statement")
        for maker, taker, blob in self.ways({"attested": ["--soter", "--counted", "--uid", UID]}):
            app = self.path(f"{maker.name}.pem")
            maker.run("export", "--statement", blob, "-o", self.path("key.statement"))
            taker.run("statement", "verify", "--export", "--record", record, "--uid", UID, "--public-key-out", app,
                      self.path("key.statement"))
            taker.run("sign", "--statement", "--finger", "1", blob, challenge, "-o", signed)
            asked = ["statement", "verify", "--sign", "--signer", app, "--finger", "1", "--uid", UID,
                     "--record", record, "--challenge", "@" + challenge]
            told = maker.run(*asked, signed)
            self.assertIn(b"Accepted: the statement of a signed challenge", told)
            self.assertEqual(taker.run(*asked, signed), told)
            maker.run(*asked, self.flipped(signed, 10), expect=INVALID)

    def test_a_secret_for_an_rsa_key_of_one_is_opened_by_the_other(self):
        secret = self.write("secret", b"open sesame")
        for maker, taker, blob in self.ways({"oaep": ["--size", "1024", "--padding", "oaep"]}):
            for sender, receiver in ((maker, taker), (taker, maker)):
                sender.run("encrypt", blob, secret, "-o", self.path("ciphertext"))
                self.assertEqual(receiver.run("decrypt", blob, self.path("ciphertext")), self.read(secret))

    def counter(self, statement):
        content = self.read(statement)
        length, = struct.unpack_from("<I", content)
        text = content[4:4 + length].rstrip(b"\0").decode()
        return int(text.split('"counter":')[1].split(",")[0].strip(' "}'))


if __name__ == "__main__":
    if not os.access(sys.argv[2], os.X_OK):
        print(f"skipped: {sys.argv[2]} cannot be run; build the preset release first")
        sys.exit(77)
    unittest.main(argv=sys.argv[:1], verbosity=1)
