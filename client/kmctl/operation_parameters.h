// What begin must be told, completed by what the key leaves no choice about.
#ifndef KEYMASTER_CLIENT_KMCTL_OPERATION_PARAMETERS_H_
#define KEYMASTER_CLIENT_KMCTL_OPERATION_PARAMETERS_H_

#include <cstdint>

#include "client/lib/authorizations.h"

namespace kmctl {

/// operation_parameters gives what begin needs to use a key with these characteristics for `purpose`: what was given,
/// and where padding, digest or block mode is missing the only one of the key's that serves the purpose. A MAC is as
/// long as its digest, and a GCM tag has 128 bits, unless something else was given. Throws usage_error when there is a
/// choice.
[[nodiscard]] keymaster::client::authorizations operation_parameters(
    keymaster::keymaster_purpose_t purpose, const keymaster::client::authorizations& given,
    const keymaster::client::authorizations& characteristics);

/// digest_bits gives the length of a digest, and 0 for what isn't one.
[[nodiscard]] std::uint32_t digest_bits(std::uint64_t digest);

/// nonce_size gives how many bytes of nonce an operation with these parameters has; 0 when it has none.
[[nodiscard]] std::size_t nonce_size(const keymaster::client::authorizations& parameters);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_OPERATION_PARAMETERS_H_
