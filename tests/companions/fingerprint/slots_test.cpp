// What the commands of the fingerprint TA are asked with, by whom, and with how much room for the answer.
#include <fmt/format.h>

#include "tests/companions/fingerprint/fingerprint_fixture.h"

using namespace keymaster::fingerprint;

namespace testing_support {
namespace {

struct typed_command {
  std::uint32_t command;
  std::uint32_t types;
};

constexpr typed_command every_command[] = {{COMMAND_ENROL, enrol_types},
                                           {COMMAND_TOUCH, touch_types},
                                           {COMMAND_REMOVE, remove_types},
                                           {COMMAND_LIST, list_types}};
constexpr std::uint32_t parameter_types[] = {0, 1, 2, 3, 5, 6, 7};

class FingerprintSlotsTest : public FingerprintTest {
 protected:
  FingerprintSlotsTest() { must_enrol(77); }

  bytes room = bytes(512);

  TEE_Result call(std::uint32_t command, std::uint32_t types) {
    TEE_Param params[4] = {};
    for (std::uint32_t slot = 0; slot < 4; ++slot) {
      const bool memory = TEE_PARAM_TYPE_GET(types, slot) >= TEE_PARAM_TYPE_MEMREF_INPUT;
      params[slot] = memory ? memory_slot(room) : value_slot(1);
    }
    return invoke(command, types, params);
  }
};

TEST_F(FingerprintSlotsTest, AnyOtherTypeInAnySlotIsRefused) {
  for (const auto& [command, types] : every_command) {
    for (std::uint32_t slot = 0; slot < 4; ++slot) {
      for (const std::uint32_t type : parameter_types) {
        const std::uint32_t other = (types & ~(0xFU << (4 * slot))) | type << (4 * slot);
        if (other == types) continue;
        SCOPED_TRACE(fmt::format("command {} with types {:#06x}", command, other));
        expect_refused(TEE_ERROR_BAD_PARAMETERS, {fmt::format("Bad argument type 0x{:x}\n", other)},
                       [&, wanted = command] { return call(wanted, other); });
      }
    }
  }
  EXPECT_EQ(room, bytes(512));
}

TEST_F(FingerprintSlotsTest, OtherCommandsAreUnknown) {
  for (const std::uint32_t command : {0U, 5U, 6U, 0xFFFFFFFFU}) {
    expect_refused(TEE_ERROR_NOT_SUPPORTED, {fmt::format("Unknown command 0x{:x}\n", command)},
                   [&] { return call(command, enrol_types); });
  }
}

TEST_F(FingerprintSlotsTest, NoTaMaySendACommand) {
  for (const TEE_Identity& client : {some_ta, TEE_Identity{TEE_LOGIN_TRUSTED_APP, KEYMASTER_TA_UUID},
                                     TEE_Identity{TEE_LOGIN_TRUSTED_APP, FINGERPRINT_TA_UUID}}) {
    open_session(client);
    for (const auto& [command, types] : every_command) {
      expect_refused(TEE_ERROR_ACCESS_DENIED, {"Refused to a client of login 0xf0000000\n"},
                     [&, wanted = command, with = types] { return call(wanted, with); });
    }
  }
  EXPECT_EQ(room, bytes(512));
}

TEST_F(FingerprintSlotsTest, ATokenNeedsRoomFor69Bytes) {
  for (const std::size_t capacity : {0U, 1U, 68U}) {
    tee.clear_trace();
    expect_refused(TEE_ERROR_SHORT_BUFFER, {"The answer needs 69 bytes\n"}, [&] {
      const touch_answer got = touch(1, 0, capacity);
      EXPECT_EQ(got.size, 69U);
      EXPECT_EQ(got.token, bytes(capacity, canary));
      EXPECT_EQ(got.told, 0U);
      return got.result;
    });
    EXPECT_FALSE(tee.traced("soter deny finger print ta"));
  }
}

TEST_F(FingerprintSlotsTest, AMoreSpaciousBufferIsFilledOnlyAsFarAsTheTokenGoes) {
  const touch_answer got = touch(1, 0, 70);
  EXPECT_EQ(got.result, TEE_SUCCESS);
  EXPECT_EQ(got.size, 69U);
  EXPECT_EQ(got.token.back(), canary);
}

TEST_F(FingerprintSlotsTest, ANullBufferHasNoRoomWhateverItsSizeSays) {
  expect_refused(TEE_ERROR_SHORT_BUFFER, {"The answer needs 69 bytes\n"}, [&] {
    TEE_Param params[4] = {value_slot(1), wide_slot(0)};
    params[2].memref.size = 69;
    return invoke(COMMAND_TOUCH, touch_types, params);
  });
}

TEST_F(FingerprintSlotsTest, AListThatHasNoRoomTellsItsSize) {
  must_enrol(78);
  for (const std::size_t capacity : {0U, 12U, 23U}) {
    expect_refused(TEE_ERROR_SHORT_BUFFER, {"The answer needs 24 bytes\n"}, [&] {
      const list_answer got = list(capacity);
      EXPECT_EQ(got.size, 24U);
      EXPECT_EQ(got.records, bytes(capacity, canary));
      return got.result;
    });
  }
  EXPECT_EQ(list(24).result, TEE_SUCCESS);
  EXPECT_EQ(list(25).size, 24U);
}

}  // namespace
}  // namespace testing_support
