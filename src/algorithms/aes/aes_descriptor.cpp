#include "algorithms/aes/aes_descriptor.h"

#include <array>

#include "algorithms/aes/aes_decrypt.h"
#include "algorithms/aes/aes_encrypt.h"
#include "algorithms/aes/aes_key.h"

namespace keymaster {
namespace {

constexpr std::array<uint32_t, 4> block_modes = {KM_MODE_ECB, KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM};
constexpr std::array<uint32_t, 2> paddings = {KM_PAD_NONE, KM_PAD_PKCS7};
constexpr std::array<uint32_t, 0> digests = {};
constexpr std::array<uint32_t, 1> import_formats = {KM_KEY_FORMAT_RAW};
constexpr std::array<uint32_t, 0> export_formats = {};

int aes_get_block_mode(const keymaster_key_param_set_t& params, uint32_t* block_mode) {
  const keymaster_key_param_t* const param = key_param_set_get_unique(params, KM_TAG_BLOCK_MODE);
  if (param == nullptr) return parameter_not_applicable;
  *block_mode = param->enumerated;
  return parameter_found;
}

/// An absent padding is KM_PAD_NONE and not "not applicable": a key that doesn't list it can't be used without padding.
/// Only where the block mode is none of the known ones does the padding say nothing.
int aes_get_padding(const keymaster_key_param_set_t& params, uint32_t* padding) {
  uint32_t block_mode = 0;
  if (aes_get_block_mode(params, &block_mode) != parameter_found) return parameter_not_applicable;
  const bool known = (block_mode >= KM_MODE_ECB && block_mode <= KM_MODE_CTR) || block_mode == KM_MODE_GCM;
  if (!known) return parameter_not_applicable;
  const keymaster_key_param_t* const param = key_param_set_get_unique(params, KM_TAG_PADDING);
  *padding = param == nullptr ? KM_PAD_NONE : param->enumerated;
  return parameter_found;
}

constexpr keymaster_purpose_ops cipher_ops(operation_constructor create) {
  return make_purpose_ops<block_modes, paddings, digests>(create, aes_get_padding, aes_get_block_mode,
                                                          never_applicable);
}

constexpr keymaster_purpose_ops encrypt_ops = cipher_ops(create_aes_encrypt);
constexpr keymaster_purpose_ops decrypt_ops = cipher_ops(create_aes_decrypt);

const keymaster_purpose_ops* aes_get_purpose_ops(uint32_t purpose) {
  if (purpose == KM_PURPOSE_ENCRYPT) return &encrypt_ops;
  if (purpose == KM_PURPOSE_DECRYPT) return &decrypt_ops;
  return nullptr;
}

}  // namespace

constinit const keymaster_algorithm_descriptor aes_descriptor = {
    .algorithm = KM_ALGORITHM_AES,
    .name = "AES",
    .get_purpose_ops = aes_get_purpose_ops,
    .get_support_import_format_cnt = constant_list<import_formats>::count,
    .get_support_import_format = constant_list<import_formats>::copy,
    .get_support_export_format_cnt = constant_list<export_formats>::count,
    .get_support_export_format = constant_list<export_formats>::copy,
    .generate_key = aes_generate_key,
    .import_key = aes_import_key,
    .export_key = aes_export_key,
};

}  // namespace keymaster
