// The device as the platform's functions see it: what all TA instances share.
#ifndef TEE_RUNTIME_DEVICE_H_
#define TEE_RUNTIME_DEVICE_H_

#include <array>
#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "tee/runtime/clocks.h"
#include "tee/runtime/faults.h"
#include "tee/runtime/trace_log.h"
#include "tee_internal_api_extensions.h"

namespace hosted_tee {

class object_store;  // tee/storage/object_store.h

/// How one TA calls another. The secure world carries it out; a device without one has no other TA.
class session_service {
 public:
  session_service() = default;
  session_service(const session_service&) = delete;
  session_service& operator=(const session_service&) = delete;
  virtual ~session_service() = default;

  virtual TEE_Result open_nested(const TEE_UUID& ta, const TEE_Identity& client, std::uint32_t param_types,
                                 TEE_Param params[4], std::uint32_t& session, std::uint32_t& origin) = 0;
  virtual TEE_Result invoke_nested(std::uint32_t session, std::uint32_t command, std::uint32_t param_types,
                                   TEE_Param params[4], std::uint32_t& origin) = 0;
  virtual void close_nested(std::uint32_t session) = 0;
};

/// Default-constructed it is a device with running clocks, an all-zero identity and boot seed and nothing attached: no
/// storage, no other TA. That is all that a unit test of a platform function needs.
class device_services {
 public:
  device_services();
  ~device_services();
  device_services(const device_services&) = delete;
  device_services& operator=(const device_services&) = delete;

  clocks clock;
  trace_log trace;
  fault_plan faults;
  TEE_UUID id{};
  std::array<std::uint8_t, 32> boot_seed{};
  std::map<std::string, std::string, std::less<>> text_properties;  ///< of TEE_PROPSET_TEE_IMPLEMENTATION
  session_service* other_tas = nullptr;
  std::vector<std::filesystem::path> ta_folders;  ///< where the images of TAs lie

  std::unique_ptr<object_store> private_store;
  std::unique_ptr<object_store> rpmb_store;  ///< null: a device without RPMB

  /// store answers the store behind a TEE_STORAGE_* identifier, or null where there is none.
  [[nodiscard]] object_store* store(std::uint32_t storage) const;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_DEVICE_H_
