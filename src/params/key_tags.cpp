#include "params/key_tags.h"

#include <algorithm>

#include "platform/trace.h"

namespace keymaster {

keymaster_error_t add_param(keymaster_key_param_set_t* params, const keymaster_key_param_t& param) {
  const keymaster_error_t error = key_param_set_append(params, param);
  if (error != KM_ERROR_OK) TRACE_ERROR("Out of memory");
  return error;
}

keymaster_error_t add_origin(keymaster_key_param_set_t* params, uint32_t origin) {
  if (key_param_set_contains(*params, KM_TAG_ORIGIN)) {
    TRACE_ERROR("Shouldn't specify KM_TAG_ORIGIN");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  return add_param(params, integer_param(KM_TAG_ORIGIN, origin));
}

keymaster_error_t read_key_size(const keymaster_key_param_set_t& params, uint32_t* bits) {
  const keymaster_key_param_t* const key_size = key_param_set_get_unique(params, KM_TAG_KEY_SIZE);
  if (key_size == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_KEY_SIZE or specified");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  *bits = key_size->integer;
  return KM_ERROR_OK;
}

keymaster_error_t settle_key_size(keymaster_key_param_set_t* params, uint64_t guessed_bits) {
  const keymaster_key_param_t* const given = key_param_set_get_unique(*params, KM_TAG_KEY_SIZE);
  if (given == nullptr) {
    const uint64_t stated = std::min<uint64_t>(guessed_bits, UINT32_MAX);
    return add_param(params, integer_param(KM_TAG_KEY_SIZE, static_cast<uint32_t>(stated)));
  }
  if (given->integer == guessed_bits) return KM_ERROR_OK;
  TRACE_ERROR("Key size mismatch (given %d, guessed %d)", given->integer, static_cast<uint32_t>(guessed_bits));
  return KM_ERROR_IMPORT_PARAMETER_MISMATCH;
}

}  // namespace keymaster
