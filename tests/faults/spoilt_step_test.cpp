// Steps of the platform that fail without being able to say so: the TA goes on, and the next call with a result tells.
#include <gmock/gmock.h>

#include "tests/faults/stage.h"
#include "tests/support/encryption.h"
#include "tests/support/hmac_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

using trace_lines = std::vector<std::string>;

class SpoiltStepTest : public ::testing::Test {
 protected:
  SpoiltStepTest() {
    on.import();
    on.params = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
    faults.clear();
    on.tee.clear_trace();
  }

  void spoil(const char* step, std::uint32_t n = 1) { faults.fail_call(step, n, TEE_ERROR_OUT_OF_MEMORY); }

  trace_lines errors() {
    trace_lines found;
    for (const hosted_tee::trace_line& line : on.tee.world().trace().lines()) {
      if (line.level == hosted_tee::trace_level::error) found.push_back(line.text);
    }
    return found;
  }

  /// expect_failed expects the TEE's own error, no response, and nothing left behind.
  void expect_failed(const answer& got, TEEC_Result result, const trace_lines& lines) {
    EXPECT_EQ(got.result, result);
    EXPECT_NE(got.error, KM_ERROR_OK);
    EXPECT_EQ(got.size, 0U);
    EXPECT_EQ(errors(), lines);
    EXPECT_TRUE(faults.triggered());
    EXPECT_TRUE(on.tee.accounting().same_holdings(before));
  }

  stage on{true};
  hosted_tee::fault_plan& faults = on.tee.world().faults();
  const hosted_tee::accounting before = [this] {
    on.import();
    return on.tee.accounting();
  }();
};

TEST_F(SpoiltStepTest, ASpoiltDigestIsNeverSigned) {
  on.begin(KM_PURPOSE_SIGN);
  spoil("TEE_DigestUpdate");
  const answer fed = on.client().update(on.handle, on.message);
  EXPECT_TRUE(fed.ok());
  EXPECT_EQ(fed.b, on.message.size());
  EXPECT_TRUE(on.client().update(on.handle, on.message).ok()) << "a later good step doesn't heal it";
  expect_failed(on.client().finish(on.handle), TEEC_ERROR_GENERIC,
                {"DigestDoFinal failed with 0xffff0000\n", "Finish failed"});
  EXPECT_EQ(on.client().abort(on.handle).error, KM_ERROR_INVALID_OPERATION_HANDLE);
}

TEST_F(SpoiltStepTest, ASpoiltDigestVerifiesNothing) {
  const bytes good = on.client().sign(on.blob, on.params, on.message).data;
  on.begin(KM_PURPOSE_VERIFY);
  spoil("TEE_DigestUpdate");
  EXPECT_TRUE(on.client().update(on.handle, on.message).ok());
  expect_failed(on.client().finish(on.handle, good), TEEC_ERROR_GENERIC,
                {"DigestDoFinal failed with 0xffff0000\n", "Finish failed"});
}

/// A GCM operation whose associated data never arrived.
class SpoiltAssociatedDataTest : public SpoiltStepTest {
 protected:
  const bytes raw = pattern(16, 7), nonce = pattern(12, 8), aad = from_text("whom it is for");

  void begin_and_spoil(std::uint32_t purpose) {
    on.blob = on.client().must_import(aes_key(128), raw);
    on.params = gcm(128, nonce);
    on.begin(purpose);
    spoil("TEE_AEUpdateAAD");
    on.tee.clear_trace();
    EXPECT_TRUE(feed({}, aad).ok());
  }
  answer feed(const bytes& input, const bytes& associated = {}) {
    param_list params;
    if (!associated.empty()) params.add_blob(KM_TAG_ASSOCIATED_DATA, associated);
    return on.client().update(on.handle, input, params);
  }
  [[nodiscard]] bytes sealed(const bytes& text, const bytes& associated) const {
    return aes_encrypt({KM_MODE_GCM, KM_PAD_NONE, raw, nonce, associated}, text);
  }
};

TEST_F(SpoiltAssociatedDataTest, NothingIsDecryptedWithoutIt) {
  begin_and_spoil(KM_PURPOSE_DECRYPT);
  expect_failed(feed(sealed(on.message, aad)), TEEC_ERROR_GENERIC,
                {"AEUpdate failed with 0xffff0000\n", "Update failed"});
  EXPECT_EQ(on.client().finish(on.handle).error, KM_ERROR_INVALID_OPERATION_HANDLE);
}

TEST_F(SpoiltAssociatedDataTest, NothingIsEncryptedWithoutIt) {
  begin_and_spoil(KM_PURPOSE_ENCRYPT);
  expect_failed(feed(on.message), TEEC_ERROR_GENERIC, {"AEUpdate failed with 0xffff0000\n", "Update failed"});
}

TEST_F(SpoiltAssociatedDataTest, NoTagIsMadeWithoutIt) {
  begin_and_spoil(KM_PURPOSE_ENCRYPT);
  expect_failed(on.client().finish(on.handle), TEEC_ERROR_GENERIC,
                {"AEEncryptFinal failed with 0xffff0000\n", "Finish failed"});
}

TEST_F(SpoiltAssociatedDataTest, NoTagIsRightWithoutIt) {
  // Neither that of the data that were sent, nor that of those that have arrived.
  for (const bytes& associated : {aad, bytes{}}) {
    begin_and_spoil(KM_PURPOSE_DECRYPT);
    EXPECT_TRUE(feed(sealed({}, associated)).ok());
    const finish_answer got = on.client().finish(on.handle);
    expect_failed(got, TEEC_SUCCESS, {"Finish failed"});
    EXPECT_EQ(got.error, KM_ERROR_VERIFICATION_FAILED);
  }
}

TEST_F(SpoiltAssociatedDataTest, WhatArrivesLaterDoesNotHealIt) {
  begin_and_spoil(KM_PURPOSE_DECRYPT);
  EXPECT_TRUE(feed({}, aad).ok());
  EXPECT_TRUE(feed(sealed({}, aad)).ok());
  EXPECT_EQ(on.client().finish(on.handle).error, KM_ERROR_VERIFICATION_FAILED);
}

TEST_F(SpoiltStepTest, ACipherThatCouldNotBeStartedGivesNothingOut) {
  on.blob = on.client().must_import(aes_key(128), pattern(16));
  struct spoilt_mode {
    std::uint32_t purpose, mode, padding;
    bytes nonce;
    const char* line;  // of the finish, without any data
  };
  constexpr const char *update_line = "CipherUpdate failed with 0xffff0000\n",
                       *final_line = "CipherDoFinal failed with 0xffff0000\n";
  for (const spoilt_mode& row : {spoilt_mode{KM_PURPOSE_ENCRYPT, KM_MODE_ECB, KM_PAD_NONE, {}, final_line},
                                 {KM_PURPOSE_ENCRYPT, KM_MODE_CBC, KM_PAD_PKCS7, pattern(16), update_line},
                                 {KM_PURPOSE_DECRYPT, KM_MODE_CBC, KM_PAD_PKCS7, pattern(16), final_line},
                                 {KM_PURPOSE_DECRYPT, KM_MODE_CTR, KM_PAD_NONE, pattern(16), final_line}}) {
    on.params = cipher(row.mode, row.padding, row.nonce);
    for (const bool with_data : {true, false}) {
      spoil("TEE_CipherInit");
      on.begin(row.purpose);
      on.tee.clear_trace();
      if (with_data) {
        expect_failed(on.client().update(on.handle, pattern(32)), TEEC_ERROR_GENERIC, {update_line, "Update failed"});
      } else {
        expect_failed(on.client().finish(on.handle), TEEC_ERROR_GENERIC, {row.line, "Finish failed"});
      }
    }
  }
}

TEST_F(SpoiltStepTest, AMacThatCouldNotBeStartedOrFedIsNeitherMadeNorHeld) {
  on.blob = on.client().must_import(hmac_key(KM_DIGEST_SHA_2_256, 256), pattern(32));
  on.params = hmac_length(64);
  for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
    for (const char* const step : {"TEE_MACInit", "TEE_MACUpdate"}) {
      faults.clear();
      if (std::string_view(step) == "TEE_MACInit") spoil(step, 2);  // the first is that of the blob's key
      on.begin(purpose);
      if (!faults.triggered()) spoil(step);
      EXPECT_TRUE(on.client().update(on.handle, on.message).ok());
      on.tee.clear_trace();
      expect_failed(on.client().finish(on.handle, bytes(8)), TEEC_ERROR_GENERIC,
                    {"MACComputeFinal failed with 0xffff0000\n", "Finish failed"});
    }
  }
}

TEST_F(SpoiltStepTest, ABlobKeyIsNotDerivedFromASpoiltMac) {
  spoil("TEE_MACInit");
  expect_failed(on.client().begin(KM_PURPOSE_SIGN, on.blob, on.params), TEEC_ERROR_GENERIC,
                {"MACComputeFinal failed with 0xffff0000\n", "DeriveKK failed with 0xffff0000\n", "Open key failed"});
}

TEST_F(SpoiltStepTest, ATokenWhoseMacCannotBeComputedIsNoToken) {
  on.import(bound_key());
  on.begin(KM_PURPOSE_SIGN);
  on.tee.clear_trace();
  spoil("TEE_MACInit");
  const answer got = on.client().update(on.handle, on.message, on.with_token());
  EXPECT_EQ(got.result, TEEC_SUCCESS);
  EXPECT_EQ(got.error, KM_ERROR_INVALID_ARGUMENT);
  EXPECT_THAT(errors(), testing::Contains("MACComputeFinal failed with 0xffff0000\n"));
  EXPECT_TRUE(faults.triggered());
  EXPECT_TRUE(on.tee.accounting().same_holdings(before));
}

TEST_F(SpoiltStepTest, WithoutRandomDataTheInstanceEndsAndTheNextOneWorks) {
  for (const std::uint32_t n : {1U, 2U}) {
    spoil("TEE_GenerateRandom", n);  // the nonce and the IV of a blob
    EXPECT_EQ(on.client().import_key(rsa_key(1024), on.key.material()).result, TEEC_ERROR_TARGET_DEAD);
    EXPECT_FALSE(on.tee.world().has_instance(keymaster_ta));
    EXPECT_THAT(errors(), testing::Contains("KEYMASTER panics: no random data to be had"));
    on.tee.open_session();
    EXPECT_TRUE(on.client().sign(on.blob, on.params, on.message).ok());
  }
  spoil("TEE_GenerateRandom");  // an operation's handle
  EXPECT_EQ(on.client().begin(KM_PURPOSE_SIGN, on.blob, on.params).result, TEEC_ERROR_TARGET_DEAD);
}

}  // namespace
}  // namespace testing_support
