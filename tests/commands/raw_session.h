// A session below the Client API: the four parameters exactly as a TA receives them.
#ifndef TESTS_COMMANDS_RAW_SESSION_H_
#define TESTS_COMMANDS_RAW_SESSION_H_

#include "tee/runtime/secure_world.h"
#include "tests/support/bytes.h"

namespace testing_support {

/// The parameter types of the commands: slot 0 values, slot 1 the request, slot 2 the response.
inline constexpr std::uint32_t values_only = 0x0003;
inline constexpr std::uint32_t with_request = 0x0053;
inline constexpr std::uint32_t with_response = 0x0603;
inline constexpr std::uint32_t with_both = 0x0653;
inline constexpr std::uint32_t status_and_response = 0x0602;
inline constexpr std::uint32_t request_only = 0x0050;

/// What a raw call answered.
struct raw_answer {
  TEE_Result result = 0;
  std::int32_t error = 0;  // slot 0 a
  std::uint32_t b = 0;     // slot 0 b
  std::uint32_t size = 0;  // of slot 2
};

TEE_Param memref(bytes& buffer);
TEE_Param null_memref(std::uint32_t size);
TEE_Param values(std::uint32_t a, std::uint32_t b);

/// Throws std::runtime_error when the session can't be opened.
class raw_session {
 public:
  explicit raw_session(hosted_tee::secure_world& world);
  raw_session(const raw_session&) = delete;
  raw_session& operator=(const raw_session&) = delete;
  ~raw_session();

  TEE_Result invoke(std::uint32_t command, std::uint32_t types, TEE_Param (&params)[4]);

  /// call is invoke for the commands with a request and a response.
  raw_answer call(std::uint32_t command, std::uint32_t a, TEE_Param request, TEE_Param response);

 private:
  hosted_tee::secure_world& world_;
  std::uint32_t session_ = 0;
};

}  // namespace testing_support

#endif  // TESTS_COMMANDS_RAW_SESSION_H_
