// Bodies against bytes that were put together by hand, and everything that is not exactly such a body.
#include <gmock/gmock.h>

#include "tee/remote/messages.h"
#include "tee_internal_api.h"
#include "tests/support/bytes.h"

namespace hosted_tee::remote {
namespace {

using ::testing::ElementsAreArray;
using ::testing_support::bytes;

template <class Message>
bytes written(const Message& message) {
  bytes room(frame_limit);
  frame_writer out(room);
  write_body(out, message);
  EXPECT_TRUE(out.ok());
  room.resize(out.size());
  return room;
}

void append(bytes& out, std::initializer_list<std::uint32_t> numbers) {
  for (const std::uint32_t number : numbers) {
    for (int shift = 0; shift < 32; shift += 8) out.push_back(static_cast<std::uint8_t>(number >> shift));
  }
}

/// A body is read whole or not at all.
template <class Message>
void expect_nothing_but(const bytes& body) {
  Message message;
  EXPECT_TRUE(read_body(body, message));
  for (std::size_t size = 0; size < body.size(); ++size) {
    Message cut;
    EXPECT_FALSE(read_body({body.data(), size}, cut)) << size;
  }
  bytes longer = body;
  longer.push_back(0);
  EXPECT_FALSE(read_body(longer, message));
}

// Session 7, command 16: a value in and out, carried input, carried output, shared memory in and out.
bytes invoke_body() {
  bytes body;
  append(body, {7, 16, 0x7653, 1, 2, 0, 3});
  body.insert(body.end(), {'a', 'b', 'c'});
  append(body, {0, 100, 1, 9, 0x1000, 0x2000});
  return body;
}

invoke_request invoke_message() {
  static const bytes abc = {'a', 'b', 'c'};
  invoke_request message{7, 16, {0x7653, {}}};
  message.params.slots[0].a = 1;
  message.params.slots[0].b = 2;
  message.params.slots[1].source = memory_source::carried;
  message.params.slots[1].size = 3;
  message.params.slots[1].data = abc;
  message.params.slots[2].source = memory_source::carried;
  message.params.slots[2].size = 100;
  message.params.slots[3] = {0, 0, memory_source::shared, 0x2000, 9, 0x1000, {}};
  return message;
}

TEST(MessagesTest, ACommandHasTheBytesOfTheDescription) {
  EXPECT_THAT(written(invoke_message()), ElementsAreArray(invoke_body()));
}

TEST(MessagesTest, ACommandIsReadBack) {
  invoke_request read;
  const bytes body = invoke_body();
  ASSERT_TRUE(read_body(body, read));
  EXPECT_EQ(read.session, 7U);
  EXPECT_EQ(read.command, 16U);
  EXPECT_EQ(read.params.slots[0].b, 2U);
  EXPECT_THAT(read.params.slots[1].data, ElementsAreArray({'a', 'b', 'c'}));
  EXPECT_EQ(read.params.slots[2].size, 100U);
  EXPECT_TRUE(read.params.slots[2].data.empty());
  EXPECT_EQ(read.params.slots[3].block, 9U);
  EXPECT_EQ(read.params.slots[3].offset, 0x1000U);
  EXPECT_EQ(read.params.slots[3].size, 0x2000U);
  expect_nothing_but<invoke_request>(body);
}

TEST(MessagesTest, TheRoomOfAnAnswerCountsWhatIsCarriedOut) {
  // The word of the types, two words for each of the three slots that come out, and the hundred bytes.
  EXPECT_EQ(answer_size(invoke_message().params), 4U + 3 * 8 + 100);
  request_slots largest{0x6666, {}};
  for (request_slot& slot : largest.slots) slot.source = memory_source::carried, slot.size = 0xFFFFFFFF;
  EXPECT_EQ(answer_size(largest), 4U + 4 * (8 + 0xFFFFFFFFULL));  // also where a size has 32 bits
}

TEST(MessagesTest, AnAnswerHasTheBytesOfTheDescription) {
  const bytes out = {1, 2};
  invoke_answer message{{0xFFFF0010, 4}, {0x0062, {}}};
  message.params.slots[0].a = 5;
  message.params.slots[0].b = 6;
  message.params.slots[1].size = 1000;
  message.params.slots[1].data = out;
  bytes body;
  append(body, {0xFFFF0010, 4, 0x0062, 5, 6, 1000, 2});
  body.insert(body.end(), {1, 2});
  EXPECT_THAT(written(message), ElementsAreArray(body));
  invoke_answer read;
  ASSERT_TRUE(read_body(body, read));
  EXPECT_EQ(read.params.slots[1].size, 1000U);
  EXPECT_THAT(read.params.slots[1].data, ElementsAreArray({1, 2}));
  expect_nothing_but<invoke_answer>(body);
}

TEST(MessagesTest, SlotTypesThatDoNotExistAreRefused) {
  for (const std::uint32_t types : {0x4U, 0x8U, 0xCU, 0xFU, 0x80U, 0x400U, 0x9000U, 0x10000U, 0x80000000U}) {
    bytes body;
    append(body, {7, 16, types, 0, 0, 0, 0});
    invoke_request read;
    EXPECT_FALSE(read_body(body, read)) << types;
    EXPECT_FALSE(are_slot_types(types)) << types;
  }
}

TEST(MessagesTest, MemoryFromNowhereKnownIsRefused) {
  for (const std::uint32_t source : {3U, 0xFFFFFFFFU}) {
    bytes body;
    append(body, {7, 16, 0x5, source, 0});
    invoke_request read;
    EXPECT_FALSE(read_body(body, read)) << source;
  }
}

TEST(MessagesTest, CarriedBytesBeyondTheFrameAreRefused) {
  for (const std::uint32_t size : {1U, 0x7FFFFFFFU, 0xFFFFFFFFU}) {
    bytes body;
    append(body, {7, 16, 0x5, 0, size});
    invoke_request read;
    EXPECT_FALSE(read_body(body, read)) << size;
  }
}

TEST(MessagesTest, OtherBodiesAreReadWholeOrNotAtAll) {
  expect_nothing_but<empty_request>(bytes{});
  expect_nothing_but<plain_answer>(written(plain_answer{{1, 2}}));
  expect_nothing_but<refusal_answer>(written(refusal_answer{refusal::crowded}));
  expect_nothing_but<hello_answer>(written(hello_answer{}));
  expect_nothing_but<open_request>(written(open_request{}));
  expect_nothing_but<open_answer>(written(open_answer{}));
  expect_nothing_but<close_request>(written(close_request{3}));
  expect_nothing_but<share_request>(written(share_request{4096, 1}));
  expect_nothing_but<share_answer>(written(share_answer{{}, 5}));
  expect_nothing_but<release_request>(written(release_request{5}));
  expect_nothing_but<log_request>(written(log_request{1}));
  status_answer status;
  status.version = "1.2";
  status.instances.resize(2);
  expect_nothing_but<status_answer>(written(status));
  log_answer log;
  log.lines = {{7, 1, 20, "TA", "f", "text\n"}};
  expect_nothing_but<log_answer>(written(log));
}

TEST(MessagesTest, ACountWithoutEntriesCostsNothing) {
  bytes body = written(log_answer{});
  body.resize(body.size() - 4);
  append(body, {0xFFFFFFFF});
  log_answer read;
  EXPECT_FALSE(read_body(body, read));
  EXPECT_LE(read.lines.size(), 1U);
}

TEST(MessagesTest, TextsAreCutAndNoLongerOneIsTaken) {
  log_answer log;
  log.lines = {{0, 1, 1, "", "", std::string(longest_text + 1, 'x')}};
  log_answer read;
  ASSERT_TRUE(read_body(written(log), read));
  EXPECT_EQ(read.lines[0].text, std::string(longest_text, 'x'));
  EXPECT_EQ(log_line_size(log.lines[0]), written(log).size() - written(log_answer{}).size());
  bytes body = written(log_answer{});
  body.resize(body.size() - 4);
  append(body, {1, 0, 0, 1, 1, longest_text + 1});
  body.resize(body.size() + longest_text + 1 + 8);
  EXPECT_FALSE(read_body(body, read));
}

TEST(MessagesTest, RefusalsWithoutANameAndTruthsThatAreNeitherAreRefused) {
  for (const std::uint32_t reason : {0U, 4U}) {
    bytes body;
    append(body, {reason});
    refusal_answer read;
    EXPECT_FALSE(read_body(body, read)) << reason;
  }
  bytes body;
  append(body, {0, 0, 0, 0, 2, 0});
  log_answer read;
  EXPECT_FALSE(read_body(body, read));
}

}  // namespace
}  // namespace hosted_tee::remote
