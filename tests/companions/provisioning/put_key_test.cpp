// The attestation key that a factory brings along.
#include "tests/companions/provisioning/provisioning_fixture.h"
#include "tests/companions/provisioning/reference_box.h"

using namespace keymaster;
using namespace keymaster::provisioning;

namespace testing_support {
namespace {

const rsa_components& fixed_key() {
  return rsa_test_key::of_bits(2048).components();
}

/// All entries of the fixed key's box but the one of `missing`.
bytes box_without(std::uint16_t missing) {
  bytes box;
  for (const auto& [tag, value] : box_entries(attestation_key_box(fixed_key()))) {
    if (tag != missing) box = join({box, tlv(tag, value)});
  }
  return box;
}

class PutKeyTest : public ProvisioningTest {
 protected:
  void SetUp() override { ASSERT_EQ(put_key(old_box), TEE_SUCCESS); }

  /// expect_no_box puts bytes that are no key, and expects that the old key stays.
  void expect_no_box(const bytes& box) {
    SCOPED_TRACE(to_hex(box).substr(0, 40));
    expect_refused(TEE_ERROR_BAD_FORMAT, {"Not the box of a key\n"}, [&] { return put_key(box); });
    EXPECT_EQ(get_key().data(), old_box);
  }

  const bytes old_box = attestation_key_box(rsa_test_key::of_bits(1024).components());
};

TEST_F(PutKeyTest, AKeyComesBackByteForByteWithItsLengthInBothPlaces) {
  const bytes box = attestation_key_box(fixed_key());
  const hosted_tee::accounting before = holdings();
  ASSERT_EQ(put_key(box), TEE_SUCCESS);
  const quil_answer answer = get_key();
  EXPECT_EQ(answer.result, TEE_SUCCESS);
  EXPECT_EQ(answer.data(), box);
  EXPECT_EQ(answer.length, box.size());
  EXPECT_EQ(stored("quil.key"), box);
  expect_same_holdings(before);
}

TEST_F(PutKeyTest, AKeyMayHaveItsFirstThreeComponentsAlone) {
  const bytes box = attestation_key_box(fixed_key(), 3);
  ASSERT_EQ(put_key(box), TEE_SUCCESS);
  EXPECT_EQ(get_key().data(), box);
}

TEST_F(PutKeyTest, TheOrderOfEntriesIsFreeAndOthersMayStandAmongThem) {
  bytes box = tlv(0x1835, from_text("whatever"));
  for (const auto& [tag, value] : box_entries(attestation_key_box(fixed_key()))) box = join({tlv(tag, value), box});
  ASSERT_EQ(put_key(box), TEE_SUCCESS);
  EXPECT_EQ(get_key().data(), box);
}

TEST_F(PutKeyTest, ASecondKeyReplacesTheFirstAlsoWhenItIsShorter) {
  ASSERT_EQ(put_key(attestation_key_box(fixed_key())), TEE_SUCCESS);
  const bytes shorter = attestation_key_box(fixed_key(), 3);
  ASSERT_EQ(put_key(shorter), TEE_SUCCESS);
  EXPECT_EQ(get_key().data(), shorter);
}

TEST_F(PutKeyTest, AKeyOutlivesAReboot) {
  restart();
  EXPECT_EQ(get_key().data(), old_box);
  EXPECT_EQ(status(), STATUS_KEY);
}

TEST_F(PutKeyTest, NoBytesAreNoKey) {
  expect_no_box({});
}

TEST_F(PutKeyTest, ABoxThatEndsAnywhereWithinAnEntryIsNone) {
  const bytes box = attestation_key_box(fixed_key());
  const std::size_t last_entry = box.size() - 4 - fixed_key()[rsa_qinv].size();
  for (const std::size_t size : {std::size_t{1}, std::size_t{2}, std::size_t{3}, std::size_t{4}, last_entry + 1,
                                 last_entry + 2, last_entry + 3, last_entry + 4, box.size() - 1}) {
    expect_no_box({box.begin(), box.begin() + static_cast<std::ptrdiff_t>(size)});
  }
}

TEST_F(PutKeyTest, BytesBehindTheLastEntryMakeNoBox) {
  for (std::size_t extra = 1; extra < 4; ++extra) {
    expect_no_box(join({attestation_key_box(fixed_key()), bytes(extra, 0)}));
  }
}

TEST_F(PutKeyTest, AValueThatIsSaidToReachBeyondTheEndMakesNoBox) {
  const bytes box = attestation_key_box(fixed_key(), 3);
  bytes longer = box;
  const std::size_t last_length = box.size() - fixed_key()[rsa_d].size() - 2;
  ++longer[last_length];
  expect_no_box(longer);
  longer[last_length + 1] = 0xFF;
  expect_no_box(longer);
}

TEST_F(PutKeyTest, AKeyThatLacksAnyOfItsComponentsIsNone) {
  for (std::uint16_t tag = QUIL_TAG_RSA_N; tag <= QUIL_TAG_RSA_QINV; ++tag) expect_no_box(box_without(tag));
  for (std::size_t components = 0; components < 8; ++components) {
    if (components != 3) expect_no_box(attestation_key_box(fixed_key(), components));
  }
}

TEST_F(PutKeyTest, AKeyIsTakenUpToTheLengthThatTheKeymasterTaCanFetch) {
  const bytes box = attestation_key_box(fixed_key());
  const bytes longest = join({box, tlv(99, bytes(QUIL_KEY_CAPACITY - box.size() - 4, 7))});
  ASSERT_EQ(longest.size(), QUIL_KEY_CAPACITY);
  ASSERT_EQ(put_key(longest), TEE_SUCCESS);
  EXPECT_EQ(get_key().data(), longest);
  const bytes too_long = join({box, tlv(99, bytes(QUIL_KEY_CAPACITY - box.size() - 3, 7))});
  expect_refused(TEE_ERROR_BAD_FORMAT, {"The box of the key is too long\n"}, [&] { return put_key(too_long); });
  EXPECT_EQ(get_key().data(), longest);
}

TEST_F(PutKeyTest, ANullBufferIsNoBoxWhateverItsSize) {
  TEE_Param params[4] = {};
  params[0].memref = {nullptr, 4000};
  expect_refused(TEE_ERROR_BAD_FORMAT, {"Not the box of a key\n"},
                 [&] { return invoke(COMMAND_PUT_KEY, 0x0005, params); });
}

TEST_F(PutKeyTest, WhatWasCheckedIsWhatIsStoredThoughTheClientWritesMeanwhile) {
  const bytes box = attestation_key_box(fixed_key());
  bytes shared = box;
  TEE_Param params[4] = {memory_slot(shared)};
  faults().observe_calls([&](std::uint32_t, std::string_view name) {
    if (name == "TEE_CreatePersistentObject") std::fill(shared.begin(), shared.end(), std::uint8_t{0xFF});
  });
  ASSERT_EQ(invoke(COMMAND_PUT_KEY, 0x0005, params), TEE_SUCCESS);
  faults().observe_calls({});
  EXPECT_NE(shared, box);
  EXPECT_EQ(get_key().data(), box);
}

}  // namespace
}  // namespace testing_support
