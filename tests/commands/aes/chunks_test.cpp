// Streams cut at random, against what libcrypto makes of them in one go.
#include <fmt/format.h>

#include "tests/commands/aes/aes_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

struct stream_kind {
  const char* name;
  std::uint32_t block_mode, padding;
};

void PrintTo(const stream_kind& kind, std::ostream* out) {
  *out << kind.name;
}

class AesChunksTest : public CommandTest, public testing::WithParamInterface<stream_kind> {
 protected:
  static constexpr unsigned rounds = 300;  // of each direction

  struct random_job {
    aes_job job;
    bytes text;
    std::vector<bytes> pieces;
    param_list params;
    std::string told;
  };

  /// Everything about a round follows from its seed.
  random_job draw(unsigned seed) {
    std::mt19937 random(seed);
    const auto below = [&random](unsigned limit) {
      return std::uniform_int_distribution<unsigned>(0, limit - 1)(random);
    };
    const stream_kind& kind = GetParam();
    const bool is_gcm = kind.block_mode == KM_MODE_GCM, is_ecb = kind.block_mode == KM_MODE_ECB;
    random_job drawn;
    drawn.job = {kind.block_mode, kind.padding, pattern(16 + 8 * std::size_t{below(3)}, seed),
                 is_ecb ? bytes{} : pattern(is_gcm ? 12 : 16, seed + 1)};
    std::size_t size = below(4) == 0 ? below(20) : below(300);
    const bool whole_blocks = kind.padding == KM_PAD_NONE && (is_ecb || kind.block_mode == KM_MODE_CBC);
    if (whole_blocks) size = size / aes_block * aes_block;
    drawn.text = pattern(size, seed + 2);
    drawn.params = cipher(kind.block_mode, kind.padding, drawn.job.nonce);
    if (is_gcm) {
      drawn.job.tag_size = 12 + below(5);
      drawn.job.aad = pattern(below(3) == 0 ? 0 : below(50), seed + 3);
      drawn.params.add(KM_TAG_MAC_LENGTH, drawn.job.tag_size * 8);
    }
    drawn.pieces = cut(drawn.text, random);
    drawn.told = fmt::format("{}, seed {}: {} bytes, AES-{}", kind.name, seed, size, drawn.job.key.size() * 8);
    return drawn;
  }

  bytes import(const bytes& key) {
    return client().must_import(aes_key(static_cast<std::uint32_t>(key.size() * 8)), key);
  }
};

TEST_P(AesChunksTest, EncryptionInPiecesIsEncryptionInOne) {
  const hosted_tee::accounting before = tee.accounting();
  for (unsigned seed = 1; seed <= rounds; ++seed) {
    const random_job drawn = draw(seed);
    SCOPED_TRACE(drawn.told);
    const cipher_answer made =
        run_cipher(client(), KM_PURPOSE_ENCRYPT, import(drawn.job.key), drawn.params, drawn.pieces, drawn.job.aad);
    ASSERT_TRUE(made.ok()) << made.result << ", error " << made.error;
    ASSERT_EQ(to_hex(made.text), to_hex(aes_encrypt(drawn.job, drawn.text)));
  }
  expect_same(before);
}

TEST_P(AesChunksTest, DecryptionInPiecesGivesTheTextBack) {
  const hosted_tee::accounting before = tee.accounting();
  for (unsigned seed = 1; seed <= rounds; ++seed) {
    const random_job drawn = draw(1'000'000 + seed);
    SCOPED_TRACE(drawn.told);
    std::mt19937 random(seed);
    const cipher_answer back = run_cipher(client(), KM_PURPOSE_DECRYPT, import(drawn.job.key), drawn.params,
                                          cut(aes_encrypt(drawn.job, drawn.text), random), drawn.job.aad);
    ASSERT_TRUE(back.ok()) << back.result << ", error " << back.error;
    ASSERT_EQ(to_hex(back.text), to_hex(drawn.text));
  }
  expect_same(before);
}

INSTANTIATE_TEST_SUITE_P(
    Modes, AesChunksTest,
    testing::Values(stream_kind{"Ecb", KM_MODE_ECB, KM_PAD_NONE}, stream_kind{"EcbPadded", KM_MODE_ECB, KM_PAD_PKCS7},
                    stream_kind{"Cbc", KM_MODE_CBC, KM_PAD_NONE}, stream_kind{"CbcPadded", KM_MODE_CBC, KM_PAD_PKCS7},
                    stream_kind{"Ctr", KM_MODE_CTR, KM_PAD_NONE}, stream_kind{"Gcm", KM_MODE_GCM, KM_PAD_NONE}),
    [](const testing::TestParamInfo<stream_kind>& mode) { return mode.param.name; });

}  // namespace
}  // namespace testing_support
