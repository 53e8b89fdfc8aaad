// What the soter framework is asked for, and what it must answer.
#ifndef TESTS_FAULTS_SOTER_STAGE_H_
#define TESTS_FAULTS_SOTER_STAGE_H_

#include "tests/faults/stage.h"

namespace testing_support {

/// A key of the framework of 1024 bits, whose export is signed by the attestation key, with counter and uid.
param_list soter_attk_key();
inline constexpr std::uint32_t soter_uid = 10012;

// The commands without a key.
answer soter_generate(stage& on);
answer soter_verify(stage& on);
answer soter_export_attk(stage& on);
answer soter_device_id(stage& on);

/// A statement that a command answered, taken apart.
struct soter_statement {
  std::string text;
  bytes signature;

  [[nodiscard]] std::uint64_t counter() const;  // 0 when it tells none
  [[nodiscard]] bool signed_by(const rsa_test_key& key) const;
};
soter_statement statement_in(const bytes& packed);

}  // namespace testing_support

#endif  // TESTS_FAULTS_SOTER_STAGE_H_
