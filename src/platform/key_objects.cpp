#include "platform/key_objects.h"

#include "platform/trace.h"

namespace keymaster {
namespace {

TEE_Result allocate_traced(uint32_t type, uint32_t bits, object_handle& object) {
  const TEE_Result result = object.allocate(type, bits);
  if (result != TEE_SUCCESS) TRACE_ERROR("AllocateTransientObject failed with 0x%08x\n", result);
  return result;
}

}  // namespace

TEE_Result make_secret_object(uint32_t type, uint32_t bits, std::span<const uint8_t> value, object_handle& object) {
  if (TEE_Result r = allocate_traced(type, bits, object); r != TEE_SUCCESS) return r;
  TEE_Attribute secret;
  TEE_InitRefAttribute(&secret, TEE_ATTR_SECRET_VALUE, value.data(), static_cast<uint32_t>(value.size()));
  if (TEE_Result r = TEE_PopulateTransientObject(object.get(), &secret, 1); r != TEE_SUCCESS) {
    TRACE_ERROR("PopulateTransientObject failed with 0x%08x\n", r);
    return r;
  }
  return TEE_SUCCESS;
}

TEE_Result generate_secret_object(uint32_t type, uint32_t bits, object_handle& object) {
  if (TEE_Result r = allocate_traced(type, bits, object); r != TEE_SUCCESS) return r;
  if (TEE_Result r = TEE_GenerateKey(object.get(), bits, nullptr, 0); r != TEE_SUCCESS) {
    TRACE_ERROR("GenerateKey failed with 0x%08x\n", r);
    return r;
  }
  return TEE_SUCCESS;
}

TEE_Result read_secret_value(const object_handle& object, std::span<uint8_t> value, uint32_t* length) {
  *length = static_cast<uint32_t>(value.size());
  const TEE_Result result = TEE_GetObjectBufferAttribute(object.get(), TEE_ATTR_SECRET_VALUE, value.data(), length);
  if (result != TEE_SUCCESS) TRACE_ERROR("GetObjectBufferAttribute failed with 0x%08x\n", result);
  return result;
}

}  // namespace keymaster
