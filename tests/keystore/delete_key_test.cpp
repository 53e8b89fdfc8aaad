// Deleting: the key store keeps nothing per key, so there is next to nothing to do.
#include "tests/keystore/keystore_fixture.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::IsEmpty;

namespace {

using DeleteKeyTest = BlobTest;

TEST_F(DeleteKeyTest, ABlobOfLessThanTwoBytesIsInvalid) {
  for (const std::size_t size : {0U, 1U}) {
    keymaster_error_t error = untouched;
    EXPECT_EQ(key_store_delete_key(pattern(size), &error), TEE_SUCCESS);
    EXPECT_EQ(error, KM_ERROR_INVALID_KEY_BLOB);
  }
}

TEST_F(DeleteKeyTest, EverythingElseIsDeletedWithoutALookAtIt) {
  for (const std::size_t size : {2U, 93U, 5000U}) {
    keymaster_error_t error = untouched;
    EXPECT_EQ(key_store_delete_key(pattern(size), &error), TEE_SUCCESS);
    EXPECT_EQ(error, KM_ERROR_OK);
  }
  EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(DeleteKeyTest, ADeletedKeysBlobStillOpens) {
  const bytes blob = must_save(key_data, characteristics);
  keymaster_error_t error = untouched;
  EXPECT_EQ(key_store_delete_key(blob, &error), TEE_SUCCESS);
  EXPECT_EQ(error, KM_ERROR_OK);
  EXPECT_EQ(key_store_delete_all_keys(), TEE_SUCCESS);
  EXPECT_NE(stored_ksk(), std::nullopt);
  EXPECT_EQ(open(blob).key_data, key_data);
}

}  // namespace
