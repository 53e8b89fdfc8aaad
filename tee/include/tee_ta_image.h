// What a loader reads in a TA image: the header record and the property table, and the platform's entry layer that the
// header points at.
#ifndef TEE_TA_IMAGE_H_
#define TEE_TA_IMAGE_H_

#include "tee_internal_api.h"

#ifdef __cplusplus
extern "C" {
#endif

// Flags of the header record.
#define TEE_TA_FLAG_USER_MODE 0x1u
#define TEE_TA_FLAG_EXEC_DDR 0x2u
#define TEE_TA_FLAG_SINGLE_INSTANCE 0x4u
#define TEE_TA_FLAG_MULTI_SESSION 0x8u

typedef TEE_Result (*tee_open_session_entry)(uint32_t paramTypes, TEE_Param params[4], void** sessionContext);
typedef void (*tee_close_session_entry)(void* sessionContext);
typedef TEE_Result (*tee_invoke_command_entry)(void* sessionContext, uint32_t commandID, uint32_t paramTypes,
                                               TEE_Param params[4]);

/// The header record, in section `.ta_head`: the first bytes of the loaded image, 36 of them on a 32-bit processor.
typedef struct {
  TEE_UUID uuid;
  uint32_t stack_size;
  uint32_t flags;
  tee_open_session_entry open_session;
  tee_close_session_entry close_session;
  tee_invoke_command_entry invoke_command;
} tee_ta_head;

// The entry layer: the platform defines it. It enters the TA (creating the instance with TA_CreateEntryPoint before the
// first session, destroying it after the last) and calls the entry point of the same meaning.
TEE_Result tee_entry_open_session(uint32_t paramTypes, TEE_Param params[4], void** sessionContext);
void tee_entry_close_session(void* sessionContext);
TEE_Result tee_entry_invoke_command(void* sessionContext, uint32_t commandID, uint32_t paramTypes, TEE_Param params[4]);

typedef enum { TEE_TA_PROPERTY_BOOL = 0, TEE_TA_PROPERTY_U32 = 1, TEE_TA_PROPERTY_STRING = 2 } tee_ta_property_type;

/// One property that the platform reports for the TA (TEE_PROPSET_CURRENT_TA). A bool stands in `number` as 0 or 1.
typedef struct {
  const char* name;
  uint32_t type;
  uint32_t number;
  const char* text;
} tee_ta_property;

#if defined(__GNUC__)
#define TA_HEAD_SECTION __attribute__((section(".ta_head")))
#else
#define TA_HEAD_SECTION
#endif

/// The image's header record and its properties; the table ends with an entry whose name is null. The section belongs
/// to the declaration: a definition in a section of its own would be another variable's to some compilers.
extern const tee_ta_head TA_EXPORT TA_HEAD_SECTION ta_head;
extern const tee_ta_property TA_EXPORT ta_properties[];

#ifdef __cplusplus
}
#endif

#endif  // TEE_TA_IMAGE_H_
