// Messages in random pieces, against the signature over the whole.
#include <fmt/format.h>

#include <random>

#include "tests/commands/command_fixture.h"
#include "tests/support/ec_test_key.h"
#include "tests/support/encryption.h"
#include "tests/support/libcrypto_digest.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr int rounds_of_each = 16;  // for each of 25 pairs of curve and digest, both ways

class EcPiecesTest : public CommandTest {
 protected:
  finish_answer run(std::uint32_t purpose, const bytes& blob, std::uint32_t digest, const std::vector<bytes>& pieces,
                    const bytes& signature) {
    const std::uint32_t handle = client().must_begin(purpose, blob, ec_digest(digest));
    for (const bytes& piece : pieces) EXPECT_EQ(client().update(handle, piece).b, piece.size());
    return client().finish(handle, signature);
  }

  std::mt19937 random_{77};
};

TEST_F(EcPiecesTest, HoweverAMessageIsCutItsSignatureIsThatOfTheWhole) {
  int cut_messages = 0;
  for (const std::uint32_t bits : ec_sizes) {
    const ec_test_key& key = ec_test_key::of_bits(bits);
    const bytes blob = client().must_import(ec_key(bits), key.material());
    for (const std::uint32_t digest : every_sha) {
      for (int round = 0; round < rounds_of_each; ++round, ++cut_messages) {
        const std::size_t size = std::uniform_int_distribution<std::size_t>(0, 400)(random_);
        SCOPED_TRACE(fmt::format("{} bits, digest {}, {} bytes, round {}", bits, digest, size, round));
        const bytes message = pattern(size, static_cast<std::uint32_t>(round));
        const finish_answer made = run(KM_PURPOSE_SIGN, blob, digest, cut(message, random_), {});
        ASSERT_TRUE(made.ok());
        ASSERT_TRUE(key.verifies(digest, message, made.data));
        ASSERT_TRUE(run(KM_PURPOSE_VERIFY, blob, digest, cut(message, random_), key.sign(digest, message)).ok());
      }
    }
  }
  EXPECT_GE(cut_messages, 300);
}

TEST_F(EcPiecesTest, ADigestOfTheClientsComesInPiecesToo) {
  for (const std::uint32_t bits : ec_sizes) {
    const ec_test_key& key = ec_test_key::of_bits(bits);
    const bytes blob = client().must_import(ec_key(bits), key.material());
    for (std::uint32_t round = 0; round < 20; ++round) {
      const bytes digest = pattern(key.fields().half(), round);
      const finish_answer made = run(KM_PURPOSE_SIGN, blob, KM_DIGEST_NONE, cut(digest, random_), {});
      ASSERT_TRUE(key.verifies(KM_DIGEST_NONE, digest, made.data));
    }
  }
}

TEST_F(EcPiecesTest, OperationsThatRunBesideEachOtherDontMix) {
  const ec_test_key& key = ec_test_key::of_bits(256);
  const bytes blob = client().must_import(ec_key(256), key.material());
  std::vector<std::uint32_t> handles;
  std::vector<bytes> fed(8);
  for (std::size_t i = 0; i < fed.size(); ++i) {
    handles.push_back(client().must_begin(KM_PURPOSE_SIGN, blob, ec_digest(every_sha.at(i % every_sha.size()))));
  }
  for (std::uint32_t round = 0; round < 5; ++round) {
    for (std::size_t i = 0; i < fed.size(); ++i) {
      const bytes piece = pattern(10 + i, round);
      EXPECT_TRUE(client().update(handles[i], piece).ok());
      fed[i] = join({fed[i], piece});
    }
  }
  for (std::size_t i = fed.size(); i-- > 0;) {
    EXPECT_TRUE(key.verifies(every_sha.at(i % every_sha.size()), fed[i], client().finish(handles[i]).data));
  }
}

}  // namespace
}  // namespace testing_support
