// Clients whose server is gone, or is none.
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>

#include "tests/remote/false_server.h"
#include "tests/remote/held_command.h"
#include "tests/remote/server_fixture.h"

namespace hosted_tee::testing {
namespace {

class ServerGoneTest : public ServerTest {
 protected:
  ServerGoneTest() { std::memcpy(&ta, &first_ta::uuid, sizeof ta); }
  ~ServerGoneTest() override {
    TEEC_CloseSession(&session);
    TEEC_FinalizeContext(&context);
  }

  TEEC_Result initialize() { return TEEC_InitializeContext(name().c_str(), &context); }
  TEEC_Result open() { return TEEC_OpenSession(&context, &session, &ta, TEEC_LOGIN_PUBLIC, nullptr, nullptr, &origin); }
  TEEC_Result invoke() { return TEEC_InvokeCommand(&session, 5, nullptr, &origin); }

  TEEC_UUID ta{};
  TEEC_Context context{};
  TEEC_Session session{};
  std::uint32_t origin = 99;
};

TEST_F(ServerGoneTest, EveryCallSaysThatTheWayBrokeAndANewContextWorks) {
  serve();
  ASSERT_EQ(initialize(), TEEC_SUCCESS);
  ASSERT_EQ(open(), TEEC_SUCCESS);
  TEEC_SharedMemory shared{nullptr, 10, TEEC_MEM_INPUT, {}};
  ASSERT_EQ(TEEC_AllocateSharedMemory(&context, &shared), TEEC_SUCCESS);
  server.reset();
  for (int i = 0; i < 2; ++i) {
    EXPECT_EQ(invoke(), TEEC_ERROR_COMMUNICATION);
    EXPECT_EQ(origin, TEEC_ORIGIN_COMMS);
  }
  TEEC_Session another{};
  EXPECT_EQ(TEEC_OpenSession(&context, &another, &ta, 0, nullptr, nullptr, &origin), TEEC_ERROR_COMMUNICATION);
  EXPECT_EQ(origin, TEEC_ORIGIN_COMMS);
  TEEC_SharedMemory more{nullptr, 10, TEEC_MEM_INPUT, {}};
  EXPECT_EQ(TEEC_AllocateSharedMemory(&context, &more), TEEC_ERROR_COMMUNICATION);
  TEEC_ReleaseSharedMemory(&shared);
  TEEC_CloseSession(&session);
  TEEC_FinalizeContext(&context);
  EXPECT_EQ(initialize(), TEEC_ERROR_COMMUNICATION);
  serve();
  ASSERT_EQ(initialize(), TEEC_SUCCESS);
  ASSERT_EQ(open(), TEEC_SUCCESS);
  EXPECT_EQ(invoke(), TEEC_SUCCESS);
}

TEST_F(ServerGoneTest, NamesThatNoSocketCanHaveAreBadParameters) {
  for (const std::string& name : {std::string("unix:"), std::string("unix"), "unix:/" + std::string(200, 'x')}) {
    EXPECT_EQ(TEEC_InitializeContext(name.c_str(), &context), TEEC_ERROR_BAD_PARAMETERS) << name;
  }
}

/// holds_in_a_child tells whether something is so in a forked process. One that waits for a thread it does not have is
/// ended by the alarm.
bool holds_in_a_child(const std::function<bool()>& holds) {
  const pid_t child = ::fork();
  if (child == 0) {
    ::alarm(20);
    ::_exit(holds() ? 0 : 1);
  }
  int state = -1;
  return ::waitpid(child, &state, 0) == child && state == 0;
}

TEST_F(ServerGoneTest, AForkedChildLeavesTheConnectionToItsParent) {
  serve();
  ASSERT_EQ(initialize(), TEEC_SUCCESS);
  ASSERT_EQ(open(), TEEC_SUCCESS);
  EXPECT_TRUE(holds_in_a_child([this] { return invoke() == TEEC_ERROR_COMMUNICATION && origin == TEEC_ORIGIN_COMMS; }));
  EXPECT_EQ(invoke(), TEEC_SUCCESS);
}

TEST_F(ServerGoneTest, AForkedChildDoesNotWaitForACallOfItsParentsThread) {
  serve();
  ASSERT_EQ(initialize(), TEEC_SUCCESS);
  ASSERT_EQ(open(), TEEC_SUCCESS);
  TEEC_SharedMemory shared{nullptr, 10, TEEC_MEM_INPUT, {}};
  ASSERT_EQ(TEEC_AllocateSharedMemory(&context, &shared), TEEC_SUCCESS);
  held_command command(first);
  std::thread calling([this] { EXPECT_EQ(invoke(), TEEC_SUCCESS); });
  command.wait_until_it_runs();

  std::uint32_t told = 99;
  TEEC_Session another{};
  char byte = 0;
  TEEC_SharedMemory more{&byte, 1, TEEC_MEM_INPUT, {}};
  const auto fails = [](TEEC_Result result) { return result == TEEC_ERROR_COMMUNICATION; };
  EXPECT_TRUE(holds_in_a_child(
      [&] { return fails(TEEC_InvokeCommand(&session, 5, nullptr, &told)) && told == TEEC_ORIGIN_COMMS; }));
  EXPECT_TRUE(holds_in_a_child([&] {
    return fails(TEEC_OpenSession(&context, &another, &ta, 0, nullptr, nullptr, &told)) && told == TEEC_ORIGIN_COMMS;
  }));
  EXPECT_TRUE(holds_in_a_child([&] { return fails(TEEC_RegisterSharedMemory(&context, &more)); }));
  EXPECT_TRUE(holds_in_a_child([&] { return fails(TEEC_AllocateSharedMemory(&context, &more)); }));
  EXPECT_TRUE(holds_in_a_child([&] { return TEEC_ReleaseSharedMemory(&shared), shared.buffer == nullptr; }));
  EXPECT_TRUE(holds_in_a_child([&] { return TEEC_CloseSession(&session), session.imp == nullptr; }));

  command.let_go();
  calling.join();
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return TEE_SUCCESS; };
  EXPECT_EQ(invoke(), TEEC_SUCCESS);
  const server_status now = status();
  EXPECT_EQ(now.sessions, 1U);
  EXPECT_EQ(now.shared_blocks, 1U);
  TEEC_ReleaseSharedMemory(&shared);
}

TEST_F(ServerGoneTest, AnAnswerThatDoesNotBelongToTheRequestEndsTheConnection) {
  const remote::open_answer sound{{0, 4}, 1, {}};
  remote::open_answer other_types = sound;
  other_types.params.types = TEE_PARAM_TYPE_VALUE_OUTPUT;
  const auto answers = std::to_array<std::function<bytes(const remote::frame&)>>({
      [](const remote::frame&) { return bytes{}; },
      [](const remote::frame&) {
        return bytes{1, 2, 3};
      },
      [&](const remote::frame& r) { return raw_frame(std::uint16_t{0x8002}, body_of(sound), r.header.sequence + 1); },
      [&](const remote::frame& r) { return raw_frame(std::uint16_t{0x8003}, body_of(sound), r.header.sequence); },
      [&](const remote::frame& r) { return raw_frame(std::uint16_t{2}, body_of(sound), r.header.sequence); },
      [](const remote::frame& r) { return raw_frame(std::uint16_t{0x8002}, bytes(3), r.header.sequence); },
      [&](const remote::frame& r) {
        bytes newer = raw_frame(std::uint16_t{0x8002}, body_of(sound), r.header.sequence);
        newer[4] = 2;
        return newer;
      },
      [&](const remote::frame& r) { return raw_frame(std::uint16_t{0x8002}, body_of(other_types), r.header.sequence); },
  });
  for (std::size_t i = 0; i < answers.size(); ++i) {
    std::atomic<int> asked = 0;
    {
      false_server liar(path());
      liar.run([&](const remote::frame& request) { return ++asked, answers[i](request); });
      ASSERT_EQ(initialize(), TEEC_SUCCESS);
      for (int again = 0; again < 2; ++again) {
        EXPECT_EQ(open(), TEEC_ERROR_COMMUNICATION) << i;
        EXPECT_EQ(origin, TEEC_ORIGIN_COMMS);
        EXPECT_EQ(session.imp, nullptr);
      }
      TEEC_FinalizeContext(&context);
    }
    EXPECT_EQ(asked, 1) << i;
  }
}

TEST_F(ServerGoneTest, MoreMemoryThanTheRequestHadRoomForIsNotTaken) {
  false_server liar(path());
  const bytes much(64, 0x66);
  liar.run([&](const remote::frame& r) {
    if (r.header.kind != 3) {
      return raw_frame(std::uint16_t{0x8002}, body_of(remote::open_answer{{0, 4}, 1, {}}), r.header.sequence);
    }
    remote::invoke_answer answer{{0, 4}, {TEE_PARAM_TYPE_MEMREF_OUTPUT, {}}};
    answer.params.slots[0].size = 64;
    answer.params.slots[0].data = much;
    return raw_frame(std::uint16_t{0x8003}, body_of(answer), r.header.sequence);
  });
  ASSERT_EQ(initialize(), TEEC_SUCCESS);
  ASSERT_EQ(open(), TEEC_SUCCESS);
  bytes room(16, 0xA5);
  TEEC_Operation operation{};
  operation.paramTypes = TEEC_MEMREF_TEMP_OUTPUT;
  operation.params[0].tmpref = {room.data(), 8};
  EXPECT_EQ(TEEC_InvokeCommand(&session, 5, &operation, &origin), TEEC_ERROR_COMMUNICATION);
  EXPECT_EQ(origin, TEEC_ORIGIN_COMMS);
  EXPECT_EQ(room, bytes(16, 0xA5));
  EXPECT_EQ(operation.params[0].tmpref.size, 8U);
  TEEC_CloseSession(&session);
  TEEC_FinalizeContext(&context);
}

}  // namespace
}  // namespace hosted_tee::testing
