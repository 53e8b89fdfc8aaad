// The header record: what a loader reads before anything else. It stands alone in its object, so that a program which
// links the TA as a library, and has no entry layer, need not take it.
#include "params/keymaster_protocol.h"
#include "ta/ta_limits.h"
#include "tee_ta_image.h"

extern "C" __attribute__((used)) const tee_ta_head ta_head = {
    KEYMASTER_TA_UUID,
    keymaster::ta_stack_size,
    TEE_TA_FLAG_USER_MODE | TEE_TA_FLAG_EXEC_DDR | TEE_TA_FLAG_SINGLE_INSTANCE | TEE_TA_FLAG_MULTI_SESSION,
    tee_entry_open_session,
    tee_entry_close_session,
    tee_entry_invoke_command,
};
