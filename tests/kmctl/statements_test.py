#!/usr/bin/env python3
"""Attested keys from end to end: a factory, a device with fingers and passwords, and a relying party.

usage: statements_test.py KMCTL [unittest arguments]
"""

import json
import os
import struct
import tempfile

from kmctl_case import DONE, FAILURE, INVALID, KEYMASTER, USAGE, KmctlTest, main, openssl

UID = "1000"


def split(statement):
    """The text with its length, and the signature."""
    length, = struct.unpack("<I", statement[:4])
    return statement[4:4 + length], statement[4 + length:]


class Device(KmctlTest):
    """A provisioned device for all tests of a class, with a finger and a password of one user."""

    @classmethod
    def setUpClass(cls):
        folder = tempfile.TemporaryDirectory(prefix="kmctl-attested-")
        cls.addClassCleanup(folder.cleanup)
        if cls.servers:
            cls.addClassCleanup(cls.servers.end_below, folder.name)
        cls.device_folder = folder.name

    def setUp(self):
        super().setUp()
        self.state = os.path.join(self.device_folder, "state")
        self.record = os.path.join(self.device_folder, "factory.json")
        self.handle = os.path.join(self.device_folder, "user.handle")
        self.password = os.path.join(self.device_folder, "password")
        facts = os.path.join(self.device_folder, "facts")
        if not os.path.exists(self.record):
            with open(self.password, "w", encoding="utf-8") as file:
                file.write("open sesame\n")
            self.kmctl("device", "provision", "--record", self.record)
            user = self.json("auth", "enrol", "--uid", UID, "--password-file", self.password, "-o", self.handle)
            finger = self.json("finger", "enrol", str(user["secure_id"]))
            with open(facts, "w", encoding="utf-8") as file:
                json.dump({"secure_id": str(user["secure_id"]), "finger": str(finger["finger"])}, file)
        with open(facts, encoding="utf-8") as file:
            self.__dict__.update(json.load(file))

    def attested(self, name, *arguments):
        return self.generate("--soter", "--counted", "--uid", UID, *arguments, name=name)

    def export(self, blob, name):
        self.kmctl("export", "--statement", blob, "-o", self.path(name))
        return self.path(name)

    def verify(self, *arguments, expect=DONE):
        return self.json("statement", "verify", *arguments, expect=expect)

    def accept(self, statement, *arguments, out="accepted.pem"):
        self.verify("--export", "--uid", UID, "--public-key-out", self.path(out), *arguments, statement)
        return self.path(out)

    def assert_openssl_verifies(self, pem, statement, *options):
        text, signature = split(self.read(statement))
        openssl("dgst", "-sha256", "-verify", pem, *options, "-signature", self.write("sig", signature),
                self.write("text", text))


class Chain(Device):
    def test_device_app_key_auth_key_and_challenge_make_a_chain(self):
        ledger = self.path("ledger.json")
        app = self.attested("app.blob")
        app_statement = self.export(app, "app.statement")
        app_pem = self.accept(app_statement, "--record", self.record, "--ledger", ledger, out="app.pem")
        auth = self.attested("auth.blob", "--signed-by", app, "--padding", "pss", "--user-secure-id", self.secure_id,
                             "--user-auth-type", "fingerprint")
        auth_statement = self.export(auth, "auth.statement")
        auth_pem = self.accept(auth_statement, "--signer", app_pem, "--ledger", ledger, out="auth.pem")
        challenge = self.write("challenge", "r\u00e4tsel/\x01\"\\\n".encode())
        self.kmctl("sign", "--statement", "--finger", self.finger, auth, challenge, "-o", self.path("sign.statement"))
        checks = ("--sign", "--signer", auth_pem, "--padding", "pss", "--challenge", "@" + challenge, "--finger",
                  self.finger, "--uid", UID, "--record", self.record, "--ledger", ledger)
        told = self.verify(*checks, self.path("sign.statement"))
        self.assertEqual((told["raw"], told["fid"], told["uid"], told["counter_gap"], told["not_checked"]),
                         ("r\u00e4tsel/\x01\"\\\n", int(self.finger), int(UID), 0, []))
        with open(ledger, encoding="utf-8") as file:
            self.assertEqual(json.load(file)["counter"], told["counter"])
        # A second time it is old.
        self.assertEqual(self.verify(*checks, self.path("sign.statement"), expect=INVALID)["check"], "counter")
        # openssl says the same of all three, over the bytes as they stand there, the last with its NUL.
        with open(self.record, encoding="utf-8") as file:
            self.write("attk.pem", json.load(file)["attk"].encode())
        self.assert_openssl_verifies(self.path("attk.pem"), app_statement)
        self.assert_openssl_verifies(app_pem, auth_statement)
        self.assert_openssl_verifies(auth_pem, self.path("sign.statement"), "-sigopt", "rsa_padding_mode:pss")
        self.assertTrue(split(self.read("app.statement"))[0].endswith(b"}"))
        self.assertTrue(split(self.read("sign.statement"))[0].endswith(b"}\0"))

    def test_plain_export_takes_the_public_key_out_of_the_statement(self):
        app = self.attested("app.blob")
        accepted = self.accept(self.export(app, "app.statement"), "--record", self.record)
        self.kmctl("export", app, "-o", self.path("plain.pem"))
        self.assertEqual(self.read("plain.pem"), self.read("accepted.pem"))
        der = self.kmctl("export", "--der", app).stdout
        self.assertEqual(der, openssl("pkey", "-pubin", "-in", accepted, "-outform", "DER").stdout)

    def test_without_a_touch_there_is_no_finger(self):
        app = self.attested("app.blob")
        pem = self.accept(self.export(app, "app.statement"), "--record", self.record)
        self.kmctl("sign", "--statement", app, "-", "-o", self.path("s"), data=b"hello")
        told = self.verify("--sign", "--signer", pem, "--challenge", "hello", "--uid", UID, self.path("s"))
        self.assertEqual((told["fid"], told["not_checked"]), (None, ["fid", "device", "counter"]))
        refused = self.verify("--sign", "--signer", pem, "--challenge", "hello", "--uid", UID, "--any-finger",
                              self.path("s"), expect=INVALID)
        self.assertEqual((refused["accepted"], refused["check"], refused["error"]["exit_code"]), (False, "fid", INVALID))

    def test_a_finger_without_authentication_still_goes_into_the_statement(self):
        app = self.attested("app.blob")
        pem = self.accept(self.export(app, "app.statement"), "--record", self.record)
        self.kmctl("sign", "--statement", "--finger", self.finger, app, "-", "-o", self.path("s"), data=b"hello")
        told = self.verify("--sign", "--signer", pem, "--challenge", "hello", "--uid", UID, "--any-finger", "--record",
                           self.record, self.path("s"))
        self.assertEqual(told["fid"], int(self.finger))

    def test_what_is_not_a_text_is_refused_before_it_reaches_the_ta(self):
        app = self.attested("app.blob")
        for data, words in ((b"ab\xff", "byte 2 is not UTF-8"), (b"a\0b", "byte 1 is a NUL")):
            refused = self.kmctl("sign", "--statement", app, "-", "-o", self.path("s"), data=data, expect=FAILURE)
            self.assertIn(words, refused.stderr.decode())
        self.assertFalse(os.path.exists(self.path("s")))

    def test_statements_and_signatures_are_not_mixed_up(self):
        app = self.attested("app.blob")
        plain = self.generate()
        self.kmctl("sign", app, self.data, "-o", self.path("s"), expect=USAGE)
        self.kmctl("sign", "--statement", plain, "-", "-o", self.path("s"), data=b"x", expect=USAGE)
        self.kmctl("export", "--statement", plain, "-o", self.path("s"), expect=USAGE)
        self.assertFalse(os.path.exists(self.path("s")))


class Refusals(Device):
    def setUp(self):
        super().setUp()
        self.app = self.attested("app.blob")
        self.statement = self.export(self.app, "app.statement")

    def refusal(self, *arguments, statement=None):
        return self.verify("--export", *arguments, statement or self.statement, expect=INVALID)["check"]

    def test_each_refusal_names_its_check_and_leaves_nothing(self):
        before = sorted(os.listdir(self.folder))
        good = ("--record", self.record, "--uid", UID)
        keep = ("--public-key-out", self.path("out.pem"), "--ledger", self.path("ledger.json"))
        size = len(self.read("app.statement"))
        other = self.write("other.pem", openssl("pkey", "-pubout", data=openssl("genrsa", "2048").stdout).stdout)
        before.append("other.pem")
        self.assertEqual(self.refusal("--record", self.record, *keep), "uid")
        self.assertEqual(self.refusal("--record", self.record, "--uid", "1001", *keep), "uid")
        self.assertEqual(self.refusal("--attk", other, "--uid", UID, *keep), "signature")
        for offset, check in ((0, "layout"), (5, "signature"), (size - 1, "signature")):
            flipped = self.flipped("app.statement", offset, "flipped")
            self.assertEqual(self.refusal(*good, *keep, statement=flipped), check)
            os.unlink(flipped)
        self.assertEqual(sorted(os.listdir(self.folder)), sorted(before))
        said = self.kmctl("statement", "verify", "--export", *good, "--last-counter", "99999999999", self.statement,
                          expect=INVALID).stderr.decode()
        self.assertIn("refused by the check counter: the counter is", said)
        self.assertIn("hint: ", said)

    def test_an_export_statement_is_no_sign_statement(self):
        pem = self.accept(self.statement, "--record", self.record)
        refused = self.verify("--sign", "--signer", pem, "--challenge", "x", "--uid", UID, self.statement,
                              expect=INVALID)
        self.assertEqual(refused["check"], "shape")

    def test_a_ledger_is_kept_whole_and_for_one_device(self):
        ledger = self.path("ledger.json")
        self.accept(self.statement, "--record", self.record, "--ledger", ledger)
        first = self.read("ledger.json")
        self.assertEqual(self.refusal("--record", self.record, "--uid", UID, "--ledger", ledger), "counter")
        self.assertEqual(self.read("ledger.json"), first)
        with open(self.record, encoding="utf-8") as file:
            record = json.load(file)
        record["device_id"] = "00" * 16
        other = self.write("other.json", json.dumps(record).encode())
        again = self.export(self.app, "again.statement")
        said = self.kmctl("statement", "verify", "--export", "--record", other, "--uid", UID, "--ledger", ledger, again,
                          expect=USAGE)
        self.assertIn(b"another device", said.stderr)
        self.assertEqual(self.read("ledger.json"), first)
        self.write("ledger.json", b"[]")
        self.kmctl("statement", "verify", "--export", "--record", self.record, "--uid", UID, "--ledger", ledger, again,
                   expect=FAILURE)
        self.assertEqual(self.read("ledger.json"), b"[]")

    def test_options_that_check_nothing_are_refused(self):
        pem = self.accept(self.statement, "--record", self.record)
        for words in (("--export",), ("--export", "--sign", "--signer", pem), ("--signer", pem),
                      ("--export", "--signer", pem, "--challenge", "x"), ("--export", "--signer", pem, "--any-finger"),
                      ("--sign", "--signer", pem), ("--sign", "--challenge", "x"),
                      ("--sign", "--signer", pem, "--challenge", "x", "--attk", pem),
                      ("--sign", "--signer", pem, "--challenge", "x", "--public-key-out", self.path("k")),
                      ("--sign", "--signer", pem, "--challenge", "x", "--digest", "none"),
                      ("--sign", "--signer", pem, "--challenge", "x", "--padding", "oaep"),
                      ("--sign", "--signer", pem, "--challenge", "x", "--finger", "1", "--any-finger"),
                      ("--export", "--signer", pem, "--attk", pem),
                      ("--export", "--signer", pem, "--ledger", self.path("l"), "--last-counter", "1"),
                      ("--export", "--signer", pem, "--uid", "4294967295")):
            self.kmctl("statement", "verify", *words, self.statement, expect=USAGE)

    def test_a_key_that_would_be_worthless_is_not_made(self):
        for words in (("--soter", "--purpose", "sign,decrypt"), ("--soter", "--padding", "none"),
                      ("--soter", "--digest", "none"), ("--soter", "--size", "1024"), ("--soter", "--algorithm", "ec"),
                      ("--soter", "--signed-by-attk", "--signed-by", self.app), ("--soter", "--uid", "4294967295"),
                      ("--counted",), ("--uid", "7"), ("--signed-by", self.app)):
            self.kmctl("generate", *words, self.path("bad.blob"), expect=USAGE)
        private = self.write("private.pem", openssl("genrsa", "2048").stdout)
        self.kmctl("import", "--soter", private, self.path("bad.blob"), expect=USAGE)
        self.assertFalse(os.path.exists(self.path("bad.blob")))


class UsersKeys(Device):
    """Keys that ask for their user, used from the shell."""

    WAYS = (("fingerprint", False), ("password", False), ("fingerprint", True), ("password", True))

    def presence(self, kind):
        if kind == "fingerprint":
            return ("--finger", self.finger)
        return ("--auth-handle", self.handle, "--auth-uid", UID, "--password-file", self.password)

    def users_key(self, kind, timed, *arguments):
        timeout = ("--auth-timeout", "60") if timed else ()
        return self.generate("--user-secure-id", self.secure_id, "--user-auth-type", kind, *timeout, *arguments,
                             name=f"{kind}-{timed}.blob")

    def test_a_signature_needs_its_user_in_every_way(self):
        for kind, timed in self.WAYS:
            blob = self.users_key(kind, timed)
            self.kmctl("sign", blob, self.data, "-o", self.path("sig"), expect=KEYMASTER)
            wrong = self.presence("password" if kind == "fingerprint" else "fingerprint")
            self.kmctl("sign", *wrong, blob, self.data, "-o", self.path("sig"), expect=KEYMASTER)
            self.assertFalse(os.path.exists(self.path("sig")))
            self.kmctl("sign", *self.presence(kind), blob, self.data, "-o", self.path("sig"))
            openssl("dgst", "-sha256", "-verify", self.public_key(blob), "-signature", self.path("sig"), self.data)
            os.unlink(self.path("sig"))

    def test_encryption_needs_its_user_in_every_way(self):
        for kind, timed in self.WAYS:
            blob = self.users_key(kind, timed, "--algorithm", "aes")
            self.kmctl("encrypt", blob, self.data, "-o", self.path("enc"), expect=KEYMASTER)
            self.kmctl("encrypt", *self.presence(kind), blob, self.data, "-o", self.path("enc"))
            self.kmctl("decrypt", blob, self.path("enc"), "-o", self.path("dec"), expect=KEYMASTER)
            self.kmctl("decrypt", *self.presence(kind), blob, self.path("enc"), "-o", self.path("dec"))
            self.assertEqual(self.read("dec"), self.read("letter.txt"))
            os.unlink(self.path("dec"))
            os.unlink(self.path("enc"))

    def test_a_mac_is_checked_with_its_user(self):
        blob = self.users_key("password", False, "--algorithm", "hmac")
        self.kmctl("sign", *self.presence("password"), blob, self.data, "-o", self.path("mac"))
        self.kmctl("verify", blob, self.path("mac"), self.data, expect=KEYMASTER)
        self.kmctl("verify", *self.presence("password"), blob, self.path("mac"), self.data)

    def test_statements_of_users_keys_tell_the_finger(self):
        for kind, timed in self.WAYS:
            timeout = ("--auth-timeout", "60") if timed else ()
            blob = self.attested(f"{kind}-{timed}.blob", "--user-secure-id", self.secure_id, "--user-auth-type", kind,
                                 *timeout)
            pem = self.accept(self.export(blob, "s"), "--record", self.record)
            presence = self.presence(kind) + (() if kind == "fingerprint" else ("--finger", self.finger))
            self.kmctl("sign", "--statement", *presence, blob, "-", "-o", self.path("s"), data=b"x")
            told = self.verify("--sign", "--signer", pem, "--challenge", "x", "--uid", UID, "--any-finger",
                               self.path("s"))
            self.assertEqual(told["fid"], int(self.finger))

    def test_who_is_not_needed_is_not_asked(self):
        self.kmctl("sign", "--finger", self.finger, self.generate(), self.data, "-o", self.path("s"), expect=USAGE)
        blob = self.users_key("fingerprint", False)
        self.kmctl("sign", "--finger", self.finger, blob, self.data, "-o", self.path("sig"))
        self.kmctl("verify", "--finger", self.finger, blob, self.path("sig"), self.data, expect=USAGE)
        self.kmctl("verify", blob, self.path("sig"), self.data)
        self.kmctl("sign", "--auth-handle", self.handle, blob, self.data, "-o", self.path("s"), expect=USAGE)


if __name__ == "__main__":
    main(__doc__)
