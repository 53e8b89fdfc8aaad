// Who may send which command, in which form.
#include <fmt/format.h>

#include "tests/companions/provisioning/provisioning_fixture.h"
#include "tests/tee/scripted_ta.h"

using namespace keymaster;
using namespace keymaster::provisioning;

namespace testing_support {
namespace {

using other_ta = hosted_tee::testing::scripted_ta<7>;

enum class who { normal_world, keymaster_ta, anybody };

struct command_case {
  const char* name;
  std::uint32_t id;
  std::uint32_t types;
  who client;
};
constexpr command_case every_command[] = {
    {"put_key", 1, 0x0005, who::normal_world},
    {"get_key", 2, 0x0026, who::keymaster_ta},
    {"put_data", 4, 0x0005, who::normal_world},
    {"get_data", 5, 0x0026, who::keymaster_ta},
    {"generate_attk", 6, 0x0061, who::normal_world},
    {"put_property", 11, 0x0055, who::normal_world},
    {"get_property", 12, 0x0065, who::keymaster_ta},
    {"lock", 13, 0x0000, who::normal_world},
    {"status", 14, 0x0002, who::anybody},
};

constexpr std::uint32_t every_login[] = {
    TEE_LOGIN_PUBLIC,           TEE_LOGIN_USER, TEE_LOGIN_GROUP, TEE_LOGIN_APPLICATION, TEE_LOGIN_APPLICATION_USER,
    TEE_LOGIN_APPLICATION_GROUP};

class CallerTest : public ProvisioningTest {
 protected:
  static TEE_Identity client_of(const command_case& command) {
    return command.client == who::keymaster_ta ? as_keymaster : normal_world;
  }
  /// Sends a command whose slots are memory of the caller, whatever their types.
  TEE_Result send(companion_session& session, std::uint32_t id, std::uint32_t types) {
    TEE_Param params[4] = {memory_slot(memory), memory_slot(memory), memory_slot(memory), memory_slot(memory)};
    return session.invoke(id, types, params);
  }
  void expect_untouched() {
    EXPECT_EQ(memory, bytes(64, canary));
    EXPECT_EQ(status(), 0U);
  }

  bytes memory = bytes(64, canary);
};

TEST_F(CallerTest, EachCommandIsRefusedToWhomItIsNotFor) {
  const TEE_Identity disguised = {TEE_LOGIN_PUBLIC, KEYMASTER_TA_UUID};
  for (const command_case& command : every_command) {
    for (const TEE_Identity& client : {normal_world, disguised, as_keymaster, some_ta}) {
      const bool normal_world_asks = client.login == TEE_LOGIN_PUBLIC;
      const bool keymaster_asks = !normal_world_asks && client.uuid.timeLow == as_keymaster.uuid.timeLow;
      if (command.client == who::anybody || (command.client == who::normal_world && normal_world_asks) ||
          (command.client == who::keymaster_ta && keymaster_asks)) {
        continue;
      }
      SCOPED_TRACE(fmt::format("{} from login {:#x}", command.name, client.login));
      companion_session session(tee.world(), quil_ta, client);
      expect_refused(TEE_ERROR_ACCESS_DENIED, {fmt::format("Refused to a client of login 0x{:08x}\n", client.login)},
                     [&] { return send(session, command.id, command.types); });
      EXPECT_TRUE(tee.traced(std::string(command.name) + "\n", hosted_tee::trace_level::info));
      expect_untouched();
    }
  }
}

TEST_F(CallerTest, TheNormalWorldIsEveryLoginThatIsNotATas) {
  for (const std::uint32_t login : every_login) {
    SCOPED_TRACE(login);
    companion_session session(tee.world(), quil_ta, {login, {}});
    bytes data = {static_cast<std::uint8_t>(login)};
    TEE_Param params[4] = {memory_slot(data)};
    EXPECT_EQ(session.invoke(COMMAND_PUT_DATA, 0x0005, params), TEE_SUCCESS);
    EXPECT_EQ(get_data().data(), data);
  }
}

TEST_F(CallerTest, TheStatusIsToldToEverybody) {
  for (const TEE_Identity& client : {normal_world, as_keymaster, some_ta}) {
    companion_session session(tee.world(), quil_ta, client);
    TEE_Param params[4] = {};
    EXPECT_EQ(session.invoke(COMMAND_STATUS, 0x0002, params), TEE_SUCCESS);
  }
}

TEST_F(CallerTest, ATaThatAsksThroughThePlatformIsKnownByItsUuid) {
  ASSERT_EQ(put_data(pattern(10)), TEE_SUCCESS);
  TEE_Result told = 0, fetched = 0, changed = 0;
  auto& script = other_ta::install();
  script.invoke = [&](void*, std::uint32_t, std::uint32_t, TEE_Param*) {
    TEE_TASessionHandle session = nullptr;
    TEE_Param params[4] = {};
    std::uint8_t room[16] = {};
    const TEE_Result opened = TEE_OpenTASession(&quil_ta, TEE_TIMEOUT_INFINITE, 0, params, &session, nullptr);
    if (opened != TEE_SUCCESS) return opened;
    told = TEE_InvokeTACommand(session, TEE_TIMEOUT_INFINITE, COMMAND_STATUS, 0x0002, params, nullptr);
    params[0].memref = {room, sizeof room};
    fetched = TEE_InvokeTACommand(session, TEE_TIMEOUT_INFINITE, QUIL_COMMAND_GET_DATA, 0x0026, params, nullptr);
    params[0].memref = {room, sizeof room};
    changed = TEE_InvokeTACommand(session, TEE_TIMEOUT_INFINITE, COMMAND_PUT_DATA, 0x0005, params, nullptr);
    TEE_CloseTASession(session);
    return TEE_SUCCESS;
  };
  other_ta::apply();
  ta_client asking(
      tee.context_name(),
      {other_ta::uuid.timeLow, other_ta::uuid.timeMid, other_ta::uuid.timeHiAndVersion, {0x80, 0, 0, 0, 0, 0, 0, 7}});
  ASSERT_EQ(asking.call(1, 0, 0, std::nullopt, std::nullopt).result, TEEC_SUCCESS);
  EXPECT_EQ(told, TEE_SUCCESS);
  EXPECT_EQ(fetched, TEE_ERROR_ACCESS_DENIED);
  EXPECT_EQ(changed, TEE_ERROR_ACCESS_DENIED);
  EXPECT_EQ(get_data().data(), pattern(10));
}

TEST_F(CallerTest, AClientThatThePlatformDoesNotNameIsRefused) {
  for (const command_case& command : every_command) {
    if (command.client == who::anybody) continue;
    SCOPED_TRACE(command.name);
    faults().clear();
    faults().fail_call("TEE_GetPropertyAsIdentity", 1, TEE_ERROR_ITEM_NOT_FOUND);
    companion_session session(tee.world(), quil_ta, client_of(command));
    expect_refused(TEE_ERROR_ITEM_NOT_FOUND, {"Get client identity failed with 0xffff0008\n"},
                   [&] { return send(session, command.id, command.types); });
    expect_untouched();
  }
}

TEST_F(CallerTest, AnotherTypeInAnySlotIsRefused) {
  for (const command_case& command : every_command) {
    companion_session session(tee.world(), quil_ta, client_of(command));
    for (std::uint32_t slot = 0; slot < 4; ++slot) {
      for (const std::uint32_t type : {0U, 1U, 2U, 3U, 5U, 6U, 7U}) {
        const std::uint32_t types = (command.types & ~(0xFU << slot * 4)) | type << slot * 4;
        if (types == command.types) continue;
        SCOPED_TRACE(fmt::format("{} with {:#x}", command.name, types));
        expect_refused(TEE_ERROR_BAD_PARAMETERS, {fmt::format("Bad argument type 0x{:x}\n", types)},
                       [&] { return send(session, command.id, types); });
        EXPECT_EQ(memory, bytes(64, canary));
      }
    }
  }
  expect_untouched();
}

TEST_F(CallerTest, OtherNumbersAreNoCommands) {
  companion_session factory(tee.world(), quil_ta);
  for (const std::uint32_t id : {0U, 3U, 7U, 8U, 9U, 10U, 15U, 0xFF00U, 0xFFFFFFFFU}) {
    expect_refused(TEE_ERROR_NOT_SUPPORTED, {fmt::format("Unknown command 0x{:x}\n", id)},
                   [&] { return send(factory, id, 0x0005); });
  }
  expect_untouched();
}

TEST_F(CallerTest, TheTaIsReachedThroughTheClientApiToo) {
  ta_client factory(tee.context_name(), QUIL_TA_UUID);
  const bytes box = attestation_key_box(rsa_test_key::of_bits(1024).components());
  EXPECT_EQ(factory.call_types(COMMAND_PUT_KEY, 0x0005, 0, 0, box, 0).result, TEEC_SUCCESS);
  const answer told = factory.call_types(COMMAND_STATUS, 0x0002, 0, 0, {}, 0);
  EXPECT_EQ(told.result, TEEC_SUCCESS);
  EXPECT_EQ(static_cast<std::uint32_t>(told.error), STATUS_KEY);
  const answer fetched = factory.call_types(QUIL_COMMAND_GET_KEY, 0x0026, 0, 0, {}, 8192);
  EXPECT_EQ(fetched.result, TEEC_ERROR_ACCESS_DENIED);
  EXPECT_EQ(fetched.origin, TEEC_ORIGIN_TRUSTED_APP);
}

}  // namespace
}  // namespace testing_support
