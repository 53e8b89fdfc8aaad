// Clients whose server answers in the slot with something else than a frame, or not at all.
#include <fcntl.h>
#include <sys/socket.h>

#include <functional>

#include "tests/remote/slot_client.h"

namespace hosted_tee::testing {
namespace {

/// What a test's server does with a request that lies in the slot. When it returns the server is gone.
struct slot_request {
  const slot_memory& slots;
  int socket;
  std::uint32_t sequence;

  void answer(const bytes& frame, std::uint32_t word) const {
    std::copy(frame.begin(), frame.end(), slots.answer_bytes());
    if (slots.answer().exchange(word) == 1) wake();
  }
  void wake() const { (void)::send(socket, "", 1, MSG_NOSIGNAL); }
};

bytes sound_answer(std::uint32_t sequence) {
  return raw_frame(std::uint16_t{0x8002}, body_of(remote::open_answer{{0, 4}, 1, {}}), sequence);
}

class SlotServerTest : public ServerTest {
 protected:
  using act = std::function<void(const slot_request&)>;

  void SetUp() override {
    if (!frame_channel::wants_slots()) GTEST_SKIP() << "slots take two processors";
  }
  ~SlotServerTest() override {
    if (thread.joinable()) thread.join();
  }

  /// serve_once takes a client's slots, and its first request out of them. A server that `stays` after `play` leaves
  /// the end to the client.
  void serve_once(act play, bool stays) {
    client_has_left = false;
    file = std::make_unique<listening_socket>(path(), 0600);
    thread = std::thread([this, listener = file->take(), play = std::move(play), stays] {
      ::fcntl(listener.get(), F_SETFL, 0);
      const file_descriptor peer(::accept(listener.get(), nullptr, nullptr));
      bytes room(remote::frame_limit);
      (void)receive_packet(peer.get(), room);
      (void)send_packet(peer.get(), raw_frame(std::uint16_t{0x8001}, body_of(remote::hello_answer{}), 1));
      const received share = receive_packet(peer.get(), room);
      const slot_memory slots(*map_file(share.descriptors.at(0).get(), wire_slots.size()));
      (void)send_packet(peer.get(), raw_frame(std::uint16_t{0x8007}, body_of(remote::plain_answer{{0, 3}}), 2));
      if (eventually([&] { return slots.request().load() != 0; })) {
        slots.request().store(0);
        play({slots, peer.get(), 3});
      }
      std::uint8_t nothing = 0;
      client_has_left = stays && eventually([&] { return ::recv(peer.get(), &nothing, 1, MSG_DONTWAIT) == 0; });
    });
  }

  /// opens tells what the first request's result is.
  TEEC_Result opens(const act& play, bool stays = false) {
    if (thread.joinable()) thread.join();
    file.reset();
    serve_once(play, stays);
    TEEC_Context context{};
    TEEC_Session session{};
    TEEC_UUID ta{};
    EXPECT_EQ(TEEC_InitializeContext(name().c_str(), &context), TEEC_SUCCESS);
    const TEEC_Result result = TEEC_OpenSession(&context, &session, &ta, 0, nullptr, nullptr, &origin);
    TEEC_CloseSession(&session);
    TEEC_FinalizeContext(&context);
    return result;
  }

  void expect_gone(const act& play) {
    EXPECT_EQ(opens(play), TEEC_ERROR_COMMUNICATION);
    EXPECT_EQ(origin, TEEC_ORIGIN_COMMS);
  }
  void expect_broken(const act& play) {
    EXPECT_EQ(opens(play, true), TEEC_ERROR_COMMUNICATION);
    EXPECT_EQ(origin, TEEC_ORIGIN_COMMS);
    thread.join();
    EXPECT_TRUE(client_has_left);
  }

  std::unique_ptr<listening_socket> file;
  std::thread thread;
  bool client_has_left = false;
  std::uint32_t origin = 99;
};

TEST_F(SlotServerTest, AnAnswerInTheSlotIsTaken) {
  EXPECT_EQ(opens([](const slot_request& request) {
              const bytes answer = sound_answer(request.sequence);
              request.answer(answer, static_cast<std::uint32_t>(answer.size()));
              (void)eventually([&] { return request.slots.answer().load() == 0; });
            }),
            TEEC_SUCCESS);
  EXPECT_EQ(origin, TEEC_ORIGIN_TRUSTED_APP);
}

// As of a server that finishes a command and ends.
TEST_F(SlotServerTest, AnAnswerThatIsFollowedByTheEndIsTaken) {
  for (int i = 0; i < 200; ++i) {
    ASSERT_EQ(opens([](const slot_request& request) {
                const bytes answer = sound_answer(request.sequence);
                request.answer(answer, static_cast<std::uint32_t>(answer.size()));
              }),
              TEEC_SUCCESS);
  }
}

TEST_F(SlotServerTest, AnAnswerToAClientThatSleepsIsTaken) {
  EXPECT_EQ(opens([](const slot_request& request) {
              EXPECT_TRUE(eventually([&] { return request.slots.answer().load() == 1; }));
              const bytes answer = sound_answer(request.sequence);
              request.answer(answer, static_cast<std::uint32_t>(answer.size()));
              (void)eventually([&] { return request.slots.answer().load() == 0; });
            }),
            TEEC_SUCCESS);
}

TEST_F(SlotServerTest, LengthsThatTheAnswerDoesNotHaveBreakTheConnection) {
  for (const std::uint32_t word : {2U, 15U, 65536U, 65537U, 0x80000000U, 0xFFFFFFFFU}) {
    expect_broken([&](const slot_request& request) { request.answer(sound_answer(request.sequence), word); });
  }
}

TEST_F(SlotServerTest, AnotherSequenceInTheSlotBreaksTheConnection) {
  expect_broken([](const slot_request& request) {
    const bytes answer = sound_answer(request.sequence - 1);
    request.answer(answer, static_cast<std::uint32_t>(answer.size()));
  });
}

TEST_F(SlotServerTest, AWakeUpWithoutAnAnswerBreaksTheConnection) {
  expect_broken([](const slot_request& request) {
    (void)eventually([&] { return request.slots.answer().load() == 1; });
    request.wake();
  });
}

TEST_F(SlotServerTest, AServerThatDiesIsNoticedWhetherTheClientSleepsOrNot) {
  expect_gone([](const slot_request&) {});
  expect_gone(
      [](const slot_request& request) { EXPECT_TRUE(eventually([&] { return request.slots.answer().load() == 1; })); });
}

}  // namespace
}  // namespace hosted_tee::testing
