// get_key_character_size and get_key_character.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

class CharacteristicsTest : public CommandTest {
 protected:
  /// expect_both_fail sends `body` to both commands.
  void expect_both_fail(const failure& expected, const bytes& body) {
    const answer sized = expect_failure(
        expected, [&] { return client().call(KM_COMMAND_GET_KEY_CHARACTER_SIZE, 0, 0, body, std::nullopt); });
    EXPECT_EQ(sized.b, 0U);
    const answer told = expect_failure(
        expected, [&] { return client().call(KM_COMMAND_GET_KEY_CHARACTER, 0, 0, body, std::size_t{512}); });
    EXPECT_EQ(told.output, bytes(512, canary));
  }
};

TEST_F(CharacteristicsTest, TheyAreWhatTheKeyWasMadeWithWithoutTheHiddenTags) {
  param_list visible = rsa_key(1024)
                           .add(KM_TAG_ACTIVE_DATETIME, 0x0123456789ABCDEF)
                           .add(KM_TAG_USER_SECURE_ID, 0xFEDCBA9876543210)
                           .add_blob(KM_TAG_ASSOCIATED_DATA, pattern(33))
                           .add_blob(KM_TAG_AUTH_TOKEN, {1})
                           .add_blob(KM_TAG_NONCE, pattern(8));
  param_list asked = visible;
  asked.add_blob(KM_TAG_APPLICATION_ID, from_text("id"))
      .add_blob(KM_TAG_APPLICATION_DATA, from_text("data"))
      .add_blob(KM_TAG_ROOT_OF_TRUST, pattern(40));
  visible.add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED);
  const bytes blob = import_fixed(1024, asked);

  const hosted_tee::accounting before = tee.accounting();
  const answer sized =
      succeeds([&] { return client().characteristics_size(blob, from_text("id"), from_text("data")); });
  const answer told = succeeds([&] { return client().characteristics(blob, from_text("id"), from_text("data")); });
  expect_same(before);
  EXPECT_EQ(told.body(), visible.marshal());
  EXPECT_EQ(sized.b, visible.marshal().size());
}

TEST_F(CharacteristicsTest, BlobsOf0And1BytesAreRefusedWithTheirLength) {
  for (const std::size_t size : {0U, 1U}) {
    expect_both_fail(refused(KM_ERROR_INVALID_KEY_BLOB, {fmt::format("Wrong key_blob_size {}", size)}),
                     key_body(bytes(size), {}, {}));
  }
}

TEST_F(CharacteristicsTest, BlobsOfUpTo93BytesAreTooShort) {
  for (const std::size_t size : {2U, 64U, 92U, 93U}) {
    expect_both_fail(refused(KM_ERROR_INVALID_KEY_BLOB, {"Too short key blob", "Open key failed"}),
                     key_body(bytes(size), {}, {}));
  }
}

TEST_F(CharacteristicsTest, ABlobOf94BytesFailsBySeal) {
  expect_both_fail(broken(TEE_ERROR_MAC_INVALID, {"AEDecryptFinal failed with 0xffff3071\n", "Open key failed"}),
                   key_body(bytes(94), {}, {}));
}

TEST_F(CharacteristicsTest, ARequestThatEndsInsideAFieldIsRefused) {
  const bytes whole = key_body(import_fixed(512), from_text("app"), from_text("data"));
  const failure expected = broken(TEEC_ERROR_GENERIC, {"Too short input"});
  for (const std::size_t cut : {std::size_t{1}, std::size_t{4}, std::size_t{5}, std::size_t{8}, std::size_t{9},
                                std::size_t{12}, std::size_t{20}, whole.size()}) {
    SCOPED_TRACE(cut);
    expect_both_fail(expected, bytes(whole.begin(), whole.end() - static_cast<std::ptrdiff_t>(cut)));
  }
  for (const std::uint32_t length : {0xFFFFFFFFU, 0xFFFFFFFCU, 0x7FFFFFFFU}) {
    expect_both_fail(expected, join({u32(length), whole}));
  }
}

TEST_F(CharacteristicsTest, BytesBehindTheLastFieldAreIgnored) {
  const bytes blob = import_fixed(512);
  const bytes body = join({key_body(blob, {}, {}), pattern(50)});
  EXPECT_EQ(client().call(KM_COMMAND_GET_KEY_CHARACTER, 0, 0, body, std::size_t{4096}).body(),
            client().characteristics(blob).body());
}

TEST_F(CharacteristicsTest, ATooSmallResponseIsRefusedAndLeftAlone) {
  const bytes blob = import_fixed(512);
  const std::size_t size = client().characteristics_size(blob).b;
  for (const std::size_t capacity : {std::size_t{0}, std::size_t{3}, std::size_t{4}, size - 1}) {
    const answer a = expect_failure(broken(TEEC_ERROR_SHORT_BUFFER, {"Too short marshalling buffer", "Marshal failed"}),
                                    [&] { return client().characteristics(blob, {}, {}, capacity); });
    EXPECT_EQ(a.output, bytes(capacity, canary));
  }
  EXPECT_EQ(succeeds([&] { return client().characteristics(blob, {}, {}, size); }).size, size);
}

}  // namespace
}  // namespace testing_support
