// The one place where this library's exceptions become results.
#ifndef TEE_CLIENT_CALL_H_
#define TEE_CLIENT_CALL_H_

#include <new>

#include "tee/client/client_failure.h"
#include "tee/client/connection.h"

namespace hosted_tee {

/// Where a result comes from, for a client that wants to know; the API itself until the TEE was asked.
class origin_report {
 public:
  explicit origin_report(std::uint32_t* out) : out_(out) {}
  ~origin_report() {
    if (out_ != nullptr) *out_ = value;
  }
  origin_report(const origin_report&) = delete;
  origin_report& operator=(const origin_report&) = delete;

  std::uint32_t value = TEEC_ORIGIN_API;

 private:
  std::uint32_t* out_;
};

/// report prints what a result can't tell where KEYMASTER_TRACE has a device's lines printed.
void report(const std::exception& error) noexcept;

/// client_call gives what `body` answers, or the result that its exception stands for. `origin` may be null.
template <class Body>
TEEC_Result client_call(origin_report* origin, Body&& body) noexcept {
  try {
    return body();
  } catch (const client_failure& failure) {
    if (origin != nullptr) origin->value = failure.origin();
    return failure.code();
  } catch (const world_error& error) {
    report(error);
    return result_of(error.fault());
  } catch (const std::bad_alloc&) {
    return TEEC_ERROR_OUT_OF_MEMORY;
  } catch (const std::exception& error) {
    report(error);
    return TEEC_ERROR_GENERIC;
  }
}

}  // namespace hosted_tee

#endif  // TEE_CLIENT_CALL_H_
