#include "tests/keystore/platform_spy.h"

#include <dlfcn.h>

#include <cstdlib>
#include <utility>

using namespace testing_support;

namespace testing_support {

platform_spy spy;

namespace {

bytes copy_of(const void* data, std::uint32_t size) {
  const auto* const first = static_cast<const std::uint8_t*>(data);
  return {first, first + size};
}

/// The hosted TEE's definition of `function`, which this program's own hides.
template <class Function>
Function* hosted(Function* /*function*/, const char* name) {
  void* const found = dlsym(RTLD_NEXT, name);
  if (found == nullptr) std::abort();
  return reinterpret_cast<Function*>(found);
}

}  // namespace
}  // namespace testing_support

TEE_Result TEE_OpenPersistentObject(uint32_t storageID, const void* objectID, uint32_t objectIDLen, uint32_t flags,
                                    TEE_ObjectHandle* object) {
  spy.opened.push_back({storageID, copy_of(objectID, objectIDLen), flags});
  return hosted(TEE_OpenPersistentObject, __func__)(storageID, objectID, objectIDLen, flags, object);
}

TEE_Result TEE_CreatePersistentObject(uint32_t storageID, const void* objectID, uint32_t objectIDLen, uint32_t flags,
                                      TEE_ObjectHandle attributes, const void* initialData, uint32_t initialDataLen,
                                      TEE_ObjectHandle* object) {
  spy.created.push_back({storageID, copy_of(objectID, objectIDLen), flags, attributes != TEE_HANDLE_NULL,
                         copy_of(initialData, initialDataLen)});
  return hosted(TEE_CreatePersistentObject, __func__)(storageID, objectID, objectIDLen, flags, attributes, initialData,
                                                      initialDataLen, object);
}

TEE_Result TEE_AEInit(TEE_OperationHandle operation, const void* nonce, uint32_t nonceLen, uint32_t tagLen,
                      uint32_t AADLen, uint32_t payloadLen) {
  spy.ae_started.push_back({copy_of(nonce, nonceLen), tagLen, AADLen, payloadLen});
  return hosted(TEE_AEInit, __func__)(operation, nonce, nonceLen, tagLen, AADLen, payloadLen);
}

TEE_Result TEE_AEUpdate(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen, void* destData,
                        uint32_t* destLen) {
  spy.encrypted.push_back(copy_of(srcData, srcLen));
  return hosted(TEE_AEUpdate, __func__)(operation, srcData, srcLen, destData, destLen);
}

TEE_Result TEE_AEEncryptFinal(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen, void* destData,
                              uint32_t* destLen, void* tag, uint32_t* tagLen) {
  const TEE_Result result =
      hosted(TEE_AEEncryptFinal, __func__)(operation, srcData, srcLen, destData, destLen, tag, tagLen);
  if (spy.falsify_tag_length) *tagLen = *std::exchange(spy.falsify_tag_length, std::nullopt);
  return result;
}

TEE_Result TEE_AEDecryptFinal(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen, void* destData,
                              uint32_t* destLen, void* tag, uint32_t tagLen) {
  spy.final_rooms.push_back(*destLen);
  return hosted(TEE_AEDecryptFinal, __func__)(operation, srcData, srcLen, destData, destLen, tag, tagLen);
}
