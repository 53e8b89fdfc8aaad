// What the clients do: short pieces of work, each of which knows what every answer must be.
#ifndef TESTS_LOAD_STEPS_H_
#define TESTS_LOAD_STEPS_H_

#include <fmt/format.h>

#include <span>
#include <stdexcept>

#include "tests/load/key_shelf.h"
#include "tests/load/mixed_client.h"

namespace load {

/// What a step works with.
struct desk {
  const std::string& tee;  // the name of its context
  mixed_client& client;
  std::mt19937& random;
  const key_shelf& keys;

  [[nodiscard]] std::uint32_t below(std::uint32_t limit) const {
    return static_cast<std::uint32_t>(load::below(random, limit));
  }
  [[nodiscard]] bool one_in(std::uint32_t many) const { return below(many) == 0; }
  template <class List>
  [[nodiscard]] const auto& pick(const List& list) const {
    return *(std::begin(list) + static_cast<std::ptrdiff_t>(load::below(random, std::size(list))));
  }

  /// message is mostly short, and sometimes more than a frame carries. pieces cuts it for updates.
  [[nodiscard]] bytes message() const;
  [[nodiscard]] std::vector<bytes> pieces(const bytes& message) const;
};

/// expect throws std::runtime_error, which names `what`, unless it is so.
void expect(bool is_so, const char* what);
void expect(const answer& given, TEEC_Result result, std::int32_t error, const char* what);
void expect_ok(const answer& given, const char* what);

/// expect_none is expect for a failed command with an output: it has none.
void expect_none(const answer& given, TEEC_Result result, std::int32_t error, const char* what);

/// is_full tells whether begin found all places for operations taken, which is the one answer that depends on what the
/// others do.
[[nodiscard]] bool is_full(const answer& given);

/// A step answers false when it ended early because there was no place for an operation. It throws for a wrong answer,
/// and leaves no operation behind otherwise.
struct step {
  const char* name;
  double weight;
  bool (*work)(desk&);
};

inline constexpr std::size_t most_steps = 40;
[[nodiscard]] std::span<const step> all_steps();  // at most most_steps

// steps_capabilities.cpp
bool ask_capabilities(desk& d);
// steps_keys.cpp
bool generate_aes(desk& d);
bool generate_hmac(desk& d);
bool generate_ec(desk& d);
bool generate_rsa(desk& d);
bool import_rsa(desk& d);
bool import_ec(desk& d);
bool import_secret(desk& d);
bool delete_keys(desk& d);
// steps_signatures.cpp
bool sign_rsa(desk& d);
bool verify_rsa(desk& d);
bool sign_ec(desk& d);
bool verify_ec(desk& d);
bool sign_hmac(desk& d);
bool verify_hmac(desk& d);
// steps_ciphers.cpp
bool encrypt_aes(desk& d);
bool decrypt_aes(desk& d);
bool forge_gcm(desk& d);
bool encrypt_rsa(desk& d);
bool decrypt_rsa(desk& d);
// steps_refusals.cpp
bool call_wrongly(desk& d);
bool send_malformed(desk& d);
bool misuse_keys(desk& d);
bool misuse_handles(desk& d);
bool abort_operation(desk& d);
bool break_operation(desk& d);
// steps_sessions.cpp
bool ask_soter(desk& d);
bool change_sessions(desk& d);

}  // namespace load

#endif  // TESTS_LOAD_STEPS_H_
