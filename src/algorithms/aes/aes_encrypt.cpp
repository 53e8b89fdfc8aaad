#include "algorithms/aes/aes_encrypt.h"

#include <cstring>

#include "params/operation_record.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

aes_encrypt_operation_t& record(keymaster_operation_t* op) {
  return *static_cast<aes_encrypt_operation_t*>(op);
}

/// Encryption makes its tag at the end, straight into the output.
keymaster_error_t no_tag_buffer(aes_operation_t&) {
  return KM_ERROR_OK;
}

/// Feeds the PKCS#7 padding (RFC 5652, section 6.3): 1 to 16 bytes of their own number.
TEE_Result encrypt_padding(aes_encrypt_operation_t& op, secret_bytes& output, keymaster_error_t* error) {
  const uint32_t count = aes_block_size - static_cast<uint32_t>(op.processed % aes_block_size);
  uint8_t pad[aes_block_size];
  std::memset(pad, static_cast<int>(count), sizeof pad);
  uint32_t written = 0;
  if (TEE_Result r = feed_cipher(op, {pad, count}, output.span(), &written); r != TEE_SUCCESS) return r;
  if (written != aes_block_size) {
    TRACE_ERROR("Padding input got wrong output length %dB, expected %dB", written, aes_block_size);
    *error = KM_ERROR_UNKNOWN_ERROR;
  }
  op.processed += count;
  return TEE_SUCCESS;
}

TEE_Result make_tag(aes_encrypt_operation_t& op, std::span<uint8_t> tag, keymaster_error_t* error) {
  uint8_t nothing = 0;
  uint32_t length = 0;
  uint32_t tag_length = op.tag_size();
  if (TEE_Result r = TEE_AEEncryptFinal(op.operation.get(), nullptr, 0, &nothing, &length, tag.data(), &tag_length);
      r != TEE_SUCCESS) {
    TRACE_ERROR("AEEncryptFinal failed with 0x%08x\n", r);
    return r;
  }
  if (length != 0) {
    TRACE_ERROR("AEEncryptFinal make output %dB, expected %dB", length, 0);
    *error = KM_ERROR_UNKNOWN_ERROR;
  } else if (tag_length != op.tag_size()) {
    // Bytes against bits: log readers know the line in this form.
    TRACE_ERROR("AEEncryptFinal make wrong tag size %dB, expected %dB", tag_length, op.mac_length);
    *error = KM_ERROR_UNKNOWN_ERROR;
  }
  return TEE_SUCCESS;
}

TEE_Result finish_stream(aes_encrypt_operation_t& op, secret_bytes& output, keymaster_error_t* error) {
  const bool whole_blocks_only = op.block_mode != KM_MODE_CTR && !op.is_gcm();
  if (op.processed % aes_block_size != 0 && !op.has_padding() && whole_blocks_only) {
    *error = KM_ERROR_INVALID_INPUT_LENGTH;
    return TEE_SUCCESS;
  }
  const uint32_t padded_size = op.has_padding() ? aes_block_size : 0;
  if (!output.allocate(padded_size + (op.is_gcm() ? op.tag_size() : 0))) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  if (op.has_padding()) {
    if (TEE_Result r = encrypt_padding(op, output, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) return r;
  }
  return op.is_gcm() ? make_tag(op, output.span().subspan(padded_size), error) : end_cipher(op, error);
}

}  // namespace

keymaster_operation_t* create_aes_encrypt(const operation_request& request, TEE_Result* result,
                                          keymaster_error_t* error) {
  return make_record<aes_encrypt_operation_t>(
      {KM_PURPOSE_ENCRYPT, aes_encrypt_free, aes_encrypt_update, aes_encrypt_finish}, result, error,
      [&](aes_encrypt_operation_t& op) {
        const TEE_Result prepared = prepare_aes_operation(op, request, TEE_MODE_ENCRYPT, no_tag_buffer, error);
        if (prepared != TEE_SUCCESS || *error != KM_ERROR_OK) return prepared;
        return start_aes_operation(op, request, error);
      });
}

TEE_Result aes_encrypt_update(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                              std::span<const uint8_t> input, uint32_t* /*input_consumed*/, uint8_t* output,
                              uint32_t* output_length, keymaster_error_t* error) {
  aes_encrypt_operation_t& encrypt = record(op);
  const std::span<uint8_t> place{output, *output_length};
  *output_length = 0;
  *error = feed_associated_data(encrypt, in_params);
  if (*error != KM_ERROR_OK || input.empty()) return TEE_SUCCESS;
  encrypt.started = true;
  if (TEE_Result r = feed_cipher(encrypt, input, place, output_length); r != TEE_SUCCESS) return r;
  encrypt.processed += input.size();
  return TEE_SUCCESS;
}

TEE_Result aes_encrypt_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                              std::span<const uint8_t> /*input*/, secret_bytes& output, parameter_set& /*out_params*/,
                              keymaster_error_t* error) {
  *error = KM_ERROR_OK;
  const TEE_Result result = finish_stream(record(op), output, error);
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) output.reset();
  return result;
}

void aes_encrypt_free(keymaster_operation_t* op) {
  auto* const encrypt = static_cast<aes_encrypt_operation_t*>(op);
  trace_aes_free(encrypt);
  delete_record(encrypt);
}

}  // namespace keymaster
