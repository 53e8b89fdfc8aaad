#include "soter/soter_counter.h"

#include <cstring>

#include "platform/byte_order.h"
#include "platform/handles.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

constexpr uint32_t counter_size = sizeof(uint64_t);
constexpr uint32_t counter_flags = TEE_DATA_FLAG_ACCESS_READ | TEE_DATA_FLAG_ACCESS_WRITE;

TEE_Result open_existing(persistent_object& object) {
  return object.open(TEE_STORAGE_PRIVATE, SOTER_COUNTER_OBJECT, sizeof SOTER_COUNTER_OBJECT, counter_flags);
}

}  // namespace

// Kept in one piece: its lines are told apart by the function's name.
TEE_Result increase_and_get_counter(uint64_t* counter_out) {
  *counter_out = 0;
  uint8_t bytes[counter_size] = {};
  persistent_object object;
  // What else an open can fail with shows when the object is read.
  if (open_existing(object) == TEE_ERROR_ITEM_NOT_FOUND) {
    TRACE_INFO("No counter object, we need create one\n");
    if (object.create(TEE_STORAGE_PRIVATE, SOTER_COUNTER_OBJECT, sizeof SOTER_COUNTER_OBJECT, counter_flags, bytes,
                      counter_size) == TEE_SUCCESS) {
      TRACE_INFO("Create counter object success\n");
    } else {
      TRACE_INFO("retry to open counter object");
      if (TEE_Result r = open_existing(object); r != TEE_SUCCESS) return r;
    }
  }
  uint32_t read = 0;
  if (TEE_Result r = object.read(bytes, counter_size, &read); r != TEE_SUCCESS) return r;
  if (read != counter_size) {
    TRACE_ERROR("counter object is not %d bytes, %d bytes\n", counter_size, read);
    return TEE_ERROR_BAD_STATE;
  }
  const uint64_t counter = load_u64(bytes) + 1;
  std::memcpy(bytes, &counter, sizeof counter);
  if (TEE_Result r = TEE_SeekObjectData(object.get(), 0, TEE_DATA_SEEK_SET); r != TEE_SUCCESS) {
    TRACE_ERROR("seek pos to the beginning error\n");
    return r;
  }
  if (TEE_Result r = TEE_WriteObjectData(object.get(), bytes, counter_size); r != TEE_SUCCESS) {
    TRACE_ERROR("write object error\n");
    return r;
  }
  *counter_out = counter;
  return TEE_SUCCESS;
}

}  // namespace keymaster
