// Growing a parameter set on a heap that can fail.
#include "params/key_param.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;

namespace {

class AppendTest : public TaUnitTest {
 protected:
  /// A parameter whose blob lies on the TA's heap, to be given away.
  static keymaster_key_param_t blob_param(keymaster_tag_t tag, const bytes& data) {
    keymaster_key_param_t param = {};
    param.tag = tag;
    param.blob.data = heap_copy(data);
    param.blob.data_length = static_cast<std::uint32_t>(data.size());
    return param;
  }
};

TEST_F(AppendTest, ParametersStandInTheOrderTheyWereAppended) {
  parameter_set set;
  param_list expected;
  for (std::uint32_t i = 0; i < 50; ++i) {
    ASSERT_EQ(key_param_set_append(&set, integer_param(KM_TAG_DIGEST, i)), KM_ERROR_OK);
    expected.add(KM_TAG_DIGEST, i);
    ASSERT_EQ(set.length, i + 1);
  }
  EXPECT_EQ(from_ta(set).marshal(), expected.marshal());
  EXPECT_EQ(ta.holdings().heap_blocks, 1U);
}

TEST_F(AppendTest, TheArrayHasRoomForItsRecordsAndNoMore) {
  parameter_set set;
  std::vector<std::size_t> sizes;
  ta.on_free([&](std::span<const std::uint8_t> block) { sizes.push_back(block.size()); });
  for (std::uint32_t i = 0; i < 4; ++i) ASSERT_EQ(key_param_set_append(&set, integer_param(KM_TAG_DIGEST, i)), 0);
  set.reset();
  ta.on_free({});
  EXPECT_THAT(sizes, ::testing::ElementsAre(24, 48, 72, 96));
}

TEST_F(AppendTest, ABlobMovesIntoTheSetWithItsParameter) {
  const bytes nonce = pattern(12);
  const keymaster_key_param_t param = blob_param(KM_TAG_NONCE, nonce);
  parameter_set set;
  ASSERT_EQ(key_param_set_append(&set, param), KM_ERROR_OK);
  EXPECT_EQ(set.params[0].blob.data, param.blob.data) << "not copied";
  EXPECT_EQ(from_ta(set).blob(KM_TAG_NONCE), nonce);
}

TEST_F(AppendTest, AStaleLengthDoesNotCount) {
  parameter_set set;
  set.length = 5;  // as keymaster_free_param_set leaves it
  ASSERT_EQ(key_param_set_append(&set, integer_param(KM_TAG_KEY_SIZE, 256)), KM_ERROR_OK);
  EXPECT_EQ(set.length, 1U);
  EXPECT_EQ(from_ta(set).marshal(), param_list{}.add(KM_TAG_KEY_SIZE, 256).marshal());
}

TEST_F(AppendTest, AFreedSetCanBeFilledAgain) {
  parameter_set set = in_ta(param_list{}.add(KM_TAG_KEY_SIZE, 1).add(KM_TAG_DIGEST, 2).add_blob(KM_TAG_NONCE, {1}));
  keymaster_free_param_set(&set);
  ASSERT_EQ(key_param_set_append(&set, integer_param(KM_TAG_PADDING, 3)), KM_ERROR_OK);
  EXPECT_EQ(from_ta(set).marshal(), param_list{}.add(KM_TAG_PADDING, 3).marshal());
}

TEST_F(AppendTest, AParameterOfTheSetItselfCanBeAppended) {
  // The hosted heap moves every block that it reallocates, so that a late read of the argument would be seen.
  parameter_set set = in_ta(param_list{}.add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN).add(KM_TAG_KEY_SIZE, 2048));
  ASSERT_EQ(key_param_set_append(&set, set.params[1]), KM_ERROR_OK);
  ASSERT_EQ(key_param_set_append(&set, set.params[0]), KM_ERROR_OK);
  EXPECT_EQ(from_ta(set).marshal(), param_list{}
                                        .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
                                        .add(KM_TAG_KEY_SIZE, 2048)
                                        .add(KM_TAG_KEY_SIZE, 2048)
                                        .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
                                        .marshal());
}

TEST_F(AppendTest, AnExhaustedHeapLeavesTheSetAsItWas) {
  const param_list before = param_list{}.add(KM_TAG_KEY_SIZE, 2048).add_blob(KM_TAG_APPLICATION_ID, pattern(20));
  parameter_set set = in_ta(before);
  const keymaster_key_param_t* const array = set.params;
  ta.faults().fail_allocation(1);
  EXPECT_EQ(key_param_set_append(&set, integer_param(KM_TAG_DIGEST, 4)), KM_ERROR_MEMORY_ALLOCATION_FAILED);
  EXPECT_TRUE(ta.faults().triggered());
  EXPECT_EQ(set.params, array);
  EXPECT_EQ(set.length, 2U);
  EXPECT_EQ(from_ta(set).marshal(), before.marshal());
}

TEST_F(AppendTest, AnExhaustedHeapLeavesAnEmptySetEmpty) {
  parameter_set set;
  ta.faults().fail_allocation(1);
  EXPECT_EQ(key_param_set_append(&set, integer_param(KM_TAG_DIGEST, 4)), KM_ERROR_MEMORY_ALLOCATION_FAILED);
  EXPECT_EQ(set.params, nullptr);
  EXPECT_EQ(set.length, 0U);
}

TEST_F(AppendTest, ABlobThatFindsNoRoomIsWipedAndFreed) {
  parameter_set set = in_ta(param_list{}.add(KM_TAG_KEY_SIZE, 2048));
  const keymaster_key_param_t param = blob_param(KM_TAG_NONCE, pattern(12));
  std::vector<bytes> freed;
  ta.on_free([&](std::span<const std::uint8_t> block) { freed.emplace_back(block.begin(), block.end()); });
  ta.faults().fail_allocation(1);
  EXPECT_EQ(key_param_set_append(&set, param), KM_ERROR_MEMORY_ALLOCATION_FAILED);
  ta.on_free({});
  EXPECT_THAT(freed, ::testing::ElementsAre(bytes(12, 0)));
  EXPECT_EQ(ta.holdings().heap_blocks, 1U) << "the set's array alone";
}

TEST_F(AppendTest, ASizeThatDoesNotFitIn32BitsIsWantOfMemory) {
  // 0x0AAAAAAB records of 24 bytes are 2^32 + 8 bytes; taken modulo 2^32 the array would shrink to 8.
  parameter_set one = in_ta(param_list{}.add(KM_TAG_KEY_SIZE, 2048));
  for (const std::uint32_t length : {0x0AAAAAA9U, 0x0AAAAAAAU, 0x0AAAAAABU, 0xFFFFFFFFU}) {
    keymaster_key_param_set_t huge = {one.params, length};
    EXPECT_EQ(key_param_set_append(&huge, integer_param(KM_TAG_DIGEST, 4)), KM_ERROR_MEMORY_ALLOCATION_FAILED);
    EXPECT_EQ(huge.params, one.params);
    EXPECT_EQ(huge.length, length);
  }
  EXPECT_EQ(from_ta(one).value(KM_TAG_KEY_SIZE), 2048U);
}

}  // namespace
