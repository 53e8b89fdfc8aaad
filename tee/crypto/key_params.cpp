#include "tee/crypto/key_params.h"

#include <openssl/params.h>

#include <bit>

#include "tee/crypto/call.h"

namespace hosted_tee {

void key_params::add_number(const char* name, std::span<const std::uint8_t> big_endian) {
  // libcrypto takes numbers in the processor's byte order.
  secret_bytes& value = std::endian::native == std::endian::little
                            ? values_.emplace_back(big_endian.rbegin(), big_endian.rend())
                            : values_.emplace_back(big_endian.begin(), big_endian.end());
  list_.push_back(OSSL_PARAM_construct_BN(name, value.data(), value.size()));
}

void key_params::add_octets(const char* name, std::span<const std::uint8_t> octets) {
  secret_bytes& value = values_.emplace_back(octets.begin(), octets.end());
  list_.push_back(OSSL_PARAM_construct_octet_string(name, value.data(), value.size()));
}

void key_params::add_name(const char* name, std::string_view value) {
  secret_bytes& text = values_.emplace_back(value.begin(), value.end());
  text.push_back(0);
  list_.push_back(OSSL_PARAM_construct_utf8_string(name, reinterpret_cast<char*>(text.data()), value.size()));
}

evp_key key_params::build(const char* type, int selection) {
  list_.push_back(OSSL_PARAM_construct_end());
  const auto context = owned<evp_key_context>(EVP_PKEY_CTX_new_from_name(nullptr, type, nullptr));
  EVP_PKEY* made = nullptr;
  const bool accepted = EVP_PKEY_fromdata_init(context.get()) == 1 &&
                        EVP_PKEY_fromdata(context.get(), &made, selection, list_.data()) == 1;
  evp_key key(made);
  refuse_unless(accepted && key != nullptr, TEE_ERROR_BAD_PARAMETERS);
  return key;
}

secret_bytes number_of(const evp_key& key, const char* name) {
  BIGNUM* read = nullptr;
  const bool there = EVP_PKEY_get_bn_param(key.get(), name, &read) == 1;
  const bignum number(read);
  refuse_unless(there, TEE_ERROR_GENERIC);
  secret_bytes bytes(static_cast<std::size_t>(BN_num_bytes(number.get())));
  BN_bn2bin(number.get(), bytes.data());
  return bytes;
}

}  // namespace hosted_tee
