// A device whose fingerprint TA a test talks to.
#ifndef TESTS_COMPANIONS_FINGERPRINT_FINGERPRINT_FIXTURE_H_
#define TESTS_COMPANIONS_FINGERPRINT_FINGERPRINT_FIXTURE_H_

#include "tee/companions/fingerprint/fingerprint_protocol.h"
#include "tests/companions/companion_fixture.h"

namespace testing_support {

/// What the fingerprint TA is asked with: the types of its commands.
inline constexpr std::uint32_t enrol_types = 0x0021;
inline constexpr std::uint32_t touch_types = 0x2611;
inline constexpr std::uint32_t remove_types = 0x0001;
inline constexpr std::uint32_t list_types = 0x0006;

/// A touch: the whole buffer, what became of its size, and what the Keymaster TA answered.
struct touch_answer {
  TEE_Result result = 0xDEADBEEF;
  bytes token;
  std::uint32_t size = 0;
  TEE_Result told = 0xDEADBEEF;
};

struct list_answer {
  TEE_Result result = 0xDEADBEEF;
  bytes records;
  std::uint32_t size = 0;
};

struct enrol_answer {
  TEE_Result result = 0xDEADBEEF;
  std::uint32_t finger = 0;
};

class FingerprintTest : public CompanionTest {
 protected:
  FingerprintTest() : CompanionTest(FINGERPRINT_TA_UUID, "FINGERPRINT", {"fp.templates", "fp.authid"}) {}

  enrol_answer enrol(std::uint64_t secure_id);
  touch_answer touch(std::uint32_t finger, std::uint64_t challenge = 0, std::size_t capacity = 69);
  TEE_Result remove(std::uint32_t finger);
  list_answer list(std::size_t capacity = 384);

  /// must_enrol and must_touch fail the test unless the command succeeds.
  std::uint32_t must_enrol(std::uint64_t secure_id);
  bytes must_touch(std::uint32_t finger, std::uint64_t challenge = 0);

  /// listed answers the whole list.
  bytes listed();
  /// The authenticator id, out of storage.
  std::uint64_t authenticator_id();
};

/// One finger as lists have it.
[[nodiscard]] bytes record(std::uint32_t finger, std::uint64_t secure_id);

}  // namespace testing_support

#endif  // TESTS_COMPANIONS_FINGERPRINT_FINGERPRINT_FIXTURE_H_
