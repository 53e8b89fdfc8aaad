// GlobalPlatform TEE Internal Core API 1.1.2: entry points of a TA, properties, memory, time, calls between TAs.
#ifndef TEE_API_TA_H_
#define TEE_API_TA_H_

#include "tee_api_types.h"

#ifdef __cplusplus
extern "C" {
#endif

#if defined(__GNUC__)
#define TA_EXPORT __attribute__((visibility("default")))
#define TEE_NORETURN __attribute__((noreturn))
#else
#define TA_EXPORT
#define TEE_NORETURN
#endif

// Entry points (4.3): the TA defines them, the platform calls them.
TEE_Result TA_EXPORT TA_CreateEntryPoint(void);
void TA_EXPORT TA_DestroyEntryPoint(void);
TEE_Result TA_EXPORT TA_OpenSessionEntryPoint(uint32_t paramTypes, TEE_Param params[4], void** sessionContext);
void TA_EXPORT TA_CloseSessionEntryPoint(void* sessionContext);
TEE_Result TA_EXPORT TA_InvokeCommandEntryPoint(void* sessionContext, uint32_t commandID, uint32_t paramTypes,
                                                TEE_Param params[4]);

// Properties (4.4). A name that is absent: TEE_ERROR_ITEM_NOT_FOUND; of another type: TEE_ERROR_BAD_FORMAT.
TEE_Result TEE_GetPropertyAsString(TEE_PropSetHandle propsetOrEnumerator, const char* name, char* valueBuffer,
                                   uint32_t* valueBufferLen);
TEE_Result TEE_GetPropertyAsBool(TEE_PropSetHandle propsetOrEnumerator, const char* name, bool* value);
TEE_Result TEE_GetPropertyAsU32(TEE_PropSetHandle propsetOrEnumerator, const char* name, uint32_t* value);
TEE_Result TEE_GetPropertyAsBinaryBlock(TEE_PropSetHandle propsetOrEnumerator, const char* name, void* valueBuffer,
                                        uint32_t* valueBufferLen);
TEE_Result TEE_GetPropertyAsUUID(TEE_PropSetHandle propsetOrEnumerator, const char* name, TEE_UUID* value);
TEE_Result TEE_GetPropertyAsIdentity(TEE_PropSetHandle propsetOrEnumerator, const char* name, TEE_Identity* value);

// Panic (4.8): ends the calling instance; its sessions answer TEE_ERROR_TARGET_DEAD from then on.
void TEE_NORETURN TEE_Panic(TEE_Result panicCode);

// Calls to another TA (4.9). A memory reference that is passed on stays the caller's.
TEE_Result TEE_OpenTASession(const TEE_UUID* destination, uint32_t cancellationRequestTimeout, uint32_t paramTypes,
                             TEE_Param params[4], TEE_TASessionHandle* session, uint32_t* returnOrigin);
void TEE_CloseTASession(TEE_TASessionHandle session);
TEE_Result TEE_InvokeTACommand(TEE_TASessionHandle session, uint32_t cancellationRequestTimeout, uint32_t commandID,
                               uint32_t paramTypes, TEE_Param params[4], uint32_t* returnOrigin);

// Memory (4.11). TEE_Malloc and TEE_Realloc answer NULL when the instance's heap is exhausted; new bytes are zero with
// TEE_MALLOC_FILL_ZERO. The caller frees with TEE_Free; NULL is allowed there.
TEE_Result TEE_CheckMemoryAccessRights(uint32_t accessFlags, void* buffer, uint32_t size);
void TEE_SetInstanceData(const void* instanceData);
const void* TEE_GetInstanceData(void);
void* TEE_Malloc(uint32_t size, uint32_t hint);
void* TEE_Realloc(void* buffer, uint32_t newSize);
void TEE_Free(void* buffer);
void TEE_MemMove(void* dest, const void* src, uint32_t size);
int32_t TEE_MemCompare(const void* buffer1, const void* buffer2, uint32_t size);
void TEE_MemFill(void* buffer, uint32_t x, uint32_t size);

// Time (7.2). System time counts from an arbitrary origin and never goes back; REE time is the normal world's claim.
void TEE_GetSystemTime(TEE_Time* time);
TEE_Result TEE_Wait(uint32_t timeout);
TEE_Result TEE_GetTAPersistentTime(TEE_Time* time);
TEE_Result TEE_SetTAPersistentTime(const TEE_Time* time);
void TEE_GetREETime(TEE_Time* time);

#ifdef __cplusplus
}
#endif

#endif  // TEE_API_TA_H_
