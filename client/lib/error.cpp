#include "client/lib/error.h"

#include "client/lib/names.h"

namespace keymaster::client {
namespace {

std::string numbered(const std::string& name, std::int32_t number) {
  return ", " + name + " (" + std::to_string(number) + ")";
}

/// What the TA adds to the result.
std::string beside_result(const failure& facts) {
  switch (facts.kind) {
    case error_kind::tee:
    case error_kind::keymaster:
      return numbered(keymaster_error_name(facts.keymaster_error), facts.keymaster_error);
    case error_kind::soter:
      return numbered(soter_status_name(facts.soter_status), facts.soter_status);
    case error_kind::connection:
    case error_kind::companion:
      break;
  }
  return facts.wait_ms == 0 ? std::string{} : ", wait " + std::to_string(facts.wait_ms) + " ms";
}

std::string describe(const failure& facts) {
  std::string text = facts.step + " failed: " + tee_result_name(facts.tee_result);
  if (facts.tee_result != 0) {
    text += " from " + tee_origin_name(facts.tee_origin);
  }
  return text + beside_result(facts);
}

}  // namespace

error::error(failure facts) : std::runtime_error(describe(facts)), facts_(std::move(facts)), hint_(hint_for(facts_)) {}

}  // namespace keymaster::client
