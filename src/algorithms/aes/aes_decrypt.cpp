#include "algorithms/aes/aes_decrypt.h"

#include <cstring>

#include "params/operation_record.h"
#include "platform/cursor.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

aes_decrypt_operation_t& record(keymaster_operation_t* op) {
  return *static_cast<aes_decrypt_operation_t*>(op);
}

keymaster_error_t allocate_tag_buffer(aes_operation_t& op) {
  if (static_cast<aes_decrypt_operation_t&>(op).tag_buffer.allocate(op.tag_size())) return KM_ERROR_OK;
  TRACE_ERROR("Out of memory");
  return KM_ERROR_MEMORY_ALLOCATION_FAILED;
}

keymaster_error_t allocate_last_block(aes_decrypt_operation_t& op) {
  if (!op.has_padding() || op.last_block.allocate(aes_block_size)) return KM_ERROR_OK;
  TRACE_ERROR("Out of memory");
  return KM_ERROR_MEMORY_ALLOCATION_FAILED;
}

/// Decrypts to the end of `out`.
TEE_Result decrypt_to(aes_decrypt_operation_t& op, std::span<const uint8_t> input, byte_writer& out) {
  if (input.empty()) return TEE_SUCCESS;
  uint32_t written = 0;
  if (TEE_Result r = feed_cipher(op, input, out.rest(), &written); r != TEE_SUCCESS) return r;
  std::span<uint8_t> place;
  return out.reserve(written, place) ? TEE_SUCCESS : TEE_ERROR_GENERIC;
}

/// Whether the end of the stream so far is a whole block, which may be the padded one.
bool at_block_end(const aes_decrypt_operation_t& op) {
  return op.has_padding() && op.processed != 0 && op.processed % aes_block_size == 0;
}

/// Feeds GCM ciphertext while the last tag_size() bytes of the stream stay in the tag buffer.
TEE_Result update_gcm(aes_decrypt_operation_t& op, std::span<const uint8_t> input, byte_writer& out) {
  const uint64_t held = uint64_t{op.tag_fill} + input.size();
  const uint32_t tag_size = op.tag_size();
  uint8_t* const tag = op.tag_buffer.data();
  if (input.size() >= tag_size) {
    const std::size_t data_size = input.size() - tag_size;
    if (TEE_Result r = decrypt_to(op, {tag, op.tag_fill}, out); r != TEE_SUCCESS) return r;
    if (TEE_Result r = decrypt_to(op, input.first(data_size), out); r != TEE_SUCCESS) return r;
    std::memcpy(tag, input.data() + data_size, tag_size);
    op.tag_fill = tag_size;
    return TEE_SUCCESS;
  }
  if (held > tag_size) {  // the oldest bytes turn out to be data
    const uint32_t released = static_cast<uint32_t>(held - tag_size);
    if (TEE_Result r = decrypt_to(op, {tag, released}, out); r != TEE_SUCCESS) return r;
    op.tag_fill -= released;
    std::memmove(tag, tag + released, op.tag_fill);
  }
  std::memcpy(tag + op.tag_fill, input.data(), input.size());
  op.tag_fill += static_cast<uint32_t>(input.size());
  return TEE_SUCCESS;
}

/// Feeds ciphertext of the other modes; with padding, a block at the end stays behind in last_block.
TEE_Result update_blocks(aes_decrypt_operation_t& op, std::span<const uint8_t> input, std::span<uint8_t> place,
                         uint32_t* written) {
  byte_writer out{place};
  const bool holds = at_block_end(op);
  if (holds && !out.write_bytes(op.last_block.data(), aes_block_size)) return TEE_ERROR_SHORT_BUFFER;
  op.started = true;
  op.processed += input.size();
  if (TEE_Result r = decrypt_to(op, input, out); r != TEE_SUCCESS) return r;
  *written = out.written();
  if (at_block_end(op) && *written >= aes_block_size) {
    // What is read back here was just written to the client's memory: a client that changes it meanwhile changes its
    // own plaintext. It must not stay there, for finish decides how much of it is text.
    *written -= aes_block_size;
    std::memcpy(op.last_block.data(), place.data() + *written, aes_block_size);
    std::memset(place.data() + *written, 0, aes_block_size);
  }
  return TEE_SUCCESS;
}

/// Judges the tag. Only a tag that the platform calls invalid fails: the platform has no other finding to make here.
TEE_Result judge_tag(aes_decrypt_operation_t& op, keymaster_error_t* error) {
  uint8_t nothing = 0;
  uint32_t length = 0;
  const TEE_Result result =
      TEE_AEDecryptFinal(op.operation.get(), nullptr, 0, &nothing, &length, op.tag_buffer.data(), op.tag_fill);
  if (result == TEE_ERROR_MAC_INVALID) {
    *error = KM_ERROR_VERIFICATION_FAILED;
  } else if (length != 0) {
    TRACE_ERROR("AEEncryptFinal make output %dB", length);
    *error = KM_ERROR_UNKNOWN_ERROR;
  }
  return TEE_SUCCESS;
}

/// Takes the padding off the block held back. All 16 bytes are looked at whatever the padding says, so that the time
/// taken does not tell where it is wrong. A count of 0 passes, and leaves the whole block.
keymaster_error_t strip_padding(const aes_decrypt_operation_t& op, secret_bytes& output) {
  const uint8_t* const block = op.last_block.data();
  const uint32_t count = block[aes_block_size - 1];
  uint32_t wrong = count > aes_block_size ? 1 : 0;
  for (uint32_t i = 0; i < aes_block_size; ++i) {
    const uint32_t is_padding = aes_block_size - i <= count ? 1 : 0;
    wrong |= is_padding & (block[i] != count ? 1U : 0U);
  }
  if (wrong != 0) {
    TRACE_ERROR("Illegal padding");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  if (count == aes_block_size) return KM_ERROR_OK;
  if (!output.copy_of({block, aes_block_size - count})) {
    TRACE_ERROR("Out of memory");
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  return KM_ERROR_OK;
}

TEE_Result finish_blocks(aes_decrypt_operation_t& op, secret_bytes& output, keymaster_error_t* error) {
  if (op.has_padding() && op.processed % aes_block_size != 0) {
    TRACE_ERROR("Input data not align to block size");
    *error = KM_ERROR_INVALID_INPUT_LENGTH;
    return TEE_SUCCESS;
  }
  if (TEE_Result r = end_cipher(op, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) return r;
  if (op.has_padding()) *error = strip_padding(op, output);
  return TEE_SUCCESS;
}

}  // namespace

keymaster_operation_t* create_aes_decrypt(const operation_request& request, TEE_Result* result,
                                          keymaster_error_t* error) {
  keymaster_operation_t* const made = make_record<aes_decrypt_operation_t>(
      {KM_PURPOSE_DECRYPT, aes_decrypt_free, aes_decrypt_update, aes_decrypt_finish}, result, error,
      [&](aes_decrypt_operation_t& op) {
        TEE_Result r = prepare_aes_operation(op, request, TEE_MODE_DECRYPT, allocate_tag_buffer, error);
        if (r == TEE_SUCCESS && *error == KM_ERROR_OK) r = start_aes_operation(op, request, error);
        if (r == TEE_SUCCESS && *error == KM_ERROR_OK) *error = allocate_last_block(op);
        return r;
      });
  if (made == nullptr) request.out_params.reset();  // the nonce is told before the last allocation
  return made;
}

TEE_Result aes_decrypt_update(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                              std::span<const uint8_t> input, uint32_t* /*input_consumed*/, uint8_t* output,
                              uint32_t* output_length, keymaster_error_t* error) {
  aes_decrypt_operation_t& decrypt = record(op);
  const std::span<uint8_t> place{output, *output_length};
  *output_length = 0;
  *error = feed_associated_data(decrypt, in_params);
  if (*error != KM_ERROR_OK || input.empty()) return TEE_SUCCESS;
  if (!decrypt.is_gcm()) {
    if (at_block_end(decrypt) && place.size() < aes_block_size) {
      *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;  // the code that clients know for too small a buffer here
      return TEE_SUCCESS;
    }
    return update_blocks(decrypt, input, place, output_length);
  }
  byte_writer out{place};
  decrypt.started = true;
  decrypt.processed += input.size();
  const TEE_Result result = update_gcm(decrypt, input, out);
  *output_length = out.written();
  return result;
}

TEE_Result aes_decrypt_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                              std::span<const uint8_t> /*input*/, secret_bytes& output, parameter_set& /*out_params*/,
                              keymaster_error_t* error) {
  aes_decrypt_operation_t& decrypt = record(op);
  *error = KM_ERROR_OK;
  const TEE_Result result = decrypt.is_gcm() ? judge_tag(decrypt, error) : finish_blocks(decrypt, output, error);
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) output.reset();
  return result;
}

void aes_decrypt_free(keymaster_operation_t* op) {
  auto* const decrypt = static_cast<aes_decrypt_operation_t*>(op);
  trace_aes_free(decrypt);
  delete_record(decrypt);
}

}  // namespace keymaster
