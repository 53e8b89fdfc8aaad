// Properties of the Internal Core API 1.1.2 (4.4).
#include <cstring>
#include <stdexcept>

#include "tee/runtime/device.h"
#include "tee/runtime/platform_call.h"
#include "tee/runtime/property.h"
#include "tee/runtime/ta_image.h"
#include "tee/runtime/uuid.h"

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

std::unique_ptr<ta_image> image_of(const TEE_UUID& ta, device_services& device) {
  try {
    std::unique_ptr<ta_image> image = find_ta(ta, device.ta_folders);
    if (image == nullptr) throw call_failure(TEE_ERROR_ITEM_NOT_FOUND);
    return image;
  } catch (const std::runtime_error& error) {
    device.trace.add(
        {"TEE", trace_level::error, "get_ta_property", 0, "the TA " + to_text(ta) + " can't be read: " + error.what()});
    throw call_failure(TEE_ERROR_BAD_FORMAT);
  }
}

}  // namespace

TEE_Result get_ta_property(const TEE_UUID& ta, const char* name, char* value, std::uint32_t* length) {
  return platform_call("get_ta_property", length, [&](const instance& self) {
    const std::unique_ptr<ta_image> image = image_of(ta, self.device);
    const auto found = find_ta_property(image->parts().head->uuid, image->parts().properties, name);
    if (!found) throw call_failure(TEE_ERROR_ITEM_NOT_FOUND);
    const std::string text = property_text(*found);
    return put(text.c_str(), text.size() + 1, value, length);
  });
}

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
