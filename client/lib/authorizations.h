// Authorizations: the tagged values that describe a key or an operation, and their marshalled form.
#ifndef KEYMASTER_CLIENT_LIB_AUTHORIZATIONS_H_
#define KEYMASTER_CLIENT_LIB_AUTHORIZATIONS_H_

#include <chrono>
#include <cstdint>
#include <initializer_list>
#include <optional>
#include <vector>

#include "client/lib/bytes.h"
#include "src/params/keymaster_defs.h"

namespace keymaster::client {

/// A moment as keys carry it: milliseconds since 1970-01-01T00:00:00Z.
using date = std::chrono::sys_time<std::chrono::milliseconds>;

[[nodiscard]] constexpr keymaster_tag_type_t tag_type(keymaster_tag_t tag) {
  return static_cast<keymaster_tag_type_t>(tag & 0xF0000000U);
}

[[nodiscard]] constexpr bool holds_bytes(keymaster_tag_t tag) {
  return tag_type(tag) == KM_BYTES || tag_type(tag) == KM_BIGNUM;
}

/// One tagged value. `blob` is used by tags of type KM_BYTES and KM_BIGNUM, `number` by all others.
struct authorization {
  keymaster_tag_t tag = 0;
  std::uint64_t number = 0;
  bytes blob;

  friend bool operator==(const authorization&, const authorization&) = default;
};

/// An ordered list of authorizations, built by chaining:
///
///     authorizations{}.algorithm(KM_ALGORITHM_RSA).key_size(2048).rsa_public_exponent(65537)
///         .purpose({KM_PURPOSE_SIGN}).digest({KM_DIGEST_SHA_2_256}).padding({KM_PAD_RSA_PSS}).no_auth_required()
///
/// Nothing is checked here beyond the form: what fits together is the TA's decision.
class authorizations {
 public:
  /// add appends a value. Throws std::invalid_argument when the tag holds the other kind of value, or when the number
  /// needs more bits than the tag's type has.
  authorizations& add(keymaster_tag_t tag, std::uint64_t number);
  authorizations& add(keymaster_tag_t tag, byte_view blob);
  authorizations& add(const authorizations& others);

  authorizations& algorithm(keymaster_algorithm_t value) { return add(KM_TAG_ALGORITHM, value); }
  authorizations& key_size(std::uint32_t bits) { return add(KM_TAG_KEY_SIZE, bits); }
  authorizations& rsa_public_exponent(std::uint64_t value) { return add(KM_TAG_RSA_PUBLIC_EXPONENT, value); }
  authorizations& purpose(std::initializer_list<keymaster_purpose_t> v) { return add_each(KM_TAG_PURPOSE, v); }
  authorizations& block_mode(std::initializer_list<keymaster_block_mode_t> v) { return add_each(KM_TAG_BLOCK_MODE, v); }
  authorizations& digest(std::initializer_list<keymaster_digest_t> v) { return add_each(KM_TAG_DIGEST, v); }
  authorizations& padding(std::initializer_list<keymaster_padding_t> v) { return add_each(KM_TAG_PADDING, v); }
  authorizations& mac_length(std::uint32_t bits) { return add(KM_TAG_MAC_LENGTH, bits); }
  authorizations& min_mac_length(std::uint32_t bits) { return add(KM_TAG_MIN_MAC_LENGTH, bits); }
  authorizations& caller_nonce() { return add(KM_TAG_CALLER_NONCE, 1); }
  authorizations& nonce(byte_view value) { return add(KM_TAG_NONCE, value); }
  authorizations& associated_data(byte_view value) { return add(KM_TAG_ASSOCIATED_DATA, value); }

  authorizations& active(date from) { return add_date(KM_TAG_ACTIVE_DATETIME, from); }
  authorizations& origination_expire(date at) { return add_date(KM_TAG_ORIGINATION_EXPIRE_DATETIME, at); }
  authorizations& usage_expire(date at) { return add_date(KM_TAG_USAGE_EXPIRE_DATETIME, at); }
  authorizations& min_seconds_between_ops(std::uint32_t seconds) {
    return add(KM_TAG_MIN_SECONDS_BETWEEN_OPS, seconds);
  }
  authorizations& max_uses_per_boot(std::uint32_t count) { return add(KM_TAG_MAX_USES_PER_BOOT, count); }

  authorizations& no_auth_required() { return add(KM_TAG_NO_AUTH_REQUIRED, 1); }
  authorizations& user_secure_id(std::uint64_t id) { return add(KM_TAG_USER_SECURE_ID, id); }
  authorizations& user_auth_type(std::uint32_t mask) { return add(KM_TAG_USER_AUTH_TYPE, mask); }
  authorizations& auth_timeout(std::uint32_t seconds) { return add(KM_TAG_AUTH_TIMEOUT, seconds); }
  authorizations& auth_token(byte_view token) { return add(KM_TAG_AUTH_TOKEN, token); }
  authorizations& application_id(byte_view id) { return add(KM_TAG_APPLICATION_ID, id); }
  authorizations& application_data(byte_view data) { return add(KM_TAG_APPLICATION_DATA, data); }

  /// soter_key makes a key one of the attestation framework. Its export statement is signed by the device's attestation
  /// key or by another key's blob; counted puts the device's counter into it, and the uid the one given here.
  authorizations& soter_key() { return add(KM_TAG_SOTER_KEY, 1); }
  authorizations& soter_signed_by_attk() { return add(KM_TAG_SOTER_SIGNED_BY_ATTK, 1); }
  authorizations& soter_signed_by_key() { return add(KM_TAG_SOTER_SIGNED_BY_KEY, 1); }
  authorizations& soter_signing_key_blob(byte_view blob) { return add(KM_TAG_SOTER_SIGNING_KEY_BLOB, blob); }
  authorizations& soter_signing_key_name(byte_view blob) { return add(KM_TAG_SOTER_SIGNING_KEY_NAME, blob); }
  authorizations& soter_counted() { return add(KM_TAG_SOTER_COUNTED, 1); }
  authorizations& soter_uid(std::uint32_t uid) { return add(KM_TAG_SOTER_UID, uid); }

  [[nodiscard]] std::size_t count(keymaster_tag_t tag) const;
  [[nodiscard]] bool contains(keymaster_tag_t tag) const { return count(tag) != 0; }
  /// numbers gives the values of a tag in order; unique_number its value when the tag occurs exactly once.
  [[nodiscard]] std::vector<std::uint64_t> numbers(keymaster_tag_t tag) const;
  [[nodiscard]] std::optional<std::uint64_t> unique_number(keymaster_tag_t tag) const;
  /// unique_blob gives the bytes of a tag when it occurs exactly once.
  [[nodiscard]] std::optional<bytes> unique_blob(keymaster_tag_t tag) const;

  [[nodiscard]] std::size_t size() const { return list_.size(); }
  [[nodiscard]] bool empty() const { return list_.empty(); }
  [[nodiscard]] auto begin() const { return list_.begin(); }
  [[nodiscard]] auto end() const { return list_.end(); }

  /// marshal gives the byte form that the TA reads: a 32-bit count, then per value a record of 24 bytes with a blob's
  /// bytes right behind it. marshalled_size is its length.
  [[nodiscard]] bytes marshal() const;
  [[nodiscard]] std::size_t marshalled_size() const;

  /// unmarshal reads that form. Throws format_error when a record or a blob runs past the end; bytes after the last
  /// record are ignored, as the format has it.
  [[nodiscard]] static authorizations unmarshal(byte_view data);

  friend bool operator==(const authorizations&, const authorizations&) = default;

 private:
  template <class Value>
  authorizations& add_each(keymaster_tag_t tag, std::initializer_list<Value> values) {
    for (const Value value : values) {
      add(tag, static_cast<std::uint64_t>(value));
    }
    return *this;
  }
  authorizations& add_date(keymaster_tag_t tag, date moment);

  std::vector<authorization> list_;
};

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_AUTHORIZATIONS_H_
