// HMAC-SHA256 under a key that is at hand as bytes.
#ifndef TEE_COMPANIONS_COMMON_KEYED_MAC_H_
#define TEE_COMPANIONS_COMMON_KEYED_MAC_H_

#include <cstdint>
#include <span>

#include "platform/handles.h"

namespace keymaster::companion {

inline constexpr uint32_t mac_size = 32;

/// keyed_mac is made ready before a message is at hand: what the platform can lack shows in `prepare`, and after it
/// `compute` fails for hardly any reason.
class keyed_mac {
 public:
  /// prepare takes the key, mac_size bytes; the caller wipes his own. The result is the platform's.
  [[nodiscard]] TEE_Result prepare(std::span<const uint8_t, mac_size> key);

  /// compute writes the MAC of `head` and then `tail` to `mac`. The result is the platform's, or TEE_ERROR_GENERIC when
  /// what it made has another size; `mac` is all zero then.
  [[nodiscard]] TEE_Result compute(std::span<const uint8_t> head, std::span<const uint8_t> tail,
                                   std::span<uint8_t, mac_size> mac);

 private:
  operation_handle operation_;
};

}  // namespace keymaster::companion

#endif  // TEE_COMPANIONS_COMMON_KEYED_MAC_H_
