// Stored objects of a fixed size: counters and the values that a companion draws once for the life of the device.
#ifndef TEE_COMPANIONS_COMMON_FIXED_OBJECT_H_
#define TEE_COMPANIONS_COMMON_FIXED_OBJECT_H_

#include <cstdint>
#include <span>
#include <string_view>

#include "tee_internal_api.h"

namespace keymaster::companion {

/// read_fixed reads an object that has just the size of `value`. TEE_ERROR_ITEM_NOT_FOUND: there is none;
/// TEE_ERROR_BAD_STATE, with a trace line: it has another size; TEE_ERROR_OUT_OF_MEMORY; otherwise the platform's
/// result. `value` stays as it was then.
[[nodiscard]] TEE_Result read_fixed(std::string_view name, std::span<uint8_t> value);

/// draw_once reads the value of this name, and draws and stores it the first time; it is never all zero. An object that
/// can't be read is not replaced: what was made with the old value would be worth nothing afterwards. The results are
/// those of read_fixed and write_stored; `value` is all zero then, so that nothing can be made with a value that is not
/// stored.
[[nodiscard]] TEE_Result draw_once(std::string_view name, std::span<uint8_t> value);

/// draw_id_once is draw_once for a number.
[[nodiscard]] TEE_Result draw_id_once(std::string_view name, uint64_t* id);

/// draw fills `value` with random bytes that are not all zero, for numbers whose zero means "none".
void draw(std::span<uint8_t> value);

}  // namespace keymaster::companion

#endif  // TEE_COMPANIONS_COMMON_FIXED_OBJECT_H_
