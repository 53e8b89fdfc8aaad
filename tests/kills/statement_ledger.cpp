#include "tests/kills/statement_ledger.h"

#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include "src/params/keymaster_defs.h"
#include "tests/support/rsa_test_key.h"

namespace hosted_tee::testing {

using testing_support::bytes;
using testing_support::rsa_test_key;

statement_ledger::request statement_ledger::ask() {
  const std::scoped_lock lock(mutex_);
  ++asked_;
  return {told_.empty() ? 0 : *told_.rbegin()};
}

void statement_ledger::note(const request& asked, std::uint64_t value) {
  const std::scoped_lock lock(mutex_);
  EXPECT_TRUE(told_.insert(value).second) << "the counter has told " << value << " twice";
  EXPECT_GT(value, asked.highest_before) << "the counter has gone back";
  EXPECT_LE(value, asked_) << "the counter has moved more often than it was asked to";
}

std::size_t statement_ledger::told() const {
  const std::scoped_lock lock(mutex_);
  return told_.size();
}

void statement_ledger::expect_no_gaps() const {
  const std::scoped_lock lock(mutex_);
  if (!told_.empty()) {
    EXPECT_EQ(told_.size(), *told_.rbegin()) << "a statement was made and not told";
  }
}

std::optional<std::uint64_t> counter_in(std::span<const std::uint8_t> statement, unsigned signer_bits, const char* name,
                                        const std::string& content) {
  const rsa_test_key& signer = rsa_test_key::of_bits(signer_bits);
  if (statement.size() < 4 + signer.size()) {
    ADD_FAILURE() << "a statement of " << statement.size() << " bytes";
    return std::nullopt;
  }
  const auto signed_part = statement.subspan(4, statement.size() - 4 - signer.size());
  const bytes text(signed_part.begin(), signed_part.end());
  const auto last = statement.last(signer.size());
  EXPECT_EQ(testing_support::u32_at(statement, 0), text.size());
  EXPECT_TRUE(signer.verifies(keymaster::KM_DIGEST_SHA_2_256, keymaster::KM_PAD_RSA_PKCS1_1_5_SIGN, text,
                              {last.begin(), last.end()}))
      << "a statement's signature does not hold";
  const auto end = !text.empty() && text.back() == 0 ? text.end() - 1 : text.end();
  const auto told = nlohmann::json::parse(text.begin(), end, nullptr, false);
  if (!told.is_object() || !told.contains("counter") || !told["counter"].is_number_unsigned()) {
    ADD_FAILURE() << "a statement without a counter: " << std::string(text.begin(), end);
    return std::nullopt;
  }
  EXPECT_EQ(told.value(name, ""), content);
  return told["counter"].get<std::uint64_t>();
}

}  // namespace hosted_tee::testing
