// RSA keys: from components, and generated.
#include <openssl/core_names.h>
#include <openssl/rsa.h>

#include <array>

#include "tee/crypto/key_material.h"
#include "tee/crypto/key_params.h"
#include "tee/crypto/magnitude.h"
#include "tee/crypto/object_types.h"

namespace hosted_tee {

namespace {

struct component {
  std::uint32_t attribute;
  const char* name;
};
constexpr std::array<component, 8> components = {{
    {TEE_ATTR_RSA_MODULUS, OSSL_PKEY_PARAM_RSA_N},
    {TEE_ATTR_RSA_PUBLIC_EXPONENT, OSSL_PKEY_PARAM_RSA_E},
    {TEE_ATTR_RSA_PRIVATE_EXPONENT, OSSL_PKEY_PARAM_RSA_D},
    {TEE_ATTR_RSA_PRIME1, OSSL_PKEY_PARAM_RSA_FACTOR1},
    {TEE_ATTR_RSA_PRIME2, OSSL_PKEY_PARAM_RSA_FACTOR2},
    {TEE_ATTR_RSA_EXPONENT1, OSSL_PKEY_PARAM_RSA_EXPONENT1},
    {TEE_ATTR_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_EXPONENT2},
    {TEE_ATTR_RSA_COEFFICIENT, OSSL_PKEY_PARAM_RSA_COEFFICIENT1},
}};

bool is_odd_and_at_least_3(bytes_view number) {
  return is_odd(number) && (number.size() > 1 || number.front() >= 3);
}

}  // namespace

key_material rsa_from_attributes(const object_type& /*type*/, std::uint32_t max_bits, const attribute_view& given) {
  key_material material;
  key_params params;
  for (const component& each : components) {
    if (!given.has(each.attribute)) continue;
    const bytes_view number = significant(given.bytes(each.attribute));
    // The bound holds for every component, since libcrypto would raise to an exponent of any length it is given.
    refuse_unless(!number.empty() && bit_length(number) <= max_bits, TEE_ERROR_BAD_PARAMETERS);
    material.attributes.push_back(stored(each.attribute, number));
    params.add_number(each.name, material.attributes.back().bytes);
  }
  const bytes_view modulus = material.find(TEE_ATTR_RSA_MODULUS)->bytes;
  refuse_unless(is_odd_and_at_least_3(modulus), TEE_ERROR_BAD_PARAMETERS);
  refuse_unless(is_odd_and_at_least_3(material.find(TEE_ATTR_RSA_PUBLIC_EXPONENT)->bytes), TEE_ERROR_BAD_PARAMETERS);
  material.bits = static_cast<std::uint32_t>(bit_length(modulus));
  const bool is_pair = given.has(TEE_ATTR_RSA_PRIVATE_EXPONENT);
  material.key = params.build("RSA", is_pair ? EVP_PKEY_KEYPAIR : EVP_PKEY_PUBLIC_KEY);
  return material;
}

key_material generate_rsa(std::uint32_t bits, const attribute_view& parameters) {
  constexpr std::array<std::uint8_t, 3> usual_exponent = {0x01, 0x00, 0x01};
  const bool chosen = parameters.has(TEE_ATTR_RSA_PUBLIC_EXPONENT);
  const bytes_view exponent =
      chosen ? significant(parameters.bytes(TEE_ATTR_RSA_PUBLIC_EXPONENT)) : bytes_view(usual_exponent);
  // libcrypto takes an exponent of 0 for "the usual one" and would generate a key with another than was asked for.
  refuse_unless(is_odd_and_at_least_3(exponent) && bit_length(exponent) < bits, TEE_ERROR_BAD_PARAMETERS);
  const auto number = owned<bignum>(BN_bin2bn(exponent.data(), static_cast<int>(exponent.size()), nullptr));

  const auto context = owned<evp_key_context>(EVP_PKEY_CTX_new_from_name(nullptr, "RSA", nullptr));
  EVP_PKEY* made = nullptr;
  const bool generated = EVP_PKEY_keygen_init(context.get()) == 1 &&
                         EVP_PKEY_CTX_set_rsa_keygen_bits(context.get(), static_cast<int>(bits)) == 1 &&
                         EVP_PKEY_CTX_set1_rsa_keygen_pubexp(context.get(), number.get()) == 1 &&
                         EVP_PKEY_generate(context.get(), &made) == 1;
  key_material material;
  material.key.reset(made);
  refuse_unless(generated, TEE_ERROR_GENERIC);
  for (const component& each : components) {
    material.attributes.push_back({.id = each.attribute, .bytes = number_of(material.key, each.name)});
  }
  material.bits = static_cast<std::uint32_t>(bit_length(material.attributes.front().bytes));
  refuse_unless(material.bits == bits, TEE_ERROR_GENERIC);
  return material;
}

}  // namespace hosted_tee
