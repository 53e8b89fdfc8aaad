#include "tests/commands/hostile/tag_length.h"

#include <dlfcn.h>

#include <optional>
#include <utility>

#include "tee_internal_api.h"

namespace {
std::optional<std::uint32_t> claimed;
}

namespace testing_support {

void claim_tag_length(std::uint32_t length) {
  claimed = length;
}

}  // namespace testing_support

// The TA takes its platform calls from the program before the hosted TEE's library, so that this one stands in front of
// the real one.
extern "C" TEE_Result TEE_AEEncryptFinal(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen,
                                         void* destData, uint32_t* destLen, void* tag, uint32_t* tagLen) {
  static const auto real = reinterpret_cast<decltype(&TEE_AEEncryptFinal)>(dlsym(RTLD_NEXT, "TEE_AEEncryptFinal"));
  const TEE_Result result = real(operation, srcData, srcLen, destData, destLen, tag, tagLen);
  if (const auto length = std::exchange(claimed, std::nullopt)) *tagLen = *length;
  return result;
}
