// GlobalPlatform TEE Client API, version 1.0 (GPD_SPE_007), with the errata of 1.0: how a program of the normal world
// reaches a TA. Names, numbers and prototypes are the standard's; only the members named `imp` are this
// implementation's own, and a program must not look into them.
#ifndef TEE_CLIENT_API_H_
#define TEE_CLIENT_API_H_

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#define TEEC_CONFIG_SHAREDMEM_MAX_SIZE 0x08000000u

typedef uint32_t TEEC_Result;

typedef struct {
  uint32_t timeLow;
  uint16_t timeMid;
  uint16_t timeHiAndVersion;
  uint8_t clockSeqAndNode[8];
} TEEC_UUID;

typedef struct {
  void* imp;
} TEEC_Context;

typedef struct {
  void* imp;
} TEEC_Session;

typedef struct {
  void* buffer;
  size_t size;
  uint32_t flags;
  struct {
    void* context;
    void* block;
  } imp;
} TEEC_SharedMemory;

/// Memory of the client's own for one operation. A null `buffer` makes the null reference, whatever `size` says: the TA
/// sees a null pointer and no bytes. Of an output, `size` is afterwards what the TA left there.
typedef struct {
  void* buffer;
  size_t size;  ///< in bytes
} TEEC_TempMemoryReference;

typedef struct {
  TEEC_SharedMemory* parent;
  size_t size;
  size_t offset;
} TEEC_RegisteredMemoryReference;

typedef struct {
  uint32_t a;
  uint32_t b;
} TEEC_Value;

typedef union {
  TEEC_TempMemoryReference tmpref;
  TEEC_RegisteredMemoryReference memref;
  TEEC_Value value;
} TEEC_Parameter;

typedef struct {
  uint32_t started;
  uint32_t paramTypes;
  TEEC_Parameter params[4];
  struct {
    TEEC_Session* session;
  } imp;
} TEEC_Operation;

// Return codes (4.4.2).
#define TEEC_SUCCESS 0x00000000u
#define TEEC_ERROR_GENERIC 0xFFFF0000u
#define TEEC_ERROR_ACCESS_DENIED 0xFFFF0001u
#define TEEC_ERROR_CANCEL 0xFFFF0002u
#define TEEC_ERROR_ACCESS_CONFLICT 0xFFFF0003u
#define TEEC_ERROR_EXCESS_DATA 0xFFFF0004u
#define TEEC_ERROR_BAD_FORMAT 0xFFFF0005u
#define TEEC_ERROR_BAD_PARAMETERS 0xFFFF0006u
#define TEEC_ERROR_BAD_STATE 0xFFFF0007u
#define TEEC_ERROR_ITEM_NOT_FOUND 0xFFFF0008u
#define TEEC_ERROR_NOT_IMPLEMENTED 0xFFFF0009u
#define TEEC_ERROR_NOT_SUPPORTED 0xFFFF000Au
#define TEEC_ERROR_NO_DATA 0xFFFF000Bu
#define TEEC_ERROR_OUT_OF_MEMORY 0xFFFF000Cu
#define TEEC_ERROR_BUSY 0xFFFF000Du
#define TEEC_ERROR_COMMUNICATION 0xFFFF000Eu
#define TEEC_ERROR_SECURITY 0xFFFF000Fu
#define TEEC_ERROR_SHORT_BUFFER 0xFFFF0010u
#define TEEC_ERROR_EXTERNAL_CANCEL 0xFFFF0011u
#define TEEC_ERROR_TARGET_DEAD 0xFFFF3024u

// Return code origins (4.4.3).
#define TEEC_ORIGIN_API 0x00000001u
#define TEEC_ORIGIN_COMMS 0x00000002u
#define TEEC_ORIGIN_TEE 0x00000003u
#define TEEC_ORIGIN_TRUSTED_APP 0x00000004u

// Shared memory flags (4.4.4).
#define TEEC_MEM_INPUT 0x00000001u
#define TEEC_MEM_OUTPUT 0x00000002u

// Parameter types (4.4.5).
#define TEEC_NONE 0x00000000u
#define TEEC_VALUE_INPUT 0x00000001u
#define TEEC_VALUE_OUTPUT 0x00000002u
#define TEEC_VALUE_INOUT 0x00000003u
#define TEEC_MEMREF_TEMP_INPUT 0x00000005u
#define TEEC_MEMREF_TEMP_OUTPUT 0x00000006u
#define TEEC_MEMREF_TEMP_INOUT 0x00000007u
#define TEEC_MEMREF_WHOLE 0x0000000Cu
#define TEEC_MEMREF_PARTIAL_INPUT 0x0000000Du
#define TEEC_MEMREF_PARTIAL_OUTPUT 0x0000000Eu
#define TEEC_MEMREF_PARTIAL_INOUT 0x0000000Fu
#define TEEC_PARAM_TYPES(t0, t1, t2, t3) (0u | (t0) | ((t1) << 4) | ((t2) << 8) | ((t3) << 12))
#define TEEC_PARAM_TYPE_GET(types, i) (((types) >> ((i)*4)) & 0xFu)

// Session login methods (4.4.6).
#define TEEC_LOGIN_PUBLIC 0x00000000u
#define TEEC_LOGIN_USER 0x00000001u
#define TEEC_LOGIN_GROUP 0x00000002u
#define TEEC_LOGIN_APPLICATION 0x00000004u
#define TEEC_LOGIN_USER_APPLICATION 0x00000005u
#define TEEC_LOGIN_GROUP_APPLICATION 0x00000006u

/// TEEC_InitializeContext connects to a TEE. `name` chooses the way in: "embedded:FOLDER" runs the hosted TEE on that
/// state folder inside the calling process; "unix:PATH" reaches the server that listens at PATH; NULL takes the name in
/// the environment variable KEYMASTER_TEE, or the default state folder. TEEC_ERROR_BAD_PARAMETERS for another form, and
/// for a folder that holds something else than a device's state, TEEC_ERROR_BUSY when another process holds the folder,
/// TEEC_ERROR_BAD_STATE when a newer version wrote it, TEEC_ERROR_BAD_FORMAT when one of its text files (`settings`,
/// for one) can't be parsed, TEEC_ERROR_SECURITY when its content does not authenticate, TEEC_ERROR_GENERIC when it
/// can't be used for another reason. Of a server: TEEC_ERROR_BAD_PARAMETERS for a path that no socket can have,
/// TEEC_ERROR_COMMUNICATION when nobody serves it, TEEC_ERROR_ACCESS_DENIED when its permissions forbid it,
/// TEEC_ERROR_BUSY when it takes no more connections, TEEC_ERROR_NOT_SUPPORTED when it speaks another version of the
/// wire. KEYMASTER_TRACE has the reason printed.
TEEC_Result TEEC_InitializeContext(const char* name, TEEC_Context* context);
void TEEC_FinalizeContext(TEEC_Context* context);

TEEC_Result TEEC_RegisterSharedMemory(TEEC_Context* context, TEEC_SharedMemory* sharedMem);
TEEC_Result TEEC_AllocateSharedMemory(TEEC_Context* context, TEEC_SharedMemory* sharedMem);
void TEEC_ReleaseSharedMemory(TEEC_SharedMemory* sharedMem);

TEEC_Result TEEC_OpenSession(TEEC_Context* context, TEEC_Session* session, const TEEC_UUID* destination,
                             uint32_t connectionMethod, const void* connectionData, TEEC_Operation* operation,
                             uint32_t* returnOrigin);
void TEEC_CloseSession(TEEC_Session* session);
TEEC_Result TEEC_InvokeCommand(TEEC_Session* session, uint32_t commandID, TEEC_Operation* operation,
                               uint32_t* returnOrigin);
void TEEC_RequestCancellation(TEEC_Operation* operation);

#ifdef __cplusplus
}
#endif

#endif  // TEE_CLIENT_API_H_
