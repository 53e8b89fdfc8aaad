// The data that nothing reads, and how the key and the data are fetched.
#include "tests/companions/provisioning/provisioning_fixture.h"

using namespace keymaster;
using namespace keymaster::provisioning;

namespace testing_support {
namespace {

using DataTest = ProvisioningTest;

TEST_F(DataTest, ComesBackAtEveryLengthItMayHave) {
  for (const std::size_t size : {std::size_t{0}, std::size_t{1}, std::size_t{512}, std::size_t{QUIL_KEY_CAPACITY}}) {
    SCOPED_TRACE(size);
    const bytes data = pattern(size);
    const hosted_tee::accounting before = holdings();
    ASSERT_EQ(put_data(data), TEE_SUCCESS);
    const quil_answer answer = get_data();
    EXPECT_EQ(answer.result, TEE_SUCCESS);
    EXPECT_EQ(answer.data(), data);
    EXPECT_EQ(answer.length, size);
    EXPECT_EQ(stored("quil.data"), data);
    expect_same_holdings(before);
  }
}

TEST_F(DataTest, OutlivesAReboot) {
  ASSERT_EQ(put_data(pattern(100)), TEE_SUCCESS);
  restart();
  EXPECT_EQ(get_data().data(), pattern(100));
}

TEST_F(DataTest, AboveItsLimitIsRefusedAndTheOldDataStays) {
  ASSERT_EQ(put_data(pattern(100)), TEE_SUCCESS);
  expect_refused(TEE_ERROR_BAD_PARAMETERS, {"The data is too long\n"},
                 [&] { return put_data(pattern(QUIL_KEY_CAPACITY + 1)); });
  EXPECT_EQ(get_data().data(), pattern(100));
}

TEST_F(DataTest, IsStoredAsItWasTakenThoughTheClientWritesMeanwhile) {
  bytes shared = pattern(64);
  TEE_Param params[4] = {memory_slot(shared)};
  faults().observe_calls([&](std::uint32_t, std::string_view name) {
    if (name == "TEE_CreatePersistentObject") shared.assign(shared.size(), 0xFF);
  });
  ASSERT_EQ(invoke(COMMAND_PUT_DATA, 0x0005, params), TEE_SUCCESS);
  faults().observe_calls({});
  EXPECT_EQ(get_data().data(), pattern(64));
}

TEST_F(DataTest, WhatIsNotThereIsNotFound) {
  const auto not_found = [&](auto fetch) {
    const quil_answer answer = fetch();
    EXPECT_EQ(answer.buffer, bytes(answer.buffer.size(), canary));
    EXPECT_EQ(answer.length, 0U);
    return answer.result;
  };
  expect_refused(TEE_ERROR_ITEM_NOT_FOUND, {}, [&] { return not_found([&] { return get_key(); }); });
  expect_refused(TEE_ERROR_ITEM_NOT_FOUND, {}, [&] { return not_found([&] { return get_data(); }); });
}

TEST_F(DataTest, KeyAndDataAreObjectsOfTheirOwn) {
  const bytes box = attestation_key_box(rsa_test_key::of_bits(1024).components());
  ASSERT_EQ(put_data(pattern(30)), TEE_SUCCESS);
  EXPECT_EQ(get_key().result, TEE_ERROR_ITEM_NOT_FOUND);
  ASSERT_EQ(put_key(box), TEE_SUCCESS);
  EXPECT_EQ(get_key().data(), box);
  EXPECT_EQ(get_data().data(), pattern(30));
}

TEST_F(DataTest, ABufferThatIsTooSmallStaysUntouchedAndLearnsTheSize) {
  const bytes box = attestation_key_box(rsa_test_key::of_bits(1024).components());
  const auto needed = static_cast<std::uint32_t>(box.size());
  ASSERT_EQ(put_key(box), TEE_SUCCESS);
  for (const std::uint32_t capacity : {0U, 1U, needed - 1}) {
    SCOPED_TRACE(capacity);
    quil_answer answer;
    expect_refused(TEE_ERROR_SHORT_BUFFER, {"The answer needs " + std::to_string(needed) + " bytes\n"},
                   [&] { return (answer = get_key(capacity)).result; });
    EXPECT_EQ(answer.size, needed);
    EXPECT_EQ(answer.length, needed);
    EXPECT_EQ(answer.buffer, bytes(capacity, canary));
  }
  EXPECT_EQ(get_key(needed).data(), box);
}

TEST_F(DataTest, ANullBufferHasNoRoomWhateverItsSize) {
  ASSERT_EQ(put_data(pattern(30)), TEE_SUCCESS);
  TEE_Param params[4] = {};
  params[0].memref = {nullptr, 8192};
  EXPECT_EQ(invoke_as_keymaster(QUIL_COMMAND_GET_DATA, 0x0026, params), TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(params[0].memref.size, 30U);
}

TEST_F(DataTest, TheRoomBehindTheAnswerStaysAsItWas) {
  ASSERT_EQ(put_data(pattern(30)), TEE_SUCCESS);
  const quil_answer answer = get_data(40);
  EXPECT_EQ(answer.buffer, join({pattern(30), bytes(10, canary)}));
}

}  // namespace
}  // namespace testing_support
