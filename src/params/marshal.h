// The byte form of parameter sets, at the boundary and inside key blobs: a count, then records of 24 bytes, each
// followed at once by its blob's bytes where it has any. Little-endian, without padding.
#ifndef KEYMASTER_PARAMS_MARSHAL_H_
#define KEYMASTER_PARAMS_MARSHAL_H_

#include <span>

#include "params/key_param.h"
#include "tee_internal_api.h"

namespace keymaster {

/// unmarshal reads `input` into `*set`, which the caller provides empty and owns afterwards. Every byte of `input` is
/// read once; bytes behind the last record are ignored.
/// TEE_ERROR_SHORT_BUFFER without a message when `set` is null; TEE_ERROR_GENERIC ("Too short input") when the input
/// ends inside a field; TEE_ERROR_OUT_OF_MEMORY when the array or a blob cannot be had. A blob is allocated before its
/// length is compared with the input, so that a huge length is a want of memory. On failure the set is empty.
[[nodiscard]] TEE_Result unmarshal(std::span<const uint8_t> input, keymaster_key_param_set_t* set);

/// marshal_size is the number of bytes that marshal writes. Without `include_hidden` the application id, the
/// application data and the root of trust are left out.
[[nodiscard]] uint32_t marshal_size(const keymaster_key_param_set_t& set, bool include_hidden);

/// marshal writes the set. With `*buffer` null it allocates exactly the size, and the caller frees it with TEE_Free;
/// otherwise `*length` is the capacity of `*buffer`. On success `*length` is the size.
/// TEE_ERROR_OUT_OF_MEMORY; TEE_ERROR_SHORT_BUFFER when the capacity is too small; TEE_ERROR_BAD_PARAMETERS for a blob
/// parameter without bytes. On failure `*buffer` is null and `*length` 0. With TEE_ERROR_SHORT_BUFFER the caller's
/// buffer has been freed, so it must come from the heap: marshal_to_slot is for all other memory.
[[nodiscard]] TEE_Result marshal(const keymaster_key_param_set_t& set, bool include_hidden, uint8_t** buffer,
                                 uint32_t* length);

/// marshal_to_slot writes the set without its hidden parameters into `slot`, memory of any kind, and tells the bytes
/// written. The bytes are put together on the heap and copied out last. Results as of marshal; `slot` is untouched and
/// `*written` 0 on failure.
[[nodiscard]] TEE_Result marshal_to_slot(const keymaster_key_param_set_t& set, std::span<uint8_t> slot,
                                         uint32_t* written);

}  // namespace keymaster

#endif  // KEYMASTER_PARAMS_MARSHAL_H_
