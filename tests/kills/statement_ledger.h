// What the device's counter may show: never the same value twice, never a lower one after a higher one, and no more
// than it was asked to move.
#ifndef TESTS_KILLS_STATEMENT_LEDGER_H_
#define TESTS_KILLS_STATEMENT_LEDGER_H_

#include <cstdint>
#include <mutex>
#include <optional>
#include <set>
#include <span>

namespace hosted_tee::testing {

/// Kept by the test over all clients and all lives of the server. What it finds wrong is a failure of the test.
class statement_ledger {
 public:
  /// A statement that was asked for. Whatever was told before that must be lower than what this one tells.
  struct request {
    std::uint64_t highest_before;
  };
  [[nodiscard]] request ask();

  /// note takes in the value that a statement tells.
  void note(const request& asked, std::uint64_t value);

  [[nodiscard]] std::size_t told() const;

  /// expect_no_gaps: every value up to the highest was told to somebody.
  void expect_no_gaps() const;

 private:
  mutable std::mutex mutex_;
  std::uint64_t asked_ = 0;
  std::set<std::uint64_t> told_;
};

/// counter_in takes a statement apart (length, text, signature), judges its signature by libcrypto with the fixed RSA
/// test key of `signer_bits`, and answers its counter. Nothing, and a failure of the test, when it is no sound
/// statement, or its text has not the value `content` in the member `name`.
[[nodiscard]] std::optional<std::uint64_t> counter_in(std::span<const std::uint8_t> statement, unsigned signer_bits,
                                                      const char* name, const std::string& content);

}  // namespace hosted_tee::testing

#endif  // TESTS_KILLS_STATEMENT_LEDGER_H_
