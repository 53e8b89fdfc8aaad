// Statements: which members they have, what is signed, and what a failure costs.
#include "tests/soter/statement_fixture.h"

#include <fmt/format.h>

#include "soter/json_writer.h"

using namespace keymaster;

namespace testing_support {
namespace {

using hosted_tee::trace_level;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

TEST_F(SoterStatementTest, TheAttestationKeySignsAnExportWithItsMembersInOrder) {
  const exported got = export_key(
      param_list{}.add(KM_TAG_SOTER_UID, 0xFFFFFFFE).add(KM_TAG_SOTER_COUNTED, 0).add(KM_TAG_SOTER_SIGNED_BY_ATTK, 0));
  ASSERT_EQ(got.result, TEE_SUCCESS);
  const statement made = take_apart(got.output);
  EXPECT_EQ(std::string(made.text.begin(), made.text.end()),
            "{\"counter\":1,\"uid\":4294967294," + pem_member(1024) + "}");
  EXPECT_EQ(made.signature.size(), 256U);
  EXPECT_TRUE(
      rsa_test_key::of_bits(2048).verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, made.text, made.signature));
  EXPECT_THAT(errors(), IsEmpty());
  for (const char* const line :
       {"This key need increase the counter", "soter key has uid\n", "soter use attkey sign\n"}) {
    EXPECT_THAT(ta().traced(trace_level::debug), Contains(line));
  }
}

TEST_F(SoterStatementTest, AnAttestationKeyOfThreeComponentsSignsAsWell) {
  quil.key.data = key_box(3);
  const exported got = export_key(param_list{}.add(KM_TAG_SOTER_SIGNED_BY_ATTK));
  ASSERT_EQ(got.result, TEE_SUCCESS);
  const statement made = take_apart(got.output);
  EXPECT_EQ(std::string(made.text.begin(), made.text.end()), "{" + pem_member(1024) + "}");
  EXPECT_TRUE(
      rsa_test_key::of_bits(2048).verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, made.text, made.signature));
  EXPECT_EQ(stored_counter(), std::nullopt) << "the key does not have the counter told";
}

TEST_F(SoterStatementTest, AnotherKeySignsAnExport) {
  const bytes signer = blob(key_data(1024));
  for (const keymaster_tag_t tag : {KM_TAG_SOTER_SIGNING_KEY_BLOB, KM_TAG_SOTER_SIGNING_KEY_NAME}) {
    const exported got = export_key(param_list{}.add(KM_TAG_SOTER_SIGNED_BY_KEY).add_blob(tag, signer), key_data(2048));
    ASSERT_EQ(got.result, TEE_SUCCESS);
    const statement made = take_apart(got.output);
    EXPECT_EQ(std::string(made.text.begin(), made.text.end()), "{" + pem_member(2048) + "}");
    EXPECT_EQ(made.signature.size(), 128U);
    EXPECT_TRUE(rsa_test_key::of_bits(1024).verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, made.text,
                                                     made.signature));
  }
  EXPECT_FALSE(soter_ready()) << "nobody needed the attestation key";
}

TEST_F(SoterStatementTest, TheBlobGoesBeforeTheNameAndARepeatedBlobIsNone) {
  const bytes good = blob(key_data(1024)), bad = flip(good, 80);
  const param_list key = param_list{}.add(KM_TAG_SOTER_SIGNED_BY_KEY).add_blob(KM_TAG_SOTER_SIGNING_KEY_NAME, good);
  param_list once = key, twice = key;
  once.add_blob(KM_TAG_SOTER_SIGNING_KEY_BLOB, bad);
  expect_export_fails(export_key(once), TEE_ERROR_BAD_STATE,
                      {"AEDecryptFinal failed with 0xffff3071\n", "Sign key is null\n"});
  twice.add_blob(KM_TAG_SOTER_SIGNING_KEY_BLOB, bad).add_blob(KM_TAG_SOTER_SIGNING_KEY_BLOB, bad);
  EXPECT_EQ(export_key(twice).result, TEE_SUCCESS);
}

TEST_F(SoterStatementTest, TheAttestationKeyGoesBeforeAnother) {
  const exported got = export_key(param_list{}
                                      .add(KM_TAG_SOTER_SIGNED_BY_KEY)
                                      .add(KM_TAG_SOTER_SIGNED_BY_ATTK)
                                      .add_blob(KM_TAG_SOTER_SIGNING_KEY_BLOB, blob(key_data(1024))));
  ASSERT_EQ(got.result, TEE_SUCCESS);
  EXPECT_EQ(take_apart(got.output).signature.size(), 256U);
}

TEST_F(SoterStatementTest, OnlyRsaKeysSign) {
  // 32 zero bytes read as an RSA key of no digits.
  for (const bytes& signer : {blob(bytes(36), KM_ALGORITHM_AES), blob(bytes(36)), blob(pattern(20)),
                              blob(key_data(1024), KM_ALGORITHM_EC), pattern(50)}) {
    const exported got =
        export_key(param_list{}.add(KM_TAG_SOTER_SIGNED_BY_KEY).add_blob(KM_TAG_SOTER_SIGNING_KEY_BLOB, signer));
    EXPECT_EQ(got.result, TEE_ERROR_BAD_STATE);
    EXPECT_THAT(errors(), Contains("Sign key is null\n"));
  }
}

TEST_F(SoterStatementTest, AnExportThatNobodySignsHasMovedTheCounter) {
  expect_export_fails(export_key(param_list{}.add(KM_TAG_SOTER_COUNTED)), TEE_ERROR_BAD_PARAMETERS, {});
  EXPECT_EQ(stored_counter(), u64(1));
  expect_export_fails(export_key(param_list{}.add(KM_TAG_SOTER_COUNTED).add(KM_TAG_SOTER_SIGNED_BY_KEY)),
                      TEE_ERROR_ITEM_NOT_FOUND, {"no sign key with key blob\n"});
  EXPECT_EQ(stored_counter(), u64(2));
}

TEST_F(SoterStatementTest, AnExportNeedsItsRoomExactly) {
  const param_list key = param_list{}.add(KM_TAG_SOTER_SIGNED_BY_ATTK).add(KM_TAG_SOTER_COUNTED);
  const exported whole = export_key(key);
  ASSERT_EQ(whole.result, TEE_SUCCESS);
  EXPECT_EQ(export_key(key, key_data(1024), whole.size).result, TEE_SUCCESS);
  expect_export_fails(export_key(key, key_data(1024), whole.size - 1), TEE_ERROR_SHORT_BUFFER, {});
  expect_export_fails(export_key(key, key_data(1024), 0), TEE_ERROR_SHORT_BUFFER, {});
  EXPECT_EQ(stored_counter(), u64(4));
}

TEST_F(SoterStatementTest, AKeyThatIsNoRsaKeyIsNotExported) {
  expect_export_fails(export_key(param_list{}.add(KM_TAG_SOTER_SIGNED_BY_ATTK), bytes(36)), TEE_ERROR_BAD_FORMAT,
                      {"resolve key from data stream error\n"});
  expect_export_fails(export_key(param_list{}.add(KM_TAG_SOTER_SIGNED_BY_ATTK), bytes(11)), TEE_ERROR_BAD_FORMAT,
                      {"Too short input", "resolve key from data stream error\n"});
}

TEST_F(SoterStatementTest, ACounterThatHasNoTextIsNotSigned) {
  const param_list key = param_list{}.add(KM_TAG_SOTER_SIGNED_BY_ATTK).add(KM_TAG_SOTER_COUNTED);
  store_counter(u64(99'999'999'998));
  EXPECT_EQ(export_key(key).result, TEE_SUCCESS);
  expect_export_fails(export_key(key), TEE_ERROR_BAD_STATE, {"json serialization error\n"});
  store_counter(u64((std::uint64_t{1} << 53) - 1));
  expect_export_fails(export_key(key), TEE_ERROR_BAD_STATE, {"json serialization error\n"});
  // From there on a double holds another number: 2^63 - 1 would be told as 2^63, with decimals.
  for (const std::uint64_t counter :
       {std::uint64_t{1} << 53, std::uint64_t{0x7FFFFFFFFFFFFFFE}, std::uint64_t{0x7FFFFFFFFFFFFFFF}}) {
    store_counter(u64(counter));
    expect_export_fails(export_key(key), TEE_ERROR_BAD_STATE, {"set counter error -1\n"});
    EXPECT_EQ(sign_once("x").result, TEE_ERROR_BAD_STATE);
    EXPECT_THAT(errors(), ElementsAre("set counter error -1\n", "produce json string error"));
    EXPECT_EQ(stored_counter(), u64(counter + 2)) << "it has moved";
  }
}

TEST_F(SoterStatementTest, ASignStatementTellsTheMessageAndTheDevice) {
  touch(0xFFFFFFFD);
  const signed_statement got = sign_once("challenge \"1\"/", param_list{}.add(KM_TAG_SOTER_UID, 10012));
  ASSERT_EQ(got.result, TEE_SUCCESS);
  const statement made = take_apart(got.output);
  EXPECT_EQ(std::string(made.text.begin(), made.text.end()),
            std::string(R"({"raw":"challenge \"1\"\/","fid":4294967293,"counter":1,"uid":10012,)") + facts + "}" +
                std::string(1, '\0'));
  EXPECT_TRUE(
      rsa_test_key::of_bits(1024).verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, made.text, made.signature))
      << "the signature covers the NUL";
  EXPECT_THAT(errors(), IsEmpty());
  EXPECT_THAT(ta().traced(trace_level::debug), Contains("produce_soter_sign_json success"));
}

TEST_F(SoterStatementTest, WithoutFingerAndUidTheFingerIsMissingAndTheUidIsNone) {
  const signed_statement got = sign_once("");
  ASSERT_EQ(got.result, TEE_SUCCESS);
  const statement made = take_apart(got.output);
  EXPECT_EQ(std::string(made.text.begin(), made.text.end() - 1),
            R"({"raw":"","counter":1,"uid":4294967295,)" + facts + "}");
  EXPECT_THAT(ta().traced(trace_level::info), Contains("get finger id error ffff3001, continue without fid\n"));
}

TEST_F(SoterStatementTest, PssSignsWithTheSaltThatItIsGiven) {
  signing op;
  begin(op, TEE_ALG_SHA1, TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1);
  TEE_Attribute salt;
  TEE_InitValueAttribute(&salt, TEE_ATTR_RSA_PSS_SALT_LENGTH, static_cast<std::uint32_t>(-1), 0);
  const signed_statement got = sign(op, "x", {}, &salt);
  ASSERT_EQ(got.result, TEE_SUCCESS);
  const statement made = take_apart(got.output);
  EXPECT_TRUE(rsa_test_key::of_bits(1024).verifies(KM_DIGEST_SHA1, KM_PAD_RSA_PSS, made.text, made.signature,
                                                   rsa_test_key::salt_as_digest));
}

TEST_F(SoterStatementTest, AMessageThatIsNoTextCostsNoCounter) {
  for (const auto& [raw, before_nul] :
       {std::pair{std::string("a\0b", 3), 1}, std::pair{std::string("\0", 1), 0}, std::pair{std::string("ab\xC3"), 3},
        std::pair{std::string("\xED\xA0\x80"), 3}}) {
    EXPECT_EQ(sign_once(raw).result, TEE_ERROR_BAD_FORMAT);
    EXPECT_THAT(errors(),
                ElementsAre(fmt::format("Not a valid utf8 string, strlen(raw) {} length {}", before_nul, raw.size()),
                            "produce json string error"));
  }
  EXPECT_EQ(stored_counter(), std::nullopt);
}

TEST_F(SoterStatementTest, WithoutADigestNothingIsSignedAndNothingHappens) {
  signing op;
  begin(op);
  op.digest_operation.reset();
  EXPECT_EQ(sign(op, "x").result, TEE_ERROR_NOT_SUPPORTED);
  EXPECT_THAT(errors(), IsEmpty());
  EXPECT_EQ(stored_counter(), std::nullopt);
  EXPECT_THAT(quil.calls, IsEmpty());
}

TEST_F(SoterStatementTest, WithoutTheResourcesThereIsNoStatement) {
  quil.key.result = TEE_ERROR_BUSY;
  EXPECT_EQ(sign_once("x").result, TEE_ERROR_BUSY);
  EXPECT_THAT(errors(),
              ElementsAre("Retrieve key fails, 0xffff000d\n", "soter is not ready\n", "produce json string error"));
  expect_export_fails(export_key(param_list{}.add(KM_TAG_SOTER_SIGNED_BY_ATTK)), TEE_ERROR_BUSY,
                      {"Retrieve key fails, 0xffff000d\n", "soter is not ready\n"});
}

TEST_F(SoterStatementTest, APropertyThatIsNoTextMakesEveryStatementFail) {
  quil.properties["34173a17"].data = from_text("\xFF");
  EXPECT_EQ(sign_once("x").result, TEE_ERROR_BAD_STATE);
  EXPECT_THAT(errors(), ElementsAre("set cpu id error -1\n", "produce json string error"));
}

TEST_F(SoterStatementTest, EveryFaultLeavesNothingBehind) {
  ASSERT_EQ(soter_ensure_ready(), TEE_SUCCESS);
  const bytes signer = blob(key_data(1024));
  const param_list key = param_list{}
                             .add(KM_TAG_SOTER_COUNTED)
                             .add(KM_TAG_SOTER_SIGNED_BY_KEY)
                             .add_blob(KM_TAG_SOTER_SIGNING_KEY_BLOB, signer);
  signing op;
  begin(op);
  const auto before = ta().holdings();
  const auto sweep = [&](auto&& order, auto&& act) {
    for (unsigned n = 1; n < 500; ++n) {
      const TEE_Result result = act([&] { faults().clear(), order(n); });
      const bool triggered = faults().triggered();
      faults().clear();
      expect_same(ta().holdings(), before);
      if (!triggered) {
        EXPECT_EQ(result, TEE_SUCCESS);
        return n;
      }
    }
    return 0U;
  };
  const auto fail_memory = [&](unsigned n) { faults().fail_allocation(n); };
  const auto fail_call = [&](unsigned n) { faults().fail_any_call(n, 0xF0001234); };
  const auto exports = [&](auto&& arm) {
    const parameter_set in = in_ta(key);
    const bytes data = key_data(1024);
    bytes output(4096, 0xEE);
    std::uint32_t size = 4096;
    arm();
    const TEE_Result result = soter_enhance_export_key(in, data, output.data(), &size);
    EXPECT_EQ(output == bytes(4096, 0xEE), result != TEE_SUCCESS);
    return result;
  };
  const auto signs = [&](auto&& arm) {
    const parameter_set set;
    const bytes message = text_with_nul("message");
    const soter_signer signer_of_op = {set, op.operation.get(), op.digest_operation.get(), op.buffer, nullptr};
    secret_bytes output;
    arm();
    const TEE_Result result = soter_enhance_sign_finish(signer_of_op, {}, {message.data(), 7}, output);
    EXPECT_EQ(static_cast<bool>(output), result == TEE_SUCCESS);
    return result;
  };
  EXPECT_GT(sweep(fail_memory, exports), 10U);
  EXPECT_GT(sweep(fail_call, exports), 10U);
  EXPECT_GT(sweep(fail_memory, signs), 20U);
  EXPECT_GT(sweep(fail_call, signs), 4U);
}

TEST_F(SoterStatementTest, ResolvingTellsNoSizeWithoutAKey) {
  std::uint32_t size = 99;
  EXPECT_EQ(resolve_key_from_data(bytes(36), &size), TEE_ObjectHandle{TEE_HANDLE_NULL});
  EXPECT_EQ(size, 0U);
  size = 99;
  EXPECT_EQ(resolve_key_from_data(pattern(30), &size), TEE_ObjectHandle{TEE_HANDLE_NULL});
  EXPECT_EQ(size, 0U);
  const object_handle key{retrieve_key_from_pobj(blob(key_data(1024)), &size)};
  EXPECT_TRUE(key);
  EXPECT_EQ(size, 1024U);
}

}  // namespace
}  // namespace testing_support
