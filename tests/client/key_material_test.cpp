// The converted keys are compared with what libcrypto's ASN.1 reader finds in the standard encodings.
#include "client/lib/key_material.h"

#include <gtest/gtest.h>
#include <openssl/asn1.h>
#include <openssl/core_names.h>
#include <openssl/pem.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <algorithm>

#include "client/lib/openssl_handles.h"

namespace {

using namespace keymaster;
using namespace keymaster::client;

pkey_ptr rsa_key(unsigned bits = 1024) {
  return pkey_ptr(EVP_RSA_gen(bits));
}
pkey_ptr ec_key(const char* curve) {
  return pkey_ptr(EVP_EC_gen(curve));
}

bytes der_of(int (*encode)(const EVP_PKEY*, unsigned char**), const EVP_PKEY* key) {
  unsigned char* raw = nullptr;
  const int length = encode(key, &raw);
  EXPECT_GT(length, 0);
  bytes out(raw, raw + length);
  OPENSSL_free(raw);
  return out;
}

bytes pkcs1_der(const pkey_ptr& key) {
  return der_of([](const EVP_PKEY* k, unsigned char** out) { return i2d_PrivateKey(k, out); }, key.get());
}

bytes pkcs8_der(const pkey_ptr& key) {
  return der_of(
      [](const EVP_PKEY* k, unsigned char** out) {
        PKCS8_PRIV_KEY_INFO* const info = EVP_PKEY2PKCS8(k);
        const int length = i2d_PKCS8_PRIV_KEY_INFO(info, out);
        PKCS8_PRIV_KEY_INFO_free(info);
        return length;
      },
      key.get());
}

template <class Write>
bytes pem_of(Write write) {
  const bio_ptr out(BIO_new(BIO_s_mem()));
  EXPECT_EQ(write(out.get()), 1);
  const char* text = nullptr;
  const long length = BIO_get_mem_data(out.get(), &text);
  return {text, text + length};
}

bytes pkcs8_pem(const pkey_ptr& key) {
  return pem_of(
      [&](BIO* out) { return PEM_write_bio_PKCS8PrivateKey(out, key.get(), nullptr, nullptr, 0, nullptr, nullptr); });
}

bytes traditional_pem(const pkey_ptr& key) {
  return pem_of([&](BIO* out) {
    return PEM_write_bio_PrivateKey_traditional(out, key.get(), nullptr, nullptr, 0, nullptr, nullptr);
  });
}

bytes encrypted_pem(const pkey_ptr& key, std::string passphrase) {
  return pem_of([&](BIO* out) {
    return PEM_write_bio_PKCS8PrivateKey(out, key.get(), EVP_aes_256_cbc(), passphrase.data(),
                                         static_cast<int>(passphrase.size()), nullptr, nullptr);
  });
}

/// The eight numbers behind the version of a PKCS#1 RSAPrivateKey, each behind its length.
bytes expected_rsa_material(const pkey_ptr& key) {
  const bytes der = pkcs1_der(key);
  const unsigned char* at = der.data();
  ASN1_SEQUENCE_ANY* const sequence = d2i_ASN1_SEQUENCE_ANY(nullptr, &at, static_cast<long>(der.size()));
  EXPECT_EQ(sk_ASN1_TYPE_num(sequence), 9);
  bytes out;
  for (int i = 1; i < sk_ASN1_TYPE_num(sequence); ++i) {
    const bignum_ptr number(ASN1_INTEGER_to_BN(sk_ASN1_TYPE_value(sequence, i)->value.integer, nullptr));
    bytes magnitude(static_cast<std::size_t>(BN_num_bytes(number.get())));
    BN_bn2bin(number.get(), magnitude.data());
    append_block(out, magnitude);
  }
  sk_ASN1_TYPE_pop_free(sequence, ASN1_TYPE_free);
  return out;
}

byte_view without_leading_zeros(byte_view number) {
  return number.subspan(
      static_cast<std::size_t>(std::ranges::find_if(number, [](auto b) { return b != 0; }) - number.begin()));
}

bytes plain(const secret_bytes& secret) {
  return {secret.begin(), secret.end()};
}

TEST(KeyMaterial, AnRsaKeyBecomesItsEightComponentsFromEveryEncoding) {
  const pkey_ptr key = rsa_key();
  const bytes expected = expected_rsa_material(key);
  for (const bytes& file : {pkcs1_der(key), pkcs8_der(key), pkcs8_pem(key), traditional_pem(key)}) {
    const private_key_material read = read_private_key(file);
    EXPECT_EQ(read.algorithm, KM_ALGORITHM_RSA);
    EXPECT_EQ(read.key_size, 1024U);
    EXPECT_EQ(plain(read.material), expected);
  }
}

TEST(KeyMaterial, AnEncryptedKeyNeedsItsPassphrase) {
  const pkey_ptr key = rsa_key();
  const bytes file = encrypted_pem(key, "correct horse");
  EXPECT_EQ(plain(read_private_key(file, "correct horse").material), expected_rsa_material(key));
  EXPECT_THROW((void)read_private_key(file, "wrong horse"), format_error);
  try {
    (void)read_private_key(file);
    FAIL() << "an encrypted key opened without its passphrase";
  } catch (const format_error& refused) {
    EXPECT_STREQ(refused.what(), "the key is encrypted and needs its passphrase");
  }
}

TEST(KeyMaterial, AnEcKeyBecomesSizeAndThreeNumbers) {
  struct row {
    const char* curve;
    std::uint32_t bits;
  };
  for (const auto& [curve, bits] :
       {row{"P-192", 192}, row{"P-224", 224}, row{"P-256", 256}, row{"P-384", 384}, row{"P-521", 521}}) {
    const pkey_ptr key = ec_key(curve);
    bytes point(256);
    std::size_t length = 0;
    ASSERT_EQ(EVP_PKEY_get_octet_string_param(key.get(), OSSL_PKEY_PARAM_PUB_KEY, point.data(), point.size(), &length),
              1);
    const std::size_t width = (length - 1) / 2;
    // SEC 1: a sequence of a version and the private value as an octet string of the field's length.
    const bytes sec1 = pkcs1_der(key);
    const auto* at = sec1.data();
    ASN1_SEQUENCE_ANY* const sequence = d2i_ASN1_SEQUENCE_ANY(nullptr, &at, static_cast<long>(sec1.size()));
    const ASN1_OCTET_STRING* const secret = sk_ASN1_TYPE_value(sequence, 1)->value.octet_string;
    bytes expected;
    append_u32(expected, bits);
    append_block(expected, without_leading_zeros(byte_view(point).subspan(1, width)));
    append_block(expected, without_leading_zeros(byte_view(point).subspan(1 + width, width)));
    append_block(expected, without_leading_zeros({secret->data, static_cast<std::size_t>(secret->length)}));
    sk_ASN1_TYPE_pop_free(sequence, ASN1_TYPE_free);

    const private_key_material read = read_private_key(pkcs8_pem(key));
    EXPECT_EQ(read.algorithm, KM_ALGORITHM_EC);
    EXPECT_EQ(read.key_size, bits);
    EXPECT_EQ(plain(read.material), expected) << curve;
  }
}

TEST(KeyMaterial, WhatIsNotAUsablePrivateKeyIsRefused) {
  const pkey_ptr rsa = rsa_key();
  const bytes public_der = der_of([](const EVP_PKEY* k, unsigned char** out) { return i2d_PUBKEY(k, out); }, rsa.get());
  const pkey_ptr ed(EVP_PKEY_Q_keygen(nullptr, nullptr, "ED25519"));
  const pkey_ptr koblitz = ec_key("secp256k1");
  bytes half = pkcs8_der(rsa);
  half.resize(half.size() / 2);
  EXPECT_THROW((void)read_private_key({}), format_error);
  EXPECT_THROW((void)read_private_key(as_bytes("hello")), format_error);
  EXPECT_THROW((void)read_private_key(public_der), format_error);
  EXPECT_THROW((void)read_private_key(half), format_error);
  EXPECT_THROW((void)read_private_key(pkcs8_pem(ed)), format_error);
  EXPECT_THROW((void)read_private_key(pkcs8_pem(koblitz)), format_error);
}

TEST(KeyMaterial, AKeyWhosePartsDontBelongTogetherIsRefused) {
  // A byte in the middle of the modulus: n is no longer p q.
  const pkey_ptr key = rsa_key();
  bytes file = pkcs1_der(key);
  file[64] ^= 0x10U;
  EXPECT_THROW((void)read_private_key(file), format_error);
}

TEST(KeyMaterial, AnExportedRsaKeyBecomesPem) {
  const pkey_ptr key = rsa_key();
  const bytes spki = der_of([](const EVP_PKEY* k, unsigned char** out) { return i2d_PUBKEY(k, out); }, key.get());
  const bytes expected = pem_of([&](BIO* out) { return PEM_write_bio_PUBKEY(out, key.get()); });
  EXPECT_EQ(public_key_pem(KM_ALGORITHM_RSA, spki), as_text(expected));
  EXPECT_EQ(public_key_der(KM_ALGORITHM_RSA, spki), spki);
}

TEST(KeyMaterial, AnExportedEcKeyBecomesASubjectPublicKeyInfo) {
  for (const char* const curve : {"P-256", "P-521"}) {
    const pkey_ptr key = ec_key(curve);
    const bytes expected = der_of([](const EVP_PKEY* k, unsigned char** out) { return i2d_PUBKEY(k, out); }, key.get());
    const private_key_material imported = read_private_key(pkcs8_der(key));
    byte_reader in{imported.material};
    bytes exported;
    append_u32(exported, in.read_u32());
    append_block(exported, in.read_block());
    append_block(exported, in.read_block());
    EXPECT_EQ(public_key_der(KM_ALGORITHM_EC, exported), expected) << curve;
  }
}

TEST(KeyMaterial, AMalformedExportIsRefused) {
  const bytes nonsense{0x30, 0x03, 0x02, 0x01, 0x00};
  bytes spki = der_of([](const EVP_PKEY* k, unsigned char** out) { return i2d_PUBKEY(k, out); }, rsa_key().get());
  spki.push_back(0);
  EXPECT_THROW((void)public_key_pem(KM_ALGORITHM_RSA, nonsense), format_error);
  EXPECT_THROW((void)public_key_pem(KM_ALGORITHM_RSA, spki), format_error);
  EXPECT_THROW((void)public_key_der(KM_ALGORITHM_EC, nonsense), format_error);
  EXPECT_THROW((void)public_key_der(KM_ALGORITHM_AES, spki), format_error);
  bytes off_curve;
  append_u32(off_curve, 256);
  append_block(off_curve, bytes(32, 1));
  append_block(off_curve, bytes(32, 1));
  EXPECT_THROW((void)public_key_der(KM_ALGORITHM_EC, off_curve), format_error);
}

}  // namespace
