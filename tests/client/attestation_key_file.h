// One RSA-2048 key for all tests of the attestation key, in the forms that its tests need: all of libcrypto's making.
#ifndef KEYMASTER_TESTS_CLIENT_ATTESTATION_KEY_FILE_H_
#define KEYMASTER_TESTS_CLIENT_ATTESTATION_KEY_FILE_H_

#include <openssl/asn1.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/x509.h>

#include <stdexcept>
#include <string>
#include <vector>

#include "client/lib/bytes.h"
#include "client/lib/openssl_handles.h"

namespace attestation_key_file {

using keymaster::client::bytes;

inline bytes taken(unsigned char* raw, int length) {
  if (length <= 0) throw std::runtime_error("libcrypto can't encode the key");
  bytes out(raw, raw + length);
  OPENSSL_free(raw);
  return out;
}

inline const EVP_PKEY* key() {
  static const keymaster::client::pkey_ptr one(EVP_RSA_gen(2048));
  return one.get();
}

/// The SubjectPublicKeyInfo.
inline bytes public_der() {
  unsigned char* raw = nullptr;
  const int length = i2d_PUBKEY(key(), &raw);
  return taken(raw, length);
}

inline bytes private_pem(const EVP_PKEY* of = key()) {
  const keymaster::client::bio_ptr out(BIO_new(BIO_s_mem()));
  if (PEM_write_bio_PKCS8PrivateKey(out.get(), of, nullptr, nullptr, 0, nullptr, nullptr) != 1) {
    throw std::runtime_error("libcrypto can't write the key");
  }
  const char* text = nullptr;
  const long length = BIO_get_mem_data(out.get(), &text);
  return {text, text + length};
}

/// The text that the Keymaster TA writes: all base64 in one line, and no line end at its end.
inline std::string one_line_pem() {
  const bytes der = public_der();
  std::vector<unsigned char> base64((der.size() + 2) / 3 * 4 + 1);
  const int length = EVP_EncodeBlock(base64.data(), der.data(), static_cast<int>(der.size()));
  return "-----BEGIN PUBLIC KEY-----\n" + std::string(base64.begin(), base64.begin() + length) +
         "\n-----END PUBLIC KEY-----";
}

/// The numbers of the private key (version, n, e, d, p, q, dp, dq, 1/q) as an ASN.1 reader finds them in PKCS#1.
inline std::vector<bytes> numbers() {
  unsigned char* raw = nullptr;
  const int length = i2d_PrivateKey(key(), &raw);
  const bytes der = taken(raw, length);
  const unsigned char* at = der.data();
  STACK_OF(ASN1_TYPE)* const sequence = d2i_ASN1_SEQUENCE_ANY(nullptr, &at, static_cast<long>(der.size()));
  std::vector<bytes> out;
  for (int i = 0; i < sk_ASN1_TYPE_num(sequence); ++i) {
    const ASN1_INTEGER* const number = sk_ASN1_TYPE_value(sequence, i)->value.integer;
    out.emplace_back(number->data, number->data + number->length);
  }
  sk_ASN1_TYPE_pop_free(sequence, ASN1_TYPE_free);
  return out;
}

}  // namespace attestation_key_file

#endif  // KEYMASTER_TESTS_CLIENT_ATTESTATION_KEY_FILE_H_
