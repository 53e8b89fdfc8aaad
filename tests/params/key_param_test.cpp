// Looking things up in a parameter set, and giving one back.
#include "params/key_param.h"

#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;

namespace {

using ParameterSetTest = TaUnitTest;

param_list two_purposes() {
  return param_list{}
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .add(KM_TAG_KEY_SIZE, 2048)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY)
      .add(KM_TAG_DIGEST, KM_DIGEST_SHA1);
}

TEST(TagTypeTest, TheTypeIsTheTopFourBitsOfATag) {
  EXPECT_EQ(keymaster_tag_get_type(KM_TAG_PURPOSE), KM_ENUM_REP);
  EXPECT_EQ(keymaster_tag_get_type(KM_TAG_AUTH_TOKEN), KM_BYTES);
  EXPECT_EQ(keymaster_tag_get_type(0x0FFFFFFF), KM_INVALID);
  EXPECT_EQ(keymaster_tag_get_type(0xFFFFFFFF), 0xF0000000);
  EXPECT_EQ(keymaster_tag_get_type(0xB0000001), 0xB0000000);
}

TEST(TagTypeTest, OnlyBignumsAndBytesHaveABlob) {
  for (std::uint32_t type = 0; type < 16; ++type) {
    EXPECT_EQ(tag_has_blob((type << 28) | 0x123), type == 8 || type == 9) << type;
  }
}

TEST(TagTypeTest, TagsHaveThePublicNumbers) {
  struct row {
    keymaster_tag_t tag;
    std::uint32_t number;
  };
  for (const row& r : {row{KM_TAG_PURPOSE, 0x20000001},
                       {KM_TAG_ALGORITHM, 0x10000002},
                       {KM_TAG_KEY_SIZE, 0x30000003},
                       {KM_TAG_BLOCK_MODE, 0x20000004},
                       {KM_TAG_DIGEST, 0x20000005},
                       {KM_TAG_PADDING, 0x20000006},
                       {KM_TAG_CALLER_NONCE, 0x70000007},
                       {KM_TAG_MIN_MAC_LENGTH, 0x30000008},
                       {KM_TAG_RSA_PUBLIC_EXPONENT, 0x500000C8},
                       {KM_TAG_BLOB_USAGE_REQUIREMENTS, 0x1000012D},
                       {KM_TAG_BOOTLOADER_ONLY, 0x7000012E},
                       {KM_TAG_ACTIVE_DATETIME, 0x60000190},
                       {KM_TAG_ORIGINATION_EXPIRE_DATETIME, 0x60000191},
                       {KM_TAG_USAGE_EXPIRE_DATETIME, 0x60000192},
                       {KM_TAG_MIN_SECONDS_BETWEEN_OPS, 0x30000193},
                       {KM_TAG_MAX_USES_PER_BOOT, 0x30000194},
                       {KM_TAG_USER_SECURE_ID, 0xA00001F6},
                       {KM_TAG_NO_AUTH_REQUIRED, 0x700001F7},
                       {KM_TAG_USER_AUTH_TYPE, 0x100001F8},
                       {KM_TAG_AUTH_TIMEOUT, 0x300001F9},
                       {KM_TAG_APPLICATION_ID, 0x90000259},
                       {KM_TAG_APPLICATION_DATA, 0x900002BC},
                       {KM_TAG_ORIGIN, 0x100002BE},
                       {KM_TAG_ROOT_OF_TRUST, 0x900002C0},
                       {KM_TAG_ASSOCIATED_DATA, 0x900003E8},
                       {KM_TAG_NONCE, 0x900003E9},
                       {KM_TAG_AUTH_TOKEN, 0x900003EA},
                       {KM_TAG_MAC_LENGTH, 0x300003EB}}) {
    EXPECT_EQ(r.tag, r.number);
  }
}

TEST_F(ParameterSetTest, TagsAreCountedByTypeAndNumber) {
  const parameter_set set = in_ta(two_purposes());
  EXPECT_EQ(key_param_set_count_tag(set, KM_TAG_PURPOSE), 2U);
  EXPECT_EQ(key_param_set_count_tag(set, KM_TAG_DIGEST), 1U);
  EXPECT_EQ(key_param_set_count_tag(set, KM_TAG_PADDING), 0U);
  EXPECT_EQ(key_param_set_count_tag(set, KM_ENUM | 1), 0U) << "the number of the purpose under another type";
}

TEST_F(ParameterSetTest, ContainsAndAtMostOneFollowTheCount) {
  const parameter_set set = in_ta(two_purposes());
  EXPECT_TRUE(key_param_set_contains(set, KM_TAG_PURPOSE));
  EXPECT_TRUE(key_param_set_contains(set, KM_TAG_DIGEST));
  EXPECT_FALSE(key_param_set_contains(set, KM_TAG_PADDING));
  EXPECT_FALSE(key_param_set_at_most_one(set, KM_TAG_PURPOSE));
  EXPECT_TRUE(key_param_set_at_most_one(set, KM_TAG_DIGEST));
  EXPECT_TRUE(key_param_set_at_most_one(set, KM_TAG_PADDING));
}

TEST_F(ParameterSetTest, ARepeatedTagIsAsGoodAsMissing) {
  const parameter_set set = in_ta(two_purposes());
  EXPECT_EQ(key_param_set_get_unique(set, KM_TAG_PURPOSE), nullptr);
  EXPECT_EQ(key_param_set_get_unique(set, KM_TAG_PADDING), nullptr);
  EXPECT_EQ(key_param_set_get_unique(set, KM_TAG_KEY_SIZE), &set.params[1]);
  EXPECT_EQ(key_param_set_get_unique(set, KM_TAG_DIGEST), &set.params[3]);
}

TEST_F(ParameterSetTest, FindNextVisitsEachOccurrenceInOrder) {
  const parameter_set set = in_ta(two_purposes());
  const keymaster_key_param_t* const first = key_param_set_find_next(set, KM_TAG_PURPOSE, nullptr);
  const keymaster_key_param_t* const second = key_param_set_find_next(set, KM_TAG_PURPOSE, first);
  EXPECT_EQ(first, &set.params[0]);
  EXPECT_EQ(second, &set.params[2]);
  EXPECT_EQ(key_param_set_find_next(set, KM_TAG_PURPOSE, second), nullptr);
  EXPECT_EQ(key_param_set_find_next(set, KM_TAG_DIGEST, &set.params[3]), nullptr) << "behind the last record";
  EXPECT_EQ(key_param_set_find_next(set, KM_TAG_KEY_SIZE, second), nullptr) << "earlier records are not revisited";
}

TEST_F(ParameterSetTest, ASetWithoutAnArrayIsEmptyWhateverItsLengthSays) {
  const keymaster_key_param_set_t stale = {nullptr, 7};
  EXPECT_TRUE(records(stale).empty());
  EXPECT_EQ(key_param_set_count_tag(stale, KM_TAG_PURPOSE), 0U);
  EXPECT_FALSE(key_param_set_contains(stale, KM_TAG_PURPOSE));
  EXPECT_TRUE(key_param_set_at_most_one(stale, KM_TAG_PURPOSE));
  EXPECT_EQ(key_param_set_get_unique(stale, KM_TAG_PURPOSE), nullptr);
  EXPECT_EQ(key_param_set_find_next(stale, KM_TAG_PURPOSE, nullptr), nullptr);
}

TEST_F(ParameterSetTest, ABlobWithoutDataHasNoBytesWhateverItsLengthSays) {
  keymaster_key_param_t param = {};
  param.tag = KM_TAG_NONCE;
  param.blob.data_length = 12;
  EXPECT_TRUE(blob_bytes(param).empty());
}

TEST_F(ParameterSetTest, FreeingGivesBackTheArrayAndEveryBlobAndLeavesTheLength) {
  keymaster_key_param_set_t set = in_ta(two_purposes()
                                            .add_blob(KM_TAG_APPLICATION_ID, from_text("an application"))
                                            .add_blob(KM_BIGNUM | 9, pattern(40))
                                            .add_blob(KM_TAG_NONCE, {}))
                                      .release();
  keymaster_free_param_set(&set);
  EXPECT_EQ(set.params, nullptr);
  EXPECT_EQ(set.length, 7U);
  expect_same(ta.holdings(), {});
}

TEST_F(ParameterSetTest, FreeingASecondTimeFindsNothing) {
  keymaster_key_param_set_t set = in_ta(two_purposes().add_blob(KM_TAG_NONCE, pattern(12))).release();
  keymaster_free_param_set(&set);
  const std::uint32_t frees = ta.faults().call_count("TEE_Free");
  keymaster_free_param_set(&set);
  EXPECT_EQ(ta.faults().call_count("TEE_Free"), frees);
  EXPECT_EQ(set.params, nullptr);
  EXPECT_EQ(set.length, 5U);
}

TEST_F(ParameterSetTest, FreeingTouchesNoValueThatIsNotABlob) {
  // A number that looks like an address, under every type without a blob: freeing one would end the instance.
  parameter_set set;
  param_list list;
  for (std::uint32_t type = 0; type < 16; ++type) {
    if (type != 8 && type != 9) list.add((type << 28) | 1, 0x7FFF'1234'5678);
  }
  set = in_ta(list);
  set.reset();
  expect_same(ta.holdings(), {});
}

TEST_F(ParameterSetTest, FreeingTheRecordsAloneLeavesTheArrayWithoutBlobs) {
  parameter_set set = in_ta(param_list{}.add(KM_TAG_KEY_SIZE, 128).add_blob(KM_TAG_NONCE, pattern(12)));
  keymaster_free_param_array(set.params, set.length);
  ASSERT_NE(set.params, nullptr);
  EXPECT_EQ(set.params[0].integer, 128U);
  EXPECT_EQ(set.params[1].tag, KM_TAG_NONCE);
  EXPECT_EQ(set.params[1].blob.data, nullptr);
  EXPECT_EQ(ta.holdings().heap_blocks, 1U);
}

TEST_F(ParameterSetTest, BlobsAreWipedBeforeTheirMemoryIsFreed) {
  const bytes token = pattern(69);
  parameter_set set = in_ta(param_list{}.add_blob(KM_TAG_AUTH_TOKEN, token));
  std::vector<bytes> freed;
  ta.on_free([&](std::span<const std::uint8_t> block) { freed.emplace_back(block.begin(), block.end()); });
  set.reset();
  ta.on_free({});
  ASSERT_EQ(freed.size(), 2U);
  EXPECT_EQ(freed[0], bytes(69, 0));
}

TEST_F(ParameterSetTest, AMovedSetLeavesItsSourceEmpty) {
  parameter_set source = in_ta(two_purposes());
  keymaster_key_param_t* const records_before = source.params;
  parameter_set target{std::move(source)};
  EXPECT_EQ(source.params, nullptr);  // NOLINT(bugprone-use-after-move): that is what is tested
  EXPECT_EQ(source.length, 0U);
  EXPECT_EQ(target.params, records_before);
  EXPECT_EQ(target.length, 4U);
}

TEST_F(ParameterSetTest, AssigningASetFreesWhatWasThere) {
  parameter_set target = in_ta(param_list{}.add_blob(KM_TAG_NONCE, pattern(12)));
  target = in_ta(two_purposes());
  EXPECT_EQ(ta.holdings().heap_blocks, 1U);
  parameter_set& same = target;
  target = std::move(same);
  EXPECT_EQ(from_ta(target).marshal(), two_purposes().marshal()) << "assigned to itself";
  target.reset();
  EXPECT_EQ(target.length, 0U) << "an owner's length is never stale";
}

TEST_F(ParameterSetTest, AReleasedSetIsTheNewOwnersToFree) {
  parameter_set owner = in_ta(two_purposes());
  keymaster_key_param_set_t content = owner.release();
  EXPECT_EQ(owner.params, nullptr);
  EXPECT_EQ(owner.length, 0U);
  EXPECT_EQ(content.length, 4U);
  keymaster_free_param_set(&content);
}

TEST_F(ParameterSetTest, MadeParametersHaveNoStrayBytes) {
  const keymaster_key_param_t small = integer_param(KM_TAG_KEY_SIZE, 0xFFFFFFFF);
  const keymaster_key_param_t large = long_param(KM_TAG_RSA_PUBLIC_EXPONENT, 0x1122334455667788);
  EXPECT_EQ(bytes(reinterpret_cast<const std::uint8_t*>(&small), reinterpret_cast<const std::uint8_t*>(&small + 1)),
            from_hex("0300003000000000ffffffff000000000000000000000000"));
  EXPECT_EQ(bytes(reinterpret_cast<const std::uint8_t*>(&large), reinterpret_cast<const std::uint8_t*>(&large + 1)),
            from_hex("c80000500000000088776655443322110000000000000000"));
}

}  // namespace
