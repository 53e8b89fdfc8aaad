// The client of the provisioning TA.
#include "quil/quil_client.h"

#include <fmt/format.h>

#include "tests/soter/soter_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

using hosted_tee::trace_level;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

using fetch = TEE_Result (*)(void*, std::uint32_t, std::uint32_t*);

class QuilClientTest : public SoterTest {};

TEST_F(QuilClientTest, KeyAndDataAreFetchedByTheirCommands) {
  quil.key.data = pattern(20);
  quil.data.data = pattern(10, 2);
  bytes room(30, 0xEE);
  std::uint32_t length = 99;
  EXPECT_EQ(retrieve_key_from_quil(room.data(), 30, &length), TEE_SUCCESS);
  EXPECT_EQ(length, 20U);
  EXPECT_EQ(room, join({pattern(20), bytes(10, 0xEE)}));
  EXPECT_EQ(retrieve_data_from_quil(room.data(), 29, &length), TEE_SUCCESS);
  EXPECT_EQ(length, 10U);
  EXPECT_THAT(quil.calls, ElementsAre("2", "5"));
  EXPECT_THAT(quil.types, ElementsAre(0x26, 0x26));
  EXPECT_THAT(quil.capacities, ElementsAre(30, 29));
  EXPECT_THAT(ta().traced(trace_level::debug), ElementsAre("Retrieve key success\n", "Retrieve TA data success\n"));
  EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(QuilClientTest, APropertyIsFetchedByItsRequest) {
  quil.properties["34173a17"].data = from_text("cpu");
  bytes room(8);
  std::uint32_t length = 8;
  EXPECT_EQ(retrieve_property_from_quil(&QUIL_PROPERTY_CPU_ID, room.data(), &length), TEE_SUCCESS);
  EXPECT_EQ(length, 3U);
  EXPECT_EQ(bytes(room.begin(), room.begin() + 3), from_text("cpu"));
  EXPECT_THAT(quil.calls, ElementsAre("12 34173a17"));
  EXPECT_THAT(quil.types, ElementsAre(0x65));
  EXPECT_THAT(ta().traced(trace_level::debug), ElementsAre("Retrieve TA property success\n"));
}

TEST_F(QuilClientTest, NullArgumentsOpenNoSession) {
  std::uint32_t length = 7;
  std::uint8_t byte = 0;
  EXPECT_EQ(retrieve_key_from_quil(nullptr, 9, nullptr), TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(retrieve_key_from_quil(&byte, 1, nullptr), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_THAT(errors(), ElementsAre("Buf is null\n", "used_length pointer is null\n"));
  ta().clear_trace();
  EXPECT_EQ(retrieve_data_from_quil(nullptr, 9, &length), TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(retrieve_data_from_quil(&byte, 1, nullptr), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_THAT(errors(), IsEmpty());
  EXPECT_THAT(ta().traced(trace_level::debug), ElementsAre("Buf is null\n", "used_length pointer is null\n"));
  ta().clear_trace();
  EXPECT_EQ(retrieve_property_from_quil(nullptr, &byte, nullptr), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(retrieve_property_from_quil(&QUIL_PROPERTY_CPU_ID, nullptr, &length), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(retrieve_property_from_quil(&QUIL_PROPERTY_CPU_ID, &byte, nullptr), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_THAT(errors(), ElementsAre(testing::StartsWith("request "), testing::StartsWith("request 0x"),
                                    "output_length pointer is null\n"));
  EXPECT_EQ(length, 7U);
  EXPECT_THAT(quil.calls, IsEmpty());
}

TEST_F(QuilClientTest, AFailureLeavesTheLengthAndClosesTheSession) {
  bytes room(8);
  for (const TEE_Result result : {TEE_ERROR_ACCESS_DENIED, TEE_ERROR_SHORT_BUFFER, TEE_Result{0xF0123456}}) {
    quil.key.result = quil.data.result = quil.properties["34173a17"].result = result;
    ta().clear_trace();
    std::uint32_t length = 8;
    EXPECT_EQ(retrieve_key_from_quil(room.data(), 8, &length), result);
    EXPECT_EQ(retrieve_data_from_quil(room.data(), 8, &length), result);
    EXPECT_EQ(retrieve_property_from_quil(&QUIL_PROPERTY_CPU_ID, room.data(), &length), result);
    EXPECT_EQ(length, 8U);
    EXPECT_EQ(quil.open_sessions, 0);
    EXPECT_THAT(errors(), ElementsAre(fmt::format("Retrieve key fails, 0x{:x}\n", result),
                                      fmt::format("Retrieve TA property fails, 0x{:x}\n", result)));
    EXPECT_THAT(ta().traced(trace_level::info), ElementsAre(fmt::format("Retrieve TA data fails, 0x{:x}\n", result)));
  }
}

TEST_F(QuilClientTest, WithoutASessionThereIsNoCall) {
  quil.opens = TEE_ERROR_BUSY;
  bytes room(8);
  std::uint32_t length = 8;
  EXPECT_EQ(retrieve_key_from_quil(room.data(), 8, &length), TEE_ERROR_BUSY);
  EXPECT_EQ(retrieve_data_from_quil(room.data(), 8, &length), TEE_ERROR_BUSY);
  EXPECT_EQ(retrieve_property_from_quil(&QUIL_PROPERTY_CPU_ID, room.data(), &length), TEE_ERROR_BUSY);
  EXPECT_EQ(length, 8U);
  EXPECT_THAT(quil.calls, IsEmpty());
  EXPECT_THAT(errors(), testing::Each("Open quil session fails, 0xffff000d\n"));
  EXPECT_EQ(errors().size(), 3U);
}

TEST_F(QuilClientTest, NoRoomIsPassedOn) {
  quil.key.data = pattern(1);
  std::uint8_t byte = 0;
  std::uint32_t length = 7;
  EXPECT_EQ(retrieve_key_from_quil(&byte, 0, &length), TEE_ERROR_SHORT_BUFFER);
  EXPECT_THAT(quil.capacities, ElementsAre(0));
}

}  // namespace
}  // namespace testing_support
