#include "client/lib/error.h"

#include "client/lib/names.h"

namespace keymaster::client {
namespace {

std::string describe(const failure& facts) {
  std::string text = facts.step + " failed: " + tee_result_name(facts.tee_result);
  if (facts.tee_result != 0) {
    text += " from " + tee_origin_name(facts.tee_origin);
  }
  if (facts.kind != error_kind::connection) {
    text += ", " + keymaster_error_name(facts.keymaster_error) + " (" + std::to_string(facts.keymaster_error) + ")";
  }
  return text;
}

}  // namespace

error::error(failure facts) : std::runtime_error(describe(facts)), facts_(std::move(facts)), hint_(hint_for(facts_)) {}

}  // namespace keymaster::client
