// GlobalPlatform TEE Internal Core API 1.1.2: generic, transient and persistent objects (chapter 5).
#ifndef TEE_API_STORAGE_H_
#define TEE_API_STORAGE_H_

#include "tee_api_types.h"

#ifdef __cplusplus
extern "C" {
#endif

// Any object (5.5).
TEE_Result TEE_GetObjectInfo1(TEE_ObjectHandle object, TEE_ObjectInfo* objectInfo);
TEE_Result TEE_RestrictObjectUsage1(TEE_ObjectHandle object, uint32_t objectUsage);
TEE_Result TEE_GetObjectBufferAttribute(TEE_ObjectHandle object, uint32_t attributeID, void* buffer, uint32_t* size);
TEE_Result TEE_GetObjectValueAttribute(TEE_ObjectHandle object, uint32_t attributeID, uint32_t* a, uint32_t* b);
void TEE_CloseObject(TEE_ObjectHandle object);

// Transient objects (5.6). The caller frees with TEE_FreeTransientObject; the null handle is allowed there.
TEE_Result TEE_AllocateTransientObject(TEE_ObjectType objectType, uint32_t maxKeySize, TEE_ObjectHandle* object);
void TEE_FreeTransientObject(TEE_ObjectHandle object);
void TEE_ResetTransientObject(TEE_ObjectHandle object);
TEE_Result TEE_PopulateTransientObject(TEE_ObjectHandle object, const TEE_Attribute* attrs, uint32_t attrCount);
void TEE_InitRefAttribute(TEE_Attribute* attr, uint32_t attributeID, const void* buffer, uint32_t length);
void TEE_InitValueAttribute(TEE_Attribute* attr, uint32_t attributeID, uint32_t a, uint32_t b);
TEE_Result TEE_CopyObjectAttributes1(TEE_ObjectHandle destObject, TEE_ObjectHandle srcObject);
TEE_Result TEE_GenerateKey(TEE_ObjectHandle object, uint32_t keySize, const TEE_Attribute* params, uint32_t paramCount);

// Persistent objects (5.7). An open handle is closed with TEE_CloseObject, or deleted together with its object.
TEE_Result TEE_OpenPersistentObject(uint32_t storageID, const void* objectID, uint32_t objectIDLen, uint32_t flags,
                                    TEE_ObjectHandle* object);
TEE_Result TEE_CreatePersistentObject(uint32_t storageID, const void* objectID, uint32_t objectIDLen, uint32_t flags,
                                      TEE_ObjectHandle attributes, const void* initialData, uint32_t initialDataLen,
                                      TEE_ObjectHandle* object);
TEE_Result TEE_CloseAndDeletePersistentObject1(TEE_ObjectHandle object);
TEE_Result TEE_RenamePersistentObject(TEE_ObjectHandle object, const void* newObjectID, uint32_t newObjectIDLen);

// Data stream of a persistent object (5.9).
TEE_Result TEE_ReadObjectData(TEE_ObjectHandle object, void* buffer, uint32_t size, uint32_t* count);
TEE_Result TEE_WriteObjectData(TEE_ObjectHandle object, const void* buffer, uint32_t size);
TEE_Result TEE_TruncateObjectData(TEE_ObjectHandle object, uint32_t size);
TEE_Result TEE_SeekObjectData(TEE_ObjectHandle object, int32_t offset, TEE_Whence whence);

#ifdef __cplusplus
}
#endif

#endif  // TEE_API_STORAGE_H_
