// Boxes taken apart without the TA's own code, and what libcrypto makes of the numbers in them.
#ifndef TESTS_COMPANIONS_PROVISIONING_REFERENCE_BOX_H_
#define TESTS_COMPANIONS_PROVISIONING_REFERENCE_BOX_H_

#include <utility>

#include "tests/support/rsa_test_key.h"

namespace testing_support {

/// box_entries lists tags and values in their order; throws std::runtime_error for bytes that end within an entry.
std::vector<std::pair<std::uint16_t, bytes>> box_entries(const bytes& box);

/// components_of finds n, e, d, p, q, dp, dq and qinv; throws std::runtime_error when one is missing.
rsa_components components_of(const bytes& box);

/// spki_of is the SubjectPublicKeyInfo of the key, in DER, as libcrypto encodes it.
bytes spki_of(const rsa_components& key);

/// is_key_pair asks libcrypto whether the numbers fit together, primes and all.
bool is_key_pair(const rsa_components& key);

/// spki_of_pem reads a PEM public key with libcrypto, and encodes it in DER again.
bytes spki_of_pem(const bytes& pem);

}  // namespace testing_support

#endif  // TESTS_COMPANIONS_PROVISIONING_REFERENCE_BOX_H_
