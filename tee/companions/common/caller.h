// Who sent the current command.
#ifndef TEE_COMPANIONS_COMMON_CALLER_H_
#define TEE_COMPANIONS_COMMON_CALLER_H_

#include "tee_internal_api.h"

namespace keymaster::companion {

/// Whom a command is for.
enum class caller_rule { anybody, normal_world, keymaster_ta };

/// check_caller tells whether the client of the current command is one that `rule` allows. TEE_ERROR_ACCESS_DENIED,
/// with a trace line, when it isn't; the platform's result when it doesn't say who the client is.
[[nodiscard]] TEE_Result check_caller(caller_rule rule);

}  // namespace keymaster::companion

#endif  // TEE_COMPANIONS_COMMON_CALLER_H_
