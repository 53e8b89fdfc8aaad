#include "params/key_param.h"

#include "platform/wipe.h"
#include "tee_internal_api.h"

namespace keymaster {

std::span<keymaster_key_param_t> records(const keymaster_key_param_set_t& set) {
  if (set.params == nullptr) return {};
  return {set.params, set.length};
}

std::span<const uint8_t> blob_bytes(const keymaster_key_param_t& param) {
  if (param.blob.data == nullptr) return {};
  return {param.blob.data, param.blob.data_length};
}

uint32_t key_param_set_count_tag(const keymaster_key_param_set_t& set, keymaster_tag_t tag) {
  uint32_t count = 0;
  for (const keymaster_key_param_t& param : records(set)) count += param.tag == tag ? 1 : 0;
  return count;
}

bool key_param_set_contains(const keymaster_key_param_set_t& set, keymaster_tag_t tag) {
  return key_param_set_find_next(set, tag, nullptr) != nullptr;
}

bool key_param_set_at_most_one(const keymaster_key_param_set_t& set, keymaster_tag_t tag) {
  return key_param_set_count_tag(set, tag) <= 1;
}

const keymaster_key_param_t* key_param_set_get_unique(const keymaster_key_param_set_t& set, keymaster_tag_t tag) {
  const keymaster_key_param_t* first = key_param_set_find_next(set, tag, nullptr);
  if (first == nullptr || key_param_set_find_next(set, tag, first) != nullptr) return nullptr;
  return first;
}

const keymaster_key_param_t* key_param_set_find_next(const keymaster_key_param_set_t& set, keymaster_tag_t tag,
                                                     const keymaster_key_param_t* previous) {
  std::span<keymaster_key_param_t> rest = records(set);
  if (previous != nullptr) rest = rest.subspan(static_cast<std::size_t>(previous - set.params) + 1);
  for (const keymaster_key_param_t& param : rest) {
    if (param.tag == tag) return &param;
  }
  return nullptr;
}

keymaster_error_t key_param_set_append(keymaster_key_param_set_t* set, const keymaster_key_param_t& parameter) {
  keymaster_key_param_t copy = parameter;  // `parameter` may lie in the array that is about to move
  const uint32_t count = static_cast<uint32_t>(records(*set).size());
  const uint64_t size = (uint64_t{count} + 1) * sizeof(keymaster_key_param_t);
  void* grown = size > UINT32_MAX        ? nullptr
                : set->params == nullptr ? TEE_Malloc(static_cast<uint32_t>(size), TEE_MALLOC_FILL_ZERO)
                                         : TEE_Realloc(set->params, static_cast<uint32_t>(size));
  if (grown == nullptr) {
    keymaster_free_param_array(&copy, 1);
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  set->params = static_cast<keymaster_key_param_t*>(grown);
  set->params[count] = copy;
  set->length = count + 1;
  return KM_ERROR_OK;
}

void keymaster_free_param_array(keymaster_key_param_t* params, uint32_t length) {
  for (uint32_t i = 0; i < length; ++i) {
    keymaster_key_param_t& param = params[i];
    if (!tag_has_blob(param.tag) || param.blob.data == nullptr) continue;
    // Application ids, auth tokens and the like are not for the next owner of the memory to read.
    wipe(param.blob.data, param.blob.data_length);
    TEE_Free(param.blob.data);
    param.blob.data_slot = 0;
  }
}

void keymaster_free_param_set(keymaster_key_param_set_t* set) {
  if (set->params == nullptr) return;
  keymaster_free_param_array(set->params, set->length);
  TEE_Free(set->params);
  set->params = nullptr;
}

keymaster_key_param_t integer_param(keymaster_tag_t tag, uint32_t value) {
  keymaster_key_param_t param = {};
  param.tag = tag;
  param.integer = value;
  return param;
}

keymaster_key_param_t long_param(keymaster_tag_t tag, uint64_t value) {
  keymaster_key_param_t param = {};
  param.tag = tag;
  param.long_integer = value;
  return param;
}

}  // namespace keymaster
