// What the tests of the platform's cryptography share: an instance, owners of handles, bytes and keys.
#ifndef TESTS_TEE_CRYPTO_FIXTURE_H_
#define TESTS_TEE_CRYPTO_FIXTURE_H_

#include <gtest/gtest.h>
#include <openssl/evp.h>

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tee_internal_api_extensions.h"
#include "tests/tee/scoped_instance.h"

namespace hosted_tee::testing {

using bytes = std::vector<std::uint8_t>;

[[nodiscard]] bytes from_hex(std::string_view hex);
[[nodiscard]] bytes from_text(std::string_view text);
[[nodiscard]] bytes repeated(std::uint8_t value, std::size_t count);
[[nodiscard]] bytes joined(const bytes& a, const bytes& b);

[[nodiscard]] inline std::uint32_t size_of(const bytes& data) {
  return static_cast<std::uint32_t>(data.size());
}

// Owners are members of tests and fixtures, and not of lambdas that panic: a panic unwinds nothing.
struct object_closer {
  void operator()(TEE_ObjectHandle handle) const { TEE_FreeTransientObject(handle); }
};
struct operation_closer {
  void operator()(TEE_OperationHandle handle) const { TEE_FreeOperation(handle); }
};
using object_owner = std::unique_ptr<std::remove_pointer_t<TEE_ObjectHandle>, object_closer>;
using operation_owner = std::unique_ptr<std::remove_pointer_t<TEE_OperationHandle>, operation_closer>;
struct key_closer {
  void operator()(EVP_PKEY* key) const { EVP_PKEY_free(key); }
};
using key_owner = std::unique_ptr<EVP_PKEY, key_closer>;

/// A result with the bytes that came with it.
struct answer {
  TEE_Result result = TEE_ERROR_GENERIC;
  bytes data;
  std::uint32_t length = 0;  ///< the reported length, also of a failure
};

/// taking calls `call(buffer, &length)` with a buffer of `capacity` bytes. More written than reported fails the test.
[[nodiscard]] answer taking(std::size_t capacity, const std::function<TEE_Result(void*, std::uint32_t*)>& call);

/// panics runs `code`, which must own nothing, and tells whether it panicked the instance.
[[nodiscard]] bool panics(const std::function<void()>& code);

/// Attributes that own their bytes.
class attribute_list {
 public:
  attribute_list& add(std::uint32_t id, const bytes& value);
  attribute_list& add_value(std::uint32_t id, std::uint32_t a, std::uint32_t b = 0);
  [[nodiscard]] const TEE_Attribute* data() const { return list_.data(); }
  [[nodiscard]] std::uint32_t count() const { return static_cast<std::uint32_t>(list_.size()); }

 private:
  std::vector<TEE_Attribute> list_;
  std::vector<std::shared_ptr<bytes>> values_;  // copies of the list share them
};

class crypto_fixture : public ::testing::Test {
 protected:
  [[nodiscard]] fault_plan& faults() { return world_.faults(); }
  [[nodiscard]] instance& self() { return world_.self(); }

  /// allocate gives an empty object; populate_into tells the result of filling it; secret_key does both for bytes.
  [[nodiscard]] static object_owner allocate(std::uint32_t type, std::uint32_t bits);
  [[nodiscard]] static TEE_Result populate_into(const object_owner& object, const attribute_list& attributes);
  [[nodiscard]] static object_owner secret_key(std::uint32_t type, const bytes& value);
  [[nodiscard]] static bytes buffer_attribute(const object_owner& object, std::uint32_t id);

  /// operation_for gives an operation of the key's size, with the key set.
  [[nodiscard]] static operation_owner operation_for(std::uint32_t algorithm, std::uint32_t mode,
                                                     const object_owner& key);
  [[nodiscard]] static operation_owner keyless(std::uint32_t algorithm, std::uint32_t mode, std::uint32_t bits);
  [[nodiscard]] static TEE_OperationInfo info_of(const operation_owner& operation);
  [[nodiscard]] static TEE_ObjectInfo info_of(const object_owner& object);

 private:
  scoped_instance world_;
};

// Keys in libcrypto's own form, from which the tests make expectations without the platform.

/// number_of gives a number of the key (OSSL_PKEY_PARAM_*), big-endian, without leading zero bytes.
[[nodiscard]] bytes number_of(const key_owner& key, const char* name);
/// rsa_attributes gives n, e and d, and with `crt` the other five components.
[[nodiscard]] attribute_list rsa_attributes(const key_owner& key, bool crt = true);
[[nodiscard]] key_owner new_rsa_key(unsigned bits);
[[nodiscard]] bytes digest_of(const char* name, const bytes& message);

}  // namespace hosted_tee::testing

#endif  // TESTS_TEE_CRYPTO_FIXTURE_H_
