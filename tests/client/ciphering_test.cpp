// What encryption and decryption send, in which order, and what reaches the output.
#include "client/kmctl/ciphering.h"

#include <gtest/gtest.h>

#include <optional>

#include "client/kmctl/exit_codes.h"
#include "client/lib/wire.h"
#include "tests/client/fake_tee.h"

namespace {

using namespace keymaster;
using namespace kmctl;
using client::authorizations;

class CipheringTest : public testing::Test {
 protected:
  void SetUp() override {
    fake_tee::reset();
    tee_.emplace("embedded:/nowhere");
    ta_.emplace(*tee_);
  }

  static void prepare(const fake_tee::answer& answer) { fake_tee::now().answers.push_back(answer); }
  static void prepare_begin(const authorizations& parameters) { prepare({.b = 5, .body = parameters.marshal()}); }
  static void prepare_finish(byte_view output) {
    bytes body;
    client::append_block(body, output);
    client::append_block(body, authorizations{}.marshal());
    prepare({.body = body});
  }
  static std::vector<std::uint32_t> commands() {
    std::vector<std::uint32_t> list;
    for (const auto& arrival : fake_tee::now().arrivals) {
      list.push_back(arrival.command);
    }
    return list;
  }

  /// A stream of these bytes, of which one read gives all that fit.
  static data_stream stream_of(const bytes& content) {
    return {.read =
                [content, offset = std::size_t{0}](std::span<std::uint8_t> buffer) mutable {
                  const std::size_t count = std::min(buffer.size(), content.size() - offset);
                  std::copy_n(content.begin() + static_cast<std::ptrdiff_t>(offset), count, buffer.begin());
                  offset += count;
                  return count;
                },
            .total = content.size()};
  }

  std::optional<client::connection> tee_;
  std::optional<client::session> ta_;
  const bytes blob_{1, 2, 3};
  const key_use key_{.blob = blob_,
                     .app = {},
                     .parameters = authorizations{}.block_mode({KM_MODE_GCM}).mac_length(128),
                     .each_step = authorizations{}.auth_token(bytes{7})};
};

constexpr std::uint32_t begin = 16, update = 17, finish = 18, abort_operation = 23;

TEST_F(CipheringTest, TheNonceComesFirstThenTheTextThenTheEnd) {
  prepare_begin(authorizations{}.nonce(bytes{0xA1, 0xA2}));
  prepare({});
  prepare({.b = 3, .body = {0xC1, 0xC2, 0xC3}});
  prepare_finish(bytes{0xF1});
  bytes out;
  const auto append = [&out](byte_view piece) { client::append_bytes(out, piece); };
  encrypt_stream(*ta_, key_, stream_of({1, 2, 3}), bytes{0xAD}, append, append);
  EXPECT_EQ(out, (bytes{0xA1, 0xA2, 0xC1, 0xC2, 0xC3, 0xF1}));
  EXPECT_EQ(commands(), (std::vector{begin, update, update, finish}));
}

TEST_F(CipheringTest, AssociatedDataGoesBeforeTheTextAndTheTokenWithEveryStep) {
  prepare_begin({});
  prepare({});
  prepare({.b = 1});
  prepare_finish({});
  decrypt_stream(*ta_, key_, stream_of({9}), bytes{0xAD}, [](byte_view) {});
  const auto& arrivals = fake_tee::now().arrivals;
  ASSERT_EQ(commands(), (std::vector{begin, update, update, finish}));
  const auto request = [&](const bytes& input, const authorizations& extra) {
    bytes body;
    client::append_block(body, input);
    client::append_block(body, authorizations(key_.each_step).add(extra).marshal());
    return body;
  };
  EXPECT_EQ(arrivals[1].request, request({}, authorizations{}.associated_data(bytes{0xAD})));
  EXPECT_EQ(arrivals[2].request, request({9}, {}));
  EXPECT_EQ(arrivals[3].request, request({}, {}));
}

TEST_F(CipheringTest, AnEmptyTextStillHasItsAssociatedDataAuthenticated) {
  prepare_begin({});
  prepare({});
  prepare_finish(bytes{0x77});
  bytes out;
  encrypt_stream(
      *ta_, key_, stream_of({}), bytes{1}, [](byte_view) { FAIL() << "begin answered no nonce"; },
      [&out](byte_view piece) { client::append_bytes(out, piece); });
  EXPECT_EQ(commands(), (std::vector{begin, update, finish}));
  EXPECT_EQ(out, bytes{0x77});
}

TEST_F(CipheringTest, AFailureOfTheOutputEndsTheOperation) {
  prepare_begin(authorizations{}.nonce(bytes{1}));
  EXPECT_THROW(
      encrypt_stream(
          *ta_, key_, stream_of({1}), {}, [](byte_view) { throw failure_error("the disk is full"); }, [](byte_view) {}),
      failure_error);
  EXPECT_EQ(commands(), (std::vector{begin, abort_operation}));
}

TEST_F(CipheringTest, ANonceIsTakenFromTheFrontOfTheStream) {
  data_stream data = stream_of({1, 2, 3, 4, 5});
  EXPECT_EQ(take_nonce(data, 2, "file"), (bytes{1, 2}));
  EXPECT_EQ(data.total, 3U);
  bytes rest(10);
  EXPECT_EQ(data.read(rest), 3U);
  EXPECT_EQ(rest[0], 3);
}

TEST_F(CipheringTest, AStreamShorterThanItsNonceIsRefused) {
  data_stream data = stream_of({1, 2});
  try {
    (void)take_nonce(data, 3, "letter.enc");
    FAIL();
  } catch (const failure_error& refused) {
    EXPECT_STREQ(refused.what(), "letter.enc is too short: a nonce of 3 bytes stands in front of a ciphertext");
  }
}

}  // namespace
