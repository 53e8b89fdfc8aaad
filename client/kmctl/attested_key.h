// The descriptions of attested keys.
#ifndef KEYMASTER_CLIENT_KMCTL_ATTESTED_KEY_H_
#define KEYMASTER_CLIENT_KMCTL_ATTESTED_KEY_H_

#include "client/lib/authorizations.h"

namespace kmctl {

/// attested_description completes what was said of a new key if it is to be an attested one: an RSA-2048 key for
/// statements, signed with PKCS#1 v1.5 unless another padding is named, whose own statement the attestation key signs
/// unless another key is named. Other descriptions come back as they are. Throws usage_error for a description that
/// makes an attested key worthless: whoever can use its bare private operation can sign any statement with it.
[[nodiscard]] keymaster::client::authorizations attested_description(const keymaster::client::authorizations& given);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_ATTESTED_KEY_H_
