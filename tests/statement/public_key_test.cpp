// Keys that are told, and the ones among them that are accepted.
#include "client/lib/rsa_public_key.h"

#include <openssl/ec.h>

#include "client/lib/wire.h"
#include "tests/statement/hand_made.h"

namespace {

using namespace hand_made;
using namespace keymaster::client;

/// What from_statement says against a text; empty: nothing.
std::string refusal(const std::string& text) {
  try {
    (void)rsa_public_key::from_statement(text);
  } catch (const format_error& refused) {
    return refused.what();
  }
  return {};
}

std::string base64_of(EVP_PKEY* key) {
  const std::string pem = one_line_pem(key);
  return pem.substr(27, pem.size() - 27 - 25);
}

TEST(PublicKey, TheOneLinePemOfTheTaIsRead) {
  const auto key = rsa_public_key::from_statement(one_line_pem(app_key()));
  EXPECT_EQ(key.bits(), 2048U);
  EXPECT_EQ(key.signature_size(), 256U);
  EXPECT_EQ(key.pem(), public_pem(app_key()));
  EXPECT_NE(key, rsa_public_key::from_pem(public_pem(foreign_key())));
}

TEST(PublicKey, APemFileIsReadWithItsLinesOfAnyLength) {
  const auto key = rsa_public_key::from_pem(public_pem(app_key()));
  EXPECT_EQ(rsa_public_key::from_pem(one_line_pem(app_key())), key);
  EXPECT_EQ(rsa_public_key::from_pem(one_line_pem(app_key()) + '\0'), key);
  for (const char* const text : {"", "no key", "-----BEGIN PUBLIC KEY-----\n-----END PUBLIC KEY-----\n"}) {
    EXPECT_THROW((void)rsa_public_key::from_pem(text), format_error);
  }
}

TEST(PublicKey, APemFileThatAsksForAPassphraseIsRefusedAndNobodyIsAsked) {
  std::string asking = public_pem(app_key());
  asking.insert(asking.find('\n') + 1,
                "Proc-Type: 4,ENCRYPTED\nDEK-Info: AES-128-CBC,00112233445566778899AABBCCDDEEFF\n\n");
  EXPECT_THROW((void)rsa_public_key::from_pem(asking), format_error);
}

TEST(PublicKey, InAStatementNothingMayDifferFromTheFormOfTheTa) {
  const std::string good = one_line_pem(app_key());
  const std::string base64 = base64_of(app_key());
  ASSERT_EQ(refusal(good), "");
  ASSERT_EQ(refusal(pem_around(base64)), "");
  for (const std::string& text : {
           std::string(),
           good + "\n",
           good + '\0',
           " " + good,
           "\n" + good,
           good.substr(1),
           good.substr(0, good.size() - 1),
           public_pem(app_key()),
           pem_around(""),
           pem_around(" " + base64),
           pem_around(base64 + " "),
           pem_around(base64.substr(0, 64) + "\n" + base64.substr(64)),
           pem_around(base64 + "AAAA"),
           pem_around(base64.substr(4)),
           pem_around(base64.substr(0, base64.size() - 4)),
           pem_around(base64 + "="),
           pem_around("----" + base64),
           pem_around(base64 + base64),
           std::string("-----BEGIN PUBLIC KEY-----\n"),
           std::string("-----BEGIN PUBLIC KEY-----\n-----END PUBLIC KEY-----"),
       }) {
    EXPECT_NE(refusal(text), "") << text;
  }
}

TEST(PublicKey, EveryPrefixOfTheFormIsRefused) {
  const std::string good = one_line_pem(app_key());
  for (std::size_t length = 0; length < good.size(); ++length) {
    EXPECT_NE(refusal(good.substr(0, length)), "") << length;
  }
}

TEST(PublicKey, KeysBelow2048BitsAreTooSmall) {
  for (const unsigned bits : {1024U, 2040U, 2047U}) {
    EXPECT_THAT(refusal(one_line_pem(new_rsa_key(bits).get())), testing::HasSubstr("too few")) << bits;
  }
  EXPECT_EQ(refusal(one_line_pem(new_rsa_key(2056).get())), "");
  EXPECT_THROW((void)rsa_public_key::from_pem(public_pem(new_rsa_key(1024).get())), format_error);
}

TEST(PublicKey, TheExponentIsOddAndAboveTwo) {
  for (const unsigned exponent : {1U, 2U, 4U, 65536U}) {
    EXPECT_THAT(refusal(one_line_pem(rsa_key_with(app_key(), exponent).get())), testing::HasSubstr("exponent"))
        << exponent;
  }
  for (const unsigned exponent : {3U, 17U}) {
    EXPECT_EQ(refusal(one_line_pem(rsa_key_with(app_key(), exponent).get())), "") << exponent;
  }
}

TEST(PublicKey, KeysOfOtherKindsAreRefused) {
  const key_ptr ec(EVP_EC_gen("P-256"), EVP_PKEY_free);
  const key_ptr pss = new_rsa_pss_key();
  for (const key_ptr* const key : {&ec, &pss}) {
    EXPECT_THAT(refusal(one_line_pem(key->get())), testing::HasSubstr("no RSA key"));
  }
}

TEST(PublicKey, ASmallKeyInAStatementIsRefusedForThatKey) {
  const auto attk = rsa_public_key::from_pem(public_pem(attestation_key()));
  for (const std::string& key :
       {one_line_member(new_rsa_key(1024).get()), one_line_member(rsa_key_with(app_key(), 1).get()), std::string(),
        std::string("-----BEGIN PUBLIC KEY-----")}) {
    const bytes statement = export_statement("{\"pub_key\":\"" + key + "\"}", attestation_key());
    EXPECT_EQ(check_that_refuses([&] { (void)verify_export_statement(statement, {.signer = attk}); }), "pub_key");
  }
}

}  // namespace
