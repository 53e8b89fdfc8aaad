// AES encryption, update by update.
#include <fmt/format.h>

#include "tests/commands/aes/aes_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

class AesEncryptTest : public AesTest {};

TEST_F(AesEncryptTest, EveryWholeBlockComesOutAtOnceAndFinishGivesThePaddedOne) {
  const bytes text = pattern(32), whole = expected(KM_MODE_CBC, KM_PAD_PKCS7, text);
  ASSERT_EQ(whole.size(), 48U);
  const std::uint32_t handle = begin_encrypting(asking(KM_MODE_CBC, KM_PAD_PKCS7));
  EXPECT_EQ(fed(handle, text), first(whole, 32));
  EXPECT_EQ(succeeds([&] { return client().finish(handle); }).data, from(whole, 32));
}

TEST_F(AesEncryptTest, APartOfABlockWaitsForTheRestOfIt) {
  const bytes text = pattern(40), whole = expected(KM_MODE_ECB, KM_PAD_PKCS7, text);
  const std::uint32_t handle = begin_encrypting(asking(KM_MODE_ECB, KM_PAD_PKCS7));
  EXPECT_EQ(fed(handle, first(text, 1)), bytes{});
  EXPECT_EQ(fed(handle, first(from(text, 1), 14)), bytes{});
  EXPECT_EQ(fed(handle, first(from(text, 15), 1)), first(whole, 16));
  EXPECT_EQ(fed(handle, {}), bytes{});
  EXPECT_EQ(fed(handle, from(text, 16)), first(from(whole, 16), 16));
  EXPECT_EQ(succeeds([&] { return client().finish(handle); }).data, from(whole, 32));
}

TEST_F(AesEncryptTest, PaddingIs1To16BytesForEveryLength) {
  for (const std::uint32_t mode : {KM_MODE_ECB, KM_MODE_CBC}) {
    for (std::size_t size = 0; size <= 33; ++size) {
      SCOPED_TRACE(fmt::format("mode {} {} bytes", mode, size));
      const bytes text = pattern(size), whole = expected(mode, KM_PAD_PKCS7, text);
      const cipher_answer made = run_cipher(client(), KM_PURPOSE_ENCRYPT, blob, asking(mode, KM_PAD_PKCS7), {text});
      EXPECT_EQ(made.text, whole);
      EXPECT_EQ(made.data.size(), aes_block);
    }
  }
}

TEST_F(AesEncryptTest, WithoutPaddingEcbAndCbcTakeWholeBlocksOnly) {
  const hosted_tee::accounting before = tee.accounting();
  for (const std::uint32_t mode : {KM_MODE_ECB, KM_MODE_CBC}) {
    for (const std::size_t size : {1U, 15U, 17U, 20U, 31U}) {
      const std::uint32_t handle = begin_encrypting(asking(mode));
      EXPECT_EQ(fed(handle, pattern(size)).size(), size / 16 * 16);
      (void)expect_lost(refused(KM_ERROR_INVALID_INPUT_LENGTH, {"Finish failed"}), handle, before,
                        [&] { return client().finish(handle); });
    }
    for (const std::size_t size : {0U, 16U, 48U}) {
      const bytes text = pattern(size);
      const cipher_answer made =
          succeeds([&] { return run_cipher(client(), KM_PURPOSE_ENCRYPT, blob, asking(mode), {text}); });
      EXPECT_EQ(made.text, expected(mode, KM_PAD_NONE, text));
      EXPECT_TRUE(made.data.empty());
    }
  }
}

TEST_F(AesEncryptTest, CtrGivesEveryByteAtOnceAndNothingAtTheEnd) {
  const bytes text = pattern(20), whole = expected(KM_MODE_CTR, KM_PAD_NONE, text);
  const std::uint32_t handle = begin_encrypting(asking(KM_MODE_CTR));
  EXPECT_EQ(fed(handle, first(text, 3)), first(whole, 3));
  EXPECT_EQ(fed(handle, from(text, 3)), from(whole, 3));
  EXPECT_TRUE(succeeds([&] { return client().finish(handle); }).data.empty());
}

TEST_F(AesEncryptTest, TheCtrCounterRunsThroughAllOfItsBytes) {
  const bytes text = pattern(64), ones(16, 0xFF);
  EXPECT_EQ(run_cipher(client(), KM_PURPOSE_ENCRYPT, blob, cipher(KM_MODE_CTR, KM_PAD_NONE, ones), {text}).text,
            aes_encrypt({KM_MODE_CTR, KM_PAD_NONE, key, ones}, text));
}

TEST_F(AesEncryptTest, TheGcmTagIsWhatFinishGives) {
  const bytes lenient = import_without_shortest_tag(), text = pattern(37), aad = pattern(9);
  for (std::uint32_t bits = 0; bits <= 128; bits += 8) {
    SCOPED_TRACE(bits);
    const cipher_answer made =
        succeeds([&] { return run_cipher(client(), KM_PURPOSE_ENCRYPT, lenient, gcm(bits, nonce), {text}, aad); });
    EXPECT_EQ(made.data.size(), bits / 8);
    EXPECT_EQ(to_hex(made.text), to_hex(aes_encrypt({KM_MODE_GCM, KM_PAD_NONE, key, nonce, aad, bits / 8}, text)));
  }
}

TEST_F(AesEncryptTest, GcmOfNothingIsATagAlone) {
  for (const bytes& aad : {bytes{}, pattern(20)}) {
    EXPECT_EQ(run_cipher(client(), KM_PURPOSE_ENCRYPT, blob, gcm(96, nonce), {}, aad).text,
              aes_encrypt({KM_MODE_GCM, KM_PAD_NONE, key, nonce, aad, 12}, {}));
  }
}

TEST_F(AesEncryptTest, AssociatedDataComeInAnyNumberOfUpdatesBeforeTheFirstData) {
  const bytes aad = pattern(50), text = pattern(33), whole = expected(KM_MODE_GCM, KM_PAD_NONE, text, aad);
  const std::uint32_t handle = begin_encrypting(asking(KM_MODE_GCM));
  EXPECT_TRUE(client().update(handle, {}, with_aad(first(aad, 1))).ok());
  EXPECT_TRUE(client().update(handle, {}, with_aad({})).ok());
  EXPECT_TRUE(client().update(handle, {}).ok());  // no data: associated data are still in time
  EXPECT_TRUE(client().update(handle, {}, with_aad(first(from(aad, 1), 30))).ok());
  const answer together = succeeds([&] { return client().update(handle, text, with_aad(from(aad, 31))); });
  EXPECT_EQ(together.body(), first(whole, 33));
  EXPECT_EQ(client().finish(handle).data, from(whole, 33));
}

TEST_F(AesEncryptTest, AssociatedDataAreRefusedBehindTheFirstDataAndInTheOtherModes) {
  const hosted_tee::accounting before = tee.accounting();
  const failure expected_failure = refused(KM_ERROR_INVALID_TAG, {"Update failed"});
  for (const std::uint32_t purpose : both_cipher_purposes) {
    std::uint32_t handle = client().must_begin(purpose, blob, asking(KM_MODE_GCM));
    EXPECT_TRUE(client().update(handle, {1}).ok());
    const answer late = expect_lost(expected_failure, handle, before,
                                    [&] { return client().update(handle, pattern(40), with_aad({1})); });
    EXPECT_EQ(late.output, bytes(late.output.size(), canary));
    for (const std::uint32_t mode : {KM_MODE_ECB, KM_MODE_CBC, KM_MODE_CTR}) {
      for (const bytes& aad : {bytes{}, pattern(5)}) {
        handle = client().must_begin(purpose, blob, asking(mode));
        const answer early = expect_lost(expected_failure, handle, before,
                                         [&] { return client().update(handle, pattern(40), with_aad(aad)); });
        EXPECT_EQ(early.output, bytes(early.output.size(), canary));
      }
    }
  }
}

TEST_F(AesEncryptTest, AssociatedDataThatAreGivenTwiceInOneUpdateCountAsNotGiven) {
  const bytes text = pattern(16);
  for (const std::uint32_t mode : {KM_MODE_GCM, KM_MODE_CBC}) {
    const std::uint32_t handle = begin_encrypting(asking(mode));
    const param_list twice = with_aad({1}).add_blob(KM_TAG_ASSOCIATED_DATA, {1});
    const bytes made = client().update(handle, text, twice).body();
    EXPECT_EQ(join({made, client().finish(handle).data}), expected(mode, KM_PAD_NONE, text));
  }
}

TEST_F(AesEncryptTest, FinishTakesNeitherDataNorAssociatedData) {
  const bytes text = pattern(16);
  for (const std::uint32_t mode : {KM_MODE_GCM, KM_MODE_CTR}) {
    const std::uint32_t handle = begin_encrypting(asking(mode));
    const bytes made = fed(handle, text);
    const finish_answer last = succeeds([&] { return client().finish(handle, pattern(100), with_aad(pattern(7))); });
    EXPECT_EQ(join({made, last.data}), expected(mode, KM_PAD_NONE, text));
    EXPECT_EQ(last.out_params, u32(0));
  }
}

TEST_F(AesEncryptTest, OutputThatDoesntFitIsAShortBufferAndEndsTheOperation) {
  struct tight {
    std::uint32_t mode, padding;
    std::size_t before, size, needed;
  };
  for (const tight& each : {tight{KM_MODE_ECB, KM_PAD_NONE, 0, 16, 16},
                            {KM_MODE_CBC, KM_PAD_PKCS7, 0, 47, 32},
                            {KM_MODE_CBC, KM_PAD_NONE, 15, 1, 16},
                            {KM_MODE_CTR, KM_PAD_NONE, 3, 20, 20},
                            {KM_MODE_GCM, KM_PAD_NONE, 3, 20, 20}}) {
    const hosted_tee::accounting before = tee.accounting();
    const bool is_gcm = each.mode == KM_MODE_GCM;
    const char* const line = is_gcm ? "AEUpdate failed with 0xffff0010\n" : "CipherUpdate failed with 0xffff0010\n";
    for (const std::size_t capacity : {std::size_t{0}, std::size_t{1}, each.needed - 1, each.needed}) {
      SCOPED_TRACE(fmt::format("mode {} capacity {}", each.mode, capacity));
      const std::uint32_t handle = begin_encrypting(asking(each.mode, each.padding));
      (void)fed(handle, pattern(each.before));
      const auto update = [&] { return client().update(handle, pattern(each.size), {}, capacity); };
      if (capacity < each.needed) {
        (void)expect_lost(broken(TEEC_ERROR_SHORT_BUFFER, {line, "Update failed"}), handle, before, update);
      } else {
        EXPECT_EQ(succeeds(update).size, each.needed);
        EXPECT_TRUE(client().abort(handle).ok());
      }
    }
  }
}

TEST_F(AesEncryptTest, AnUpdateWithoutOutputNeedsNoRoom) {
  const std::uint32_t handle = begin_encrypting(asking(KM_MODE_CBC, KM_PAD_PKCS7));
  EXPECT_TRUE(succeeds([&] { return client().update(handle, pattern(15), {}, 0); }).ok());
  EXPECT_EQ(fed(handle, {9}).size(), 16U);
}

}  // namespace
}  // namespace testing_support
