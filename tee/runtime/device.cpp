#include "tee/runtime/device.h"

#include <openssl/crypto.h>

#include "tee/storage/object_store.h"

namespace hosted_tee {

device_services::device_services() = default;
device_services::~device_services() {
  OPENSSL_cleanse(boot_seed.data(), boot_seed.size());
}

object_store* device_services::store(std::uint32_t storage) const {
  if (storage == TEE_STORAGE_PRIVATE) return private_store.get();
  return storage == TEE_STORAGE_RPMB ? rpmb_store.get() : nullptr;
}

}  // namespace hosted_tee
