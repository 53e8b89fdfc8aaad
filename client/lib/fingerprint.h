// The fingerprint TA: fingers that belong to users, and touches that yield auth tokens.
#ifndef KEYMASTER_CLIENT_LIB_FINGERPRINT_H_
#define KEYMASTER_CLIENT_LIB_FINGERPRINT_H_

#include <cstdint>
#include <vector>

#include "client/lib/bytes.h"
#include "client/lib/ta_session.h"

namespace keymaster::client {

/// An enrolled finger, and the secure id of its user.
struct finger {
  std::uint32_t id = 0;
  std::uint64_t secure_id = 0;

  friend bool operator==(const finger&, const finger&) = default;
};

/// What a touch leads to.
struct touch_result {
  bytes token;                         ///< the auth token, see auth_token.h
  std::uint32_t keymaster_result = 0;  ///< what the Keymaster TA answered when it was told of the finger
};

/// A session with the fingerprint TA. Every call throws error with error_kind::companion when the TA refuses it, and
/// format_error when its answer is malformed.
class fingerprint {
 public:
  /// Opens the session. Throws error with error_kind::connection.
  explicit fingerprint(connection& tee);

  /// enrol takes a new finger of the user `secure_id` and gives its id. TEEC_ERROR_BAD_PARAMETERS for 0, which is
  /// nobody; TEE_ERROR_OVERFLOW when no more fingers fit in.
  [[nodiscard]] std::uint32_t enrol(std::uint64_t secure_id);

  /// touch is the finger on the sensor: the Keymaster TA is told of it, which counts as long as a session with that TA
  /// is open, and the token says `challenge`. For the finger to be believed the Keymaster TA must be ready, see
  /// ensure_ready in attestation.h; else keymaster_result tells the refusal. TEEC_ERROR_ITEM_NOT_FOUND: no such finger.
  [[nodiscard]] touch_result touch(std::uint32_t id, std::uint64_t challenge = 0);

  /// remove forgets a finger. TEEC_ERROR_ITEM_NOT_FOUND.
  void remove(std::uint32_t id);

  /// list gives the fingers in the order of their enrolment.
  [[nodiscard]] std::vector<finger> list();

 private:
  ta_session session_;
};

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_FINGERPRINT_H_
