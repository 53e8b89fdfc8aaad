// Owners of platform handles, as the instance's tables see them.
#include "platform/handles.h"

#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;

namespace {

class HandlesTest : public TaUnitTest {
 protected:
  [[nodiscard]] std::uint32_t objects() const { return ta.holdings().transient_objects; }
  [[nodiscard]] std::uint32_t operations() const { return ta.holdings().operations; }
};

TEST_F(HandlesTest, AnOwnerFreesItsHandleWhenItGoes) {
  {
    object_handle key;
    operation_handle mac;
    EXPECT_FALSE(key);
    ASSERT_EQ(key.allocate(TEE_TYPE_HMAC_SHA256, 256), TEE_SUCCESS);
    ASSERT_EQ(mac.allocate(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, 256), TEE_SUCCESS);
    EXPECT_TRUE(key);
    EXPECT_TRUE(mac);
    EXPECT_EQ(objects(), 1U);
    EXPECT_EQ(operations(), 1U);
  }
  EXPECT_EQ(objects(), 0U);
  EXPECT_EQ(operations(), 0U);
}

TEST_F(HandlesTest, AllocatingAgainFreesTheOldHandle) {
  object_handle key;
  ASSERT_EQ(key.allocate(TEE_TYPE_HMAC_SHA256, 256), TEE_SUCCESS);
  const TEE_ObjectHandle old = key.get();
  ASSERT_EQ(key.allocate(TEE_TYPE_AES, 128), TEE_SUCCESS);
  EXPECT_NE(key.get(), old);
  EXPECT_EQ(objects(), 1U);
}

TEST_F(HandlesTest, AFailedAllocationLeavesTheOwnerEmpty) {
  object_handle key;
  operation_handle mac;
  persistent_object stored;
  ASSERT_EQ(key.allocate(TEE_TYPE_HMAC_SHA256, 256), TEE_SUCCESS);
  ASSERT_EQ(mac.allocate(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, 256), TEE_SUCCESS);
  ta.faults().fail_call("TEE_AllocateTransientObject", 1, TEE_ERROR_BUSY);
  ta.faults().fail_call("TEE_AllocateOperation", 1, TEE_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(key.allocate(TEE_TYPE_HMAC_SHA256, 256), TEE_ERROR_BUSY);
  EXPECT_EQ(mac.allocate(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, 256), TEE_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(stored.open(TEE_STORAGE_PRIVATE, "x", 1, TEE_DATA_FLAG_ACCESS_READ), TEE_ERROR_ITEM_NOT_FOUND);
  EXPECT_EQ(stored.create(TEE_STORAGE_PRIVATE, "x", 1, TEE_DATA_FLAG_ACCESS_READ, nullptr, 0),
            TEE_ERROR_ITEM_NOT_FOUND);
  EXPECT_FALSE(key);
  EXPECT_FALSE(mac);
  EXPECT_FALSE(stored);
  EXPECT_EQ(objects(), 0U);
  EXPECT_EQ(operations(), 0U);
}

TEST_F(HandlesTest, MovingLeavesTheSourceEmpty) {
  object_handle source;
  ASSERT_EQ(source.allocate(TEE_TYPE_HMAC_SHA256, 256), TEE_SUCCESS);
  const TEE_ObjectHandle handle = source.get();
  object_handle target{std::move(source)};
  EXPECT_FALSE(source);  // NOLINT(bugprone-use-after-move): that is what is tested
  EXPECT_EQ(target.get(), handle);

  object_handle other;
  ASSERT_EQ(other.allocate(TEE_TYPE_HMAC_SHA256, 256), TEE_SUCCESS);
  other = std::move(target);
  EXPECT_EQ(other.get(), handle);
  EXPECT_EQ(objects(), 1U) << "what the assigned owner held is freed";
  object_handle& same = other;
  other = std::move(same);
  EXPECT_EQ(other.get(), handle) << "assigned to itself";
}

TEST_F(HandlesTest, AReleasedHandleIsTheNewOwnersToFree) {
  operation_handle owner;
  ASSERT_EQ(owner.allocate(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, 256), TEE_SUCCESS);
  const TEE_OperationHandle handle = owner.release();
  EXPECT_FALSE(owner);
  owner.reset();
  EXPECT_EQ(operations(), 1U);
  operation_handle{handle}.reset();
  EXPECT_EQ(operations(), 0U);
}

}  // namespace
