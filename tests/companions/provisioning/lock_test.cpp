// The lock, and what the status tells.
#include <functional>

#include "tests/companions/provisioning/provisioning_fixture.h"

using namespace keymaster;
using namespace keymaster::provisioning;

namespace testing_support {
namespace {

class LockTest : public ProvisioningTest {
 protected:
  void provision() {
    ASSERT_EQ(put_key(box), TEE_SUCCESS);
    ASSERT_EQ(put_data(pattern(40)), TEE_SUCCESS);
    ASSERT_EQ(put_property(cpu_id, pattern(20)), TEE_SUCCESS);
  }
  void expect_locked(const std::function<TEE_Result()>& command) {
    expect_refused(TEE_ERROR_ACCESS_DENIED, {"The device is locked\n"}, command);
  }
  void expect_nothing_changes() {
    const bytes other = attestation_key_box(rsa_test_key::of_bits(1024).components(), 3);
    expect_locked([&] { return put_key(other); });
    expect_locked([&] { return put_data(pattern(41)); });
    expect_locked([&] { return generate().result; });
    expect_locked([&] { return put_property(cpu_id, pattern(21)); });
    expect_locked([&] { return put_property(from_hex("00000000"), pattern(21)); });
    EXPECT_EQ(get_key().data(), box);
    EXPECT_EQ(get_data().data(), pattern(40));
    EXPECT_EQ(get_property(cpu_id).data(), pattern(20));
    EXPECT_EQ(stored("quil.prop.0000.0000"), std::nullopt);
  }

  const bytes box = attestation_key_box(rsa_test_key::of_bits(1024).components());
  const bytes cpu_id = from_hex(cpu_id_property);
};

TEST_F(LockTest, NothingChangesAnyMoreAndEverythingIsStillAnswered) {
  provision();
  const hosted_tee::accounting before = holdings();
  ASSERT_EQ(lock(), TEE_SUCCESS);
  expect_same_holdings(before);
  EXPECT_TRUE(stored("quil.lock").has_value());
  expect_nothing_changes();
}

TEST_F(LockTest, ItOutlivesAReboot) {
  provision();
  ASSERT_EQ(lock(), TEE_SUCCESS);
  restart();
  EXPECT_EQ(status(), STATUS_KEY | STATUS_DATA | STATUS_CPU_ID | STATUS_LOCKED);
  expect_nothing_changes();
}

TEST_F(LockTest, ADeviceThatIsLockedAlreadyStaysSo) {
  provision();
  ASSERT_EQ(lock(), TEE_SUCCESS);
  faults().clear();
  EXPECT_EQ(lock(), TEE_SUCCESS);
  EXPECT_EQ(faults().call_count("TEE_CreatePersistentObject"), 0U);
  expect_nothing_changes();
}

TEST_F(LockTest, WhetherADeviceIsLockedMustBeKnownBeforeAnythingChanges) {
  provision();
  for (const TEE_Result result : {TEE_ERROR_CORRUPT_OBJECT, TEE_ERROR_STORAGE_NOT_AVAILABLE, TEE_ERROR_GENERIC}) {
    faults().clear();
    faults().fail_call("TEE_OpenPersistentObject", 1, result);
    expect_refused(result, {}, [&] { return put_data(pattern(41)); });
    EXPECT_TRUE(faults().triggered());
    faults().fail_call("TEE_OpenPersistentObject", 1, result);
    expect_refused(result, {}, [&] { return lock(); });
    faults().clear();
    EXPECT_EQ(get_data().data(), pattern(40));
  }
}

TEST_F(LockTest, AnEmptyDeviceCanBeLockedToo) {
  ASSERT_EQ(lock(), TEE_SUCCESS);
  EXPECT_EQ(status(), STATUS_LOCKED);
  EXPECT_EQ(get_key().result, TEE_ERROR_ITEM_NOT_FOUND);
}

TEST_F(LockTest, TheStatusTellsEachThingThatIsThere) {
  EXPECT_EQ(status(), 0U);
  ASSERT_EQ(put_data({}), TEE_SUCCESS);
  EXPECT_EQ(status(), 0x02U);
  ASSERT_EQ(put_property(from_hex(device_id_property), pattern(32)), TEE_SUCCESS);
  EXPECT_EQ(status(), 0x12U);
  ASSERT_EQ(put_property(from_hex(soter_property), pattern(60)), TEE_SUCCESS);
  EXPECT_EQ(status(), 0x16U);
  ASSERT_EQ(put_key(box), TEE_SUCCESS);
  EXPECT_EQ(status(), 0x17U);
  ASSERT_EQ(put_property(cpu_id, pattern(20)), TEE_SUCCESS);
  EXPECT_EQ(status(), 0x1FU);
  ASSERT_EQ(put_property(from_hex("01020304"), pattern(20)), TEE_SUCCESS);
  EXPECT_EQ(status(), 0x1FU);
  ASSERT_EQ(lock(), TEE_SUCCESS);
  EXPECT_EQ(status(), 0x8000001FU);
}

TEST_F(LockTest, AStatusThatCantBeFoundOutIsNotToldInPart) {
  provision();
  for (std::uint32_t n = 1; n <= 6; ++n) {
    faults().clear();
    faults().fail_call("TEE_OpenPersistentObject", n, TEE_ERROR_CORRUPT_OBJECT);
    TEE_Param params[4] = {};
    expect_refused(TEE_ERROR_CORRUPT_OBJECT, {}, [&] { return invoke(COMMAND_STATUS, 0x0002, params); });
    EXPECT_TRUE(faults().triggered());
    EXPECT_EQ(params[0].value.a, 0U);
  }
}

}  // namespace
}  // namespace testing_support
