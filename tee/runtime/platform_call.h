// The wall between a TA and the platform's C++: every function of the Internal Core API is one platform_call.
#ifndef TEE_RUNTIME_PLATFORM_CALL_H_
#define TEE_RUNTIME_PLATFORM_CALL_H_

#include <exception>
#include <new>
#include <optional>
#include <string>
#include <utility>

#include "tee/runtime/instance.h"

namespace hosted_tee {

/// A programmer error of the TA, or TEE_Panic: ends the instance. Thrown inside a platform function only.
struct ta_panic {
  TEE_Result code;
  std::string reason;
};

/// panic throws ta_panic.
[[noreturn]] void panic(const char* reason, TEE_Result code = TEE_ERROR_BAD_PARAMETERS);

/// A failure deep inside a platform function, with the result that the TA shall see.
class call_failure : public std::exception {
 public:
  explicit call_failure(TEE_Result code) : code_(code) {}
  [[nodiscard]] TEE_Result code() const { return code_; }
  [[nodiscard]] const char* what() const noexcept override { return "platform call failed"; }

 private:
  TEE_Result code_;
};

/// report_panic puts one line into the trace: which function panicked the instance, and why.
void report_panic(const instance& self, const char* function, const ta_panic& why) noexcept;

/// leave_by_panic abandons the TA's call: control returns to the secure world, which reclaims the instance. No frame of
/// the TA is unwound (a panicked TA runs no more code); no C++ object of the platform may be alive in the caller.
[[noreturn]] void leave_by_panic(TEE_Result code, const char* function);

/// platform_call runs `body(instance&)` as the function `name`: ordered faults first, then the body, then ordered
/// falsifications of its output. `length` is the call's output length, where it has one. No exception crosses: a
/// call_failure is its code, want of host memory TEE_ERROR_OUT_OF_MEMORY, any other surprise TEE_ERROR_GENERIC, all
/// with a length of 0 (only a short buffer tells one); a panic does not return. `name` must be a literal: calls are
/// counted by its address.
template <class Body>
TEE_Result platform_call(const char* name, std::uint32_t* length, Body&& body) noexcept {
  bool panicked = false;
  TEE_Result result = TEE_ERROR_GENERIC;
  {
    instance& self = current_instance();
    try {
      if (const auto fault = self.faults.on_call(name, call_kind::fallible)) {
        if (length != nullptr) *length = 0;
        result = *fault;
      } else {
        result = std::forward<Body>(body)(self);
        self.faults.on_output(name, length, result);
      }
    } catch (const ta_panic& p) {
      panicked = true;
      result = p.code;
      report_panic(self, name, p);
    } catch (const call_failure& f) {
      result = f.code();
      if (length != nullptr && result != TEE_ERROR_SHORT_BUFFER) *length = 0;
    } catch (const std::bad_alloc&) {
      result = TEE_ERROR_OUT_OF_MEMORY;
      if (length != nullptr) *length = 0;
    } catch (const std::exception&) {
      result = TEE_ERROR_GENERIC;
      if (length != nullptr) *length = 0;
    }
  }
  if (panicked) leave_by_panic(result, name);
  return result;
}

/// call_without_result is platform_call for functions without a result; `body(instance&, fault)` gets the failure that
/// was ordered, if there is one. Any exception that it lets out panics.
template <class Body>
void call_without_result(const char* name, call_kind kind, Body&& body) noexcept {
  bool panicked = false;
  TEE_Result code = TEE_SUCCESS;
  {
    instance& self = current_instance();
    try {
      const std::optional<TEE_Result> fault = self.faults.on_call(name, kind);
      std::forward<Body>(body)(self, fault);
    } catch (const ta_panic& p) {
      panicked = true;
      code = p.code;
      report_panic(self, name, p);
    } catch (const std::exception&) {
      panicked = true;
      code = TEE_ERROR_OUT_OF_MEMORY;
    }
  }
  if (panicked) leave_by_panic(code, name);
}

/// platform_call_void is for functions that cannot fail.
template <class Body>
void platform_call_void(const char* name, Body&& body) noexcept {
  call_without_result(name, call_kind::infallible,
                      [&](instance& self, const std::optional<TEE_Result>& /*fault*/) { body(self); });
}

/// platform_step is for functions that can fail without being able to say so: a failure is the body's to remember (an
/// operation becomes poisoned and its next call with a result reports it).
template <class Body>
void platform_step(const char* name, Body&& body) noexcept {
  call_without_result(name, call_kind::step, std::forward<Body>(body));
}

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_PLATFORM_CALL_H_
