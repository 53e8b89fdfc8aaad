// What the platform offers beyond the Internal Core API, and TEE_Panic.
#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "tee/runtime/device.h"
#include "tee/runtime/platform_call.h"
#include "tee/storage/object_store.h"

namespace hosted_tee {
namespace {

trace_level level_of(int level) {
  return static_cast<trace_level>(std::clamp(level, TEE_TRACE_ERROR, TEE_TRACE_DEBUG));
}

}  // namespace

extern "C" {

void TEE_Panic(TEE_Result panicCode) {
  platform_call_void("TEE_Panic", [&](const instance&) { panic("", panicCode); });
  std::abort();  // never reached: a panic does not return
}

void tee_trace(const char* function, int line, int level, const char* format, ...) {
  std::va_list arguments;
  va_start(arguments, format);
  platform_call_void("tee_trace", [&](const instance& self) {
    self.device.trace.add_formatted(self.trace_prefix, level_of(level), function, line, format, arguments);
  });
  va_end(arguments);
}

TEE_Result GetBootSeed(void* seed, uint32_t length) {
  return platform_call("GetBootSeed", nullptr, [&](const instance& self) -> TEE_Result {
    const auto& value = self.device.boot_seed;
    if (seed == nullptr || length != value.size()) return TEE_ERROR_BAD_PARAMETERS;
    std::memcpy(seed, value.data(), value.size());
    return TEE_SUCCESS;
  });
}

TEE_Result TEE_RPMB_MakeFileSystem(uint32_t* state) {
  return platform_call("TEE_RPMB_MakeFileSystem", nullptr, [&](const instance& self) -> TEE_Result {
    if (state == nullptr) return TEE_ERROR_BAD_PARAMETERS;
    object_store* rpmb = self.device.store(TEE_STORAGE_RPMB);
    if (rpmb == nullptr) return TEE_ERROR_NOT_SUPPORTED;
    const TEE_Result result = rpmb->check();
    *state = result == TEE_SUCCESS ? 1 : 0;
    return result;
  });
}

}  // extern "C"
}  // namespace hosted_tee
