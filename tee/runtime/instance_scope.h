// Entering and leaving TA code: which instance is current, and where a panic of it lands.
#ifndef TEE_RUNTIME_INSTANCE_SCOPE_H_
#define TEE_RUNTIME_INSTANCE_SCOPE_H_

#include <functional>
#include <optional>

#include "tee/runtime/instance.h"

namespace hosted_tee {

/// Makes `self` the current instance of this thread while it lives. Scopes nest as the calls of TAs do.
class instance_scope {
 public:
  explicit instance_scope(instance& self);
  ~instance_scope();
  instance_scope(const instance_scope&) = delete;
  instance_scope& operator=(const instance_scope&) = delete;

 private:
  instance* outer_;
};

/// run_guarded runs `code` with a landing place for a panic of the current instance and answers the panic's code, or
/// nothing when `code` returned. After a panic no frame of `code` is unwound, so it must own nothing on its stack at a
/// platform call that can panic; the instance stays as the panic left it, for its owner to reclaim.
[[nodiscard]] std::optional<TEE_Result> run_guarded(const std::function<void()>& code);

/// run_guarded for callers that must not allocate: `code` is called with `context`.
[[nodiscard]] std::optional<TEE_Result> run_guarded(void (*code)(void* context), void* context);

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_INSTANCE_SCOPE_H_
