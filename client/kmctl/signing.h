// Signing and verifying a stream: RSA and EC signatures, and MACs. Statements of messages.
#ifndef KEYMASTER_CLIENT_KMCTL_SIGNING_H_
#define KEYMASTER_CLIENT_KMCTL_SIGNING_H_

#include "client/kmctl/key_use.h"

namespace kmctl {

/// sign_stream signs the data. Throws keymaster::client::error, and failure_error when the data can't be read.
[[nodiscard]] bytes sign_stream(keymaster::client::session& ta, const key_use& key, const data_stream& data);

/// sign_statement has an attested key make a statement of the message, which must be UTF-8 without a NUL: failure_error
/// if it isn't, before anything is asked of the TA. The message is complete before the user is asked, so that a touch
/// is still fresh at the end. Throws keymaster::client::error, and what the key's user throws.
[[nodiscard]] bytes sign_statement(keymaster::client::session& ta, const key_use& key, byte_view message);

/// verify_stream checks a signature over the data. Throws the same; the error KM_ERROR_VERIFICATION_FAILED says that
/// the signature does not belong to the data and the key.
void verify_stream(keymaster::client::session& ta, const key_use& key, const data_stream& data, byte_view signature);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_SIGNING_H_
