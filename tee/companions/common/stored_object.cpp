#include "tee/companions/common/stored_object.h"

#include "platform/handles.h"
#include "platform/trace.h"

namespace keymaster::companion {
namespace {

TEE_Result open_for_reading(std::string_view name, persistent_object& object) {
  return object.open(TEE_STORAGE_PRIVATE, name.data(), static_cast<uint32_t>(name.size()), TEE_DATA_FLAG_ACCESS_READ);
}

TEE_Result read_all(const persistent_object& object, uint32_t limit, secret_bytes& data) {
  if (!data.allocate(limit)) return TEE_ERROR_OUT_OF_MEMORY;
  uint32_t count = 0;
  if (TEE_Result r = object.read(data.data(), limit, &count); r != TEE_SUCCESS) return r;
  data.shorten(count);
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result is_stored(std::string_view name, bool* there) {
  persistent_object object;
  const TEE_Result result = open_for_reading(name, object);
  *there = result == TEE_SUCCESS;
  return result == TEE_ERROR_ITEM_NOT_FOUND ? TEE_SUCCESS : result;
}

TEE_Result read_stored(std::string_view name, uint32_t limit, secret_bytes& data) {
  data.reset();
  persistent_object object;
  if (TEE_Result r = open_for_reading(name, object); r != TEE_SUCCESS) return r;
  const TEE_Result result = read_all(object, limit, data);
  if (result != TEE_SUCCESS) {
    TRACE_ERROR("Read stored object failed with 0x%08x\n", result);
    data.reset();
  }
  return result;
}

TEE_Result write_stored(std::string_view name, std::span<const uint8_t> data) {
  persistent_object object;
  const TEE_Result result = object.create(TEE_STORAGE_PRIVATE, name.data(), static_cast<uint32_t>(name.size()),
                                          TEE_DATA_FLAG_ACCESS_WRITE | TEE_DATA_FLAG_OVERWRITE, data.data(),
                                          static_cast<uint32_t>(data.size()));
  if (result != TEE_SUCCESS) TRACE_ERROR("Write stored object failed with 0x%08x\n", result);
  return result;
}

}  // namespace keymaster::companion
