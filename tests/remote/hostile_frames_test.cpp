// Clients that send what is no request, or no good one. Each loses at most its own connection.
#include <sys/socket.h>

#include "tests/remote/server_fixture.h"

namespace hosted_tee::testing {
namespace {

using remote::frame_kind;
using remote::refusal;
using ::testing_support::join;
using ::testing_support::u32;

class HostileFramesTest : public ServerTest {
 protected:
  HostileFramesTest() { serve(); }

  void expect_refused(const bytes& packet, refusal why) {
    const auto client = greeted();
    EXPECT_EQ(client->refusal_after(packet), why);
    expect_served();
  }

  static bytes invoke_frame(std::uint32_t session, std::uint32_t types, const bytes& slots = {}) {
    return raw_frame(frame_kind::invoke, join({u32(session), u32(5), u32(types), slots}));
  }
};

TEST_F(HostileFramesTest, AHalfSentFrameEndsItsOwnConnectionAlone) {
  const bytes whole = invoke_frame(1, 0);
  for (std::size_t size = 1; size < whole.size(); ++size) {
    expect_refused({whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size)}, refusal::malformed);
  }
}

TEST_F(HostileFramesTest, AFrameWithMoreThanItSaysIsRefused) {
  bytes longer = invoke_frame(1, 0);
  longer.push_back(0);
  expect_refused(longer, refusal::malformed);
  expect_refused(raw_frame(frame_kind::invoke, join({u32(1), u32(5), u32(0), {0}})), refusal::malformed);
}

TEST_F(HostileFramesTest, AnOversizedFrameIsRefused) {
  expect_refused(raw_frame(frame_kind::invoke, bytes(remote::frame_limit)), refusal::malformed);
  expect_refused(raw_frame(frame_kind::invoke, bytes(2 * remote::frame_limit)), refusal::malformed);
}

TEST_F(HostileFramesTest, TheLongestFrameIsServed) {
  const auto client = greeted();
  const std::uint32_t session = client->must_open(first_ta::uuid);
  constexpr std::size_t in_front = remote::header_size + 5 * 4;
  const auto size = static_cast<std::uint32_t>(remote::frame_limit - in_front);
  std::uint32_t seen = 0;
  first.invoke = [&](void*, std::uint32_t, std::uint32_t, TEE_Param* params) {
    seen = params[0].memref.size;
    return static_cast<std::uint8_t*>(params[0].memref.buffer)[seen - 1] == 0x77 ? TEE_SUCCESS : TEE_ERROR_GENERIC;
  };
  const bytes data(size, 0x77);
  remote::request_slots slots{TEE_PARAM_TYPE_MEMREF_INPUT, {}};
  slots.slots[0].source = remote::memory_source::carried;
  slots.slots[0].size = size;
  slots.slots[0].data = data;
  EXPECT_EQ(client->invoke(session, slots).done.result, TEEC_SUCCESS);
  EXPECT_EQ(seen, size);
}

TEST_F(HostileFramesTest, AnotherVersionIsToldTheServersOwn) {
  for (const std::uint8_t version : bytes{0, 2, 255}) {
    raw_client client(path());
    bytes hello = raw_frame(frame_kind::hello);
    hello[4] = version;
    client.send(hello);
    const raw_answer answer = client.receive();
    remote::refusal_answer why;
    ASSERT_TRUE(remote::read_body(answer.body, why));
    EXPECT_EQ(answer.kind, remote::refused_kind);
    EXPECT_EQ(why.reason, refusal::version);
    EXPECT_EQ(answer.version, remote::wire_version);
    EXPECT_TRUE(client.is_closed());
  }
  expect_served();
}

TEST_F(HostileFramesTest, KindsThatDoNotExistAreRefused) {
  for (const std::uint16_t kind : std::vector<std::uint16_t>{0, 8, 15, 19, 0x7FFF, 0x8000, 0x8001, 0xFFFF}) {
    expect_refused(raw_frame(kind), refusal::malformed);
  }
}

TEST_F(HostileFramesTest, TheHelloComesFirstAndOnce) {
  for (const frame_kind kind : {frame_kind::status, frame_kind::stop}) {
    raw_client client(path());
    EXPECT_EQ(client.refusal_after(raw_frame(kind)), refusal::malformed);
  }
  expect_refused(raw_frame(frame_kind::hello), refusal::malformed);
}

TEST_F(HostileFramesTest, SlotTypesThatDoNotExistAreRefused) {
  for (const std::uint32_t types : {0x4U, 0x8U, 0xFU, 0x10000U, 0xFFFFFFFFU}) {
    expect_refused(invoke_frame(1, types), refusal::malformed);
  }
  expect_refused(invoke_frame(1, 0x5, join({u32(7), u32(0)})), refusal::malformed);
}

TEST_F(HostileFramesTest, SizesThatTheFrameDoesNotHaveAreRefused) {
  for (const std::uint32_t size : {1U, 0x7FFFFFFFU, 0xFFFFFFFFU}) {
    expect_refused(invoke_frame(1, 0x5, join({u32(0), u32(size)})), refusal::malformed);
  }
}

TEST_F(HostileFramesTest, AnEmptyPacketIsTheEnd) {
  const auto client = greeted();
  client->send({});
  EXPECT_TRUE(client->is_closed());
  expect_served();
}

TEST_F(HostileFramesTest, UnknownNumbersAreAnsweredAndTheConnectionGoesOn) {
  const auto client = greeted();
  for (const std::uint32_t number : {0U, 1U, 0x7FFFFFFFU, 0xFFFFFFFFU}) {
    EXPECT_EQ(client->invoke(number).done.result, TEEC_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(client->ask<remote::plain_answer>(frame_kind::close_session, remote::close_request{number}).done.result,
              TEEC_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(
        client->ask<remote::plain_answer>(frame_kind::release_memory, remote::release_request{number}).done.result,
        TEEC_ERROR_BAD_PARAMETERS);
  }
  EXPECT_EQ(client->invoke(client->must_open(first_ta::uuid)).done.result, TEEC_SUCCESS);
}

TEST_F(HostileFramesTest, ASessionIsItsOwnClientsAlone) {
  const auto owner = greeted(), thief = greeted();
  const std::uint32_t session = owner->must_open(first_ta::uuid);
  EXPECT_EQ(thief->invoke(session).done.result, TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(thief->ask<remote::plain_answer>(frame_kind::close_session, remote::close_request{session}).done.result,
            TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(owner->invoke(session).done.result, TEEC_SUCCESS);
}

TEST_F(HostileFramesTest, AnAnswerThatWouldNotFitIsNotBegun) {
  const auto client = greeted();
  const std::uint32_t session = client->must_open(first_ta::uuid);
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return ADD_FAILURE(), TEE_SUCCESS; };
  for (const std::uint32_t size : {std::uint32_t{remote::frame_limit}, 0x80000000U, 0xFFFFFFFFU}) {
    remote::request_slots slots{0x66, {}};
    slots.slots[0].source = slots.slots[1].source = remote::memory_source::carried;
    slots.slots[0].size = slots.slots[1].size = size;
    EXPECT_EQ(client->invoke(session, slots).done.result, TEEC_ERROR_EXCESS_DATA) << size;
  }
}

TEST_F(HostileFramesTest, NobodyGetsWhatAnotherCommandLeft) {
  const auto client = greeted();
  const std::uint32_t session = client->must_open(first_ta::uuid);
  remote::request_slots slots{TEE_PARAM_TYPE_MEMREF_OUTPUT, {}};
  slots.slots[0].source = remote::memory_source::carried;
  slots.slots[0].size = 64;
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param* params) {
    std::memset(params[0].memref.buffer, 0x5E, params[0].memref.size);
    return TEE_SUCCESS;
  };
  (void)client->invoke(session, slots);
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return TEE_SUCCESS; };
  const remote::invoke_answer answer = client->invoke(session, slots);
  EXPECT_EQ(bytes(answer.params.slots[0].data.begin(), answer.params.slots[0].data.end()), bytes(64, 0));
}

TEST_F(HostileFramesTest, EveryFlippedBitOfACommandIsAnsweredOrRefused) {
  const bytes good = invoke_frame(1, 0x0065, join({u32(0), u32(2), {1, 2}, u32(0), u32(8)}));
  for (std::size_t bit = 0; bit < good.size() * 8; ++bit) {
    bytes bad = good;
    bad[bit / 8] = static_cast<std::uint8_t>(bad[bit / 8] ^ (1U << (bit % 8)));
    const auto client = greeted();
    client->send(bad);
    EXPECT_TRUE(client->receive().kind.has_value()) << bit;
  }
  expect_served();
  EXPECT_TRUE(has_let_go());
}

TEST_F(HostileFramesTest, ASilentNewcomerIsSentAway) {
  server_limits limits;
  limits.first_request = std::chrono::seconds(1);
  serve(limits);
  const auto patient = greeted();
  raw_client silent(path());
  EXPECT_TRUE(silent.is_closed());
  EXPECT_EQ(patient->invoke(patient->must_open(first_ta::uuid)).done.result, TEEC_SUCCESS);
}

TEST_F(HostileFramesTest, WhoDoesNotTakeItsAnswersWaitsAlone) {
  server_limits limits;
  limits.answer_taken = std::chrono::seconds(1);
  serve(limits);
  const auto greedy = greeted();
  const std::uint32_t session = greedy->must_open(first_ta::uuid);
  const bytes request = raw_frame(frame_kind::invoke, body_of(remote::invoke_request{session, 5, {}}));
  // Until both queues are full: the server does not take the next request before its answer is taken.
  const timeval moment{0, 300'000};
  ASSERT_EQ(::setsockopt(greedy->socket(), SOL_SOCKET, SO_SNDTIMEO, &moment, sizeof moment), 0);
  while (::send(greedy->socket(), request.data(), request.size(), MSG_NOSIGNAL) > 0) {
  }
  expect_served();
  EXPECT_TRUE(has_let_go());
}

}  // namespace
}  // namespace hosted_tee::testing
