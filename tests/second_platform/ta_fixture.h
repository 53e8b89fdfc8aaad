// The TA on the second platform, reached through its five entry points and nothing else.
#ifndef TESTS_SECOND_PLATFORM_TA_FIXTURE_H_
#define TESTS_SECOND_PLATFORM_TA_FIXTURE_H_

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <iosfwd>
#include <optional>

#include "params/keymaster_protocol.h"
#include "tests/second_platform/platform.h"
#include "tests/support/param_list.h"

namespace second_platform {

using testing_support::param_list;

/// What a command comes to: the result and, in slot 0, the Keymaster error.
struct outcome {
  TEE_Result result = TEE_SUCCESS;
  std::int32_t error = 0;
  bool operator==(const outcome&) const = default;
};
std::ostream& operator<<(std::ostream& out, const outcome& shown);

struct command_answer : outcome {
  std::uint32_t b = 0;
  bytes body;
  std::uint32_t reported = 0;  // the size of slot 2, whatever there was room for
};

/// ta calls the TA's commands, with requests and responses in memory that is exactly as long as they are.
class ta {
 public:
  static constexpr std::uint32_t room = 4096;

  command_answer call(std::uint32_t command, std::uint32_t a, const std::optional<bytes>& request,
                      std::optional<std::uint32_t> capacity);

  // Responses have room for 4096 bytes unless it is said.
  command_answer generate(const param_list& params, std::uint32_t capacity = room);
  command_answer import_key(const param_list& params, const bytes& material, std::uint32_t capacity = room);
  command_answer characteristics(const bytes& blob);
  command_answer export_key(const bytes& blob);
  command_answer begin(std::uint32_t purpose, const bytes& blob, const param_list& params);
  command_answer update(std::uint32_t handle, const bytes& input, const param_list& params = {},
                        std::uint32_t capacity = room);
  command_answer finish(std::uint32_t handle, const bytes& input = {}, const param_list& params = {},
                        std::uint32_t capacity = room);
  command_answer abort(std::uint32_t handle);
  /// soter calls one of the commands that need neither handle nor request; 0xFF02 and 0xFF03 offer a response.
  command_answer soter(std::uint32_t command);

  /// The same, and they must succeed; what comes back is the blob, or the handle.
  bytes must_generate(const param_list& params, std::uint32_t capacity = room);
  std::uint32_t must_begin(std::uint32_t purpose, const bytes& blob, const param_list& params);
};

/// power_on is a device with a provisioned attestation key whose TA has not started yet.
void power_on();

/// Fixture with the TA started and nothing noted yet.
class SecondPlatformTest : public ::testing::Test {
 protected:
  SecondPlatformTest();
  ~SecondPlatformTest() override;

  void SetUp() override;
  void TearDown() override;

  ta keymaster_ta;
};

// Kinds of keys, all of which every purpose and parameter is allowed for.
param_list any_use(std::uint32_t algorithm, std::uint32_t bits);
param_list rsa_key(std::uint32_t bits = 1024);
param_list aes_key();
param_list ec_key(std::uint32_t bits = 256);
param_list hmac_key();
/// soter_key signs statements and is exported in one, signed by the attestation key.
param_list soter_key();

// Parameters of begin.
param_list aes_params(std::uint32_t mode, std::uint32_t padding = keymaster::KM_PAD_NONE);
param_list digest_params(std::uint32_t digest, std::uint32_t padding);
param_list mac_params(std::uint32_t bits = 256);

}  // namespace second_platform

#endif  // TESTS_SECOND_PLATFORM_TA_FIXTURE_H_
