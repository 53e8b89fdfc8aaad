#include "tee/companions/common/keyed_mac.h"

#include "platform/key_objects.h"
#include "platform/trace.h"
#include "platform/wipe.h"

namespace keymaster::companion {

TEE_Result keyed_mac::prepare(std::span<const uint8_t, mac_size> key) {
  object_handle object;
  if (TEE_Result r = make_secret_object(TEE_TYPE_HMAC_SHA256, mac_size * 8, key, object); r != TEE_SUCCESS) return r;
  return make_operation(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, mac_size * 8, object, operation_);
}

TEE_Result keyed_mac::compute(std::span<const uint8_t> head, std::span<const uint8_t> tail,
                              std::span<uint8_t, mac_size> mac) {
  TEE_MACInit(operation_.get(), nullptr, 0);
  TEE_MACUpdate(operation_.get(), head.data(), static_cast<uint32_t>(head.size()));
  uint32_t length = mac_size;
  TEE_Result result =
      TEE_MACComputeFinal(operation_.get(), tail.data(), static_cast<uint32_t>(tail.size()), mac.data(), &length);
  if (result == TEE_SUCCESS && length != mac_size) result = TEE_ERROR_GENERIC;
  if (result == TEE_SUCCESS) return TEE_SUCCESS;
  TRACE_ERROR("MACComputeFinal failed with 0x%08x, %u bytes\n", result, length);
  wipe(mac.data(), mac.size());
  return result;
}

}  // namespace keymaster::companion
