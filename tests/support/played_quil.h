// The provisioning TA, played by a test: a table of answers, true ones and others.
#ifndef TESTS_SUPPORT_PLAYED_QUIL_H_
#define TESTS_SUPPORT_PLAYED_QUIL_H_

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "tee/runtime/device.h"
#include "tests/support/rsa_test_key.h"

namespace testing_support {

/// The fingerprint TA of the device that is played.
inline constexpr TEE_UUID fingerprint_ta = {0x11223344, 0x5566, 0x4788, {0x99, 1, 2, 3, 4, 5, 6, 7}};

/// One entry of a box, and a text as boxes have it.
[[nodiscard]] bytes tlv(std::uint16_t tag, const bytes& value);
[[nodiscard]] bytes text_with_nul(std::string_view text);

/// The box of an attestation key, of its first so many components, and that of the properties.
[[nodiscard]] bytes attestation_key_box(const rsa_components& key, std::size_t components = 8);
[[nodiscard]] bytes soter_property_box(const TEE_UUID& finger_ta = fingerprint_ta);

/// The requests of the properties, as they look on the wire.
inline constexpr const char* soter_property = "34180000";
inline constexpr const char* cpu_id_property = "34173a17";
inline constexpr const char* device_id_property = "34193619";

class played_quil : public hosted_tee::session_service {
 public:
  struct response {
    TEE_Result result = TEE_SUCCESS;
    bytes data = {};
    std::optional<std::uint32_t> length = {};  // what it says of the length, if that is a lie
  };

  TEE_Result opens = TEE_SUCCESS;
  response key;
  response data;
  std::map<std::string, response> properties;  // by request, in hex

  std::vector<std::string> calls;  // "2", "12 34180000", …
  int open_sessions = 0;
  std::vector<std::uint32_t> types;
  std::vector<std::uint32_t> capacities;
  std::vector<std::string> complaints;  // about how it was called: a test expects none

  /// provision gives it a key and all properties.
  void provision(const rsa_components& attestation_key);

  TEE_Result open_nested(const TEE_UUID& ta, const TEE_Identity& client, std::uint32_t param_types, TEE_Param params[4],
                         std::uint32_t& session, std::uint32_t& origin) override;
  TEE_Result invoke_nested(std::uint32_t session, std::uint32_t command, std::uint32_t param_types, TEE_Param params[4],
                           std::uint32_t& origin) override;
  void close_nested(std::uint32_t session) override;

 private:
  void expect(bool holds, const char* complaint);
};

}  // namespace testing_support

#endif  // TESTS_SUPPORT_PLAYED_QUIL_H_
