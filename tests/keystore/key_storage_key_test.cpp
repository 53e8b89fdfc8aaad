// The key storage keys over the life of a device.
#include "tests/keystore/keystore_fixture.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

using KeyStorageKeyTest = KeystoreTest;
using hosted_tee::trace_level;

TEST_F(KeyStorageKeyTest, TheFirstStartDrawsTheRpmbKskAndStoresIt) {
  ASSERT_EQ(stored_ksk(), std::nullopt);
  ASSERT_EQ(key_store_init(), TEE_SUCCESS);
  ASSERT_NE(rpmb_ksk(), nullptr);
  EXPECT_EQ(value_of(rpmb_ksk()), rpmb_value());
  EXPECT_EQ(rpmb_value().size(), 32U);
  EXPECT_NE(rpmb_value(), bytes(32, 0));
  EXPECT_THAT(errors(), IsEmpty());
  EXPECT_THAT(ta().traced(trace_level::info), IsEmpty());
}

TEST_F(KeyStorageKeyTest, TwoKeyObjectsAreHeldAndNoOpenStorage) {
  for (int start = 0; start < 2; ++start) {
    ASSERT_EQ(key_store_init(), TEE_SUCCESS);
    const auto held = ta().holdings();
    EXPECT_EQ(held.transient_objects, 2U);
    EXPECT_EQ(held.persistent_objects, 0U);
    EXPECT_EQ(held.operations, 0U);
    EXPECT_EQ(held.heap_blocks, 0U);
    key_store_release();
  }
}

TEST_F(KeyStorageKeyTest, BothKsksAreHmacKeysOf256Bits) {
  ASSERT_EQ(key_store_init(), TEE_SUCCESS);
  for (const TEE_ObjectHandle ksk : {derived_ksk(), rpmb_ksk()}) {
    TEE_ObjectInfo info = {};
    ASSERT_EQ(TEE_GetObjectInfo1(ksk, &info), TEE_SUCCESS);
    EXPECT_EQ(info.objectType, 0xA0000004U);
    EXPECT_EQ(info.maxKeySize, 256U);
    EXPECT_EQ(value_of(ksk).size(), 32U);
  }
}

TEST_F(KeyStorageKeyTest, TheKskIsStoredForReadingUnderItsNameWithTheZero) {
  ASSERT_EQ(key_store_init(), TEE_SUCCESS);
  ASSERT_EQ(spy.created.size(), 1U);
  const create_call& call = spy.created[0];
  EXPECT_EQ(call.storage, 0x80000001U);
  EXPECT_EQ(to_hex(call.id), "4b65796d6173746572204b534b00");
  EXPECT_EQ(call.flags, 0x1U) << "read alone; an object that exists is not overwritten";
  EXPECT_FALSE(call.has_attributes);
  EXPECT_EQ(call.data, value_of(rpmb_ksk()));
  ASSERT_EQ(spy.opened.size(), 1U);
  EXPECT_EQ(spy.opened[0].storage, 0x80000001U);
  EXPECT_EQ(spy.opened[0].id, call.id);
  EXPECT_EQ(spy.opened[0].flags, 0x1U);
  EXPECT_EQ(world().read_object(keymaster_ta, TEE_STORAGE_RPMB, "Keymaster KSK"), std::nullopt);
}

TEST_F(KeyStorageKeyTest, TheSecondStartLoadsTheSameKsk) {
  start_keys();
  const bytes first = value_of(rpmb_ksk());
  reboot(true);
  EXPECT_EQ(value_of(rpmb_ksk()), first);
  EXPECT_EQ(rpmb_value(), first);
  EXPECT_EQ(faults().call_count("TEE_GenerateKey"), 0U);
}

TEST_F(KeyStorageKeyTest, AStoredValueIsTheKsk) {
  const bytes value = pattern(32, 99);
  store_ksk(value);
  start_keys();
  EXPECT_EQ(value_of(rpmb_ksk()), value);
  EXPECT_THAT(spy.created, IsEmpty());
}

TEST_F(KeyStorageKeyTest, TheDerivedKskIsTheDeviceIdAsItLiesInMemoryAndTheFill) {
  start_keys();
  EXPECT_EQ(to_hex(value_of(derived_ksk())),
            "040302010605080709"
            "0a0b0c0d0e0f10"
            "5a5a5a5a5a5a5a5a5a5a5a5a5a5a5a5a");
  EXPECT_EQ(value_of(derived_ksk()), derived_value());
}

TEST_F(KeyStorageKeyTest, TheDerivedKskIsTheSameAtEveryStart) {
  start_keys();
  const bytes first = value_of(derived_ksk());
  reboot(false);
  EXPECT_EQ(value_of(derived_ksk()), first);
  reboot(true);
  EXPECT_EQ(value_of(derived_ksk()), first);
}

TEST_F(KeyStorageKeyTest, ADeviceWithoutRpmbStartsWithTheDerivedKskAlone) {
  boot(false);
  ASSERT_EQ(key_store_init(), TEE_SUCCESS);
  EXPECT_NE(derived_ksk(), nullptr);
  EXPECT_EQ(rpmb_ksk(), nullptr);
  EXPECT_THAT(ta().traced(trace_level::info), ElementsAre("no RPMB for ksk\n"));
  EXPECT_THAT(errors(), ElementsAre("TEE_RPMB_MakeFileSystem return 0xffff000a"));
  EXPECT_THAT(spy.opened, IsEmpty());
}

TEST_F(KeyStorageKeyTest, AProbeThatFailsMeansNoRpmbForThisInstance) {
  start_keys();
  key_store_release();
  faults().fail_call("TEE_RPMB_MakeFileSystem", 1, TEE_ERROR_SECURITY);
  ASSERT_EQ(key_store_init(), TEE_SUCCESS);
  EXPECT_EQ(rpmb_ksk(), nullptr) << "although a KSK is stored";
  EXPECT_THAT(ta().traced(trace_level::info), ElementsAre("no RPMB for ksk\n"));
  EXPECT_THAT(errors(), ElementsAre("TEE_RPMB_MakeFileSystem return 0xffff000f"));
  key_store_release();
  ASSERT_EQ(key_store_init(), TEE_SUCCESS);
  EXPECT_NE(rpmb_ksk(), nullptr);
}

TEST_F(KeyStorageKeyTest, TheProbeAnswersOneOrZero) {
  EXPECT_EQ(judge_rpmb(), 1);
  boot(false);
  EXPECT_EQ(judge_rpmb(), 0);
}

TEST_F(KeyStorageKeyTest, AStoredObjectOfAnotherSizeIsDeletedAndEndsTheStart) {
  struct row {
    std::size_t size;
    const char* line;
  };
  for (const row& r : {row{0, "Wrong persistent data length, expected 32B, got 0B"},
                       {1, "Wrong persistent data length, expected 32B, got 1B"},
                       {31, "Wrong persistent data length, expected 32B, got 31B"},
                       {33, "Wrong persistent data length, expected 32B, got 33B"},
                       {40, "Wrong persistent data length, expected 32B, got 33B"},
                       {64, "Wrong persistent data length, expected 32B, got 33B"}}) {
    SCOPED_TRACE(r.size);
    store_ksk(pattern(r.size));
    ta().clear_trace();
    spy = platform_spy();
    EXPECT_EQ(key_store_init(), 0xF0100001);
    EXPECT_THAT(errors(),
                ElementsAre(r.line, "Now, delete the key and recreate it, but all previous keymaster key will die",
                            "Init RPMB KSK failed with 0xf0100001"));
    EXPECT_EQ(stored_ksk(), std::nullopt);
    EXPECT_THAT(spy.created, IsEmpty()) << "not recreated at once";
    ASSERT_EQ(spy.opened.size(), 2U);
    EXPECT_EQ(spy.opened[1].flags, 0x4U) << "opened again for deleting";
    EXPECT_EQ(derived_ksk(), nullptr);
    EXPECT_EQ(rpmb_ksk(), nullptr);
    expect_same(ta().holdings(), {});
  }
}

TEST_F(KeyStorageKeyTest, TheStartAfterADeletionDrawsAFreshKsk) {
  store_ksk(pattern(31));
  ASSERT_EQ(key_store_init(), KSK_ERROR_DELETED);
  ASSERT_EQ(key_store_init(), TEE_SUCCESS);
  EXPECT_EQ(rpmb_value().size(), 32U);
  EXPECT_EQ(value_of(rpmb_ksk()), rpmb_value());
}

TEST_F(KeyStorageKeyTest, AMalformedObjectThatCannotBeReopenedStays) {
  store_ksk(pattern(31));
  faults().fail_call("TEE_OpenPersistentObject", 2, TEE_ERROR_ACCESS_CONFLICT);
  EXPECT_EQ(key_store_init(), TEE_ERROR_ACCESS_CONFLICT);
  EXPECT_THAT(errors(), Contains("OpenPersistentObject failed with 0xffff0003\n"));
  EXPECT_EQ(errors().back(), "Init RPMB KSK failed with 0xffff0003");
  EXPECT_NE(stored_ksk(), std::nullopt);
  expect_same(ta().holdings(), {});
}

TEST_F(KeyStorageKeyTest, WhatBecomesOfTheDeletionItselfDoesNotMatter) {
  store_ksk(pattern(31));
  faults().override_output("TEE_CloseAndDeletePersistentObject1", 1,
                           [](std::uint32_t*, TEE_Result& result) { result = TEE_ERROR_STORAGE_NOT_AVAILABLE; });
  EXPECT_EQ(key_store_init(), KSK_ERROR_DELETED);
  EXPECT_TRUE(faults().triggered());
  expect_same(ta().holdings(), {});
}

TEST_F(KeyStorageKeyTest, AStartDoesNotTrustHandlesOfAnEarlierInstance) {
  // The image's memory may outlive an instance whose handles are long gone.
  start_keys();
  boot(false);
  ASSERT_EQ(key_store_init(), TEE_SUCCESS);
  EXPECT_EQ(rpmb_ksk(), nullptr);
  EXPECT_EQ(value_of(derived_ksk()), derived_value());
}

TEST_F(KeyStorageKeyTest, EitherKeyMadeAgainReplacesTheOldOneAndAFailureLeavesNone) {
  start_keys();
  const auto held = ta().holdings();
  EXPECT_EQ(key_store_init_derived_ksk(), TEE_SUCCESS);
  EXPECT_EQ(key_store_init_rpmb_ksk(), TEE_SUCCESS);
  expect_same(ta().holdings(), held);
  EXPECT_EQ(value_of(derived_ksk()), derived_value());
  EXPECT_EQ(value_of(rpmb_ksk()), rpmb_value());

  faults().fail_call("TEE_GetPropertyAsUUID", 1, TEE_ERROR_GENERIC);
  EXPECT_EQ(key_store_init_derived_ksk(), TEE_ERROR_GENERIC);
  EXPECT_EQ(derived_ksk(), nullptr);
  EXPECT_NE(rpmb_ksk(), nullptr);
  faults().fail_call("TEE_OpenPersistentObject", 1, TEE_ERROR_GENERIC);
  EXPECT_EQ(key_store_init_rpmb_ksk(), TEE_ERROR_GENERIC);
  EXPECT_EQ(rpmb_ksk(), nullptr);
  EXPECT_EQ(ta().holdings().transient_objects, 0U);
}

}  // namespace
