// A client that sends the same commands in every way there is: on any of its sessions, and each memory slot as a
// temporary reference or as registered or allocated shared memory.
#ifndef TESTS_LOAD_MIXED_CLIENT_H_
#define TESTS_LOAD_MIXED_CLIENT_H_

#include <memory>
#include <random>

#include "tests/support/ta_client.h"

namespace load {

using testing_support::answer;
using testing_support::bytes;

/// below draws a number smaller than `limit`.
std::size_t below(std::mt19937& random, std::size_t limit);

/// Every choice is drawn from `random`, which outlives the client.
class mixed_client : public testing_support::ta_client {
 public:
  mixed_client(const std::string& context_name, std::mt19937& random) : ta_client(context_name), random_(random) {}
  ~mixed_client() override;

  /// open_session adds a session to the context, and close_session takes one of the added away. Throw
  /// std::runtime_error when the server refuses, and when there is none.
  void open_session();
  void close_session();
  [[nodiscard]] std::size_t added_sessions() const { return added_.size(); }

  /// Throws std::runtime_error when somebody else than the TA answers, when bytes around a buffer were written to, or
  /// when the request was.
  answer call_types(std::uint32_t command, std::uint32_t types, std::uint32_t a, std::uint32_t b, const bytes& request,
                    std::size_t capacity) override;

 private:
  std::mt19937& random_;
  std::vector<std::unique_ptr<TEEC_Session>> added_;
};

}  // namespace load

#endif  // TESTS_LOAD_MIXED_CLIENT_H_
