// Persistent objects of the Internal Core API 1.1.2 (5.7): open, create, delete, rename.
#include "tee/runtime/device.h"
#include "tee/storage/api_access.h"

namespace hosted_tee {
namespace {

constexpr std::uint32_t access_and_share_flags = TEE_DATA_FLAG_ACCESS_READ | TEE_DATA_FLAG_ACCESS_WRITE |
                                                 TEE_DATA_FLAG_ACCESS_WRITE_META | TEE_DATA_FLAG_SHARE_READ |
                                                 TEE_DATA_FLAG_SHARE_WRITE;

// A storage that the device does not have holds no object.
object_store& store_of(const instance& self, std::uint32_t storage) {
  object_store* store = self.device.store(storage);
  if (store == nullptr) throw call_failure(TEE_ERROR_ITEM_NOT_FOUND);
  return *store;
}

object_key key_of(const instance& self, const void* id, std::uint32_t length) {
  if (length > TEE_OBJECT_ID_MAX_LEN) panic("an object identifier is longer than 64 bytes");
  if (id == nullptr && length != 0) panic("an object identifier is null");
  return {to_bytes(self.uuid), std::string(static_cast<const char*>(id), length)};
}

void require_known(std::uint32_t flags, std::uint32_t known) {
  if ((flags & ~known) != 0) throw call_failure(TEE_ERROR_BAD_PARAMETERS);
}

TEE_Result open_object(instance& self, std::uint32_t storage, const object_key& key, std::uint32_t flags,
                       TEE_ObjectHandle* object) {
  require_known(flags, access_and_share_flags);
  object_store& store = store_of(self, storage);
  // The row is opened, not only looked for: a corrupt object is told at once.
  if (!store.read(key)) return TEE_ERROR_ITEM_NOT_FOUND;
  if (!may_open(store, key, flags)) return TEE_ERROR_ACCESS_CONFLICT;
  *object = self.objects.insert(std::make_unique<persistent_object>(store, key, flags));
  return TEE_SUCCESS;
}

TEE_Result create_object(instance& self, std::uint32_t storage, const object_key& key, std::uint32_t flags,
                         std::span<const std::uint8_t> data, TEE_ObjectHandle* object) {
  require_known(flags, access_and_share_flags | TEE_DATA_FLAG_OVERWRITE);
  object_store& store = store_of(self, storage);
  if (!store.handles_on(key).empty()) return TEE_ERROR_ACCESS_CONFLICT;
  if ((flags & TEE_DATA_FLAG_OVERWRITE) == 0 && store.contains(key)) return TEE_ERROR_ACCESS_CONFLICT;
  auto created = std::make_unique<persistent_object>(store, key, flags & access_and_share_flags);
  store.write(key, data);
  *object = self.objects.insert(std::move(created));
  return TEE_SUCCESS;
}

// This version keeps data streams only; objects with attributes (keys) are told apart from bad handles all the same.
TEE_Result refuse_attributes(const instance& self, TEE_ObjectHandle attributes) {
  if (attributes == TEE_HANDLE_NULL) return TEE_SUCCESS;
  if (self.objects.find(attributes) == nullptr) panic("attributes is not an object");
  return TEE_ERROR_NOT_SUPPORTED;
}

}  // namespace

extern "C" {

TEE_Result TEE_OpenPersistentObject(uint32_t storageID, const void* objectID, uint32_t objectIDLen, uint32_t flags,
                                    TEE_ObjectHandle* object) {
  if (object != nullptr) *object = TEE_HANDLE_NULL;
  return platform_call("TEE_OpenPersistentObject", nullptr, [&](instance& self) {
    if (object == nullptr) panic("object is null");
    return open_object(self, storageID, key_of(self, objectID, objectIDLen), flags, object);
  });
}

TEE_Result TEE_CreatePersistentObject(uint32_t storageID, const void* objectID, uint32_t objectIDLen, uint32_t flags,
                                      TEE_ObjectHandle attributes, const void* initialData, uint32_t initialDataLen,
                                      TEE_ObjectHandle* object) {
  if (object != nullptr) *object = TEE_HANDLE_NULL;
  return platform_call("TEE_CreatePersistentObject", nullptr, [&](instance& self) {
    if (object == nullptr) panic("object is null");
    const object_key key = key_of(self, objectID, objectIDLen);
    if (const TEE_Result r = refuse_attributes(self, attributes); r != TEE_SUCCESS) return r;
    return create_object(self, storageID, key, flags, caller_bytes(initialData, initialDataLen), object);
  });
}

TEE_Result TEE_CloseAndDeletePersistentObject1(TEE_ObjectHandle object) {
  return platform_call("TEE_CloseAndDeletePersistentObject1", nullptr, [&](instance& self) {
    if (object == TEE_HANDLE_NULL) return TEE_SUCCESS;
    persistent_object& open = persistent(self, object, TEE_DATA_FLAG_ACCESS_WRITE_META);
    TEE_Result result = TEE_SUCCESS;
    try {
      open.remove();
    } catch (const call_failure& failure) {
      result = failure.code();
    }
    self.objects.erase(object);  // the handle is closed whether or not the object could be deleted
    return result;
  });
}

TEE_Result TEE_RenamePersistentObject(TEE_ObjectHandle object, const void* newObjectID, uint32_t newObjectIDLen) {
  return platform_call("TEE_RenamePersistentObject", nullptr, [&](instance& self) {
    persistent_object& open = persistent(self, object, TEE_DATA_FLAG_ACCESS_WRITE_META);
    open.rename(key_of(self, newObjectID, newObjectIDLen).id);
    return TEE_SUCCESS;
  });
}

}  // extern "C"

}  // namespace hosted_tee
