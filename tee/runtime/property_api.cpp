// Properties of the Internal Core API 1.1.2 (4.4).
#include <cstring>

#include "tee/runtime/platform_call.h"
#include "tee/runtime/property.h"

namespace hosted_tee {
namespace {

property_value require(const instance& self, TEE_PropSetHandle set, const char* name, const void* out) {
  if (name == nullptr || out == nullptr) panic("a property's name or the place for its value is null");
  std::optional<property_value> value = find_property(self, set, name);
  if (!value) throw call_failure(TEE_ERROR_ITEM_NOT_FOUND);
  return std::move(*value);
}

// The value of a property that has exactly this type.
template <class T>
TEE_Result get_as(const char* function, TEE_PropSetHandle set, const char* name, T* out) {
  return platform_call(function, nullptr, [&](const instance& self) -> TEE_Result {
    const property_value value = require(self, set, name, out);
    const T* typed = std::get_if<T>(&value);
    if (typed == nullptr) return TEE_ERROR_BAD_FORMAT;
    *out = *typed;
    return TEE_SUCCESS;
  });
}

TEE_Result put(const void* data, std::size_t size, void* buffer, std::uint32_t* length) {
  const std::uint32_t capacity = *length;
  *length = static_cast<std::uint32_t>(size);
  if (size > capacity) return TEE_ERROR_SHORT_BUFFER;
  if (buffer == nullptr && size != 0) panic("the place for a property's value is null");
  if (size != 0) std::memcpy(buffer, data, size);
  return TEE_SUCCESS;
}

}  // namespace

extern "C" {

TEE_Result TEE_GetPropertyAsString(TEE_PropSetHandle propsetOrEnumerator, const char* name, char* valueBuffer,
                                   uint32_t* valueBufferLen) {
  return platform_call("TEE_GetPropertyAsString", valueBufferLen, [&](const instance& self) {
    const std::string text = property_text(require(self, propsetOrEnumerator, name, valueBufferLen));
    return put(text.c_str(), text.size() + 1, valueBuffer, valueBufferLen);
  });
}

TEE_Result TEE_GetPropertyAsBool(TEE_PropSetHandle propsetOrEnumerator, const char* name, bool* value) {
  return get_as("TEE_GetPropertyAsBool", propsetOrEnumerator, name, value);
}

TEE_Result TEE_GetPropertyAsU32(TEE_PropSetHandle propsetOrEnumerator, const char* name, uint32_t* value) {
  return get_as("TEE_GetPropertyAsU32", propsetOrEnumerator, name, value);
}

TEE_Result TEE_GetPropertyAsUUID(TEE_PropSetHandle propsetOrEnumerator, const char* name, TEE_UUID* value) {
  return get_as("TEE_GetPropertyAsUUID", propsetOrEnumerator, name, value);
}

TEE_Result TEE_GetPropertyAsIdentity(TEE_PropSetHandle propsetOrEnumerator, const char* name, TEE_Identity* value) {
  return get_as("TEE_GetPropertyAsIdentity", propsetOrEnumerator, name, value);
}

TEE_Result TEE_GetPropertyAsBinaryBlock(TEE_PropSetHandle propsetOrEnumerator, const char* name, void* valueBuffer,
                                        uint32_t* valueBufferLen) {
  return platform_call("TEE_GetPropertyAsBinaryBlock", valueBufferLen, [&](const instance& self) -> TEE_Result {
    const property_value value = require(self, propsetOrEnumerator, name, valueBufferLen);
    const auto* block = std::get_if<binary_block>(&value);
    if (block == nullptr) return TEE_ERROR_BAD_FORMAT;
    return put(block->data(), block->size(), valueBuffer, valueBufferLen);
  });
}

}  // extern "C"
}  // namespace hosted_tee
