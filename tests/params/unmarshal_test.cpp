// Reading the byte form of parameter sets, which comes from a hostile client.
#include <random>

#include "params/marshal.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

class UnmarshalTest : public TaUnitTest {
 protected:
  /// Unmarshals from a heap block of exactly the input's size, so that the address sanitizer sees every overrun.
  TEE_Result read(const bytes& input, parameter_set& set) {
    ta.clear_trace();
    const std::vector<std::uint8_t> exact(input);
    return unmarshal(exact, &set);
  }

  /// A refused input leaves an empty set, one error line and nothing on the heap.
  void expect_refused(const bytes& input, TEE_Result result, const std::string& line) {
    const auto before = ta.holdings();
    parameter_set set;
    EXPECT_EQ(read(input, set), result);
    EXPECT_EQ(set.params, nullptr);
    EXPECT_EQ(set.length, 0U);
    EXPECT_THAT(ta.errors(), ElementsAre(line));
    expect_same(ta.holdings(), before);
  }
};

/// A record with all 24 bytes given: tag, gap, value or data reference, length slot.
bytes record(std::uint32_t tag, std::uint32_t gap, std::uint64_t value, std::uint64_t length) {
  return join({u32(tag), u32(gap), u64(value), u64(length)});
}

TEST_F(UnmarshalTest, EachTypeIsReadIntoItsField) {
  // Written out by hand: two records, then a blob's bytes, then a record again.
  const bytes input = from_hex(
      "04000000"
      "030000300000000000080000000000000000000000000000"
      "c80000500000000088776655443322110000000000000000"
      "e90300900000000000000000000000000500000000000000a1a2a3a4a5"
      "070000700000000002000000000000000000000000000000");
  parameter_set set;
  ASSERT_EQ(read(input, set), TEE_SUCCESS);
  ASSERT_EQ(set.length, 4U);
  EXPECT_EQ(set.params[0].tag, KM_TAG_KEY_SIZE);
  EXPECT_EQ(set.params[0].integer, 2048U);
  EXPECT_EQ(set.params[1].tag, KM_TAG_RSA_PUBLIC_EXPONENT);
  EXPECT_EQ(set.params[1].long_integer, 0x1122334455667788U);
  EXPECT_EQ(set.params[2].tag, KM_TAG_NONCE);
  EXPECT_EQ(set.params[2].blob.data_length, 5U);
  EXPECT_EQ(to_hex(blob_bytes(set.params[2])), "a1a2a3a4a5");
  EXPECT_EQ(set.params[3].tag, KM_TAG_CALLER_NONCE);
  EXPECT_EQ(set.params[3].boolean, 2U) << "a byte, whatever the client makes of it";
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(UnmarshalTest, AnEmptySetTakesNoMemory) {
  parameter_set set;
  ASSERT_EQ(read(u32(0), set), TEE_SUCCESS);
  EXPECT_EQ(set.params, nullptr);
  EXPECT_EQ(set.length, 0U);
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(UnmarshalTest, BytesBehindTheLastRecordAreIgnored) {
  const bytes input = param_list{}.add(KM_TAG_KEY_SIZE, 2048).add_blob(KM_TAG_NONCE, pattern(12)).marshal();
  for (const std::size_t surplus : {1U, 3U, 24U, 1000U}) {
    parameter_set set;
    ASSERT_EQ(read(join({input, pattern(surplus)}), set), TEE_SUCCESS);
    EXPECT_EQ(from_ta(set).marshal(), input);
  }
  parameter_set set;
  ASSERT_EQ(read(join({u32(0), pattern(30)}), set), TEE_SUCCESS);
  EXPECT_EQ(set.params, nullptr);
}

TEST_F(UnmarshalTest, TheUnusedPartsOfARecordAreCarried) {
  parameter_set set;
  ASSERT_EQ(read(join({u32(1), record(KM_TAG_KEY_SIZE, 0xCAFEBABE, 0x99999999'00000800, 0x1234567890)}), set), 0U);
  EXPECT_EQ(set.params[0].gap, 0xCAFEBABE);
  EXPECT_EQ(set.params[0].integer, 2048U);
  EXPECT_EQ(set.params[0].long_integer, 0x99999999'00000800U);
  std::uint8_t* buffer = nullptr;
  std::uint32_t length = 0;
  ASSERT_EQ(marshal(set, true, &buffer, &length), TEE_SUCCESS);
  EXPECT_EQ(bytes(buffer, buffer + length),
            join({u32(1), record(KM_TAG_KEY_SIZE, 0xCAFEBABE, 0x99999999'00000800, 0x1234567890)}));
  TEE_Free(buffer);
}

TEST_F(UnmarshalTest, ABlobIsACopyOnTheTasHeap) {
  bytes input = param_list{}.add_blob(KM_TAG_APPLICATION_ID, from_text("mine")).marshal();
  parameter_set set;
  ASSERT_EQ(unmarshal(input, &set), TEE_SUCCESS);
  std::fill(input.begin(), input.end(), std::uint8_t{0});
  EXPECT_EQ(from_ta(set).blob(KM_TAG_APPLICATION_ID), from_text("mine"));
  EXPECT_TRUE(ta.instance().heap.owns(set.params[0].blob.data));
}

TEST_F(UnmarshalTest, AZeroLengthBlobIsABlob) {
  parameter_set set;
  ASSERT_EQ(read(param_list{}.add_blob(KM_TAG_APPLICATION_DATA, {}).marshal(), set), TEE_SUCCESS);
  ASSERT_EQ(set.length, 1U);
  EXPECT_NE(set.params[0].blob.data, nullptr);
  EXPECT_EQ(set.params[0].blob.data_length, 0U);
}

TEST_F(UnmarshalTest, OnlyTheLow32BitsOfALengthCount) {
  parameter_set set;
  ASSERT_EQ(read(join({u32(1), record(KM_TAG_NONCE, 0, 0, 0xFFFFFFFF'00000003), from_hex("0a0b0c")}), set), 0U);
  EXPECT_EQ(to_hex(blob_bytes(set.params[0])), "0a0b0c");
}

TEST_F(UnmarshalTest, TheClientsDataReferenceIsNeitherUsedNorKept) {
  parameter_set set;
  ASSERT_EQ(read(join({u32(1), record(KM_TAG_NONCE, 0, 0x4141414141414141, 2), from_hex("0102")}), set), 0U);
  EXPECT_NE(set.params[0].blob.data_slot, 0x4141414141414141U);
  set.reset();
  // Where the blob can't be had, nothing may take the reference for a block to free.
  ta.faults().fail_allocation(2);
  expect_refused(join({u32(1), record(KM_TAG_NONCE, 0, 0x4141414141414141, 2), from_hex("0102")}),
                 TEE_ERROR_OUT_OF_MEMORY, "Out of memory, require 2B");
}

TEST_F(UnmarshalTest, WithoutAnOutputSetNothingIsRead) {
  EXPECT_EQ(unmarshal(param_list{}.add(KM_TAG_KEY_SIZE).marshal(), nullptr), TEE_ERROR_SHORT_BUFFER);
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(UnmarshalTest, EveryTruncationIsTooShort) {
  const bytes whole = param_list{}
                          .add(KM_TAG_KEY_SIZE, 2048)
                          .add_blob(KM_TAG_APPLICATION_ID, pattern(9))
                          .add_blob(KM_BIGNUM | 3, pattern(30))
                          .add(KM_TAG_DIGEST, KM_DIGEST_SHA1)
                          .marshal();
  for (std::size_t size = 0; size < whole.size(); ++size) {
    SCOPED_TRACE(size);
    expect_refused({whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size)}, TEE_ERROR_GENERIC,
                   "Too short input");
  }
}

TEST_F(UnmarshalTest, ACountThatNoHeapCanHoldIsWantOfMemoryWhateverTheInput) {
  // 0x0AAAAAAB * 24 is 8 modulo 2^32; 21846 records are more than the whole heap.
  for (const std::uint32_t count : {21846U, 0x0AAAAAAAU, 0x0AAAAAABU, 0x15555556U, 0x80000000U, 0xFFFFFFFFU}) {
    SCOPED_TRACE(count);
    expect_refused(u32(count), TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
    expect_refused(join({u32(count), record(KM_TAG_KEY_SIZE, 0, 1, 0)}), TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  }
}

TEST_F(UnmarshalTest, ACountThatFitsTheHeapButNotTheInputIsTooShort) {
  expect_refused(u32(1), TEE_ERROR_GENERIC, "Too short input");
  expect_refused(join({u32(20000), record(KM_TAG_KEY_SIZE, 0, 1, 0)}), TEE_ERROR_GENERIC, "Too short input");
}

TEST_F(UnmarshalTest, ABlobIsAllocatedBeforeItsLengthIsComparedWithTheInput) {
  expect_refused(join({u32(1), record(KM_TAG_NONCE, 0, 0, 0x7FFFFFFF)}), TEE_ERROR_OUT_OF_MEMORY,
                 "Out of memory, require 2147483647B");
  expect_refused(join({u32(1), record(KM_TAG_NONCE, 0, 0, 0x80000000)}), TEE_ERROR_OUT_OF_MEMORY,
                 "Out of memory, require -2147483648B");
  expect_refused(join({u32(1), record(KM_BIGNUM | 1, 0, 0, 0xFFFFFFFF)}), TEE_ERROR_OUT_OF_MEMORY,
                 "Out of memory, require -1B");
  expect_refused(join({u32(1), record(KM_TAG_NONCE, 0, 0, 600 * 1024)}), TEE_ERROR_OUT_OF_MEMORY,
                 "Out of memory, require 614400B");
  expect_refused(join({u32(1), record(KM_TAG_NONCE, 0, 0, 400 * 1024)}), TEE_ERROR_GENERIC, "Too short input");
}

TEST_F(UnmarshalTest, EachFailedAllocationGivesBackWhatWasRead) {
  const bytes input = param_list{}
                          .add_blob(KM_TAG_APPLICATION_ID, pattern(9))
                          .add(KM_TAG_KEY_SIZE, 256)
                          .add_blob(KM_TAG_NONCE, pattern(12))
                          .marshal();
  ta.faults().fail_allocation(1);
  expect_refused(input, TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  ta.faults().fail_allocation(2);
  expect_refused(input, TEE_ERROR_OUT_OF_MEMORY, "Out of memory, require 9B");
  ta.faults().fail_allocation(3);
  expect_refused(input, TEE_ERROR_OUT_OF_MEMORY, "Out of memory, require 12B");
}

TEST_F(UnmarshalTest, AStaleSetIsReplacedAndNotAddedTo) {
  keymaster_key_param_set_t set = {nullptr, 11};
  ASSERT_EQ(unmarshal(param_list{}.add(KM_TAG_KEY_SIZE, 1).marshal(), &set), TEE_SUCCESS);
  EXPECT_EQ(set.length, 1U);
  keymaster_free_param_set(&set);
  set.length = 11;
  EXPECT_EQ(unmarshal(bytes{}, &set), TEE_ERROR_GENERIC);
  EXPECT_EQ(set.params, nullptr);
  EXPECT_EQ(set.length, 0U);
}

TEST_F(UnmarshalTest, DamagedInputNeverLeavesAnythingBehind) {
  const bytes whole = param_list{}
                          .add(KM_TAG_KEY_SIZE, 2048)
                          .add_blob(KM_TAG_APPLICATION_ID, pattern(9))
                          .add_blob(KM_BIGNUM | 3, pattern(30))
                          .add(KM_TAG_DIGEST, KM_DIGEST_SHA1)
                          .marshal();
  std::mt19937 random(20231114);
  std::size_t refused = 0;
  for (int round = 0; round < 5000; ++round) {
    bytes input = whole;
    for (std::uint32_t flips = random() % 4 + 1; flips != 0; --flips) {
      input[random() % input.size()] = static_cast<std::uint8_t>(random());
    }
    input.resize(random() % (input.size() + 1));
    parameter_set set;
    const TEE_Result result = read(input, set);
    if (result == TEE_SUCCESS) continue;
    ++refused;
    EXPECT_TRUE(result == TEE_ERROR_GENERIC || result == TEE_ERROR_OUT_OF_MEMORY) << to_hex(input);
    EXPECT_EQ(set.params, nullptr) << to_hex(input);
    expect_same(ta.holdings(), {});
  }
  EXPECT_GT(refused, 1000U);
}

}  // namespace
