// The counter: it grows by one, lives in storage, and is stored before it is told.
#include "soter/soter_counter.h"

#include "tests/soter/soter_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

using hosted_tee::trace_level;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class SoterCounterTest : public SoterTest {
 protected:
  TEE_Result next() {
    ta().clear_trace();
    counter = 99;
    const TEE_Result result = increase_and_get_counter(&counter);
    expect_same(ta().holdings(), {});
    return result;
  }
  [[nodiscard]] std::vector<std::string> info() { return ta().traced(trace_level::info); }

  std::uint64_t counter = 0;
};

TEST_F(SoterCounterTest, AFreshDeviceBeginsWithOne) {
  EXPECT_EQ(stored_counter(), std::nullopt);
  ASSERT_EQ(next(), TEE_SUCCESS);
  EXPECT_EQ(counter, 1U);
  EXPECT_EQ(stored_counter(), u64(1));
  EXPECT_THAT(info(), ElementsAre("No counter object, we need create one\n", "Create counter object success\n"));
  ASSERT_EQ(next(), TEE_SUCCESS);
  EXPECT_EQ(counter, 2U);
  EXPECT_EQ(stored_counter(), u64(2));
  EXPECT_THAT(info(), IsEmpty());
  EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(SoterCounterTest, TheStoredNumberIsLittleEndianAndOf64Bits) {
  store_counter(u64(0x01020304050607FF));
  ASSERT_EQ(next(), TEE_SUCCESS);
  EXPECT_EQ(counter, 0x0102030405060800U);
  EXPECT_EQ(stored_counter(), u64(0x0102030405060800));
  store_counter(bytes(8, 0xFF));
  ASSERT_EQ(next(), TEE_SUCCESS);
  EXPECT_EQ(counter, 0U);
}

TEST_F(SoterCounterTest, AnObjectOfFewerBytesIsABadState) {
  for (const std::size_t size : {0U, 4U, 7U}) {
    store_counter(bytes(size, 1));
    for (int i = 0; i < 2; ++i) {
      EXPECT_EQ(next(), TEE_ERROR_BAD_STATE);
      EXPECT_EQ(counter, 0U);
      EXPECT_EQ(errors(),
                std::vector<std::string>{"counter object is not 8 bytes, " + std::to_string(size) + " bytes\n"});
      EXPECT_EQ(stored_counter(), bytes(size, 1));
    }
  }
}

TEST_F(SoterCounterTest, OfALongerObjectTheFirst8BytesCount) {
  store_counter(join({u64(7), pattern(4)}));
  ASSERT_EQ(next(), TEE_SUCCESS);
  EXPECT_EQ(counter, 8U);
  EXPECT_EQ(stored_counter(), join({u64(8), pattern(4)}));
}

TEST_F(SoterCounterTest, AnOpenThatFailsOtherwiseIsABadParameter) {
  store_counter(u64(7));
  faults().fail_call("TEE_OpenPersistentObject", 1, TEE_ERROR_ACCESS_CONFLICT);
  EXPECT_EQ(next(), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(counter, 0U);
  EXPECT_THAT(errors(), IsEmpty());
  EXPECT_EQ(faults().call_count("TEE_ReadObjectData"), 0U);
  EXPECT_THAT(info(), IsEmpty());
  EXPECT_EQ(stored_counter(), u64(7));
}

TEST_F(SoterCounterTest, ACreationThatFailsIsFollowedByOneMoreOpen) {
  faults().fail_call("TEE_CreatePersistentObject", 1, TEE_ERROR_ACCESS_CONFLICT);
  EXPECT_EQ(next(), TEE_ERROR_ITEM_NOT_FOUND);
  EXPECT_EQ(counter, 0U);
  EXPECT_EQ(faults().call_count("TEE_OpenPersistentObject"), 2U);
  EXPECT_THAT(info(), ElementsAre("No counter object, we need create one\n", "retry to open counter object"));

  store_counter(u64(5));
  faults().clear();
  faults().fail_call("TEE_OpenPersistentObject", 1, TEE_ERROR_ITEM_NOT_FOUND);
  faults().fail_call("TEE_CreatePersistentObject", 1, TEE_ERROR_ACCESS_CONFLICT);
  EXPECT_EQ(next(), TEE_SUCCESS);
  EXPECT_EQ(counter, 6U);
}

TEST_F(SoterCounterTest, AnObjectThatWasThoughtAbsentIsNotReplaced) {
  store_counter(u64(5));
  faults().fail_call("TEE_OpenPersistentObject", 1, TEE_ERROR_ITEM_NOT_FOUND);
  EXPECT_EQ(next(), TEE_SUCCESS);
  EXPECT_EQ(counter, 6U);
  EXPECT_EQ(stored_counter(), u64(6));
  EXPECT_THAT(info(), ElementsAre("No counter object, we need create one\n", "retry to open counter object"));
}

TEST_F(SoterCounterTest, AReopenThatFailsIsTheResult) {
  faults().fail_call("TEE_CreatePersistentObject", 1, TEE_ERROR_ACCESS_CONFLICT);
  faults().fail_call("TEE_OpenPersistentObject", 2, TEE_ERROR_STORAGE_NOT_AVAILABLE);
  EXPECT_EQ(next(), TEE_ERROR_STORAGE_NOT_AVAILABLE);
  EXPECT_EQ(counter, 0U);
  EXPECT_EQ(faults().call_count("TEE_ReadObjectData"), 0U);
  EXPECT_THAT(info(), ElementsAre("No counter object, we need create one\n", "retry to open counter object"));
  EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(SoterCounterTest, OnlyAnAbsentObjectIsCreated) {
  for (const TEE_Result result : {TEE_ERROR_GENERIC, TEE_ERROR_ACCESS_DENIED, TEE_ERROR_CORRUPT_OBJECT,
                                  TEE_ERROR_STORAGE_NOT_AVAILABLE, TEE_ERROR_OUT_OF_MEMORY}) {
    faults().clear();
    faults().fail_call("TEE_OpenPersistentObject", 1, result);
    EXPECT_EQ(next(), TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(counter, 0U);
    EXPECT_EQ(faults().call_count("TEE_CreatePersistentObject"), 0U);
    EXPECT_EQ(faults().call_count("TEE_CloseObject"), 0U) << "there is nothing to close";
    EXPECT_THAT(info(), IsEmpty());
    EXPECT_EQ(stored_counter(), std::nullopt);
  }
}

TEST_F(SoterCounterTest, AReadThatComesShortIsABadState) {
  store_counter(u64(7));
  for (const std::uint32_t read : {0U, 5U}) {
    faults().clear();
    faults().override_output("TEE_ReadObjectData", 1, [&](std::uint32_t* length, TEE_Result&) { *length = read; });
    EXPECT_EQ(next(), TEE_ERROR_BAD_STATE);
    EXPECT_EQ(counter, 0U);
    EXPECT_EQ(errors(),
              std::vector<std::string>{"counter object is not 8 bytes, " + std::to_string(read) + " bytes\n"});
    EXPECT_EQ(stored_counter(), u64(7));
  }
}

TEST_F(SoterCounterTest, ACreatedObjectHoldsZeroUntilTheFirstIncrement) {
  faults().fail_call("TEE_WriteObjectData", 1, TEE_ERROR_STORAGE_NO_SPACE);
  EXPECT_EQ(next(), TEE_ERROR_STORAGE_NO_SPACE);
  EXPECT_EQ(counter, 0U);
  EXPECT_EQ(stored_counter(), u64(0));
  EXPECT_EQ(next(), TEE_SUCCESS);
  EXPECT_EQ(counter, 1U);
}

TEST_F(SoterCounterTest, AWriteThatIsDoneAndReportedAsFailedCostsAValue) {
  store_counter(u64(7));
  faults().override_output("TEE_WriteObjectData", 1,
                           [](std::uint32_t*, TEE_Result& result) { result = TEE_ERROR_GENERIC; });
  EXPECT_EQ(next(), TEE_ERROR_GENERIC);
  EXPECT_EQ(counter, 0U) << "8 is told to nobody";
  EXPECT_EQ(stored_counter(), u64(8));
  EXPECT_EQ(next(), TEE_SUCCESS);
  EXPECT_EQ(counter, 9U);
}

TEST_F(SoterCounterTest, WhatFailsBehindTheOpenIsTheResultAndMovesNothing) {
  store_counter(u64(7));
  for (const auto& [call, lines] :
       std::map<std::string, std::vector<std::string>>{{"TEE_ReadObjectData", {}},
                                                       {"TEE_SeekObjectData", {"seek pos to the beginning error\n"}},
                                                       {"TEE_WriteObjectData", {"write object error\n"}}}) {
    faults().clear();
    faults().fail_call(call, 1, TEE_ERROR_STORAGE_NO_SPACE);
    EXPECT_EQ(next(), TEE_ERROR_STORAGE_NO_SPACE);
    EXPECT_EQ(counter, 0U);
    EXPECT_EQ(errors(), lines);
    EXPECT_EQ(stored_counter(), u64(7));
  }
}

}  // namespace
}  // namespace testing_support
