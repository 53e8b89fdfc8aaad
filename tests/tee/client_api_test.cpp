// The Client API against a scripted TA: parameters of every type, shared memory, logins, origins, both ways.
#include <gmock/gmock.h>
#include <unistd.h>

#include <array>
#include <filesystem>
#include <limits>

#include "tee/client/connection.h"
#include "tee/runtime/uuid.h"
#include "tee_client_api.h"
#include "tests/remote/server_fixture.h"

namespace hosted_tee::testing {
namespace {

namespace fs = std::filesystem;

TEEC_UUID to_client(const TEE_UUID& uuid) {
  TEEC_UUID out{uuid.timeLow, uuid.timeMid, uuid.timeHiAndVersion, {}};
  std::copy(std::begin(uuid.clockSeqAndNode), std::end(uuid.clockSeqAndNode), std::begin(out.clockSeqAndNode));
  return out;
}

/// The two ways to one and the same device: in this process, and through a server's socket.
enum class way { embedded, server };

class ClientTest : public WorldTest, public ::testing::WithParamInterface<way> {
 protected:
  ClientTest() {
    first_ta::apply();
    if (GetParam() == way::server) server = std::make_unique<running_server>(socket(), world);
    EXPECT_EQ(TEEC_InitializeContext(name().c_str(), &context), TEEC_SUCCESS);
    EXPECT_EQ(open_session(), TEEC_SUCCESS);
  }
  ~ClientTest() override {
    TEEC_CloseSession(&session);
    TEEC_FinalizeContext(&context);
  }

  std::string socket() const { return (folder.path() / "tee.sock").string(); }
  std::string name() const {
    return GetParam() == way::server ? "unix:" + socket() : "embedded:" + options.state.string();
  }

  TEEC_Result open_session(std::uint32_t method = TEEC_LOGIN_PUBLIC, const void* data = nullptr,
                           TEEC_Operation* with = nullptr) {
    TEEC_CloseSession(&session);
    const TEEC_UUID ta = to_client(first_ta::uuid);
    return TEEC_OpenSession(&context, &session, &ta, method, data, with, &origin);
  }
  TEEC_Result invoke() { return TEEC_InvokeCommand(&session, 5, &operation, &origin); }

  /// expect makes the TA look at its slots with `body` and answer `result`.
  void expect(std::uint32_t types, TEE_Result result, const std::function<void(TEE_Param*)>& body) {
    first.invoke = [=](void*, std::uint32_t command, std::uint32_t actual, TEE_Param* params) {
      EXPECT_EQ(command, 5U);
      EXPECT_EQ(actual, types);
      body(params);
      return result;
    };
  }

  std::unique_ptr<running_server> server;
  TEEC_Context context{};
  TEEC_Session session{};
  TEEC_Operation operation{};
  std::uint32_t origin = 99;
};

#if SERVER_IS_TESTED
const auto ways = ::testing::Values(way::embedded, way::server);
#else  // for a server that asks the kernel, every emulated program is the emulator
const auto ways = ::testing::Values(way::embedded);
#endif

INSTANTIATE_TEST_SUITE_P(BothWays, ClientTest, ways,
                         [](const auto& tested) { return tested.param == way::server ? "Server" : "Embedded"; });

TEST_P(ClientTest, CommandsReachTheTaWithAndWithoutAnOperation) {
  expect(0, TEE_SUCCESS, [](TEE_Param*) {});
  EXPECT_EQ(TEEC_InvokeCommand(&session, 5, nullptr, nullptr), TEEC_SUCCESS);
  EXPECT_EQ(invoke(), TEEC_SUCCESS);
  EXPECT_EQ(origin, TEEC_ORIGIN_TRUSTED_APP);
}

TEST_P(ClientTest, ValuesGoBothWays) {
  operation.paramTypes = TEEC_PARAM_TYPES(TEEC_VALUE_INPUT, TEEC_VALUE_OUTPUT, TEEC_VALUE_INOUT, TEEC_NONE);
  for (auto& p : operation.params) p.value = {1, 2};
  expect(0x0321, TEE_ERROR_GENERIC, [](TEE_Param* params) {
    EXPECT_EQ(params[0].value.b, 2U);
    EXPECT_EQ(params[1].value.b, 0U);
    EXPECT_EQ(params[2].value.b, 2U);
    for (int i = 0; i < 4; ++i) params[i].value = {10, 20};
  });
  EXPECT_EQ(invoke(), TEEC_ERROR_GENERIC);
  EXPECT_EQ(operation.params[0].value.a, 1U);
  EXPECT_EQ(operation.params[1].value.a, 10U);
  EXPECT_EQ(operation.params[2].value.b, 20U);
  EXPECT_EQ(operation.params[3].value.b, 2U);
}

TEST_P(ClientTest, TemporaryMemoryTellsItsSizeAlsoWhenItWasTooSmall) {
  char in[] = "in";
  char out[4] = {};
  operation.paramTypes =
      TEEC_PARAM_TYPES(TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_OUTPUT, TEEC_MEMREF_TEMP_INOUT, TEEC_NONE);
  operation.params[0].tmpref = {in, 2};
  operation.params[1].tmpref = {out, 4};
  operation.params[2].tmpref = {nullptr, 0};
  expect(0x0765, TEE_ERROR_SHORT_BUFFER, [](TEE_Param* params) {
    EXPECT_EQ(params[0].memref.size, 2U);
    EXPECT_EQ(params[2].memref.buffer, nullptr);
    static_cast<char*>(params[1].memref.buffer)[0] = 'o';
    for (int i = 0; i < 3; ++i) params[i].memref.size = 1000;
  });
  EXPECT_EQ(invoke(), TEEC_ERROR_SHORT_BUFFER);
  EXPECT_EQ(operation.params[0].tmpref.size, 2U);
  EXPECT_EQ(operation.params[1].tmpref.size, 1000U);
  EXPECT_EQ(operation.params[2].tmpref.size, 1000U);
  EXPECT_EQ(out[0], 'o');
}

TEST_P(ClientTest, ANullBufferAloneMakesANullReference) {
  operation.paramTypes =
      TEEC_PARAM_TYPES(TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_OUTPUT, TEEC_MEMREF_TEMP_INOUT, TEEC_NONE);
  for (const std::size_t size : {std::size_t{1}, std::size_t{1} << 20, std::numeric_limits<std::size_t>::max()}) {
    for (auto& p : operation.params) p.tmpref = {nullptr, size};
    bool is_reached = false;
    expect(0x0765, TEE_SUCCESS, [&](TEE_Param* params) {
      for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(params[i].memref.buffer, nullptr);
        EXPECT_EQ(params[i].memref.size, 0U);
      }
      params[1].memref.size = 16;
      is_reached = true;
    });
    EXPECT_EQ(invoke(), TEEC_SUCCESS);
    EXPECT_EQ(origin, TEEC_ORIGIN_TRUSTED_APP);
    EXPECT_TRUE(is_reached);
    EXPECT_EQ(operation.params[0].tmpref.size, size);
    EXPECT_EQ(operation.params[1].tmpref.size, 16U);
    EXPECT_EQ(operation.params[2].tmpref.size, 0U);
  }
}

TEST_P(ClientTest, MemoryThatCantBeIsRefusedByTheApiItself) {
  char byte = 0;
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return ADD_FAILURE(), TEE_SUCCESS; };
  operation.paramTypes = TEEC_MEMREF_TEMP_INPUT;
  if constexpr (sizeof(std::size_t) > sizeof(std::uint32_t)) {  // elsewhere no size is too large to be told
    operation.params[0].tmpref = {&byte, static_cast<std::size_t>(std::uint64_t{1} << 32)};
    EXPECT_EQ(invoke(), TEEC_ERROR_EXCESS_DATA);
  }
  operation.paramTypes = TEEC_MEMREF_WHOLE;
  TEEC_SharedMemory unregistered{&byte, 1, TEEC_MEM_INPUT, {}};
  for (TEEC_SharedMemory* parent : {&unregistered, static_cast<TEEC_SharedMemory*>(nullptr)}) {
    operation.params[0].memref = {parent, 1, 0};
    EXPECT_EQ(invoke(), TEEC_ERROR_BAD_PARAMETERS);
  }
  TEEC_SharedMemory shared{&byte, 1, TEEC_MEM_INPUT, {}};
  ASSERT_EQ(TEEC_RegisterSharedMemory(&context, &shared), TEEC_SUCCESS);
  shared.buffer = nullptr;  // shared memory is never the null reference
  operation.params[0].memref = {&shared, 1, 0};
  EXPECT_EQ(invoke(), TEEC_ERROR_BAD_PARAMETERS);
  TEEC_ReleaseSharedMemory(&shared);
  for (const std::uint32_t type : {0x4U, 0x8U, 0x9U, 0xAU, 0xBU, 0x10000U}) {
    operation.paramTypes = type;
    EXPECT_EQ(invoke(), TEEC_ERROR_BAD_PARAMETERS) << type;
    EXPECT_EQ(origin, TEEC_ORIGIN_API);
  }
}

// In this process the TA works on the client's own bytes; a server on the bytes that were copied for it.
TEST_P(ClientTest, RegisteredMemoryIsReachedWholeOrInParts) {
  char block[8] = "abcdefg";
  TEEC_SharedMemory shared{block, 8, TEEC_MEM_INPUT | TEEC_MEM_OUTPUT, {}};
  ASSERT_EQ(TEEC_RegisterSharedMemory(&context, &shared), TEEC_SUCCESS);
  operation.paramTypes = TEEC_PARAM_TYPES(TEEC_MEMREF_WHOLE, TEEC_MEMREF_PARTIAL_INPUT, TEEC_MEMREF_PARTIAL_OUTPUT,
                                          TEEC_MEMREF_PARTIAL_INOUT);
  operation.params[0].memref = {&shared, 0, 0};
  operation.params[1].memref = {&shared, 2, 1};
  operation.params[2].memref = {&shared, 0, 8};
  operation.params[3].memref = {&shared, 3, 5};
  expect(0x7657, TEE_SUCCESS, [&](TEE_Param* params) {
    const char* const seen = static_cast<const char*>(params[0].memref.buffer);
    EXPECT_EQ(seen == block, GetParam() == way::embedded);
    EXPECT_STREQ(seen, "abcdefg");
    EXPECT_EQ(params[0].memref.size, 8U);
    EXPECT_EQ(params[1].memref.buffer, seen + 1);
    EXPECT_EQ(params[2].memref.size, 0U);
    EXPECT_EQ(params[3].memref.buffer, seen + 5);
    for (std::uint32_t i = 0; i < 4; ++i) params[i].memref.size = i + 20;
  });
  EXPECT_EQ(invoke(), TEEC_SUCCESS);
  EXPECT_EQ(operation.params[0].memref.size, 20U);
  EXPECT_EQ(operation.params[1].memref.size, 2U);
  EXPECT_EQ(operation.params[2].memref.size, 22U);
  EXPECT_EQ(operation.params[3].memref.size, 23U);
  TEEC_ReleaseSharedMemory(&shared);
  EXPECT_EQ(shared.buffer, block);
  EXPECT_EQ(invoke(), TEEC_ERROR_BAD_PARAMETERS);
}

TEST_P(ClientTest, PartsMustLieInsideAndGoTheMemorysWay) {
  char block[8] = {};
  TEEC_SharedMemory shared{block, 8, TEEC_MEM_INPUT, {}};
  ASSERT_EQ(TEEC_RegisterSharedMemory(&context, &shared), TEEC_SUCCESS);
  operation.paramTypes = TEEC_MEMREF_PARTIAL_INPUT;
  for (const auto& [size, offset] : {std::pair<std::size_t, std::size_t>{9, 0}, {1, 8}, {SIZE_MAX, 1}, {0, 9}}) {
    operation.params[0].memref = {&shared, size, offset};
    EXPECT_EQ(invoke(), TEEC_ERROR_BAD_PARAMETERS) << size << " from " << offset;
  }
  operation.params[0].memref = {&shared, 1, 0};
  for (const std::uint32_t type : {TEEC_MEMREF_PARTIAL_OUTPUT, TEEC_MEMREF_PARTIAL_INOUT}) {
    operation.paramTypes = type;
    EXPECT_EQ(invoke(), TEEC_ERROR_BAD_PARAMETERS);
  }
  TEEC_ReleaseSharedMemory(&shared);
}

TEST_P(ClientTest, AllocatedMemoryIsGivenAndTakenBack) {
  TEEC_SharedMemory shared{nullptr, 0, TEEC_MEM_OUTPUT, {}};
  ASSERT_EQ(TEEC_AllocateSharedMemory(&context, &shared), TEEC_SUCCESS);
  EXPECT_NE(shared.buffer, nullptr);
  TEEC_ReleaseSharedMemory(&shared);
  EXPECT_EQ(shared.buffer, nullptr);
  shared = {nullptr, TEEC_CONFIG_SHAREDMEM_MAX_SIZE + 1, TEEC_MEM_OUTPUT, {}};
  EXPECT_EQ(TEEC_AllocateSharedMemory(&context, &shared), TEEC_ERROR_OUT_OF_MEMORY);
  shared = {nullptr, 1, 4, {}};
  EXPECT_EQ(TEEC_AllocateSharedMemory(&context, &shared), TEEC_ERROR_BAD_PARAMETERS);
  shared = {nullptr, 1, TEEC_MEM_INPUT, {}};
  EXPECT_EQ(TEEC_RegisterSharedMemory(&context, &shared), TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(TEEC_RegisterSharedMemory(nullptr, &shared), TEEC_ERROR_BAD_PARAMETERS);
  TEEC_ReleaseSharedMemory(nullptr);
}

TEST_P(ClientTest, MemoryThatCouldNotBeAllocatedHasNoAddress) {
  char byte = 0;
  TEEC_SharedMemory shared{&byte, TEEC_CONFIG_SHAREDMEM_MAX_SIZE + 1, TEEC_MEM_OUTPUT, {}};
  EXPECT_EQ(TEEC_AllocateSharedMemory(&context, &shared), TEEC_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(shared.buffer, nullptr);
  TEEC_ReleaseSharedMemory(&shared);
  shared = {&byte, 1, TEEC_MEM_OUTPUT, {}};
  EXPECT_EQ(TEEC_AllocateSharedMemory(nullptr, &shared), TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(shared.buffer, nullptr);
}

TEST_P(ClientTest, MemoryOfAnotherContextIsRefused) {
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return ADD_FAILURE(), TEE_SUCCESS; };
  TEEC_Context other{};
  ASSERT_EQ(TEEC_InitializeContext(name().c_str(), &other), TEEC_SUCCESS);
  char own[10] = {};
  TEEC_SharedMemory allocated{nullptr, 10, TEEC_MEM_INPUT, {}}, registered{own, 10, TEEC_MEM_INPUT, {}};
  ASSERT_EQ(TEEC_AllocateSharedMemory(&other, &allocated), TEEC_SUCCESS);
  ASSERT_EQ(TEEC_RegisterSharedMemory(&other, &registered), TEEC_SUCCESS);
  for (TEEC_SharedMemory* memory : {&allocated, &registered}) {
    operation.paramTypes = TEEC_MEMREF_WHOLE;
    operation.params[0].memref = {memory, 0, 0};
    EXPECT_EQ(invoke(), TEEC_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(origin, TEEC_ORIGIN_API);
    TEEC_ReleaseSharedMemory(memory);
  }
  TEEC_FinalizeContext(&other);
}

TEST_P(ClientTest, APanicIsTheTeesAnswerAndTheSessionStaysDead) {
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) -> TEE_Result { TEE_Panic(3); };
  for (int i = 0; i < 2; ++i) {
    EXPECT_EQ(invoke(), TEEC_ERROR_TARGET_DEAD);
    EXPECT_EQ(origin, TEEC_ORIGIN_TEE);
  }
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return TEE_SUCCESS; };
  EXPECT_EQ(open_session(), TEEC_SUCCESS);
  EXPECT_EQ(invoke(), TEEC_SUCCESS);
}

TEST_P(ClientTest, SessionsOpenWithParametersAndSayWhereTheyFailed) {
  operation.paramTypes = TEEC_VALUE_INOUT;
  operation.params[0].value = {1, 0};
  first.open = [](std::uint32_t, TEE_Param* params, void**) {
    params[0].value.b = params[0].value.a + 1;
    return TEE_ERROR_ACCESS_DENIED;
  };
  EXPECT_EQ(open_session(TEEC_LOGIN_PUBLIC, nullptr, &operation), TEEC_ERROR_ACCESS_DENIED);
  EXPECT_EQ(origin, TEEC_ORIGIN_TRUSTED_APP);
  EXPECT_EQ(operation.params[0].value.b, 2U);
  EXPECT_EQ(session.imp, nullptr);
  const TEEC_UUID nobody{1, 2, 3, {}};
  EXPECT_EQ(TEEC_OpenSession(&context, &session, &nobody, 0, nullptr, nullptr, &origin), TEEC_ERROR_ITEM_NOT_FOUND);
  EXPECT_EQ(origin, TEEC_ORIGIN_TEE);
}

TEST_P(ClientTest, LoginsGiveTheTaAnIdentity) {
  TEE_Identity seen{};
  first.open = [&](std::uint32_t, TEE_Param*, void**) {
    return TEE_GetPropertyAsIdentity(TEE_PROPSET_CURRENT_CLIENT, "gpd.client.identity", &seen);
  };
  const std::string uid = "uid=" + std::to_string(::geteuid()) + ";";
  const std::string gid = "gid=" + std::to_string(::getegid()) + ";";
  const std::string program = "application=" + fs::read_symlink("/proc/self/exe").string() + ";";
  const std::uint32_t group = ::getegid();
  for (const auto& [method, data, who] : std::initializer_list<std::tuple<std::uint32_t, const void*, std::string>>{
           {TEEC_LOGIN_USER, nullptr, uid},
           {TEEC_LOGIN_GROUP, &group, gid},
           {TEEC_LOGIN_APPLICATION, nullptr, program},
           {TEEC_LOGIN_USER_APPLICATION, nullptr, uid + program},
           {TEEC_LOGIN_GROUP_APPLICATION, &group, gid + program}}) {
    EXPECT_EQ(open_session(method, data), TEEC_SUCCESS) << who;
    EXPECT_EQ(seen.login, method);
    EXPECT_TRUE(same_uuid(seen.uuid, named_uuid(who))) << who;
  }
  EXPECT_EQ(open_session(), TEEC_SUCCESS);
  EXPECT_TRUE(same_uuid(seen.uuid, {}));
}

TEST_P(ClientTest, LoginsThatCantBeVouchedForAreRefused) {
  const std::uint32_t strangers = 0x7FFFFFF0;
  EXPECT_EQ(open_session(TEEC_LOGIN_GROUP, &strangers), TEEC_ERROR_ACCESS_DENIED);
  EXPECT_EQ(open_session(TEEC_LOGIN_GROUP, nullptr), TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(open_session(TEEC_LOGIN_PUBLIC, &strangers), TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(open_session(3), TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(open_session(TEE_LOGIN_TRUSTED_APP), TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(origin, TEEC_ORIGIN_API);
}

TEST_P(ClientTest, NullArgumentsAreBadParametersOrNothing) {
  TEEC_Session none{};
  EXPECT_EQ(TEEC_InvokeCommand(nullptr, 0, nullptr, &origin), TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(TEEC_InvokeCommand(&none, 0, nullptr, &origin), TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(TEEC_OpenSession(&context, &none, nullptr, 0, nullptr, nullptr, nullptr), TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(TEEC_InitializeContext(name().c_str(), nullptr), TEEC_ERROR_BAD_PARAMETERS);
  TEEC_CloseSession(nullptr);
  TEEC_CloseSession(&none);
  TEEC_FinalizeContext(nullptr);
  TEEC_RequestCancellation(nullptr);
}

TEST_P(ClientTest, ContextsOfOneFolderShareTheDeviceAndKeepItRunning) {
  TEEC_Context second_context{};
  ASSERT_EQ(TEEC_InitializeContext(name().c_str(), &second_context), TEEC_SUCCESS);
  world.reset();
  TEEC_Session second_session{};
  const TEEC_UUID ta_uuid = to_client(first_ta::uuid);
  EXPECT_EQ(TEEC_OpenSession(&second_context, &second_session, &ta_uuid, 0, nullptr, nullptr, nullptr), TEEC_SUCCESS);
  EXPECT_NE(secure_world::find_open(options.state), nullptr);
  TEEC_CloseSession(&second_session);
  TEEC_FinalizeContext(&second_context);
  TEEC_CloseSession(&session);
  TEEC_FinalizeContext(&context);
  server.reset();  // which is the last to let go where there is one
  EXPECT_EQ(secure_world::find_open(options.state), nullptr);
}

}  // namespace
}  // namespace hosted_tee::testing
