// Sealing of what lies in the state folder: AES-256-GCM under the device storage key.
#ifndef TEE_STORAGE_SEALING_H_
#define TEE_STORAGE_SEALING_H_

#include <array>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

#include "tee/crypto/secret_bytes.h"

namespace hosted_tee {

/// The device storage key. Every copy wipes itself when it goes.
class storage_key {
 public:
  storage_key() = default;
  storage_key(const storage_key&) = default;
  storage_key& operator=(const storage_key&) = default;
  ~storage_key() { OPENSSL_cleanse(bytes_.data(), bytes_.size()); }

  [[nodiscard]] std::span<std::uint8_t, 32> bytes() { return bytes_; }
  [[nodiscard]] std::span<const std::uint8_t, 32> bytes() const { return bytes_; }

 private:
  std::array<std::uint8_t, 32> bytes_{};
};

/// A sealed record is a random 12-byte nonce, the ciphertext and a 16-byte tag. The label names the place that the
/// record belongs to, so that it does not open anywhere else.
class sealer {
 public:
  static constexpr std::uint32_t overhead = 12 + 16;

  explicit sealer(const storage_key& key) : key_(key) {}

  /// seal throws call_failure when libcrypto refuses.
  [[nodiscard]] std::vector<std::uint8_t> seal(std::string_view label, std::span<const std::uint8_t> data) const;

  /// open answers nothing when the record is too short or does not authenticate.
  [[nodiscard]] std::optional<secret_bytes> open(std::string_view label, std::span<const std::uint8_t> sealed) const;

 private:
  storage_key key_;
};

}  // namespace hosted_tee

#endif  // TEE_STORAGE_SEALING_H_
