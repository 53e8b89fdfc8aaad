// Importing AES keys, and the refusal to export them.
#include <fmt/format.h>

#include "tests/commands/aes/aes_fixture.h"
#include "tests/commands/sealed_blob.h"

using namespace keymaster;

namespace testing_support {
namespace {

class AesImportTest : public CommandTest {
 protected:
  /// imported imports, compares the blob's content, and answers the characteristics that the client is told.
  param_list imported(const param_list& params, const bytes& raw) {
    const hosted_tee::accounting before = tee.accounting();
    const answer a = succeeds([&] { return client().import_key(params, raw); });
    expect_same(before);
    const std::uint32_t blob_size = u32_at(a.output, 0);
    const bytes blob = first(from(a.output, 4), blob_size), told = from(a.body(), 8 + blob_size);
    EXPECT_EQ(open_blob(stored_ksk(), blob),
              blob_plaintext(join({u32(static_cast<std::uint32_t>(raw.size() * 8)), raw}), told));
    return param_list::parse(told).value();
  }
  void expect_refused(const failure& expected, const param_list& params, const bytes& raw) {
    const answer a = expect_failure(expected, [&] { return client().import_key(params, raw, 2048); });
    EXPECT_EQ(a.output, bytes(2048, 0));
  }
};

TEST_F(AesImportTest, TheBlobHoldsTheSizeAndTheKeyAsItCame) {
  for (const std::uint32_t bits : {128U, 192U, 256U}) {
    param_list expected = aes_key(bits);
    expected.add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED);
    EXPECT_EQ(imported(aes_key(bits), pattern(bits / 8)).marshal(), expected.marshal());
  }
}

TEST_F(AesImportTest, ASizeThatIsNotStatedIsTheMaterials) {
  for (const std::uint32_t bits : {128U, 192U, 256U}) {
    const param_list asked = aes_key(bits).remove(KM_TAG_KEY_SIZE);
    param_list expected = asked;
    expected.add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED).add(KM_TAG_KEY_SIZE, bits);
    EXPECT_EQ(imported(asked, pattern(bits / 8)).marshal(), expected.marshal());
  }
}

TEST_F(AesImportTest, ASizeThatIsStatedTwiceCountsAsNotStatedAndIsStatedOnceMore) {
  const param_list asked = aes_key(7).add(KM_TAG_KEY_SIZE, 9);
  param_list expected = asked;
  expected.add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED).add(KM_TAG_KEY_SIZE, 192);
  EXPECT_EQ(imported(asked, pattern(24)).marshal(), expected.marshal());
}

TEST_F(AesImportTest, AStatedSizeMustBeTheMaterials) {
  struct mismatch {
    std::uint32_t stated;
    std::size_t size;
    const char* line;
  };
  for (const mismatch& each : {mismatch{256, 16, "Key size mismatch (given 256, guessed 128)"},
                               {128, 15, "Key size mismatch (given 128, guessed 120)"},
                               {128, 0, "Key size mismatch (given 128, guessed 0)"},
                               {0, 16, "Key size mismatch (given 0, guessed 128)"},
                               {16, 16, "Key size mismatch (given 16, guessed 128)"},
                               {0xFFFFFFFF, 32, "Key size mismatch (given -1, guessed 256)"}}) {
    expect_refused(refused(KM_ERROR_IMPORT_PARAMETER_MISMATCH, {each.line}), aes_key(each.stated), pattern(each.size));
  }
}

TEST_F(AesImportTest, MaterialOfAnotherSizeThanAnAesKeyIsRefused) {
  for (const std::uint32_t size : {0U, 1U, 8U, 15U, 17U, 20U, 23U, 25U, 31U, 33U, 64U, 2000U}) {
    const failure expected = refused(KM_ERROR_UNSUPPORTED_KEY_SIZE, {fmt::format("Invalid AES key size {}", size * 8)});
    expect_refused(expected, aes_key(0).remove(KM_TAG_KEY_SIZE), pattern(size));
    expect_refused(expected, aes_key(size * 8), pattern(size));
  }
}

TEST_F(AesImportTest, AnOriginIsRefusedBeforeTheMaterialIsLookedAt) {
  const failure expected = refused(KM_ERROR_INVALID_ARGUMENT, {"Shouldn't specify KM_TAG_ORIGIN"});
  expect_refused(expected, aes_key(128).add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED), pattern(16));
  expect_refused(expected, aes_key(256).add(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED), pattern(5));
}

TEST_F(AesImportTest, ModesAndTagsAreNotLookedAt) {
  const param_list bare = aes_key(128).remove(KM_TAG_BLOCK_MODE).remove(KM_TAG_MIN_MAC_LENGTH);
  (void)imported(bare, pattern(16));
  (void)imported(param_list{bare}.add(KM_TAG_BLOCK_MODE, KM_MODE_GCM), pattern(16));
  (void)imported(param_list{bare}.add(KM_TAG_BLOCK_MODE, KM_MODE_GCM).add(KM_TAG_MIN_MAC_LENGTH, 5), pattern(16));
  (void)imported(param_list{bare}.add(KM_TAG_MIN_MAC_LENGTH, 5).add(KM_TAG_MIN_MAC_LENGTH, 6), pattern(16));
}

TEST_F(AesImportTest, AnImportedKeyEncryptsAsLibcryptoDoes) {
  for (const std::uint32_t bits : {128U, 192U, 256U}) {
    const bytes key = pattern(bits / 8, bits), text = pattern(64);
    const bytes blob = client().must_import(aes_key(bits), key);
    EXPECT_EQ(run_cipher(client(), KM_PURPOSE_ENCRYPT, blob, cipher(KM_MODE_ECB), {text}).text,
              aes_encrypt({KM_MODE_ECB, KM_PAD_NONE, key, {}}, text));
  }
}

TEST_F(AesImportTest, NoKeyIsEverExported) {
  const bytes made = client().must_generate(aes_key(256)), taken = client().must_import(aes_key(128), pattern(16));
  for (const bytes& blob : {made, taken}) {
    for (const std::size_t capacity : {0U, 64U, 4096U}) {
      const answer a = expect_failure(refused(KM_ERROR_UNSUPPORTED_KEY_FORMAT, {"Export key failed"}),
                                      [&] { return client().export_key(blob, {}, {}, capacity); });
      EXPECT_EQ(a.output, bytes(capacity, canary));
    }
  }
}

}  // namespace
}  // namespace testing_support
