#include "algorithms/rsa/rsa_descriptor.h"

#include <array>
#include <cstring>

#include "algorithms/rsa/rsa_cipher.h"
#include "algorithms/rsa/rsa_key.h"
#include "algorithms/rsa/rsa_sign.h"
#include "algorithms/rsa/rsa_verify.h"

namespace keymaster {
namespace {

constexpr std::array<uint32_t, 0> block_modes = {};
constexpr std::array<uint32_t, 3> cipher_paddings = {KM_PAD_NONE, KM_PAD_RSA_OAEP, KM_PAD_RSA_PKCS1_1_5_ENCRYPT};
constexpr std::array<uint32_t, 6> cipher_digests = {KM_DIGEST_NONE,      KM_DIGEST_SHA1,      KM_DIGEST_SHA_2_224,
                                                    KM_DIGEST_SHA_2_256, KM_DIGEST_SHA_2_384, KM_DIGEST_SHA_2_512};
constexpr std::array<uint32_t, 3> signature_paddings = {KM_PAD_NONE, KM_PAD_RSA_PSS, KM_PAD_RSA_PKCS1_1_5_SIGN};
constexpr std::array<uint32_t, 7> signature_digests = {KM_DIGEST_NONE,      KM_DIGEST_MD5,       KM_DIGEST_SHA1,
                                                       KM_DIGEST_SHA_2_224, KM_DIGEST_SHA_2_256, KM_DIGEST_SHA_2_384,
                                                       KM_DIGEST_SHA_2_512};
constexpr std::array<uint32_t, 1> import_formats = {KM_KEY_FORMAT_PKCS8};
constexpr std::array<uint32_t, 1> export_formats = {KM_KEY_FORMAT_X509};

int rsa_get_padding(const keymaster_key_param_set_t& params, uint32_t* padding) {
  const keymaster_key_param_t* const param = key_param_set_get_unique(params, KM_TAG_PADDING);
  if (param == nullptr) return parameter_not_applicable;
  *padding = param->enumerated;
  return parameter_found;
}

/// The digest counts where it says what is signed. With an encryption padding it is part of the padding, which the
/// key's list of digests does not restrict.
int rsa_get_digest(const keymaster_key_param_set_t& params, uint32_t* digest) {
  uint32_t padding = 0;
  if (rsa_get_padding(params, &padding) != parameter_found) return parameter_not_applicable;
  if (padding != KM_PAD_NONE && padding != KM_PAD_RSA_PSS && padding != KM_PAD_RSA_PKCS1_1_5_SIGN) {
    return parameter_not_applicable;
  }
  return unique_digest(params, digest);
}

template <const auto& Paddings, const auto& Digests>
constexpr keymaster_purpose_ops purpose_ops(operation_constructor create) {
  return make_purpose_ops<block_modes, Paddings, Digests>(create, rsa_get_padding, never_applicable, rsa_get_digest);
}

/// A record's place is the purpose's value.
constexpr std::array<keymaster_purpose_ops, 4> purposes = {
    purpose_ops<cipher_paddings, cipher_digests>(create_rsa_encrypt),
    purpose_ops<cipher_paddings, cipher_digests>(create_rsa_decrypt),
    purpose_ops<signature_paddings, signature_digests>(create_rsa_sign),
    purpose_ops<signature_paddings, signature_digests>(create_rsa_verify),
};
static_assert(KM_PURPOSE_ENCRYPT == 0 && KM_PURPOSE_DECRYPT == 1 && KM_PURPOSE_SIGN == 2 && KM_PURPOSE_VERIFY == 3);

const keymaster_purpose_ops* rsa_get_purpose_ops(uint32_t purpose) {
  return purpose < purposes.size() ? &purposes[purpose] : nullptr;
}

}  // namespace

constinit const keymaster_algorithm_descriptor rsa_descriptor = {
    .algorithm = KM_ALGORITHM_RSA,
    .name = "RSA",
    .get_purpose_ops = rsa_get_purpose_ops,
    .get_support_import_format_cnt = constant_list<import_formats>::count,
    .get_support_import_format = constant_list<import_formats>::copy,
    .get_support_export_format_cnt = constant_list<export_formats>::count,
    .get_support_export_format = constant_list<export_formats>::copy,
    .generate_key = rsa_generate_key,
    .import_key = rsa_import_key,
    .export_key = rsa_export_key,
};

}  // namespace keymaster
