// The data stream of a persistent object (Internal Core API 1.1.2, 5.9).
#include "tee/storage/api_access.h"

namespace hosted_tee {
namespace {

std::int64_t origin_of(const persistent_object& object, TEE_Whence whence) {
  switch (whence) {
    case TEE_DATA_SEEK_SET:
      return 0;
    case TEE_DATA_SEEK_CUR:
      return object.position();
    case TEE_DATA_SEEK_END:
      return object.size();
  }
  panic("whence is none of the three");
}

}  // namespace

extern "C" {

TEE_Result TEE_ReadObjectData(TEE_ObjectHandle object, void* buffer, uint32_t size, uint32_t* count) {
  return platform_call("TEE_ReadObjectData", count, [&](instance& self) {
    persistent_object& open = persistent(self, object, TEE_DATA_FLAG_ACCESS_READ);
    if (count == nullptr) panic("count is null");
    if (buffer == nullptr && size != 0) panic("a buffer with a size is null");
    *count = 0;
    *count = open.read({static_cast<std::uint8_t*>(buffer), size});
    return TEE_SUCCESS;
  });
}

TEE_Result TEE_WriteObjectData(TEE_ObjectHandle object, const void* buffer, uint32_t size) {
  return platform_call("TEE_WriteObjectData", nullptr, [&](instance& self) {
    persistent(self, object, TEE_DATA_FLAG_ACCESS_WRITE).write(caller_bytes(buffer, size));
    return TEE_SUCCESS;
  });
}

TEE_Result TEE_TruncateObjectData(TEE_ObjectHandle object, uint32_t size) {
  return platform_call("TEE_TruncateObjectData", nullptr, [&](instance& self) {
    persistent(self, object, TEE_DATA_FLAG_ACCESS_WRITE).truncate(size);
    return TEE_SUCCESS;
  });
}

TEE_Result TEE_SeekObjectData(TEE_ObjectHandle object, int32_t offset, TEE_Whence whence) {
  return platform_call("TEE_SeekObjectData", nullptr, [&](instance& self) {
    persistent_object& open = persistent(self, object, 0);
    open.seek(origin_of(open, whence) + offset);
    return TEE_SUCCESS;
  });
}

}  // extern "C"

}  // namespace hosted_tee
