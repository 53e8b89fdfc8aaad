// teed, and what can be seen of it from outside.
#ifndef TESTS_LOAD_WATCHED_TEED_H_
#define TESTS_LOAD_WATCHED_TEED_H_

#include <string>

#include "tee/client/management.h"
#include "tests/support/device_fixture.h"
#include "tests/support/eventually.h"
#include "tests/support/teed_process.h"

namespace load {

using testing_support::eventually;

/// What the kernel and the server itself say that the server has.
struct holdings {
  std::size_t descriptors = 0, threads = 0, shared_maps = 0;
  std::uint32_t connections = 0, sessions = 0, instances = 0, blocks = 0;
  std::uint64_t block_bytes = 0;

  [[nodiscard]] bool is_within(const holdings& other) const;
};
void PrintTo(const holdings& what, std::ostream* out);

/// The server runs from the constructor, which waits until it answers, to the end of the scope. Functions throw
/// std::runtime_error when the server does not answer them.
class watched_teed {
 public:
  watched_teed();

  [[nodiscard]] std::string name() const { return place_.context_name(); }

  /// One of the connections is this object's own. It is always the same, so that looking changes nothing.
  [[nodiscard]] hosted_tee::server_status status();
  [[nodiscard]] holdings holdings_now();
  /// own_memory is what the server has of its own, in bytes: without files and what it shares with clients.
  [[nodiscard]] std::size_t own_memory() const;

  /// said is what the server wrote on standard error.
  [[nodiscard]] std::string said() const { return process_.said(); }

  /// stop has the server end, and answers how it went.
  testing_support::process_end stop() { return process_.terminate(); }

 private:
  [[nodiscard]] std::string proc() const;

  testing_support::temporary_folder folder_;
  testing_support::server_place place_;
  testing_support::teed_process process_;
  hosted_tee::server_management management_;
};

}  // namespace load

#endif  // TESTS_LOAD_WATCHED_TEED_H_
