// Parameter sets as a client writes and reads them: an encoder and a parser of their own, so that the TA's are checked
// against something else than themselves.
#ifndef TESTS_SUPPORT_PARAM_LIST_H_
#define TESTS_SUPPORT_PARAM_LIST_H_

#include <optional>

#include "src/params/keymaster_defs.h"
#include "tests/support/bytes.h"

namespace testing_support {

struct param {
  std::uint32_t tag = 0;
  std::uint64_t value = 0;  // numbers of every width
  bytes blob;               // KM_BIGNUM and KM_BYTES
};

/// Builds parameter sets: param_list{}.add(KM_TAG_KEY_SIZE, 2048).add_blob(KM_TAG_APPLICATION_ID, id).
class param_list {
 public:
  param_list& add(std::uint32_t tag, std::uint64_t value = 1);
  param_list& add_blob(std::uint32_t tag, bytes blob);
  param_list& add(const param_list& others);
  param_list& remove(std::uint32_t tag);

  /// marshal gives the byte form, without gaps: count, then 24-byte records with their blobs.
  [[nodiscard]] bytes marshal() const;

  /// parse reads the byte form; nothing when it is malformed or has bytes left over.
  static std::optional<param_list> parse(std::span<const std::uint8_t> data);

  [[nodiscard]] const std::vector<param>& params() const { return params_; }
  [[nodiscard]] bool has(std::uint32_t tag) const;
  [[nodiscard]] std::uint64_t value(std::uint32_t tag) const;  // of the first; throws when absent
  [[nodiscard]] bytes blob(std::uint32_t tag) const;

 private:
  std::vector<param> params_;
};

/// rsa_key asks for an RSA key that signs and verifies with any of the signature paddings and digests and needs no
/// user.
param_list rsa_key(std::uint32_t bits = 2048);

/// signature asks for an operation with this digest and padding.
param_list signature(std::uint32_t digest, std::uint32_t padding);

}  // namespace testing_support

#endif  // TESTS_SUPPORT_PARAM_LIST_H_
