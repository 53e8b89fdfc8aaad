// The dispatcher: one table of commands, one place that checks parameter types and values.
#ifndef KEYMASTER_TA_DISPATCH_H_
#define KEYMASTER_TA_DISPATCH_H_

#include <cstdint>

#include "tee_internal_api.h"

namespace keymaster {

/// dispatch carries out one command. TEE_ERROR_BAD_PARAMETERS for an unknown command, other parameter types than the
/// command's, or a slot 0 that should have been cleared; no slot is touched then. Otherwise the handler's result.
[[nodiscard]] TEE_Result dispatch(uint32_t command, uint32_t param_types, TEE_Param params[4]);

}  // namespace keymaster

#endif  // KEYMASTER_TA_DISPATCH_H_
