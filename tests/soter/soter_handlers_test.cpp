// The commands of the framework, called as the dispatcher does.
#include "soter/soter_handlers.h"

#include "params/keymaster_defs.h"
#include "params/keymaster_protocol.h"
#include "soter/finger_id.h"
#include "tests/soter/soter_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

using hosted_tee::trace_level;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class SoterHandlersTest : public SoterTest {
 protected:
  void SetUp() override {
    provision();
    ta().instance().client = {TEE_LOGIN_TRUSTED_APP, fingerprint_ta};
  }
  void TearDown() override {
    soter_set_fid(0, 0);
    SoterTest::TearDown();
  }

  std::int32_t status() const { return static_cast<std::int32_t>(slot0.value.a); }
  std::int32_t generate() {
    ta().clear_trace();
    EXPECT_EQ(soter_handle_generate_attk_key_pair(7, &slot0), TEE_SUCCESS);
    return status();
  }
  std::int32_t verify() {
    ta().clear_trace();
    quil.calls.clear();
    EXPECT_EQ(soter_handle_verify_attk_key_pair(&slot0), TEE_SUCCESS);
    return status();
  }
  /// For the handlers with an output: offers `capacity` bytes.
  template <class Handler>
  std::int32_t with_room(Handler handler, std::uint32_t capacity) {
    ta().clear_trace();
    room.assign(capacity, 0xEE);
    slot2.memref = {capacity == 0 ? nullptr : room.data(), capacity};
    EXPECT_EQ(handler(&slot2, &slot0), TEE_SUCCESS);
    return status();
  }
  TEE_Result set_fid(const bytes& message) {
    ta().clear_trace();
    return soter_handle_setFid(message.data(), static_cast<std::uint32_t>(message.size()));
  }
  std::uint64_t now() {
    const TEE_Time time = clock().system();
    return std::uint64_t{time.seconds} * 1000 + time.millis;
  }
  static bytes message(std::uint32_t fid, std::uint64_t time, std::uint32_t version = 0) {
    return join({u32(version), u32(fid), u64(time)});
  }

  TEE_Param slot0 = {}, slot2 = {};
  bytes room;
};

TEST_F(SoterHandlersTest, GeneratingLoadsTheResources) {
  EXPECT_EQ(generate(), 0);
  EXPECT_TRUE(soter_ready());
  EXPECT_THAT(ta().traced(trace_level::info),
              ElementsAre("this function should not be called in anytime but in meta mode\n"));
  EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(SoterHandlersTest, GeneratingWithoutAKeyIsAnUnknownError) {
  quil.key.result = TEE_ERROR_ITEM_NOT_FOUND;
  EXPECT_EQ(generate(), KM_ERROR_UNKNOWN_ERROR);
  EXPECT_THAT(errors(), ElementsAre("Retrieve key fails, 0xffff0008\n", "attk_key_pair is not produced\n"));
}

TEST_F(SoterHandlersTest, VerifyingReadsTheKeyBesideTheResources) {
  EXPECT_EQ(verify(), 0);
  EXPECT_FALSE(soter_ready());
  EXPECT_THAT(quil.calls, ElementsAre("2"));
  expect_same(ta().holdings(), {});
}

TEST_F(SoterHandlersTest, VerifyingTellsAnAbsentKeyFromOneThatCantBeRead) {
  quil.key.result = TEE_ERROR_ITEM_NOT_FOUND;
  EXPECT_EQ(verify(), SOTER_STATUS_NO_ATTK);
  EXPECT_THAT(quil.calls, ElementsAre("2"));
  quil.key.result = TEE_ERROR_ACCESS_DENIED;
  EXPECT_EQ(verify(), SOTER_STATUS_UNREADABLE_ATTK);
  EXPECT_THAT(quil.calls, ElementsAre("2"));
}

TEST_F(SoterHandlersTest, VerifyingIsTriedThreeTimesWhereMemoryIsWanted) {
  quil.key.result = TEE_ERROR_OUT_OF_MEMORY;
  EXPECT_EQ(verify(), SOTER_STATUS_UNREADABLE_ATTK);
  EXPECT_THAT(quil.calls, ElementsAre("2", "2", "2"));
  quil.key = {};
  quil.key.data = bytes(5, 1);  // a box that does not parse
  EXPECT_EQ(verify(), SOTER_STATUS_UNREADABLE_ATTK);
  EXPECT_THAT(quil.calls, ElementsAre("2", "2", "2"));
  provision();
  faults().fail_allocation(1);
  EXPECT_EQ(verify(), 0);
  EXPECT_THAT(quil.calls, ElementsAre("2"));
}

TEST_F(SoterHandlersTest, TheAttestationKeyIsExportedAsPem) {
  for (const std::size_t components : {8U, 3U}) {
    quil.key.data = key_box(components);
    ASSERT_EQ(with_room(soter_handle_export_attk_public_key, 445), 0);
    EXPECT_EQ(slot2.memref.size, 445U);
    const std::string text(room.begin(), room.end());
    EXPECT_THAT(text, testing::StartsWith("-----BEGIN PUBLIC KEY-----\nMIIBIjAN"));
    EXPECT_THAT(text, testing::EndsWith(std::string("\n-----END PUBLIC KEY-----\0", 26)));
    EXPECT_THAT(errors(), IsEmpty());
    soter_release_resources();
  }
}

TEST_F(SoterHandlersTest, ExportNeedsABufferThenTheResourcesThenTheRoom) {
  quil.key.result = TEE_ERROR_ITEM_NOT_FOUND;
  EXPECT_EQ(with_room(soter_handle_export_attk_public_key, 0), KM_ERROR_INVALID_ARGUMENT);
  EXPECT_THAT(errors(), IsEmpty());
  EXPECT_EQ(with_room(soter_handle_export_attk_public_key, 445), SOTER_STATUS_NO_ATTK);
  provision();
  quil.key.result = TEE_SUCCESS;
  for (const std::uint32_t capacity : {1U, 100U, 293U, 294U, 444U}) {
    EXPECT_EQ(with_room(soter_handle_export_attk_public_key, capacity), KM_ERROR_UNKNOWN_ERROR);
    EXPECT_EQ(slot2.memref.size, 0U);
    // What the platform wrote, as DER, has room from 294 bytes on; the text around it is silent about its own.
    const std::vector<std::string> lines{"TEE_AsymmetricExport failed: ffff0010\n"};
    EXPECT_EQ(errors(), capacity < 294 ? lines : std::vector<std::string>{});
  }
}

TEST_F(SoterHandlersTest, AKeyOfEmptyComponentsIsNotExported) {
  quil.key.data = join({tlv(17, {}), tlv(18, {}), tlv(19, {})});
  EXPECT_EQ(with_room(soter_handle_export_attk_public_key, 445), KM_ERROR_UNKNOWN_ERROR);
}

TEST_F(SoterHandlersTest, TheDeviceIdComesWithoutTheResources) {
  EXPECT_EQ(with_room(soter_handle_get_device_id, 64), 0);
  EXPECT_EQ(slot2.memref.size, 32U);
  EXPECT_EQ(room, join({pattern(32), bytes(32, 0xEE)}));
  EXPECT_FALSE(soter_ready());
}

TEST_F(SoterHandlersTest, ADeviceIdThatDoesntFitKeepsTheSize) {
  EXPECT_EQ(with_room(soter_handle_get_device_id, 31), KM_ERROR_INSUFFICIENT_BUFFER_SPACE);
  EXPECT_EQ(slot2.memref.size, 31U);
  EXPECT_THAT(errors(), ElementsAre("Retrieve TA property fails, 0xffff0010\n"));
  EXPECT_EQ(with_room(soter_handle_get_device_id, 0), KM_ERROR_UNKNOWN_ERROR);
  EXPECT_THAT(errors(), Contains("retrieve_device_id_from_quil fail, 0xffff0006\n"));
}

TEST_F(SoterHandlersTest, ADeviceIdThatClaimsMoreThanTheRoomIsNotBelieved) {
  for (const std::uint32_t claimed : {65U, 0xFFFFFFFFU}) {
    quil.properties[device_id_property].length = claimed;
    EXPECT_EQ(with_room(soter_handle_get_device_id, 64), KM_ERROR_INSUFFICIENT_BUFFER_SPACE);
    EXPECT_EQ(slot2.memref.size, 64U);
    EXPECT_THAT(errors(), IsEmpty());
  }
  quil.properties[device_id_property].length = 64;
  EXPECT_EQ(with_room(soter_handle_get_device_id, 64), 0);
  EXPECT_EQ(slot2.memref.size, 64U);
}

TEST_F(SoterHandlersTest, TheFingerIdOfTheFingerprintTaIsTaken) {
  ASSERT_EQ(generate(), 0);
  EXPECT_EQ(set_fid(message(0x01020304, now())), TEE_SUCCESS);
  EXPECT_THAT(ta().traced(trace_level::debug),
              ElementsAre("soter handle finger print ta notify", "Try to get client property\n",
                          "soter handle finger print ta notify success"));
  std::uint32_t fid = 0;
  EXPECT_EQ(soter_get_fid(&fid), TEE_SUCCESS);
  EXPECT_EQ(fid, 0x01020304U);
  EXPECT_EQ(soter_get_fid(&fid), TEE_SUCCESS) << "it is not used up";
}

TEST_F(SoterHandlersTest, AFingerIdIsValidFor3000Milliseconds) {
  ASSERT_EQ(generate(), 0);
  for (const auto& [age, valid] : {std::pair{0, true}, std::pair{2999, true}, std::pair{3000, true},
                                   std::pair{3001, false}, std::pair{-1, false}, std::pair{-5000, false}}) {
    ASSERT_EQ(set_fid(message(9, now() - static_cast<std::uint64_t>(age))), TEE_SUCCESS);
    std::uint32_t fid = 0;
    EXPECT_EQ(soter_get_fid(&fid), valid ? TEE_SUCCESS : TEE_ERROR_TIMEOUT) << age;
    EXPECT_EQ(fid, valid ? 9U : 0xFFFFFFFFU);
  }
}

TEST_F(SoterHandlersTest, TimeIsCountedIn64Bits) {
  ASSERT_EQ(generate(), 0);
  clock().set_system({5'000'000, 999});  // more than 2^32 milliseconds
  ASSERT_EQ(set_fid(message(9, 5'000'000'999)), TEE_SUCCESS);
  std::uint32_t fid = 0;
  EXPECT_EQ(soter_get_fid(&fid), TEE_SUCCESS);
}

TEST_F(SoterHandlersTest, OthersAreDeniedBeforeTheMessageIsLookedAt) {
  const auto denied = [&] {
    EXPECT_EQ(set_fid({}), TEE_ERROR_ACCESS_DENIED);
    EXPECT_THAT(errors(), ElementsAre("soter deny finger print ta"));
  };
  denied();  // the resources are not loaded, so that nobody is known to be the fingerprint TA
  ASSERT_EQ(generate(), 0);
  ta().instance().client = {TEE_LOGIN_PUBLIC, fingerprint_ta};
  denied();
  TEE_UUID other = fingerprint_ta;
  other.clockSeqAndNode[7] ^= 1;
  ta().instance().client = {TEE_LOGIN_TRUSTED_APP, other};
  denied();
  ta().instance().client = {TEE_LOGIN_TRUSTED_APP, fingerprint_ta};
  faults().fail_call("TEE_GetPropertyAsIdentity", 1, TEE_ERROR_ITEM_NOT_FOUND);
  EXPECT_EQ(set_fid(message(9, now())), TEE_ERROR_ITEM_NOT_FOUND);
  EXPECT_THAT(errors(), ElementsAre("get client property error, 0xffff0008\n", "soter deny finger print ta"));
  EXPECT_EQ(get_client_property(nullptr), TEE_ERROR_BAD_PARAMETERS);
}

TEST_F(SoterHandlersTest, AMessageOfAnotherSizeOrVersionIsRefused) {
  ASSERT_EQ(generate(), 0);
  for (const std::size_t size : {0U, 15U, 17U}) {
    EXPECT_EQ(set_fid(bytes(size, 1)), TEE_ERROR_BAD_PARAMETERS) << "the size comes before the version";
    EXPECT_THAT(errors(), ElementsAre("finger print ta input argument error"));
  }
  EXPECT_EQ(soter_handle_setFid(nullptr, 16), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(set_fid(message(9, now(), 1)), TEE_ERROR_BAD_FORMAT);
  EXPECT_THAT(errors(), ElementsAre("finger print ta input argument version mismatch expected 0 actual 1\n"));
  std::uint32_t fid = 0;
  EXPECT_EQ(soter_get_fid(&fid), TEE_ERROR_TIMEOUT) << "nothing was taken";
}

}  // namespace
}  // namespace testing_support
