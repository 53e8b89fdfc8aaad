// RSA encryption. What is expected comes from libcrypto's own calls, and from plain modular arithmetic.
#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/rsa.h>

#include "tests/tee/crypto_rsa_fixture.h"

namespace hosted_tee::testing {
namespace {

class RsaCipherTest : public rsa_fixture {};

/// libcrypto's encryption and decryption with the schemes that the platform's algorithms stand for.
struct scheme {
  std::uint32_t algorithm;
  int padding;
  const char* label_digest;
  const char* mask_digest;
  std::size_t overhead;
};
const scheme schemes[] = {
    {TEE_ALG_RSAES_PKCS1_V1_5, RSA_PKCS1_PADDING, nullptr, nullptr, 11},
    {0x60210230, RSA_PKCS1_OAEP_PADDING, "SHA1", "SHA1", 42},
    {0x60310230, RSA_PKCS1_OAEP_PADDING, "SHA224", "SHA224", 58},
    {0x60410230, RSA_PKCS1_OAEP_PADDING, "SHA256", "SHA256", 66},
    {0x60510230, RSA_PKCS1_OAEP_PADDING, "SHA384", "SHA384", 98},
    {0x60610230, RSA_PKCS1_OAEP_PADDING, "SHA512", "SHA512", 130},
    {0x60212230, RSA_PKCS1_OAEP_PADDING, "SHA1", "SHA1", 42},
    {0x60312230, RSA_PKCS1_OAEP_PADDING, "SHA224", "SHA1", 58},
    {0x60412230, RSA_PKCS1_OAEP_PADDING, "SHA256", "SHA1", 66},
    {0x60512230, RSA_PKCS1_OAEP_PADDING, "SHA384", "SHA1", 98},
    {0x60612230, RSA_PKCS1_OAEP_PADDING, "SHA512", "SHA1", 130},
};

void set_scheme(EVP_PKEY_CTX* context, const scheme& each) {
  EXPECT_EQ(EVP_PKEY_CTX_set_rsa_padding(context, each.padding), 1);
  if (each.label_digest == nullptr) return;
  EXPECT_EQ(EVP_PKEY_CTX_set_rsa_oaep_md(context, md(each.label_digest)), 1);
  EXPECT_EQ(EVP_PKEY_CTX_set_rsa_mgf1_md(context, md(each.mask_digest)), 1);
}

bytes encrypted(const key_owner& key, const scheme& each, const bytes& plain) {
  const context_owner context(EVP_PKEY_CTX_new(key.get(), nullptr));
  EXPECT_EQ(EVP_PKEY_encrypt_init(context.get()), 1);
  set_scheme(context.get(), each);
  bytes cipher(static_cast<std::size_t>(EVP_PKEY_get_size(key.get())));
  std::size_t size = cipher.size();
  EXPECT_EQ(EVP_PKEY_encrypt(context.get(), cipher.data(), &size, plain.data(), plain.size()), 1);
  return cipher;
}

bytes decrypted(const key_owner& key, const scheme& each, const bytes& cipher) {
  const context_owner context(EVP_PKEY_CTX_new(key.get(), nullptr));
  EXPECT_EQ(EVP_PKEY_decrypt_init(context.get()), 1);
  set_scheme(context.get(), each);
  bytes plain(static_cast<std::size_t>(EVP_PKEY_get_size(key.get())));
  std::size_t size = plain.size();
  EXPECT_EQ(EVP_PKEY_decrypt(context.get(), plain.data(), &size, cipher.data(), cipher.size()), 1);
  plain.resize(size);
  return plain;
}

/// raised computes number^exponent mod n without any RSA code. The result has no leading zero bytes.
bytes raised(const key_owner& key, const bytes& number, const char* exponent) {
  BN_CTX* scratch = BN_CTX_new();
  const auto bn = [](const bytes& b) { return BN_bin2bn(b.data(), static_cast<int>(b.size()), nullptr); };
  BIGNUM* base = bn(number);
  BIGNUM* power = bn(number_of(key, exponent));
  BIGNUM* modulus = bn(number_of(key, OSSL_PKEY_PARAM_RSA_N));
  BIGNUM* result = BN_new();
  EXPECT_EQ(BN_mod_exp(result, base, power, modulus, scratch), 1);
  bytes out(static_cast<std::size_t>(BN_num_bytes(result)));
  BN_bn2bin(result, out.data());
  for (BIGNUM* each : {base, power, modulus, result}) BN_clear_free(each);
  BN_CTX_free(scratch);
  return out;
}

TEST_F(RsaCipherTest, BareOperationIsModularExponentiationWithAStrippedResult) {
  const key_owner& key = reference(1024);
  const bytes modulus = number_of(key, OSSL_PKEY_PARAM_RSA_N);
  bytes largest = modulus;
  largest.back() -= 1;  // odd, so there is no borrow
  for (const bool crt : {true, false}) {
    const object_owner object = imported(1024, crt);
    const operation_owner to_public = operation_for(TEE_ALG_RSA_NOPAD, TEE_MODE_ENCRYPT, object);
    const operation_owner to_private = operation_for(TEE_ALG_RSA_NOPAD, TEE_MODE_DECRYPT, object);
    for (const bytes& number :
         {bytes{1}, bytes{2}, from_text("short"), repeated(0x11, 127), repeated(0x33, 128),
          joined(bytes(60), repeated(0x44, 68)), joined(bytes(1), repeated(0x55, 128)), largest}) {
      EXPECT_EQ(encrypt(to_public, number, 128).data, raised(key, number, OSSL_PKEY_PARAM_RSA_E));
      EXPECT_EQ(decrypt(to_private, number, 128).data, raised(key, number, OSSL_PKEY_PARAM_RSA_D));
    }
    const bytes small = from_hex("0000000000c0ffee");
    EXPECT_EQ(encrypt(to_public, decrypt(to_private, small, 128).data, 128).data, from_hex("c0ffee"))
        << "leading zero bytes are dropped on the way back";
  }
}

TEST_F(RsaCipherTest, BareOperationOnZeroIsNoBytes) {
  for (const bytes& zero : {bytes{}, bytes{0}, bytes(128), bytes(300)}) {
    const answer encrypted_zero = encrypt(rsa(TEE_ALG_RSA_NOPAD, TEE_MODE_ENCRYPT), zero, 0);
    EXPECT_EQ(encrypted_zero.result, TEE_SUCCESS);
    EXPECT_EQ(encrypted_zero.length, 0U);
    const answer decrypted_zero = decrypt(rsa(TEE_ALG_RSA_NOPAD, TEE_MODE_DECRYPT), zero, 0);
    EXPECT_EQ(decrypted_zero.result, TEE_SUCCESS);
    EXPECT_EQ(decrypted_zero.length, 0U);
  }
}

TEST_F(RsaCipherTest, BareOperationRefusesNumbersFromTheModulusOn) {
  const bytes modulus = number_of(reference(1024), OSSL_PKEY_PARAM_RSA_N);
  const operation_owner to_public = rsa(TEE_ALG_RSA_NOPAD, TEE_MODE_ENCRYPT);
  const operation_owner to_private = rsa(TEE_ALG_RSA_NOPAD, TEE_MODE_DECRYPT);
  for (const bytes& number : {modulus, joined(bytes(1), modulus), repeated(0xFF, 128), joined({1}, bytes(128))}) {
    const answer got = encrypt(to_public, number, 256);
    EXPECT_EQ(got.result, TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(got.length, 0U);
    EXPECT_EQ(decrypt(to_private, number, 256).result, TEE_ERROR_BAD_PARAMETERS);
  }
}

TEST_F(RsaCipherTest, EverySchemeAgreesWithLibcryptoBothWays) {
  const key_owner& key = reference(2048);
  const object_owner object = imported(2048);
  for (const scheme& each : schemes) {
    const operation_owner encrypting = operation_for(each.algorithm, TEE_MODE_ENCRYPT, object);
    const operation_owner decrypting = operation_for(each.algorithm, TEE_MODE_DECRYPT, object);
    for (const std::size_t size : {std::size_t{0}, std::size_t{1}, 256 - each.overhead}) {
      const bytes plain = repeated(0x5A, size);
      const answer sealed = encrypt(encrypting, plain, 256);
      ASSERT_EQ(sealed.result, TEE_SUCCESS) << std::hex << each.algorithm;
      EXPECT_EQ(sealed.data.size(), 256U);
      EXPECT_EQ(decrypted(key, each, sealed.data), plain);
      const answer opened = decrypt(decrypting, encrypted(key, each, plain), 256);
      EXPECT_EQ(opened.result, TEE_SUCCESS) << "also of no bytes";
      EXPECT_EQ(opened.data, plain);
    }
    EXPECT_EQ(encrypt(encrypting, repeated(1, 257 - each.overhead), 256).result, TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(encrypt(encrypting, repeated(1, 300), 256).result, TEE_ERROR_BAD_PARAMETERS);
  }
}

TEST_F(RsaCipherTest, EveryDecryptionFailureIsTheSameCode) {
  const key_owner& key = reference(2048);
  const object_owner object = imported(2048);
  for (const scheme& each : schemes) {
    const operation_owner decrypting = operation_for(each.algorithm, TEE_MODE_DECRYPT, object);
    const bytes good = encrypted(key, each, from_text("plain"));
    for (std::size_t i = 1; i <= 20 && each.padding == RSA_PKCS1_OAEP_PADDING; ++i) {
      bytes garbage = good;
      garbage[256 - i] ^= 0x40;
      EXPECT_EQ(decrypt(decrypting, garbage, 256).result, TEE_ERROR_BAD_PARAMETERS);
    }
    EXPECT_EQ(decrypt(decrypting, bytes(good.begin(), good.end() - 1), 256).result, TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(decrypt(decrypting, joined(good, {0}), 256).result, TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(decrypt(decrypting, joined({0}, good), 256).result, TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(decrypt(decrypting, {}, 256).result, TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(decrypt(decrypting, repeated(0xFF, 256), 256).result, TEE_ERROR_BAD_PARAMETERS) << "above the modulus";
  }
  const operation_owner sha1_mask = operation_for(0x60412230, TEE_MODE_DECRYPT, object);
  EXPECT_EQ(decrypt(sha1_mask, encrypted(key, schemes[3], from_text("x")), 256).result, TEE_ERROR_BAD_PARAMETERS)
      << "the two families of OAEP identifiers have different masks";
}

TEST_F(RsaCipherTest, WrongPkcs1PaddingIsTheSameCodeToo) {
  // RFC 8017, section 7.2.2: 00 02, at least eight bytes that are not 00, a 00, the message.
  const bytes filler = repeated(0xAB, 120);
  const bytes good = joined(joined({0, 2}, filler), joined({0}, repeated(0x11, 5)));
  const bytes no_separator = joined({0, 2}, repeated(0xAB, 126));
  const bytes short_filler = joined(joined({0, 2}, repeated(0xAB, 7)), joined({0}, repeated(0x11, 118)));
  const bytes block_type_1 = joined(joined({0, 1}, filler), joined({0}, repeated(0x11, 5)));
  const bytes first_byte = joined(joined({1, 2}, filler), joined({0}, repeated(0x11, 5)));
  const operation_owner decrypting = rsa(TEE_ALG_RSAES_PKCS1_V1_5, TEE_MODE_DECRYPT);
  const auto outcome = [&](const bytes& block) {
    const bytes cipher = raised(reference(1024), block, OSSL_PKEY_PARAM_RSA_E);
    return decrypt(decrypting, joined(bytes(128 - cipher.size()), cipher), 128);
  };
  EXPECT_EQ(outcome(good).data, repeated(0x11, 5));
  for (const bytes& block : {no_separator, short_filler, block_type_1, first_byte, bytes(128), bytes{1}}) {
    EXPECT_EQ(outcome(block).result, TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(outcome(block).length, 0U);
  }
}

TEST_F(RsaCipherTest, OaepLabelIsPartOfTheMessage) {
  const object_owner object = imported(1024);
  const operation_owner encrypting = operation_for(0x60410230, TEE_MODE_ENCRYPT, object);
  const operation_owner decrypting = operation_for(0x60410230, TEE_MODE_DECRYPT, object);
  const attribute_list label = attribute_list().add(TEE_ATTR_RSA_OAEP_LABEL, from_text("label"));
  const attribute_list empty = attribute_list().add(TEE_ATTR_RSA_OAEP_LABEL, {});
  const bytes sealed = encrypt(encrypting, from_text("plain"), 128, label).data;
  EXPECT_EQ(decrypt(decrypting, sealed, 128, label).data, from_text("plain"));
  EXPECT_EQ(decrypt(decrypting, sealed, 128).result, TEE_ERROR_BAD_PARAMETERS);
  const bytes unlabelled = encrypt(encrypting, from_text("plain"), 128).data;
  EXPECT_EQ(decrypt(decrypting, unlabelled, 128, empty).data, from_text("plain"));
}

TEST_F(RsaCipherTest, ShortBufferTellsTheSize) {
  const operation_owner encrypting = rsa(TEE_ALG_RSAES_PKCS1_V1_5, TEE_MODE_ENCRYPT);
  const answer refusal = encrypt(encrypting, from_text("plain"), 127);
  EXPECT_EQ(refusal.result, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(refusal.length, 128U);
  const bytes cipher = encrypted(reference(1024), schemes[0], from_text("plain"));
  const operation_owner decrypting = rsa(TEE_ALG_RSAES_PKCS1_V1_5, TEE_MODE_DECRYPT);
  const answer short_plain = decrypt(decrypting, cipher, 4);
  EXPECT_EQ(short_plain.result, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(short_plain.length, 5U);
  EXPECT_EQ(decrypt(decrypting, cipher, 5).data, from_text("plain"));
}

TEST_F(RsaCipherTest, SizeThatCountsALeadingZeroOfTheModulusWorks) {
  // 129 bytes of modulus, the first of them 00: what is stated as 1032 bits is a key of 1024.
  const object_owner object = allocate(TEE_TYPE_RSA_KEYPAIR, 1032);
  ASSERT_EQ(populate_into(object, rsa_attributes(reference(1024))), TEE_SUCCESS);
  const bytes cipher = encrypted(reference(1024), schemes[0], from_text("plain"));
  const operation_owner decrypting = operation_for(TEE_ALG_RSAES_PKCS1_V1_5, TEE_MODE_DECRYPT, object);
  EXPECT_EQ(decrypt(decrypting, joined({0}, cipher), 129).data, from_text("plain"));
  const bytes block = joined({0, 0}, repeated(0x22, 127));
  const answer raw = decrypt(operation_for(TEE_ALG_RSA_NOPAD, TEE_MODE_DECRYPT, object), block, 129);
  EXPECT_EQ(raw.data, raised(reference(1024), block, OSSL_PKEY_PARAM_RSA_D));
}

}  // namespace
}  // namespace hosted_tee::testing
