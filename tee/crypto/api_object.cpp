// Generic object functions (section 5.5 of the API).
#include "tee/crypto/transient_object.h"

using namespace hosted_tee;  // NOLINT(google-build-using-namespace): the file holds nothing but the API's C functions

namespace {

/// keyed_object is the object whose attributes are asked for. Persistent objects of this platform are data alone, so
/// they have none: null.
const transient_object* keyed_object(const instance& self, TEE_ObjectHandle handle) {
  const object& found = find_object(self, handle);
  if (found.is_persistent()) return nullptr;
  const auto& transient = dynamic_cast<const transient_object&>(found);
  panic_unless(transient.holds_key(), "the object holds no key");
  return &transient;
}

/// attribute_of gives the attribute, or refuses with TEE_ERROR_ITEM_NOT_FOUND. A protected attribute of an object that
/// isn't extractable is the TA's mistake.
const stored_attribute& attribute_of(const instance& self, TEE_ObjectHandle handle, std::uint32_t id) {
  const transient_object* const holder = keyed_object(self, handle);
  refuse_unless(holder != nullptr, TEE_ERROR_ITEM_NOT_FOUND);
  panic_unless((id & TEE_ATTR_FLAG_PUBLIC) != 0 || (holder->usage() & TEE_USAGE_EXTRACTABLE) != 0,
               "the attribute may not be extracted");
  const stored_attribute* const found = holder->material().find(id);
  refuse_unless(found != nullptr, TEE_ERROR_ITEM_NOT_FOUND);
  return *found;
}

}  // namespace

extern "C" {

TEE_Result TEE_GetObjectInfo1(TEE_ObjectHandle object, TEE_ObjectInfo* objectInfo) {
  return crypto_call(__func__, nullptr, [&](instance& self) {
    panic_unless(objectInfo != nullptr, "no place for the information");
    *objectInfo = find_object(self, object).info();
  });
}

TEE_Result TEE_RestrictObjectUsage1(TEE_ObjectHandle object, uint32_t objectUsage) {
  return crypto_call(__func__, nullptr, [&](instance& self) {
    refuse_unless(!find_object(self, object).is_persistent(), TEE_ERROR_NOT_SUPPORTED);
    find_transient_object(self, object).restrict_usage(objectUsage);
  });
}

TEE_Result TEE_GetObjectBufferAttribute(TEE_ObjectHandle object, uint32_t attributeID, void* buffer, uint32_t* size) {
  return crypto_call(__func__, size, [&](instance& self) {
    panic_unless(!is_value_attribute(attributeID), "not a buffer attribute");
    const output destination(buffer, size);
    destination.put(attribute_of(self, object, attributeID).bytes);
  });
}

TEE_Result TEE_GetObjectValueAttribute(TEE_ObjectHandle object, uint32_t attributeID, uint32_t* a, uint32_t* b) {
  return crypto_call(__func__, nullptr, [&](instance& self) {
    panic_unless(is_value_attribute(attributeID), "not a value attribute");
    const stored_attribute& found = attribute_of(self, object, attributeID);
    if (a != nullptr) *a = found.a;
    if (b != nullptr) *b = found.b;
  });
}

void TEE_CloseObject(TEE_ObjectHandle object) {
  platform_call_void(__func__, [&](instance& self) {
    if (object == TEE_HANDLE_NULL) return;
    panic_unless(self.objects.erase(object), "not an open object");
  });
}

}  // extern "C"
