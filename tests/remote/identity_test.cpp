// Who a client is: what the kernel says, the same as for a client in the secure world's own process.
#include <unistd.h>

#include "tee/runtime/uuid.h"
#include "tests/remote/server_fixture.h"

namespace hosted_tee::testing {
namespace {

class IdentityTest : public ServerTest {
 protected:
  IdentityTest() {
    serve();
    first.open = [this](std::uint32_t, TEE_Param*, void**) {
      return TEE_GetPropertyAsIdentity(TEE_PROPSET_CURRENT_CLIENT, "gpd.client.identity", &seen);
    };
  }

  /// Opens a session and gives its result; `seen` is who the TA saw.
  TEEC_Result log_in(const std::string& context_name, std::uint32_t method, const void* data) {
    TEEC_Context context{};
    TEEC_Session session{};
    TEEC_UUID ta{};
    static_assert(sizeof ta == sizeof first_ta::uuid);
    std::memcpy(&ta, &first_ta::uuid, sizeof ta);
    seen = {};
    EXPECT_EQ(TEEC_InitializeContext(context_name.c_str(), &context), TEEC_SUCCESS);
    const TEEC_Result result = TEEC_OpenSession(&context, &session, &ta, method, data, nullptr, nullptr);
    TEEC_CloseSession(&session);
    TEEC_FinalizeContext(&context);
    return result;
  }

  TEE_Identity seen{};
};

TEST_F(IdentityTest, EveryLoginGivesTheIdentityThatAnEmbeddedClientHas) {
  const std::string embedded = "embedded:" + options.state.string();
  const std::uint32_t group = ::getegid();
  for (const auto& [method, data] :
       std::initializer_list<std::pair<std::uint32_t, const void*>>{{TEEC_LOGIN_PUBLIC, nullptr},
                                                                    {TEEC_LOGIN_USER, nullptr},
                                                                    {TEEC_LOGIN_GROUP, &group},
                                                                    {TEEC_LOGIN_APPLICATION, nullptr},
                                                                    {TEEC_LOGIN_USER_APPLICATION, nullptr},
                                                                    {TEEC_LOGIN_GROUP_APPLICATION, &group}}) {
    ASSERT_EQ(log_in(embedded, method, data), TEEC_SUCCESS);
    const TEE_Identity expected = seen;
    ASSERT_EQ(log_in(name(), method, data), TEEC_SUCCESS) << method;
    EXPECT_EQ(seen.login, method);
    EXPECT_TRUE(same_uuid(seen.uuid, expected.uuid)) << method;
  }
}

TEST_F(IdentityTest, AProgramIsNamedByItsPath) {
  ASSERT_EQ(log_in(name(), TEEC_LOGIN_APPLICATION, nullptr), TEEC_SUCCESS);
  const std::string program = std::filesystem::read_symlink("/proc/self/exe").string();
  EXPECT_TRUE(same_uuid(seen.uuid, named_uuid("application=" + program + ";")));
}

TEST_F(IdentityTest, AGroupThatTheProcessIsNotInIsDenied) {
  const std::uint32_t strangers = 0x7FFFFFF0;
  EXPECT_EQ(log_in(name(), TEEC_LOGIN_GROUP, &strangers), TEEC_ERROR_ACCESS_DENIED);
  EXPECT_EQ(log_in(name(), TEEC_LOGIN_GROUP_APPLICATION, &strangers), TEEC_ERROR_ACCESS_DENIED);
}

TEST_F(IdentityTest, LoginsThatDontExistAreRefusedWhoeverSendsThem) {
  const auto client = greeted();
  for (const std::uint32_t method : {3U, 7U, 0x80000000U, 0xF0000000U, 0xFFFFFFFFU}) {
    EXPECT_EQ(client->open_session(first_ta::uuid, method).done.result, TEEC_ERROR_BAD_PARAMETERS) << method;
  }
  EXPECT_EQ(client->open_session(first_ta::uuid, TEEC_LOGIN_USER, 5).done.result, TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(client->open_session(first_ta::uuid, TEEC_LOGIN_PUBLIC).done.result, TEEC_SUCCESS);
}

}  // namespace
}  // namespace hosted_tee::testing
