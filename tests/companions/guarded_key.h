// A key of the Keymaster TA that is bound to a user, and what the TA says to auth tokens for it.
#ifndef TESTS_COMPANIONS_GUARDED_KEY_H_
#define TESTS_COMPANIONS_GUARDED_KEY_H_

#include <functional>
#include <optional>

#include "tests/support/rsa_test_key.h"
#include "tests/support/ta_client.h"

namespace testing_support {

/// A fixed RSA key that signs for the user `secure_id` who proved themselves in one of the ways of `auth_type`: for
/// each operation, or for `timeout` seconds.
class guarded_key {
 public:
  guarded_key(ta_client& client, std::uint64_t secure_id, std::uint32_t auth_type,
              std::optional<std::uint32_t> timeout = std::nullopt);

  /// use signs with a token that `token_for` makes of the operation's handle, and answers the Keymaster error of the
  /// first step that failed. KM_ERROR_OK: there is a signature, and libcrypto verifies it.
  std::int32_t use(const std::function<bytes(std::uint32_t handle)>& token_for);

  /// begin answers the Keymaster error of a begin with this token, or with none, and ends the operation.
  std::int32_t begin(const std::optional<bytes>& token = std::nullopt);

 private:
  ta_client& client_;
  const rsa_test_key& key_ = rsa_test_key::of_bits(1024);
  bytes blob_;
};

}  // namespace testing_support

#endif  // TESTS_COMPANIONS_GUARDED_KEY_H_
