// RSA public keys as statements carry them and are verified with.
#ifndef KEYMASTER_CLIENT_LIB_RSA_PUBLIC_KEY_H_
#define KEYMASTER_CLIENT_LIB_RSA_PUBLIC_KEY_H_

#include <cstdint>
#include <string>
#include <string_view>

#include "client/lib/bytes.h"
#include "client/lib/openssl_handles.h"
#include "src/params/keymaster_defs.h"

namespace keymaster::client {

/// How a signature was made.
struct signature_scheme {
  keymaster_padding_t padding = KM_PAD_RSA_PKCS1_1_5_SIGN;  ///< or KM_PAD_RSA_PSS, with a salt of any length
  keymaster_digest_t digest = KM_DIGEST_SHA_2_256;          ///< any but KM_DIGEST_NONE
};

/// An RSA key of at least 2048 bits whose public exponent is odd and above 2.
class rsa_public_key {
 public:
  /// from_pem reads a PEM file of a SubjectPublicKeyInfo, with lines of any length. from_statement reads the one form
  /// that the TA writes: "-----BEGIN PUBLIC KEY-----\n", the base64 of the canonical DER on one line,
  /// "\n-----END PUBLIC KEY-----", and nothing else. Both throw format_error that says what is wrong with the key.
  [[nodiscard]] static rsa_public_key from_pem(std::string_view text);
  [[nodiscard]] static rsa_public_key from_statement(std::string_view text);

  /// pem gives the key as a PEM file with lines of 64 characters, der as a SubjectPublicKeyInfo.
  [[nodiscard]] std::string pem() const;
  [[nodiscard]] bytes der() const;

  [[nodiscard]] std::uint32_t bits() const;
  /// The length of the modulus in bytes, which is the length of every signature.
  [[nodiscard]] std::size_t signature_size() const;

  /// verifies tells whether `signature` is one of this key over `message`. Throws std::invalid_argument for a scheme
  /// that signs no digest.
  [[nodiscard]] bool verifies(byte_view message, byte_view signature, const signature_scheme& scheme) const;

  /// Whether both are the same key.
  friend bool operator==(const rsa_public_key& one, const rsa_public_key& other) {
    return EVP_PKEY_eq(one.key_.get(), other.key_.get()) == 1;
  }

 private:
  explicit rsa_public_key(pkey_ptr key);

  pkey_ptr key_;
};

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_RSA_PUBLIC_KEY_H_
