// Transient objects: types and sizes, populating, reading, copying, generating.
#include <openssl/core_names.h>

#include "tests/tee/crypto_fixture.h"

namespace hosted_tee::testing {
namespace {

class ObjectTest : public crypto_fixture {
 protected:
  static TEE_Result try_allocate(std::uint32_t type, std::uint32_t bits) {
    TEE_ObjectHandle handle = TEE_HANDLE_NULL;
    const TEE_Result result = TEE_AllocateTransientObject(type, bits, &handle);
    EXPECT_EQ(handle != TEE_HANDLE_NULL, result == TEE_SUCCESS);
    TEE_FreeTransientObject(handle);
    return result;
  }
  static TEE_Result generate(const object_owner& object, std::uint32_t bits, const attribute_list& params = {}) {
    return TEE_GenerateKey(object.get(), bits, params.data(), params.count());
  }
};

struct size_range {
  std::uint32_t type;
  std::uint32_t least;
  std::uint32_t most;
  std::uint32_t step;
};
const size_range size_ranges[] = {
    {TEE_TYPE_AES, 128, 256, 64},         {TEE_TYPE_GENERIC_SECRET, 256, 256, 8},
    {TEE_TYPE_HMAC_MD5, 64, 512, 8},      {TEE_TYPE_HMAC_SHA1, 80, 512, 8},
    {TEE_TYPE_HMAC_SHA224, 112, 512, 8},  {TEE_TYPE_HMAC_SHA256, 192, 1024, 8},
    {TEE_TYPE_HMAC_SHA384, 256, 1024, 8}, {TEE_TYPE_HMAC_SHA512, 256, 1024, 8},
    {TEE_TYPE_RSA_KEYPAIR, 512, 8192, 8}, {TEE_TYPE_RSA_PUBLIC_KEY, 512, 8192, 8},
};

TEST_F(ObjectTest, EachTypeHasItsSizesAndNoOther) {
  for (const size_range& range : size_ranges) {
    for (std::uint32_t bits = 0; bits <= range.most + 64; ++bits) {
      const bool expected = bits >= range.least && bits <= range.most && bits % range.step == 0;
      ASSERT_EQ(try_allocate(range.type, bits), expected ? TEE_SUCCESS : TEE_ERROR_NOT_SUPPORTED)
          << std::hex << range.type << " with " << std::dec << bits;
    }
    EXPECT_EQ(try_allocate(range.type, 0x20000080), TEE_ERROR_NOT_SUPPORTED) << "no multiplication may wrap";
  }
  for (const std::uint32_t type : {TEE_TYPE_ECDSA_KEYPAIR, TEE_TYPE_ECDSA_PUBLIC_KEY}) {
    for (std::uint32_t bits = 0; bits <= 600; ++bits) {
      const bool expected = bits == 192 || bits == 224 || bits == 256 || bits == 384 || bits == 521;
      ASSERT_EQ(try_allocate(type, bits), expected ? TEE_SUCCESS : TEE_ERROR_NOT_SUPPORTED) << bits;
    }
  }
  for (const std::uint32_t type : {0U, TEE_TYPE_DATA, TEE_TYPE_CORRUPTED_OBJECT, 0xA0000007U, 0xA0000011U}) {
    EXPECT_EQ(try_allocate(type, 256), TEE_ERROR_NOT_SUPPORTED);
  }
  EXPECT_EQ(self().objects.size(), 0U);
}

TEST_F(ObjectTest, OrderedFailureLeavesTheNullHandle) {
  faults().fail_call("TEE_AllocateTransientObject", 1, TEE_ERROR_OUT_OF_MEMORY);
  int somewhere = 0;
  auto* handle = reinterpret_cast<TEE_ObjectHandle>(&somewhere);
  EXPECT_EQ(TEE_AllocateTransientObject(TEE_TYPE_AES, 128, &handle), TEE_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(handle, nullptr);
}

TEST_F(ObjectTest, InformationTellsWhatTheObjectHolds) {
  const object_owner object = allocate(TEE_TYPE_AES, 256);
  TEE_ObjectInfo info = info_of(object);
  EXPECT_EQ(info.objectType, TEE_TYPE_AES);
  EXPECT_EQ(info.maxKeySize, 256U);
  EXPECT_EQ(info.keySize, 0U);
  EXPECT_EQ(info.objectUsage, 0xFFFFFFFFU);
  EXPECT_EQ(info.handleFlags, 0U);
  ASSERT_EQ(populate_into(object, attribute_list().add(TEE_ATTR_SECRET_VALUE, repeated(7, 16))), TEE_SUCCESS);
  info = info_of(object);
  EXPECT_EQ(info.keySize, 128U);
  EXPECT_EQ(info.maxKeySize, 256U);
  EXPECT_EQ(info.handleFlags, TEE_HANDLE_FLAG_INITIALIZED);
  EXPECT_EQ(info.dataSize, 0U);
  EXPECT_EQ(info.dataPosition, 0U);
}

TEST_F(ObjectTest, SecretValueIsKeptToTheByte) {
  const bytes value = joined(repeated(0, 5), repeated(0xAB, 27));
  const object_owner object = secret_key(TEE_TYPE_HMAC_SHA256, value);
  EXPECT_EQ(buffer_attribute(object, TEE_ATTR_SECRET_VALUE), value) << "a secret value is no number: zeros stay";
  const answer refusal = taking(31, [&](void* buffer, std::uint32_t* size) {
    return TEE_GetObjectBufferAttribute(object.get(), TEE_ATTR_SECRET_VALUE, buffer, size);
  });
  EXPECT_EQ(refusal.result, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(refusal.length, 32U);
  const answer absent = taking(32, [&](void* buffer, std::uint32_t* size) {
    return TEE_GetObjectBufferAttribute(object.get(), TEE_ATTR_RSA_MODULUS, buffer, size);
  });
  EXPECT_EQ(absent.result, TEE_ERROR_ITEM_NOT_FOUND);
}

TEST_F(ObjectTest, SecretValueOfAWrongLengthIsRefusedAndTheObjectStaysEmpty) {
  for (const std::size_t size : {0U, 1U, 15U, 17U, 24U, 32U, 4096U}) {
    const object_owner object = allocate(TEE_TYPE_AES, 128);
    EXPECT_EQ(populate_into(object, attribute_list().add(TEE_ATTR_SECRET_VALUE, repeated(1, size))),
              TEE_ERROR_BAD_PARAMETERS)
        << size;
    EXPECT_EQ(info_of(object).handleFlags, 0U);
    EXPECT_EQ(populate_into(object, attribute_list().add(TEE_ATTR_SECRET_VALUE, repeated(1, 16))), TEE_SUCCESS);
  }
  const object_owner object = allocate(TEE_TYPE_AES, 128);
  TEE_Attribute attribute;
  TEE_InitRefAttribute(&attribute, TEE_ATTR_SECRET_VALUE, nullptr, 16);
  EXPECT_EQ(TEE_PopulateTransientObject(object.get(), &attribute, 1), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(TEE_PopulateTransientObject(object.get(), nullptr, 1), TEE_ERROR_BAD_PARAMETERS);
}

TEST_F(ObjectTest, ResetForgetsTheKeyAndGivesTheRightsBack) {
  const object_owner object = secret_key(TEE_TYPE_AES, repeated(7, 16));
  ASSERT_EQ(TEE_RestrictObjectUsage1(object.get(), TEE_USAGE_ENCRYPT), TEE_SUCCESS);
  EXPECT_EQ(info_of(object).objectUsage, TEE_USAGE_ENCRYPT);
  ASSERT_EQ(TEE_RestrictObjectUsage1(object.get(), TEE_USAGE_ENCRYPT | TEE_USAGE_MAC), TEE_SUCCESS);
  EXPECT_EQ(info_of(object).objectUsage, TEE_USAGE_ENCRYPT) << "rights are only ever lost";
  TEE_ResetTransientObject(object.get());
  EXPECT_EQ(info_of(object).objectUsage, 0xFFFFFFFFU);
  EXPECT_EQ(info_of(object).keySize, 0U);
  EXPECT_EQ(populate_into(object, attribute_list().add(TEE_ATTR_SECRET_VALUE, repeated(9, 16))), TEE_SUCCESS);
}

TEST_F(ObjectTest, UsageIsEnforced) {
  const object_owner key = secret_key(TEE_TYPE_AES, repeated(7, 16));
  ASSERT_EQ(TEE_RestrictObjectUsage1(key.get(), TEE_USAGE_DECRYPT), TEE_SUCCESS);
  const operation_owner encrypt = keyless(TEE_ALG_AES_CTR, TEE_MODE_ENCRYPT, 128);
  const operation_owner decrypt = keyless(TEE_ALG_AES_CTR, TEE_MODE_DECRYPT, 128);
  EXPECT_EQ(TEE_SetOperationKey(decrypt.get(), key.get()), TEE_SUCCESS);
  EXPECT_TRUE(panics([&] { (void)TEE_SetOperationKey(encrypt.get(), key.get()); }));
  std::uint32_t size = 0;
  EXPECT_TRUE(panics([&] { (void)TEE_GetObjectBufferAttribute(key.get(), TEE_ATTR_SECRET_VALUE, nullptr, &size); }))
      << "not extractable";
}

TEST_F(ObjectTest, CopyTakesTheAttributesAndTheLesserRights) {
  const object_owner source = secret_key(TEE_TYPE_AES, repeated(7, 16));
  ASSERT_EQ(TEE_RestrictObjectUsage1(source.get(), TEE_USAGE_EXTRACTABLE | TEE_USAGE_MAC), TEE_SUCCESS);
  const object_owner copy = allocate(TEE_TYPE_AES, 256);
  ASSERT_EQ(TEE_RestrictObjectUsage1(copy.get(), TEE_USAGE_EXTRACTABLE | TEE_USAGE_SIGN), TEE_SUCCESS);
  ASSERT_EQ(TEE_CopyObjectAttributes1(copy.get(), source.get()), TEE_SUCCESS);
  EXPECT_EQ(buffer_attribute(copy, TEE_ATTR_SECRET_VALUE), repeated(7, 16));
  EXPECT_EQ(info_of(copy).keySize, 128U);
  EXPECT_EQ(info_of(copy).objectUsage, TEE_USAGE_EXTRACTABLE);
}

TEST_F(ObjectTest, PublicKeyCanBeCopiedOutOfAPair) {
  const object_owner pair = allocate(TEE_TYPE_ECDSA_KEYPAIR, 256);
  ASSERT_EQ(generate(pair, 256, attribute_list().add_value(TEE_ATTR_ECC_CURVE, TEE_ECC_CURVE_NIST_P256)), TEE_SUCCESS);
  const object_owner copy = allocate(TEE_TYPE_ECDSA_PUBLIC_KEY, 256);
  ASSERT_EQ(TEE_CopyObjectAttributes1(copy.get(), pair.get()), TEE_SUCCESS);
  EXPECT_EQ(buffer_attribute(copy, TEE_ATTR_ECC_PUBLIC_VALUE_X), buffer_attribute(pair, TEE_ATTR_ECC_PUBLIC_VALUE_X));
  std::uint32_t size = 0;
  EXPECT_EQ(TEE_GetObjectBufferAttribute(copy.get(), TEE_ATTR_ECC_PRIVATE_VALUE, nullptr, &size),
            TEE_ERROR_ITEM_NOT_FOUND);
  const object_owner other_kind = allocate(TEE_TYPE_RSA_PUBLIC_KEY, 512);
  EXPECT_TRUE(panics([&] { (void)TEE_CopyObjectAttributes1(other_kind.get(), pair.get()); }));
  const object_owner pair_again = allocate(TEE_TYPE_ECDSA_KEYPAIR, 256);
  EXPECT_TRUE(panics([&] { (void)TEE_CopyObjectAttributes1(pair_again.get(), copy.get()); })) << "no private value";
}

TEST_F(ObjectTest, GeneratedSecretsHaveTheirSizeAndDiffer) {
  for (const size_range& range : size_ranges) {
    if (range.type == TEE_TYPE_RSA_KEYPAIR || range.type == TEE_TYPE_RSA_PUBLIC_KEY) continue;
    const object_owner first = allocate(range.type, range.most);
    const object_owner second = allocate(range.type, range.most);
    ASSERT_EQ(generate(first, range.least), TEE_SUCCESS);
    ASSERT_EQ(generate(second, range.least), TEE_SUCCESS);
    EXPECT_EQ(info_of(first).keySize, range.least);
    EXPECT_EQ(buffer_attribute(first, TEE_ATTR_SECRET_VALUE).size(), range.least / 8);
    EXPECT_NE(buffer_attribute(first, TEE_ATTR_SECRET_VALUE), buffer_attribute(second, TEE_ATTR_SECRET_VALUE));
  }
  const object_owner object = allocate(TEE_TYPE_AES, 192);
  EXPECT_EQ(generate(object, 256), TEE_ERROR_BAD_PARAMETERS) << "above the object's maximum";
  EXPECT_EQ(generate(object, 160), TEE_ERROR_BAD_PARAMETERS) << "not a size of the type";
  EXPECT_EQ(info_of(object).keySize, 0U);
}

TEST_F(ObjectTest, MisusePanics) {
  const object_owner key = secret_key(TEE_TYPE_AES, repeated(7, 16));
  const object_owner empty = allocate(TEE_TYPE_AES, 128);
  TEE_Attribute attribute;
  TEE_InitRefAttribute(&attribute, TEE_ATTR_SECRET_VALUE, "0123456789abcdef", 16);
  std::uint32_t number = 0;
  EXPECT_TRUE(panics([&] { (void)TEE_PopulateTransientObject(key.get(), &attribute, 1); })) << "already holds a key";
  EXPECT_TRUE(panics([&] { (void)TEE_GenerateKey(key.get(), 128, nullptr, 0); }));
  EXPECT_TRUE(panics([&] { (void)TEE_PopulateTransientObject(empty.get(), nullptr, 0); })) << "missing attribute";
  EXPECT_TRUE(
      panics([&] { (void)TEE_GetObjectBufferAttribute(empty.get(), TEE_ATTR_SECRET_VALUE, nullptr, &number); }));
  EXPECT_TRUE(panics([&] { (void)TEE_GetObjectBufferAttribute(key.get(), TEE_ATTR_ECC_CURVE, nullptr, &number); }));
  EXPECT_TRUE(panics([&] { (void)TEE_GetObjectValueAttribute(key.get(), TEE_ATTR_SECRET_VALUE, &number, nullptr); }));
  EXPECT_TRUE(panics([&] { TEE_InitRefAttribute(&attribute, TEE_ATTR_ECC_CURVE, nullptr, 0); }));
  EXPECT_TRUE(panics([&] { TEE_InitValueAttribute(&attribute, TEE_ATTR_SECRET_VALUE, 0, 0); }));
  auto* const stale = reinterpret_cast<TEE_ObjectHandle>(0x123456);
  EXPECT_TRUE(panics([&] { TEE_FreeTransientObject(stale); }));
  EXPECT_TRUE(panics([&] { TEE_CloseObject(stale); }));
  EXPECT_TRUE(panics([&] { TEE_ResetTransientObject(stale); }));
  EXPECT_FALSE(panics([&] { TEE_FreeTransientObject(TEE_HANDLE_NULL); }));
  EXPECT_FALSE(panics([&] { TEE_CloseObject(TEE_HANDLE_NULL); }));
}

/// What tee/storage derives from object, as far as the generic functions see it.
class open_file : public object {
 public:
  explicit open_file(bool* closed) : closed_(closed) {}
  ~open_file() override { *closed_ = true; }
  [[nodiscard]] bool is_persistent() const override { return true; }
  [[nodiscard]] TEE_ObjectInfo info() const override {
    return {.objectType = TEE_TYPE_DATA,
            .keySize = 0,
            .maxKeySize = 0,
            .objectUsage = 0xFFFFFFFF,
            .dataSize = 32,
            .dataPosition = 8,
            .handleFlags = TEE_HANDLE_FLAG_PERSISTENT | TEE_HANDLE_FLAG_INITIALIZED};
  }

 private:
  bool* closed_;
};

TEST_F(ObjectTest, GenericFunctionsServePersistentObjectsToo) {
  bool closed = false;
  auto* const handle = self().objects.insert(std::make_unique<open_file>(&closed));
  TEE_ObjectInfo info{};
  EXPECT_EQ(TEE_GetObjectInfo1(handle, &info), TEE_SUCCESS);
  EXPECT_EQ(info.dataSize, 32U);
  EXPECT_EQ(info.dataPosition, 8U);
  std::uint32_t size = 0;
  EXPECT_EQ(TEE_GetObjectBufferAttribute(handle, TEE_ATTR_SECRET_VALUE, nullptr, &size), TEE_ERROR_ITEM_NOT_FOUND);
  EXPECT_TRUE(panics([&] { TEE_FreeTransientObject(handle); }));
  EXPECT_FALSE(closed);
  TEE_CloseObject(handle);
  EXPECT_TRUE(closed);
}

}  // namespace
}  // namespace hosted_tee::testing
