// From the factory to the relying party, through every TA of the device; the openssl command judges each signature over
// exactly the bytes that were sent.
#include "tests/attestation/attested_device.h"

using namespace keymaster;
using ::testing::ElementsAre;

namespace testing_support {
namespace {

const param_list& by_attk() {
  static const param_list tags =
      param_list{}.add(KM_TAG_SOTER_SIGNED_BY_ATTK).add(KM_TAG_SOTER_COUNTED).add(KM_TAG_SOTER_UID, 10001);
  return tags;
}

using AttestationChainTest = AttestationTest;

TEST_F(AttestationChainTest, TheAttestationKeyIsPublishedAsOpensslHasIt) {
  bytes pem(445);
  EXPECT_EQ(soter_command(KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY, &pem), SOTER_STATUS_OK);
  ASSERT_EQ(pem.size(), 445U);
  EXPECT_EQ(pem.back(), 0);
  pem.pop_back();
  write_file(tee.folder() / "attk.pem", pem);
  const openssl_result der = openssl(tee.folder(), {"pkey", "-pubin", "-in", "attk.pem", "-outform", "DER"});
  EXPECT_EQ(from_text(der.output), rsa_test_key::of_bits(2048).spki());
}

TEST_F(AttestationChainTest, TheDeviceVouchesForAKeyAndThatOneForAnotherAndThatOneForAMessage) {
  bytes pem(445);
  ASSERT_EQ(soter_command(KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY, &pem), SOTER_STATUS_OK);
  pem.pop_back();

  const bytes app_blob = client().must_generate(rsa_key(2048).add(KM_TAG_SOTER_KEY).add(by_attk()));
  const statement app = exported(app_blob, attk_size);
  EXPECT_THAT(app.members(), ElementsAre("counter", "uid", "pub_key"));
  EXPECT_EQ(app.json()["counter"], 1);
  EXPECT_EQ(app.json()["uid"], 10001);
  EXPECT_TRUE(openssl_verifies({pem.begin(), pem.end()}, app.text, app.signature));

  const bytes auth_blob =
      soter_key(1024, param_list{}.add(KM_TAG_SOTER_SIGNED_BY_KEY).add_blob(KM_TAG_SOTER_SIGNING_KEY_BLOB, app_blob));
  const statement auth = exported(auth_blob, 256);
  EXPECT_THAT(auth.members(), ElementsAre("pub_key"));
  EXPECT_TRUE(openssl_verifies(app.json()["pub_key"], auth.text, auth.signature));

  const std::uint32_t finger = enrol_finger();
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, auth_blob, pkcs1);
  EXPECT_TRUE(client().update(handle, from_text("pay 10/")).ok());
  EXPECT_TRUE(client().update(handle, from_text("to Mary")).ok());
  EXPECT_EQ(touch(finger).noticed, TEE_SUCCESS);
  const statement paid = take_apart(client().finish(handle).data, 128);
  EXPECT_THAT(paid.members(), ElementsAre("raw", "fid", "counter", "uid", "tee_n", "tee_v", "fp_n", "fp_v", "cpu_id"));
  EXPECT_EQ(paid.json()["raw"], "pay 10/to Mary");
  EXPECT_EQ(paid.json()["fid"], finger);
  EXPECT_EQ(paid.json()["counter"], 2);
  EXPECT_EQ(paid.json()["uid"], 4294967295);
  EXPECT_EQ(paid.json()["fp_n"], "sensor/1");
  EXPECT_EQ(paid.json()["fp_v"], "v2");
  EXPECT_EQ(paid.json()["cpu_id"], "CPU-0001");
  EXPECT_TRUE(openssl_verifies(auth.json()["pub_key"], paid.text, paid.signature));
}

TEST_F(AttestationChainTest, AnExportStatementIsSignedWithoutANulAndASignStatementWithIt) {
  const bytes blob = soter_key(1024, by_attk());
  bytes pem(445);
  ASSERT_EQ(soter_command(KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY, &pem), SOTER_STATUS_OK);
  const std::string attk(pem.begin(), pem.end() - 1);

  statement of_key = exported(blob, attk_size);
  EXPECT_EQ(of_key.text.back(), '}');
  EXPECT_TRUE(openssl_verifies(attk, of_key.text, of_key.signature));
  EXPECT_FALSE(openssl_verifies(attk, join({of_key.text, {0}}), of_key.signature));

  const std::string key = of_key.json()["pub_key"];
  statement of_message = signed_statement(blob, pkcs1, "hello", 128);
  EXPECT_EQ(of_message.text.back(), 0);
  EXPECT_EQ(std::count(of_message.text.begin(), of_message.text.end(), 0), 1);
  EXPECT_TRUE(openssl_verifies(key, of_message.text, of_message.signature));
  of_message.text.pop_back();
  EXPECT_FALSE(openssl_verifies(key, of_message.text, of_message.signature));
}

TEST_F(AttestationChainTest, AStatementIsSignedWithThePaddingThatWasBegun) {
  const bytes blob = soter_key(2048, by_attk());
  const std::string key = exported(blob, attk_size).json()["pub_key"];
  const param_list pss = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS);
  const statement made = signed_statement(blob, pss, "padded otherwise", 256);
  const std::vector<std::string> options{"-sigopt", "rsa_padding_mode:pss", "-sigopt", "rsa_pss_saltlen:digest"};
  EXPECT_TRUE(openssl_verifies(key, made.text, made.signature, options));
  EXPECT_FALSE(openssl_verifies(key, made.text, made.signature));
}

TEST_F(AttestationChainTest, TheTextIsWrittenByteByByteAsItAlwaysWas) {
  const bytes blob = soter_key(1024, param_list{}.add(KM_TAG_SOTER_UID, 0));
  ASSERT_EQ(soter_command(KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR), SOTER_STATUS_OK);
  const statement made = signed_statement(blob, pkcs1, "a/b\"c\\\x01\t\u00e9", 128);
  // The control character and the letter beyond ASCII stand as they are.
  std::string expected = R"({"raw":"a\/b\"c\\)"
                         "\x01"
                         R"(\t)"
                         "\u00e9"
                         R"(","counter":1,"uid":0,"tee_n":")";
  const std::string text(made.text.begin(), made.text.end());
  EXPECT_EQ(text.substr(0, expected.size()), expected);
  expected = R"(","fp_n":"sensor\/1","fp_v":"v2","cpu_id":"CPU-0001"})" + std::string(1, '\0');
  EXPECT_EQ(text.substr(text.size() - expected.size()), expected);
}

TEST_F(AttestationChainTest, TheDeviceIdIsTold) {
  bytes id(64);
  EXPECT_EQ(soter_command(KM_COMMAND_SOTER_GET_DEVICE_ID, &id), SOTER_STATUS_OK);
  EXPECT_EQ(id, pattern(16));
}

}  // namespace
}  // namespace testing_support
