// Statements made by hand: texts written out, signed by libcrypto.
#ifndef KEYMASTER_TESTS_STATEMENT_HAND_MADE_H_
#define KEYMASTER_TESTS_STATEMENT_HAND_MADE_H_

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <openssl/evp.h>

#include <memory>
#include <string>
#include <string_view>

#include "client/lib/statement.h"

namespace hand_made {

using keymaster::client::byte_view;
using keymaster::client::bytes;

using key_ptr = std::unique_ptr<EVP_PKEY, void (*)(EVP_PKEY*)>;

/// The attestation key, a key of an app, and one of somebody else, made once per run: RSA with 2048 bits.
EVP_PKEY* attestation_key();
EVP_PKEY* app_key();
EVP_PKEY* foreign_key();

/// new_rsa_key makes a key pair, new_rsa_pss_key one that is for PSS alone; rsa_key_with puts a public key together
/// from a modulus and an exponent.
key_ptr new_rsa_key(unsigned bits);
key_ptr new_rsa_pss_key();
key_ptr rsa_key_with(EVP_PKEY* modulus_of, unsigned exponent);

/// public_pem writes the public key as openssl does, one_line_pem as the TA does, one_line_member as that stands in a
/// statement, the slashes and line ends escaped.
std::string public_pem(EVP_PKEY* key);
std::string one_line_pem(EVP_PKEY* key);
std::string one_line_member(EVP_PKEY* key);
std::string pem_around(const std::string& base64);

/// A signature over the text's bytes. The salt of PSS has `salt` bytes; its mask is made with `mask`, or the digest.
bytes sign_pkcs1(EVP_PKEY* key, std::string_view text, const EVP_MD* digest = EVP_sha256());
bytes sign_pss(EVP_PKEY* key, std::string_view text, int salt, const EVP_MD* digest = EVP_sha256(),
               const EVP_MD* mask = nullptr);

/// pack joins the length of the text in 4 bytes, the lowest first, the text and the signature.
bytes pack(std::string_view text, const bytes& signature);

/// An export statement with this text, signed by `key`, and a sign statement, whose text gets its NUL here.
bytes export_statement(std::string_view text, EVP_PKEY* key);
bytes sign_statement(std::string_view text, EVP_PKEY* key);

/// check_that_refuses gives the word of the check that `verify` fails at; "accepted" when it doesn't.
template <class Verify>
std::string check_that_refuses(const Verify& verify) {
  try {
    verify();
  } catch (const keymaster::client::statement_refused& refused) {
    EXPECT_STRNE(refused.what(), "");
    return std::string(check_name(refused.check()));
  }
  return "accepted";
}

}  // namespace hand_made

#endif  // KEYMASTER_TESTS_STATEMENT_HAND_MADE_H_
