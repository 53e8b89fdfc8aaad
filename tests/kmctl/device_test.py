#!/usr/bin/env python3
"""kmctl device and kmctl attest: a device's way through the factory, judged by openssl and this script's own eyes.

usage: device_test.py KMCTL [unittest arguments]
"""

import json
import os

from kmctl_case import FAILURE, KEYMASTER, TEE_ERROR, USAGE, KmctlTest, main, openssl

NOTHING = {"key": False, "soter_properties": False, "cpu_id": False, "device_id": False, "data": False,
           "locked": False}
PROVISIONED = {**NOTHING, "key": True, "soter_properties": True, "cpu_id": True, "device_id": True}
RECORD_MEMBERS = ["device_id", "cpu_id", "tee_n", "tee_v", "fp_n", "fp_v", "attk"]


class DeviceTest(KmctlTest):
    def setUp(self):
        super().setUp()
        self.state = self.path("state")  # a device that nobody has touched

    def private_key(self, bits=2048, name="attk-private.pem"):
        openssl("genrsa", "-out", self.path(name), str(bits))
        return self.path(name)

    def failure(self, *arguments, expect):
        return self.json(*arguments, expect=expect)["error"]

    def public_of(self, pem):
        """The key of a PEM text as openssl writes it."""
        return openssl("pkey", "-pubin", "-outform", "DER", data=pem).stdout


class ANewDevice(DeviceTest):
    def test_has_nothing(self):
        self.assertEqual(self.json("device", "status"), NOTHING)
        self.assertEqual(self.json("attest", "status"), {"attk": "absent", "ready": False})
        self.assertEqual(self.kmctl("attest", "status").stdout, b"attestation key  absent\nready            no\n")

    def test_tells_what_is_missing_by_the_statuses_own_names(self):
        told = self.failure("attest", "export-attk", "-o", self.path("attk.pem"), expect=KEYMASTER)
        self.assertEqual(told["step"], "soter_export_attk_public_key")
        self.assertEqual(told["soter_status"], {"name": "SOTER_STATUS_NO_ATTK", "value": -1})
        self.assertEqual(told["tee_result"], {"name": "TEE_SUCCESS", "value": 0})
        self.assertIn("kmctl device provision", told["hint"])
        self.assertNotIn("keymaster_error", told)
        told = self.failure("attest", "device-id", expect=KEYMASTER)
        self.assertEqual(told["soter_status"], {"name": "KM_ERROR_UNKNOWN_ERROR", "value": -1000})
        self.assertIn("has no id", told["hint"])
        self.assertFalse(os.path.exists(self.path("attk.pem")))


class Provisioning(DeviceTest):
    def provision(self, *arguments, **how):
        return self.json("device", "provision", *arguments, **how)

    def test_the_device_attests_with_what_was_put_in_and_the_record_says_so(self):
        told = self.provision("--record", self.path("record.json"))
        self.assertEqual(list(told), ["attk", "device_id", "cpu_id", "fp_n", "fp_v", "record", "locked"])
        self.assertEqual((told["attk"], told["record"], told["locked"]), ("generated", self.path("record.json"), False))
        self.assertRegex(told["device_id"], "^[0-9a-f]{64}$")
        self.assertRegex(told["cpu_id"], "^[0-9a-f]{32}$")
        self.assertEqual(self.json("device", "status"), PROVISIONED)
        self.assertEqual(self.json("attest", "status"), {"attk": "present", "ready": True})
        self.assertEqual(self.json("attest", "device-id"), {"device_id": told["device_id"]})
        self.assertEqual(self.kmctl("attest", "device-id").stdout.decode(), told["device_id"] + "\n")

        text = self.read("record.json").decode("ascii")
        self.assertTrue(text.endswith("}\n"))
        record = json.loads(text)
        self.assertEqual(list(record), RECORD_MEMBERS)
        for name in ("device_id", "cpu_id", "fp_n", "fp_v"):
            self.assertEqual(record[name], told[name], name)
        properties = self.json("info")["tee_properties"]
        self.assertEqual(record["tee_n"], properties["gpd.tee.trustedos.manufacturer"])
        self.assertEqual(record["tee_v"], properties["gpd.tee.trustedos.implementation.version"])
        attk = self.kmctl("attest", "export-attk").stdout
        self.assertEqual(self.public_of(record["attk"].encode()), self.public_of(attk))
        self.assertIn(b"(2048 bit)", openssl("pkey", "-pubin", "-text", "-noout", data=attk).stdout)
        self.assert_folder_holds("state", "record.json")

    def test_no_two_devices_are_alike(self):
        first = self.provision()
        self.state = self.path("other")
        second = self.provision()
        self.assertNotEqual(first["device_id"], second["device_id"])
        self.assertNotEqual(first["cpu_id"], second["cpu_id"])
        keys = []
        for state in ("state", "other"):
            self.state = self.path(state)
            keys.append(self.kmctl("attest", "export-attk").stdout)
        self.assertNotEqual(*keys)

    def test_what_is_said_is_what_goes_in(self):
        key = self.private_key()
        told = self.provision("--key", key, "--sensor-name", "FP-1", "--sensor-version", "2.0", "--cpu-id", "4711",
                              "--device-id", "hex:000102030405060708090a0b0c0d0e0f",
                              "--record", self.path("record.json"))
        self.assertEqual(told["attk"], "imported")
        record = json.loads(self.read("record.json"))
        self.assertEqual((record["fp_n"], record["fp_v"], record["cpu_id"]), ("FP-1", "2.0", "4711"))
        self.assertEqual(record["device_id"], "000102030405060708090a0b0c0d0e0f")
        expected = openssl("pkey", "-in", key, "-pubout").stdout
        self.assertEqual(record["attk"].encode(), expected)
        self.assertEqual(self.kmctl("attest", "export-attk").stdout, expected)
        self.assertEqual(self.json("attest", "export-attk", "-o", self.path("attk.pem")),
                         {"output": self.path("attk.pem"), "format": "pem", "key": "RSA-2048"})
        self.assertEqual(self.read("attk.pem"), expected)

    def test_an_encrypted_key_file_needs_its_passphrase(self):
        key = self.private_key()
        openssl("pkcs8", "-topk8", "-in", key, "-out", self.path("encrypted.pem"), "-passout", "pass:open sesame")
        self.write("passphrase", b"open sesame\n")
        self.write("wrong", b"swordfish\n")
        self.kmctl("device", "provision", "--key", self.path("encrypted.pem"), expect=FAILURE)
        self.kmctl("device", "provision", "--key", self.path("encrypted.pem"), "--passphrase-file", self.path("wrong"),
                   expect=FAILURE)
        self.assertEqual(self.json("device", "status"), NOTHING)
        self.provision("--key", self.path("encrypted.pem"), "--passphrase-file", self.path("passphrase"))
        self.assertEqual(self.kmctl("attest", "export-attk").stdout, openssl("pkey", "-in", key, "-pubout").stdout)

    def test_the_key_may_come_and_the_record_go_through_pipes(self):
        key = self.private_key()
        with open(key, "rb") as file:
            result = self.kmctl("device", "provision", "--key", "-", "--record", "-", data=file.read())
        self.assertEqual(list(json.loads(result.stdout)), RECORD_MEMBERS)
        self.assertIn(b"Provisioned", result.stderr)

    def test_texts_that_do_not_fit_are_refused_before_anything_is_asked(self):
        for arguments in (["--cpu-id", ""], ["--cpu-id", "x" * 64], ["--cpu-id", "\u00e4"], ["--device-id", ""],
                          ["--sensor-name", ""],
                          ["--sensor-name", "x" * 64], ["--sensor-version", "a\nb"],
                          ["--device-id", "text:fifteen bytes.."[:20]],
                          ["--device-id", "hex:" + "00" * 33], ["--device-id", "hex:0g"],
                          ["--passphrase-file", self.path("letter.txt")]):
            with self.subTest(arguments=arguments):
                self.kmctl("device", "provision", *arguments, expect=USAGE)
        self.assert_no_device()
        self.provision("--cpu-id", "x" * 63, "--device-id", "sixteen bytes...")
        self.assertEqual(self.json("attest", "device-id")["device_id"], b"sixteen bytes...".hex())

    def test_a_file_that_is_no_attestation_key_is_refused(self):
        openssl("ecparam", "-name", "prime256v1", "-genkey", "-noout", "-out", self.path("ec.pem"))
        for path in (self.private_key(1024, "small.pem"), self.path("ec.pem"), self.data, self.path("none")):
            with self.subTest(path=path):
                self.kmctl("device", "provision", "--key", path, expect=FAILURE)
        self.assert_no_device()


class TheLock(DeviceTest):
    def test_nothing_changes_after_it(self):
        self.json("device", "provision", "--record", self.path("record.json"), "--lock")
        self.assertEqual(self.json("device", "status"), {**PROVISIONED, "locked": True})
        attk = self.kmctl("attest", "export-attk").stdout
        for arguments in ([], ["--force"], ["--lock"], ["--force", "--key", self.private_key()]):
            with self.subTest(arguments=arguments):
                told = self.failure("device", "provision", *arguments, expect=TEE_ERROR)
                self.assertEqual(told["tee_result"]["name"], "TEE_ERROR_ACCESS_DENIED")
                self.assertEqual(told["tee_origin"], "TRUSTED_APP")
                self.assertIn("locked", told["hint"])
        self.assertEqual(self.json("device", "status"), {**PROVISIONED, "locked": True})
        self.assertEqual(self.kmctl("attest", "export-attk").stdout, attk)
        self.assertEqual(self.public_of(json.loads(self.read("record.json"))["attk"].encode()), self.public_of(attk))

    def test_a_record_that_cannot_be_written_leaves_the_device_open(self):
        self.kmctl("device", "provision", "--record", self.path("no/such/folder"), "--lock", expect=FAILURE)
        self.assert_no_device("nothing is made before the record's place is known to be good")
        self.kmctl("device", "provision", "--record", "/dev/full", "--lock", expect=FAILURE)
        self.assertEqual(self.json("device", "status"), PROVISIONED)

    def test_a_refused_device_leaves_no_record(self):
        self.json("device", "provision", "--lock")
        self.kmctl("device", "provision", "--record", self.path("record.json"), expect=TEE_ERROR)
        self.assert_folder_holds("state")


class TheSecondTime(DeviceTest):
    def test_a_key_and_a_record_are_replaced_only_by_force(self):
        record = self.path("record.json")
        first = self.json("device", "provision", "--record", record)
        told = self.failure("device", "provision", expect=FAILURE)
        self.assertIn("--force", told["hint"])
        self.kmctl("device", "provision", "--record", record, expect=FAILURE)
        self.assertEqual(json.loads(self.read("record.json"))["device_id"], first["device_id"])
        second = self.json("device", "provision", "--record", record, "--force")
        self.assertNotEqual(second["device_id"], first["device_id"])
        self.assertEqual(json.loads(self.read("record.json"))["device_id"], second["device_id"])
        self.assertEqual(self.json("attest", "device-id")["device_id"], second["device_id"])

    def test_the_record_does_not_take_the_place_of_an_input(self):
        key = self.private_key()
        kept = self.read("attk-private.pem")
        self.kmctl("device", "provision", "--key", key, "--record", key, "--force", expect=USAGE)
        self.assertEqual(self.read("attk-private.pem"), kept)
        self.assert_no_device()


class TheCommandLine(DeviceTest):
    GROUPS = {"device": ["provision", "status"], "attest": ["status", "export-attk", "device-id"],
              "finger": ["enrol", "touch", "list", "remove"], "auth": ["enrol", "token"]}

    def test_every_command_of_every_group_has_help_with_examples(self):
        for group, commands in self.GROUPS.items():
            text = self.kmctl(group, "--help").stdout.decode()
            for command in commands:
                with self.subTest(group=group, command=command):
                    self.assertIn(command, text)
                    own = self.kmctl(group, command, "--help").stdout.decode()
                    self.assertIn("Examples:", own)
                    self.assertIn(f"kmctl {group} {command}", own)

    def test_a_group_needs_one_of_its_commands(self):
        for group in self.GROUPS:
            with self.subTest(group=group):
                told = self.failure(group, expect=USAGE)
                self.assertEqual(told["hint"], f"see kmctl {group} --help")
                self.kmctl(group, "frobnicate", expect=USAGE)
                self.kmctl(group, "sign", expect=USAGE)  # one of another place
        self.assertEqual(self.failure("device", "status", "--frobnicate", expect=USAGE)["hint"],
                         "see kmctl device status --help")
        self.assert_no_device()

    def test_the_programs_own_options_stand_anywhere(self):
        for words in (["--json", "device", "status"], ["device", "--json", "status"], ["device", "status", "--json"]):
            self.assertEqual(json.loads(self.kmctl(*words).stdout), NOTHING, words)
        other = self.path("another")
        self.kmctl("device", "status", "--state", other)
        self.assertTrue(os.path.isdir(other))

    def test_status_is_text_for_people(self):
        self.assertEqual(self.kmctl("device", "status").stdout.decode(),
                         "attestation key     none\nfingerprint sensor  none\ncpu id              none\n"
                         "device id           none\nfactory's own data  none\nlocked              no\n")


if __name__ == "__main__":
    main(__doc__)
