// The properties of the TEE and of its TAs, and the state of the device: from the TA "device information", where the
// TEE has one. The hosted TEE does.
#ifndef KEYMASTER_CLIENT_LIB_DEVICE_INFORMATION_H_
#define KEYMASTER_CLIENT_LIB_DEVICE_INFORMATION_H_

#include <cstdint>
#include <optional>
#include <string>

#include "client/lib/ta_session.h"

namespace keymaster::client {

/// What the device is like at this moment. The clocks are in milliseconds: the system time since an origin of the
/// TEE's, the REE time since 1970.
struct device_state {
  bool has_rpmb;  ///< whether its RPMB storage can be used
  std::uint64_t system_time;
  std::uint64_t ree_time;
};

/// A session with the TA "device information". Every call throws error with error_kind::companion when the TEE or the
/// TA refuses it for another reason than those told.
class device_information {
 public:
  /// Opens the session. Throws error with error_kind::connection; TEEC_ERROR_ITEM_NOT_FOUND says that this TEE does not
  /// have the TA.
  explicit device_information(connection& tee);

  /// tee_property gives the text form of a property of the TEE (gpd.tee.…). Nothing: it has no such property.
  [[nodiscard]] std::optional<std::string> tee_property(std::string_view name);

  /// ta_property gives the text form of a property of a TA (gpd.ta.…), which need not run. Nothing: there is no such
  /// TA, or it has no such property.
  [[nodiscard]] std::optional<std::string> ta_property(const TEEC_UUID& ta, std::string_view name);

  [[nodiscard]] device_state state();

 private:
  ta_session session_;
};

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_DEVICE_INFORMATION_H_
