#!/usr/bin/env python3
"""Drives kmctl from end to end: keys, RSA signatures, every exit code, --json, standard input and output, the demo.

usage: kmctl_test.py KMCTL [unittest arguments]

The openssl command is the judge of signatures and keys. Each test works in a folder and on a device of its own.
"""

import datetime
import json
import os
import pty
import re
import subprocess

from kmctl_case import (DIGESTS, DONE, EMULATED, FAILURE, INVALID, KEYMASTER, LONG_KEY, NO_CONNECTION, TEE_ERROR, USAGE,
                        KmctlTest, embedded_only, main, openssl)


class Keys(KmctlTest):
    def test_a_generated_key_is_a_blob_only_its_owner_can_read(self):
        result = self.json("generate", self.path("key.blob"))
        self.assertEqual(result["size"], os.path.getsize(self.path("key.blob")))
        self.assertEqual(os.stat(self.path("key.blob")).st_mode & 0o777, 0o600)
        self.assertEqual(result["characteristics"], {
            "algorithm": "rsa", "key_size": 2048, "rsa_public_exponent": 65537, "purpose": ["sign", "verify"],
            "digest": ["sha-256"], "padding": ["pkcs1-1-5-sign"], "no_auth_required": True, "origin": "generated"})

    def test_text_output_names_the_key(self):
        output = self.kmctl("generate", "--size", "1024", self.path("key.blob")).stdout.decode()
        self.assertIn("Generated RSA-1024 key", output)
        self.assertRegex(output, r"\n  padding +pkcs1-1-5-sign\n")
        self.assertIn("RSA-1024", self.kmctl("characteristics", self.path("key.blob")).stdout.decode())

    def test_every_description_comes_back_as_a_characteristic(self):
        blob = self.generate("--size", "1024", "--exponent", "3", "--purpose", "sign", "--digest", "sha-512,none",
                             "--padding", "pss,none", "--active", "2020-01-01", "--origination-expire",
                             "2040-06-01T12:00:00+02:00", "--usage-expire", "2041-01-01", "--max-uses-per-boot", "5",
                             "--min-seconds-between-ops", "6", "--user-secure-id", "7,8", "--user-auth-type", "any",
                             "--auth-timeout", "9", "--caller-nonce", "--min-mac-length", "96", "--block-mode", "gcm")
        self.assertEqual(self.json("characteristics", blob)["characteristics"], {
            "algorithm": "rsa", "key_size": 1024, "rsa_public_exponent": 3, "purpose": ["sign"],
            "digest": ["sha-512", "none"], "padding": ["pss", "none"], "active_datetime": "2020-01-01T00:00:00Z",
            "origination_expire_datetime": "2040-06-01T10:00:00Z", "usage_expire_datetime": "2041-01-01T00:00:00Z",
            "max_uses_per_boot": 5, "min_seconds_between_ops": 6, "user_secure_id": [7, 8], "user_auth_type": "any",
            "auth_timeout": 9, "caller_nonce": True, "min_mac_length": 96, "block_mode": ["gcm"],
            "origin": "generated"})

    def test_an_existing_blob_is_never_overwritten_unless_forced(self):
        blob = self.generate("--size", "1024")
        before = self.read(blob)
        result = self.kmctl("generate", blob, expect=FAILURE)
        self.assertIn(b"--force", result.stderr)
        self.assertEqual(self.read(blob), before)
        self.kmctl("generate", "--force", "--size", "1024", blob)
        self.assertNotEqual(self.read(blob), before)
        self.assertEqual(sorted(os.listdir(self.folder)), ["key.blob", "letter.txt"])

    def test_no_other_output_overwrites_the_blob_or_the_data(self):
        blob = self.generate("--size", "1024")
        before = self.read(blob)
        self.kmctl("sign", blob, self.data, "-o", blob, expect=USAGE)
        self.kmctl("sign", blob, self.data, "-o", self.data, expect=USAGE)
        self.kmctl("export", blob, "-o", blob, expect=USAGE)
        self.assertEqual(self.read(blob), before)

    def test_a_blob_can_come_and_go_by_standard_input_and_output(self):
        made = self.kmctl("generate", "--size", "1024", "-")
        self.assertIn(b"Generated RSA-1024 key", made.stderr)
        listed = self.json("characteristics", "-", data=made.stdout)
        self.assertEqual(listed["size"], len(made.stdout))
        pem = self.kmctl("export", "-", data=made.stdout).stdout
        openssl("pkey", "-pubin", "-noout", data=pem)
        reported = self.kmctl("generate", "--size", "1024", "--json", "-")
        self.assertEqual(json.loads(reported.stderr)["blob"], "-")

    def test_export_writes_pem_and_der_of_the_same_key(self):
        blob = self.generate("--size", "1024")
        pem = self.kmctl("export", blob).stdout
        self.assertTrue(pem.startswith(b"-----BEGIN PUBLIC KEY-----\n"))
        self.kmctl("export", blob, "--der", "-o", self.path("public.der"))
        self.assertEqual(openssl("pkey", "-pubin", "-outform", "DER", data=pem).stdout, self.read("public.der"))
        self.assertEqual(self.json("export", blob, "-o", self.path("again.pem"))["key"], "RSA-1024")
        self.assertEqual(self.read("again.pem"), pem)

    def test_delete_removes_the_file_and_says_that_copies_live_on(self):
        blob = self.generate("--size", "1024")
        copy = self.write("copy.blob", self.read(blob))
        self.assertIn(b"Copies of it would still work", self.kmctl("delete", blob).stdout)
        self.assertFalse(os.path.exists(blob))
        self.kmctl("characteristics", copy)
        self.assertEqual(self.json("delete", copy), {"deleted": copy})
        self.kmctl("delete", blob, expect=FAILURE)
        self.kmctl("delete", "-", expect=USAGE)

    def test_delete_keeps_a_file_that_the_ta_does_not_take(self):
        stub = self.write("stub", b"\0")
        self.assertIn(b"KM_ERROR_INVALID_KEY_BLOB", self.kmctl("delete", stub, expect=KEYMASTER).stderr)
        self.assertTrue(os.path.exists(stub))

    def test_delete_all_touches_no_file(self):
        blob = self.generate("--size", "1024")
        self.assertEqual(self.json("delete-all"), {"deleted": "all"})
        self.kmctl("characteristics", blob)


class Signatures(KmctlTest):
    def openssl_verifies(self, public, signature, digest, padding, data):
        options = ["-sigopt", f"rsa_padding_mode:{padding}"] if padding == "pss" else []
        result = openssl("dgst", f"-{DIGESTS[digest]}", *options, "-verify", public, "-signature", signature, data,
                         check=False)
        return result.returncode == 0

    def test_openssl_accepts_every_signature_with_a_digest(self):
        blob = self.generate("--size", "2048", "--padding", "pss,pkcs1-1-5-sign",
                             "--digest", "md5,sha-1,sha-224,sha-256,sha-384,sha-512")
        public = self.public_key(blob)
        for padding in ("pkcs1-1-5-sign", "pss"):
            for digest in DIGESTS:
                if padding == "pss" and digest == "md5":
                    continue
                with self.subTest(padding=padding, digest=digest):
                    options = ["--padding", padding, "--digest", digest]
                    self.kmctl("sign", *options, blob, self.data, "-o", self.path("sig"))
                    self.assertTrue(self.openssl_verifies(public, self.path("sig"), digest, padding, self.data))
                    self.kmctl("verify", *options, blob, self.path("sig"), self.data)

    def test_openssl_and_kmctl_agree_on_imported_keys_in_both_directions(self):
        openssl("genrsa", "-out", self.path("private.pem"), "2048")
        blob = self.path("key.blob")
        self.kmctl("import", "--padding", "pss,pkcs1-1-5-sign", "--digest",
                   "md5,sha-1,sha-224,sha-256,sha-384,sha-512", self.path("private.pem"), blob)
        for padding in ("pkcs1-1-5-sign", "pss"):
            for digest, name in DIGESTS.items():
                if padding == "pss" and digest == "md5":
                    continue
                with self.subTest(padding=padding, digest=digest):
                    options = ["-sigopt", "rsa_padding_mode:pss"] if padding == "pss" else []
                    openssl("dgst", f"-{name}", *options, "-sign", self.path("private.pem"), "-out", self.path("sig"),
                            self.data)
                    ours = ["--padding", padding, "--digest", digest]
                    self.assertIs(self.json("verify", *ours, blob, self.path("sig"), self.data)["valid"], True)
                    signature = self.kmctl("sign", *ours, blob, self.data).stdout
                    if padding != "pss":  # which is randomised
                        self.assertEqual(signature, self.read("sig"))

    def test_pkcs1_without_a_digest_signs_what_it_is_given(self):
        blob = self.generate("--size", "1024", "--digest", "none")
        public = self.public_key(blob)
        message = self.write("message", b"prepared by the caller")
        self.kmctl("sign", blob, message, "-o", self.path("sig"))
        recovered = openssl("pkeyutl", "-verifyrecover", "-pubin", "-inkey", public, "-in", self.path("sig"))
        self.assertEqual(recovered.stdout, b"prepared by the caller")
        self.kmctl("verify", blob, self.path("sig"), message)
        long = self.write("long", b"x" * 118)
        self.assertIn(b"KM_ERROR_INVALID_INPUT_LENGTH", self.kmctl("sign", blob, long, expect=KEYMASTER).stderr)
        self.kmctl("sign", blob, self.write("fits", b"x" * 117), "-o", self.path("sig"))

    def test_raw_rsa_is_the_bare_private_operation(self):
        blob = self.generate("--size", "1024", "--padding", "none")
        public = self.public_key(blob)
        message = b"\0\1" + b"\x5a" * 126
        signature = self.kmctl("sign", blob, "-", data=message).stdout
        self.assertEqual(len(signature), 128)
        sig = self.write("sig", signature)
        recovered = openssl("pkeyutl", "-verifyrecover", "-pubin", "-inkey", public, "-in", sig, "-pkeyopt",
                            "rsa_padding_mode:none")
        self.assertEqual(recovered.stdout, message)
        self.kmctl("verify", blob, sig, "-", data=message)
        self.kmctl("verify", blob, sig, "-", data=message[:-1] + b"!", expect=INVALID)

    def test_an_empty_file_can_be_signed(self):
        blob = self.generate("--size", "1024")
        empty = self.write("empty", b"")
        self.kmctl("sign", blob, empty, "-o", self.path("sig"))
        self.assertTrue(self.openssl_verifies(self.public_key(blob), self.path("sig"), "sha-256", "", empty))

    def test_standard_input_and_output_are_files_too(self):
        blob = self.generate("--size", "1024")
        letter = self.read(self.data)
        signature = self.kmctl("sign", blob, data=letter).stdout
        self.assertEqual(signature, self.kmctl("sign", blob, "-", "-o", "-", data=letter).stdout)
        sig = self.write("sig", signature)
        self.kmctl("verify", blob, sig, data=letter)
        self.kmctl("verify", blob, "-", self.data, data=signature)
        self.kmctl("sign", "-", self.data, data=self.read(blob))
        self.kmctl("sign", "-", "-", data=b"", expect=USAGE)
        self.kmctl("verify", blob, "-", "-", data=b"", expect=USAGE)

    def test_json_goes_where_the_signature_does_not(self):
        blob = self.generate("--size", "1024")
        result = self.kmctl("sign", "--json", blob, self.data)
        self.assertEqual(len(result.stdout), 128)
        self.assertEqual(json.loads(result.stderr),
                         {"signature": "-", "size": 128, "padding": "pkcs1-1-5-sign", "digest": "sha-256"})
        self.assertEqual(self.json("sign", blob, self.data, "-o", self.path("sig"))["signature"], self.path("sig"))

    def test_a_wrong_signature_exits_with_its_own_code(self):
        blob = self.generate("--size", "1024")
        self.kmctl("sign", blob, self.data, "-o", self.path("sig"))
        cases = {
            "changed data": (self.path("sig"), self.flipped(self.data, 70000, "changed")),
            "changed signature": (self.flipped("sig", 5, "other-sig"), self.data),
            "short signature": (self.write("short-sig", self.read("sig")[:-1]), self.data),
            "empty signature": (self.write("empty-sig", b""), self.data),
        }
        for case, (signature, data) in cases.items():
            with self.subTest(case):
                result = self.kmctl("verify", blob, signature, data, expect=INVALID)
                self.assertIn(b"TEE_SUCCESS, KM_ERROR_VERIFICATION_FAILED (-30)", result.stderr)
                answer = self.json("verify", blob, signature, data, expect=INVALID)
                self.assertIs(answer["valid"], False)
                self.assertEqual(answer["error"]["keymaster_error"]["value"], -30)

    def test_the_only_choice_is_taken_and_a_choice_is_asked_for(self):
        blob = self.generate("--size", "1024", "--padding", "pss", "--digest", "sha-1")
        self.assertEqual(self.json("sign", blob, self.data, "-o", self.path("sig"))["padding"], "pss")
        wide = self.generate("--size", "1024", "--padding", "pss", "--digest", "sha-1,sha-256", name="wide.blob")
        result = self.kmctl("sign", wide, self.data, expect=USAGE)
        self.assertIn(b"the key allows more than one digest: sha-1, sha-256", result.stderr)
        self.assertIn(b"--digest", result.stderr)
        self.kmctl("sign", "--digest", "sha-256", wide, self.data, "-o", self.path("sig"))


class Imports(KmctlTest):
    def test_every_key_file_of_openssl_gives_the_same_public_key(self):
        openssl("genrsa", "-traditional", "-out", self.path("pkcs1.pem"), "1024")
        convert = ["pkey", "-in", self.path("pkcs1.pem")]
        openssl(*convert, "-out", self.path("pkcs8.pem"))
        openssl(*convert, "-outform", "DER", "-out", self.path("pkcs8.der"))
        openssl("rsa", "-in", self.path("pkcs1.pem"), "-traditional", "-outform", "DER", "-out", self.path("pkcs1.der"))
        openssl("pkcs8", "-topk8", "-v2", "aes-256-cbc", "-in", self.path("pkcs1.pem"), "-passout", "pass:open sesame",
                "-out", self.path("encrypted.pem"))
        self.write("passphrase", b"open sesame\n")
        expected = openssl(*convert, "-pubout").stdout
        for name in ("pkcs1.pem", "pkcs8.pem", "pkcs8.der", "pkcs1.der", "encrypted.pem"):
            with self.subTest(name):
                options = ["--passphrase", "@" + self.path("passphrase")] if name == "encrypted.pem" else []
                answer = self.json("import", *options, self.path(name), self.path(name + ".blob"))
                self.assertEqual(answer["characteristics"]["origin"], "imported")
                self.assertEqual(answer["characteristics"]["key_size"], 1024)
                self.assertEqual(answer["characteristics"]["rsa_public_exponent"], 65537)
                self.assertEqual(self.kmctl("export", self.path(name + ".blob")).stdout, expected)
        result = self.kmctl("import", self.path("encrypted.pem"), self.path("x.blob"), expect=FAILURE)
        self.assertIn(b"needs its passphrase", result.stderr)
        self.kmctl("import", "--passphrase", "wrong", self.path("encrypted.pem"), self.path("x.blob"), expect=FAILURE)

    def test_a_key_can_come_from_standard_input(self):
        private = openssl("genrsa", "1024").stdout
        blob = self.kmctl("import", "-", "-", data=private).stdout
        self.assertEqual(self.kmctl("export", "-", data=blob).stdout, openssl("pkey", "-pubout", data=private).stdout)

    def test_what_is_stated_must_be_true(self):
        openssl("genrsa", "-out", self.path("private.pem"), "1024")
        blob = self.path("key.blob")
        for wrong in (["--size", "2048"], ["--exponent", "3"]):
            result = self.kmctl("import", *wrong, self.path("private.pem"), blob, expect=KEYMASTER)
            self.assertIn(b"KM_ERROR_IMPORT_PARAMETER_MISMATCH (-44)", result.stderr)
        self.kmctl("import", "--algorithm", "ec", self.path("private.pem"), blob, expect=USAGE)
        self.assertFalse(os.path.exists(blob))
        self.kmctl("import", "--size", "1024", "--exponent", "65537", "--algorithm", "rsa", self.path("private.pem"),
                   blob)

    def test_files_that_hold_no_private_key_are_refused(self):
        private = openssl("genrsa", "1024").stdout
        public = self.write("public.pem", openssl("pkey", "-pubout", data=private).stdout)
        for file in (public, self.data, self.write("empty", b"")):
            result = self.kmctl("import", file, self.path("key.blob"), expect=FAILURE)
            self.assertIn(b"no private key found", result.stderr)


class Refusals(KmctlTest):
    def test_application_id_and_data_must_match(self):
        bound = ["--app-id", "my.app", "--app-data", "hex:00ff17"]
        blob = self.generate("--size", "1024", *bound)
        self.write("data.bin", b"\x00\xff\x17")
        same = ["--app-id", "text:my.app", "--app-data", "@" + self.path("data.bin")]
        self.kmctl("sign", *same, blob, self.data, "-o", self.path("sig"))
        self.kmctl("verify", *same, blob, self.path("sig"), self.data)
        listed = self.json("characteristics", *same, blob)["characteristics"]
        self.assertNotIn("application_id", listed)
        for other in ([], ["--app-id", "my.app"], ["--app-id", "My.app", "--app-data", "hex:00ff17"]):
            for command in (["characteristics", blob], ["export", blob], ["sign", blob, self.data]):
                with self.subTest(command=command[0], other=other):
                    result = self.kmctl(*command, *other, expect=KEYMASTER)
                    self.assertIn(b"KM_ERROR_INVALID_KEY_BLOB (-33)", result.stderr)

    def test_a_changed_blob_does_not_authenticate(self):
        blob = self.generate("--size", "1024")
        size = os.path.getsize(blob)
        for offset in (1, 64, 65, 77, 92, 93, size - 1):
            with self.subTest(offset=offset):
                changed = self.flipped(blob, offset, "changed.blob")
                result = self.kmctl("sign", changed, self.data, expect=TEE_ERROR)
                self.assertIn(b"TEE_ERROR_MAC_INVALID from TRUSTED_APP", result.stderr)
        answer = self.json("characteristics", self.path("changed.blob"), expect=TEE_ERROR)["error"]
        self.assertEqual(answer["tee_result"], {"name": "TEE_ERROR_MAC_INVALID", "value": 0xFFFF3071})
        self.assertEqual(answer["step"], "get_key_character_size")
        self.assertEqual(answer["exit_code"], TEE_ERROR)
        self.assertTrue(answer["hint"])

    def test_what_is_no_blob_is_refused(self):
        for content in (b"", b"x", b"\2" + bytes(200), bytes(93)):
            stub = self.write("stub", content)
            result = self.kmctl("characteristics", stub, expect=KEYMASTER)
            self.assertIn(b"KM_ERROR_INVALID_KEY_BLOB", result.stderr)
        self.write("huge", bytes(2 << 20))
        self.assertIn(b"too large", self.kmctl("characteristics", self.path("huge"), expect=FAILURE).stderr)

    def test_a_blob_of_another_device_does_not_authenticate(self):
        blob = self.generate("--size", "1024")
        result = self.kmctl("--state", self.path("other-device"), "characteristics", blob, expect=TEE_ERROR)
        self.assertIn(b"TEE_ERROR_MAC_INVALID", result.stderr)
        self.assertIn(b"another device", result.stderr)

    def test_the_keys_dates_hold(self):
        future = self.generate("--size", "1024", "--active", "2999-01-01", name="future.blob")
        self.assertIn(b"KM_ERROR_KEY_NOT_YET_VALID", self.kmctl("sign", future, self.data, expect=KEYMASTER).stderr)
        past = self.generate("--size", "1024", "--origination-expire", "2001-01-01", name="past.blob")
        self.assertIn(b"KM_ERROR_KEY_EXPIRED", self.kmctl("sign", past, self.data, expect=KEYMASTER).stderr)

    def test_purpose_padding_and_digest_hold(self):
        verify_only = self.generate("--size", "1024", "--purpose", "verify", name="v.blob")
        self.assertIn(b"KM_ERROR_INCOMPATIBLE_PURPOSE",
                      self.kmctl("sign", verify_only, self.data, expect=KEYMASTER).stderr)
        blob = self.generate("--size", "1024")
        self.assertIn(b"KM_ERROR_INCOMPATIBLE_PADDING_MODE",
                      self.kmctl("sign", "--padding", "pss", blob, self.data, expect=KEYMASTER).stderr)
        self.assertIn(b"KM_ERROR_INCOMPATIBLE_DIGEST",
                      self.kmctl("sign", "--digest", "sha-1", blob, self.data, expect=KEYMASTER).stderr)

    def test_a_key_with_a_user_needs_a_token(self):
        blob = self.generate("--size", "1024", "--user-secure-id", "1", "--user-auth-type", "password",
                             "--auth-timeout", "60")
        self.assertIn(b"KM_ERROR_KEY_USER_NOT_AUTHENTICATED",
                      self.kmctl("sign", blob, self.data, expect=KEYMASTER).stderr)
        token = self.write("token", bytes(69))
        self.assertIn(b"KM_ERROR_INVALID_ARGUMENT",
                      self.kmctl("sign", "--auth-token", token, blob, self.data, expect=KEYMASTER).stderr)

    def test_sizes_and_exponents_that_cannot_be(self):
        self.assertIn(b"KM_ERROR_UNSUPPORTED_KEY_SIZE",
                      self.kmctl("generate", "--size", "2049", self.path("k"), expect=KEYMASTER).stderr)
        self.assertIn(b"TEE_ERROR_BAD_PARAMETERS",
                      self.kmctl("generate", "--exponent", "4", self.path("k"), expect=TEE_ERROR).stderr)
        self.assertFalse(os.path.exists(self.path("k")))

    def test_files_that_cannot_be_read_or_written(self):
        blob = self.generate("--size", "1024")
        self.assertIn(b"No such file", self.kmctl("sign", blob, self.path("none"), expect=FAILURE).stderr)
        self.assertIn(b"No such file", self.kmctl("characteristics", self.path("none"), expect=FAILURE).stderr)
        self.assertIn(b"Is a directory", self.kmctl("sign", blob, self.folder, expect=FAILURE).stderr)
        self.kmctl("sign", blob, self.data, "-o", self.path("no/such/folder"), expect=FAILURE)
        self.kmctl("generate", self.path("no/such/folder"), expect=FAILURE)

    def test_wrong_usage(self):
        cases = [[], ["frobnicate"], ["sign"], ["generate", "--digest", "sha-3", "x"], ["generate", "--size", "big", "x"],
                 ["generate", "--active", "tomorrow", "x"], ["generate", "a", "b"], ["sign", "--nonsense", "x"],
                 ["--state", "a", "--tee", "b", "info"], ["--trace", "loud", "info"],
                 ["generate", "--app-id", "hex:0", "x"]]
        for arguments in cases:
            with self.subTest(arguments=arguments):
                self.kmctl(*arguments, expect=USAGE)
        self.assertIn(b"there is no sub-command 'frobnicate'", self.kmctl("frobnicate", expect=USAGE).stderr)
        answer = self.json("generate", "--digest", "sha-3", "x", expect=USAGE)["error"]
        self.assertEqual(answer["exit_code"], USAGE)
        self.assertIn("sha-256", answer["hint"])


@embedded_only
class Devices(KmctlTest):
    def setUp(self):
        super().setUp()
        self.state = self.path("device")

    def test_info_tells_the_device_and_its_capabilities(self):
        told = self.json("info")
        self.assertEqual(told["tee"], "embedded:" + self.state)
        self.assertEqual(told["ta"], "fbacea43-f475-4df3-866f-76256aba994f")
        self.assertEqual([a["name"] for a in told["algorithms"]], ["rsa", "aes", "ec", "hmac"])
        rsa = told["algorithms"][0]
        self.assertEqual(rsa["import_formats"], ["pkcs8"])
        self.assertEqual(rsa["export_formats"], ["x509"])
        purposes = {p["name"]: p for p in rsa["purposes"]}
        self.assertEqual(purposes["sign"], {"name": "sign", "block_modes": [],
                                            "paddings": ["none", "pss", "pkcs1-1-5-sign"],
                                            "digests": ["none", "md5", "sha-1", "sha-224", "sha-256", "sha-384",
                                                        "sha-512"]})
        self.assertIn("pkcs1-1-5-sign", self.kmctl("info").stdout.decode())

    def test_info_tells_the_properties_of_the_tee_and_of_the_ta(self):
        told = self.json("info")
        self.assertEqual(list(told["tee_properties"]),
                         ["gpd.tee.apiversion", "gpd.tee.description", "gpd.tee.deviceID",
                          "gpd.tee.trustedos.manufacturer", "gpd.tee.trustedos.implementation.version"])
        self.assertEqual(told["tee_properties"]["gpd.tee.apiversion"], "1.1")
        self.assertEqual(told["ta_properties"],
                         {"gpd.ta.singleInstance": "true", "gpd.ta.multiSession": "true",
                          "gpd.ta.instanceKeepAlive": "false", "gpd.ta.dataSize": "524288",
                          "gpd.ta.stackSize": "8192", "gpd.ta.version": "Undefined version",
                          "gpd.ta.description": "Undefined description"})
        self.assertIs(told["rpmb"], True)
        self.assertGreaterEqual(told["system_time_ms"], 7200 * 1000)  # two hours after a boot that was just now
        self.assertLess(told["system_time_ms"], 7300 * 1000)
        now = datetime.datetime.now(datetime.timezone.utc)
        self.assertLess(abs(now - datetime.datetime.fromisoformat(told["ree_time"])), datetime.timedelta(minutes=1))
        text = self.kmctl("info").stdout.decode()
        self.assertRegex(text, r"\n  gpd\.tee\.deviceID +" + told["tee_properties"]["gpd.tee.deviceID"] + r"\n")
        self.assertRegex(text, r"\n  RPMB storage +yes\n  system time +72\d\d\.\d\d\d s\n  REE time +20")
        self.assertRegex(text, r"\nTA +fbacea43-.*\n  gpd\.ta\.singleInstance +true\n")

    def test_info_follows_the_settings_of_the_device(self):
        self.kmctl("info")
        with open(os.path.join(self.state, "settings"), "wb") as file:
            file.write(b"rpmb = off\ndevice-id = 01234567-89ab-4cde-8f01-23456789abcd\n"
                       b"gpd.tee.trustedos.manufacturer = " + b"long " * 100 + b"\xff\n")
        told = self.json("info")
        self.assertIs(told["rpmb"], False)
        self.assertEqual(told["tee_properties"]["gpd.tee.deviceID"], "01234567-89ab-4cde-8f01-23456789abcd")
        self.assertEqual(told["tee_properties"]["gpd.tee.trustedos.manufacturer"], "long " * 100 + "\ufffd")
        self.assertRegex(self.kmctl("info").stdout, rb"\n  RPMB storage +no\n")

    def test_the_state_folder_can_be_named_in_four_ways(self):
        blob = self.generate("--size", "1024")
        home = {"KEYMASTER_STATE": "", "XDG_STATE_HOME": self.path("xdg"), "HOME": self.path("home")}
        self.kmctl("--state", self.state, "characteristics", blob, **home)
        self.kmctl("--tee", "embedded:" + self.state, "characteristics", blob, **home)
        self.kmctl("characteristics", blob, "--state", self.state, **home)
        self.kmctl("characteristics", blob, **{**home, "KEYMASTER_TEE": "embedded:" + self.state})
        self.assertEqual(self.json("info", **home)["tee"], "embedded:" + self.path("xdg/keymaster"))
        home["XDG_STATE_HOME"] = ""
        self.assertEqual(self.json("info", **home)["tee"], "embedded:" + self.path("home/.local/state/keymaster"))
        self.assertTrue(os.path.isdir(self.path("home/.local/state/keymaster")))

    def test_a_state_folder_in_use_is_no_connection(self):
        blob = self.generate("--size", "1024")
        # A signature whose data has not ended yet keeps the device.
        with subprocess.Popen([self.program, "sign", blob, "-"], stdin=subprocess.PIPE, stdout=subprocess.PIPE,
                              stderr=subprocess.PIPE, env=self.environment()) as busy:
            busy.stdin.write(bytes(1 << 20))  # more than a pipe holds: it has begun to read, so it holds the device
            busy.stdin.flush()
            result = self.kmctl("characteristics", blob, expect=NO_CONNECTION)
            self.assertIn(b"TEE_ERROR_BUSY", result.stderr)
            self.assertIn(b"another process", result.stderr)
            signature, errors = busy.communicate()
        self.assertEqual((busy.returncode, len(signature)), (DONE, 128), errors)
        self.kmctl("characteristics", blob)

    def test_a_newer_state_is_no_connection_and_stays_untouched(self):
        blob = self.generate("--size", "1024")
        version = os.path.join(self.state, "version")
        with open(version, encoding="ascii") as file:
            current = int(file.read())
        with open(version, "w", encoding="ascii") as file:
            file.write(f"{current + 1}\n")
        result = self.kmctl("characteristics", blob, expect=NO_CONNECTION)
        self.assertIn(b"TEE_ERROR_BAD_STATE", result.stderr)
        self.assertIn(b"newer version", result.stderr)
        with open(version, "w", encoding="ascii") as file:
            file.write(f"{current}\n")
        self.kmctl("characteristics", blob)

    def test_other_ways_to_have_no_connection(self):
        self.kmctl("--tee", "nothing-of-the-kind", "info", expect=NO_CONNECTION)
        result = self.kmctl("info", expect=NO_CONNECTION, KEYMASTER_TA_PATH=self.path("no-images"))
        self.assertIn(b"KEYMASTER_TA_PATH", result.stderr)
        self.kmctl("--state", self.data, "info", expect=NO_CONNECTION)
        answer = self.json("--tee", "nothing-of-the-kind", "info", expect=NO_CONNECTION)["error"]
        self.assertEqual(answer["step"], "connect")

    def test_the_trace_goes_to_standard_error_on_demand(self):
        blob = self.generate("--size", "1024")
        changed = self.flipped(blob, 200, "changed.blob")
        line = b"AEDecryptFinal failed with 0xffff3071"
        self.assertNotIn(line, self.kmctl("characteristics", changed, expect=TEE_ERROR).stderr)
        self.assertIn(line, self.kmctl("--trace", "error", "characteristics", changed, expect=TEE_ERROR).stderr)
        self.assertIn(line, self.kmctl("characteristics", changed, expect=TEE_ERROR, KEYMASTER_TRACE="error").stderr)
        self.assertIn(b"get_key_character_size", self.kmctl("--trace", "info", "characteristics", blob).stderr)


class Demo(KmctlTest):
    STEPS = ["generate", "export", "sign", "verify", "openssl", "tampered_file", "tampered_blob", "ec_sign",
             "ec_openssl", "mac", "mac_openssl", "encrypt", "decrypt", "tampered_ciphertext", "openssl_encrypt",
             "decrypt_secret", "provision", "app_key", "statement_openssl", "auth_key", "sign_statement",
             "verify_statement", "altered_statement"]

    def test_the_demo_shows_every_step_and_leaves_what_openssl_can_check(self):
        told = self.json("demo", self.data, "-o", self.path("shown"))
        self.assertEqual([step["step"] for step in told["steps"]], self.STEPS)
        results = {step["step"]: step["result"] for step in told["steps"]}
        self.assertIn("Verified OK", results["openssl"])
        self.assertIn("KM_ERROR_VERIFICATION_FAILED", results["tampered_file"])
        self.assertIn("TEE_ERROR_MAC_INVALID", results["tampered_blob"])
        self.assertIn("Verified OK", results["ec_openssl"])
        self.assertIn(results["mac"].strip(), results["mac_openssl"])
        self.assertIn("KM_ERROR_VERIFICATION_FAILED", results["tampered_ciphertext"])
        self.assertIn(self.read("shown/secret.bin").hex(), results["decrypt_secret"])
        self.assertIn("Verified OK", results["statement_openssl"])
        self.assertIn("(signature)", results["altered_statement"])
        self.check_statements(results["verify_statement"])
        repeated = subprocess.run(told["commands"][0], shell=True, capture_output=True, check=True)
        self.assertIn(b"Verified OK", repeated.stdout)
        self.kmctl("verify", told["blob"], told["signature"], self.data)

    def check_statements(self, told):
        """The demo's chain, without kmctl: a parser of JSON, and openssl over the exact bytes."""
        def parts(name):
            data = self.read(f"shown/{name}.statement")
            length = int.from_bytes(data[:4], "little")
            return data[4:4 + length], data[4 + length:]

        signer = self.path("shown/attk.pem")
        for name, options in (("app", []), ("auth", []), ("sign", ["-sigopt", "rsa_padding_mode:pss"])):
            text, signature = parts(name)
            self.write("text", text)
            self.write("signature", signature)
            subprocess.run(["openssl", "dgst", "-sha256", *options, "-verify", signer, "-signature",
                            self.path("signature"), self.path("text")], check=True, capture_output=True)
            if name != "sign":
                signer = self.write("signer.pem", json.loads(text)["pub_key"].encode())
        message = json.loads(text.rstrip(b"\0"))
        self.assertIn(f"finger {message['fid']}, uid 10001, counter {message['counter']}, device {message['cpu_id']}", told)
        self.assertIn("pay 10 to Mary", message["raw"])

    def test_a_second_demo_goes_on_with_the_same_device(self):
        first = self.json("demo", self.data, "-o", self.path("first"))
        second = self.json("demo", self.data, "-o", self.path("second"))
        self.assertEqual(self.read("first/attk.pem"), self.read("second/attk.pem"))
        told = {step["step"]: step["result"] for step in second["steps"]}
        self.assertIn("has an attestation key already", told["provision"])
        before = {step["step"]: step["result"] for step in first["steps"]}
        counters = [int(re.search(r"counter (\d+)", text["verify_statement"])[1]) for text in (before, told)]
        self.assertEqual(counters[1], counters[0] + 3)

    def test_the_demo_works_in_plain_words_on_any_file(self):
        files = {"it's a file": b"x", "empty": b"", "large": bytes(300000)}
        for name, content in list(files.items())[:1 if EMULATED else None]:
            with self.subTest(name):
                told = self.kmctl("demo", self.write(name, content), "-o", self.path("of " + name)).stdout.decode()
                self.assertEqual(told.count("Refused, as it must be"), 4)
                self.assertEqual(told.count("Verified OK"), 3)
                self.assertIn(f"the file came back ({len(content):,} byte", told)
                self.assertRegex(told, r"1\. Generate an RSA-2048 key inside the TEE \([0-9.]+ ms\)")

    def test_the_demo_needs_a_file_and_respects_what_is_there(self):
        self.kmctl("demo", self.path("none"), expect=FAILURE)
        self.kmctl("demo", self.folder, expect=FAILURE)
        self.kmctl("demo", self.data, "-o", self.path("shown"))
        blob = self.read("shown/key.blob")
        self.kmctl("demo", self.data, "-o", self.path("shown"), expect=FAILURE)
        self.assertEqual(self.read("shown/key.blob"), blob)
        self.kmctl("demo", "--force", self.data, "-o", self.path("shown"))
        self.assertNotEqual(self.read("shown/key.blob"), blob)

    def test_the_demo_fails_when_openssl_does_not_agree(self):
        fake = self.path("bin")
        os.mkdir(fake)
        with open(os.path.join(fake, "openssl"), "w", encoding="ascii") as file:
            file.write("#!/bin/sh\necho Verification failure\nexit 1\n")
        os.chmod(os.path.join(fake, "openssl"), 0o755)
        result = self.kmctl("demo", self.data, "-o", self.path("shown"), expect=FAILURE, PATH=fake)
        self.assertIn(b"openssl did not accept", result.stderr)
        os.remove(os.path.join(fake, "openssl"))
        result = self.kmctl("demo", self.data, "-o", self.path("other"), expect=FAILURE, PATH=fake)
        self.assertIn(b"install openssl", result.stderr)


class Terminal(KmctlTest):
    def on_terminal(self, *arguments, stdout=None):
        """Runs kmctl with standard error (and output, unless it is given) on a terminal; gives what that shows."""
        leader, follower = pty.openpty()
        with subprocess.Popen([self.program, *arguments], stdin=subprocess.DEVNULL, stdout=stdout or follower,
                              stderr=follower, env=self.environment(), cwd=self.folder) as process:
            os.close(follower)
            shown = b""
            try:
                while piece := os.read(leader, 65536):
                    shown += piece
            except OSError:  # how a terminal ends on Linux
                pass
            os.close(leader)
            return process.wait(), shown

    def test_long_work_shows_that_it_lives(self):
        blob = self.generate("--size", "1024")
        for size in (1 << 28, 1 << 30, 1 << 32):  # until it takes this machine long enough
            with open(self.path("long"), "wb") as file:
                file.truncate(size)
            status, shown = self.on_terminal("sign", blob, self.path("long"), "-o", self.path("sig"))
            self.assertEqual(status, DONE, shown)
            if b"Signing" in shown:
                break
        self.assertIn(b"Signing [", shown)
        self.assertTrue(shown.split(b"\r\x1b[K")[-1].startswith(b"Signature of 128 bytes"), "the bar stayed")
        quiet = self.kmctl("sign", blob, self.path("long"), "-o", self.path("sig"))
        self.assertEqual(quiet.stderr, b"")

    def test_key_generation_shows_that_it_lives(self):
        for _ in range(20):  # the primes are found by luck, at times before anybody could wonder
            status, shown = self.on_terminal("generate", "--force", "--size", LONG_KEY, self.path("key.blob"))
            self.assertEqual(status, DONE, shown)
            if b"Generating" in shown:
                break
        self.assertRegex(shown, rb"\r\x1b\[KGenerating the RSA-%s key \|  0\.\d s" % LONG_KEY.encode())
        last = shown.split(b"\r\x1b[K")[-1]
        self.assertTrue(last.startswith(b"Generated RSA-%s key" % LONG_KEY.encode()), "the mark stayed")

    def test_binary_does_not_go_to_a_terminal(self):
        blob = self.generate("--size", "1024")
        status, shown = self.on_terminal("sign", blob, self.data)
        self.assertEqual(status, USAGE)
        self.assertIn(b"-o", shown)


class Help(KmctlTest):
    def test_help_teaches(self):
        told = self.kmctl("--help").stdout.decode()
        for words in ("Exit codes:", "6  signature, MAC, tag or statement invalid", "KEYMASTER_STATE", "demo"):
            self.assertIn(words, told)
        for command in ("info", "generate", "import", "export", "characteristics", "sign", "verify", "encrypt",
                        "decrypt", "delete", "delete-all", "demo", "device provision", "device status",
                        "attest status", "attest export-attk", "attest device-id", "finger enrol", "finger touch",
                        "finger list", "finger remove", "auth enrol", "auth token", "statement verify"):
            self.assertIn(f"Examples:\n  ", self.kmctl(*command.split(), "--help").stdout.decode(), command)
        self.assertRegex(self.kmctl("--version").stdout.decode(), r"^kmctl \d+\.\d+\.\d+\n$")


if __name__ == "__main__":
    main(__doc__)
