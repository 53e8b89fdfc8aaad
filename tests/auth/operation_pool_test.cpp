// The table of live operations. Handles are random; here the test decides what is drawn.
#include "auth/operation_pool.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <deque>
#include <random>

#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

std::deque<std::uint32_t> drawn_next;  // what the random source gives, in order; afterwards a seeded generator
std::mt19937 afterwards(1);
std::uint32_t draws = 0;

}  // namespace

// The program's own definition goes before the hosted TEE's.
void TEE_GenerateRandom(void* randomBuffer, uint32_t randomBufferLen) {
  ++draws;
  ASSERT_EQ(randomBufferLen, sizeof(std::uint32_t)) << "a handle is drawn as four bytes";
  std::uint32_t value = static_cast<std::uint32_t>(afterwards());
  if (!drawn_next.empty()) {
    value = drawn_next.front();
    drawn_next.pop_front();
  }
  std::memcpy(randomBuffer, &value, sizeof value);
}

namespace {

struct added {
  std::uint32_t handle = 0xDEADBEEF;
  keymaster_error_t error = static_cast<keymaster_error_t>(77);
};

class OperationPoolTest : public TaUnitTest {
 protected:
  void SetUp() override {
    drawn_next.clear();
    draws = 0;
    ASSERT_EQ(operation_pool_init(), TEE_SUCCESS);
  }

  static added add(keymaster_operation_t& operation) {
    added a;
    EXPECT_EQ(operation_pool_add(&operation, &a.handle, &a.error), TEE_SUCCESS);
    return a;
  }

  /// add with the handle to be drawn.
  static std::uint32_t add_as(keymaster_operation_t& operation, std::uint32_t handle) {
    drawn_next = {handle};
    const added a = add(operation);
    EXPECT_EQ(a.error, KM_ERROR_OK);
    EXPECT_EQ(a.handle, handle);
    return a.handle;
  }

  std::array<keymaster_operation_t, operation_pool_size + 1> operations = {};
};

TEST_F(OperationPoolTest, AnOperationIsFoundUnderItsHandle) {
  const added a = add(operations[0]), b = add(operations[1]);
  EXPECT_EQ(a.error, KM_ERROR_OK);
  EXPECT_NE(a.handle, 0U);
  EXPECT_NE(a.handle, b.handle);
  EXPECT_EQ(operation_pool_get(a.handle), &operations[0]);
  EXPECT_EQ(operation_pool_get(b.handle), &operations[1]);
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(OperationPoolTest, TheDrawnBytesAreTheHandle) {
  drawn_next = {0x80000001};
  EXPECT_EQ(add(operations[0]).handle, 0x80000001U);
  EXPECT_EQ(draws, 1U);
}

TEST_F(OperationPoolTest, AnUnknownHandleIsNotFound) {
  (void)add_as(operations[0], 5);
  EXPECT_EQ(operation_pool_get(6), nullptr);
  EXPECT_THAT(ta.errors(), ElementsAre("Operation handle not found"));
}

TEST_F(OperationPoolTest, HandleZeroIsNeverFoundNotEvenInFreeSlots) {
  EXPECT_EQ(operation_pool_get(0), nullptr);
  (void)add(operations[0]);
  EXPECT_EQ(operation_pool_get(0), nullptr);
  operation_pool_remove(0);
  EXPECT_THAT(ta.errors(), ElementsAre("Operation handle not found", "Operation handle not found",
                                       "Try to free invalid operation handle"));
}

TEST_F(OperationPoolTest, ZeroIsDrawnAgain) {
  drawn_next = {0, 0, 0, 9};
  EXPECT_EQ(add(operations[0]).handle, 9U);
  EXPECT_EQ(draws, 4U);
}

TEST_F(OperationPoolTest, AHandleInUseIsDrawnAgain) {
  (void)add_as(operations[0], 5);
  (void)add_as(operations[1], 6);
  drawn_next = {6, 5, 6, 7};
  EXPECT_EQ(add(operations[2]).handle, 7U);
  EXPECT_EQ(operation_pool_get(5), &operations[0]);
  EXPECT_EQ(operation_pool_get(6), &operations[1]);
}

TEST_F(OperationPoolTest, AFreeSlotRemembersItsHandleUntilItIsGivenAnother) {
  (void)add_as(operations[0], 5);
  (void)add_as(operations[1], 6);
  operation_pool_remove(5);
  operation_pool_remove(6);
  drawn_next = {6, 5, 7};
  EXPECT_EQ(add(operations[2]).handle, 7U) << "takes slot 0, which forgets 5";
  drawn_next = {6, 7, 5};
  EXPECT_EQ(add(operations[3]).handle, 5U) << "slot 1 still remembered 6";
}

TEST_F(OperationPoolTest, AllSixteenSlotsAreCompared) {
  std::deque<std::uint32_t> all;
  for (std::uint32_t i = 0; i < operation_pool_size; ++i) all.push_back(add_as(operations[i], 100 + i));
  for (const std::uint32_t handle : all) operation_pool_remove(handle);
  drawn_next = all;
  drawn_next.push_back(999);
  EXPECT_EQ(add(operations[0]).handle, 999U);
  EXPECT_EQ(draws, operation_pool_size + 17);
}

TEST_F(OperationPoolTest, TheLowestFreeSlotIsTaken) {
  // Slot 1 is freed after slot 3, and taken first: what slot 3 remembers still counts, what slot 1 remembers does not.
  for (std::uint32_t i = 0; i < 5; ++i) (void)add_as(operations[i], 10 + i);
  operation_pool_remove(13);
  operation_pool_remove(11);
  (void)add_as(operations[5], 50);
  (void)add_as(operations[6], 11);  // refused and drawn again if a slot still remembered it
  drawn_next = {13, 14, 60};
  EXPECT_EQ(add(operations[7]).handle, 13U) << "slot 3 was taken by the second, which forgot 13";
}

TEST_F(OperationPoolTest, TheSeventeenthOperationIsOneTooMany) {
  for (std::uint32_t i = 0; i < operation_pool_size; ++i) ASSERT_EQ(add(operations[i]).error, KM_ERROR_OK);
  const std::uint32_t before = draws;
  const added refused = add(operations[16]);
  EXPECT_EQ(refused.error, KM_ERROR_TOO_MANY_OPERATIONS);
  EXPECT_EQ(refused.handle, 0U);
  EXPECT_EQ(draws, before) << "no handle is drawn for it";
  EXPECT_THAT(ta.errors(), ElementsAre("Too many operations"));
}

TEST_F(OperationPoolTest, AFreedSlotMakesRoom) {
  for (std::uint32_t i = 0; i < operation_pool_size; ++i) (void)add_as(operations[i], 100 + i);
  operation_pool_remove(107);
  const added a = add(operations[16]);
  EXPECT_EQ(a.error, KM_ERROR_OK);
  EXPECT_EQ(operation_pool_get(a.handle), &operations[16]);
  for (std::uint32_t i = 0; i < operation_pool_size; ++i) {
    if (i != 7) {
      EXPECT_EQ(operation_pool_get(100 + i), &operations[i]);
    }
  }
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(OperationPoolTest, ARemovedHandleIsNotFoundAndNotRemovedAgain) {
  (void)add_as(operations[0], 5);
  (void)add_as(operations[1], 6);
  operation_pool_remove(5);
  EXPECT_THAT(ta.errors(), IsEmpty());
  EXPECT_EQ(operation_pool_get(5), nullptr);
  operation_pool_remove(5);
  EXPECT_THAT(ta.errors(), ElementsAre("Operation handle not found", "Try to free invalid operation handle"));
  EXPECT_EQ(operation_pool_get(6), &operations[1]);
}

TEST_F(OperationPoolTest, InitEmptiesThePoolAndForgetsItsHandles) {
  for (std::uint32_t i = 0; i < operation_pool_size; ++i) (void)add_as(operations[i], 100 + i);
  ASSERT_EQ(operation_pool_init(), TEE_SUCCESS);
  EXPECT_EQ(operation_pool_get(100), nullptr);
  for (std::uint32_t i = 0; i < operation_pool_size; ++i) (void)add_as(operations[i], 100 + i);
}

TEST_F(OperationPoolTest, ThePoolOwnsNothing) {
  // Neither the record nor its authorization set is touched when a slot is freed.
  operations[0].authorization_set = in_ta(param_list{}.add(KM_TAG_KEY_SIZE, 1)).release();
  operations[0].free = [](keymaster_operation_t*) { FAIL() << "the pool released an operation"; };
  operation_pool_remove(add(operations[0]).handle);
  EXPECT_EQ(operations[0].authorization_set.length, 1U);
  EXPECT_NE(operations[0].authorization_set.params, nullptr);
  keymaster_free_param_set(&operations[0].authorization_set);
}

TEST_F(OperationPoolTest, NoHandleIsGivenOutThatASlotRemembers) {
  // Only 24 different values are drawn, so that refusals are the rule.
  std::mt19937 random(99);
  std::array<std::uint32_t, operation_pool_size> in_use = {};
  std::array<std::uint32_t, operation_pool_size> remembered = {};
  for (int round = 0; round < 20000; ++round) {
    const std::size_t slot = random() % operation_pool_size;
    if (in_use[slot] != 0) {
      operation_pool_remove(in_use[slot]);
      in_use[slot] = 0;
      continue;
    }
    drawn_next.clear();
    for (int i = 0; i < 100; ++i) drawn_next.push_back(static_cast<std::uint32_t>(random() % 24));
    const std::uint32_t handle = add(operations[0]).handle;
    const auto lowest = std::find(in_use.begin(), in_use.end(), 0U);
    ASSERT_NE(handle, 0U);
    ASSERT_EQ(std::count(remembered.begin(), remembered.end(), handle), 0);
    *lowest = handle;
    remembered[static_cast<std::size_t>(lowest - in_use.begin())] = handle;
  }
}

}  // namespace
