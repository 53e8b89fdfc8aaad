#include "ta/capability_commands.h"

#include <cstring>

#include "platform/trace.h"
#include "ta/algorithm_registry.h"

namespace keymaster {
namespace {

/// A list that an algorithm offers: how many values, and how to get them. Either may be missing.
struct offered_list {
  uint32_t (*count)() = nullptr;
  list_writer copy = nullptr;
};

using purpose_list = offered_list (*)(const keymaster_purpose_ops& ops);
using format_list = offered_list (*)(const keymaster_algorithm_descriptor& descriptor);

offered_list block_modes(const keymaster_purpose_ops& ops) {
  return {ops.get_support_block_mode_cnt, ops.get_support_block_mode};
}
offered_list padding_modes(const keymaster_purpose_ops& ops) {
  return {ops.get_support_padding_mode_cnt, ops.get_support_padding_mode};
}
offered_list digests(const keymaster_purpose_ops& ops) {
  return {ops.get_support_digest_cnt, ops.get_support_digest};
}
offered_list import_formats(const keymaster_algorithm_descriptor& descriptor) {
  return {descriptor.get_support_import_format_cnt, descriptor.get_support_import_format};
}
offered_list export_formats(const keymaster_algorithm_descriptor& descriptor) {
  return {descriptor.get_support_export_format_cnt, descriptor.get_support_export_format};
}

offered_list find_purpose_list(uint32_t algorithm, uint32_t purpose, purpose_list select) {
  const keymaster_purpose_ops* const ops = find_purpose_ops(algorithm, purpose);
  return ops == nullptr ? offered_list{} : select(*ops);
}

offered_list find_format_list(uint32_t algorithm, format_list select) {
  const keymaster_algorithm_descriptor* const descriptor = find_algorithm(algorithm);
  return descriptor == nullptr ? offered_list{} : select(*descriptor);
}

void count_list(const offered_list& offered, keymaster_error_t missing, uint32_t* count, keymaster_error_t* error) {
  *count = offered.count == nullptr ? 0 : offered.count();
  *error = offered.count == nullptr ? missing : KM_ERROR_OK;
}

/// Writes a list. TEE_ERROR_GENERIC: there is a count only, and the caller says whose list is missing.
TEE_Result write_list(const offered_list& offered, keymaster_error_t missing, std::span<uint8_t> list,
                      keymaster_error_t* error) {
  uint32_t count = 0;
  count_list(offered, missing, &count, error);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  if (list.size() != uint64_t{count} * sizeof(uint32_t)) {
    TRACE_ERROR("Output buffer doesn't match");
    return TEE_ERROR_BAD_PARAMETERS;
  }
  if (offered.copy == nullptr) return TEE_ERROR_GENERIC;
  offered.copy(list.data());
  return TEE_SUCCESS;
}

}  // namespace

uint32_t get_support_algo_cnt() {
  return static_cast<uint32_t>(algorithms().size());
}

TEE_Result get_support_algo(std::span<uint8_t> list) {
  if (list.size() != algorithms().size() * sizeof(uint32_t)) {
    TRACE_ERROR("Output buffer doesn't match");
    return TEE_ERROR_BAD_PARAMETERS;
  }
  for (const keymaster_algorithm_descriptor* descriptor : algorithms()) {
    std::memcpy(list.data(), &descriptor->algorithm, sizeof descriptor->algorithm);
    list = list.subspan(sizeof descriptor->algorithm);
  }
  return TEE_SUCCESS;
}

TEE_Result get_support_blk_mode_cnt(uint32_t algorithm, uint32_t purpose, uint32_t* count, keymaster_error_t* error) {
  count_list(find_purpose_list(algorithm, purpose, block_modes), KM_ERROR_UNSUPPORTED_PURPOSE, count, error);
  return TEE_SUCCESS;
}

TEE_Result get_support_padding_mode_cnt(uint32_t algorithm, uint32_t purpose, uint32_t* count,
                                        keymaster_error_t* error) {
  count_list(find_purpose_list(algorithm, purpose, padding_modes), KM_ERROR_UNSUPPORTED_PURPOSE, count, error);
  return TEE_SUCCESS;
}

TEE_Result get_support_digest_cnt(uint32_t algorithm, uint32_t purpose, uint32_t* count, keymaster_error_t* error) {
  count_list(find_purpose_list(algorithm, purpose, digests), KM_ERROR_UNSUPPORTED_PURPOSE, count, error);
  return TEE_SUCCESS;
}

TEE_Result get_support_blk_mode(uint32_t algorithm, uint32_t purpose, std::span<uint8_t> list,
                                keymaster_error_t* error) {
  const TEE_Result result =
      write_list(find_purpose_list(algorithm, purpose, block_modes), KM_ERROR_UNSUPPORTED_PURPOSE, list, error);
  if (result == TEE_ERROR_GENERIC) TRACE_ERROR("get_support_block_mode == NULL");
  return result;
}

TEE_Result get_support_padding_mode(uint32_t algorithm, uint32_t purpose, std::span<uint8_t> list,
                                    keymaster_error_t* error) {
  const TEE_Result result =
      write_list(find_purpose_list(algorithm, purpose, padding_modes), KM_ERROR_UNSUPPORTED_PURPOSE, list, error);
  if (result == TEE_ERROR_GENERIC) TRACE_ERROR("get_support_padding_mode == NULL");
  return result;
}

TEE_Result get_support_digest(uint32_t algorithm, uint32_t purpose, std::span<uint8_t> list, keymaster_error_t* error) {
  const TEE_Result result =
      write_list(find_purpose_list(algorithm, purpose, digests), KM_ERROR_UNSUPPORTED_PURPOSE, list, error);
  if (result == TEE_ERROR_GENERIC) TRACE_ERROR("get_support_digest == NULL");
  return result;
}

TEE_Result get_support_import_format_cnt(uint32_t algorithm, uint32_t* count, keymaster_error_t* error) {
  count_list(find_format_list(algorithm, import_formats), KM_ERROR_UNSUPPORTED_ALGORITHM, count, error);
  return TEE_SUCCESS;
}

TEE_Result get_support_export_format_cnt(uint32_t algorithm, uint32_t* count, keymaster_error_t* error) {
  count_list(find_format_list(algorithm, export_formats), KM_ERROR_UNSUPPORTED_ALGORITHM, count, error);
  return TEE_SUCCESS;
}

TEE_Result get_support_import_format(uint32_t algorithm, std::span<uint8_t> list, keymaster_error_t* error) {
  const TEE_Result result =
      write_list(find_format_list(algorithm, import_formats), KM_ERROR_UNSUPPORTED_ALGORITHM, list, error);
  if (result == TEE_ERROR_GENERIC) TRACE_ERROR("get_support_import_format == NULL");
  return result;
}

TEE_Result get_support_export_format(uint32_t algorithm, std::span<uint8_t> list, keymaster_error_t* error) {
  const TEE_Result result =
      write_list(find_format_list(algorithm, export_formats), KM_ERROR_UNSUPPORTED_ALGORITHM, list, error);
  if (result == TEE_ERROR_GENERIC) TRACE_ERROR("get_support_export_format == NULL");
  return result;
}

}  // namespace keymaster
