// The key of one blob: HMAC-SHA256 of the blob's nonce under a KSK.
#include <fmt/format.h>

#include "tests/keystore/keystore_fixture.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

class DeriveKeyTest : public BlobTest {
 protected:
  TEE_Result derive(TEE_ObjectHandle ksk, const bytes& nonce, object_handle& key) {
    TEE_ObjectHandle made = derived_ksk();  // anything but null
    ta().clear_trace();
    const TEE_Result result = TEE_DeriveKK(ksk, std::span<const std::uint8_t, 64>{nonce}, &made);
    key.reset(made);
    return result;
  }

  bytes derived(TEE_ObjectHandle ksk, const bytes& nonce) {
    object_handle key;
    EXPECT_EQ(derive(ksk, nonce, key), TEE_SUCCESS);
    return value_of(key.get());
  }

  void expect_failure(TEE_Result result, const std::string& line) {
    const auto before = ta().holdings();
    object_handle key;
    EXPECT_EQ(derive(derived_ksk(), pattern(64), key), result);
    EXPECT_FALSE(key);
    EXPECT_THAT(errors(), ElementsAre(line));
    expect_same(ta().holdings(), before);
  }
};

TEST_F(DeriveKeyTest, TheKeyIsTheHmacOfTheNonce) {
  for (std::uint32_t seed = 0; seed < 10; ++seed) {
    const bytes nonce = pattern(64, seed);
    EXPECT_EQ(derived(derived_ksk(), nonce), hmac_sha256(derived_value(), nonce));
    EXPECT_EQ(derived(rpmb_ksk(), nonce), hmac_sha256(rpmb_value(), nonce));
  }
  EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(DeriveKeyTest, TheSameNonceGivesTheSameKeyAndAnotherAnother) {
  const bytes first = derived(derived_ksk(), pattern(64, 1));
  EXPECT_EQ(derived(derived_ksk(), pattern(64, 1)), first);
  EXPECT_NE(derived(derived_ksk(), pattern(64, 2)), first);
  EXPECT_NE(derived(derived_ksk(), flip(pattern(64, 1), 63)), first);
}

TEST_F(DeriveKeyTest, TheKeyIsASecretOf256BitsThatAesTakes) {
  object_handle key;
  ASSERT_EQ(derive(derived_ksk(), pattern(64), key), TEE_SUCCESS);
  TEE_ObjectInfo info = {};
  ASSERT_EQ(TEE_GetObjectInfo1(key.get(), &info), TEE_SUCCESS);
  EXPECT_EQ(info.objectType, 0xA0000010U);
  EXPECT_EQ(info.maxKeySize, 256U);
  operation_handle cipher;
  ASSERT_EQ(cipher.allocate(TEE_ALG_AES_GCM, TEE_MODE_ENCRYPT, 256), TEE_SUCCESS);
  EXPECT_EQ(TEE_SetOperationKey(cipher.get(), key.get()), TEE_SUCCESS);
}

TEST_F(DeriveKeyTest, EachPlatformFailureIsToldAndLeavesNothing) {
  struct row {
    const char* call;
    const char* message;
  };
  for (const row& r : {row{"TEE_AllocateOperation", "AllocateOperation"},
                       {"TEE_SetOperationKey", "SetOperationKey"},
                       {"TEE_MACComputeFinal", "MACComputeFinal"},
                       {"TEE_AllocateTransientObject", "AllocateTransientObject"},
                       {"TEE_PopulateTransientObject", "PopulateTransientObject"}}) {
    faults().fail_call(r.call, 1, TEE_ERROR_BUSY);
    expect_failure(TEE_ERROR_BUSY, fmt::format("{} failed with 0xffff000d\n", r.message));
  }
}

TEST_F(DeriveKeyTest, AMacOfAnotherLengthMakesNoKey) {
  for (const std::uint32_t size : {0U, 20U, 31U, 33U, 64U}) {
    faults().override_output("TEE_MACComputeFinal", 1, [size](std::uint32_t* length, TEE_Result&) { *length = size; });
    expect_failure(TEE_ERROR_BAD_PARAMETERS, fmt::format("Wrong MAC length, expected 32B, got {}B\n", size));
  }
}

}  // namespace
