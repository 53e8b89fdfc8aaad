// Fingers come, are listed, and go; a finger id never comes back.
#include "tests/companions/fingerprint/fingerprint_fixture.h"

using namespace keymaster::fingerprint;

namespace testing_support {
namespace {

constexpr std::uint64_t alice = 0x1122334455667788, bob = 0xFFEEDDCCBBAA9988;

TEST_F(FingerprintTest, ADeviceBeginsWithoutFingers) {
  const list_answer got = list(0);
  EXPECT_EQ(got.result, TEE_SUCCESS);
  EXPECT_EQ(got.size, 0U);
  EXPECT_EQ(stored("fp.templates"), std::nullopt);
}

TEST_F(FingerprintTest, FingersAreListedInTheOrderOfEnrolment) {
  const std::uint32_t first = must_enrol(bob), second = must_enrol(alice), third = must_enrol(bob);
  EXPECT_EQ(listed(), join({record(first, bob), record(second, alice), record(third, bob)}));
  EXPECT_EQ(std::vector({first, second, third}), std::vector({1U, 2U, 3U}));
}

TEST_F(FingerprintTest, TheListIsStoredBehindTheHighestIdGiven) {
  must_enrol(alice);
  must_enrol(bob);
  ASSERT_EQ(remove(2), TEE_SUCCESS);
  EXPECT_EQ(stored("fp.templates"), join({u32(2), record(1, alice)}));
}

TEST_F(FingerprintTest, RemovingClosesTheGapAndKeepsTheOrder) {
  for (int i = 0; i < 4; ++i) must_enrol(alice + static_cast<unsigned>(i));
  EXPECT_EQ(remove(2), TEE_SUCCESS);
  EXPECT_EQ(listed(), join({record(1, alice), record(3, alice + 2), record(4, alice + 3)}));
  EXPECT_EQ(remove(4), TEE_SUCCESS);
  EXPECT_EQ(remove(1), TEE_SUCCESS);
  EXPECT_EQ(listed(), record(3, alice + 2));
}

TEST_F(FingerprintTest, ARemovedFingerGetsANewIdWhenItIsEnrolledAgain) {
  const std::uint32_t once = must_enrol(alice);
  ASSERT_EQ(remove(once), TEE_SUCCESS);
  const std::uint32_t again = must_enrol(alice);
  EXPECT_NE(again, once);
  EXPECT_EQ(listed(), record(again, alice));
  expect_refused(TEE_ERROR_ITEM_NOT_FOUND, {"No finger 1\n"}, [&] { return touch(once).result; });
}

TEST_F(FingerprintTest, IdsAreNotReusedAfterARestartWithoutFingers) {
  must_enrol(alice);
  must_enrol(alice);
  ASSERT_EQ(remove(1), TEE_SUCCESS);
  ASSERT_EQ(remove(2), TEE_SUCCESS);
  restart();
  EXPECT_EQ(listed(), bytes{});
  EXPECT_EQ(must_enrol(alice), 3U);
}

TEST_F(FingerprintTest, FingersOutliveARestart) {
  must_enrol(alice);
  must_enrol(bob);
  restart();
  EXPECT_EQ(listed(), join({record(1, alice), record(2, bob)}));
}

TEST_F(FingerprintTest, WhatIsNotThereCannotBeRemoved) {
  must_enrol(alice);
  expect_refused(TEE_ERROR_ITEM_NOT_FOUND, {"No finger 2\n"}, [&] { return remove(2); });
  expect_refused(TEE_ERROR_ITEM_NOT_FOUND, {"No finger 0\n"}, [&] { return remove(0); });
  ASSERT_EQ(remove(1), TEE_SUCCESS);
  expect_refused(TEE_ERROR_ITEM_NOT_FOUND, {"No finger 1\n"}, [&] { return remove(1); });
}

TEST_F(FingerprintTest, NobodyHasNoFingers) {
  expect_refused(TEE_ERROR_BAD_PARAMETERS, {"A finger is somebody's\n"}, [&] { return enrol(0).result; });
  EXPECT_EQ(enrol(1).result, TEE_SUCCESS);
  EXPECT_EQ(enrol(std::uint64_t{1} << 32).result, TEE_SUCCESS);
}

TEST_F(FingerprintTest, ThirtyTwoFingersAreAllThereIsRoomFor) {
  bytes all;
  for (std::uint32_t i = 1; i <= 32; ++i) {
    ASSERT_EQ(must_enrol(alice + i), i);
    all = join({all, record(i, alice + i)});
  }
  expect_refused(TEE_ERROR_OVERFLOW, {"No room for another finger\n"}, [&] { return enrol(bob).result; });
  EXPECT_EQ(listed(), all);
  ASSERT_EQ(remove(7), TEE_SUCCESS);
  EXPECT_EQ(must_enrol(bob), 33U);
  EXPECT_EQ(enrol(bob).result, TEE_ERROR_OVERFLOW);
}

TEST_F(FingerprintTest, TheLastFingerIdIsTheOneBeforeTheIdOfNoFinger) {
  store("fp.templates", join({u32(0xFFFFFFFD), record(9, alice)}));
  EXPECT_EQ(must_enrol(bob), 0xFFFFFFFE);
  expect_refused(TEE_ERROR_OVERFLOW, {"No room for another finger\n"}, [&] { return enrol(bob).result; });
  EXPECT_EQ(listed(), join({record(9, alice), record(0xFFFFFFFE, bob)}));
}

TEST_F(FingerprintTest, AListThatIsNoneIsRefusedAndKept) {
  const std::vector<bytes> broken = {{}, bytes(3), bytes(15), bytes(17), bytes(4 + 33 * 12)};
  for (const bytes& content : broken) {
    SCOPED_TRACE(content.size());
    store("fp.templates", content);
    const std::size_t read = std::min<std::size_t>(content.size(), 4 + 32 * 12 + 1);  // as far as it is read
    const std::vector<std::string> line = {"The stored list of fingers has " + std::to_string(read) + " bytes\n"};
    expect_refused(TEE_ERROR_BAD_STATE, line, [&] { return enrol(alice).result; });
    expect_refused(TEE_ERROR_BAD_STATE, line, [&] { return remove(1); });
    expect_refused(TEE_ERROR_BAD_STATE, line, [&] { return touch(1).result; });
    expect_refused(TEE_ERROR_BAD_STATE, line, [&] { return list().result; });
  }
}

}  // namespace
}  // namespace testing_support
