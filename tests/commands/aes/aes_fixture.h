// A device with an AES key that the test knows.
#ifndef TESTS_COMMANDS_AES_AES_FIXTURE_H_
#define TESTS_COMMANDS_AES_AES_FIXTURE_H_

#include "tests/commands/command_fixture.h"
#include "tests/support/encryption.h"

namespace testing_support {

inline constexpr std::uint32_t aes_block = 16;
inline constexpr std::uint32_t both_cipher_purposes[] = {keymaster::KM_PURPOSE_ENCRYPT, keymaster::KM_PURPOSE_DECRYPT};

class AesTest : public CommandTest {
 protected:
  const bytes key = pattern(16, 77);
  const bytes iv = pattern(16, 78);     // of CBC and CTR
  const bytes nonce = pattern(12, 79);  // of GCM
  const bytes blob = import_raw(key, aes_key(128));

  bytes import_raw(const bytes& raw, const param_list& params) { return client().must_import(params, raw); }

  /// A key without a shortest tag, as only an import can make one.
  bytes import_without_shortest_tag() { return import_raw(key, aes_key(128).remove(keymaster::KM_TAG_MIN_MAC_LENGTH)); }

  [[nodiscard]] bytes nonce_of(std::uint32_t block_mode) const {
    return block_mode == keymaster::KM_MODE_ECB ? bytes{} : block_mode == keymaster::KM_MODE_GCM ? nonce : iv;
  }
  [[nodiscard]] param_list asking(std::uint32_t block_mode, std::uint32_t padding = keymaster::KM_PAD_NONE) const {
    param_list list = cipher(block_mode, padding, nonce_of(block_mode));
    return block_mode == keymaster::KM_MODE_GCM ? list.add(keymaster::KM_TAG_MAC_LENGTH, 128) : list;
  }

  /// What libcrypto makes of `text` under the same key and nonce.
  [[nodiscard]] bytes expected(std::uint32_t block_mode, std::uint32_t padding, const bytes& text,
                               const bytes& aad = {}) const {
    return aes_encrypt({block_mode, padding, key, nonce_of(block_mode), aad}, text);
  }

  std::uint32_t begin_encrypting(const param_list& params) {
    return client().must_begin(keymaster::KM_PURPOSE_ENCRYPT, blob, params);
  }
  std::uint32_t begin_decrypting(const param_list& params) {
    return client().must_begin(keymaster::KM_PURPOSE_DECRYPT, blob, params);
  }
  /// fed answers what an update of `input` gives out.
  bytes fed(std::uint32_t handle, const bytes& input) {
    const answer a = succeeds([&] { return client().update(handle, input); });
    EXPECT_EQ(a.b, input.size());
    return a.body();
  }

  static param_list with_aad(const bytes& aad) { return param_list{}.add_blob(keymaster::KM_TAG_ASSOCIATED_DATA, aad); }
};

/// first and from are parts of `data`.
inline bytes first(const bytes& data, std::size_t size) {
  return {data.begin(), data.begin() + static_cast<std::ptrdiff_t>(size)};
}
inline bytes from(const bytes& data, std::size_t offset) {
  return {data.begin() + static_cast<std::ptrdiff_t>(offset), data.end()};
}

}  // namespace testing_support

#endif  // TESTS_COMMANDS_AES_AES_FIXTURE_H_
