#!/usr/bin/env python3
"""Where kmctl writes: streams that don't take it, files that must not be lost, writes that fail half way.

usage: outputs_test.py KMCTL [unittest arguments]
"""

import json
import os
import resource
import subprocess

from kmctl_case import DONE, FAILURE, INVALID, KEYMASTER, NO_CONNECTION, USAGE, KmctlTest, embedded_only, main, openssl

CLOSED = {"stdin": "0<&-", "stdout": "1>&-", "stderr": "2>&-"}


class StreamsTest(KmctlTest):
    def redirected(self, redirection, *arguments, expect, data=b""):
        """Runs kmctl with a redirection of the shell's."""
        words = ["sh", "-c", f'"$@" {redirection}', "sh", self.program, *arguments]
        result = subprocess.run(words, input=data, capture_output=True, env=self.environment(), cwd=self.folder,
                                check=False)
        self.assertEqual(result.returncode, expect, f"kmctl {arguments} {redirection}: {result.stderr!r}")
        return result


class StandardOutput(StreamsTest):
    def text_commands(self):
        blob = self.generate("--size", "1024")
        self.kmctl("sign", blob, self.data, "-o", self.path("sig"))
        made = [self.path(f"made{i}") for i in range(9)]
        openssl("genrsa", "-out", self.path("private.pem"), "1024")
        aes = self.generate("--algorithm", "aes", name="aes.blob")
        self.kmctl("encrypt", aes, self.data, "-o", self.path("enc"))
        return [["info"], ["info", "--json"], ["generate", "--size", "1024", made[0]],
                ["import", self.path("private.pem"), made[1]], ["export", blob], ["export", blob, "-o", made[2]],
                ["characteristics", blob], ["characteristics", "--json", blob], ["sign", blob, self.data, "-o", made[3]],
                ["verify", blob, self.path("sig"), self.data], ["verify", "--json", blob, self.path("sig"), self.data],
                ["encrypt", aes, self.data, "-o", made[4]], ["decrypt", aes, self.path("enc"), "-o", made[5]],
                ["device", "status"], ["attest", "status"], ["finger", "list"], ["finger", "enrol", "1"],
                ["delete-all"], ["demo", self.data, "-o", made[6]], ["--help"], ["sign", "--help"], ["--version"],
                ["delete", blob]]

    def test_every_text_command_fails_when_its_answer_cannot_be_written(self):
        for redirection, reason in (("1>/dev/full", b"No space left on device"), ("1>&-", b"Bad file descriptor")):
            for arguments in self.text_commands():
                with self.subTest(arguments=arguments, redirection=redirection):
                    result = self.redirected(redirection, *arguments, expect=FAILURE)
                    self.assertIn(b"kmctl" if "--json" not in arguments else b'"message"', result.stderr)
                    self.assertIn(b"can't write standard output: " + reason, result.stderr)
                    self.assertIn(b"hint", result.stderr)
            for name in os.listdir(self.folder):
                if name != "letter.txt" and os.path.isfile(self.path(name)):
                    os.remove(self.path(name))
            subprocess.run(["rm", "-r", self.path("made6")], check=True)

    def test_binary_commands_fail_too(self):
        blob = self.generate("--size", "1024")
        aes = self.generate("--algorithm", "aes", name="aes.blob")
        self.kmctl("encrypt", aes, self.data, "-o", self.path("enc"))
        for redirection in ("1>/dev/full", "1>&-"):
            for arguments in (["sign", blob, self.data], ["export", "--der", blob], ["generate", "--size", "1024", "-"],
                              ["encrypt", aes, self.data], ["decrypt", aes, self.path("enc")]):
                with self.subTest(arguments=arguments, redirection=redirection):
                    self.assertIn(b"can't write standard output",
                                  self.redirected(redirection, *arguments, expect=FAILURE).stderr)

    def test_a_refusal_keeps_its_exit_code_and_is_told_elsewhere(self):
        blob = self.generate("--size", "1024")
        bad = self.write("bad", bytes(128))
        for redirection in ("1>/dev/full", "1>&-"):
            told = self.redirected(redirection, "verify", "--json", blob, bad, self.data, expect=INVALID).stderr
            self.assertIs(json.loads(told)["valid"], False)
            told = self.redirected(redirection, "sign", "--json", blob, self.path("none"), "-o", "x", expect=FAILURE)
            self.assertIn("none", json.loads(told.stderr)["error"]["message"])
            self.redirected(redirection, "frobnicate", "--json", expect=USAGE)


class StandardError(StreamsTest):
    def test_exit_codes_do_not_depend_on_it(self):
        blob = self.generate("--size", "1024")
        self.kmctl("sign", blob, self.data, "-o", self.path("sig"))
        bad = self.write("bad", bytes(128))
        for redirection in ("2>&-", "2>/dev/full"):
            for expect, arguments in ((DONE, ["verify", blob, self.path("sig"), self.data]),
                                      (FAILURE, ["verify", blob, self.path("none"), self.data]),
                                      (USAGE, ["frobnicate"]), (USAGE, []),
                                      (KEYMASTER, ["sign", "--padding", "pss", blob, self.data]),
                                      (NO_CONNECTION, ["--tee", "nothing", "info"]),
                                      (INVALID, ["verify", blob, bad, self.data]),
                                      (DONE, ["sign", "--json", blob, self.data])):
                with self.subTest(arguments=arguments, redirection=redirection):
                    self.redirected(redirection, *arguments, expect=expect)

    def test_a_closed_stream_becomes_no_file(self):
        """What is printed must not go into the first file that is opened."""
        blob = self.generate("--size", "1024")
        everything = " ".join(CLOSED.values())
        state = {name: os.path.getsize(os.path.join(self.state, name)) for name in os.listdir(self.state)}
        for redirection in (*CLOSED.values(), everything):
            expect = FAILURE if "1>" in redirection else DONE
            self.redirected(redirection, "--trace", "debug", "characteristics", blob, expect=expect)
        self.redirected("0<&-", "sign", blob, "-", expect=FAILURE)
        self.assertEqual({name: os.path.getsize(os.path.join(self.state, name)) for name in os.listdir(self.state)},
                         state)
        self.kmctl("characteristics", blob)


class Json(StreamsTest):
    def test_a_failure_never_goes_into_the_data(self):
        blob = self.generate("--size", "1024")
        aes = self.generate("--algorithm", "aes", name="aes.blob")
        for expect, arguments in ((FAILURE, ["sign", blob, self.path("none")]),
                                  (FAILURE, ["sign", blob, self.path("none"), "-o", "-"]),
                                  (USAGE, ["sign", blob, "--nonsense"]), (USAGE, ["export"]),
                                  (USAGE, ["generate", "--digest", "sha-3", "-"]),
                                  (KEYMASTER, ["sign", "--padding", "pss", blob, self.data]), (KEYMASTER, ["export", aes]),
                                  (FAILURE, ["import", self.data, "-"]),
                                  (INVALID, ["decrypt", aes, self.data])):
            with self.subTest(arguments=arguments):
                result = self.kmctl("--json", *arguments, expect=expect)
                self.assertEqual(result.stdout, b"")
                self.assertEqual(json.loads(result.stderr)["error"]["exit_code"], expect)

    def test_otherwise_it_goes_where_the_answer_would(self):
        blob = self.generate("--size", "1024")
        for expect, arguments in ((FAILURE, ["sign", blob, self.path("none"), "-o", self.path("x")]),
                                  (USAGE, ["sign", blob, "--nonsense", "-o", self.path("x")]),
                                  (USAGE, ["generate", "--digest", "sha-3", self.path("x")]),
                                  (FAILURE, ["characteristics", self.path("none")]), (USAGE, ["frobnicate"])):
            with self.subTest(arguments=arguments):
                result = self.kmctl("--json", *arguments, expect=expect)
                self.assertEqual(json.loads(result.stdout)["error"]["exit_code"], expect)
                self.assertEqual(result.stderr, b"")


class PreciousFiles(KmctlTest):
    def test_an_input_is_never_overwritten_by_the_blob(self):
        openssl("genrsa", "-out", self.path("private.pem"), "1024")
        private = self.read("private.pem")
        secret = self.write("secret", b"open sesame")
        os.symlink("private.pem", self.path("link.pem"))
        for file, blob in (("private.pem", "private.pem"), ("private.pem", "link.pem"), ("link.pem", "private.pem")):
            result = self.kmctl("import", "--force", self.path(file), self.path(blob), expect=USAGE)
            self.assertIn(b"is an input of this command", result.stderr)
        result = subprocess.run(["sh", "-c", '"$@" < private.pem', "sh", self.program, "import", "--force", "-",
                                 self.path("private.pem")], capture_output=True, env=self.environment(),
                                cwd=self.folder, check=False)
        self.assertEqual(result.returncode, USAGE, result.stderr)
        value = "@" + secret
        for arguments in (["import", "--force", "--passphrase", value, self.path("private.pem"), secret],
                          ["import", "--force", "--app-id", value, self.path("private.pem"), secret],
                          ["generate", "--force", "--app-id", value, secret],
                          ["generate", "--force", "--app-data", value, secret]):
            self.kmctl(*arguments, expect=USAGE)
        self.assertEqual((self.read("private.pem"), self.read("secret")), (private, b"open sesame"))

    def test_nor_by_any_other_output(self):
        secret = self.write("secret", b"id")
        nonce = self.write("nonce", bytes(12))
        bound = ["--app-id", "@" + secret]
        rsa = self.generate("--size", "1024", *bound, name="rsa")
        aes = self.generate("--algorithm", "aes", "--caller-nonce", *bound, name="aes")
        before = {name: self.read(name) for name in ("secret", "nonce", "rsa", "aes", "letter.txt")}
        for arguments in (["export", *bound, rsa, "-o", secret], ["export", rsa, "-o", rsa],
                          ["sign", *bound, rsa, self.data, "-o", secret], ["sign", rsa, self.data, "-o", self.data],
                          ["sign", "--auth-token", nonce, rsa, self.data, "-o", nonce],
                          ["encrypt", *bound, aes, self.data, "-o", secret],
                          ["encrypt", "--aad", "@" + nonce, aes, self.data, "-o", nonce],
                          ["encrypt", "--nonce", "@" + nonce, aes, self.data, "-o", nonce],
                          ["encrypt", "--nonce", "@" + nonce, aes, self.data, "-o", "x", "--nonce-out", nonce],
                          ["encrypt", "--nonce-out", aes, aes, self.data, "-o", "x"],
                          ["decrypt", "--aad", "@" + nonce, aes, self.data, "-o", nonce]):
            with self.subTest(arguments=arguments):
                self.kmctl(*arguments, expect=USAGE)
        self.assertEqual({name: self.read(name) for name in before}, before)
        self.assert_folder_holds("secret", "nonce", "rsa", "aes")

    def test_the_demo_overwrites_nothing_that_it_is_not_told_to(self):
        self.kmctl("demo", self.data, "-o", self.path("shown"))
        left = sorted(os.listdir(self.path("shown")))
        self.assertGreater(len(left), 10)
        folder = self.path("mine")
        os.mkdir(folder)
        for name in left:
            with self.subTest(name):
                mine = self.write(os.path.join("mine", name), b"precious")
                self.assertIn(b"--force", self.kmctl("demo", self.data, "-o", folder, expect=FAILURE).stderr)
                self.assertEqual((self.read(mine), os.listdir(folder)), (b"precious", [name]))
                # Its own input it does not take even then, under any name.
                for file in (mine, self.path("link")):
                    if file != mine:
                        os.symlink(mine, file)
                    self.kmctl("demo", "--force", file, "-o", folder, expect=USAGE)
                    self.assertEqual((self.read(mine), os.listdir(folder)), (b"precious", [name]))
                os.remove(mine)
                os.remove(self.path("link"))

    def test_the_demo_names_a_folder_that_cannot_be(self):
        result = self.kmctl("demo", self.data, "-o", self.data, expect=FAILURE)
        self.assertIn(b"hint: ", result.stderr)


class HalfWritten(KmctlTest):
    LIMIT = 48 << 20  # more than any file of the device, and than the copy of the TA's image in memory

    def setUp(self):
        super().setUp()
        self.large = self.path("large")
        with open(self.large, "wb") as file:
            file.truncate(self.LIMIT + (1 << 20))

    def limited(self, limit, *arguments, expect):
        """Runs kmctl with a limit on the size of the files that it writes."""
        result = subprocess.run([self.program, *arguments], capture_output=True, env=self.environment(), check=False,
                                preexec_fn=lambda: resource.setrlimit(resource.RLIMIT_FSIZE, (limit, limit)))
        self.assertEqual(result.returncode, expect, result.stderr)
        return result

    def test_a_write_that_fails_half_way_changes_nothing(self):
        blob = self.generate("--algorithm", "aes")
        ciphertext = self.path("enc")
        self.kmctl("encrypt", blob, self.large, "-o", ciphertext)
        kept = self.write("kept", b"what was there before")
        for arguments in (["encrypt", blob, self.large], ["decrypt", blob, ciphertext]):
            for out in (kept, self.path("new")):
                with self.subTest(arguments=arguments[0], out=out):
                    result = self.limited(self.LIMIT, *arguments, "-o", out, expect=FAILURE)
                    self.assertIn(b"can't write " + out.encode() + b": File too large", result.stderr)
                    self.assertIn(b"hint: ", result.stderr)
                    self.assertEqual(self.read("kept"), b"what was there before")
                    self.assert_folder_holds("key.blob", "enc", "kept", "large")
        self.limited(2 * self.LIMIT, "decrypt", blob, ciphertext, "-o", kept, expect=DONE)
        subprocess.run(["cmp", kept, self.large], check=True)

    def test_so_does_text_that_is_held_back_for_standard_output(self):
        blob = self.generate("--algorithm", "aes")
        self.kmctl("encrypt", blob, self.large, "-o", self.path("enc"))
        self.assertEqual(self.limited(self.LIMIT, "decrypt", blob, self.path("enc"), expect=FAILURE).stdout, b"")

    def test_a_file_that_is_replaced_stays_as_private_as_it_was(self):
        blob = self.generate("--size", "1024")
        private = self.write("sig", b"")
        os.chmod(private, 0o600)
        self.kmctl("sign", blob, self.data, "-o", private)
        self.kmctl("export", blob, "-o", self.write("public.pem", b""))
        self.assertEqual(os.stat(private).st_mode & 0o777, 0o600)
        self.assertEqual(os.path.getsize(private), 128)


class Folders(KmctlTest):
    def test_a_folder_of_something_else_does_not_become_a_device(self):
        result = self.kmctl("--state", self.folder, "info", expect=NO_CONNECTION)
        self.assertIn(b"TEE_ERROR_BAD_PARAMETERS", result.stderr)
        self.assertIn(b"left alone", result.stderr)
        self.assertIn(b"neither empty nor a device's state",
                      self.kmctl("--trace", "error", "--state", self.folder, "info", expect=NO_CONNECTION).stderr)
        self.assert_folder_holds()

    @embedded_only
    def test_every_failure_says_what_to_try(self):
        blob = self.generate("--size", "1024")
        os.mkdir(self.path("images"))
        broken = self.write("images/fbacea43-f475-4df3-866f-76256aba994f.ta", b"\x7fELF of no use")
        state = self.path("device")
        os.mkdir(state)
        self.write("device/settings", b"rpbm = off\n")
        images = {"KEYMASTER_TA_PATH": os.path.dirname(broken)}
        for words, expect, arguments, extra in (
                (b"build it again", NO_CONNECTION, ["info"], images),
                (b"`settings`", NO_CONNECTION, ["--state", state, "info"], {}),
                (b"check the name", FAILURE, ["sign", blob, self.path("none")], {}),
                (b"not a folder", FAILURE, ["characteristics", self.folder], {}),
                (b"make the folder", FAILURE, ["generate", self.path("no/such")], {}),
                (b"is not a folder", FAILURE, ["sign", blob, self.data, "-o", os.path.join(self.data, "x")], {}),
                (b"right file", FAILURE, ["characteristics", self.write("large", bytes(2 << 20))], {})):
            with self.subTest(arguments=arguments):
                told = self.kmctl(*arguments, expect=expect, **extra).stderr
                self.assertIn(words, told.split(b"hint: ")[-1])


if __name__ == "__main__":
    main(__doc__)
