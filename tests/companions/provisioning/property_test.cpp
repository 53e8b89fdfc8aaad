// The device's properties.
#include "tests/companions/provisioning/provisioning_fixture.h"

using namespace keymaster;
using namespace keymaster::provisioning;

namespace testing_support {
namespace {

constexpr const char* wrong_request = "A property request has 4 bytes, not ";
constexpr const char* wrong_value = "A property has 1 to 512 bytes\n";

class PropertyTest : public ProvisioningTest {
 protected:
  const bytes cpu_id = from_hex(cpu_id_property);
};

TEST_F(PropertyTest, ComeBackAtEveryLengthTheyMayHave) {
  for (const std::size_t size : {std::size_t{1}, std::size_t{63}, std::size_t{property_limit}}) {
    SCOPED_TRACE(size);
    const hosted_tee::accounting before = holdings();
    ASSERT_EQ(put_property(cpu_id, pattern(size)), TEE_SUCCESS);
    const quil_answer answer = get_property(cpu_id);
    EXPECT_EQ(answer.result, TEE_SUCCESS);
    EXPECT_EQ(answer.data(), pattern(size));
    expect_same_holdings(before);
  }
}

TEST_F(PropertyTest, StandInStorageUnderTheirGroupAndItem) {
  ASSERT_EQ(put_property(from_hex(soter_property), pattern(10, 1)), TEE_SUCCESS);
  ASSERT_EQ(put_property(from_hex(cpu_id_property), pattern(10, 2)), TEE_SUCCESS);
  ASSERT_EQ(put_property(from_hex(device_id_property), pattern(10, 3)), TEE_SUCCESS);
  ASSERT_EQ(put_property(from_hex("efcd0900"), pattern(10, 4)), TEE_SUCCESS);
  EXPECT_EQ(stored("quil.prop.1834.0000"), pattern(10, 1));
  EXPECT_EQ(stored("quil.prop.1734.173a"), pattern(10, 2));
  EXPECT_EQ(stored("quil.prop.1934.1936"), pattern(10, 3));
  EXPECT_EQ(stored("quil.prop.cdef.0009"), pattern(10, 4));
  restart();
  EXPECT_EQ(get_property(from_hex("efcd0900")).data(), pattern(10, 4));
}

TEST_F(PropertyTest, AreReplacedOneByOne) {
  ASSERT_EQ(put_property(cpu_id, pattern(60, 1)), TEE_SUCCESS);
  ASSERT_EQ(put_property(from_hex(device_id_property), pattern(32, 2)), TEE_SUCCESS);
  ASSERT_EQ(put_property(cpu_id, pattern(7, 3)), TEE_SUCCESS);
  EXPECT_EQ(get_property(cpu_id).data(), pattern(7, 3));
  EXPECT_EQ(get_property(from_hex(device_id_property)).data(), pattern(32, 2));
}

TEST_F(PropertyTest, OfNoBytesOrOfTooManyAreRefusedAndTheOldValueStays) {
  ASSERT_EQ(put_property(cpu_id, pattern(20)), TEE_SUCCESS);
  for (const std::size_t size : {std::size_t{0}, std::size_t{property_limit} + 1, std::size_t{4096}}) {
    SCOPED_TRACE(size);
    expect_refused(TEE_ERROR_BAD_PARAMETERS, {wrong_value}, [&] { return put_property(cpu_id, pattern(size)); });
    EXPECT_EQ(get_property(cpu_id).data(), pattern(20));
  }
}

TEST_F(PropertyTest, AreNamedByFourBytes) {
  for (const std::size_t size : {std::size_t{0}, std::size_t{3}, std::size_t{5}, std::size_t{8}}) {
    const std::string line = wrong_request + std::to_string(size) + "\n";
    bytes request = cpu_id;
    request.resize(size);
    expect_refused(TEE_ERROR_BAD_PARAMETERS, {line}, [&] { return put_property(request, pattern(8)); });
    quil_answer answer;
    expect_refused(TEE_ERROR_BAD_PARAMETERS, {line}, [&] { return (answer = get_property(request)).result; });
    EXPECT_EQ(answer.buffer, bytes(512, canary));
  }
  EXPECT_EQ(stored("quil.prop.1734.173a"), std::nullopt);
}

TEST_F(PropertyTest, ThatAreNotThereAreNotFound) {
  ASSERT_EQ(put_property(cpu_id, pattern(20)), TEE_SUCCESS);
  for (const char* request : {soter_property, "34170000", "00003a17", "3417173a"}) {
    SCOPED_TRACE(request);
    quil_answer answer;
    expect_refused(TEE_ERROR_ITEM_NOT_FOUND, {}, [&] { return (answer = get_property(from_hex(request))).result; });
    EXPECT_EQ(answer.buffer, bytes(512, canary));
  }
}

TEST_F(PropertyTest, ABufferThatIsTooSmallStaysUntouchedAndLearnsTheSize) {
  ASSERT_EQ(put_property(cpu_id, pattern(20)), TEE_SUCCESS);
  for (const std::size_t capacity : {std::size_t{0}, std::size_t{19}}) {
    quil_answer answer;
    expect_refused(TEE_ERROR_SHORT_BUFFER, {"The answer needs 20 bytes\n"},
                   [&] { return (answer = get_property(cpu_id, capacity)).result; });
    EXPECT_EQ(answer.size, 20U);
    EXPECT_EQ(answer.buffer, bytes(capacity, canary));
  }
  EXPECT_EQ(get_property(cpu_id, 20).data(), pattern(20));
}

TEST_F(PropertyTest, AreStoredAsTheyWereTakenThoughTheClientWritesMeanwhile) {
  bytes request = cpu_id, value = pattern(64);
  TEE_Param params[4] = {memory_slot(request), memory_slot(value)};
  faults().observe_calls([&](std::uint32_t, std::string_view name) {
    if (name != "TEE_CreatePersistentObject") return;
    value.assign(value.size(), 0xFF);
    request.assign(request.size(), 0xFF);
  });
  ASSERT_EQ(invoke(COMMAND_PUT_PROPERTY, 0x0055, params), TEE_SUCCESS);
  faults().observe_calls({});
  EXPECT_EQ(get_property(cpu_id).data(), pattern(64));
}

}  // namespace
}  // namespace testing_support
