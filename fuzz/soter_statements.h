// Statements of the soter framework as a relying party reads them: what they must say, and whose signature they carry.
#ifndef FUZZ_SOTER_STATEMENTS_H_
#define FUZZ_SOTER_STATEMENTS_H_

#include <openssl/evp.h>

#include <memory>
#include <optional>
#include <string>

#include "fuzz/input_reader.h"
#include "tests/support/rsa_test_key.h"

namespace fuzzing {

/// A key pair of libcrypto's making that the TA has as well.
class known_key {
 public:
  explicit known_key(unsigned bits);

  [[nodiscard]] const testing_support::rsa_components& components() const { return components_; }
  [[nodiscard]] bytes material() const;   ///< for an import
  [[nodiscard]] std::string pem() const;  ///< of the public half, on one line, escaped for a JSON text

  /// signed_by tells whether the signature of `text` is this key's; `pss` with a salt of any length.
  [[nodiscard]] bool signed_by(const bytes& text, const bytes& signature, bool pss = false) const;

 private:
  std::unique_ptr<EVP_PKEY, void (*)(EVP_PKEY*)> key_;
  testing_support::rsa_components components_;
};

/// A statement taken apart. The text includes a NUL where the TA counts it in.
struct statement {
  bytes text, signature;
};
statement take_apart(const bytes& packed);

/// What stands for the counter in a text that is expected: its last one.
inline constexpr char counter_place = '\x1A';

/// counter_in answers the counter that `told` has where `text` has its place; nothing when the two differ otherwise.
std::optional<std::uint64_t> counter_in(const bytes& told, const std::string& text);

/// escaped writes a text as the framework writes it into statements.
std::string escaped(const bytes& text);
bytes bytes_of(const std::string& text);

}  // namespace fuzzing

#endif  // FUZZ_SOTER_STATEMENTS_H_
