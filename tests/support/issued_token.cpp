#include "tests/support/issued_token.h"

#include <openssl/evp.h>
#include <openssl/hmac.h>

#include <algorithm>

namespace testing_support {
namespace {

bytes big_endian(bytes number) {
  std::reverse(number.begin(), number.end());
  return number;
}

}  // namespace

bytes issued_token::issue(const std::array<std::uint8_t, 32>& boot_seed) const {
  const bytes version = {0};
  const bytes text = join({version, u64(challenge), u64(user_id), u64(authenticator_id),
                           big_endian(u32(authenticator_type)), big_endian(u64(timestamp_ms))});
  bytes mac(32);
  unsigned length = 0;
  HMAC(EVP_sha256(), boot_seed.data(), static_cast<int>(boot_seed.size()), text.data(), text.size(), mac.data(),
       &length);
  return join({text, mac});
}

}  // namespace testing_support
