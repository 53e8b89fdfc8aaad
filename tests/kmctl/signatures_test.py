#!/usr/bin/env python3
"""EC signatures and MACs of kmctl, judged by the openssl command.

usage: signatures_test.py KMCTL [unittest arguments]
"""

import os

from kmctl_case import DIGESTS, FAILURE, INVALID, KEYMASTER, USAGE, KmctlTest, main, openssl

CURVES = {192: "prime192v1", 224: "secp224r1", 256: "prime256v1", 384: "secp384r1", 521: "secp521r1"}
EC_DIGESTS = [name for name in DIGESTS if name != "md5"]


class EllipticCurves(KmctlTest):
    def test_openssl_accepts_every_signature_on_every_curve(self):
        for size in CURVES:
            blob = self.generate("--algorithm", "ec", "--size", str(size), "--digest", ",".join(EC_DIGESTS),
                                 name=f"{size}.blob")
            public = self.public_key(blob)
            self.assertIn(f"({size} bit)".encode(), openssl("pkey", "-pubin", "-in", public, "-text", "-noout").stdout)
            for digest in EC_DIGESTS:
                with self.subTest(size=size, digest=digest):
                    self.kmctl("sign", "--digest", digest, blob, self.data, "-o", self.path("sig"))
                    openssl("dgst", f"-{DIGESTS[digest]}", "-verify", public, "-signature", self.path("sig"), self.data)
                    self.kmctl("verify", "--digest", digest, blob, self.path("sig"), self.data)

    def test_kmctl_accepts_openssls_signatures_with_imported_keys(self):
        for size, curve in CURVES.items():
            private = self.path(f"{size}.pem")
            openssl("ecparam", "-name", curve, "-genkey", "-noout", "-out", private)
            blob = self.path(f"{size}.blob")
            answer = self.json("import", "--digest", ",".join(EC_DIGESTS), private, blob)
            self.assertEqual((answer["characteristics"]["algorithm"], answer["characteristics"]["key_size"]),
                             ("ec", size))
            for digest in EC_DIGESTS:
                with self.subTest(size=size, digest=digest):
                    openssl("dgst", f"-{DIGESTS[digest]}", "-sign", private, "-out", self.path("sig"), self.data)
                    self.kmctl("verify", "--digest", digest, blob, self.path("sig"), self.data)

    def test_every_key_file_of_openssl_gives_the_same_public_key(self):
        openssl("ecparam", "-name", "prime256v1", "-genkey", "-noout", "-out", self.path("sec1.pem"))
        convert = ["pkey", "-in", self.path("sec1.pem")]
        openssl(*convert, "-out", self.path("pkcs8.pem"))
        openssl(*convert, "-outform", "DER", "-out", self.path("pkcs8.der"))
        expected = openssl(*convert, "-pubout").stdout
        for name in ("sec1.pem", "pkcs8.pem", "pkcs8.der"):
            blob = self.path(name + ".blob")
            self.kmctl("import", self.path(name), blob)
            self.assertEqual(self.kmctl("export", blob).stdout, expected, name)

    def test_der_and_pem_hold_the_same_key(self):
        blob = self.generate("--algorithm", "ec")
        pem = self.kmctl("export", blob).stdout
        self.kmctl("export", blob, "--der", "-o", self.path("public.der"))
        self.assertEqual(openssl("pkey", "-pubin", "-outform", "DER", data=pem).stdout, self.read("public.der"))

    def test_a_digest_that_the_caller_made_is_signed_as_it_is(self):
        blob = self.generate("--algorithm", "ec", "--digest", "none")
        digest = openssl("dgst", "-sha256", "-binary", self.data).stdout
        self.assertEqual(self.json("sign", blob, "-", "-o", self.path("sig"), data=digest)["digest"], "none")
        openssl("dgst", "-sha256", "-verify", self.public_key(blob), "-signature", self.path("sig"), self.data)
        result = self.kmctl("sign", blob, "-", data=digest + b"!", expect=KEYMASTER)
        self.assertIn(b"KM_ERROR_INVALID_INPUT_LENGTH", result.stderr)
        self.assertIn(b"hint: ", result.stderr)

    def test_a_wrong_signature_exits_with_its_own_code(self):
        blob = self.generate("--algorithm", "ec")
        other = self.generate("--algorithm", "ec", name="other.blob")
        self.kmctl("sign", blob, self.data, "-o", self.path("sig"))
        changed = self.flipped(self.data, 70000, "changed")
        for key, signature, data in ((blob, self.path("sig"), changed), (other, self.path("sig"), self.data),
                                     (blob, self.flipped("sig", -1, "flipped"), self.data)):
            self.assertIs(self.json("verify", key, signature, data, expect=INVALID)["valid"], False)

    def test_sizes_digests_and_curves_that_cannot_be(self):
        self.assertIn(b"192, 224, 256, 384 or 521", self.kmctl("generate", "--algorithm", "ec", "--size", "255",
                                                               self.path("k"), expect=KEYMASTER).stderr)
        openssl("ecparam", "-name", "secp256k1", "-genkey", "-noout", "-out", self.path("koblitz.pem"))
        self.assertIn(b"not one of the NIST prime curves",
                      self.kmctl("import", self.path("koblitz.pem"), self.path("k"), expect=FAILURE).stderr)
        self.assertFalse(os.path.exists(self.path("k")))

    def test_an_ec_key_does_not_encrypt(self):
        blob = self.generate("--algorithm", "ec")
        result = self.kmctl("encrypt", blob, self.data, expect=KEYMASTER)
        self.assertIn(b"KM_ERROR_UNSUPPORTED_PURPOSE", result.stderr)


class Macs(KmctlTest):
    def import_key(self, *options, key=bytes(range(40))):
        self.kmctl("import", "--algorithm", "hmac", "--force", *options, self.write("raw.key", key),
                   self.path("hmac.blob"))
        return self.path("hmac.blob")

    def openssl_mac(self, digest, key=bytes(range(40))):
        return openssl("dgst", f"-{DIGESTS[digest]}", "-mac", "HMAC", "-macopt", f"hexkey:{key.hex()}", "-binary",
                       self.data).stdout

    def test_openssl_makes_the_same_mac_with_every_digest(self):
        for digest in DIGESTS:
            with self.subTest(digest):
                blob = self.import_key("--digest", digest)
                mac = self.kmctl("sign", blob, self.data).stdout
                self.assertEqual(mac, self.openssl_mac(digest))
                self.kmctl("verify", blob, self.write("mac", mac), self.data)

    def test_a_shorter_mac_is_the_front_of_the_whole_one(self):
        blob = self.import_key("--min-mac-length", "64")
        whole = self.openssl_mac("sha-256")
        for bits in (64, 128, 248):
            mac = self.kmctl("sign", "--mac-length", str(bits), blob, self.data).stdout
            self.assertEqual(mac, whole[:bits // 8])
            self.kmctl("verify", "--mac-length", str(bits), blob, self.write("mac", mac), self.data)
            # A MAC is checked as a whole unless its user asks for less.
            self.kmctl("verify", blob, self.path("mac"), self.data, expect=INVALID)

    def test_the_answer_names_what_was_made(self):
        blob = self.generate("--algorithm", "hmac")
        told = self.kmctl("sign", blob, self.data, "-o", self.path("mac")).stdout.decode()
        self.assertEqual(told, f"MAC of 32 bytes in {self.path('mac')} (sha-256, 256 bits)\n")
        self.assertEqual(self.kmctl("verify", blob, self.path("mac"), self.data).stdout,
                         b"MAC valid (sha-256, 256 bits)\n")
        self.assertEqual(self.json("verify", blob, self.path("mac"), self.data),
                         {"valid": True, "digest": "sha-256", "mac_length": 256})

    def test_a_wrong_mac_exits_with_its_own_code(self):
        blob = self.import_key()
        mac = self.write("mac", self.openssl_mac("sha-256"))
        changed = self.flipped(self.data, 0, "changed")
        for signature, data in ((mac, changed), (self.flipped("mac", 31, "flipped"), self.data),
                                (self.write("short", self.read("mac")[:-1]), self.data),
                                (self.write("empty", b""), self.data)):
            self.kmctl("verify", blob, signature, data, expect=INVALID)
        self.kmctl("verify", blob, mac, self.data)

    def test_lengths_that_the_key_does_not_allow(self):
        blob = self.import_key("--min-mac-length", "128")
        self.assertIn(b"KM_ERROR_INVALID_MAC_LENGTH",
                      self.kmctl("sign", "--mac-length", "64", blob, self.data, expect=KEYMASTER).stderr)
        result = self.kmctl("sign", "--mac-length", "264", blob, self.data, expect=KEYMASTER)
        self.assertIn(b"at most as long as its digest", result.stderr)
        self.assertEqual(result.stdout, b"")

    def test_keys_that_cannot_be(self):
        refused = {"KM_ERROR_UNSUPPORTED_KEY_SIZE": ["--size", "128"],
                   "KM_ERROR_UNSUPPORTED_DIGEST": ["--digest", "sha-1,sha-256"],
                   "KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH": ["--min-mac-length", "264"]}
        for error, options in refused.items():
            result = self.kmctl("generate", "--algorithm", "hmac", *options, self.path("k"), expect=KEYMASTER)
            self.assertIn(error.encode(), result.stderr)
            self.assertIn(b"hint: ", result.stderr)
        self.assertIn(b"KM_ERROR_UNSUPPORTED_KEY_SIZE",
                      self.kmctl("import", "--algorithm", "hmac", self.write("raw", bytes(23)), self.path("k"),
                                 expect=KEYMASTER).stderr)
        self.assertFalse(os.path.exists(self.path("k")))

    def test_the_key_never_comes_out(self):
        blob = self.import_key()
        result = self.kmctl("export", blob, "-o", self.path("out"), expect=KEYMASTER)
        self.assertIn(b"KM_ERROR_UNSUPPORTED_KEY_FORMAT (-17)", result.stderr)
        self.assertIn(b"never leave the TA", result.stderr)
        self.assertFalse(os.path.exists(self.path("out")))
        self.assertNotIn(bytes(range(40)), self.read(blob))

    def test_an_hmac_key_does_not_encrypt(self):
        blob = self.generate("--algorithm", "hmac")
        self.assertIn(b"KM_ERROR_UNSUPPORTED_PURPOSE", self.kmctl("encrypt", blob, self.data, expect=KEYMASTER).stderr)
        self.kmctl("sign", "--block-mode", "gcm", blob, self.data, expect=USAGE)


if __name__ == "__main__":
    main(__doc__)
