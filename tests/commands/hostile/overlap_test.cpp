// A client whose request and response are the same memory, or overlap. What comes out is its own doing, but the TA must
// stand, and hold what it held.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/commands/raw_session.h"
#include "tests/support/encryption.h"

using namespace keymaster;

namespace testing_support {
namespace {

struct overlapped_cipher {
  std::uint32_t mode, padding;
};
constexpr overlapped_cipher every_cipher[] = {{KM_MODE_ECB, KM_PAD_NONE}, {KM_MODE_ECB, KM_PAD_PKCS7},
                                              {KM_MODE_CBC, KM_PAD_NONE}, {KM_MODE_CBC, KM_PAD_PKCS7},
                                              {KM_MODE_CTR, KM_PAD_NONE}, {KM_MODE_GCM, KM_PAD_NONE}};
constexpr std::uint32_t input_at = 4;  // of the request: the input's length comes first

class OverlapTest : public CommandTest {
 protected:
  static constexpr std::uint32_t memory_size = 400;
  const bytes key = pattern(16, 601);
  const bytes blob = client().must_import(aes_key(128), key);
  raw_session session{tee.world()};
  bytes memory = bytes(memory_size);

  [[nodiscard]] static bytes nonce_of(std::uint32_t mode) {
    return mode == KM_MODE_ECB ? bytes{} : pattern(mode == KM_MODE_GCM ? 12 : 16, 602);
  }
  std::uint32_t begin(std::uint32_t purpose, const overlapped_cipher& what) {
    param_list params = cipher(what.mode, what.padding, nonce_of(what.mode));
    if (what.mode == KM_MODE_GCM) params.add(KM_TAG_MAC_LENGTH, 128);
    return client().must_begin(purpose, blob, params);
  }

  /// call puts `request` at `from` and has the response written from `to` on.
  raw_answer call(std::uint32_t command, std::uint32_t handle, const bytes& request, std::uint32_t from,
                  std::uint32_t to) {
    std::fill(memory.begin(), memory.end(), canary);
    std::copy(request.begin(), request.end(), memory.begin() + from);
    TEE_Param in = memref(memory), out = memref(memory);
    in.memref.buffer = memory.data() + from;
    in.memref.size = static_cast<std::uint32_t>(request.size());
    out.memref.buffer = memory.data() + to;
    out.memref.size = memory_size - to;
    const raw_answer got = session.call(command, handle, in, out);
    EXPECT_NE(got.result, TEE_ERROR_TARGET_DEAD);
    EXPECT_LE(got.size, memory_size - to);
    return got;
  }
  static bool good(const raw_answer& got) { return got.result == TEE_SUCCESS && got.error == KM_ERROR_OK; }
};

TEST_F(OverlapTest, TheTaStandsAndHoldsWhatItHeld) {
  const hosted_tee::accounting before = tee.accounting();
  for (const overlapped_cipher& what : every_cipher) {
    for (const std::uint32_t purpose : {KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT}) {
      for (const std::uint32_t distance : {0U, 1U, 4U, 15U, 16U, 17U, 20U}) {
        for (const bool response_first : {false, true}) {
          SCOPED_TRACE(fmt::format("mode {} padding {} purpose {} distance {} {}", what.mode, what.padding, purpose,
                                   distance, response_first));
          const std::uint32_t from = response_first ? distance : 0, to = response_first ? 0 : distance;
          const std::uint32_t handle = begin(purpose, what);
          bool lives = true;
          for (const std::size_t size : {16U, 48U, 5U, 43U}) {  // with a block held back, and inside a block
            if (!lives) break;
            lives = good(call(KM_COMMAND_UPDATE, handle, join({prefixed(pattern(size)), prefixed(u32(0))}), from, to));
          }
          if (lives) (void)call(KM_COMMAND_FINISH, handle, join({prefixed({}), prefixed(u32(0))}), from, to);
          expect_same(before);
        }
      }
    }
  }
  EXPECT_TRUE(tee.world().has_instance(keymaster_ta));
}

TEST_F(OverlapTest, AnOutputThatTakesThePlaceOfItsInputIsWhatItShouldBe) {
  // Without a block held back, that is what clients do who have one buffer alone.
  for (const overlapped_cipher& what : every_cipher) {
    if (what.padding != KM_PAD_NONE) continue;
    SCOPED_TRACE(what.mode);
    const bytes text = pattern(64, what.mode);
    const std::uint32_t handle = begin(KM_PURPOSE_ENCRYPT, what);
    const raw_answer got = call(KM_COMMAND_UPDATE, handle, join({prefixed(text), prefixed(u32(0))}), 0, input_at);
    EXPECT_TRUE(good(got));
    ASSERT_EQ(got.size, text.size());
    const bytes expected = aes_encrypt({what.mode, what.padding, key, nonce_of(what.mode), {}, 0}, text);
    EXPECT_EQ(bytes(memory.begin() + input_at, memory.begin() + input_at + 64), expected);
    EXPECT_TRUE(client().abort(handle).ok());
  }
}

}  // namespace
}  // namespace testing_support
