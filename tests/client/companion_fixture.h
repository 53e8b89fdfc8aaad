// What the tests of the companions' sessions share: a connection to the fake TEE, and what it was asked.
#ifndef KEYMASTER_TESTS_CLIENT_COMPANION_FIXTURE_H_
#define KEYMASTER_TESTS_CLIENT_COMPANION_FIXTURE_H_

#include <gtest/gtest.h>

#include <optional>
#include <string>

#include "client/lib/session.h"
#include "tests/client/fake_tee.h"

class companion_fixture : public testing::Test {
 protected:
  void SetUp() override {
    fake_tee::reset();
    tee.emplace("embedded:/nowhere");
  }
  void TearDown() override {
    tee.reset();
    EXPECT_EQ(fake_tee::now().open_sessions, 0);
    EXPECT_EQ(fake_tee::now().open_contexts, 0);
  }

  static void prepare(const fake_tee::answer& answer) { fake_tee::now().answers.push_back(answer); }
  static const fake_tee::arrival& last() { return fake_tee::now().arrivals.back(); }
  static std::size_t count() { return fake_tee::now().arrivals.size(); }

  /// The failure that `work` throws.
  template <class Work>
  static keymaster::client::failure failure_of(const Work& work) {
    try {
      work();
    } catch (const keymaster::client::error& refused) {
      return refused.facts();
    }
    ADD_FAILURE() << "nothing was thrown";
    return {.kind = keymaster::client::error_kind::connection, .step = {}};
  }

  /// Expects `work` to fail because a companion, and not somebody else, answers the prepared result.
  template <class Work>
  static void expect_refused(const Work& work, const std::string& step, std::uint32_t result) {
    const auto facts = failure_of(work);
    EXPECT_EQ(facts.kind, keymaster::client::error_kind::companion) << step;
    EXPECT_EQ(facts.step, step);
    EXPECT_EQ(facts.tee_result, result) << step;
    EXPECT_EQ(facts.tee_origin, TEEC_ORIGIN_TRUSTED_APP) << step;
  }

  std::optional<keymaster::client::connection> tee;
};

#endif  // KEYMASTER_TESTS_CLIENT_COMPANION_FIXTURE_H_
