#!/usr/bin/env python3
"""kmctl encrypt and decrypt, judged by the openssl command.

usage: ciphers_test.py KMCTL [unittest arguments]

openssl enc has no GCM, so that is put together here from its AES-ECB and AES-CTR and a GHASH of a few lines.
"""

import json
import os
import signal
import subprocess
import time

from kmctl_case import DONE, FAILURE, INVALID, KEYMASTER, TEE_ERROR, USAGE, KmctlTest, main, openssl

SIZES = (128, 192, 256)
KEY = bytes(range(1, 33))


def openssl_cipher(mode, key, nonce, text, *options):
    initial = ["-iv", nonce.hex()] if nonce else []
    return openssl("enc", f"-aes-{len(key) * 8}-{mode}", "-K", key.hex(), *initial, *options, data=text).stdout


def multiply(x, y):
    """The product in the field of GHASH."""
    product = 0
    for bit in range(127, -1, -1):
        if x >> bit & 1:
            product ^= y
        y = y >> 1 ^ (0xE1 << 120 if y & 1 else 0)
    return product


def gcm_encrypt(key, nonce, text, associated_data=b""):
    """AES-GCM with a nonce of 12 bytes: ciphertext and tag."""
    subkey = int.from_bytes(openssl_cipher("ecb", key, b"", bytes(16), "-nopad"), "big")
    ciphertext = openssl_cipher("ctr", key, nonce + b"\0\0\0\2", text)
    blocks = b"".join(part + bytes(-len(part) % 16) for part in (associated_data, ciphertext))
    blocks += (len(associated_data) * 8).to_bytes(8, "big") + (len(ciphertext) * 8).to_bytes(8, "big")
    state = 0
    for i in range(0, len(blocks), 16):
        state = multiply(state ^ int.from_bytes(blocks[i:i + 16], "big"), subkey)
    mask = openssl_cipher("ecb", key, b"", nonce + b"\0\0\0\1", "-nopad")
    return ciphertext + bytes(a ^ b for a, b in zip(state.to_bytes(16, "big"), mask))


class CipherTest(KmctlTest):
    def import_key(self, *options, size=256):
        blob = self.path(f"aes-{size}.blob")
        self.kmctl("import", "--algorithm", "aes", "--force", *options, self.write("raw.key", KEY[:size // 8]), blob)
        return blob

    def encrypt(self, blob, *options, source=None, name="letter.enc"):
        self.kmctl("encrypt", *options, blob, source or self.data, "-o", self.path(name))
        return self.path(name)


class Modes(CipherTest):
    def test_openssl_decrypts_what_kmctl_encrypts_and_the_other_way_round(self):
        cases = [("ecb", "pkcs7", 0), ("ecb", "none", 0), ("cbc", "pkcs7", 16), ("cbc", "none", 16), ("ctr", "none", 16)]
        letter = self.read(self.data)
        for size in SIZES:
            key = KEY[:size // 8]
            for mode, padding, nonce_size in cases:
                with self.subTest(size=size, mode=mode, padding=padding):
                    text = self.write("text", letter if padding == "pkcs7" or mode == "ctr" else letter[:65536 + 160])
                    nopad = ["-nopad"] if padding == "none" and mode != "ctr" else []
                    blob = self.import_key("--block-mode", mode, "--padding", padding, size=size)
                    ours = self.read(self.encrypt(blob, source=text))
                    nonce, ciphertext = ours[:nonce_size], ours[nonce_size:]
                    self.assertEqual(openssl_cipher(mode, key, nonce, ciphertext, "-d", *nopad), self.read(text))
                    theirs = nonce + openssl_cipher(mode, key, nonce, self.read(text), *nopad)
                    self.assertEqual(self.kmctl("decrypt", blob, data=theirs).stdout, self.read(text))

    def test_gcm_is_the_standards_in_both_directions(self):
        text = self.read(self.data)[:5000]
        for size in SIZES:
            for aad in (b"", b"to: Mary", bytes(100)):
                with self.subTest(size=size, aad=aad):
                    blob = self.import_key(size=size)
                    options = ["--aad", "hex:" + aad.hex()] if aad else []
                    ours = self.kmctl("encrypt", *options, blob, data=text).stdout
                    self.assertEqual(ours[12:], gcm_encrypt(KEY[:size // 8], ours[:12], text, aad))
                    nonce = bytes(range(12))
                    theirs = nonce + gcm_encrypt(KEY[:size // 8], nonce, text, aad)
                    self.assertEqual(self.kmctl("decrypt", *options, blob, data=theirs).stdout, text)

    def test_a_shorter_tag_is_the_front_of_the_whole_one(self):
        blob = self.import_key("--min-mac-length", "96", "--caller-nonce")
        nonce = ["--nonce", "00" * 12]
        whole = self.kmctl("encrypt", *nonce, blob, data=b"text").stdout
        short = self.kmctl("encrypt", *nonce, "--mac-length", "96", blob, data=b"text").stdout
        self.assertEqual(short, whole[:-4])
        self.assertEqual(self.kmctl("decrypt", "--mac-length", "96", blob, data=short).stdout, b"text")
        self.assertIn(b"KM_ERROR_INVALID_MAC_LENGTH",
                      self.kmctl("encrypt", "--mac-length", "64", blob, data=b"text", expect=KEYMASTER).stderr)

    def test_every_length_comes_back(self):
        for mode in ("ecb", "cbc", "ctr", "gcm"):
            blob = self.generate("--algorithm", "aes", "--block-mode", mode, name=mode)
            for length in (0, 1, 15, 16, 17, 65535, 65536, 65537, 200000):
                text = os.urandom(length)
                ciphertext = self.kmctl("encrypt", blob, data=text).stdout
                self.assertEqual(self.kmctl("decrypt", blob, data=ciphertext).stdout, text, (mode, length))

    def test_two_encryptions_differ(self):
        blob = self.generate("--algorithm", "aes")
        self.assertNotEqual(self.kmctl("encrypt", blob, data=b"x").stdout[:12],
                            self.kmctl("encrypt", blob, data=b"x").stdout[:12])

    def test_what_the_key_leaves_open_is_asked_for(self):
        blob = self.generate("--algorithm", "aes", "--block-mode", "cbc,ctr")
        self.assertIn(b"the key allows more than one block-mode: cbc, ctr",
                      self.kmctl("encrypt", blob, self.data, expect=USAGE).stderr)
        told = self.json("encrypt", "--block-mode", "ctr", blob, self.data, "-o", self.path("out"))
        self.assertEqual((told["block_mode"], told["padding"], len(told["nonce"])), ("ctr", "none", 32))
        self.assertEqual(told["size"], os.path.getsize(self.path("out")))

    def test_text_without_padding_must_be_whole_blocks(self):
        for mode in ("ecb", "cbc"):
            blob = self.generate("--algorithm", "aes", "--block-mode", mode, "--padding", "none", name=mode)
            result = self.kmctl("encrypt", blob, "-", "-o", self.path("out"), data=b"x", expect=KEYMASTER)
            self.assertIn(b"whole blocks of 16 bytes", result.stderr)
            result = self.kmctl("decrypt", blob, "-", "-o", self.path("out"), data=bytes(40), expect=TEE_ERROR)
            self.assertIn(b"whole blocks of 16 bytes", result.stderr)
        self.assert_folder_holds("ecb", "cbc")


class Nonces(CipherTest):
    def test_the_nonce_can_go_to_a_file_of_its_own(self):
        blob = self.generate("--algorithm", "aes")
        bare = self.encrypt(blob, "--nonce-out", self.path("nonce"), name="bare")
        self.assertEqual(len(self.read("nonce")), 12)
        self.assertEqual(os.path.getsize(bare), os.path.getsize(self.data) + 16)
        raw = ["decrypt", "--raw", "--nonce"]
        for nonce in ("@" + self.path("nonce"), self.read("nonce").hex(), "hex:" + self.read("nonce").hex()):
            self.assertEqual(self.kmctl(*raw, nonce, blob, bare).stdout, self.read(self.data))
        self.kmctl("decrypt", blob, bare, "-o", self.path("out"), expect=INVALID)  # its front is no nonce
        self.assert_folder_holds("key.blob", "nonce", "bare")

    def test_the_user_may_choose_the_nonce_if_the_key_says_so(self):
        nonce = "000102030405060708090a0b"
        blob = self.import_key("--caller-nonce")
        front = self.kmctl("encrypt", "--nonce", nonce, blob, data=b"text").stdout
        bare = self.kmctl("encrypt", "--raw", "--nonce", nonce, blob, data=b"text").stdout
        self.assertEqual(front, bytes.fromhex(nonce) + bare)
        self.assertEqual(bare, gcm_encrypt(KEY, bytes.fromhex(nonce), b"text"))
        strict = self.import_key()
        self.assertIn(b"KM_ERROR_CALLER_NONCE_PROHIBITED",
                      self.kmctl("encrypt", "--nonce", nonce, strict, data=b"text", expect=KEYMASTER).stderr)

    def test_what_would_lose_or_confuse_the_nonce_is_refused(self):
        blob = self.generate("--algorithm", "aes", "--caller-nonce")
        out = ["-o", self.path("out")]
        refused = {
            "nobody would know the nonce": ["encrypt", "--raw", blob, self.data, *out],
            "a raw ciphertext comes without its nonce": ["decrypt", "--raw", blob, self.data, *out],
            "the nonce stands in front": ["decrypt", "--nonce", "00" * 12, blob, self.data, *out],
            "the nonce has 1 bytes and must have 12": ["encrypt", "--nonce", "00", blob, self.data, *out],
            "'letter' is not hexadecimal": ["encrypt", "--nonce", "letter", blob, self.data, *out],
            "the nonce needs a file of its own": ["encrypt", "--nonce-out", self.path("out"), blob, self.data, *out],
        }
        for words, arguments in refused.items():
            self.assertIn(words.encode(), self.kmctl(*arguments, expect=USAGE).stderr)
        self.assert_folder_holds("key.blob")

    def test_what_the_cipher_does_not_have_is_refused(self):
        ecb = self.generate("--algorithm", "aes", "--block-mode", "ecb", name="ecb")
        rsa = self.generate("--size", "1024", "--padding", "oaep", "--digest", "sha-1", name="rsa")
        for blob in (ecb, rsa):
            for options in (["--nonce", "00"], ["--nonce-out", self.path("n")], ["--aad", "x"], ["--mac-length", "96"]):
                with self.subTest(blob=blob, options=options):
                    self.kmctl("encrypt", *options, blob, self.data, "-o", self.path("out"), expect=USAGE)
        self.kmctl("encrypt", "--block-mode", "gcm", rsa, self.data, expect=USAGE)
        self.kmctl("encrypt", "--raw", ecb, self.data, "-o", self.path("out"))  # there is no nonce to lose
        self.assert_folder_holds("ecb", "rsa", "out")


class Refusals(CipherTest):
    def test_nothing_of_a_changed_gcm_text_comes_out(self):
        blob = self.generate("--algorithm", "aes")
        other = self.generate("--algorithm", "aes", name="other.blob")
        good = self.encrypt(blob, "--aad", "to: Mary")
        size = os.path.getsize(good)
        aad = ["--aad", "to: Mary"]
        cases = {
            "nonce": (blob, aad, self.flipped(good, 0, "1")),
            "text": (blob, aad, self.flipped(good, 70000, "2")),
            "tag": (blob, aad, self.flipped(good, size - 1, "3")),
            "truncated": (blob, aad, self.write("4", self.read(good)[:-1])),
            "longer": (blob, aad, self.write("5", self.read(good) + b"!")),
            "only a nonce": (blob, aad, self.write("6", self.read(good)[:12])),
            "other associated data": (blob, ["--aad", "to: Eve"], good),
            "no associated data": (blob, [], good),
            "other key": (other, aad, good),
        }
        kept = self.write("kept", b"what was there before")
        left = os.listdir(self.folder)
        for case, (key, options, ciphertext) in cases.items():
            with self.subTest(case):
                result = self.kmctl("decrypt", *options, key, ciphertext, "-o", kept, expect=INVALID)
                self.assertIn(b"TEE_SUCCESS, KM_ERROR_VERIFICATION_FAILED (-30)", result.stderr)
                self.kmctl("decrypt", *options, key, ciphertext, "-o", self.path("new"), expect=INVALID)
                self.assertEqual(self.kmctl("decrypt", *options, key, ciphertext, expect=INVALID).stdout, b"")
                self.assertEqual(self.read("kept"), b"what was there before")
                self.assertEqual(sorted(os.listdir(self.folder)), sorted(left))
        self.assertEqual(self.kmctl("decrypt", *aad, blob, good).stdout, self.read(self.data))

    def test_held_back_text_leaves_no_file_in_the_temporary_folder(self):
        blob = self.generate("--algorithm", "aes")
        os.mkdir(self.path("tmp"))
        good = self.encrypt(blob)
        for ciphertext, expect in ((good, DONE), (self.flipped(good, 99, "bad"), INVALID)):
            self.kmctl("decrypt", blob, ciphertext, expect=expect, TMPDIR=self.path("tmp"))
            self.assertEqual(os.listdir(self.path("tmp")), [])

    def test_a_ciphertext_shorter_than_its_nonce(self):
        blob = self.generate("--algorithm", "aes")
        short = self.write("short", b"11 bytes...")
        result = self.kmctl("decrypt", blob, short, "-o", self.path("out"), expect=FAILURE)
        self.assertIn(b"is too short: a nonce of 12 bytes", result.stderr)
        self.assert_folder_holds("key.blob", "short")

    def test_wrong_padding_is_told(self):
        blob = self.import_key("--block-mode", "cbc", "--padding", "pkcs7,none")
        bad = self.encrypt(blob, "--padding", "none", source=self.write("text", bytes(15) + b"\x11"))
        result = self.kmctl("decrypt", "--padding", "pkcs7", blob, bad, "-o", self.path("out"), expect=KEYMASTER)
        self.assertIn(b"KM_ERROR_INVALID_ARGUMENT (-38)", result.stderr)
        self.assertIn(b"has not the padding", result.stderr)
        cut = self.write("cut", self.read(bad)[:-1])
        result = self.kmctl("decrypt", "--padding", "pkcs7", blob, cut, "-o", self.path("out"), expect=KEYMASTER)
        self.assertIn(b"KM_ERROR_INVALID_INPUT_LENGTH (-21)", result.stderr)
        self.assertFalse(os.path.exists(self.path("out")))

    def test_keys_and_files_of_the_wrong_kind(self):
        blob = self.generate("--algorithm", "aes")
        self.assertIn(b"KM_ERROR_UNSUPPORTED_PURPOSE", self.kmctl("sign", blob, self.data, expect=KEYMASTER).stderr)
        one_way = self.generate("--algorithm", "aes", "--purpose", "encrypt", name="one-way")
        ciphertext = self.encrypt(one_way)
        self.assertIn(b"KM_ERROR_INCOMPATIBLE_PURPOSE",
                      self.kmctl("decrypt", one_way, ciphertext, expect=KEYMASTER).stderr)
        self.assertIn(b"KM_ERROR_INCOMPATIBLE_BLOCK_MODE",
                      self.kmctl("encrypt", "--block-mode", "ctr", blob, self.data, expect=KEYMASTER).stderr)
        self.kmctl("encrypt", blob, self.path("none"), expect=FAILURE)
        self.kmctl("encrypt", blob, self.data, "-o", self.data, expect=USAGE)
        self.kmctl("decrypt", blob, ciphertext, "-o", blob, expect=USAGE)
        self.kmctl("encrypt", "-", "-", expect=USAGE)
        self.assertIn(b"-17", self.kmctl("export", blob, expect=KEYMASTER).stderr)

    def test_keys_that_cannot_be(self):
        refused = {"KM_ERROR_UNSUPPORTED_KEY_SIZE": ["--size", "160"],
                   "KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH": ["--min-mac-length", "88"]}
        for error, options in refused.items():
            result = self.kmctl("generate", "--algorithm", "aes", *options, self.path("k"), expect=KEYMASTER)
            self.assertIn(error.encode(), result.stderr)
        self.kmctl("import", "--algorithm", "aes", self.write("raw", bytes(17)), self.path("k"), expect=KEYMASTER)
        self.assert_folder_holds("raw")


class Rsa(KmctlTest):
    def pkeyutl(self, operation, key, data, *options):
        words = [word for option in options for word in ("-pkeyopt", option)]
        return openssl("pkeyutl", operation, *key, *words, data=data).stdout

    PADDINGS = [("oaep", digest, f"rsa_oaep_md:sha{bits}") for digest, bits in
                (("sha-1", 1), ("sha-224", 224), ("sha-256", 256), ("sha-384", 384), ("sha-512", 512))] + [
                    ("pkcs1-1-5-encrypt", None, None)]

    def test_openssl_and_kmctl_read_each_other(self):
        openssl("genrsa", "-out", self.path("private.pem"), "2048")
        blob = self.path("key.blob")
        self.kmctl("import", "--purpose", "encrypt,decrypt", "--padding", "oaep,pkcs1-1-5-encrypt,none", "--digest",
                   "none,sha-1,sha-224,sha-256,sha-384,sha-512", self.path("private.pem"), blob)
        for padding, digest, option in self.PADDINGS:
            with self.subTest(padding=padding, digest=digest):
                ours = ["--padding", padding] + (["--digest", digest] if digest else [])
                theirs = ["rsa_padding_mode:oaep", option, "rsa_mgf1_md:sha1"] if digest else ["rsa_padding_mode:pkcs1"]
                ciphertext = self.kmctl("encrypt", *ours, blob, data=b"a small secret").stdout
                self.assertEqual(self.pkeyutl("-decrypt", ["-inkey", self.path("private.pem")], ciphertext, *theirs),
                                 b"a small secret")
                ciphertext = self.pkeyutl("-encrypt", ["-inkey", self.path("private.pem")], b"another", *theirs)
                self.assertEqual(self.kmctl("decrypt", *ours, blob, data=ciphertext).stdout, b"another")
        block = b"\0" + bytes(range(1, 256))
        raw = self.kmctl("encrypt", "--padding", "none", blob, data=block).stdout
        self.assertEqual(self.pkeyutl("-decrypt", ["-inkey", self.path("private.pem")], raw, "rsa_padding_mode:none"),
                         block)
        self.assertEqual(self.kmctl("decrypt", "--padding", "none", blob, data=raw).stdout, block)

    def test_a_key_for_secrets_is_one_option_away(self):
        blob = self.generate("--size", "1024", "--padding", "oaep")
        listed = self.json("characteristics", blob)["characteristics"]
        self.assertEqual((listed["purpose"], listed["digest"]), (["encrypt", "decrypt"], ["sha-256"]))
        told = self.json("encrypt", blob, self.write("secret", b"s"), "-o", self.path("out"))
        self.assertEqual(told, {"output": self.path("out"), "size": 128, "padding": "oaep", "digest": "sha-256"})
        self.assertEqual(self.kmctl("decrypt", blob, self.path("out")).stdout, b"s")

    def test_what_does_not_fit_or_does_not_belong_is_refused(self):
        blob = self.generate("--size", "1024", "--padding", "oaep")
        self.kmctl("encrypt", blob, "-", "-o", self.path("out"), data=b"x" * 62)
        self.assertEqual(self.kmctl("decrypt", blob, self.path("out")).stdout, b"x" * 62)
        for size in (63, 128, 129, 100000):
            result = self.kmctl("encrypt", blob, data=b"x" * size, expect=KEYMASTER)
            self.assertIn(b"KM_ERROR_INVALID_INPUT_LENGTH", result.stderr)
            self.assertEqual(result.stdout, b"")
        changed = self.flipped("out", 100, "changed")
        for ciphertext in (changed, self.write("short", self.read("out")[:-1])):
            result = self.kmctl("decrypt", blob, ciphertext, "-o", self.path("text"), expect=KEYMASTER)
            self.assertIn(b"KM_ERROR_INVALID_ARGUMENT (-38)", result.stderr)
        self.assert_folder_holds("key.blob", "out", "changed", "short")


class Streams(CipherTest):
    def peak_memory(self, *arguments):
        """The most memory that kmctl ever had, in KiB."""
        # A sanitizer keeps freed memory for a while, which must not count.
        settings = self.environment(ASAN_OPTIONS="exitcode=99:quarantine_size_mb=1")
        with subprocess.Popen([self.program, *arguments], env=settings, cwd=self.folder,
                              stdout=subprocess.DEVNULL) as process:
            _, status, usage = os.wait4(process.pid, 0)
            process.returncode = os.waitstatus_to_exitcode(status)
        self.assertEqual(process.returncode, DONE)
        return usage.ru_maxrss

    def test_memory_does_not_grow_with_the_file(self):
        blob = self.generate("--algorithm", "aes")
        peaks = {}
        for size in (1 << 10, 64 << 20):
            text = self.path("text")
            with open(text, "wb") as file:
                file.truncate(size)
            peaks[size] = (self.peak_memory("encrypt", blob, text, "-o", self.path("enc")),
                           self.peak_memory("decrypt", blob, self.path("enc"), "-o", self.path("dec")))
            self.assertEqual(os.path.getsize(self.path("enc")), size + 28)
            subprocess.run(["cmp", text, self.path("dec")], check=True)
        for small, large in zip(peaks[1 << 10], peaks[64 << 20]):
            self.assertLess(large - small, 8 << 10)

    def test_a_stream_that_does_not_end_is_encrypted_as_it_comes(self):
        blob = self.generate("--algorithm", "aes", "--block-mode", "ctr")
        with subprocess.Popen([self.program, "encrypt", blob], stdin=subprocess.PIPE, stdout=subprocess.PIPE,
                              env=self.environment()) as process:
            process.stdin.write(bytes(1 << 16))
            process.stdin.flush()
            first = process.stdout.read(16 + (1 << 16))
            rest, _ = process.communicate(b"end")
        self.assertEqual((len(first), len(rest), process.returncode), (65552, 3, DONE))

    def test_an_interrupted_decryption_leaves_nothing(self):
        blob = self.generate("--algorithm", "aes")
        for ending in (signal.SIGINT, signal.SIGTERM):
            with subprocess.Popen([self.program, "decrypt", blob, "-", "-o", self.path("text")], stdin=subprocess.PIPE,
                                  env=self.environment()) as process:
                process.stdin.write(bytes(1 << 20))  # more than a pipe holds: it is at work
                process.stdin.flush()
                deadline = time.monotonic() + 60
                while not any(name.startswith(".text.") for name in os.listdir(self.folder)):
                    self.assertLess(time.monotonic(), deadline)
                process.send_signal(ending)
                self.assertEqual(process.wait(), -ending)
            self.assert_folder_holds("key.blob")

    def test_json_goes_where_the_data_does_not(self):
        blob = self.generate("--algorithm", "aes")
        result = self.kmctl("encrypt", "--json", blob, data=b"text")
        told = json.loads(result.stderr)
        self.assertEqual(result.stdout[:12].hex(), told["nonce"])
        self.assertEqual((told["output"], told["size"], told["mac_length"]), ("-", len(result.stdout), 128))
        refused = self.kmctl("decrypt", "--json", blob, data=result.stdout[:-1], expect=INVALID)
        self.assertEqual(json.loads(refused.stderr)["error"]["keymaster_error"]["value"], -30)
        answer = self.json("decrypt", blob, "-o", self.path("x"), data=result.stdout[:-1], expect=INVALID)["error"]
        self.assertEqual(answer["keymaster_error"]["value"], -30)

    def test_associated_data_can_be_larger_than_a_request(self):
        blob = self.generate("--algorithm", "aes")
        aad = self.write("aad", os.urandom(700_000))
        ciphertext = self.kmctl("encrypt", "--aad", "@" + aad, blob, data=b"").stdout
        self.assertEqual(len(ciphertext), 28)
        self.kmctl("decrypt", "--aad", "@" + aad, blob, data=ciphertext)
        self.kmctl("decrypt", "--aad", "@" + self.flipped("aad", 699_999, "other"), blob, data=ciphertext,
                   expect=INVALID)


if __name__ == "__main__":
    main(__doc__)
