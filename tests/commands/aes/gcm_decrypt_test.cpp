// AES-GCM decryption: the end of the stream is the tag, and only the end tells where it begins.
#include <fmt/format.h>

#include <algorithm>

#include "tests/commands/aes/aes_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

class GcmDecryptTest : public AesTest {
 protected:
  const bytes lenient = import_without_shortest_tag();
  const failure forged = refused(KM_ERROR_VERIFICATION_FAILED, {"Finish failed"});

  bytes sealed(const bytes& text, std::uint32_t tag_bits, const bytes& aad = {}) const {
    return aes_encrypt({KM_MODE_GCM, KM_PAD_NONE, key, nonce, aad, tag_bits / 8}, text);
  }
  std::uint32_t begin(std::uint32_t tag_bits) {
    return client().must_begin(KM_PURPOSE_DECRYPT, lenient, gcm(tag_bits, nonce));
  }
  /// expect_forged feeds a whole stream and expects finish to refuse it.
  void expect_forged(const bytes& stream, std::uint32_t tag_bits, const bytes& aad = {}) {
    const hosted_tee::accounting before = tee.accounting();
    const std::uint32_t handle = begin(tag_bits);
    EXPECT_TRUE(aad.empty() || client().update(handle, {}, with_aad(aad)).ok());
    EXPECT_TRUE(client().update(handle, stream).ok());
    (void)expect_lost(forged, handle, before, [&] { return client().finish(handle); });
  }
};

TEST_F(GcmDecryptTest, NothingComesOutUntilMoreThanATagHasArrived) {
  for (const std::uint32_t tag_bits : {8U, 96U, 104U, 128U}) {
    SCOPED_TRACE(tag_bits);
    const bytes text = pattern(20), stream = sealed(text, tag_bits);
    const std::uint32_t handle = begin(tag_bits);
    for (std::size_t i = 0; i < stream.size(); ++i) {
      const bytes given = fed(handle, {stream.at(i)});
      EXPECT_EQ(given, i < tag_bits / 8 ? bytes{} : bytes{text.at(i - tag_bits / 8)});
    }
    EXPECT_TRUE(succeeds([&] { return client().finish(handle); }).data.empty());
  }
}

TEST_F(GcmDecryptTest, EveryPairOfCutsGivesTheText) {
  const bytes text = pattern(21), stream = sealed(text, 128, from_text("aad"));
  for (std::size_t one = 0; one <= stream.size(); ++one) {
    for (std::size_t two = one; two <= stream.size(); two += 3) {
      SCOPED_TRACE(fmt::format("cut at {} and {}", one, two));
      const cipher_answer back =
          run_cipher(client(), KM_PURPOSE_DECRYPT, lenient, gcm(128, nonce),
                     {first(stream, one), first(from(stream, one), two - one), from(stream, two)}, from_text("aad"));
      EXPECT_TRUE(back.ok());
      EXPECT_EQ(back.text, text);
    }
  }
}

TEST_F(GcmDecryptTest, ATagOfNoBytesHoldsNothingBackAndVerifies) {
  const bytes text = pattern(20), stream = sealed(text, 0);
  const std::uint32_t handle = begin(0);
  EXPECT_EQ(fed(handle, first(stream, 1)), first(text, 1));
  EXPECT_EQ(fed(handle, from(stream, 1)), from(text, 1));
  EXPECT_TRUE(succeeds([&] { return client().finish(handle); }).data.empty());
  const std::uint32_t empty = begin(0);
  EXPECT_TRUE(succeeds([&] { return client().finish(empty); }).data.empty());
}

TEST_F(GcmDecryptTest, EveryTagLengthVerifiesAndEveryBitOfItCounts) {
  for (std::uint32_t tag_bits = 8; tag_bits <= 128; tag_bits += 8) {
    SCOPED_TRACE(tag_bits);
    const bytes text = pattern(33), stream = sealed(text, tag_bits, {7});
    const cipher_answer back = succeeds(
        [&] { return run_cipher(client(), KM_PURPOSE_DECRYPT, lenient, gcm(tag_bits, nonce), {stream}, {7}); });
    EXPECT_EQ(back.text, text);
    EXPECT_TRUE(back.data.empty());
    for (std::size_t at = 33; at < stream.size(); ++at) expect_forged(flip(stream, at), tag_bits, {7});
  }
}

TEST_F(GcmDecryptTest, WhateverWasChangedIsAForgery) {
  const bytes stream = sealed(pattern(20), 128, from_text("aad"));
  for (const std::size_t at : {0U, 19U, 20U, 35U}) expect_forged(flip(stream, at), 128, from_text("aad"));
  expect_forged(stream, 128, from_text("aae"));
  expect_forged(stream, 128, from_text("aa"));
  expect_forged(stream, 128);
  expect_forged(first(stream, 35), 128, from_text("aad"));
  expect_forged(join({stream, {0}}), 128, from_text("aad"));
  expect_forged(stream, 120, from_text("aad"));
}

TEST_F(GcmDecryptTest, AStreamShorterThanItsTagIsAForgery) {
  const bytes stream = sealed({}, 128);
  ASSERT_EQ(stream.size(), 16U);
  for (std::size_t size = 0; size < 16; ++size) expect_forged(first(stream, size), 128);
  const std::uint32_t handle = begin(128);
  EXPECT_EQ(fed(handle, stream), bytes{});
  EXPECT_TRUE(client().finish(handle).ok());
}

TEST_F(GcmDecryptTest, ATagThatFinishWasGivenIsNotLookedAt) {
  const bytes stream = sealed(pattern(20), 128);
  const hosted_tee::accounting before = tee.accounting();
  const std::uint32_t handle = begin(128);
  (void)fed(handle, first(stream, 20));
  (void)expect_lost(forged, handle, before, [&] { return client().finish(handle, from(stream, 20)); });
}

TEST_F(GcmDecryptTest, RoomIsNeededForWhatComesOutAndNoMore) {
  const bytes text = pattern(48), stream = sealed(text, 128);
  const hosted_tee::accounting before = tee.accounting();
  const failure no_room = broken(TEEC_ERROR_SHORT_BUFFER, {"AEUpdate failed with 0xffff0010\n", "Update failed"});
  struct room {
    std::size_t fed_before, size, capacity;
    bool fits;
  };
  for (const room& each : {room{0, 16, 0, true},
                           {0, 17, 0, false},
                           {0, 17, 1, true},
                           {16, 5, 4, false},
                           {16, 5, 5, true},
                           {10, 5, 0, true},
                           {10, 10, 3, false},
                           {10, 10, 4, true},
                           {16, 32, 15, false},
                           {16, 32, 16, false},  // the bytes held fit, those of the input don't
                           {16, 32, 31, false},
                           {16, 32, 32, true},
                           {10, 22, 15, false},
                           {10, 22, 16, true}}) {
    SCOPED_TRACE(fmt::format("{} behind {} with room for {}", each.size, each.fed_before, each.capacity));
    const std::uint32_t handle = begin(128);
    (void)fed(handle, first(stream, each.fed_before));
    const bytes input = first(from(stream, each.fed_before), each.size);
    const auto update = [&] { return client().update(handle, input, {}, each.capacity); };
    if (!each.fits) {
      (void)expect_lost(no_room, handle, before, update);
      continue;
    }
    EXPECT_EQ(succeeds(update).body(),
              first(text, each.fed_before + each.size - std::min<std::size_t>(16, each.fed_before + each.size)));
    EXPECT_TRUE(client().abort(handle).ok());
  }
}

TEST_F(GcmDecryptTest, AssociatedDataComeBeforeTheFirstDataAlsoWhenThoseAreHeldBack) {
  const bytes aad = pattern(30), text = pattern(5), stream = sealed(text, 96, aad);
  std::uint32_t handle = begin(96);
  EXPECT_TRUE(client().update(handle, {}, with_aad(first(aad, 10))).ok());
  EXPECT_TRUE(client().update(handle, first(stream, 1), with_aad(from(aad, 10))).ok());
  EXPECT_EQ(fed(handle, from(stream, 1)), text);
  EXPECT_TRUE(client().finish(handle).ok());
  const hosted_tee::accounting before = tee.accounting();
  handle = begin(96);
  (void)fed(handle, first(stream, 1));
  (void)expect_lost(refused(KM_ERROR_INVALID_TAG, {"Update failed"}), handle, before,
                    [&] { return client().update(handle, {}, with_aad(aad)); });
}

}  // namespace
}  // namespace testing_support
