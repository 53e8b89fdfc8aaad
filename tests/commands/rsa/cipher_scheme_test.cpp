// Which paddings and digests RSA encryption and decryption take, and what the policy has to say of them.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/support/encryption.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr std::uint32_t paddings[] = {0, 1, 2, 3, 4, 5, 6, 64, 0xFFFFFFFF};
constexpr std::uint32_t digests[] = {0, 1, 2, 3, 4, 5, 6, 7, 8, 0x80000000, 0xFFFFFFFF};
constexpr std::uint32_t purposes[] = {KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT};

/// What a combination answers, for a key that lists it.
std::int32_t expected_error(std::uint32_t padding, std::uint32_t digest) {
  const bool is_oaep = padding == KM_PAD_RSA_OAEP;
  if (padding != KM_PAD_NONE && !is_oaep && padding != KM_PAD_RSA_PKCS1_1_5_ENCRYPT) {
    return KM_ERROR_UNSUPPORTED_PADDING_MODE;
  }
  if (digest > KM_DIGEST_SHA_2_512) return KM_ERROR_UNSUPPORTED_DIGEST;
  const bool fits = is_oaep ? digest >= KM_DIGEST_SHA1 : digest == KM_DIGEST_NONE;
  return fits ? KM_ERROR_OK : KM_ERROR_INCOMPATIBLE_DIGEST;
}

class CipherSchemeTest : public CommandTest {
 protected:
  void expect_refused(std::int32_t error, trace_lines lines, std::uint32_t purpose, const bytes& blob,
                      const param_list& params) {
    const answer a =
        expect_failure(refused(error, std::move(lines)), [&] { return client().begin(purpose, blob, params); });
    EXPECT_EQ(a.b, 0U);
  }
  void expect_taken(std::uint32_t purpose, const bytes& blob, const param_list& params) {
    const hosted_tee::accounting before = tee.accounting();
    const answer a = succeeds([&] { return client().begin(purpose, blob, params); });
    EXPECT_EQ(a.body(), u32(0));
    EXPECT_TRUE(client().abort(a.b).ok());
    expect_same(before);
  }
};

TEST_F(CipherSchemeTest, EveryCombinationIsTakenOrRefusedByTheTable) {
  param_list permissive = rsa_cipher_key(1024).remove(KM_TAG_PADDING).remove(KM_TAG_DIGEST);
  for (const std::uint32_t padding : paddings) permissive.add(KM_TAG_PADDING, padding);
  for (const std::uint32_t digest : digests) permissive.add(KM_TAG_DIGEST, digest);
  const bytes blob = import_fixed(1024, permissive);
  for (const std::uint32_t purpose : purposes) {
    for (const std::uint32_t padding : paddings) {
      for (const std::uint32_t digest : digests) {
        SCOPED_TRACE(fmt::format("purpose {} padding {} digest {}", purpose, padding, digest));
        const std::int32_t error = expected_error(padding, digest);
        if (error == KM_ERROR_OK) {
          expect_taken(purpose, blob, signature(digest, padding));
        } else {
          expect_refused(error, {"Create operation failed"}, purpose, blob, signature(digest, padding));
        }
      }
    }
  }
}

TEST_F(CipherSchemeTest, ThePaddingMustOccurOnce) {
  const bytes blob = import_fixed(1024, rsa_cipher_key(1024));
  const trace_lines lines = {"No or too many KM_TAG_PADDING", "Create operation failed"};
  for (const std::uint32_t purpose : purposes) {
    for (const param_list& params :
         {param_list{}, param_list{}.add(KM_TAG_DIGEST, 99), param_list{}.add(KM_TAG_PADDING, 1).add(KM_TAG_PADDING, 1),
          signature(4, 2).add(KM_TAG_PADDING, 4)}) {
      expect_refused(KM_ERROR_INVALID_ARGUMENT, lines, purpose, blob, params);
    }
  }
}

TEST_F(CipherSchemeTest, ADigestThatIsAbsentOrRepeatedIsNone) {
  const bytes blob = import_fixed(1024, rsa_cipher_key(1024));
  for (const std::uint32_t purpose : purposes) {
    for (const std::uint32_t padding : {KM_PAD_NONE, KM_PAD_RSA_OAEP, KM_PAD_RSA_PKCS1_1_5_ENCRYPT}) {
      const param_list absent = param_list{}.add(KM_TAG_PADDING, padding);
      const param_list repeated = param_list{absent}.add(KM_TAG_DIGEST, 4).add(KM_TAG_DIGEST, 4);
      for (const param_list& params : {absent, repeated}) {
        if (padding == KM_PAD_RSA_OAEP) {
          expect_refused(KM_ERROR_INCOMPATIBLE_DIGEST, {"Create operation failed"}, purpose, blob, params);
        } else {
          expect_taken(purpose, blob, params);
        }
      }
    }
  }
}

TEST_F(CipherSchemeTest, AKeysListsRestrictDecryptionAndNotEncryption) {
  const bytes narrow =
      import_fixed(1024, rsa_cipher_key(1024).remove(KM_TAG_PADDING).add(KM_TAG_PADDING, KM_PAD_RSA_PKCS1_1_5_ENCRYPT));
  const param_list oaep = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP);
  expect_taken(KM_PURPOSE_ENCRYPT, narrow, oaep);
  expect_refused(KM_ERROR_INCOMPATIBLE_PADDING_MODE, {"No such padding in key_params", "Authorization failed"},
                 KM_PURPOSE_DECRYPT, narrow, oaep);
  const bytes for_signing = import_fixed(1024);
  expect_taken(KM_PURPOSE_ENCRYPT, for_signing, oaep);
  expect_refused(KM_ERROR_INCOMPATIBLE_PURPOSE, {"No such purpose in key_params", "Authorization failed"},
                 KM_PURPOSE_DECRYPT, for_signing, oaep);
  const bytes expired = import_fixed(
      1024, rsa_cipher_key(1024).add(KM_TAG_USAGE_EXPIRE_DATETIME, 1).add(KM_TAG_ORIGINATION_EXPIRE_DATETIME, 1));
  expect_taken(KM_PURPOSE_ENCRYPT, expired, oaep);
  expect_refused(KM_ERROR_KEY_EXPIRED, {"Key expired", "Authorization failed"}, KM_PURPOSE_DECRYPT, expired, oaep);
}

TEST_F(CipherSchemeTest, AKeysListOfDigestsDoesNotRestrictOaep) {
  const bytes other_digest =
      import_fixed(1024, rsa_cipher_key(1024).remove(KM_TAG_DIGEST).add(KM_TAG_DIGEST, KM_DIGEST_SHA1));
  expect_taken(KM_PURPOSE_DECRYPT, other_digest, signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP));
  // With a padding of signatures, or with none, a digest says what is signed, and is asked for.
  const trace_lines unlisted = {"No such digest in key_params", "Authorization failed"};
  expect_refused(KM_ERROR_INCOMPATIBLE_DIGEST, unlisted, KM_PURPOSE_DECRYPT, other_digest,
                 signature(KM_DIGEST_NONE, KM_PAD_NONE));
  expect_taken(KM_PURPOSE_DECRYPT, other_digest, param_list{}.add(KM_TAG_PADDING, KM_PAD_NONE));
  expect_taken(KM_PURPOSE_DECRYPT, other_digest, signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_ENCRYPT));
}

TEST_F(CipherSchemeTest, EachPlatformFailureHasItsLinesAndItsResult) {
  struct platform_failure {
    const char* call;
    std::uint32_t n;  // of begin's calls of that function; the blob's opening has made some
    trace_lines lines;
  };
  const std::string code = " failed with 0xffff0001\n", create = "Create operation failed",
                    resolve = "Resolve key data failed";
  const bytes blob = import_fixed(1024, rsa_cipher_key(1024));
  for (const platform_failure& row :
       {platform_failure{"TEE_AllocateTransientObject", 2, {"AllocateTransientObject" + code, resolve, create}},
        {"TEE_PopulateTransientObject", 2, {"PopulateTransientObject" + code, resolve, create}},
        {"TEE_AllocateOperation", 3, {"AllocateOperation" + code, create}},
        {"TEE_SetOperationKey", 3, {"SetOperationKey" + code, create}}}) {
    for (const std::uint32_t purpose : purposes) {
      for (const param_list& params :
           {signature(KM_DIGEST_NONE, KM_PAD_NONE), signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP)}) {
        SCOPED_TRACE(fmt::format("{} number {}", row.call, row.n));
        tee.world().faults().fail_call(row.call, row.n, TEE_ERROR_ACCESS_DENIED);
        expect_failure(broken(TEEC_ERROR_ACCESS_DENIED, row.lines),
                       [&] { return client().begin(purpose, blob, params); });
      }
    }
  }
}

TEST_F(CipherSchemeTest, MalformedKeyDataFailWhereTheyAreUsed) {
  rsa_components even = rsa_test_key::of_bits(1024).components();
  even[rsa_n].back() &= 0xFE;
  const bytes blob = client().must_import(rsa_cipher_key(1024), rsa_material(even));
  for (const std::uint32_t purpose : purposes) {
    expect_failure(broken(TEEC_ERROR_BAD_PARAMETERS, {"PopulateTransientObject failed with 0xffff0006\n",
                                                      "Resolve key data failed", "Create operation failed"}),
                   [&] { return client().begin(purpose, blob, signature(KM_DIGEST_NONE, KM_PAD_NONE)); });
  }
}

}  // namespace
}  // namespace testing_support
