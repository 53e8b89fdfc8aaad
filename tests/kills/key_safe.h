// Every key that a client ever got, and what it does.
#ifndef TESTS_KILLS_KEY_SAFE_H_
#define TESTS_KILLS_KEY_SAFE_H_

#include <array>
#include <mutex>
#include <random>
#include <string>
#include <vector>

#include "client/lib/keys.h"

namespace hosted_tee::testing {

using dice = std::minstd_rand;

/// pick draws a number below `end`.
[[nodiscard]] inline std::size_t pick(dice& random, std::size_t end) {
  return std::uniform_int_distribution<std::size_t>(0, end - 1)(random);
}

/// The kinds of keys, in the order of how many of them a test makes.
enum class key_kind { ec, aes, hmac, rsa };

/// make_key has the TA make one that needs no user.
[[nodiscard]] keymaster::client::key_blob make_key(keymaster::client::session& ta, key_kind kind);

/// What a key answers to the same request each time: of EC its public half, of the others a ciphertext, a MAC or a
/// signature. Empty while nobody has asked.
using key_proof = keymaster::client::bytes;

struct kept_key {
  key_kind kind = key_kind::ec;
  keymaster::client::key_blob blob;
  key_proof proof;
};

/// use_key opens a key twice: for its characteristics, which must be as it was made, and for an operation, whose output
/// must be right as far as the test can tell and otherwise the same as ever. Answers the proof. What does not fit is a
/// failure of the test; throws keymaster::client::error.
[[nodiscard]] key_proof use_key(keymaster::client::session& ta, const kept_key& key);

/// Kept by the test over all clients and all lives of the server.
class key_safe {
 public:
  /// put answers the key's place. A blob that is not sealed under the RPMB key is a failure of the test.
  std::size_t put(key_kind kind, keymaster::client::key_blob blob);
  void learn(std::size_t place, key_proof proof);

  [[nodiscard]] std::size_t size() const;
  [[nodiscard]] kept_key at(std::size_t place) const;

  /// use uses the key at a place, and keeps its proof if there was none.
  void use(keymaster::client::session& ta, std::size_t place);

 private:
  mutable std::mutex mutex_;
  std::vector<kept_key> keys_;
};

}  // namespace hosted_tee::testing

#endif  // TESTS_KILLS_KEY_SAFE_H_
