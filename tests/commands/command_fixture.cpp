#include "tests/commands/command_fixture.h"

#include <stdexcept>

using namespace keymaster;

namespace testing_support {

failure refused(std::int32_t error, trace_lines lines) {
  return {TEEC_SUCCESS, error, std::move(lines)};
}

failure broken(TEEC_Result result, trace_lines lines) {
  return {result, KM_ERROR_UNKNOWN_ERROR, std::move(lines)};
}

trace_lines CommandTest::lines(hosted_tee::trace_level level) {
  trace_lines found;
  for (const hosted_tee::trace_line& line : tee.world().trace().lines()) {
    if (line.level == level) found.push_back(line.text);
  }
  return found;
}

bytes CommandTest::import_fixed(unsigned bits) {
  return import_fixed(bits, rsa_key(bits));
}

bytes CommandTest::import_fixed(unsigned bits, const param_list& params) {
  return client().must_import(params, rsa_test_key::of_bits(bits).material());
}

bytes CommandTest::stored_ksk() {
  const auto value = tee.world().read_object(keymaster_ta, TEE_STORAGE_RPMB, stored_ksk_name);
  if (!value) throw std::runtime_error("the device has no key storage key");
  return {value->begin(), value->end()};
}

}  // namespace testing_support
