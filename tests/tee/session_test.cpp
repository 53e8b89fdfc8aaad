// Instances and sessions as the flags of a TA ask for them, parameters, panics, and calls between TAs.
#include <gmock/gmock.h>

#include <thread>

#include "tee/runtime/uuid.h"
#include "tests/tee/world_fixture.h"

namespace hosted_tee::testing {
namespace {

using ::testing::ElementsAre;

class SessionTest : public WorldTest {
 protected:
  SessionTest() {
    first.create = [this] { return log("create"), TEE_SUCCESS; };
    first.destroy = [this] { log("destroy"); };
    first.open = [this](std::uint32_t, TEE_Param*, void**) { return log("open"), TEE_SUCCESS; };
    first.close = [this](void*) { log("close"); };
  }
  void log(const char* what) { calls.emplace_back(what); }

  std::vector<std::string> calls;
};

TEST_F(SessionTest, ASingleInstanceLivesFromItsFirstSessionToItsLast) {
  const std::uint32_t a = must_open(first_ta::uuid);
  const std::uint32_t b = must_open(first_ta::uuid);
  EXPECT_NE(a, b);
  world->close_session(a);
  EXPECT_TRUE(world->has_instance(first_ta::uuid));
  world->close_session(b);
  EXPECT_FALSE(world->has_instance(first_ta::uuid));
  EXPECT_THAT(calls, ElementsAre("create", "open", "open", "close", "close", "destroy"));
}

TEST_F(SessionTest, AKeptInstanceOutlivesItsLastSession) {
  first.keep_alive = 1;
  world->close_session(must_open(first_ta::uuid));
  EXPECT_TRUE(world->has_instance(first_ta::uuid));
  world->close_session(must_open(first_ta::uuid));
  EXPECT_THAT(calls, ElementsAre("create", "open", "close", "open", "close"));
}

TEST_F(SessionTest, WithoutTheSingleFlagEachSessionHasItsInstance) {
  first.flags = 0;
  const std::uint32_t a = must_open(first_ta::uuid);
  const std::uint32_t b = must_open(first_ta::uuid);
  world->close_session(a);
  world->close_session(b);
  EXPECT_THAT(calls, ElementsAre("create", "open", "create", "open", "close", "destroy", "close", "destroy"));
}

TEST_F(SessionTest, WithoutTheMultiSessionFlagTheSecondSessionMustWait) {
  first.flags = TEE_TA_FLAG_SINGLE_INSTANCE;
  const std::uint32_t a = must_open(first_ta::uuid);
  EXPECT_EQ(open(first_ta::uuid), (reply{TEE_ERROR_BUSY, TEE_ORIGIN_TEE, 0}));
  world->close_session(a);
  EXPECT_EQ(open(first_ta::uuid).result, TEE_SUCCESS);
}

TEST_F(SessionTest, AFailedCreationLeavesNoInstanceAndIsNotDestroyed) {
  first.create = [this] { return log("create"), TEE_ERROR_CORRUPT_OBJECT; };
  EXPECT_EQ(open(first_ta::uuid), (reply{TEE_ERROR_CORRUPT_OBJECT, TEE_ORIGIN_TRUSTED_APP, 0}));
  EXPECT_FALSE(world->has_instance(first_ta::uuid));
  EXPECT_THAT(calls, ElementsAre("create"));
}

TEST_F(SessionTest, ARefusedFirstSessionDestroysTheInstance) {
  first.open = [this](std::uint32_t, TEE_Param*, void**) { return log("open"), TEE_ERROR_ACCESS_DENIED; };
  EXPECT_EQ(open(first_ta::uuid), (reply{TEE_ERROR_ACCESS_DENIED, TEE_ORIGIN_TRUSTED_APP, 0}));
  EXPECT_THAT(calls, ElementsAre("create", "open", "destroy"));
}

TEST_F(SessionTest, UnknownTasAndSessionsAreRefused) {
  const TEE_UUID nobody{1, 2, 3, {}};
  EXPECT_EQ(open(nobody), (reply{TEE_ERROR_ITEM_NOT_FOUND, TEE_ORIGIN_TEE, 0}));
  EXPECT_EQ(invoke(77), (reply{TEE_ERROR_BAD_PARAMETERS, TEE_ORIGIN_API, 0}));
  world->close_session(77);
}

TEST_F(SessionTest, EachSessionKeepsItsContext) {
  static int contexts[2];
  first.open = [n = 0](std::uint32_t, TEE_Param*, void** context) mutable {
    *context = &contexts[n++];
    return TEE_SUCCESS;
  };
  std::vector<void*> seen;
  first.invoke = [&](void* context, std::uint32_t, std::uint32_t, TEE_Param*) {
    return seen.push_back(context), TEE_SUCCESS;
  };
  first.close = [&](void* context) { seen.push_back(context); };
  const std::uint32_t a = must_open(first_ta::uuid);
  const std::uint32_t b = must_open(first_ta::uuid);
  (void)invoke(b);
  (void)invoke(a);
  world->close_session(b);
  EXPECT_THAT(seen, ElementsAre(&contexts[1], &contexts[0], &contexts[1]));
}

TEST_F(SessionTest, OutputValuesAndEmptySlotsReadAsZeroOnEntry) {
  std::array<TEE_Param, 4> seen{};
  first.invoke = [&](void*, std::uint32_t, std::uint32_t, TEE_Param* params) {
    std::copy_n(params, 4, seen.begin());
    params[0].value = {5, 6};
    params[1].value = {7, 8};
    return TEE_ERROR_GENERIC;
  };
  std::array<TEE_Param, 4> params;
  for (TEE_Param& p : params) p.value = {0x11111111, 0x22222222};
  const std::uint32_t types = TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_OUTPUT, TEE_PARAM_TYPE_VALUE_INPUT, 0, 0);
  EXPECT_EQ(invoke(must_open(first_ta::uuid), 0, types, params.data()).result, TEE_ERROR_GENERIC);
  EXPECT_EQ(seen[0].value.a, 0U);
  EXPECT_EQ(seen[0].value.b, 0U);
  EXPECT_EQ(seen[1].value.a, 0x11111111U);
  EXPECT_EQ(seen[2].memref.buffer, nullptr);
  EXPECT_EQ(params[0].value.b, 6U);
  EXPECT_EQ(params[1].value.a, 0x11111111U);  // an input is not handed back
  EXPECT_EQ(params[3].value.a, 0x11111111U);
}

TEST_F(SessionTest, OnlyOutputReferencesHandTheirSizeBack) {
  std::array<std::uint8_t, 4> memory{};
  first.invoke = [&](void*, std::uint32_t, std::uint32_t, TEE_Param* params) {
    EXPECT_EQ(params[0].memref.buffer, memory.data());
    for (int i = 0; i < 3; ++i) params[i].memref.size = 99;
    return TEE_ERROR_SHORT_BUFFER;
  };
  std::array<TEE_Param, 4> params{};
  for (TEE_Param& p : params) p.memref = {memory.data(), 4};
  const std::uint32_t types = TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT,
                                              TEE_PARAM_TYPE_MEMREF_INOUT, TEE_PARAM_TYPE_NONE);
  EXPECT_EQ(invoke(must_open(first_ta::uuid), 0, types, params.data()).result, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(params[0].memref.size, 4U);
  EXPECT_EQ(params[1].memref.size, 99U);
  EXPECT_EQ(params[2].memref.size, 99U);
}

TEST_F(SessionTest, ParameterTypesThatDoNotExistNeverReachTheTa) {
  const std::uint32_t session = must_open(first_ta::uuid);
  std::array<TEE_Param, 4> params{};
  for (const std::uint32_t types : {0x4U, 0x80U, 0xF000U, 0x10000U}) {
    EXPECT_EQ(invoke(session, 0, types, params.data()), (reply{TEE_ERROR_BAD_PARAMETERS, TEE_ORIGIN_API, 0}));
  }
  EXPECT_EQ(invoke(session, 0, 1, nullptr).result, TEE_ERROR_BAD_PARAMETERS);
}

TEST_F(SessionTest, CommandsOfSeveralThreadsRunOneAtATime) {
  int inside = 0;
  int served = 0;
  first.invoke = [&](void*, std::uint32_t, std::uint32_t, TEE_Param*) {
    EXPECT_EQ(++inside, 1);
    ++served;
    --inside;
    return TEE_SUCCESS;
  };
  std::vector<std::thread> clients;
  for (int i = 0; i < 4; ++i) {
    clients.emplace_back([this, session = must_open(first_ta::uuid)] {
      for (int n = 0; n < 1000; ++n) EXPECT_EQ(invoke(session).result, TEE_SUCCESS);
    });
  }
  for (std::thread& client : clients) client.join();
  EXPECT_EQ(served, 4000);
}

using PanicTest = SessionTest;

TEST_F(PanicTest, KillsTheInstanceAndAllOfItsSessionsButNoOther) {
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) -> TEE_Result { TEE_Panic(0xBAD); };
  const std::uint32_t a = must_open(first_ta::uuid);
  const std::uint32_t b = must_open(first_ta::uuid);
  const std::uint32_t other = must_open(second_ta::uuid);
  EXPECT_EQ(invoke(a), dead);
  EXPECT_FALSE(world->has_instance(first_ta::uuid));
  EXPECT_EQ(invoke(a), dead);
  EXPECT_EQ(invoke(b), dead);
  EXPECT_EQ(invoke(other).result, TEE_SUCCESS);
  world->close_session(a);
  world->close_session(b);
  EXPECT_THAT(calls, ElementsAre("create", "open", "open"));  // a dead TA runs no more code
}

TEST_F(PanicTest, TheNextSessionGetsAFreshInstanceWhileOldOnesStayDead) {
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) -> TEE_Result { TEE_Panic(1); };
  const std::uint32_t old = must_open(first_ta::uuid);
  (void)invoke(old);
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return TEE_SUCCESS; };
  const std::uint32_t fresh = must_open(first_ta::uuid);
  EXPECT_EQ(invoke(fresh).result, TEE_SUCCESS);
  EXPECT_EQ(invoke(old), dead);
  world->close_session(old);
  EXPECT_EQ(invoke(fresh).result, TEE_SUCCESS);
}

TEST_F(PanicTest, InAnyEntryPointEndsTheInstance) {
  const auto panics = [] { TEE_Panic(1); };
  first.create = [&]() -> TEE_Result { return panics(), TEE_SUCCESS; };
  EXPECT_EQ(open(first_ta::uuid), dead);
  first.create = [] { return TEE_SUCCESS; };
  first.open = [&](std::uint32_t, TEE_Param*, void**) -> TEE_Result { return panics(), TEE_SUCCESS; };
  EXPECT_EQ(open(first_ta::uuid), dead);
  first.open = [](std::uint32_t, TEE_Param*, void**) { return TEE_SUCCESS; };
  first.close = [&](void*) { panics(); };
  world->close_session(must_open(first_ta::uuid));
  EXPECT_FALSE(world->has_instance(first_ta::uuid));
  first.close = [](void*) {};
  first.destroy = panics;
  world->close_session(must_open(first_ta::uuid));
  EXPECT_FALSE(world->has_instance(first_ta::uuid));
}

TEST_F(PanicTest, ReclaimsWhatTheInstanceHeld) {
  const std::uint32_t types = TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INPUT, 0, 0, 0);
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param* params) -> TEE_Result {
    (void)TEE_Malloc(64, 0);
    TEE_ObjectHandle object = nullptr;
    if (TEE_CreatePersistentObject(TEE_STORAGE_PRIVATE, "x", 1,
                                   TEE_DATA_FLAG_OVERWRITE | TEE_DATA_FLAG_ACCESS_WRITE_META, nullptr, "", 0,
                                   &object) != TEE_SUCCESS) {
      return TEE_ERROR_GENERIC;
    }
    if (params[0].value.a != 0) TEE_Panic(1);
    return TEE_SUCCESS;
  };
  std::array<TEE_Param, 4> params{};
  params[0].value.a = 0;
  const std::uint32_t session = must_open(first_ta::uuid);
  EXPECT_EQ(invoke(session, 0, types, params.data()).result, TEE_SUCCESS);
  EXPECT_EQ(world->account(first_ta::uuid).persistent_objects, 1U);
  EXPECT_EQ(world->account(first_ta::uuid).heap_blocks, 1U);
  world->close_session(session);
  params[0].value.a = 1;
  EXPECT_EQ(invoke(must_open(first_ta::uuid), 0, types, params.data()), dead);
  EXPECT_TRUE(world->account(first_ta::uuid).same_holdings({}));
  params[0].value.a = 0;  // the exclusive handle is gone too: the object can be opened again
  EXPECT_EQ(invoke(must_open(first_ta::uuid), 0, types, params.data()).result, TEE_SUCCESS);
}

TEST_F(PanicTest, IsTracedWithItsReason) {
  (void)in_first([]() -> TEE_Result {
    static int foreign = 0;
    TEE_Free(&foreign);
    return TEE_SUCCESS;
  });
  EXPECT_TRUE(world->trace().contains("SCRIPT panics: the block to free is none of this heap", trace_level::error));
}

class NestedTest : public WorldTest {
 protected:
  static TEE_Result open_second(TEE_TASessionHandle* session, std::uint32_t* origin = nullptr) {
    return TEE_OpenTASession(&second_ta::uuid, TEE_TIMEOUT_INFINITE, 0, nullptr, session, origin);
  }
  static TEE_Result call(TEE_TASessionHandle session, std::uint32_t* origin = nullptr) {
    return TEE_InvokeTACommand(session, TEE_TIMEOUT_INFINITE, 0, 0, nullptr, origin);
  }
};

TEST_F(NestedTest, TheCalledTaSeesTheCallersUuid) {
  TEE_Identity seen{};
  second.invoke = [&](void*, std::uint32_t, std::uint32_t, TEE_Param*) {
    return TEE_GetPropertyAsIdentity(TEE_PROPSET_CURRENT_CLIENT, "gpd.client.identity", &seen);
  };
  const reply r = in_first([] {
    TEE_TASessionHandle session = nullptr;
    if (const TEE_Result opened = open_second(&session); opened != TEE_SUCCESS) return opened;
    const TEE_Result result = call(session);
    TEE_CloseTASession(session);
    return result;
  });
  EXPECT_EQ(r.result, TEE_SUCCESS);
  EXPECT_EQ(seen.login, TEE_LOGIN_TRUSTED_APP);
  EXPECT_TRUE(same_uuid(seen.uuid, first_ta::uuid));
  EXPECT_FALSE(world->has_instance(second_ta::uuid));
}

TEST_F(NestedTest, ParametersGoThroughAndComeBack) {
  second.invoke = [](void*, std::uint32_t command, std::uint32_t, TEE_Param* params) {
    static_cast<char*>(params[0].memref.buffer)[0] = 'y';
    params[0].memref.size = 1;
    params[1].value.a += command;
    return TEE_SUCCESS;
  };
  char buffer[4] = "n";
  std::array<TEE_Param, 4> params{};
  params[0].memref = {buffer, 4};
  params[1].value.a = 40;
  (void)in_first([&] {
    TEE_TASessionHandle session = nullptr;
    (void)open_second(&session);
    const std::uint32_t types = TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_OUTPUT, TEE_PARAM_TYPE_VALUE_INOUT, 0, 0);
    return TEE_InvokeTACommand(session, TEE_TIMEOUT_INFINITE, 2, types, params.data(), nullptr);
  });
  EXPECT_EQ(buffer[0], 'y');
  EXPECT_EQ(params[0].memref.size, 1U);
  EXPECT_EQ(params[1].value.a, 42U);
}

TEST_F(NestedTest, APanicOfTheCalledTaComesBackAsAResult) {
  second.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) -> TEE_Result { TEE_Panic(1); };
  std::uint32_t origin = 0;
  const reply r = in_first([&] {
    TEE_TASessionHandle session = nullptr;
    (void)open_second(&session);
    return call(session, &origin);
  });
  EXPECT_EQ(r, (reply{TEE_ERROR_TARGET_DEAD, TEE_ORIGIN_TRUSTED_APP, 0}));
  EXPECT_EQ(origin, TEE_ORIGIN_TEE);
  EXPECT_FALSE(world->has_instance(second_ta::uuid));
}

TEST_F(NestedTest, ATaThatCallsItselfIsBusy) {
  std::uint32_t origin = 0;
  const reply direct = in_first([&] {
    TEE_TASessionHandle session = nullptr;
    return TEE_OpenTASession(&first_ta::uuid, TEE_TIMEOUT_INFINITE, 0, nullptr, &session, &origin);
  });
  EXPECT_EQ(direct.result, TEE_ERROR_BUSY);
  EXPECT_EQ(origin, TEE_ORIGIN_TEE);
  second.open = [](std::uint32_t, TEE_Param*, void**) {
    TEE_TASessionHandle session = nullptr;
    return TEE_OpenTASession(&first_ta::uuid, TEE_TIMEOUT_INFINITE, 0, nullptr, &session, nullptr);
  };
  const reply round = in_first([] {
    TEE_TASessionHandle session = nullptr;
    return open_second(&session);
  });
  EXPECT_EQ(round.result, TEE_ERROR_BUSY);
}

TEST_F(NestedTest, SessionsToOtherTasEndWithTheirOwner) {
  int closed = 0;
  second.close = [&](void*) { ++closed; };
  const auto hold = [] {
    TEE_TASessionHandle session = nullptr;
    return open_second(&session);
  };
  EXPECT_EQ(in_first(hold).result, TEE_SUCCESS);
  EXPECT_EQ(closed, 1);
  EXPECT_FALSE(world->has_instance(second_ta::uuid));
  EXPECT_EQ(in_first([&]() -> TEE_Result {
              (void)hold();
              TEE_Panic(1);
            }),
            dead);
  EXPECT_EQ(closed, 2);
  EXPECT_FALSE(world->has_instance(second_ta::uuid));
}

// The second TA calls the first, which holds a session to the second and gives it up: the second is on the stack, so
// the session can only be closed when it has returned.
TEST_F(NestedTest, ClosingASessionToATaThatIsRunningWaitsForIt) {
  static TEE_TASessionHandle held;
  std::vector<std::string> calls;
  first.invoke = [&](void*, std::uint32_t command, std::uint32_t, TEE_Param*) {
    if (command == 1) return open_second(&held);
    calls.emplace_back("give up");
    TEE_CloseTASession(held);
    return TEE_SUCCESS;
  };
  second.invoke = [&](void*, std::uint32_t, std::uint32_t, TEE_Param*) {
    TEE_TASessionHandle session = nullptr;
    (void)TEE_OpenTASession(&first_ta::uuid, TEE_TIMEOUT_INFINITE, 0, nullptr, &session, nullptr);
    const TEE_Result result = call(session);
    calls.emplace_back("back");
    return result;
  };
  second.close = [&](void*) { calls.emplace_back("closed"); };
  const std::uint32_t to_first = must_open(first_ta::uuid);
  EXPECT_EQ(invoke(to_first, 1).result, TEE_SUCCESS);
  EXPECT_EQ(invoke(must_open(second_ta::uuid)).result, TEE_SUCCESS);
  EXPECT_THAT(calls, ElementsAre("give up", "back", "closed"));
}

TEST_F(NestedTest, AnInventedSessionHandlePanics) {
  EXPECT_EQ(in_first([] { return call(reinterpret_cast<TEE_TASessionHandle>(std::uintptr_t{0x40})); }), dead);
}

TEST_F(NestedTest, FailedOpeningLeavesTheNullHandle) {
  world->faults().fail_call("TEE_OpenTASession", 1, TEE_ERROR_COMMUNICATION);
  TEE_TASessionHandle session = reinterpret_cast<TEE_TASessionHandle>(std::uintptr_t{1});
  EXPECT_EQ(in_first([&] { return open_second(&session); }).result, TEE_ERROR_COMMUNICATION);
  EXPECT_EQ(session, nullptr);
}

}  // namespace
}  // namespace hosted_tee::testing
