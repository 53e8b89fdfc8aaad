// Which memory a TA may touch.
#ifndef TEE_RUNTIME_MEMORY_ACCESS_H_
#define TEE_RUNTIME_MEMORY_ACCESS_H_

#include <cstdint>

#include "tee/runtime/instance.h"

namespace hosted_tee {

/// may_access tells whether all of a buffer is mapped with the rights of TEE_MEMORY_ACCESS_READ and _WRITE in `flags`
/// and, unless they hold TEE_MEMORY_ACCESS_ANY_OWNER, shares no byte with the client's memory of the running call.
[[nodiscard]] bool may_access(const instance& self, std::uint32_t flags, const void* buffer, std::uint32_t size);

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_MEMORY_ACCESS_H_
