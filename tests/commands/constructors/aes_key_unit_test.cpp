// The entries of the AES key module themselves, where memory runs out and where a blob's content is not to be trusted.
#include "algorithms/aes/aes_key.h"
#include "tests/support/encryption.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using testing::ElementsAre;

namespace testing_support {
namespace {

class AesKeyUnitTest : public TaUnitTest {
 protected:
  secret_bytes key_data;
  keymaster_error_t error = KM_ERROR_OK;
};

TEST_F(AesKeyUnitTest, WantOfMemoryIsAResultWhenGeneratingTheKeyAndAnErrorWhenTakingIt) {
  {
    parameter_set params = in_ta(aes_key(128));
    const hosted_tee::accounting before = ta.holdings();
    ta.faults().fail_allocation(2);  // the first one is the origin's place among the parameters
    EXPECT_EQ(aes_generate_key(&params, key_data, &error), TEE_ERROR_OUT_OF_MEMORY);
    EXPECT_EQ(error, KM_ERROR_OK);
    EXPECT_THAT(ta.errors(), ElementsAre("Out of memory"));
    EXPECT_FALSE(key_data);
    EXPECT_EQ(ta.holdings().transient_objects, before.transient_objects);
  }
  ta.clear_trace();
  ta.faults().clear();
  parameter_set params = in_ta(aes_key(128));
  ta.faults().fail_allocation(2);
  EXPECT_EQ(aes_import_key(&params, pattern(16), key_data, &error), TEE_SUCCESS);
  EXPECT_EQ(error, KM_ERROR_MEMORY_ALLOCATION_FAILED);
  EXPECT_THAT(ta.errors(), ElementsAre("Out of memory"));
  EXPECT_FALSE(key_data);
}

TEST_F(AesKeyUnitTest, NoPlaceForTheOriginIsWantOfMemoryInBoth) {
  for (const bool importing : {false, true}) {
    parameter_set params = in_ta(aes_key(128));
    ta.clear_trace();
    ta.faults().clear();
    ta.faults().fail_allocation(1);
    EXPECT_EQ(importing ? aes_import_key(&params, pattern(16), key_data, &error)
                        : aes_generate_key(&params, key_data, &error),
              TEE_SUCCESS);
    EXPECT_EQ(error, KM_ERROR_MEMORY_ALLOCATION_FAILED);
    EXPECT_THAT(ta.errors(), ElementsAre("Out of memory"));
    EXPECT_EQ(from_ta(params).marshal(), aes_key(128).marshal());
  }
}

TEST_F(AesKeyUnitTest, KeyDataResolveToAKeyAndItsSize) {
  for (const std::uint32_t bits : {128U, 192U, 256U}) {
    const bytes raw = pattern(bits / 8);
    for (const bytes& data : {join({u32(bits), raw}), join({u32(bits), raw, pattern(9)})}) {
      TEE_ObjectHandle key = TEE_HANDLE_NULL;
      std::uint32_t size = 0;
      error = KM_ERROR_UNKNOWN_ERROR;
      ASSERT_EQ(aes_resolve_key_data(data, &key, &size, &error), TEE_SUCCESS);
      EXPECT_EQ(error, KM_ERROR_OK);
      EXPECT_EQ(size, bits);
      bytes value(32);
      std::uint32_t length = 32;
      EXPECT_EQ(TEE_GetObjectBufferAttribute(key, TEE_ATTR_SECRET_VALUE, value.data(), &length), TEE_SUCCESS);
      EXPECT_EQ(bytes(value.begin(), value.begin() + length), raw);
      TEE_FreeTransientObject(key);
      ASSERT_EQ(aes_resolve_key_data(data, &key, nullptr, &error), TEE_SUCCESS);
      TEE_FreeTransientObject(key);
    }
  }
}

TEST_F(AesKeyUnitTest, KeyDataThatEndTooSoonResolveToNothing) {
  for (const bytes& data : {bytes{}, bytes(3), u32(8), join({u32(256), pattern(16)}), join({u32(256), pattern(31)}),
                            join({u32(0xFFFFFFFF), pattern(64)})}) {
    SCOPED_TRACE(to_hex(data));
    auto key = reinterpret_cast<TEE_ObjectHandle>(1);
    std::uint32_t size = 99;
    ta.clear_trace();
    EXPECT_EQ(aes_resolve_key_data(data, &key, &size, &error), TEE_ERROR_GENERIC);
    EXPECT_EQ(key, TEE_ObjectHandle{TEE_HANDLE_NULL});
    EXPECT_EQ(size, 0U);
    EXPECT_THAT(ta.errors(), ElementsAre("Too short input"));
  }
}

TEST_F(AesKeyUnitTest, ExportOnlyRefuses) {
  bytes room = pattern(100);
  auto length = static_cast<std::uint32_t>(room.size());
  EXPECT_EQ(aes_export_key(join({u32(128), pattern(16)}), room.data(), &length, &error), TEE_SUCCESS);
  EXPECT_EQ(error, KM_ERROR_UNSUPPORTED_KEY_FORMAT);
  EXPECT_EQ(length, 0U);
  EXPECT_EQ(room, pattern(100));
}

}  // namespace
}  // namespace testing_support
