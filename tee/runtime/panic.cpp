// How a panic leaves the TA: the stack is cut back to where the secure world entered the instance.
#include <csetjmp>
#include <cstdio>
#include <cstdlib>

#include "tee/runtime/device.h"
#include "tee/runtime/instance_scope.h"
#include "tee/runtime/platform_call.h"

namespace hosted_tee {
namespace {

struct landing_place {
  std::jmp_buf registers;
  landing_place* outer;
  TEE_Result volatile code;  // written between setjmp and its second return
};

// Nested TA calls have one each; the innermost belongs to the current instance.
thread_local landing_place* innermost_landing = nullptr;

}  // namespace

void panic(const char* reason, TEE_Result code) {
  throw ta_panic{code, reason};
}

void report_panic(const instance& self, const char* function, const ta_panic& why) noexcept {
  try {
    const std::string reason = why.reason.empty() ? "the TA asked for it" : why.reason;
    self.device.trace.add(
        {"TEE", trace_level::error, function, 0, std::string(self.trace_prefix) + " panics: " + reason});
  } catch (const std::exception&) {
    // The panic takes its course without its line.
  }
}

void leave_by_panic(TEE_Result code, const char* function) {
  landing_place* landing = innermost_landing;
  if (landing == nullptr) {
    (void)std::fprintf(stderr, "hosted TEE: %s panicked with 0x%08x and nobody entered the TA\n", function, code);
    std::abort();
  }
  landing->code = code;
  std::longjmp(landing->registers, 1);  // NOLINT(cert-err52-cpp): the TA's frames know no exceptions
}

std::optional<TEE_Result> run_guarded(void (*code)(void* context), void* context) {
  landing_place landing;
  landing.outer = innermost_landing;
  innermost_landing = &landing;
  if (setjmp(landing.registers) == 0) {  // NOLINT(cert-err52-cpp): see leave_by_panic
    code(context);
    innermost_landing = landing.outer;
    return std::nullopt;
  }
  innermost_landing = landing.outer;
  return landing.code;
}

std::optional<TEE_Result> run_guarded(const std::function<void()>& code) {
  return run_guarded([](void* context) { (*static_cast<const std::function<void()>*>(context))(); },
                     const_cast<std::function<void()>*>(&code));
}

}  // namespace hosted_tee
