#include "platform/key_objects.h"

#include "platform/trace.h"

namespace keymaster {
namespace {

TEE_Result allocate_object(uint32_t type, uint32_t bits, object_handle& object) {
  const TEE_Result result = object.allocate(type, bits);
  if (result != TEE_SUCCESS) TRACE_ERROR("AllocateTransientObject failed with 0x%08x\n", result);
  return result;
}

TEE_Result allocate_operation(uint32_t algorithm, uint32_t mode, uint32_t bits, operation_handle& operation) {
  const TEE_Result result = operation.allocate(algorithm, mode, bits);
  if (result != TEE_SUCCESS) TRACE_ERROR("AllocateOperation failed with 0x%08x\n", result);
  return result;
}

}  // namespace

TEE_Result populate_object(uint32_t type, uint32_t bits, std::span<const TEE_Attribute> attributes,
                           object_handle& object) {
  if (TEE_Result r = allocate_object(type, bits, object); r != TEE_SUCCESS) return r;
  const TEE_Result result =
      TEE_PopulateTransientObject(object.get(), attributes.data(), static_cast<uint32_t>(attributes.size()));
  if (result != TEE_SUCCESS) TRACE_ERROR("PopulateTransientObject failed with 0x%08x\n", result);
  return result;
}

TEE_Result generate_object(uint32_t type, uint32_t bits, std::span<const TEE_Attribute> parameters,
                           object_handle& object) {
  if (TEE_Result r = allocate_object(type, bits, object); r != TEE_SUCCESS) return r;
  const TEE_Result result = TEE_GenerateKey(object.get(), bits, parameters.empty() ? nullptr : parameters.data(),
                                            static_cast<uint32_t>(parameters.size()));
  if (result != TEE_SUCCESS) TRACE_ERROR("GenerateKey failed with 0x%08x\n", result);
  return result;
}

TEE_Result make_secret_object(uint32_t type, uint32_t bits, std::span<const uint8_t> value, object_handle& object) {
  TEE_Attribute secret;
  TEE_InitRefAttribute(&secret, TEE_ATTR_SECRET_VALUE, value.data(), static_cast<uint32_t>(value.size()));
  return populate_object(type, bits, {&secret, 1}, object);
}

TEE_Result read_attribute(const object_handle& object, uint32_t attribute, std::span<uint8_t> place, uint32_t* length) {
  *length = static_cast<uint32_t>(place.size());
  const TEE_Result result = TEE_GetObjectBufferAttribute(object.get(), attribute, place.data(), length);
  if (result != TEE_SUCCESS) TRACE_ERROR("GetObjectBufferAttribute failed with 0x%08x\n", result);
  return result;
}

TEE_Result make_operation(uint32_t algorithm, uint32_t mode, uint32_t bits, const object_handle& key,
                          operation_handle& operation) {
  if (TEE_Result r = allocate_operation(algorithm, mode, bits, operation); r != TEE_SUCCESS) return r;
  const TEE_Result result = TEE_SetOperationKey(operation.get(), key.get());
  if (result != TEE_SUCCESS) TRACE_ERROR("SetOperationKey failed with 0x%08x\n", result);
  return result;
}

TEE_Result make_digest_operation(uint32_t algorithm, operation_handle& operation) {
  return allocate_operation(algorithm, TEE_MODE_DIGEST, 0, operation);
}

}  // namespace keymaster
