#include "tests/tee/crypto_fixture.h"

#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/rsa.h>

#include <algorithm>

namespace hosted_tee::testing {

bytes from_hex(std::string_view hex) {
  bytes result;
  for (std::size_t i = 0; i + 1 < hex.size(); i += 2) {
    result.push_back(static_cast<std::uint8_t>(std::stoul(std::string(hex.substr(i, 2)), nullptr, 16)));
  }
  return result;
}

bytes from_text(std::string_view text) {
  return {text.begin(), text.end()};
}

bytes repeated(std::uint8_t value, std::size_t count) {
  bytes result;
  result.assign(count, value);
  return result;
}

bytes joined(const bytes& a, const bytes& b) {
  bytes result = a;
  result.insert(result.end(), b.begin(), b.end());
  return result;
}

answer taking(std::size_t capacity, const std::function<TEE_Result(void*, std::uint32_t*)>& call) {
  constexpr std::uint8_t untouched = 0xA5;
  constexpr std::size_t margin = 64;
  bytes buffer = repeated(untouched, capacity + margin);
  answer got;
  got.length = static_cast<std::uint32_t>(capacity);
  got.result = call(buffer.data(), &got.length);
  const std::size_t written = got.result == TEE_SUCCESS ? got.length : capacity;
  EXPECT_TRUE(std::all_of(buffer.begin() + static_cast<std::ptrdiff_t>(written), buffer.end(), [](std::uint8_t b) {
    return b == untouched;
  })) << "written behind the reported length";
  if (got.result == TEE_SUCCESS) got.data.assign(buffer.begin(), buffer.begin() + static_cast<std::ptrdiff_t>(written));
  return got;
}

bool panics(const std::function<void()>& code) {
  return run_guarded(code).has_value();
}

attribute_list& attribute_list::add(std::uint32_t id, const bytes& value) {
  bytes& own = *values_.emplace_back(std::make_shared<bytes>(value));
  TEE_InitRefAttribute(&list_.emplace_back(), id, own.data(), size_of(own));
  return *this;
}

attribute_list& attribute_list::add_value(std::uint32_t id, std::uint32_t a, std::uint32_t b) {
  TEE_InitValueAttribute(&list_.emplace_back(), id, a, b);
  return *this;
}

object_owner crypto_fixture::allocate(std::uint32_t type, std::uint32_t bits) {
  TEE_ObjectHandle handle = TEE_HANDLE_NULL;
  EXPECT_EQ(TEE_AllocateTransientObject(type, bits, &handle), TEE_SUCCESS);
  return object_owner(handle);
}

TEE_Result crypto_fixture::populate_into(const object_owner& object, const attribute_list& attributes) {
  return TEE_PopulateTransientObject(object.get(), attributes.data(), attributes.count());
}

object_owner crypto_fixture::secret_key(std::uint32_t type, const bytes& value) {
  object_owner object = allocate(type, size_of(value) * 8);
  EXPECT_EQ(populate_into(object, attribute_list().add(TEE_ATTR_SECRET_VALUE, value)), TEE_SUCCESS);
  return object;
}

bytes crypto_fixture::buffer_attribute(const object_owner& object, std::uint32_t id) {
  const answer got = taking(2048, [&](void* buffer, std::uint32_t* size) {
    return TEE_GetObjectBufferAttribute(object.get(), id, buffer, size);
  });
  EXPECT_EQ(got.result, TEE_SUCCESS);
  return got.data;
}

operation_owner crypto_fixture::keyless(std::uint32_t algorithm, std::uint32_t mode, std::uint32_t bits) {
  TEE_OperationHandle handle = TEE_HANDLE_NULL;
  EXPECT_EQ(TEE_AllocateOperation(&handle, algorithm, mode, bits), TEE_SUCCESS);
  return operation_owner(handle);
}

operation_owner crypto_fixture::operation_for(std::uint32_t algorithm, std::uint32_t mode, const object_owner& key) {
  operation_owner operation = keyless(algorithm, mode, info_of(key).maxKeySize);
  EXPECT_EQ(TEE_SetOperationKey(operation.get(), key.get()), TEE_SUCCESS);
  return operation;
}

TEE_OperationInfo crypto_fixture::info_of(const operation_owner& operation) {
  TEE_OperationInfo info{};
  TEE_GetOperationInfo(operation.get(), &info);
  return info;
}

TEE_ObjectInfo crypto_fixture::info_of(const object_owner& object) {
  TEE_ObjectInfo info{};
  EXPECT_EQ(TEE_GetObjectInfo1(object.get(), &info), TEE_SUCCESS);
  return info;
}

bytes number_of(const key_owner& key, const char* name) {
  BIGNUM* number = nullptr;
  EXPECT_EQ(EVP_PKEY_get_bn_param(key.get(), name, &number), 1) << name;
  bytes result(static_cast<std::size_t>(BN_num_bytes(number)));
  BN_bn2bin(number, result.data());
  BN_clear_free(number);
  return result;
}

attribute_list rsa_attributes(const key_owner& key, bool crt) {
  attribute_list list;
  list.add(TEE_ATTR_RSA_MODULUS, number_of(key, OSSL_PKEY_PARAM_RSA_N))
      .add(TEE_ATTR_RSA_PUBLIC_EXPONENT, number_of(key, OSSL_PKEY_PARAM_RSA_E))
      .add(TEE_ATTR_RSA_PRIVATE_EXPONENT, number_of(key, OSSL_PKEY_PARAM_RSA_D));
  if (crt) {
    list.add(TEE_ATTR_RSA_PRIME1, number_of(key, OSSL_PKEY_PARAM_RSA_FACTOR1))
        .add(TEE_ATTR_RSA_PRIME2, number_of(key, OSSL_PKEY_PARAM_RSA_FACTOR2))
        .add(TEE_ATTR_RSA_EXPONENT1, number_of(key, OSSL_PKEY_PARAM_RSA_EXPONENT1))
        .add(TEE_ATTR_RSA_EXPONENT2, number_of(key, OSSL_PKEY_PARAM_RSA_EXPONENT2))
        .add(TEE_ATTR_RSA_COEFFICIENT, number_of(key, OSSL_PKEY_PARAM_RSA_COEFFICIENT1));
  }
  return list;
}

key_owner new_rsa_key(unsigned bits) {
  return key_owner(EVP_RSA_gen(bits));
}

bytes digest_of(const char* name, const bytes& message) {
  bytes digest(EVP_MAX_MD_SIZE);
  std::size_t size = 0;
  EXPECT_EQ(EVP_Q_digest(nullptr, name, nullptr, message.data(), message.size(), digest.data(), &size), 1);
  digest.resize(size);
  return digest;
}

}  // namespace hosted_tee::testing
