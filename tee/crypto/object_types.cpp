#include "tee/crypto/object_types.h"

#include <algorithm>
#include <array>

namespace hosted_tee {

namespace {

template <std::uint32_t Least, std::uint32_t Most, std::uint32_t Step>
bool between(std::uint32_t bits) {
  return bits >= Least && bits <= Most && bits % Step == 0;
}

constexpr std::array secret_value = {TEE_ATTR_SECRET_VALUE};
constexpr std::array rsa_public = {TEE_ATTR_RSA_MODULUS, TEE_ATTR_RSA_PUBLIC_EXPONENT};
constexpr std::array rsa_pair = {TEE_ATTR_RSA_MODULUS, TEE_ATTR_RSA_PUBLIC_EXPONENT, TEE_ATTR_RSA_PRIVATE_EXPONENT};
constexpr std::array rsa_crt = {TEE_ATTR_RSA_PRIME1, TEE_ATTR_RSA_PRIME2, TEE_ATTR_RSA_EXPONENT1,
                                TEE_ATTR_RSA_EXPONENT2, TEE_ATTR_RSA_COEFFICIENT};
constexpr std::array rsa_parameter = {TEE_ATTR_RSA_PUBLIC_EXPONENT};
constexpr std::array ec_public = {TEE_ATTR_ECC_CURVE, TEE_ATTR_ECC_PUBLIC_VALUE_X, TEE_ATTR_ECC_PUBLIC_VALUE_Y};
constexpr std::array ec_pair = {TEE_ATTR_ECC_CURVE, TEE_ATTR_ECC_PUBLIC_VALUE_X, TEE_ATTR_ECC_PUBLIC_VALUE_Y,
                                TEE_ATTR_ECC_PRIVATE_VALUE};
constexpr std::array ec_parameter = {TEE_ATTR_ECC_CURVE};

constexpr object_type secret(std::uint32_t id, bool (*has_size)(std::uint32_t)) {
  return {id, has_size, secret_value, {}, {}, false, secret_from_attributes, generate_secret};
}

// A generic secret serves as an AES-256 key, as which a derived key arrives, and has no other size.
constexpr std::array object_types = {
    secret(TEE_TYPE_GENERIC_SECRET, between<256, 256, 8>),
    secret(TEE_TYPE_HMAC_MD5, between<64, 512, 8>),
    secret(TEE_TYPE_HMAC_SHA1, between<80, 512, 8>),
    secret(TEE_TYPE_HMAC_SHA224, between<112, 512, 8>),
    secret(TEE_TYPE_HMAC_SHA256, between<192, 1024, 8>),
    secret(TEE_TYPE_HMAC_SHA384, between<256, 1024, 8>),
    secret(TEE_TYPE_HMAC_SHA512, between<256, 1024, 8>),
    secret(TEE_TYPE_AES, between<128, 256, 64>),
    object_type{
        TEE_TYPE_RSA_PUBLIC_KEY, between<512, 8192, 8>, rsa_public, {}, {}, false, rsa_from_attributes, nullptr},
    object_type{TEE_TYPE_RSA_KEYPAIR, between<512, 8192, 8>, rsa_pair, rsa_crt, rsa_parameter, false,
                rsa_from_attributes, generate_rsa},
    object_type{TEE_TYPE_ECDSA_PUBLIC_KEY, is_curve_size, ec_public, {}, {}, false, ec_from_attributes, nullptr},
    object_type{
        TEE_TYPE_ECDSA_KEYPAIR, is_curve_size, ec_pair, {}, ec_parameter, true, ec_from_attributes, generate_ec},
};

}  // namespace

const object_type* find_object_type(std::uint32_t id) {
  const auto found =
      std::find_if(object_types.begin(), object_types.end(), [&](const object_type& each) { return each.id == id; });
  return found == object_types.end() ? nullptr : &*found;
}

}  // namespace hosted_tee
