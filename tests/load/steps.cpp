#include "tests/load/steps.h"

#include "src/params/keymaster_defs.h"
#include "tests/support/encryption.h"

namespace load {

// Weights make none of the kinds rare but the one that costs most.
std::span<const step> all_steps() {
  static constexpr step steps[] = {
      {"capabilities", 6, ask_capabilities},
      {"generate AES", 3, generate_aes},
      {"generate HMAC", 3, generate_hmac},
      {"generate EC", 2, generate_ec},
      {"generate RSA", 0.2, generate_rsa},
      {"import RSA", 2, import_rsa},
      {"import EC", 2, import_ec},
      {"import secret", 3, import_secret},
      {"delete", 2, delete_keys},
      {"sign RSA", 2, sign_rsa},
      {"verify RSA", 4, verify_rsa},
      {"sign EC", 3, sign_ec},
      {"verify EC", 3, verify_ec},
      {"sign HMAC", 5, sign_hmac},
      {"verify HMAC", 5, verify_hmac},
      {"encrypt AES", 6, encrypt_aes},
      {"decrypt AES", 6, decrypt_aes},
      {"forge GCM", 3, forge_gcm},
      {"encrypt RSA", 4, encrypt_rsa},
      {"decrypt RSA", 2, decrypt_rsa},
      {"wrong calls", 5, call_wrongly},
      {"malformed requests", 5, send_malformed},
      {"misused keys", 5, misuse_keys},
      {"misused handles", 4, misuse_handles},
      {"abort", 4, abort_operation},
      {"broken operation", 4, break_operation},
      {"soter", 4, ask_soter},
      {"sessions", 4, change_sessions},
  };
  static_assert(std::size(steps) <= most_steps);
  return steps;
}

bytes desk::message() const {
  const std::uint32_t kind = below(10);
  const std::size_t size = kind < 6 ? below(200) : kind < 9 ? below(5000) : 17'000 + below(80'000);
  return testing_support::pattern(size, below(1000));
}

std::vector<bytes> desk::pieces(const bytes& message) const {
  // Byte by byte only what is short: an operation holds a place that others wait for.
  if (message.size() <= 64) return testing_support::cut(message, random);
  return testing_support::cut_every(message, message.size() / (1 + below(4)) + 1);
}

void expect(bool is_so, const char* what) {
  if (!is_so) throw std::runtime_error(fmt::format("not so: {}", what));
}

void expect(const answer& given, TEEC_Result result, std::int32_t error, const char* what) {
  if (given.result == result && given.error == error) return;
  throw std::runtime_error(
      fmt::format("{}: result {:#x}, error {} (expected {:#x}, {})", what, given.result, given.error, result, error));
}

void expect_ok(const answer& given, const char* what) {
  expect(given, TEEC_SUCCESS, keymaster::KM_ERROR_OK, what);
}

void expect_none(const answer& given, TEEC_Result result, std::int32_t error, const char* what) {
  expect(given, result, error, what);
  if (given.size != 0 || given.b != 0) throw std::runtime_error(fmt::format("{}: failed, with an output", what));
}

bool is_full(const answer& given) {
  if (given.result != TEEC_SUCCESS || given.error != keymaster::KM_ERROR_TOO_MANY_OPERATIONS) return false;
  expect(given.size == 0 && given.b == 0, "begin without a place answers nothing");
  return true;
}

}  // namespace load
