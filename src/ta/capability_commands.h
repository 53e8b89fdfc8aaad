// What the TA can do: commands 1 to 12, answered from the registry alone.
#ifndef KEYMASTER_TA_CAPABILITY_COMMANDS_H_
#define KEYMASTER_TA_CAPABILITY_COMMANDS_H_

#include <cstdint>
#include <span>

#include "params/keymaster_defs.h"
#include "tee_internal_api.h"

namespace keymaster {

/// get_support_algo_cnt answers the number of algorithms.
[[nodiscard]] uint32_t get_support_algo_cnt();

/// get_support_algo writes the algorithms in registry order. TEE_ERROR_BAD_PARAMETERS unless `list` has exactly their
/// size.
[[nodiscard]] TEE_Result get_support_algo(std::span<uint8_t> list);

/// The counts for an algorithm and a purpose. `*error`: KM_ERROR_UNSUPPORTED_PURPOSE when the algorithm is unknown or
/// doesn't serve the purpose, with `*count` 0. Always TEE_SUCCESS.
[[nodiscard]] TEE_Result get_support_blk_mode_cnt(uint32_t algorithm, uint32_t purpose, uint32_t* count,
                                                  keymaster_error_t* error);
[[nodiscard]] TEE_Result get_support_padding_mode_cnt(uint32_t algorithm, uint32_t purpose, uint32_t* count,
                                                      keymaster_error_t* error);
[[nodiscard]] TEE_Result get_support_digest_cnt(uint32_t algorithm, uint32_t purpose, uint32_t* count,
                                                keymaster_error_t* error);

/// The lists, as 32-bit values. The same errors; TEE_ERROR_BAD_PARAMETERS unless `list` has exactly the size of the
/// list (a larger one is refused too: a client asks for the count first); TEE_ERROR_GENERIC for an algorithm with a
/// count and no list.
[[nodiscard]] TEE_Result get_support_blk_mode(uint32_t algorithm, uint32_t purpose, std::span<uint8_t> list,
                                              keymaster_error_t* error);
[[nodiscard]] TEE_Result get_support_padding_mode(uint32_t algorithm, uint32_t purpose, std::span<uint8_t> list,
                                                  keymaster_error_t* error);
[[nodiscard]] TEE_Result get_support_digest(uint32_t algorithm, uint32_t purpose, std::span<uint8_t> list,
                                            keymaster_error_t* error);

/// Counts and lists of key formats: the same with KM_ERROR_UNSUPPORTED_ALGORITHM for an algorithm without them.
[[nodiscard]] TEE_Result get_support_import_format_cnt(uint32_t algorithm, uint32_t* count, keymaster_error_t* error);
[[nodiscard]] TEE_Result get_support_export_format_cnt(uint32_t algorithm, uint32_t* count, keymaster_error_t* error);
[[nodiscard]] TEE_Result get_support_import_format(uint32_t algorithm, std::span<uint8_t> list,
                                                   keymaster_error_t* error);
[[nodiscard]] TEE_Result get_support_export_format(uint32_t algorithm, std::span<uint8_t> list,
                                                   keymaster_error_t* error);

}  // namespace keymaster

#endif  // KEYMASTER_TA_CAPABILITY_COMMANDS_H_
