// The header record: what a loader reads before anything else. It stands alone in its object, so that a program which
// links the TA as a library, and has no entry layer, need not take it.
#include <cstddef>

#include "params/keymaster_protocol.h"
#include "ta/ta_limits.h"
#include "tee_ta_image.h"

static_assert(offsetof(tee_ta_head, stack_size) == 16 && offsetof(tee_ta_head, flags) == 20 &&
                  offsetof(tee_ta_head, open_session) == 24 && sizeof(tee_ta_head) == 24 + 3 * sizeof(void*),
              "loaders read the record by these offsets");
static_assert(sizeof(tee_ta_head) == 36 || sizeof(void*) != 4);
static_assert(offsetof(tee_ta_property, type) == sizeof(void*) &&
                  offsetof(tee_ta_property, number) == sizeof(void*) + 4 &&
                  offsetof(tee_ta_property, text) == sizeof(void*) + 8 &&
                  sizeof(tee_ta_property) == 2 * sizeof(void*) + 8,
              "and the properties by these");

// What platform and TA hand each other in memory.
static_assert(sizeof(TEE_UUID) == 16 && offsetof(TEE_UUID, timeMid) == 4 && offsetof(TEE_UUID, timeHiAndVersion) == 6 &&
              offsetof(TEE_UUID, clockSeqAndNode) == 8);
static_assert(sizeof(TEE_Identity) == 20 && offsetof(TEE_Identity, uuid) == 4);
static_assert(sizeof(TEE_Time) == 8 && offsetof(TEE_Time, millis) == 4);
static_assert(sizeof(TEE_Param) == 2 * sizeof(void*) && offsetof(TEE_Param, memref.size) == sizeof(void*) &&
              offsetof(TEE_Param, value.b) == 4);

extern "C" __attribute__((used)) const tee_ta_head ta_head = {
    KEYMASTER_TA_UUID,
    keymaster::ta_stack_size,
    TEE_TA_FLAG_USER_MODE | TEE_TA_FLAG_EXEC_DDR | TEE_TA_FLAG_SINGLE_INSTANCE | TEE_TA_FLAG_MULTI_SESSION,
    tee_entry_open_session,
    tee_entry_close_session,
    tee_entry_invoke_command,
};
