// AES decryption with PKCS#7 padding: the block held back, the padding, and how much room an update needs.
#include <fmt/format.h>

#include <algorithm>

#include "tests/commands/aes/aes_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

class AesDecryptTest : public AesTest {
 protected:
  const param_list padded = asking(KM_MODE_CBC, KM_PAD_PKCS7);

  /// Ciphertext of a text whose last block is whatever the test wants it to be.
  bytes ending_in(const bytes& last_block, std::size_t blocks_before = 1) const {
    return expected(KM_MODE_CBC, KM_PAD_NONE, join({pattern(16 * blocks_before), last_block}));
  }
  cipher_answer decrypted(const bytes& ciphertext, const param_list& params) {
    return run_cipher(client(), KM_PURPOSE_DECRYPT, blob, params, {ciphertext});
  }
};

TEST_F(AesDecryptTest, TheLastBlockSoFarIsHeldBackUntilMoreComes) {
  const bytes text = pattern(40), whole = expected(KM_MODE_CBC, KM_PAD_PKCS7, text);
  const std::uint32_t handle = begin_decrypting(padded);
  EXPECT_EQ(fed(handle, first(whole, 16)), bytes{});
  EXPECT_EQ(fed(handle, {}), bytes{});
  EXPECT_EQ(fed(handle, first(from(whole, 16), 1)), first(text, 16));
  EXPECT_EQ(fed(handle, first(from(whole, 17), 15)), bytes{});
  EXPECT_EQ(fed(handle, from(whole, 32)), first(from(text, 16), 16));
  EXPECT_EQ(succeeds([&] { return client().finish(handle); }).data, from(text, 32));
}

TEST_F(AesDecryptTest, EveryLengthComesBack) {
  for (const std::uint32_t mode : {KM_MODE_ECB, KM_MODE_CBC}) {
    for (std::size_t size = 0; size <= 49; ++size) {
      SCOPED_TRACE(fmt::format("mode {} {} bytes", mode, size));
      const bytes text = pattern(size), whole = expected(mode, KM_PAD_PKCS7, text);
      for (const std::size_t step : {1U, 7U, 16U, 17U, 100U}) {
        const cipher_answer back = succeeds([&] {
          return run_cipher(client(), KM_PURPOSE_DECRYPT, blob, asking(mode, KM_PAD_PKCS7), cut_every(whole, step));
        });
        EXPECT_EQ(to_hex(back.text), to_hex(text));
      }
    }
  }
}

TEST_F(AesDecryptTest, WithoutPaddingNothingIsHeldBack) {
  const bytes text = pattern(48);
  for (const std::uint32_t mode : {KM_MODE_ECB, KM_MODE_CBC}) {
    const std::uint32_t handle = begin_decrypting(asking(mode));
    EXPECT_EQ(fed(handle, expected(mode, KM_PAD_NONE, text)), text);
    EXPECT_TRUE(succeeds([&] { return client().finish(handle); }).data.empty());
  }
}

TEST_F(AesDecryptTest, PaddingIsWhatTheLastByteSaysAndEveryByteOfItMustSayTheSame) {
  const hosted_tee::accounting before = tee.accounting();
  for (unsigned count = 0; count < 256; ++count) {
    SCOPED_TRACE(count);
    bytes block = pattern(16, count + 1000);
    for (std::size_t i = 0; i < std::min(count, 16U); ++i) block.at(15 - i) = static_cast<std::uint8_t>(count);
    block.back() = static_cast<std::uint8_t>(count);
    const bytes ciphertext = ending_in(block);
    if (count <= 16) {
      const cipher_answer back = succeeds([&] { return decrypted(ciphertext, padded); });
      EXPECT_EQ(back.data, first(block, 16 - count));
    } else {
      const std::uint32_t handle = begin_decrypting(padded);
      EXPECT_EQ(fed(handle, ciphertext), pattern(16));
      (void)expect_lost(refused(KM_ERROR_INVALID_ARGUMENT, {"Illegal padding", "Finish failed"}), handle, before,
                        [&] { return client().finish(handle); });
    }
  }
}

TEST_F(AesDecryptTest, AWrongByteAnywhereInThePaddingIsFound) {
  const hosted_tee::accounting before = tee.accounting();
  for (unsigned count = 2; count <= 16; ++count) {
    for (unsigned wrong = 1; wrong < count; ++wrong) {
      bytes block = join({pattern(16 - count), bytes(count, static_cast<std::uint8_t>(count))});
      block.at(15 - wrong) ^= 0x80;
      const std::uint32_t handle = begin_decrypting(padded);
      (void)fed(handle, ending_in(block));
      (void)expect_lost(refused(KM_ERROR_INVALID_ARGUMENT, {"Illegal padding", "Finish failed"}), handle, before,
                        [&] { return client().finish(handle); });
    }
  }
}

TEST_F(AesDecryptTest, ABlockThatEndsIn0IsTextAsAWhole) {
  for (const bytes& block : {bytes(16), join({pattern(15), {0}})}) {
    EXPECT_EQ(succeeds([&] { return decrypted(ending_in(block), padded); }).data, block);
  }
}

TEST_F(AesDecryptTest, ABlockOfNothingButPaddingIsNoText) {
  const cipher_answer back = succeeds([&] { return decrypted(ending_in(bytes(16, 16), 0), padded); });
  EXPECT_TRUE(back.text.empty());
}

TEST_F(AesDecryptTest, NoDataAtAllAreABlockOfZeros) {
  for (const std::uint32_t mode : {KM_MODE_ECB, KM_MODE_CBC}) {
    const std::uint32_t handle = begin_decrypting(asking(mode, KM_PAD_PKCS7));
    EXPECT_EQ(succeeds([&] { return client().finish(handle); }).data, bytes(16));
  }
}

TEST_F(AesDecryptTest, DataThatEndInsideABlockAreRefusedAtTheEndBehindTheBlocksBefore) {
  const hosted_tee::accounting before = tee.accounting();
  const bytes whole = expected(KM_MODE_CBC, KM_PAD_PKCS7, pattern(40));
  for (const std::size_t size : {1U, 15U, 17U, 31U, 33U}) {
    SCOPED_TRACE(size);
    std::uint32_t handle = begin_decrypting(padded);
    EXPECT_EQ(fed(handle, first(whole, size)), first(pattern(40), size / 16 * 16));
    const std::uint32_t ends = tee.world().faults().call_count("TEE_CipherDoFinal");
    (void)expect_lost(refused(KM_ERROR_INVALID_INPUT_LENGTH, {"Input data not align to block size", "Finish failed"}),
                      handle, before, [&] { return client().finish(handle); });
    EXPECT_EQ(tee.world().faults().call_count("TEE_CipherDoFinal"), ends) << "the platform is not asked";
    // Without padding it is the platform that refuses.
    handle = begin_decrypting(asking(KM_MODE_CBC));
    (void)fed(handle, first(whole, size));
    (void)expect_lost(broken(TEEC_ERROR_BAD_PARAMETERS, {"CipherDoFinal failed with 0xffff0006\n", "Finish failed"}),
                      handle, before, [&] { return client().finish(handle); });
  }
}

TEST_F(AesDecryptTest, AnUpdateNeedsRoomForTheHeldBlockAndForEveryBlockOfItsInput) {
  const hosted_tee::accounting before = tee.accounting();
  const bytes text = pattern(60), whole = expected(KM_MODE_CBC, KM_PAD_PKCS7, text);
  const failure no_room = broken(TEEC_ERROR_SHORT_BUFFER, {"CipherUpdate failed with 0xffff0010\n", "Update failed"});
  const failure no_room_for_held = refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {"Update failed"});
  struct room {
    std::size_t fed_before, size, capacity;
    const failure* expected;  // null: it fits
    std::size_t given;
  };
  for (const room& each : {room{0, 16, 15, &no_room, 0},
                           {0, 16, 0, &no_room, 0},
                           {0, 16, 16, nullptr, 0},
                           {0, 32, 31, &no_room, 0},
                           {0, 32, 32, nullptr, 16},
                           {0, 15, 0, nullptr, 0},
                           {16, 1, 0, &no_room_for_held, 0},
                           {16, 1, 15, &no_room_for_held, 0},
                           {16, 16, 15, &no_room_for_held, 0},
                           {16, 1, 16, nullptr, 16},
                           {16, 15, 16, nullptr, 16},
                           {16, 16, 16, &no_room, 0},
                           {16, 16, 31, &no_room, 0},
                           {16, 16, 32, nullptr, 16},
                           {16, 48, 63, &no_room, 0},
                           {16, 48, 64, nullptr, 48}}) {
    SCOPED_TRACE(fmt::format("{} behind {} with room for {}", each.size, each.fed_before, each.capacity));
    const std::uint32_t handle = begin_decrypting(padded);
    (void)fed(handle, first(whole, each.fed_before));
    const bytes input = first(from(whole, each.fed_before), each.size);
    const auto update = [&] { return client().update(handle, input, {}, each.capacity); };
    if (each.expected != nullptr) {
      (void)expect_lost(*each.expected, handle, before, update);
      continue;
    }
    const answer a = succeeds(update);
    EXPECT_EQ(a.body(), first(text, each.given));
    EXPECT_TRUE(client().abort(handle).ok());
  }
}

TEST_F(AesDecryptTest, TheBlockHeldBackDoesNotStayInTheClientsMemory) {
  const bytes text = pattern(47), whole = expected(KM_MODE_CBC, KM_PAD_PKCS7, text);
  const std::uint32_t handle = begin_decrypting(padded);
  const answer a = succeeds([&] { return client().update(handle, whole, {}, 100); });
  EXPECT_EQ(a.output, join({first(text, 32), bytes(16, 0), bytes(52, canary)}));
  EXPECT_EQ(client().finish(handle).data, from(text, 32));
}

TEST_F(AesDecryptTest, AnEmptyUpdateLeavesTheHeldBlockAlone) {
  const std::uint32_t handle = begin_decrypting(padded);
  (void)fed(handle, expected(KM_MODE_CBC, KM_PAD_PKCS7, pattern(3)));
  EXPECT_EQ(succeeds([&] { return client().update(handle, {}, {}, 0); }).size, 0U);
  EXPECT_EQ(client().finish(handle).data, pattern(3));
}

TEST_F(AesDecryptTest, AnotherNonceOrKeyGivesAnotherText) {
  const bytes text = pattern(32), whole = expected(KM_MODE_CBC, KM_PAD_NONE, text);
  // In CBC the nonce covers the first block alone.
  EXPECT_EQ(from(decrypted(whole, cipher(KM_MODE_CBC, KM_PAD_NONE, flip(iv, 3))).text, 16), from(text, 16));
  EXPECT_EQ(first(decrypted(whole, cipher(KM_MODE_CBC, KM_PAD_NONE, flip(iv, 3))).text, 16), flip(first(text, 16), 3));
  const bytes other = import_raw(flip(key, 0), aes_key(128));
  EXPECT_NE(run_cipher(client(), KM_PURPOSE_DECRYPT, other, asking(KM_MODE_CBC), {whole}).text, text);
}

}  // namespace
}  // namespace testing_support
