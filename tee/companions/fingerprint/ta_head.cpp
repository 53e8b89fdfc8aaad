// The header record: what a loader reads before anything else.
#include "tee/companions/common/companion_limits.h"
#include "tee/companions/fingerprint/fingerprint_protocol.h"

extern "C" __attribute__((used)) const tee_ta_head ta_head = {
    FINGERPRINT_TA_UUID,    keymaster::companion::stack_size, keymaster::companion::flags,
    tee_entry_open_session, tee_entry_close_session,          tee_entry_invoke_command,
};
