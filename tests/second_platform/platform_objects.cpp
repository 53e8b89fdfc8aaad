// The platform's functions on the heap, objects, storage and properties.
#include <fmt/format.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "tests/second_platform/platform.h"

using namespace second_platform;
using namespace testing_support;

namespace {

/// The lengths of a key's values as they come without leading zeros: half as long are the primes and what goes with
/// them, and every public exponent is 65537.
std::size_t value_size(const object& key, std::uint32_t attribute) {
  if (key.type != TEE_TYPE_RSA_KEYPAIR) return (key.bits == 521 ? 520 : key.bits) / 8;
  if (attribute == TEE_ATTR_RSA_PUBLIC_EXPONENT) return 3;
  return attribute == TEE_ATTR_RSA_MODULUS || attribute == TEE_ATTR_RSA_PRIVATE_EXPONENT ? key.bits / 8 : key.bits / 16;
}

std::string shown_attributes(const TEE_Attribute* attributes, std::uint32_t count) {
  std::string text;
  for (std::uint32_t i = 0; i < count; ++i) {
    const TEE_Attribute& given = attributes[i];
    text += fmt::format("{}{:08x}=", i == 0 ? "" : " ", given.attributeID);
    if ((given.attributeID & TEE_ATTR_FLAG_VALUE) != 0) {
      text += fmt::format("{},{}", static_cast<std::int32_t>(given.content.value.a), given.content.value.b);
    } else {
      text += shown(platform.read(given.content.ref.buffer, given.content.ref.length));
    }
  }
  return text;
}

std::pair<std::uint32_t, bytes> stored_name(std::uint32_t storage, const void* id, std::uint32_t length) {
  return {storage, platform.read(id, length)};
}

TEE_Result open_object(const twist& departure, const std::pair<std::uint32_t, bytes>& name, TEE_ObjectHandle* handle) {
  if (departure.undone) return departure.result.value_or(TEE_SUCCESS);
  *handle = platform.add(object{0, 0, true, name, 0});
  return departure.result.value_or(TEE_SUCCESS);
}

}  // namespace

namespace second_platform {
std::string shown_parameters(const TEE_Attribute* attributes, std::uint32_t count) {
  return attributes == nullptr && count == 0 ? "none" : shown_attributes(attributes, count);
}
}  // namespace second_platform

void* TEE_Malloc(uint32_t size, uint32_t hint) {
  void* const block = platform.allocate(size);
  if (block != nullptr && hint == TEE_MALLOC_FILL_ZERO) std::memset(block, 0, size);
  return block;
}

void* TEE_Realloc(void* buffer, uint32_t newSize) {
  return platform.grow(buffer, newSize);
}

void TEE_Free(void* buffer) {
  platform.free(buffer);
}

TEE_Result TEE_GetPropertyAsUUID(TEE_PropSetHandle, const char* name, TEE_UUID* value) {
  const twist departure = platform.enter(__func__, name);
  if (!departure.undone) *value = {0x01020304, 0x0506, 0x0708, {9, 10, 11, 12, 13, 14, 15, 16}};
  return departure.result.value_or(TEE_SUCCESS);
}

TEE_Result TEE_GetPropertyAsString(TEE_PropSetHandle, const char* name, char* valueBuffer, uint32_t* valueBufferLen) {
  const twist departure = platform.enter(__func__, fmt::format("{}, {}", name, *valueBufferLen));
  return platform.deliver(departure, from_text(std::string{"scripted\0", 9}), valueBuffer, valueBufferLen);
}

TEE_Result TEE_GetPropertyAsIdentity(TEE_PropSetHandle, const char* name, TEE_Identity* value) {
  const twist departure = platform.enter(__func__, name);
  if (!departure.undone) *value = platform.client;
  return departure.result.value_or(TEE_SUCCESS);
}

TEE_Result TEE_AllocateTransientObject(TEE_ObjectType objectType, uint32_t maxKeySize, TEE_ObjectHandle* handle) {
  const twist departure = platform.enter(__func__, fmt::format("{:08x}, {}", objectType, maxKeySize));
  if (!departure.undone) *handle = platform.add(object{objectType, maxKeySize, false, {}, 0});
  return departure.result.value_or(TEE_SUCCESS);
}

void TEE_FreeTransientObject(TEE_ObjectHandle handle) {
  platform.enter(__func__, platform.label(handle));
  if (handle != TEE_HANDLE_NULL) platform.drop(handle);
}

TEE_Result TEE_PopulateTransientObject(TEE_ObjectHandle handle, const TEE_Attribute* attrs, uint32_t attrCount) {
  const twist departure =
      platform.enter(__func__, fmt::format("{}, {}", platform.label(handle), shown_attributes(attrs, attrCount)));
  return departure.result.value_or(TEE_SUCCESS);
}

void TEE_InitRefAttribute(TEE_Attribute* attr, uint32_t attributeID, const void* buffer, uint32_t length) {
  attr->attributeID = attributeID;
  attr->content.ref.buffer = const_cast<void*>(buffer);
  attr->content.ref.length = length;
}

void TEE_InitValueAttribute(TEE_Attribute* attr, uint32_t attributeID, uint32_t a, uint32_t b) {
  attr->attributeID = attributeID;
  attr->content.value.a = a;
  attr->content.value.b = b;
}

TEE_Result TEE_GenerateKey(TEE_ObjectHandle handle, uint32_t keySize, const TEE_Attribute* params,
                           uint32_t paramCount) {
  const twist departure = platform.enter(
      __func__, fmt::format("{}, {}, {}", platform.label(handle), keySize, shown_parameters(params, paramCount)));
  return departure.result.value_or(TEE_SUCCESS);
}

TEE_Result TEE_GetObjectBufferAttribute(TEE_ObjectHandle handle, uint32_t attributeID, void* buffer, uint32_t* size) {
  const twist departure =
      platform.enter(__func__, fmt::format("{}, {:08x}, {}", platform.label(handle), attributeID, *size));
  const object* const key = platform.find(handle);
  return platform.deliver(departure, pattern(key == nullptr ? 0 : value_size(*key, attributeID), attributeID), buffer,
                          size);
}

TEE_Result TEE_OpenPersistentObject(uint32_t storageID, const void* objectID, uint32_t objectIDLen, uint32_t flags,
                                    TEE_ObjectHandle* handle) {
  const auto name = stored_name(storageID, objectID, objectIDLen);
  const twist departure =
      platform.enter(__func__, fmt::format("{:08x}, {}, {:#x}", storageID, shown(name.second), flags));
  if (!departure.result && !platform.storage.contains(name)) return TEE_ERROR_ITEM_NOT_FOUND;
  return open_object(departure, name, handle);
}

TEE_Result TEE_CreatePersistentObject(uint32_t storageID, const void* objectID, uint32_t objectIDLen, uint32_t flags,
                                      TEE_ObjectHandle attributes, const void* initialData, uint32_t initialDataLen,
                                      TEE_ObjectHandle* handle) {
  const auto name = stored_name(storageID, objectID, objectIDLen);
  const bytes data = platform.read(initialData, initialDataLen);
  const twist departure = platform.enter(
      __func__, fmt::format("{:08x}, {}, {:#x}, {}, {}", storageID, shown(name.second), flags,
                            attributes == TEE_HANDLE_NULL ? "no attributes" : "attributes", shown(data)));
  if (!departure.undone) platform.storage[name] = data;
  return open_object(departure, name, handle);
}

void TEE_CloseObject(TEE_ObjectHandle handle) {
  platform.enter(__func__, platform.label(handle));
  platform.drop(handle);
}

TEE_Result TEE_CloseAndDeletePersistentObject1(TEE_ObjectHandle handle) {
  const twist departure = platform.enter(__func__, platform.label(handle));
  if (const object* const known = platform.find(handle)) platform.storage.erase(known->stored);
  platform.drop(handle);
  return departure.result.value_or(TEE_SUCCESS);
}

TEE_Result TEE_ReadObjectData(TEE_ObjectHandle handle, void* buffer, uint32_t size, uint32_t* count) {
  const twist departure = platform.enter(__func__, fmt::format("{}, {}", platform.label(handle), size));
  object* const known = platform.find(handle);
  if (known == nullptr) return TEE_ERROR_BAD_PARAMETERS;
  const bytes& data = platform.storage[known->stored];
  const std::size_t taken = std::min<std::size_t>(size, data.size() - std::min(known->position, data.size()));
  const auto first = data.begin() + static_cast<std::ptrdiff_t>(known->position);
  const bytes content{first, first + static_cast<std::ptrdiff_t>(taken)};
  known->position += taken;
  *count = size;
  return platform.deliver(departure, content, buffer, count);
}

TEE_Result TEE_WriteObjectData(TEE_ObjectHandle handle, const void* buffer, uint32_t size) {
  const bytes data = platform.read(buffer, size);
  const twist departure = platform.enter(__func__, fmt::format("{}, {}", platform.label(handle), shown(data)));
  object* const known = platform.find(handle);
  if (known == nullptr || departure.undone) return departure.result.value_or(TEE_SUCCESS);
  bytes& stored = platform.storage[known->stored];
  stored.resize(std::max(stored.size(), known->position + size));
  std::copy(data.begin(), data.end(), stored.begin() + static_cast<std::ptrdiff_t>(known->position));
  known->position += size;
  return departure.result.value_or(TEE_SUCCESS);
}

TEE_Result TEE_SeekObjectData(TEE_ObjectHandle handle, int32_t offset, TEE_Whence whence) {
  const twist departure =
      platform.enter(__func__, fmt::format("{}, {}, {}", platform.label(handle), offset, static_cast<int>(whence)));
  if (object* const known = platform.find(handle); known != nullptr && whence == TEE_DATA_SEEK_SET && offset >= 0) {
    known->position = static_cast<std::size_t>(offset);
  }
  return departure.result.value_or(TEE_SUCCESS);
}

TEE_Result TEE_RPMB_MakeFileSystem(uint32_t* state) {
  const twist departure = platform.enter(__func__, std::to_string(*state));
  return departure.result.value_or(platform.rpmb ? TEE_SUCCESS : TEE_ERROR_NOT_SUPPORTED);
}

TEE_Result GetBootSeed(void* seed, uint32_t length) {
  const twist departure = platform.enter(__func__, std::to_string(length));
  std::uint32_t capacity = length;
  return platform.deliver(departure, fixed_output(length), seed, &capacity);
}

void TEE_GetSystemTime(TEE_Time* time) {
  platform.enter(__func__, "");
  *time = {7200, 250};
}

void TEE_GetREETime(TEE_Time* time) {
  platform.enter(__func__, "");
  *time = {1'700'000'000, 500};
}

void tee_trace(const char* function, int line, int level, const char* format, ...) {
  (void)line;
  char text[512];
  va_list arguments;
  va_start(arguments, format);
  (void)std::vsnprintf(text, sizeof text, format, arguments);
  va_end(arguments);
  platform.trace(level, fmt::format("{}: {}", function, text));
}
