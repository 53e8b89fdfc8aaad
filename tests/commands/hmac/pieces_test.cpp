// Messages in random pieces, against the MAC of the whole.
#include <fmt/format.h>

#include <random>

#include "tests/commands/command_fixture.h"
#include "tests/support/encryption.h"
#include "tests/support/hmac_test_key.h"
#include "tests/support/libcrypto_digest.h"

using namespace keymaster;

namespace testing_support {
namespace {

class HmacPiecesTest : public CommandTest {
 protected:
  finish_answer run(std::uint32_t purpose, const bytes& blob, std::uint32_t bits, const std::vector<bytes>& pieces,
                    const bytes& mac) {
    const std::uint32_t handle = client().must_begin(purpose, blob, hmac_length(bits));
    for (const bytes& piece : pieces) EXPECT_EQ(client().update(handle, piece).b, piece.size());
    return client().finish(handle, mac);
  }

  std::mt19937 random_{78};
};

TEST_F(HmacPiecesTest, HoweverAMessageIsCutItsMacIsThatOfTheWhole) {
  int cut_messages = 0;
  for (const hmac_limits& each : every_hmac) {
    for (int round = 0; round < 60; ++round, ++cut_messages) {
      const auto pick = [this](std::uint32_t least, std::uint32_t most) {
        return std::uniform_int_distribution<std::uint32_t>(least, most)(random_);
      };
      const bytes key = pattern(pick(each.shortest_key / 8, each.longest_key / 8), pick(0, 9999));
      const bytes message = pattern(pick(0, 600), pick(0, 9999));
      const std::uint32_t bits = pick(8, each.longest_mac / 8) * 8;
      SCOPED_TRACE(fmt::format("digest {}, round {}: {} bytes, {} bits", each.digest, round, message.size(), bits));
      const bytes blob = client().must_import(hmac_key(each.digest, 0), key);
      bytes expected = hmac_of(each.digest, key, message);
      expected.resize(bits / 8);
      ASSERT_EQ(run(KM_PURPOSE_SIGN, blob, bits, cut(message, random_), {}).data, expected);
      ASSERT_TRUE(run(KM_PURPOSE_VERIFY, blob, bits, cut(message, random_), expected).ok());
    }
  }
  EXPECT_GE(cut_messages, 300);
}

TEST_F(HmacPiecesTest, OperationsThatRunBesideEachOtherDontMix) {
  const bytes key = pattern(64);
  std::vector<std::uint32_t> handles;
  std::vector<bytes> fed(every_hmac.size());
  for (const hmac_limits& each : every_hmac) {
    const bytes blob = client().must_import(hmac_key(each.digest, 0), key);
    handles.push_back(client().must_begin(KM_PURPOSE_SIGN, blob, hmac_length(each.longest_mac)));
  }
  for (std::uint32_t round = 0; round < 5; ++round) {
    for (std::size_t i = 0; i < fed.size(); ++i) {
      const bytes piece = pattern(10 + i, round);
      EXPECT_TRUE(client().update(handles[i], piece).ok());
      fed[i] = join({fed[i], piece});
    }
  }
  for (std::size_t i = fed.size(); i-- > 0;) {
    EXPECT_EQ(client().finish(handles[i]).data, hmac_of(every_hmac[i].digest, key, fed[i]));
  }
}

}  // namespace
}  // namespace testing_support
