// What the functions for persistent objects share: from what a TA passes to what the platform works on.
#ifndef TEE_STORAGE_API_ACCESS_H_
#define TEE_STORAGE_API_ACCESS_H_

#include <cstdint>
#include <span>

#include "tee/runtime/platform_call.h"
#include "tee/storage/persistent_object.h"

namespace hosted_tee {

/// persistent finds the open object behind `handle`. A handle of another kind, or one that was opened without the
/// access right, is a programmer error.
inline persistent_object& persistent(const instance& self, TEE_ObjectHandle handle, std::uint32_t access) {
  object* found = self.objects.find(handle);
  if (found == nullptr || !found->is_persistent()) panic("the handle is not that of an open persistent object");
  auto& open = static_cast<persistent_object&>(*found);
  if (!open.allows(access)) panic("the object was not opened with this access right");
  return open;
}

/// caller_bytes is the caller's bytes; null stands for none.
inline std::span<const std::uint8_t> caller_bytes(const void* data, std::uint32_t size) {
  if (data == nullptr && size != 0) panic("a buffer with a size is null");
  return {static_cast<const std::uint8_t*>(data), size};
}

}  // namespace hosted_tee

#endif  // TEE_STORAGE_API_ACCESS_H_
