// Base64 and PEM, against libcrypto's.
#include <openssl/bio.h>
#include <openssl/evp.h>
#include <openssl/pem.h>

#include "platform/handles.h"
#include "soter/public_key_pem.h"
#include "tests/support/rsa_test_key.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;

namespace testing_support {
namespace {

using ::testing::IsEmpty;

std::string encoded(const bytes& data) {
  const heap_bytes text = base64_encode(data);
  if (!text) return "(none)";
  EXPECT_EQ(text.data()[text.size() - 1], 0);
  return {reinterpret_cast<const char*>(text.data()), text.size() - 1};
}

std::string by_libcrypto(const bytes& data) {
  std::string text(4 * ((data.size() + 2) / 3) + 1, '\0');
  const int length =
      EVP_EncodeBlock(reinterpret_cast<unsigned char*>(text.data()), data.data(), static_cast<int>(data.size()));
  text.resize(static_cast<std::size_t>(length));
  return text;
}

class Base64Test : public TaUnitTest {};

TEST_F(Base64Test, EveryLengthIsEncodedAsLibcryptoDoes) {
  for (std::size_t size = 0; size <= 600; ++size) {
    const bytes data = pattern(size, static_cast<std::uint32_t>(size));
    ASSERT_EQ(encoded(data), by_libcrypto(data)) << size;
  }
}

TEST_F(Base64Test, EveryGroupOfBitsHasItsLetter) {
  for (int a = 0; a < 256; ++a) {
    for (int b = 0; b < 256; ++b) {
      const bytes data = {static_cast<std::uint8_t>(a), static_cast<std::uint8_t>(b), static_cast<std::uint8_t>(a ^ b)};
      ASSERT_EQ(encoded(data), by_libcrypto(data));
    }
  }
}

TEST_F(Base64Test, WantOfMemoryLeavesNothing) {
  ta.faults().fail_allocation(1);
  EXPECT_FALSE(base64_encode(pattern(9)));
  ta.faults().clear();
  ta.faults().fail_allocation(1);
  const bytes der = pattern(9);
  bytes out(200, 0xEE);
  std::uint32_t length = 77;
  EXPECT_EQ(wrap_pem_public_key(der.data(), 9, out.data(), 200, &length), TEE_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(length, 77U);
  EXPECT_EQ(out, bytes(200, 0xEE));
}

TEST_F(Base64Test, PemIsOneLineOfBase64BetweenItsMarksWithANulBehind) {
  const bytes der = pattern(50);
  const std::string expected =
      "-----BEGIN PUBLIC KEY-----\n" + by_libcrypto(der) + "\n-----END PUBLIC KEY-----" + std::string(1, '\0');
  ASSERT_EQ(expected.size(), 27 + 68 + 25 + 1U);
  bytes out(200, 0xEE);
  std::uint32_t length = 0;
  ASSERT_EQ(wrap_pem_public_key(der.data(), 50, out.data(), 200, &length), TEE_SUCCESS);
  EXPECT_EQ(length, expected.size());
  EXPECT_EQ(bytes(out.begin(), out.begin() + length), from_text(expected));
  EXPECT_EQ(bytes(out.begin() + length, out.end()), bytes(200 - length, 0xEE));
}

TEST_F(Base64Test, TheDerMayLieWhereThePemIsWritten) {
  const bytes der = pattern(294);
  bytes apart(445), in_place = der;
  in_place.resize(445);
  std::uint32_t length = 0;
  ASSERT_EQ(wrap_pem_public_key(der.data(), 294, apart.data(), 445, &length), TEE_SUCCESS);
  ASSERT_EQ(wrap_pem_public_key(in_place.data(), 294, in_place.data(), 445, &length), TEE_SUCCESS);
  EXPECT_EQ(length, 445U);
  EXPECT_EQ(in_place, apart);
}

TEST_F(Base64Test, OneByteTooFewForThePemIsAShortBuffer) {
  bytes out = pattern(294);
  out.resize(445);
  const bytes before = out;
  std::uint32_t length = 294;
  EXPECT_EQ(wrap_pem_public_key(out.data(), 294, out.data(), 444, &length), TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(length, 294U);
  EXPECT_EQ(out, before);
}

/// A key-pair object of one of the fixed keys.
object_handle key_object(std::uint32_t bits) {
  const bytes material = rsa_test_key::of_bits(bits).material();
  constexpr std::uint32_t attributes_of[] = {TEE_ATTR_RSA_MODULUS, TEE_ATTR_RSA_PUBLIC_EXPONENT,
                                             TEE_ATTR_RSA_PRIVATE_EXPONENT};
  TEE_Attribute attributes[3];
  std::size_t at = 0;
  for (std::size_t i = 0; i < 3; ++i) {
    const std::uint32_t size = u32_at(material, at);
    TEE_InitRefAttribute(&attributes[i], attributes_of[i], material.data() + at + 4, size);
    at += 4 + size;
  }
  object_handle key;
  EXPECT_EQ(key.allocate(TEE_TYPE_RSA_KEYPAIR, bits), TEE_SUCCESS);
  EXPECT_EQ(TEE_PopulateTransientObject(key.get(), attributes, 3), TEE_SUCCESS);
  return key;
}

TEST_F(Base64Test, ThePemOfAKeyIsReadByLibcrypto) {
  for (const std::uint32_t bits : {1024U, 2048U}) {
    const object_handle key = key_object(bits);
    bytes out(1024);
    std::uint32_t length = 0;
    ASSERT_EQ(export_rsa_public_key(key.get(), bits, out.data(), 1024, &length), TEE_SUCCESS);
    EXPECT_EQ(length, bits == 2048 ? 445U : 269U);
    const std::unique_ptr<BIO, decltype(&BIO_free)> bio(BIO_new_mem_buf(out.data(), static_cast<int>(length)),
                                                        BIO_free);
    const std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)> read(
        PEM_read_bio_PUBKEY(bio.get(), nullptr, nullptr, nullptr), EVP_PKEY_free);
    ASSERT_NE(read, nullptr);
    unsigned char* der = nullptr;
    const int der_length = i2d_PUBKEY(read.get(), &der);
    ASSERT_GT(der_length, 0);
    EXPECT_EQ(bytes(der, der + der_length), rsa_test_key::of_bits(bits).spki());
    OPENSSL_free(der);
  }
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(Base64Test, AKeyNeedsTheRoomForItsPem) {
  const object_handle key = key_object(2048);
  for (const auto& [capacity, line] :
       std::map<std::uint32_t, std::vector<std::string>>{{0, {"TEE_AsymmetricExport failed: ffff0010\n"}},
                                                         {293, {"TEE_AsymmetricExport failed: ffff0010\n"}},
                                                         {294, {}},
                                                         {444, {}}}) {
    ta.clear_trace();
    bytes out(445);
    std::uint32_t length = 0;
    EXPECT_EQ(export_rsa_public_key(key.get(), 2048, out.data(), capacity, &length), TEE_ERROR_SHORT_BUFFER);
    EXPECT_EQ(ta.errors(), line) << capacity;
  }
}

}  // namespace
}  // namespace testing_support
