// A device with storage, and a provisioning TA that the test plays.
#ifndef TESTS_SOTER_SOTER_FIXTURE_H_
#define TESTS_SOTER_SOTER_FIXTURE_H_

#include <optional>
#include <string>
#include <vector>

#include "quil/quil_client.h"
#include "soter/soter_counter.h"
#include "soter/soter_init.h"
#include "tests/support/device_fixture.h"
#include "tests/support/played_quil.h"
#include "tests/support/rsa_test_key.h"
#include "tests/support/ta_scope.h"

namespace testing_support {

class SoterTest : public ::testing::Test {
 protected:
  SoterTest();
  void TearDown() override;

  /// provision gives the played TA the fixed 2048-bit key and all properties.
  void provision();
  [[nodiscard]] static bytes key_box(std::size_t components = 8);
  [[nodiscard]] static bytes property_box();

  [[nodiscard]] ta_scope& ta() { return *ta_; }
  [[nodiscard]] hosted_tee::fault_plan& faults() { return world_->faults(); }
  [[nodiscard]] hosted_tee::clocks& clock() { return world_->device().clock; }
  [[nodiscard]] std::optional<bytes> stored_counter();
  void store_counter(const bytes& data);
  [[nodiscard]] std::vector<std::string> errors() const { return ta_->errors(); }

  played_quil quil;

 private:
  temporary_folder folder_;
  std::shared_ptr<hosted_tee::secure_world> world_;
  std::optional<ta_scope> ta_;
};

}  // namespace testing_support

#endif  // TESTS_SOTER_SOTER_FIXTURE_H_
