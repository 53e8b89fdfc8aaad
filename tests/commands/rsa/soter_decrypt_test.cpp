// What keeps a soter key honest is its client: the tag rules signing and export, and no other purpose.
#include "tests/commands/rsa/cipher_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// The block of a PKCS#1 v1.5 signature with SHA-256 (RFC 8017, section 9.2) over a digest.
bytes signature_block(const bytes& digest, std::size_t size) {
  const bytes info = join({from_hex("3031300d060960864801650304020105000420"), digest});
  return join({{0, 1}, bytes(size - info.size() - 3, 0xFF), {0}, info});
}

using SoterDecryptTest = RsaCipherTest;

TEST_F(SoterDecryptTest, AnUnpaddedDecryptionWithASoterKeySignsWhateverItsUserChooses) {
  const bytes soter_blob = import_fixed(1024, rsa_cipher_key(1024).add(KM_TAG_SOTER_KEY));
  const bytes chosen = from_text(R"({"raw":"never signed"})");
  const bytes digest =
      from_hex("dd4643d771007dd1a5bce1e6ab696b9e79b2e417b0afb602c3c08d87681dd645");  // as sha256sum has it
  const auto forged = succeeds([&] { return run(KM_PURPOSE_DECRYPT, soter_blob, bare, signature_block(digest, 128)); });
  EXPECT_TRUE(key.verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, chosen, forged.text));
}

TEST_F(SoterDecryptTest, PaddedDecryptionIsAsWithAnyKey) {
  const bytes soter_blob = import_fixed(1024, rsa_cipher_key(1024).add(KM_TAG_SOTER_KEY));
  const param_list pkcs1 = signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_ENCRYPT);
  const auto sealed = succeeds([&] { return run(KM_PURPOSE_ENCRYPT, soter_blob, pkcs1, from_text("secret")); });
  const auto opened = succeeds([&] { return run(KM_PURPOSE_DECRYPT, soter_blob, pkcs1, sealed.text); });
  EXPECT_EQ(opened.text, from_text("secret"));
}

}  // namespace
}  // namespace testing_support
