#include "algorithms/hmac/hmac_descriptor.h"

#include <array>

#include "algorithms/hmac/hmac_key.h"
#include "algorithms/hmac/hmac_operation.h"

namespace keymaster {
namespace {

constexpr std::array<uint32_t, 0> block_modes = {};
constexpr std::array<uint32_t, 0> paddings = {};
constexpr std::array<uint32_t, 6> digests = {KM_DIGEST_MD5,       KM_DIGEST_SHA1,      KM_DIGEST_SHA_2_224,
                                             KM_DIGEST_SHA_2_256, KM_DIGEST_SHA_2_384, KM_DIGEST_SHA_2_512};
constexpr std::array<uint32_t, 1> import_formats = {KM_KEY_FORMAT_RAW};
constexpr std::array<uint32_t, 0> export_formats = {};

constexpr keymaster_purpose_ops mac_ops(operation_constructor create) {
  return make_purpose_ops<block_modes, paddings, digests>(create, never_applicable, never_applicable, unique_digest);
}

constexpr keymaster_purpose_ops sign_ops = mac_ops(create_hmac_sign);
constexpr keymaster_purpose_ops verify_ops = mac_ops(create_hmac_verify);

const keymaster_purpose_ops* hmac_get_purpose_ops(uint32_t purpose) {
  if (purpose == KM_PURPOSE_SIGN) return &sign_ops;
  if (purpose == KM_PURPOSE_VERIFY) return &verify_ops;
  return nullptr;
}

}  // namespace

constinit const keymaster_algorithm_descriptor hmac_descriptor = {
    .algorithm = KM_ALGORITHM_HMAC,
    .name = "HMAC",
    .get_purpose_ops = hmac_get_purpose_ops,
    .get_support_import_format_cnt = constant_list<import_formats>::count,
    .get_support_import_format = constant_list<import_formats>::copy,
    .get_support_export_format_cnt = constant_list<export_formats>::count,
    .get_support_export_format = constant_list<export_formats>::copy,
    .generate_key = hmac_generate_key,
    .import_key = hmac_import_key,
    .export_key = hmac_export_key,
};

}  // namespace keymaster
