// How the generic layers see an algorithm: one descriptor, and through it one record per purpose. Any entry may be
// null; whoever calls one looks first.
#ifndef KEYMASTER_PARAMS_ALGORITHM_H_
#define KEYMASTER_PARAMS_ALGORITHM_H_

#include <cstdint>
#include <cstring>
#include <span>

#include "params/key_param.h"
#include "params/operation.h"
#include "platform/bytes.h"
#include "tee_internal_api.h"

namespace keymaster {

/// Answers of get_padding, get_block_mode and get_digest.
inline constexpr int parameter_found = 0;
inline constexpr int parameter_not_applicable = 1;

/// An operation_constructor builds an algorithm's record, or answers null and says why: a platform failure in
/// `*result`, a Keymaster error in `*error`, either of which may stay zero. A failure leaves nothing behind, and no
/// parameter in `request.out_params`.
using operation_constructor = keymaster_operation_t* (*)(const operation_request& request, TEE_Result* result,
                                                         keymaster_error_t* error);

/// A parameter_reader answers what `params` ask for: parameter_found and the value, or parameter_not_applicable and the
/// value untouched.
using parameter_reader = int (*)(const keymaster_key_param_set_t& params, uint32_t* value);

/// A list_writer writes the words of a list to memory of the client, which may lie at any address.
using list_writer = void (*)(uint8_t* list);

/// What an algorithm offers for one purpose.
struct keymaster_purpose_ops {
  uint32_t (*get_support_block_mode_cnt)();
  list_writer get_support_block_mode;
  uint32_t (*get_support_padding_mode_cnt)();
  list_writer get_support_padding_mode;
  uint32_t (*get_support_digest_cnt)();
  list_writer get_support_digest;

  operation_constructor create_operation;

  parameter_reader get_padding;
  parameter_reader get_block_mode;
  parameter_reader get_digest;
};

struct keymaster_algorithm_descriptor {
  uint32_t algorithm;
  const char* name;
  const keymaster_purpose_ops* (*get_purpose_ops)(uint32_t purpose);
  uint32_t (*get_support_import_format_cnt)();
  list_writer get_support_import_format;
  uint32_t (*get_support_export_format_cnt)();
  list_writer get_support_export_format;

  /// generate_key makes a key as `params` ask and adds to them what becomes known; key data and parameters go into the
  /// blob. On failure `key_data` is empty.
  TEE_Result (*generate_key)(keymaster_key_param_set_t* params, secret_bytes& key_data, keymaster_error_t* error);

  /// import_key takes key material in the algorithm's own layout. `material` is TA memory.
  TEE_Result (*import_key)(keymaster_key_param_set_t* params, std::span<const uint8_t> material, secret_bytes& key_data,
                           keymaster_error_t* error);

  /// export_key writes the public key to `output`; `*output_length` is the capacity on entry, the size on return.
  TEE_Result (*export_key)(std::span<const uint8_t> key_data, uint8_t* output, uint32_t* output_length,
                           keymaster_error_t* error);
};

/// An algorithm's lists are constant arrays; constant_list makes the pair of entries that a descriptor holds for one.
template <const auto& List>
struct constant_list {
  static uint32_t count() { return static_cast<uint32_t>(List.size()); }
  static void copy(uint8_t* list) {
    if constexpr (List.size() != 0) std::memcpy(list, List.data(), sizeof List);
  }
};

/// make_purpose_ops puts a purpose's record together from its lists, its constructor and its readers.
template <const auto& BlockModes, const auto& Paddings, const auto& Digests>
constexpr keymaster_purpose_ops make_purpose_ops(operation_constructor create, parameter_reader padding,
                                                 parameter_reader block_mode, parameter_reader digest) {
  return {
      .get_support_block_mode_cnt = constant_list<BlockModes>::count,
      .get_support_block_mode = constant_list<BlockModes>::copy,
      .get_support_padding_mode_cnt = constant_list<Paddings>::count,
      .get_support_padding_mode = constant_list<Paddings>::copy,
      .get_support_digest_cnt = constant_list<Digests>::count,
      .get_support_digest = constant_list<Digests>::copy,
      .create_operation = create,
      .get_padding = padding,
      .get_block_mode = block_mode,
      .get_digest = digest,
  };
}

/// never_applicable is the answer of an algorithm without paddings or without block modes.
inline int never_applicable(const keymaster_key_param_set_t& /*params*/, uint32_t* /*value*/) {
  return parameter_not_applicable;
}

/// unique_digest answers the one digest that `params` name.
inline int unique_digest(const keymaster_key_param_set_t& params, uint32_t* digest) {
  const keymaster_key_param_t* const param = key_param_set_get_unique(params, KM_TAG_DIGEST);
  if (param == nullptr) return parameter_not_applicable;
  *digest = param->enumerated;
  return parameter_found;
}

}  // namespace keymaster

#endif  // KEYMASTER_PARAMS_ALGORITHM_H_
