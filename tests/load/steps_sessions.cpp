// The soter commands, and sessions that come and go.
#include "src/params/keymaster_defs.h"
#include "tests/load/steps.h"
#include "tests/support/ec_test_key.h"

using namespace keymaster;
using namespace testing_support;

namespace load {
namespace {

constexpr std::uint32_t status_and_response =
    TEEC_PARAM_TYPES(TEEC_VALUE_OUTPUT, TEEC_NONE, TEEC_MEMREF_TEMP_OUTPUT, TEEC_NONE);
constexpr std::uint32_t request_only = TEEC_PARAM_TYPES(TEEC_NONE, TEEC_MEMREF_TEMP_INPUT, TEEC_NONE, TEEC_NONE);
constexpr std::size_t most_added_sessions = 4;

}  // namespace

bool ask_soter(desk& d) {
  const answer loaded =
      d.client.call(KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR, d.below(9), 0, std::nullopt, std::nullopt);
  expect_ok(loaded, "loading the attestation key");
  expect_ok(d.client.call(KM_COMMAND_SOTER_VERIFY_ATTK_KEY_PAIR, 0, 0, std::nullopt, std::nullopt),
            "reading the attestation key");
  const auto ask = [&](std::uint32_t command, std::size_t capacity) {
    return d.client.call_types(command, status_and_response, 0, 0, {}, capacity);
  };
  const answer pem = ask(KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY, 445 + d.below(20'000));
  expect_ok(pem, "exporting the attestation key");
  expect(pem.body() == d.keys.attestation_pem, "the attestation key is the factory's");
  expect_none(ask(KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY, 1 + d.below(400)), TEEC_SUCCESS, KM_ERROR_UNKNOWN_ERROR,
              "no room for the attestation key");
  const answer id = ask(KM_COMMAND_SOTER_GET_DEVICE_ID, 64);
  expect_ok(id, "the device id");
  expect(id.body() == d.keys.device_id, "the device id is the factory's");
  expect(ask(KM_COMMAND_SOTER_GET_DEVICE_ID, 1 + d.below(15)), TEEC_SUCCESS, KM_ERROR_INSUFFICIENT_BUFFER_SPACE,
         "no room for the device id");
  const answer touched =
      d.client.call_types(KM_COMMAND_SOTER_SET_FID, request_only, 0, 0, join({u32(0), u32(1), u64(1)}), 0);
  expect(touched, TEEC_ERROR_ACCESS_DENIED, 0, "a finger from somebody who is not the fingerprint TA");
  return true;
}

// A session is opened or closed, or a second client comes, works and goes.
bool change_sessions(desk& d) {
  if (d.one_in(2)) {
    const auto added = static_cast<std::uint32_t>(d.client.added_sessions());
    if (added == 0 || (added < most_added_sessions && d.one_in(2))) {
      d.client.open_session();
    } else {
      d.client.close_session();
    }
    return true;
  }
  mixed_client guest(d.tee, d.random);
  const ec_pair& key = d.pick(d.keys.ec);
  const answer given = guest.export_key(key.blob);
  expect_ok(given, "a guest's export");
  expect(given.body() == ec_test_key::of_bits(key.bits).fields().public_material(), "a guest gets the right key");
  return true;
}

}  // namespace load
