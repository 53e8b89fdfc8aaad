#include "tee/crypto/transient_object.h"

namespace hosted_tee {

TEE_ObjectInfo transient_object::info() const {
  return {.objectType = type_.id,
          .keySize = material_.bits,
          .maxKeySize = max_bits_,
          .objectUsage = usage_,
          .dataSize = 0,
          .dataPosition = 0,
          .handleFlags = holds_key() ? TEE_HANDLE_FLAG_INITIALIZED : 0};
}

void transient_object::reset() {
  material_ = {};
  usage_ = every_usage;
}

object& find_object(const instance& self, TEE_ObjectHandle handle) {
  object* const found = self.objects.find(handle);
  panic_unless(found != nullptr, "not an open object");
  return *found;
}

transient_object& find_transient_object(const instance& self, TEE_ObjectHandle handle) {
  auto* const found = dynamic_cast<transient_object*>(&find_object(self, handle));
  panic_unless(found != nullptr, "not a transient object");
  return *found;
}

}  // namespace hosted_tee
