// A platform that reports success with numbers that can't be true.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/commands/hostile/tag_length.h"
#include "tests/commands/sealed_blob.h"
#include "tests/support/issued_token.h"

using namespace keymaster;

namespace testing_support {
namespace {

class FalseAnswerTest : public CommandTest {
 protected:
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  const bytes blob = import_fixed(1024);

  /// claim makes the n-th call (1 = the next) of a platform function report `length`.
  void claim(const char* call, std::uint32_t n, std::uint32_t length) {
    tee.world().faults().override_output(call, n,
                                         [length](std::uint32_t* reported, TEE_Result&) { *reported = length; });
  }
  /// claim_more makes it report that much more than it did.
  void claim_more(const char* call, std::uint32_t n, std::int32_t more) {
    tee.world().faults().override_output(
        call, n, [more](std::uint32_t* reported, TEE_Result&) { *reported += static_cast<std::uint32_t>(more); });
  }

  void expect_import_fails(TEEC_Result result, trace_lines lines) {
    lines.emplace_back("Can't save key to TEE storage");
    const answer a = expect_failure(broken(result, std::move(lines)),
                                    [&] { return client().import_key(rsa_key(1024), key.material(), 4096); });
    EXPECT_EQ(a.output, bytes(4096, 0));
  }
  template <class Command>
  void expect_open_fails(failure expected, Command&& falsify) {
    expected.lines.emplace_back("Open key failed");
    falsify();
    expect_failure(expected, [&] { return client().characteristics(blob); });
    falsify();
    expect_failure(expected,
                   [&] { return client().begin(KM_PURPOSE_SIGN, blob, signature(KM_DIGEST_NONE, KM_PAD_NONE)); });
  }
};

TEST_F(FalseAnswerTest, AMacOfAnotherLengthDerivesNoKey) {
  for (const std::uint32_t length : {0U, 31U, 33U, 0xFFFFFFFFU}) {
    const std::string line =
        fmt::format("Wrong MAC length, expected 32B, got {}B\n", static_cast<std::int32_t>(length));
    const trace_lines lines = {line, "DeriveKK failed with 0xffff0006\n"};
    claim("TEE_MACComputeFinal", 1, length);
    expect_import_fails(TEEC_ERROR_BAD_PARAMETERS, lines);
    expect_open_fails(broken(TEEC_ERROR_BAD_PARAMETERS, lines), [&] { claim("TEE_MACComputeFinal", 1, length); });
  }
}

TEST_F(FalseAnswerTest, ABlobOfAnotherSizeThanItsPartsIsNotHandedOut) {
  const auto total = static_cast<std::int32_t>(blob.size());
  struct wrong_piece {
    const char* call;
    std::uint32_t n;
    std::int32_t more;
  };
  for (const wrong_piece& each : {wrong_piece{"TEE_AEUpdate", 1, -1},
                                  {"TEE_AEUpdate", 2, -7},
                                  {"TEE_AEUpdate", 3, -4},
                                  {"TEE_AEUpdate", 4, -1}}) {
    claim_more(each.call, each.n, each.more);
    expect_import_fails(TEEC_ERROR_GENERIC,
                        {fmt::format("Unmatched total size, expected: {} actual: {}\n", total, total + each.more)});
  }
  for (const wrong_piece& each : {wrong_piece{"TEE_AEUpdate", 4, 1}, {"TEE_AEEncryptFinal", 1, 16}}) {
    claim_more(each.call, each.n, each.more);
    expect_import_fails(TEEC_ERROR_GENERIC,
                        {fmt::format("Unmatched total size, expected: {} actual: {}\n", total, total + each.more)});
  }
}

TEST_F(FalseAnswerTest, ATagOfAnotherSizeIsTracedWithTheBytesOfTheLastStep) {
  for (const std::uint32_t length : {0U, 12U, 15U, 17U}) {
    claim_tag_length(length);
    expect_import_fails(TEEC_ERROR_GENERIC, {"Wrong tag size, expect 16B, got 0B"});
    claim_tag_length(length);
    claim("TEE_AEEncryptFinal", 1, 5);
    expect_import_fails(TEEC_ERROR_GENERIC, {"Wrong tag size, expect 16B, got 5B"});
  }
}

TEST_F(FalseAnswerTest, ADecryptionOfAnotherSizeIsAnUnknownError) {
  const auto size = static_cast<std::int32_t>(blob.size() - blob_header);
  for (const std::int32_t more : {-1, -size, 1, 4096}) {
    const std::string line = fmt::format("Too short output of AES, expect {}B, got {}B", size, size + more);
    expect_open_fails(refused(KM_ERROR_UNKNOWN_ERROR, {line}), [&] { claim_more("TEE_AEUpdate", 1, more); });
  }
  for (const std::int32_t more : {1, 300}) {
    const std::string line = fmt::format("Too short output of AES, expect {}B, got {}B", size, size + more);
    expect_open_fails(refused(KM_ERROR_UNKNOWN_ERROR, {line}), [&] { claim_more("TEE_AEDecryptFinal", 1, more); });
  }
}

TEST_F(FalseAnswerTest, AComponentThatGrowsOrShrinksBetweenTwoReadsIsNoticed) {
  const auto expect_generate_fails = [&](const failure& expected) {
    const answer a = expect_failure(expected, [&] { return client().generate(rsa_key(512), 2048); });
    EXPECT_EQ(a.output, bytes(2048, 0));
  };
  // The modulus, of 64 bytes, is the first component of each of the two passes of eight.
  claim("TEE_GetObjectBufferAttribute", 1, 70);
  expect_generate_fails(refused(KM_ERROR_UNKNOWN_ERROR, {"Buffer size modified, before 70B, after 64B"}));
  claim("TEE_GetObjectBufferAttribute", 9, 63);
  expect_generate_fails(refused(KM_ERROR_UNKNOWN_ERROR, {"Buffer size modified, before 64B, after 63B"}));
  claim("TEE_GetObjectBufferAttribute", 9, 1000);
  expect_generate_fails(refused(KM_ERROR_UNKNOWN_ERROR, {"Buffer size modified, before 64B, after 1000B"}));
  claim("TEE_GetObjectBufferAttribute", 1, 63);
  expect_generate_fails(broken(TEEC_ERROR_SHORT_BUFFER, {"GetObjectBufferAttribute failed with 0xffff0010\n"}));
  claim("TEE_GetObjectBufferAttribute", 1, 0);
  expect_generate_fails(broken(TEEC_ERROR_SHORT_BUFFER, {"GetObjectBufferAttribute failed with 0xffff0010\n"}));
}

TEST_F(FalseAnswerTest, ComponentsOfImpossibleSizeAreWantOfMemory) {
  for (const std::uint32_t length : {0x80000U, 0x7FFFFFFFU, 0xFFFFFFFFU}) {
    claim("TEE_GetObjectBufferAttribute", 3, length);
    expect_failure(broken(TEEC_ERROR_OUT_OF_MEMORY, {"Out of memory"}),
                   [&] { return client().generate(rsa_key(512), 2048); });
  }
  claim("TEE_GetObjectBufferAttribute", 1, 0xFFFFFFFF);  // together they pass 32 bits
  claim("TEE_GetObjectBufferAttribute", 2, 0xFFFFFFFF);
  expect_failure(broken(TEEC_ERROR_OUT_OF_MEMORY, {"Out of memory"}),
                 [&] { return client().generate(rsa_key(512), 2048); });
}

TEST_F(FalseAnswerTest, ASignatureIsAlwaysAsLongAsTheModulus) {
  const param_list pkcs1 = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
  const bytes message = from_text("message"), made = client().sign(blob, pkcs1, message).data;
  for (const std::uint32_t length : {128U, 129U, 5000U, 0xFFFFFFFFU}) {
    claim("TEE_AsymmetricSignDigest", 1, length);
    EXPECT_EQ(client().sign(blob, pkcs1, message).data, made);
  }
  // Fewer bytes are a number without its leading zeros.
  claim("TEE_AsymmetricSignDigest", 1, 126);
  EXPECT_EQ(client().sign(blob, pkcs1, message).data, join({{0, 0}, bytes(made.begin(), made.begin() + 126)}));
  claim("TEE_AsymmetricDecrypt", 1, 0xFFFFFFFF);
  EXPECT_EQ(client().sign(blob, signature(KM_DIGEST_NONE, KM_PAD_NONE), message).data.size(), 128U);
}

TEST_F(FalseAnswerTest, ADigestOfAnotherLengthIsNotSigned) {
  for (const std::uint32_t length : {0U, 31U, 33U, 128U}) {
    claim("TEE_DigestDoFinal", 1, length);
    expect_failure(
        broken(TEEC_ERROR_BAD_PARAMETERS, {"AsymmetricSignDigest failed with 0xffff0006\n", "Finish failed"}), [&] {
          return client().sign(blob, signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN), from_text("message"));
        });
  }
}

TEST_F(FalseAnswerTest, ARecoveredBlockOfAnotherLengthIsAWrongSignature) {
  const param_list raw = signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN);
  const bytes message = from_text("message"), made = client().sign(blob, raw, message).data;
  for (const std::uint32_t length : {0U, 126U, 128U, 0xFFFFFFFFU}) {
    claim("TEE_AsymmetricEncrypt", 1, length);
    expect_failure(refused(KM_ERROR_VERIFICATION_FAILED, {"Finish failed"}),
                   [&] { return client().verify(blob, raw, message, made); });
  }
}

TEST_F(FalseAnswerTest, AnExportOfMoreThanTheRoomIsNotHandedOut) {
  for (const std::uint32_t length : {4097U, 5000U, 0xFFFFFFFFU}) {
    claim("TEE_AsymmetricExport", 1, length);
    const answer a = expect_failure(refused(KM_ERROR_UNKNOWN_ERROR, {"Export key failed"}),
                                    [&] { return client().export_key(blob); });
    EXPECT_EQ(a.size, 0U);
  }
}

/// An auth token must not pass because its MAC couldn't be computed.
class FalseTokenTest : public FalseAnswerTest {
 protected:
  const bytes bound = import_fixed(1024, rsa_key(1024)
                                             .remove(KM_TAG_NO_AUTH_REQUIRED)
                                             .add(KM_TAG_USER_SECURE_ID, 5)
                                             .add(KM_TAG_USER_AUTH_TYPE, 1)
                                             .add(KM_TAG_AUTH_TIMEOUT, 100));

  void expect_refused(const bytes& token, trace_lines lines) {
    lines.emplace_back("Authorization failed");
    param_list params = signature(KM_DIGEST_NONE, KM_PAD_NONE);
    params.add_blob(KM_TAG_AUTH_TOKEN, token);
    expect_failure(refused(KM_ERROR_INVALID_ARGUMENT, std::move(lines)),
                   [&] { return client().begin(KM_PURPOSE_SIGN, bound, params); });
  }
};

TEST_F(FalseTokenTest, ATokenOfZerosDoesntPassWhenThereIsNoMacToCompareWith) {
  const bytes good = issued_token{.user_id = 5}.issue(tee.world().boot_seed());
  const bytes zero_mac = join({bytes(good.begin(), good.begin() + 37), bytes(32)});
  expect_refused(zero_mac, {});
  struct failing {
    const char* call;
    std::uint32_t n;
    const char* line;
  };
  for (const failing& each : {failing{"TEE_AllocateOperation", 3, "AllocateOperation failed with 0xffff000c\n"},
                              {"TEE_SetOperationKey", 3, "SetOperationKey failed with 0xffff000c\n"},
                              {"TEE_MACComputeFinal", 2, "MACComputeFinal failed with 0xffff000c\n"}}) {
    tee.world().faults().fail_call(each.call, each.n, TEE_ERROR_OUT_OF_MEMORY);
    expect_refused(zero_mac, {each.line});
  }
}

TEST_F(FalseTokenTest, AMacOfAnotherLengthMakesAGoodTokenInvalid) {
  const bytes good = issued_token{.user_id = 5}.issue(tee.world().boot_seed());
  for (const std::uint32_t length : {0U, 31U, 33U, 256U, 0xFFFFFFFFU}) {
    claim("TEE_MACComputeFinal", 2, length);
    expect_refused(good, {fmt::format("Wrong MAC length, expected 32B, got {}B\n", static_cast<std::int32_t>(length))});
  }
}

}  // namespace
}  // namespace testing_support
