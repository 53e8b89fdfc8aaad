// What the records of AES encryption and decryption have in common, and how both are set up.
#ifndef KEYMASTER_ALGORITHMS_AES_AES_OPERATION_H_
#define KEYMASTER_ALGORITHMS_AES_AES_OPERATION_H_

#include <cstdint>
#include <span>

#include "params/operation.h"
#include "platform/bytes.h"
#include "platform/handles.h"

namespace keymaster {

inline constexpr uint32_t aes_block_size = 16;

struct aes_operation_t : keymaster_operation_t {
  operation_handle operation;
  object_handle key;
  uint32_t padding = 0;
  uint32_t block_mode = 0;
  uint32_t key_size = 0;    // bits
  uint32_t mac_length = 0;  // bits of the GCM tag
  /// All input so far. 64 bits: with fewer, a long enough stream would look like none and lose its last block.
  uint64_t processed = 0;
  bool started = false;  // data has been fed, so that associated data comes too late

  [[nodiscard]] bool is_gcm() const { return block_mode == KM_MODE_GCM; }
  [[nodiscard]] bool has_padding() const { return padding != KM_PAD_NONE; }
  [[nodiscard]] uint32_t tag_size() const { return mac_length / 8; }
};

/// prepare_aes_operation reads the begin parameters into `op`, and makes its key and its platform operation for `mode`,
/// short of the nonce. `allocate_tag` is called for GCM once the tag's length is known, and may fail.
/// `*error`: KM_ERROR_INVALID_ARGUMENT (block mode or, for GCM, MAC length absent or repeated),
/// KM_ERROR_UNSUPPORTED_MAC_LENGTH (above 128 or no multiple of 8), KM_ERROR_UNSUPPORTED_BLOCK_MODE,
/// KM_ERROR_INCOMPATIBLE_PADDING_MODE, what `allocate_tag` says. Otherwise the platform's result.
[[nodiscard]] TEE_Result prepare_aes_operation(aes_operation_t& op, const operation_request& request, uint32_t mode,
                                               keymaster_error_t (*allocate_tag)(aes_operation_t& op),
                                               keymaster_error_t* error);

/// start_aes_operation gives the operation its nonce, which is the client's or a fresh one, and tells the client which
/// through `request.out_params`. Decryption draws one too when none is given.
/// `*error`: KM_ERROR_INVALID_TAG (a nonce for ECB), KM_ERROR_INVALID_ARGUMENT (of another length than the mode's),
/// KM_ERROR_MEMORY_ALLOCATION_FAILED. Otherwise the platform's result.
[[nodiscard]] TEE_Result start_aes_operation(aes_operation_t& op, const operation_request& request,
                                             keymaster_error_t* error);

/// feed_associated_data takes the associated data of an update, if it brings any. KM_ERROR_INVALID_TAG when the mode
/// has none or data has been fed already.
[[nodiscard]] keymaster_error_t feed_associated_data(aes_operation_t& op, const keymaster_key_param_set_t& in_params);

/// feed_cipher feeds `input` to the operation and writes at most `output.size()` bytes; `*written` tells how many.
[[nodiscard]] TEE_Result feed_cipher(aes_operation_t& op, std::span<const uint8_t> input, std::span<uint8_t> output,
                                     uint32_t* written);

/// end_cipher ends the operation of a mode other than GCM. The platform has nothing left to give by then: more output
/// is KM_ERROR_UNKNOWN_ERROR.
[[nodiscard]] TEE_Result end_cipher(aes_operation_t& op, keymaster_error_t* error);

/// trace_aes_free traces what is missing in a record that is to be freed. Encryption and decryption use the same texts.
void trace_aes_free(const aes_operation_t* op);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_AES_AES_OPERATION_H_
