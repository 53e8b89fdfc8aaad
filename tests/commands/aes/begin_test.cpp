// Beginning an AES operation: block modes, paddings, tag lengths and nonces.
#include <fmt/format.h>

#include <set>

#include "tests/commands/aes/aes_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr std::uint32_t some_modes[] = {0, 1, 2, 3, 4, 5, 31, 32, 33, 0x80000001, 0xFFFFFFFF};
constexpr std::uint32_t some_paddings[] = {0, 1, 2, 3, 4, 5, 63, 64, 65, 0xFFFFFFFF};
constexpr std::uint32_t known_modes[] = {KM_MODE_ECB, KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM};

/// What a combination answers when the key lists both.
std::int32_t expected_error(std::uint32_t mode, std::uint32_t padding) {
  if ((mode < 1 || mode > 3) && mode != 32) return KM_ERROR_UNSUPPORTED_BLOCK_MODE;
  const bool accepted = padding == KM_PAD_NONE || (padding == KM_PAD_PKCS7 && mode <= 2);
  return accepted ? KM_ERROR_OK : KM_ERROR_INCOMPATIBLE_PADDING_MODE;
}

class AesBeginTest : public AesTest {
 protected:
  bytes permissive_key() {
    param_list params = aes_key(128).remove(KM_TAG_BLOCK_MODE).remove(KM_TAG_PADDING);
    for (const std::uint32_t mode : some_modes) params.add(KM_TAG_BLOCK_MODE, mode);
    for (const std::uint32_t padding : some_paddings) params.add(KM_TAG_PADDING, padding);
    return import_raw(key, params);
  }

  void expect_refused(const failure& expected, std::uint32_t purpose, const bytes& with, const param_list& params) {
    const answer a = expect_failure(expected, [&] { return client().begin(purpose, with, params); });
    EXPECT_EQ(a.b, 0U);
    EXPECT_EQ(a.output, bytes(a.output.size(), canary));
  }
  void expect_refused(std::int32_t error, trace_lines lines, const bytes& with, const param_list& params) {
    for (const std::uint32_t purpose : both_cipher_purposes) {
      expect_refused(refused(error, lines), purpose, with, params);
    }
  }
  /// begun answers the parameters that begin gives out, and ends the operation.
  param_list begun(std::uint32_t purpose, const bytes& with, const param_list& params) {
    const hosted_tee::accounting before = tee.accounting();
    const answer a = succeeds([&] { return client().begin(purpose, with, params); });
    EXPECT_NE(a.b, 0U);
    EXPECT_TRUE(client().abort(a.b).ok());
    expect_same(before);
    return param_list::parse(a.body()).value();
  }
};

TEST_F(AesBeginTest, EveryCombinationIsTakenOrRefusedByTheTable) {
  const bytes permissive = permissive_key();
  for (const std::uint32_t mode : some_modes) {
    for (const std::uint32_t padding : some_paddings) {
      SCOPED_TRACE(fmt::format("mode {} padding {}", mode, padding));
      const param_list params = cipher(mode, padding).add(KM_TAG_MAC_LENGTH, 128);
      const std::int32_t error = expected_error(mode, padding);
      if (error != KM_ERROR_OK) {
        expect_refused(error, {"Create operation failed"}, permissive, params);
        continue;
      }
      for (const std::uint32_t purpose : both_cipher_purposes) (void)begun(purpose, permissive, params);
    }
  }
}

TEST_F(AesBeginTest, TheBlockModeMustOccurOnce) {
  const trace_lines lines = {"No or too many KM_TAG_BLOCK_MODE", "Create operation failed"};
  for (const param_list& params :
       {param_list{}, param_list{}.add(KM_TAG_PADDING, KM_PAD_PKCS7), param_list{}.add(KM_TAG_PADDING, 99),
        cipher(KM_MODE_CBC).add(KM_TAG_BLOCK_MODE, 2), cipher(KM_MODE_ECB).add(KM_TAG_BLOCK_MODE, KM_MODE_GCM)}) {
    expect_refused(KM_ERROR_INVALID_ARGUMENT, lines, blob, params);
  }
}

TEST_F(AesBeginTest, APaddingThatIsAbsentOrRepeatedIsNone) {
  const bytes text = pattern(32);
  for (const std::uint32_t mode : known_modes) {
    const param_list absent = asking(mode).remove(KM_TAG_PADDING);
    const param_list repeated = param_list{absent}.add(KM_TAG_PADDING, KM_PAD_PKCS7).add(KM_TAG_PADDING, KM_PAD_PKCS7);
    for (const param_list& params : {absent, repeated}) {
      EXPECT_EQ(run_cipher(client(), KM_PURPOSE_ENCRYPT, blob, params, {text}).text, expected(mode, KM_PAD_NONE, text));
    }
  }
}

TEST_F(AesBeginTest, AKeyThatDoesntListNoPaddingNeedsOneInEveryMode) {
  const bytes padded_only = import_raw(key, aes_key(128).remove(KM_TAG_PADDING).add(KM_TAG_PADDING, KM_PAD_PKCS7));
  const trace_lines lines = {"No such padding in key_params", "Authorization failed"};
  for (const std::uint32_t mode : known_modes) {
    const param_list absent = asking(mode).remove(KM_TAG_PADDING);
    expect_refused(KM_ERROR_INCOMPATIBLE_PADDING_MODE, lines, padded_only, absent);
    expect_refused(KM_ERROR_INCOMPATIBLE_PADDING_MODE, lines, padded_only, asking(mode));
    expect_refused(KM_ERROR_INCOMPATIBLE_PADDING_MODE, lines, padded_only,
                   param_list{absent}.add(KM_TAG_PADDING, KM_PAD_PKCS7).add(KM_TAG_PADDING, KM_PAD_PKCS7));
  }
  (void)begun(KM_PURPOSE_ENCRYPT, padded_only, asking(KM_MODE_CBC, KM_PAD_PKCS7));
  // Where the block mode is none of the known ones, the padding says nothing and the mode is what fails.
  for (const std::uint32_t mode : {0U, 4U, 31U, 33U}) {
    expect_refused(KM_ERROR_INCOMPATIBLE_BLOCK_MODE, {"No such block mode in key_params", "Authorization failed"},
                   padded_only, cipher(mode));
  }
}

TEST_F(AesBeginTest, AModeOrPaddingThatTheKeyDoesntListIsThePolicysToRefuse) {
  const bytes narrow = import_raw(key, aes_key(128)
                                           .remove(KM_TAG_BLOCK_MODE)
                                           .remove(KM_TAG_PADDING)
                                           .add(KM_TAG_BLOCK_MODE, KM_MODE_CTR)
                                           .add(KM_TAG_PADDING, KM_PAD_NONE));
  for (const std::uint32_t mode : {KM_MODE_ECB, KM_MODE_CBC, KM_MODE_GCM}) {
    expect_refused(KM_ERROR_INCOMPATIBLE_BLOCK_MODE, {"No such block mode in key_params", "Authorization failed"},
                   narrow, asking(mode));
  }
  expect_refused(KM_ERROR_INCOMPATIBLE_PADDING_MODE, {"No such padding in key_params", "Authorization failed"}, narrow,
                 asking(KM_MODE_CTR, KM_PAD_PKCS7));
  // A digest says nothing here.
  (void)begun(KM_PURPOSE_DECRYPT, narrow, asking(KM_MODE_CTR).add(KM_TAG_DIGEST, 4));
}

TEST_F(AesBeginTest, SigningIsNothingForAnAesKey) {
  for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
    expect_refused(refused(KM_ERROR_UNSUPPORTED_PURPOSE, {"Authorization failed"}), purpose, blob, asking(KM_MODE_ECB));
  }
}

TEST_F(AesBeginTest, GcmNeedsOneTagLengthWhichIsLookedAtBeforeThePadding) {
  const trace_lines lines = {"No or too many KM_TAG_MAC_LENGTH", "Create operation failed"};
  const param_list none = cipher(KM_MODE_GCM, KM_PAD_PKCS7, nonce);
  expect_refused(KM_ERROR_INVALID_ARGUMENT, lines, blob, none);
  expect_refused(KM_ERROR_INVALID_ARGUMENT, lines, blob,
                 param_list{none}.add(KM_TAG_MAC_LENGTH, 128).add(KM_TAG_MAC_LENGTH, 128));
  // The other modes don't ask.
  (void)begun(KM_PURPOSE_ENCRYPT, blob, asking(KM_MODE_CTR).add(KM_TAG_MAC_LENGTH, 5));
}

TEST_F(AesBeginTest, ATagHasAtMost128BitsInWholeBytes) {
  const bytes lenient = import_without_shortest_tag();
  for (std::uint32_t bits = 0; bits <= 128; bits += 8) (void)begun(KM_PURPOSE_DECRYPT, lenient, gcm(bits, nonce));
  for (const std::uint32_t bits : {1U, 4U, 7U, 9U, 100U, 127U, 129U, 136U, 256U, 0x80000080U, 0xFFFFFFF8U}) {
    const trace_lines lines = {fmt::format("Unsupported mac length {}", static_cast<int>(bits)),
                               "Create operation failed"};
    expect_refused(KM_ERROR_UNSUPPORTED_MAC_LENGTH, lines, lenient, gcm(bits, nonce));
  }
  for (const std::uint32_t bits : {100U, 136U}) {
    const trace_lines lines = {fmt::format("Unsupported mac length {}", bits), "Create operation failed"};
    expect_refused(KM_ERROR_UNSUPPORTED_MAC_LENGTH, lines, blob, gcm(bits, nonce));
  }
}

TEST_F(AesBeginTest, ATagBelowTheKeysShortestIsThePolicysToRefuse) {
  for (const std::uint32_t bits : {0U, 8U, 88U, 95U}) {
    expect_refused(KM_ERROR_INVALID_MAC_LENGTH, {"Authorization failed"}, blob, gcm(bits, nonce));
  }
  for (const std::uint32_t bits : {96U, 104U, 112U, 120U, 128U})
    (void)begun(KM_PURPOSE_ENCRYPT, blob, gcm(bits, nonce));
}

TEST_F(AesBeginTest, TheNonceIsToldInEveryModeButEcbAndForDecryptionToo) {
  for (const std::uint32_t mode : known_modes) {
    const param_list given = asking(mode), drawn = param_list{given}.remove(KM_TAG_NONCE);
    for (const std::uint32_t purpose : both_cipher_purposes) {
      SCOPED_TRACE(fmt::format("mode {} purpose {}", mode, purpose));
      if (mode == KM_MODE_ECB) {
        EXPECT_TRUE(begun(purpose, blob, drawn).params().empty());
        continue;
      }
      EXPECT_EQ(begun(purpose, blob, given).marshal(), param_list{}.add_blob(KM_TAG_NONCE, nonce_of(mode)).marshal());
      std::set<bytes> nonces;
      for (int i = 0; i < 8; ++i) {
        const param_list told = begun(purpose, blob, drawn);
        EXPECT_EQ(told.params().size(), 1U);
        EXPECT_EQ(told.blob(KM_TAG_NONCE).size(), mode == KM_MODE_GCM ? 12U : 16U);
        nonces.insert(told.blob(KM_TAG_NONCE));
      }
      EXPECT_EQ(nonces.size(), 8U);
    }
  }
}

TEST_F(AesBeginTest, ANonceThatWasDrawnIsTheOneThatIsUsed) {
  const bytes text = pattern(64);
  for (const std::uint32_t mode : {KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM}) {
    const param_list drawn = asking(mode).remove(KM_TAG_NONCE);
    const cipher_answer made = run_cipher(client(), KM_PURPOSE_ENCRYPT, blob, drawn, {text});
    EXPECT_EQ(made.text, aes_encrypt({mode, KM_PAD_NONE, key, made.begun.blob(KM_TAG_NONCE)}, text));
  }
}

TEST_F(AesBeginTest, ANonceOfAnotherLengthThanTheModesIsAnInvalidArgument) {
  for (const std::uint32_t mode : {KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM}) {
    const std::size_t right = nonce_of(mode).size();
    for (const std::size_t size : {0U, 1U, 11U, 12U, 13U, 15U, 16U, 17U, 64U}) {
      if (size == right) continue;
      SCOPED_TRACE(fmt::format("mode {} nonce of {} bytes", mode, size));
      expect_refused(KM_ERROR_INVALID_ARGUMENT, {"Create operation failed"}, blob,
                     asking(mode).remove(KM_TAG_NONCE).add_blob(KM_TAG_NONCE, pattern(size)));
    }
  }
}

TEST_F(AesBeginTest, EcbTakesNoNonce) {
  for (const std::size_t size : {0U, 12U, 16U}) {
    expect_refused(KM_ERROR_INVALID_TAG, {"Create operation failed"}, blob,
                   asking(KM_MODE_ECB).add_blob(KM_TAG_NONCE, pattern(size)));
  }
}

TEST_F(AesBeginTest, ANonceThatIsGivenTwiceCountsAsNotGiven) {
  for (const std::uint32_t mode : known_modes) {
    const param_list twice =
        asking(mode).remove(KM_TAG_NONCE).add_blob(KM_TAG_NONCE, nonce_of(mode)).add_blob(KM_TAG_NONCE, nonce_of(mode));
    const param_list told = begun(KM_PURPOSE_ENCRYPT, blob, twice);
    if (mode == KM_MODE_ECB) {
      EXPECT_TRUE(told.params().empty());
    } else {
      EXPECT_NE(told.blob(KM_TAG_NONCE), nonce_of(mode));
    }
  }
}

TEST_F(AesBeginTest, OnlyAKeyThatSaysSoTakesTheClientsNonceForEncryption) {
  const bytes strict = import_raw(key, aes_key(128).remove(KM_TAG_CALLER_NONCE));
  const failure prohibited =
      refused(KM_ERROR_CALLER_NONCE_PROHIBITED, {"Caller nonce prohibited", "Authorization failed"});
  for (const std::uint32_t mode : {KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM}) {
    expect_refused(prohibited, KM_PURPOSE_ENCRYPT, strict, asking(mode));
    expect_refused(prohibited, KM_PURPOSE_ENCRYPT, strict, asking(mode).add_blob(KM_TAG_NONCE, nonce));
    (void)begun(KM_PURPOSE_DECRYPT, strict, asking(mode));
    (void)begun(KM_PURPOSE_ENCRYPT, strict, asking(mode).remove(KM_TAG_NONCE));
  }
  const param_list ecb = asking(KM_MODE_ECB).add_blob(KM_TAG_NONCE, iv);
  expect_refused(prohibited, KM_PURPOSE_ENCRYPT, strict, ecb);
  expect_refused(refused(KM_ERROR_INVALID_TAG, {"Create operation failed"}), KM_PURPOSE_DECRYPT, strict, ecb);
}

}  // namespace
}  // namespace testing_support
