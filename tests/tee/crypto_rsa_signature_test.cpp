// RSA signatures. libcrypto judges what the platform signs.
#include <openssl/rsa.h>

#include "tests/tee/crypto_rsa_fixture.h"

namespace hosted_tee::testing {
namespace {

class RsaSignatureTest : public rsa_fixture {};

struct signature_scheme {
  const char* digest;
  std::uint32_t algorithm;
  bool pss;
};
const signature_scheme signature_schemes[] = {
    {"MD5", 0x70001830, false},    {"SHA1", 0x70002830, false},   {"SHA224", 0x70003830, false},
    {"SHA256", 0x70004830, false}, {"SHA384", 0x70005830, false}, {"SHA512", 0x70006830, false},
    {"SHA1", 0x70212930, true},    {"SHA224", 0x70313930, true},  {"SHA256", 0x70414930, true},
    {"SHA384", 0x70515930, true},  {"SHA512", 0x70616930, true},
};

/// accepted asks libcrypto about a signature of a message, with a salt of exactly `salt` bytes in PSS.
bool accepted(const key_owner& key, const signature_scheme& each, const bytes& message, const bytes& signature,
              int salt) {
  EVP_MD_CTX* context = EVP_MD_CTX_new();
  EVP_PKEY_CTX* details = nullptr;
  EXPECT_EQ(EVP_DigestVerifyInit(context, &details, md(each.digest), nullptr, key.get()), 1);
  if (each.pss) {
    EXPECT_EQ(EVP_PKEY_CTX_set_rsa_padding(details, RSA_PKCS1_PSS_PADDING), 1);
    EXPECT_EQ(EVP_PKEY_CTX_set_rsa_pss_saltlen(details, salt), 1);
  }
  const bool valid = EVP_DigestVerify(context, signature.data(), signature.size(), message.data(), message.size()) == 1;
  EVP_MD_CTX_free(context);
  return valid;
}

attribute_list salt(std::uint32_t length) {
  return attribute_list().add_value(TEE_ATTR_RSA_PSS_SALT_LENGTH, length);
}

struct salt_case {
  std::uint32_t attribute;
  int salt;                // -1: refused
  std::size_t digest_row;  // in signature_schemes
};

TEST_F(RsaSignatureTest, EverySignatureSchemeAgreesWithLibcrypto) {
  const bytes message = from_text("the message");
  const object_owner object = imported(2048);
  for (const signature_scheme& each : signature_schemes) {
    const operation_owner signing = operation_for(each.algorithm, TEE_MODE_SIGN, object);
    const operation_owner verifying = operation_for(each.algorithm, TEE_MODE_VERIFY, object);
    const bytes digest = digest_of(each.digest, message);
    const answer made = sign(signing, digest, 256);
    ASSERT_EQ(made.result, TEE_SUCCESS) << std::hex << each.algorithm;
    EXPECT_EQ(made.data.size(), 256U);
    EXPECT_TRUE(accepted(reference(2048), each, message, made.data, static_cast<int>(digest.size())))
        << "without an attribute the salt is as long as the digest";
    EXPECT_EQ(verify(verifying, digest, made.data), TEE_SUCCESS);

    bytes wrong = made.data;
    wrong[200] ^= 1;
    EXPECT_EQ(verify(verifying, digest, wrong), TEE_ERROR_SIGNATURE_INVALID);
    EXPECT_EQ(verify(verifying, digest_of(each.digest, from_text("other")), made.data), TEE_ERROR_SIGNATURE_INVALID);
    for (const bytes& length : {bytes{}, bytes(made.data.begin(), made.data.end() - 1), joined(made.data, {0}),
                                joined({0}, made.data), repeated(0xFF, 256)}) {
      EXPECT_EQ(verify(verifying, digest, length), TEE_ERROR_SIGNATURE_INVALID) << length.size() << " bytes";
    }
    for (const bytes& length : {bytes{}, bytes(digest.begin(), digest.end() - 1), joined(digest, {0})}) {
      EXPECT_EQ(sign(signing, length, 256).result, TEE_ERROR_BAD_PARAMETERS);
      EXPECT_EQ(verify(verifying, length, made.data), TEE_ERROR_BAD_PARAMETERS);
    }
  }
}

TEST_F(RsaSignatureTest, PssSaltHasTheLengthThatIsAskedFor) {
  // In 1024 bits: with SHA-256 (row 8) up to 94 bytes fit; with SHA-512 (row 10) 62, so that 64 don't.
  const salt_case cases[] = {
      {0xFFFFFFFF, 32, 8},  {0xFFFFFFFE, 94, 8},  {0, 0, 8},           {94, 94, 8},         {95, -1, 8},
      {0xFFFFFFFF, -1, 10}, {0xFFFFFFFE, 62, 10}, {0xFFFFFFFD, -1, 8}, {0x80000000, -1, 8}, {0x7FFFFFFF, -1, 8}};
  const bytes message = from_text("the message");
  const object_owner object = imported(1024);
  for (const salt_case& each : cases) {
    const signature_scheme& used = signature_schemes[each.digest_row];
    const bytes digest = digest_of(used.digest, message);
    const answer made = sign(operation_for(used.algorithm, TEE_MODE_SIGN, object), digest, 128, salt(each.attribute));
    if (each.salt < 0) {
      EXPECT_EQ(made.result, TEE_ERROR_BAD_PARAMETERS) << std::hex << each.attribute;
      continue;
    }
    ASSERT_EQ(made.result, TEE_SUCCESS) << std::hex << each.attribute;
    EXPECT_TRUE(accepted(reference(1024), used, message, made.data, each.salt));
    const operation_owner verifying = operation_for(used.algorithm, TEE_MODE_VERIFY, object);
    EXPECT_EQ(verify(verifying, digest, made.data, salt(0xFFFFFFFE)), TEE_SUCCESS) << "-2 takes any salt";
    EXPECT_EQ(verify(verifying, digest, made.data, salt(static_cast<std::uint32_t>(each.salt))), TEE_SUCCESS);
    EXPECT_EQ(verify(verifying, digest, made.data, salt(17)), TEE_ERROR_SIGNATURE_INVALID);
  }
}

TEST_F(RsaSignatureTest, KeyTooShortForTheSignatureIsACode) {
  const object_owner object = imported(512);
  const bytes digest = digest_of("SHA512", {});
  EXPECT_EQ(sign(operation_for(0x70006830, TEE_MODE_SIGN, object), digest, 64).result, TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(sign(operation_for(0x70616930, TEE_MODE_SIGN, object), digest, 64, salt(0xFFFFFFFE)).result,
            TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(verify(operation_for(0x70006830, TEE_MODE_VERIFY, object), digest, repeated(1, 64)),
            TEE_ERROR_SIGNATURE_INVALID);
}

TEST_F(RsaSignatureTest, ShortBufferTellsTheSize) {
  const answer short_signature = sign(rsa(TEE_ALG_RSASSA_PKCS1_V1_5_SHA1, TEE_MODE_SIGN), digest_of("SHA1", {}), 127);
  EXPECT_EQ(short_signature.result, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(short_signature.length, 128U);
}

TEST_F(RsaSignatureTest, SizeThatCountsALeadingZeroOfTheModulusWorks) {
  // 129 bytes of modulus, the first of them 00: what is stated as 1032 bits is a key of 1024.
  const object_owner object = allocate(TEE_TYPE_RSA_KEYPAIR, 1032);
  ASSERT_EQ(populate_into(object, rsa_attributes(reference(1024))), TEE_SUCCESS);
  const bytes digest = digest_of("SHA256", {});
  const bytes signature = sign(operation_for(0x70004830, TEE_MODE_SIGN, object), digest, 129).data;
  EXPECT_EQ(signature.size(), 128U);
  const operation_owner verifying = operation_for(0x70004830, TEE_MODE_VERIFY, object);
  EXPECT_EQ(verify(verifying, digest, signature), TEE_SUCCESS);
  EXPECT_EQ(verify(verifying, digest, joined({0}, signature)), TEE_SUCCESS) << "right-aligned in the stated size";
  EXPECT_EQ(verify(verifying, digest, joined({1}, signature)), TEE_ERROR_SIGNATURE_INVALID);
  EXPECT_EQ(verify(verifying, digest, joined({0, 0}, signature)), TEE_ERROR_SIGNATURE_INVALID);
}

}  // namespace
}  // namespace hosted_tee::testing
