#include "algorithms/aes/aes_operation.h"

#include <array>

#include "algorithms/aes/aes_key.h"
#include "params/key_tags.h"
#include "params/operation_record.h"
#include "platform/key_objects.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

struct mode_row {
  uint32_t block_mode;
  uint32_t algorithm;
  uint32_t nonce_size;  // 0: the mode takes none
  bool pads;            // takes PKCS#7 as well as no padding
};

constexpr std::array<mode_row, 4> modes = {{
    {KM_MODE_ECB, TEE_ALG_AES_ECB_NOPAD, 0, true},
    {KM_MODE_CBC, TEE_ALG_AES_CBC_NOPAD, 16, true},
    {KM_MODE_CTR, TEE_ALG_AES_CTR, 16, false},
    {KM_MODE_GCM, TEE_ALG_AES_GCM, 12, false},
}};
constexpr uint32_t longest_nonce = 16;
constexpr uint32_t longest_mac = 128;

const mode_row* find_mode(uint32_t block_mode) {
  for (const mode_row& row : modes) {
    if (row.block_mode == block_mode) return &row;
  }
  return nullptr;
}

keymaster_error_t read_mode(aes_operation_t& op, const keymaster_key_param_set_t& in_params) {
  const keymaster_key_param_t* const mode = key_param_set_get_unique(in_params, KM_TAG_BLOCK_MODE);
  if (mode == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_BLOCK_MODE");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  const keymaster_key_param_t* const padding = key_param_set_get_unique(in_params, KM_TAG_PADDING);
  op.block_mode = mode->enumerated;
  op.padding = padding == nullptr ? KM_PAD_NONE : padding->enumerated;
  return KM_ERROR_OK;
}

/// How long the tag is. The key's own minimum was settled before; there is none here.
keymaster_error_t read_mac_length(aes_operation_t& op, const keymaster_key_param_set_t& in_params) {
  const keymaster_key_param_t* const mac_length = key_param_set_get_unique(in_params, KM_TAG_MAC_LENGTH);
  if (mac_length == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_MAC_LENGTH");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  op.mac_length = mac_length->integer;
  if (op.mac_length <= longest_mac && op.mac_length % 8 == 0) return KM_ERROR_OK;
  TRACE_ERROR("Unsupported mac length %d", op.mac_length);
  return KM_ERROR_UNSUPPORTED_MAC_LENGTH;
}

keymaster_error_t check_padding(const aes_operation_t& op, const mode_row** row) {
  *row = find_mode(op.block_mode);
  if (*row == nullptr) return KM_ERROR_UNSUPPORTED_BLOCK_MODE;
  const bool accepted = op.padding == KM_PAD_NONE || (op.padding == KM_PAD_PKCS7 && (*row)->pads);
  return accepted ? KM_ERROR_OK : KM_ERROR_INCOMPATIBLE_PADDING_MODE;
}

/// The client's nonce, or a drawn one. Empty, with KM_ERROR_OK, for ECB without one.
keymaster_error_t choose_nonce(const mode_row& row, const keymaster_key_param_set_t& in_params,
                               std::span<uint8_t, longest_nonce> place, std::span<const uint8_t>& nonce) {
  const keymaster_key_param_t* const given = key_param_set_get_unique(in_params, KM_TAG_NONCE);
  if (row.nonce_size == 0) return given == nullptr ? KM_ERROR_OK : KM_ERROR_INVALID_TAG;
  if (given == nullptr) {
    TEE_GenerateRandom(place.data(), row.nonce_size);
    nonce = place.first(row.nonce_size);
    return KM_ERROR_OK;
  }
  nonce = blob_bytes(*given);
  return nonce.size() == row.nonce_size ? KM_ERROR_OK : KM_ERROR_INVALID_ARGUMENT;
}

TEE_Result init_cipher(aes_operation_t& op, std::span<const uint8_t> nonce) {
  const uint32_t size = static_cast<uint32_t>(nonce.size());
  if (!op.is_gcm()) {
    TEE_CipherInit(op.operation.get(), size == 0 ? nullptr : nonce.data(), size);
    return TEE_SUCCESS;
  }
  const TEE_Result result = TEE_AEInit(op.operation.get(), nonce.data(), size, op.mac_length, 0, 0);
  if (result != TEE_SUCCESS) TRACE_ERROR("AEInit failed with 0x%08x\n", result);
  return result;
}

/// Tells the client the nonce, without which it could not decrypt.
keymaster_error_t report_nonce(std::span<const uint8_t> nonce, parameter_set& out_params) {
  heap_bytes copy;
  if (!copy.copy_of(nonce)) {
    TRACE_ERROR("Out of memory");
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  keymaster_key_param_t param = {};
  param.tag = KM_TAG_NONCE;
  param.blob.data_length = copy.size();
  param.blob.data = copy.release();
  return add_param(&out_params, param);
}

}  // namespace

TEE_Result prepare_aes_operation(aes_operation_t& op, const operation_request& request, uint32_t mode,
                                 keymaster_error_t (*allocate_tag)(aes_operation_t& op), keymaster_error_t* error) {
  const TEE_Result resolved = resolve_into(op.key, error, [&](TEE_ObjectHandle* key) {
    return aes_resolve_key_data(request.key_data, key, &op.key_size, error);
  });
  if (resolved != TEE_SUCCESS || *error != KM_ERROR_OK) return resolved;
  const mode_row* row = nullptr;
  *error = read_mode(op, request.in_params);
  if (*error == KM_ERROR_OK && op.is_gcm()) *error = read_mac_length(op, request.in_params);
  if (*error == KM_ERROR_OK && op.is_gcm()) *error = allocate_tag(op);
  if (*error == KM_ERROR_OK) *error = check_padding(op, &row);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  return make_operation(row->algorithm, mode, op.key_size, op.key, op.operation);
}

TEE_Result start_aes_operation(aes_operation_t& op, const operation_request& request, keymaster_error_t* error) {
  uint8_t drawn[longest_nonce] = {};
  std::span<const uint8_t> nonce;
  *error = choose_nonce(*find_mode(op.block_mode), request.in_params, drawn, nonce);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  if (TEE_Result r = init_cipher(op, nonce); r != TEE_SUCCESS) return r;
  if (!nonce.empty()) *error = report_nonce(nonce, request.out_params);
  return TEE_SUCCESS;
}

keymaster_error_t feed_associated_data(aes_operation_t& op, const keymaster_key_param_set_t& in_params) {
  const keymaster_key_param_t* const aad = key_param_set_get_unique(in_params, KM_TAG_ASSOCIATED_DATA);
  if (aad == nullptr) return KM_ERROR_OK;
  if (!op.is_gcm() || op.started) return KM_ERROR_INVALID_TAG;
  TEE_AEUpdateAAD(op.operation.get(), aad->blob.data, aad->blob.data_length);
  return KM_ERROR_OK;
}

TEE_Result feed_cipher(aes_operation_t& op, std::span<const uint8_t> input, std::span<uint8_t> output,
                       uint32_t* written) {
  *written = static_cast<uint32_t>(output.size());
  const uint32_t size = static_cast<uint32_t>(input.size());
  if (op.is_gcm()) {
    const TEE_Result result = TEE_AEUpdate(op.operation.get(), input.data(), size, output.data(), written);
    if (result != TEE_SUCCESS) TRACE_ERROR("AEUpdate failed with 0x%08x\n", result);
    return result;
  }
  const TEE_Result result = TEE_CipherUpdate(op.operation.get(), input.data(), size, output.data(), written);
  if (result != TEE_SUCCESS) TRACE_ERROR("CipherUpdate failed with 0x%08x\n", result);
  return result;
}

TEE_Result end_cipher(aes_operation_t& op, keymaster_error_t* error) {
  uint8_t nothing = 0;
  uint32_t length = 0;
  if (TEE_Result r = TEE_CipherDoFinal(op.operation.get(), nullptr, 0, &nothing, &length); r != TEE_SUCCESS) {
    TRACE_ERROR("CipherDoFinal failed with 0x%08x\n", r);
    return r;
  }
  if (length != 0) {
    TRACE_ERROR("CipherDoFinal make output %dB, expected %dB", length, 0);
    *error = KM_ERROR_UNKNOWN_ERROR;
  }
  return TEE_SUCCESS;
}

void trace_aes_free(const aes_operation_t* op) {
  if (op == nullptr) {
    TRACE_ERROR("Try to free NULL aes_encrypt_operation_t");
    return;
  }
  for (uint32_t n = missing_handles(*op); n > 0; --n) TRACE_ERROR("Try to free invalid aes_encrypt_operation_t");
}

}  // namespace keymaster
