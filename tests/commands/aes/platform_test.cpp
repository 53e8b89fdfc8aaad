// AES operations on a platform that fails or lies.
#include <fmt/format.h>

#include "tests/commands/aes/aes_fixture.h"
#include "tests/commands/hostile/tag_length.h"

using namespace keymaster;

namespace testing_support {
namespace {

class AesPlatformTest : public AesTest {
 protected:
  /// claim makes the n-th call of a platform function report `length`.
  void claim(const char* call, std::uint32_t n, std::uint32_t length) {
    tee.world().faults().override_output(call, n,
                                         [length](std::uint32_t* reported, TEE_Result&) { *reported = length; });
  }
  /// expect_finish_fails begins, feeds `input`, lets `disturb` order what goes wrong and expects finish to fail.
  template <class Disturb>
  void expect_finish_fails(failure expected_failure, std::uint32_t purpose, const param_list& params,
                           const bytes& input, Disturb&& disturb) {
    expected_failure.lines.emplace_back("Finish failed");
    const hosted_tee::accounting before = tee.accounting();
    const std::uint32_t handle = client().must_begin(purpose, blob, params);
    (void)fed(handle, input);
    disturb();
    (void)expect_lost(expected_failure, handle, before, [&] { return client().finish(handle); });
  }
};

TEST_F(AesPlatformTest, EachFailureOfBeginHasItsLinesAndItsResult) {
  struct platform_failure {
    const char* call;
    std::uint32_t n;  // of begin's calls of that function; the blob's opening has made some
    trace_lines lines;
  };
  const std::string code = " failed with 0xffff0001\n", create = "Create operation failed",
                    resolve = "Resolve key data failed";
  const std::vector<platform_failure> rows = {
      {"TEE_AllocateTransientObject", 2, {"AllocateTransientObject" + code, resolve, create}},
      {"TEE_PopulateTransientObject", 2, {"PopulateTransientObject" + code, resolve, create}},
      {"TEE_AllocateOperation", 3, {"AllocateOperation" + code, create}},
      {"TEE_SetOperationKey", 3, {"SetOperationKey" + code, create}},
  };
  const auto expect_broken = [&](const platform_failure& row, std::uint32_t purpose, const param_list& params) {
    SCOPED_TRACE(fmt::format("{} number {}, purpose {}", row.call, row.n, purpose));
    tee.world().faults().fail_call(row.call, row.n, TEE_ERROR_ACCESS_DENIED);
    const answer a = expect_failure(broken(TEEC_ERROR_ACCESS_DENIED, row.lines),
                                    [&] { return client().begin(purpose, blob, params); });
    EXPECT_EQ(a.b, 0U);
    EXPECT_EQ(a.output, bytes(a.output.size(), canary));
  };
  for (const std::uint32_t purpose : both_cipher_purposes) {
    for (const platform_failure& row : rows) {
      for (const std::uint32_t mode : {KM_MODE_ECB, KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM}) {
        expect_broken(row, purpose, asking(mode));
      }
    }
    expect_broken({"TEE_AEInit", 2, {"AEInit" + code, create}}, purpose, asking(KM_MODE_GCM));
  }
}

TEST_F(AesPlatformTest, APlatformThatTakesTheStandardsTagsAloneRefusesTheOthersAtBegin) {
  const bytes lenient = import_without_shortest_tag();
  tee.world().faults().strict_gcm_tags(true);
  for (const std::uint32_t bits : {0U, 8U, 88U}) {
    expect_failure(broken(TEEC_ERROR_NOT_SUPPORTED, {"AEInit failed with 0xffff000a\n", "Create operation failed"}),
                   [&] { return client().begin(KM_PURPOSE_ENCRYPT, lenient, gcm(bits, nonce)); });
  }
  EXPECT_TRUE(client().begin(KM_PURPOSE_ENCRYPT, lenient, gcm(96, nonce)).ok());
}

TEST_F(AesPlatformTest, AFailedUpdateIsThePlatformsResultAndEndsTheOperation) {
  struct update_failure {
    std::uint32_t purpose, mode, padding, n;
    const char* call;
    const char* line;
  };
  const hosted_tee::accounting before = tee.accounting();
  constexpr const char *cipher_line = "CipherUpdate failed with 0xffff0001\n",
                       *ae_line = "AEUpdate failed with 0xffff0001\n";
  for (const update_failure& row :
       {update_failure{KM_PURPOSE_ENCRYPT, KM_MODE_ECB, KM_PAD_NONE, 1, "TEE_CipherUpdate", cipher_line},
        {KM_PURPOSE_ENCRYPT, KM_MODE_CTR, KM_PAD_NONE, 1, "TEE_CipherUpdate", cipher_line},
        {KM_PURPOSE_ENCRYPT, KM_MODE_GCM, KM_PAD_NONE, 1, "TEE_AEUpdate", ae_line},
        {KM_PURPOSE_DECRYPT, KM_MODE_CBC, KM_PAD_PKCS7, 1, "TEE_CipherUpdate", cipher_line},
        {KM_PURPOSE_DECRYPT, KM_MODE_GCM, KM_PAD_NONE, 1, "TEE_AEUpdate", ae_line},
        {KM_PURPOSE_DECRYPT, KM_MODE_GCM, KM_PAD_NONE, 2, "TEE_AEUpdate", ae_line}}) {
    SCOPED_TRACE(fmt::format("purpose {} mode {} call {}", row.purpose, row.mode, row.n));
    const std::uint32_t handle = client().must_begin(row.purpose, blob, asking(row.mode, row.padding));
    (void)fed(handle, pattern(16));
    tee.world().faults().fail_call(row.call, row.n, TEE_ERROR_ACCESS_DENIED);
    (void)expect_lost(broken(TEEC_ERROR_ACCESS_DENIED, {row.line, "Update failed"}), handle, before,
                      [&] { return client().update(handle, pattern(32)); });
  }
}

TEST_F(AesPlatformTest, AFailedReleaseOfHeldBytesIsThePlatformsResult) {
  const hosted_tee::accounting before = tee.accounting();
  const std::uint32_t handle = begin_decrypting(asking(KM_MODE_GCM));
  (void)fed(handle, pattern(16));
  tee.world().faults().fail_call("TEE_AEUpdate", 1, TEE_ERROR_ACCESS_DENIED);
  (void)expect_lost(broken(TEEC_ERROR_ACCESS_DENIED, {"AEUpdate failed with 0xffff0001\n", "Update failed"}), handle,
                    before, [&] { return client().update(handle, {1}); });
}

TEST_F(AesPlatformTest, AFailedFinishIsThePlatformsResult) {
  struct finish_failure {
    std::uint32_t purpose, mode, padding;
    const char* call;
    const char* line;
  };
  constexpr const char* final_line = "CipherDoFinal failed with 0xffff0001\n";
  for (const finish_failure& row : {finish_failure{KM_PURPOSE_ENCRYPT, KM_MODE_CBC, KM_PAD_PKCS7, "TEE_CipherUpdate",
                                                   "CipherUpdate failed with 0xffff0001\n"},
                                    {KM_PURPOSE_ENCRYPT, KM_MODE_CBC, KM_PAD_PKCS7, "TEE_CipherDoFinal", final_line},
                                    {KM_PURPOSE_ENCRYPT, KM_MODE_CTR, KM_PAD_NONE, "TEE_CipherDoFinal", final_line},
                                    {KM_PURPOSE_DECRYPT, KM_MODE_ECB, KM_PAD_NONE, "TEE_CipherDoFinal", final_line},
                                    {KM_PURPOSE_DECRYPT, KM_MODE_CBC, KM_PAD_PKCS7, "TEE_CipherDoFinal", final_line},
                                    {KM_PURPOSE_ENCRYPT, KM_MODE_GCM, KM_PAD_NONE, "TEE_AEEncryptFinal",
                                     "AEEncryptFinal failed with 0xffff0001\n"}}) {
    expect_finish_fails(broken(TEEC_ERROR_ACCESS_DENIED, {row.line}), row.purpose, asking(row.mode, row.padding),
                        pattern(16), [&] { tee.world().faults().fail_call(row.call, 1, TEE_ERROR_ACCESS_DENIED); });
  }
}

TEST_F(AesPlatformTest, OutputWhereThereIsNoneLeftIsAnUnknownError) {
  const auto unknown = [](const char* line) { return refused(KM_ERROR_UNKNOWN_ERROR, {line}); };
  for (const std::uint32_t purpose : both_cipher_purposes) {
    for (const std::uint32_t padding : {KM_PAD_NONE, KM_PAD_PKCS7}) {
      expect_finish_fails(unknown("CipherDoFinal make output 3B, expected 0B"), purpose, asking(KM_MODE_ECB, padding),
                          pattern(16), [&] { claim("TEE_CipherDoFinal", 1, 3); });
    }
  }
  expect_finish_fails(unknown("AEEncryptFinal make output 5B, expected 0B"), KM_PURPOSE_ENCRYPT, asking(KM_MODE_GCM),
                      pattern(16), [&] { claim("TEE_AEEncryptFinal", 1, 5); });
  // Decryption has the same text, without what was expected.
  expect_finish_fails(unknown("AEEncryptFinal make output 5B"), KM_PURPOSE_DECRYPT, asking(KM_MODE_GCM),
                      expected(KM_MODE_GCM, KM_PAD_NONE, pattern(16)), [&] { claim("TEE_AEDecryptFinal", 1, 5); });
}

TEST_F(AesPlatformTest, APaddedBlockOfAnotherSizeIsAnUnknownError) {
  for (const std::uint32_t claimed : {0U, 15U, 32U}) {
    expect_finish_fails(refused(KM_ERROR_UNKNOWN_ERROR,
                                {fmt::format("Padding input got wrong output length {}B, expected 16B", claimed)}),
                        KM_PURPOSE_ENCRYPT, asking(KM_MODE_CBC, KM_PAD_PKCS7), pattern(5),
                        [&] { claim("TEE_CipherUpdate", 1, claimed); });
  }
}

TEST_F(AesPlatformTest, ATagOfAnotherSizeIsTracedInBytesBesideTheBitsThatWereAskedFor) {
  for (const std::uint32_t claimed : {0U, 11U, 13U, 96U}) {
    expect_finish_fails(
        refused(KM_ERROR_UNKNOWN_ERROR, {fmt::format("AEEncryptFinal make wrong tag size {}B, expected 96B", claimed)}),
        KM_PURPOSE_ENCRYPT, gcm(96, nonce), pattern(5), [&] { claim_tag_length(claimed); });
  }
}

TEST_F(AesPlatformTest, OnlyAnInvalidTagFailsDecryption) {
  const bytes text = pattern(20), stream = expected(KM_MODE_GCM, KM_PAD_NONE, text);
  for (const TEE_Result result : {TEE_ERROR_GENERIC, TEE_ERROR_SHORT_BUFFER, TEE_ERROR_OUT_OF_MEMORY}) {
    const std::uint32_t handle = begin_decrypting(asking(KM_MODE_GCM));
    EXPECT_EQ(fed(handle, stream), text);
    tee.world().faults().fail_call("TEE_AEDecryptFinal", 1, result);
    EXPECT_TRUE(succeeds([&] { return client().finish(handle); }).data.empty());
  }
  expect_finish_fails(refused(KM_ERROR_VERIFICATION_FAILED, {}), KM_PURPOSE_DECRYPT, asking(KM_MODE_GCM), stream,
                      [&] { tee.world().faults().fail_call("TEE_AEDecryptFinal", 1, TEE_ERROR_MAC_INVALID); });
}

}  // namespace
}  // namespace testing_support
