// The Keymaster TA's attestation commands: the attestation key, the resources that go with it, and the device's id.
#ifndef KEYMASTER_CLIENT_LIB_ATTESTATION_H_
#define KEYMASTER_CLIENT_LIB_ATTESTATION_H_

#include <string>

#include "client/lib/bytes.h"
#include "client/lib/session.h"

namespace keymaster::client {

// Each of these throws error: error_kind::soter when the TA answers a status other than SOTER_STATUS_OK (facts() has it
// in soter_status), error_kind::tee when it does not carry out the request.

/// ensure_ready has the TA load the attestation key and the device's properties, which it needs before it makes or
/// exports attested keys, and before it takes a finger. It answers KM_ERROR_UNKNOWN_ERROR for whatever is missing.
void ensure_ready(session& ta);

/// verify_attk has the TA read the attestation key now. SOTER_STATUS_NO_ATTK, SOTER_STATUS_UNREADABLE_ATTK.
void verify_attk(session& ta);

enum class attk_status { present, absent, unreadable };

/// get_attk_status tells the same in place of throwing.
[[nodiscard]] attk_status get_attk_status(session& ta);

/// is_ready tells whether ensure_ready succeeds.
[[nodiscard]] bool is_ready(session& ta);

/// export_attk gives the public half of the attestation key as PEM, all of its base64 in one line and without a line
/// end at the end, which rsa_public_key::from_statement reads. Throws format_error when the TA's answer is no such
/// text.
[[nodiscard]] std::string export_attk(session& ta);

/// get_device_id gives the device's id, up to 64 bytes. Throws format_error when it is empty.
[[nodiscard]] bytes get_device_id(session& ta);

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_ATTESTATION_H_
