// Slots, and clients that spoil them in every way. Each loses at most its own connection.
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/socket.h>

#include "tests/remote/slot_client.h"

namespace hosted_tee::testing {
namespace {

using remote::frame_kind;
using remote::refusal;

constexpr int all_seals = F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_SEAL;

bytes invoke_frame(std::uint32_t session, std::uint32_t sequence = 1) {
  return raw_frame(frame_kind::invoke, body_of(remote::invoke_request{session, 5, {}}), sequence);
}

class HostileSlotsTest : public ServerTest {
 protected:
  void SetUp() override {
    if (!frame_channel::wants_slots()) GTEST_SKIP() << "slots take two processors";
    serve();
    client = std::make_unique<slot_client>(path());
    session = client->must_open(first_ta::uuid);
  }

  void expect_served_through_slot(std::uint32_t sequence) {
    client->put(invoke_frame(session, sequence));
    const raw_answer answer = client->take();
    remote::invoke_answer told;
    ASSERT_TRUE(remote::read_body(answer.body, told));
    EXPECT_EQ(answer.kind, remote::answer_to(frame_kind::invoke));
    EXPECT_EQ(answer.sequence, sequence);
    EXPECT_EQ(told.done.result, TEEC_SUCCESS);
  }

  /// The connection is over, and nothing but that.
  void expect_refused() {
    EXPECT_TRUE(client->is_refused());
    client->close();
    expect_served();
    EXPECT_TRUE(has_let_go());
  }

  remote::outcome offer(raw_client& other, int file) {
    return other.ask<remote::plain_answer>(frame_kind::use_slots, remote::empty_request{}, {file}).done;
  }

  std::unique_ptr<slot_client> client;
  std::uint32_t session = 0;
};

TEST_F(HostileSlotsTest, CommandsGoThroughTheSlotWhetherTheServerSleepsOrNot) {
  for (std::uint32_t i = 1; i < 50; ++i) expect_served_through_slot(i);
  EXPECT_TRUE(client->waits_for_sleep());
  expect_served_through_slot(0xFFFFFFFF);
  EXPECT_TRUE(client->waits_for_sleep());
  EXPECT_EQ(client->invoke(session).done.result, TEEC_SUCCESS);  // by the socket, and answered there
  expect_served_through_slot(7);
}

TEST_F(HostileSlotsTest, AnAnswerToASleeperComesWithAWakeUp) {
  client->slots().answer().store(1);
  client->put(invoke_frame(session));
  std::array<std::uint8_t, 16> packet{};
  ASSERT_EQ(::recv(client->socket(), packet.data(), packet.size(), 0), 1);
  EXPECT_EQ(packet[0], 0);
  EXPECT_EQ(client->take().kind, remote::answer_to(frame_kind::invoke));
}

TEST_F(HostileSlotsTest, LengthsThatNoFrameHasEndTheirConnectionAlone) {
  for (const std::uint32_t word : {1U, 2U, 15U, 65537U, 131072U, 0x7FFFFFFFU, 0x80000000U, 0xFFFFFFFFU}) {
    client = std::make_unique<slot_client>(path());
    client->mark(invoke_frame(session), word, true);
    EXPECT_TRUE(client->is_refused()) << word;
  }
  expect_served();
}

TEST_F(HostileSlotsTest, LengthsBesideTheFramesOwnAreRefused) {
  const bytes frame = invoke_frame(session);
  for (const std::size_t size : {frame.size() - 1, frame.size() + 1, remote::frame_limit}) {
    client = std::make_unique<slot_client>(path());
    client->mark(frame, static_cast<std::uint32_t>(size));
    EXPECT_TRUE(client->is_refused()) << size;
  }
}

TEST_F(HostileSlotsTest, AWakeUpWithoutAFrameIsRefused) {
  ASSERT_TRUE(client->waits_for_sleep());
  client->send({0});
  expect_refused();
}

TEST_F(HostileSlotsTest, AWakeUpWithoutSlotsIsRefused) {
  const auto other = greeted();
  EXPECT_EQ(other->refusal_after({0}), refusal::malformed);
}

TEST_F(HostileSlotsTest, AWordThatIsSpoiltUnderASleeperIsNoticedWithTheNextFrame) {
  for (const std::uint32_t word : {0U, 2U, 0xFFFFFFFFU}) {
    client = std::make_unique<slot_client>(path());
    ASSERT_TRUE(client->waits_for_sleep());
    client->slots().request().store(word);
    client->send(raw_frame(frame_kind::status));
    EXPECT_TRUE(client->is_refused()) << word;
  }
}

TEST_F(HostileSlotsTest, AFrameInTheSlotAndOneAtTheSocketAtOnceAreRefused) {
  ASSERT_TRUE(client->waits_for_sleep());
  const bytes frame = invoke_frame(session);
  std::copy(frame.begin(), frame.end(), client->slots().request_bytes());
  client->slots().request().store(static_cast<std::uint32_t>(frame.size()));
  client->send(frame);
  expect_refused();
}

TEST_F(HostileSlotsTest, AnAnswersWordThatNobodyLeavesSoEndsTheConnection) {
  for (const std::uint32_t word : {2U, 16U, 0xFFFFFFFFU}) {
    client = std::make_unique<slot_client>(path());
    client->slots().answer().store(word);
    client->put(raw_frame(frame_kind::status));
    EXPECT_TRUE(client->is_refused()) << word;
  }
}

TEST_F(HostileSlotsTest, FramesInTheSlotAreJudgedLikeAnyOther) {
  bytes newer = invoke_frame(session), foreign = newer;
  newer[4] = 2;
  foreign[0] = 'X';
  const bytes share = raw_frame(frame_kind::share_memory, body_of(remote::share_request{4096, 1}));
  for (const bytes& frame : {foreign, share, raw_frame(std::uint16_t{99}), raw_frame(frame_kind::hello)}) {
    client = std::make_unique<slot_client>(path());
    client->put(frame);
    EXPECT_TRUE(client->is_refused());
  }
  client = std::make_unique<slot_client>(path());
  client->put(newer);
  remote::refusal_answer why;
  ASSERT_TRUE(remote::read_body(client->receive().body, why));
  EXPECT_EQ(why.reason, refusal::version);
}

TEST_F(HostileSlotsTest, BytesThatChangeWhileTheyAreReadHarmNobodyElse) {
  using byte = std::atomic_ref<std::uint8_t>;
  const bytes frame = invoke_frame(session);
  std::atomic<bool> goes_on{true};
  slot_client* spoilt = nullptr;
  for (int round = 0; round < 20; ++round) {
    client = std::make_unique<slot_client>(path());
    spoilt = client.get();
    goes_on = true;
    std::thread spoiler([&] {
      for (std::uint8_t i = 0; goes_on; ++i) byte(spoilt->slots().request_bytes()[i % 28]).store(i);
    });
    bool is_answered = true;
    for (int i = 0; i < 20 && is_answered; ++i) {
      for (std::size_t at = 0; at < frame.size(); ++at) byte(client->slots().request_bytes()[at]).store(frame[at]);
      client->mark({}, static_cast<std::uint32_t>(frame.size()));
      is_answered = eventually([&] {
        std::uint8_t packet = 0;
        return client->slots().answer().exchange(0) > 1 ||
               ::recv(client->socket(), &packet, 1, MSG_DONTWAIT | MSG_PEEK) >= 0;
      });
      EXPECT_TRUE(is_answered);
      std::uint8_t packet = 0;
      is_answered = ::recv(client->socket(), &packet, 1, MSG_DONTWAIT | MSG_PEEK) < 0;
    }
    goes_on = false;
    spoiler.join();
  }
  client->close();
  expect_served();
  EXPECT_TRUE(has_let_go());
}

TEST_F(HostileSlotsTest, MemoryThatIsNotSafeIsNotUsedAndAllElseGoesByTheSocket) {
  const auto other = greeted();
  const auto file_of = [](std::size_t size, int seals) {
    file_descriptor file(::memfd_create("test", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    EXPECT_EQ(::ftruncate(file.get(), static_cast<off_t>(size)), 0);
    EXPECT_EQ(::fcntl(file.get(), F_ADD_SEALS, seals), 0);
    return file;
  };
  const std::size_t whole = wire_slots.size();
  for (const int seals : {0, F_SEAL_GROW, F_SEAL_SHRINK, F_SEAL_SHRINK | F_SEAL_GROW}) {
    EXPECT_EQ(offer(*other, file_of(whole, seals).get()).result, TEEC_ERROR_BAD_PARAMETERS) << seals;
  }
  for (const std::size_t size : {std::size_t{0}, std::size_t{4096}, whole - 1}) {
    EXPECT_EQ(offer(*other, file_of(size, all_seals).get()).result, TEEC_ERROR_BAD_PARAMETERS) << size;
  }
  EXPECT_EQ(offer(*other, file_of(whole, all_seals | F_SEAL_WRITE).get()).result, TEEC_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(offer(*other, other->socket()).result, TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(other->invoke(other->must_open(first_ta::uuid)).done.result, TEEC_SUCCESS);
  EXPECT_EQ(offer(*other, file_of(whole, all_seals).get()).result, TEEC_SUCCESS);
}

TEST_F(HostileSlotsTest, SlotsAreSharedOnceByAFrameWithTheirMemory) {
  const shared_file more = make_shared_file(wire_slots.size());
  const remote::outcome again = offer(*client, more.file.get());
  EXPECT_EQ(again.result, TEEC_ERROR_BAD_STATE);
  EXPECT_EQ(again.origin, TEEC_ORIGIN_COMMS);
  expect_served_through_slot(3);
  EXPECT_EQ(greeted()->refusal_after(raw_frame(frame_kind::use_slots)), refusal::malformed);
  EXPECT_EQ(greeted()->refusal_after(raw_frame(frame_kind::use_slots, {0}), {more.file.get()}), refusal::malformed);
  raw_client early(path());
  EXPECT_EQ(early.refusal_after(raw_frame(frame_kind::use_slots), {more.file.get()}), refusal::malformed);
}

TEST_F(HostileSlotsTest, AClientThatEndsWithAFrameInTheSlotLeavesNothing) {
  const belongings before = current_belongings();
  for (int i = 0; i < 50; ++i) {
    slot_client brief(path());
    const std::uint32_t opened = brief.must_open(first_ta::uuid);
    EXPECT_TRUE(i % 2 == 1 || brief.waits_for_sleep());
    brief.slots().request().store(i % 3 == 0 ? 20 : 0xFFFF);
    if (i % 3 != 0) brief.mark(invoke_frame(opened), 28, i % 5 == 0);
  }
  EXPECT_TRUE(eventually([&] { return current_belongings() == before; }));
  client.reset();
  EXPECT_TRUE(has_let_go());
}

// The TA plays a client that is always ahead: whenever a command is done the last answer has been taken, and the next
// request lies in the slot.
TEST_F(HostileSlotsTest, AServerEndsBesideAClientThatNeverRests) {
  const bytes frame = invoke_frame(session);
  std::copy(frame.begin(), frame.end(), client->slots().request_bytes());
  int commands = 0;
  first.invoke = [&](void*, std::uint32_t, std::uint32_t, TEE_Param*) {
    if (++commands == 10) server->stop();
    client->slots().answer().store(0);
    if (commands < 1000) client->slots().request().store(static_cast<std::uint32_t>(frame.size()));
    return TEE_SUCCESS;
  };
  client->send(frame);
  server->join();
  EXPECT_EQ(commands, 10);
  EXPECT_FALSE(world->has_instance(first_ta::uuid));
}

}  // namespace
}  // namespace hosted_tee::testing
