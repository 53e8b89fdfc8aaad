// A device whose provisioning TA a test talks to, as anybody it likes.
#ifndef TESTS_COMPANIONS_PROVISIONING_PROVISIONING_FIXTURE_H_
#define TESTS_COMPANIONS_PROVISIONING_PROVISIONING_FIXTURE_H_

#include <optional>

#include "tee/companions/provisioning/provisioning_protocol.h"
#include "tests/companions/companion_fixture.h"
#include "tests/support/played_quil.h"
#include "tests/support/rsa_test_key.h"

namespace testing_support {

inline constexpr TEE_UUID quil_ta = QUIL_TA_UUID;
inline constexpr TEE_Identity as_keymaster = {TEE_LOGIN_TRUSTED_APP, KEYMASTER_TA_UUID};

/// What a command with an output answered: the whole buffer, and what became of its size.
struct quil_answer {
  TEE_Result result = 0xDEADBEEF;
  bytes buffer;
  std::uint32_t size = 0;    // of the output slot
  std::uint32_t length = 0;  // slot 1 `a`, of the commands that have it

  [[nodiscard]] bytes data() const { return {buffer.begin(), buffer.begin() + size}; }
};

class ProvisioningTest : public CompanionTest {
 protected:
  ProvisioningTest();

  // The commands, well-formed, as those clients that may send them.
  TEE_Result put_key(const bytes& box) { return put(keymaster::provisioning::COMMAND_PUT_KEY, box); }
  TEE_Result put_data(const bytes& data) { return put(keymaster::provisioning::COMMAND_PUT_DATA, data); }
  TEE_Result put_property(const bytes& request, const bytes& value);
  quil_answer generate(std::uint32_t bits = 2048, std::size_t capacity = 294);
  TEE_Result lock();
  quil_answer get_key(std::size_t capacity = 8192) { return fetch(keymaster::QUIL_COMMAND_GET_KEY, capacity); }
  quil_answer get_data(std::size_t capacity = 8192) { return fetch(keymaster::QUIL_COMMAND_GET_DATA, capacity); }
  quil_answer get_property(const bytes& request, std::size_t capacity = 512);
  /// status fails the test, and answers nothing, unless the TA tells it.
  std::optional<std::uint32_t> status();

  /// invoke_as_keymaster sends a command with the Keymaster TA's identity; invoke sends it from the normal world.
  TEE_Result invoke_as_keymaster(std::uint32_t command, std::uint32_t types, TEE_Param (&params)[4]) {
    return as_keymaster_->invoke(command, types, params);
  }

  /// restart is a reboot of the device.
  void restart();

 private:
  TEE_Result put(std::uint32_t command, const bytes& data);
  quil_answer fetch(std::uint32_t command, std::size_t capacity);

  std::optional<companion_session> as_keymaster_;
};

}  // namespace testing_support

#endif  // TESTS_COMPANIONS_PROVISIONING_PROVISIONING_FIXTURE_H_
