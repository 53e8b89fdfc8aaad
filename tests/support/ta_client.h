// A client that can say anything: commands as raw bodies through the Client API, with every answer kept whole.
#ifndef TESTS_SUPPORT_TA_CLIENT_H_
#define TESTS_SUPPORT_TA_CLIENT_H_

#include <optional>

#include "src/params/keymaster_protocol.h"
#include "tee_client_api.h"
#include "tests/support/param_list.h"

namespace testing_support {

/// What a command answered. `output` is slot 2's whole buffer; `size` is what the TA wrote back as its size.
struct answer {
  TEEC_Result result = 0xDEADBEEF;
  std::uint32_t origin = 0;
  std::int32_t error = 0;  // slot 0 a
  std::uint32_t b = 0;     // slot 0 b
  bytes output;
  std::uint32_t size = 0;

  [[nodiscard]] bool ok() const { return result == TEEC_SUCCESS && error == 0; }
  [[nodiscard]] bytes body() const { return {output.begin(), output.begin() + size}; }
};

struct finish_answer : answer {
  bytes data;        // the operation's output, parsed from the body
  bytes out_params;  // marshalled
};

inline constexpr std::uint8_t canary = 0xA5;  // fills response buffers before the call

/// One session. Throws std::runtime_error when it can't be opened.
class ta_client {
 public:
  explicit ta_client(const std::string& context_name, const TEEC_UUID& ta = KEYMASTER_TA_UUID);
  ta_client(const ta_client&) = delete;
  ta_client& operator=(const ta_client&) = delete;
  virtual ~ta_client();

  /// call sends `request` in slot 1 and offers `capacity` bytes in slot 2; an absent one makes its slot NONE. Slot 0 is
  /// VALUE_INOUT.
  answer call(std::uint32_t command, std::uint32_t a, std::uint32_t b, const std::optional<bytes>& request,
              std::optional<std::size_t> capacity);

  /// call_types is call with parameter types of the caller's choice (TEEC numbers); slots get what their type asks for.
  /// Every command goes through it.
  virtual answer call_types(std::uint32_t command, std::uint32_t types, std::uint32_t a, std::uint32_t b,
                            const bytes& request, std::size_t capacity);

  // The commands, well-formed. Capacities are ample unless given.
  answer generate(const param_list& params, std::size_t capacity = 16384);
  answer import_key(const param_list& params, const bytes& material, std::size_t capacity = 16384);
  answer characteristics_size(const bytes& blob, const bytes& app_id = {}, const bytes& app_data = {});
  answer characteristics(const bytes& blob, const bytes& app_id = {}, const bytes& app_data = {},
                         std::size_t capacity = 16384);
  answer export_key(const bytes& blob, const bytes& app_id = {}, const bytes& app_data = {},
                    std::size_t capacity = 4096);
  answer delete_key(const bytes& blob);
  answer delete_all();
  answer begin(std::uint32_t purpose, const bytes& blob, const param_list& params, std::size_t capacity = 4096);
  answer update(std::uint32_t handle, const bytes& input, const param_list& params = {}, std::size_t capacity = 4096);
  finish_answer finish(std::uint32_t handle, const bytes& input = {}, const param_list& params = {},
                       std::size_t capacity = 8192);
  answer abort(std::uint32_t handle);

  /// must_generate, must_import and must_begin throw unless the command succeeds; they answer the blob or the handle.
  bytes must_generate(const param_list& params);
  bytes must_import(const param_list& params, const bytes& material);
  std::uint32_t must_begin(std::uint32_t purpose, const bytes& blob, const param_list& params);

  /// sign and verify run a whole operation over `message`, stopping at the first failure.
  finish_answer sign(const bytes& blob, const param_list& params, const bytes& message);
  finish_answer verify(const bytes& blob, const param_list& params, const bytes& message, const bytes& signature);

 protected:
  TEEC_Context context_ = {};
  TEEC_Session session_ = {};
};

/// key_body is the request of the commands on an existing key.
bytes key_body(const bytes& blob, const bytes& app_id, const bytes& app_data);

}  // namespace testing_support

#endif  // TESTS_SUPPORT_TA_CLIENT_H_
