// Which of several failures a statement tells, what it has cost by then, and what is wiped of it.
#include <openssl/sha.h>

#include <algorithm>

#include "soter/soter_init.h"
#include "tests/soter/statement_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

class StatementOrderTest : public SoterStatementTest {
 protected:
  /// Exports a key that has the counter told.
  exported counted(const param_list& more, const bytes& data = key_data(1024)) {
    return export_key(param_list(more).add(KM_TAG_SOTER_COUNTED), data);
  }
  static param_list signed_by(const bytes& signer) {
    return param_list{}.add(KM_TAG_SOTER_SIGNED_BY_KEY).add_blob(KM_TAG_SOTER_SIGNING_KEY_BLOB, signer);
  }
  std::string signed_text() {
    const signed_statement got = sign_once("x");
    EXPECT_EQ(got.result, TEE_SUCCESS);
    if (got.result != TEE_SUCCESS) return {};
    const bytes text = take_apart(got.output).text;
    return {text.begin(), text.end() - 1};
  }
  const param_list by_attk = param_list{}.add(KM_TAG_SOTER_SIGNED_BY_ATTK);
};

TEST_F(StatementOrderTest, AnExportThatFailsBehindTheCounterHasMovedIt) {
  expect_export_fails(counted(by_attk, bytes(36)), TEE_ERROR_BAD_FORMAT, {"resolve key from data stream error\n"});
  EXPECT_EQ(stored_counter(), u64(1));
  quil.key.result = TEE_ERROR_BUSY;
  expect_export_fails(counted(by_attk), TEE_ERROR_BUSY, {"Retrieve key fails, 0xffff000d\n", "soter is not ready\n"});
  EXPECT_EQ(stored_counter(), u64(2));
  expect_export_fails(counted(signed_by(blob(pattern(20)))), TEE_ERROR_BAD_STATE,
                      {"Too short input", "Sign key is null\n"});
  EXPECT_EQ(stored_counter(), u64(3));
}

TEST_F(StatementOrderTest, AnAttestationKeyThatThePlatformRefusesIsNull) {
  quil.key.data = join({tlv(17, {}), tlv(18, {}), tlv(19, {})});
  const exported got = counted(by_attk);
  EXPECT_EQ(got.result, TEE_ERROR_BAD_STATE);
  ASSERT_THAT(errors(), testing::SizeIs(2));
  EXPECT_THAT(errors().front(), testing::StartsWith("TEE_PopulateTransientObject failed: "));
  EXPECT_EQ(errors().back(), "Sign key is null\n");
  EXPECT_EQ(stored_counter(), u64(1));
}

TEST_F(StatementOrderTest, AKeyWithoutOneAlgorithmSignsNothing) {
  const param_list none = param_list{}.add(KM_TAG_KEY_SIZE, 1024);
  const param_list twice = param_list{}.add(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA).add(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA);
  for (const param_list& characteristics : {none, twice}) {
    std::uint32_t size = 99;
    const bytes signer = blob_of(key_data(1024), characteristics);
    EXPECT_EQ(retrieve_key_from_pobj(signer, &size), TEE_ObjectHandle{TEE_HANDLE_NULL});
    EXPECT_EQ(size, 0U);
    expect_export_fails(export_key(signed_by(signer)), TEE_ERROR_BAD_STATE, {"Sign key is null\n"});
  }
}

TEST_F(StatementOrderTest, TheResourcesComeBeforeTheMessage) {
  quil.key.result = TEE_ERROR_BUSY;
  EXPECT_EQ(sign_once("\xFF").result, TEE_ERROR_BUSY);
  EXPECT_THAT(errors(),
              ElementsAre("Retrieve key fails, 0xffff000d\n", "soter is not ready\n", "produce json string error"));
}

TEST_F(StatementOrderTest, AUidThatIsThereTwiceIsAbsent) {
  const param_list twice = param_list{}.add(KM_TAG_SOTER_UID, 5).add(KM_TAG_SOTER_UID, 5);
  const exported got = export_key(param_list(twice).add(KM_TAG_SOTER_SIGNED_BY_ATTK));
  ASSERT_EQ(got.result, TEE_SUCCESS);
  const bytes exported_text = take_apart(got.output).text;
  EXPECT_EQ(std::string(exported_text.begin(), exported_text.end()), "{" + pem_member(1024) + "}");
  const signed_statement made = sign_once("x", twice);
  ASSERT_EQ(made.result, TEE_SUCCESS);
  const bytes text = take_apart(made.output).text;
  EXPECT_THAT(std::string(text.begin(), text.end()), HasSubstr(R"("counter":1,"uid":4294967295,"tee_n")"));
}

TEST_F(StatementOrderTest, ASensorNameEndsAtItsFirstNulOrWithItsEntry) {
  const bytes rest = join({tlv(0x1836, text_with_nul("2.0")), tlv(0x1837, bytes(16))});
  for (const auto& [name, told] : {std::pair{from_text("bare"), R"("fp_n":"bare","fp_v":"2.0")"},
                                   std::pair{from_hex("6162006364"), R"("fp_n":"ab","fp_v":"2.0")"},
                                   std::pair{bytes{}, R"("fp_n":"","fp_v":"2.0")"}}) {
    quil.properties[soter_property].data = join({tlv(0x1835, name), rest});
    EXPECT_THAT(signed_text(), HasSubstr(told));
    soter_release_resources();
  }
}

TEST_F(StatementOrderTest, TheSignersKeyAndTheScratchOfASignatureAreWiped) {
  const param_list key = signed_by(blob(key_data(1024)));
  std::vector<bytes> freed;
  const auto held = [&](std::span<const std::uint8_t> secret) {
    return std::any_of(freed.begin(), freed.end(), [&](const bytes& block) { return contains(block, secret); });
  };
  ta().on_free([&](std::span<const std::uint8_t> block) { freed.emplace_back(block.begin(), block.end()); });
  const exported got = export_key(key, key_data(2048));
  ta().on_free({});
  ASSERT_EQ(got.result, TEE_SUCCESS);
  const statement made = take_apart(got.output);
  EXPECT_TRUE(held(from_text("-----BEGIN PUBLIC KEY-----"))) << "what is public is freed as it is";
  for (const rsa_component part : {rsa_d, rsa_p, rsa_q, rsa_dp, rsa_dq, rsa_qinv}) {
    EXPECT_FALSE(held(std::span(rsa_test_key::of_bits(1024).component(part)).subspan(8, 16))) << part;
  }
  bytes digest(32);
  (void)SHA256(made.text.data(), made.text.size(), digest.data());
  EXPECT_FALSE(held(digest));
  EXPECT_FALSE(held(std::span(made.signature).first(16)));
}

}  // namespace
}  // namespace testing_support
