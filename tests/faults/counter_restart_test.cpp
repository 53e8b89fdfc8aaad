// The counter in statements, on a device that restarts and one that dies in the middle of a command.
#include <gmock/gmock.h>

#include <algorithm>
#include <filesystem>
#include <fstream>

#include "tests/faults/soter_stage.h"
#include "tests/tee/crash.h"

using namespace keymaster;

namespace testing_support {
namespace {

TEST(CounterRestartTest, StatementsOfBothKindsShareTheCounterAcrossRestarts) {
  stage on(true);
  on.provision();
  on.import(soter_attk_key());
  on.params = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
  std::uint64_t last = 0;
  for (int round = 0; round < 3; ++round) {
    const answer exported = on.client().export_key(on.blob);
    ASSERT_TRUE(exported.ok());
    EXPECT_EQ(statement_in(exported.body()).counter(), ++last);
    const finish_answer signed_one = on.client().sign(on.blob, on.params, on.message);
    ASSERT_TRUE(signed_one.ok());
    EXPECT_EQ(statement_in(signed_one.data).counter(), ++last);
    on.tee.restart();
    on.provision();
  }
}

/// A key that nobody but itself signs for, on a device that is started for each use.
class CounterKillTest : public ::testing::Test {
 protected:
  CounterKillTest() {
    options_.state = folder_.path() / "state";
    const auto world = hosted_tee::secure_world::open_shared(options_);
    ta_client client(context_);
    const bytes material = rsa_test_key::of_bits(1024).material();
    const bytes signer = client.must_import(rsa_key(1024), material);
    blob_ = client.must_import(rsa_key(1024)
                                   .add(KM_TAG_SOTER_KEY)
                                   .add(KM_TAG_SOTER_COUNTED)
                                   .add(KM_TAG_SOTER_SIGNED_BY_KEY)
                                   .add_blob(KM_TAG_SOTER_SIGNING_KEY_BLOB, signer),
                               material);
  }

  /// Exports twice, and notes what the client was told before it goes on.
  void tell(const hosted_tee::testing::step_action& at_step) const {
    const auto world = hosted_tee::secure_world::open_shared(options_);
    ta_client client(context_);
    world->faults().at_storage_step(at_step);
    for (int i = 0; i < 2; ++i) {
      const answer got = client.export_key(blob_);
      if (got.ok()) std::ofstream(told_, std::ios::app) << statement_in(got.body()).counter() << std::endl;
    }
    world->faults().at_storage_step({});
  }
  [[nodiscard]] std::vector<std::uint64_t> told() const {
    std::vector<std::uint64_t> all;
    std::ifstream file(told_);
    for (std::uint64_t value = 0; file >> value;) all.push_back(value);
    return all;
  }

  temporary_folder folder_;
  hosted_tee::world_options options_;
  std::string context_ = "embedded:" + (folder_.path() / "state").string();
  std::filesystem::path told_ = folder_.path() / "told";
  bytes blob_;
};

TEST_F(CounterKillTest, ADeviceThatDiesInAnExportNeverTellsAValueTwice) {
  constexpr int steps = 3 * 3;  // three each for the creation and for two increments
  int deaths = 0;
  for (int round = 0; round < 2; ++round) {
    for (int step = 0; step < steps; ++step) {
      deaths +=
          hosted_tee::testing::dies_at(step, [&](const hosted_tee::testing::step_action& at_step) { tell(at_step); })
              ? 1
              : 0;
    }
  }
  EXPECT_GE(deaths, 2 * 6);
  tell({});
  const std::vector<std::uint64_t> all = told();
  EXPECT_GE(all.size(), 2U * 3);
  EXPECT_EQ(std::ranges::adjacent_find(all, std::greater_equal<>()), all.end()) << ::testing::PrintToString(all);
}

}  // namespace
}  // namespace testing_support
