// What the commands of the authenticator are asked with, by whom, and with how much room for the answer.
#include <fmt/format.h>

#include "tests/companions/authenticator/authenticator_fixture.h"

using namespace keymaster::authenticator;

namespace testing_support {
namespace {

struct typed_command {
  std::uint32_t command;
  std::uint32_t types;
};

constexpr typed_command every_command[] = {{COMMAND_ENROL, enrol_types}, {COMMAND_VERIFY, verify_types}};
constexpr std::uint32_t parameter_types[] = {0, 1, 2, 3, 5, 6, 7};

class AuthenticatorSlotsTest : public AuthenticatorTest {
 protected:
  const bytes handle = must_enrol(alice, right).output;
  bytes room = bytes(512);

  TEE_Result call(std::uint32_t command, std::uint32_t types) {
    TEE_Param params[4] = {};
    for (std::uint32_t slot = 0; slot < 4; ++slot) {
      const bool memory = TEE_PARAM_TYPE_GET(types, slot) >= TEE_PARAM_TYPE_MEMREF_INPUT;
      params[slot] = memory ? memory_slot(room) : value_slot(alice);
    }
    return invoke(command, types, params);
  }

  /// send sends a body of the test's own making, with ample room for the answer.
  TEE_Result send(const typed_command& to, bytes body) {
    body.shrink_to_fit();  // so that the sanitizer sees a read past the end
    TEE_Param params[4] = {value_slot(alice), memory_slot(body), memory_slot(room)};
    return invoke(to.command, to.types, params);
  }
};

TEST_F(AuthenticatorSlotsTest, AnyOtherTypeInAnySlotIsRefused) {
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
}

TEST_F(AuthenticatorSlotsTest, OtherCommandsAreUnknown) {
  for (const std::uint32_t command : {0U, 3U, 0xFFFFFFFFU}) {
    expect_refused(TEE_ERROR_NOT_SUPPORTED, {fmt::format("Unknown command 0x{:x}\n", command)},
                   [&] { return call(command, verify_types); });
  }
}

TEST_F(AuthenticatorSlotsTest, NoTaMaySendACommand) {
  for (const TEE_Identity& client : {some_ta, TEE_Identity{TEE_LOGIN_TRUSTED_APP, KEYMASTER_TA_UUID},
                                     TEE_Identity{TEE_LOGIN_TRUSTED_APP, AUTHENTICATOR_TA_UUID}}) {
    open_session(client);
    for (const typed_command& to : every_command) {
      expect_refused(TEE_ERROR_ACCESS_DENIED, {"Refused to a client of login 0xf0000000\n"},
                     [&] { return call(to.command, to.types); });
    }
  }
}

TEST_F(AuthenticatorSlotsTest, ATokenNeedsRoomFor69BytesBeforeAnythingElse) {
  for (const std::size_t capacity : {0U, 1U, 68U}) {
    expect_refused(TEE_ERROR_SHORT_BUFFER, {"The answer needs 69 bytes\n"}, [&] {
      const password_answer got = verify(alice, handle, wrong, 0, capacity);
      EXPECT_EQ(got.size, 69U);
      EXPECT_EQ(got.a, 0U);
      EXPECT_EQ(got.output, bytes(capacity, canary));
      return got.result;
    });
  }
  const password_answer spacious = verify(alice, handle, right, 0, 70);
  EXPECT_EQ(spacious.result, TEE_SUCCESS);
  EXPECT_EQ(spacious.size, 69U);
  EXPECT_EQ(spacious.output.back(), canary);
}

TEST_F(AuthenticatorSlotsTest, AHandleNeedsRoomFor61BytesBeforeAnythingElse) {
  for (const std::size_t capacity : {0U, 1U, 60U}) {
    expect_refused(TEE_ERROR_SHORT_BUFFER, {"The answer needs 61 bytes\n"}, [&] {
      const password_answer got = enrol(alice, right, handle, wrong, capacity);
      EXPECT_EQ(got.size, 61U);
      EXPECT_EQ(got.secure_id(), 0U);
      EXPECT_EQ(got.output, bytes(capacity, canary));
      return got.result;
    });
  }
  const password_answer spacious = enrol(alice, right, {}, {}, 62);
  EXPECT_EQ(spacious.result, TEE_SUCCESS);
  EXPECT_EQ(spacious.size, 61U);
  EXPECT_EQ(spacious.output.back(), canary);
}

TEST_F(AuthenticatorSlotsTest, ABodyThatEndsEarlyOrLateIsNoAttempt) {
  const std::pair<typed_command, bytes> whole[] = {{every_command[0], enrol_request(handle, wrong, right)},
                                                   {every_command[1], verify_request(5, handle, wrong)}};
  for (const auto& [to, body] : whole) {
    for (std::size_t size = 0; size <= body.size() + 1; ++size) {
      if (size == body.size()) continue;
      SCOPED_TRACE(fmt::format("command {}, {} of {} bytes", to.command, size, body.size()));
      bytes other = body;
      other.resize(size);
      expect_refused(TEE_ERROR_BAD_PARAMETERS, {"Malformed request\n"},
                     [&, target = to] { return send(target, other); });
    }
  }
}

TEST_F(AuthenticatorSlotsTest, ALengthBeyondTheBodyIsNoAttempt) {
  for (const std::uint32_t length : {62U, 0x7FFFFFFFU, 0xFFFFFFFCU, 0xFFFFFFFFU}) {
    expect_refused(TEE_ERROR_BAD_PARAMETERS, {"Malformed request\n"}, [&] {
      return send(every_command[1], join({u64(0), u32(length), handle}));
    });
    expect_refused(TEE_ERROR_BAD_PARAMETERS, {"Malformed request\n"}, [&] {
      return send(every_command[0], join({u32(length), handle}));
    });
  }
}

TEST_F(AuthenticatorSlotsTest, ANullBodyIsEmpty) {
  TEE_Param params[4] = {value_slot(alice), {}, memory_slot(room)};
  params[1].memref.size = 100;
  expect_refused(TEE_ERROR_BAD_PARAMETERS, {"Malformed request\n"},
                 [&] { return invoke(COMMAND_VERIFY, verify_types, params); });
}

}  // namespace
}  // namespace testing_support
