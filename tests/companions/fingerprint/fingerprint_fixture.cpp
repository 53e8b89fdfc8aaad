#include "tests/companions/fingerprint/fingerprint_fixture.h"

#include <stdexcept>

using namespace keymaster::fingerprint;

namespace testing_support {

enrol_answer FingerprintTest::enrol(std::uint64_t secure_id) {
  TEE_Param params[4] = {wide_slot(secure_id)};
  enrol_answer got;
  got.result = invoke(COMMAND_ENROL, enrol_types, params);
  got.finger = params[1].value.a;
  return got;
}

touch_answer FingerprintTest::touch(std::uint32_t finger, std::uint64_t challenge, std::size_t capacity) {
  touch_answer got;
  got.token.assign(capacity, canary);
  TEE_Param params[4] = {value_slot(finger), wide_slot(challenge), memory_slot(got.token)};
  got.result = invoke(COMMAND_TOUCH, touch_types, params);
  got.size = params[2].memref.size;
  got.told = params[3].value.a;
  return got;
}

TEE_Result FingerprintTest::remove(std::uint32_t finger) {
  TEE_Param params[4] = {value_slot(finger)};
  return invoke(COMMAND_REMOVE, remove_types, params);
}

list_answer FingerprintTest::list(std::size_t capacity) {
  list_answer got;
  got.records.assign(capacity, canary);
  TEE_Param params[4] = {memory_slot(got.records)};
  got.result = invoke(COMMAND_LIST, list_types, params);
  got.size = params[0].memref.size;
  return got;
}

std::uint32_t FingerprintTest::must_enrol(std::uint64_t secure_id) {
  const enrol_answer got = enrol(secure_id);
  if (got.result != TEE_SUCCESS) throw std::runtime_error("the finger can't be enrolled");
  return got.finger;
}

bytes FingerprintTest::must_touch(std::uint32_t finger, std::uint64_t challenge) {
  const touch_answer got = touch(finger, challenge);
  if (got.result != TEE_SUCCESS || got.size != 69) throw std::runtime_error("the touch yields no token");
  return got.token;
}

bytes FingerprintTest::listed() {
  const list_answer got = list();
  if (got.result != TEE_SUCCESS) throw std::runtime_error("the fingers can't be listed");
  return {got.records.begin(), got.records.begin() + got.size};
}

std::uint64_t FingerprintTest::authenticator_id() {
  const auto kept = stored("fp.authid");
  if (!kept || kept->size() != 8) throw std::runtime_error("there is no authenticator id");
  return u32_at(*kept, 0) | std::uint64_t{u32_at(*kept, 4)} << 32;
}

bytes record(std::uint32_t finger, std::uint64_t secure_id) {
  return join({u32(finger), u64(secure_id)});
}

}  // namespace testing_support
