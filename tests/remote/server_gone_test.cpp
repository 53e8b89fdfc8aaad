// Clients whose server is gone, or is none.
#include <fcntl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>

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

TEST_F(ServerGoneTest, AForkedChildLeavesTheConnectionToItsParent) {
  serve();
  ASSERT_EQ(initialize(), TEEC_SUCCESS);
  ASSERT_EQ(open(), TEEC_SUCCESS);
  const pid_t child = ::fork();
  if (child == 0) ::_exit(invoke() == TEEC_ERROR_COMMUNICATION ? 0 : 1);
  int state = -1;
  ASSERT_EQ(::waitpid(child, &state, 0), child);
  EXPECT_EQ(state, 0);
  EXPECT_EQ(invoke(), TEEC_SUCCESS);
}

/// A server whose answers a test writes. It serves one connection.
class false_server {
 public:
  explicit false_server(const std::string& path) : file_(path, 0600), listener_(file_.take()) {}
  ~false_server() { thread_.join(); }
  false_server(const false_server&) = delete;
  false_server& operator=(const false_server&) = delete;

  /// After an honest hello, and a refusal to use slots, it answers every request with what `answer` gives for it;
  /// nothing closes the connection.
  void run(std::function<bytes(const remote::frame&)> answer) {
    thread_ = std::thread([this, answer = std::move(answer)] {
      ::fcntl(listener_.get(), F_SETFL, 0);
      const file_descriptor peer(::accept(listener_.get(), nullptr, nullptr));
      bytes room(remote::frame_limit);
      for (ssize_t size = 0; (size = ::recv(peer.get(), room.data(), room.size(), 0)) > 0;) {
        remote::frame request;
        if (!remote::read_frame({room.data(), static_cast<std::size_t>(size)}, request)) return;
        const bytes told =
            request.header.kind == 1 || request.header.kind == 7 ? honest_answer(request) : answer(request);
        if (told.empty()) return;
        if (::send(peer.get(), told.data(), told.size(), MSG_NOSIGNAL) < 0) return;
      }
    });
  }

 private:
  static bytes honest_answer(const remote::frame& request) {
    if (request.header.kind == 1) {
      return raw_frame(std::uint16_t{0x8001}, body_of(remote::hello_answer{}), request.header.sequence);
    }
    const remote::plain_answer no{{TEEC_ERROR_NOT_SUPPORTED, TEEC_ORIGIN_COMMS}};
    return raw_frame(std::uint16_t{0x8007}, body_of(no), request.header.sequence);
  }

  listening_socket file_;
  file_descriptor listener_;
  std::thread thread_;
};

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
