// Writing the byte form of parameter sets, for clients and for key blobs.
#include "params/marshal.h"

#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

constexpr std::uint8_t filler = 0xA5;

class MarshalTest : public TaUnitTest {
 protected:
  /// What marshal writes into a buffer that it allocates itself.
  bytes allocated(const keymaster_key_param_set_t& set, bool include_hidden) {
    std::uint8_t* buffer = nullptr;
    std::uint32_t length = 0xDEADBEEF;  // means nothing without a buffer
    EXPECT_EQ(marshal(set, include_hidden, &buffer, &length), TEE_SUCCESS);
    bytes written(buffer, buffer + length);
    TEE_Free(buffer);
    return written;
  }

  /// A failure leaves no buffer, no length, one error line and the heap as `after`.
  void expect_failure(const keymaster_key_param_set_t& set, std::uint8_t* given, std::uint32_t capacity,
                      TEE_Result result, const std::string& line, const hosted_tee::accounting& after) {
    std::uint8_t* buffer = given;
    std::uint32_t length = capacity;
    ta.clear_trace();
    EXPECT_EQ(marshal(set, true, &buffer, &length), result);
    EXPECT_EQ(buffer, nullptr);
    EXPECT_EQ(length, 0U);
    EXPECT_THAT(ta.errors(), ElementsAre(line));
    expect_same(ta.holdings(), after);
  }
};

param_list every_type() {
  return param_list{}
      .add(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY)
      .add(KM_TAG_KEY_SIZE, 0x800)
      .add(KM_UINT_REP | 0x77, 7)
      .add(KM_TAG_RSA_PUBLIC_EXPONENT, 0x1122334455667788)
      .add(KM_TAG_ACTIVE_DATETIME, 0x18BCFE56800)
      .add(KM_TAG_NO_AUTH_REQUIRED)
      .add_blob(KM_BIGNUM | 0x64, from_hex("0102030405060708090a0b0c0d"))
      .add_blob(KM_TAG_NONCE, from_hex("f1f2"))
      .add(KM_TAG_USER_SECURE_ID, 0xFFEEDDCCBBAA9988);
}

TEST_F(MarshalTest, TheBytesOfEveryTypeAreTheFormats) {
  EXPECT_EQ(to_hex(allocated(in_ta(every_type()), false)),
            "0a000000"
            "0200001000000000"
            "8000000000000000"
            "0000000000000000"
            "0100002000000000"
            "0300000000000000"
            "0000000000000000"
            "0300003000000000"
            "0008000000000000"
            "0000000000000000"
            "7700004000000000"
            "0700000000000000"
            "0000000000000000"
            "c800005000000000"
            "8877665544332211"
            "0000000000000000"
            "9001006000000000"
            "0068e5cf8b010000"
            "0000000000000000"
            "f701007000000000"
            "0100000000000000"
            "0000000000000000"
            "6400008000000000"
            "0000000000000000"
            "0d00000000000000"
            "0102030405060708090a0b0c0d"
            "e903009000000000"
            "0000000000000000"
            "0200000000000000"
            "f1f2"
            "f60100a000000000"
            "8899aabbccddeeff"
            "0000000000000000");
}

TEST_F(MarshalTest, HiddenTagsAreLeftOutOfCountAndBodyUnlessAskedFor) {
  param_list all = every_type();
  for (const std::uint32_t hidden : {KM_TAG_APPLICATION_ID, KM_TAG_APPLICATION_DATA, KM_TAG_ROOT_OF_TRUST}) {
    all.add_blob(hidden, pattern(5 + hidden % 7));
  }
  all.add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED).add_blob(KM_TAG_AUTH_TOKEN, pattern(69));
  const parameter_set set = in_ta(all);
  param_list visible = all;
  visible.remove(KM_TAG_APPLICATION_ID).remove(KM_TAG_APPLICATION_DATA).remove(KM_TAG_ROOT_OF_TRUST);

  EXPECT_EQ(allocated(set, true), all.marshal());
  EXPECT_EQ(allocated(set, false), visible.marshal()) << "an auth token is not hidden";
  EXPECT_EQ(marshal_size(set, true), all.marshal().size());
  EXPECT_EQ(marshal_size(set, false), visible.marshal().size());
}

TEST_F(MarshalTest, AnApplicationIdAloneIsAnEmptySetToTheClient) {
  const parameter_set set = in_ta(param_list{}.add_blob(KM_TAG_APPLICATION_ID, from_text("app")));
  EXPECT_EQ(to_hex(allocated(set, false)), "00000000");
  EXPECT_EQ(to_hex(allocated(set, true)),
            "01000000"
            "5902009000000000"
            "0000000000000000"
            "0300000000000000"
            "617070");
}

TEST_F(MarshalTest, AnEmptySetIsItsCount) {
  EXPECT_EQ(to_hex(allocated({nullptr, 0}, true)), "00000000");
  EXPECT_EQ(to_hex(allocated({nullptr, 0}, false)), "00000000");
  EXPECT_EQ(to_hex(allocated({nullptr, 9}, true)), "00000000") << "a stale length";
  EXPECT_EQ(marshal_size({nullptr, 9}, true), 4U);
}

TEST_F(MarshalTest, AnAllocatedBufferHasExactlyTheSize) {
  const parameter_set set = in_ta(every_type());
  std::uint8_t* buffer = nullptr;
  std::uint32_t length = 0;
  ASSERT_EQ(marshal(set, true, &buffer, &length), TEE_SUCCESS);
  std::size_t block = 0;
  ta.on_free([&](std::span<const std::uint8_t> freed) { block = freed.size(); });
  TEE_Free(buffer);
  ta.on_free({});
  EXPECT_EQ(length, every_type().marshal().size());
  EXPECT_EQ(block, length);
}

TEST_F(MarshalTest, AGivenBufferOfTheExactCapacityIsFilled) {
  const parameter_set set = in_ta(every_type());
  const bytes expected = every_type().marshal();
  std::uint8_t* const given = heap_copy(bytes(expected.size(), filler));
  std::uint8_t* buffer = given;
  std::uint32_t length = static_cast<std::uint32_t>(expected.size());
  ASSERT_EQ(marshal(set, true, &buffer, &length), TEE_SUCCESS);
  EXPECT_EQ(buffer, given);
  EXPECT_EQ(bytes(buffer, buffer + length), expected);
  EXPECT_THAT(ta.errors(), IsEmpty());
  TEE_Free(buffer);
}

TEST_F(MarshalTest, AGivenBufferOfLargerCapacityLearnsTheSize) {
  const parameter_set set = in_ta(every_type());
  std::uint8_t* buffer = heap_copy(bytes(1000, filler));
  std::uint32_t length = 1000;
  ASSERT_EQ(marshal(set, false, &buffer, &length), TEE_SUCCESS);
  EXPECT_EQ(bytes(buffer, buffer + length), every_type().marshal());
  TEE_Free(buffer);
}

TEST_F(MarshalTest, ACapacityOneByteShortCostsTheBufferItsLife) {
  const parameter_set set = in_ta(every_type());
  const auto before = ta.holdings();
  const std::uint32_t capacity = static_cast<std::uint32_t>(every_type().marshal().size()) - 1;
  for (const std::uint32_t given : {capacity, 4U, 3U, 0U}) {
    expect_failure(set, heap_copy(bytes(given)), given, TEE_ERROR_SHORT_BUFFER, "Too short marshalling buffer", before);
  }
}

TEST_F(MarshalTest, ABlobOfAnyLengthAtTheEndStaysInsideItsBuffer) {
  // Short blobs are those whose data area ends before the upper half of a 64-bit data reference. The address sanitizer
  // watches the end of the block.
  for (std::size_t size = 0; size < 32; ++size) {
    const param_list list = param_list{}.add(KM_TAG_KEY_SIZE, 1).add_blob(KM_TAG_NONCE, pattern(size));
    const parameter_set set = in_ta(list);
    EXPECT_EQ(allocated(set, true), list.marshal()) << size;
    std::uint8_t* buffer = heap_copy(list.marshal());
    std::uint32_t length = static_cast<std::uint32_t>(list.marshal().size());
    ASSERT_EQ(marshal(set, true, &buffer, &length), TEE_SUCCESS);
    EXPECT_EQ(bytes(buffer, buffer + length), list.marshal()) << size;
    TEE_Free(buffer);
  }
}

TEST_F(MarshalTest, AShortBlobDoesNotDamageTheRecordBehindIt) {
  for (std::size_t size = 0; size < 16; ++size) {
    const param_list list =
        param_list{}.add_blob(KM_TAG_NONCE, pattern(size)).add_blob(KM_TAG_ASSOCIATED_DATA, pattern(3, 2));
    EXPECT_EQ(allocated(in_ta(list), true), list.marshal()) << size;
  }
}

TEST_F(MarshalTest, NoHeapAddressLeavesTheTa) {
  const param_list list = every_type().add_blob(KM_TAG_APPLICATION_ID, pattern(16));
  const parameter_set set = in_ta(list);
  const bytes written = allocated(set, true);
  for (const keymaster_key_param_t& param : records(set)) {
    if (!tag_has_blob(param.tag)) continue;
    EXPECT_FALSE(contains(written, u64(param.blob.data_slot)));
    EXPECT_FALSE(contains(written, u32(static_cast<std::uint32_t>(param.blob.data_slot))));
  }
}

TEST_F(MarshalTest, ABlobWithoutDataIsInvalidAtAnyLength) {
  for (const std::uint32_t claimed : {0U, 1U, 12U, 100U}) {
    parameter_set set = in_ta(param_list{}.add(KM_TAG_KEY_SIZE, 1).add_blob(KM_TAG_NONCE, {}).add(KM_TAG_DIGEST, 1));
    keymaster_free_param_array(set.params, set.length);
    set.params[1].blob.data_length = claimed;
    const auto before = ta.holdings();
    expect_failure(set, nullptr, 0, TEE_ERROR_BAD_PARAMETERS, "Invalid keymaster_key_param_set_t", before);

    // A buffer that was given stays its owner's, although marshal lets go of the pointer.
    std::uint8_t* const given = heap_copy(bytes(500));
    expect_failure(set, given, 500, TEE_ERROR_BAD_PARAMETERS, "Invalid keymaster_key_param_set_t", ta.holdings());
    TEE_Free(given);
  }
}

TEST_F(MarshalTest, AHiddenBlobWithoutDataDoesNotMatterToTheClient) {
  parameter_set set = in_ta(param_list{}.add_blob(KM_TAG_APPLICATION_ID, {}));
  keymaster_free_param_array(set.params, set.length);
  EXPECT_EQ(to_hex(allocated(set, false)), "00000000");
}

TEST_F(MarshalTest, AnExhaustedHeapIsTold) {
  const parameter_set set = in_ta(every_type());
  ta.faults().fail_allocation(1);
  expect_failure(set, nullptr, 0, TEE_ERROR_OUT_OF_MEMORY, "Out of memory, need 259B", ta.holdings());
}

TEST_F(MarshalTest, ASizeThatDoesNotFitIn32BitsIsNotTakenForASmallOne) {
  // Lengths that no set on the heap can have, yet 28 + 0xFFFFFFF0 wraps to 12.
  parameter_set set = in_ta(param_list{}.add_blob(KM_TAG_NONCE, {}));
  set.params[0].blob.data_length = 0xFFFFFFF0;
  EXPECT_EQ(marshal_size(set, true), 0xFFFFFFFF);
  expect_failure(set, nullptr, 0, TEE_ERROR_OUT_OF_MEMORY, "Out of memory, need -1B", ta.holdings());
  set.params[0].blob.data_length = 0;
}

}  // namespace
