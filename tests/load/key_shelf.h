// Keys of which the tests know everything, on a device that they gave its identity to.
#ifndef TESTS_LOAD_KEY_SHELF_H_
#define TESTS_LOAD_KEY_SHELF_H_

#include "tests/support/bytes.h"

namespace load {

using testing_support::bytes;

struct rsa_pair {
  unsigned bits;
  bytes signing, ciphering;  // two blobs of the same rsa_test_key
};
struct ec_pair {
  std::uint32_t bits;
  bytes blob;  // of ec_test_key
};
struct aes_secret {
  bytes key, blob;
};
struct hmac_secret {
  std::uint32_t digest, longest_mac;
  bytes key, blob;
};

/// Blobs belong to the device and not to a client: everybody can use them at once.
struct key_shelf {
  std::vector<rsa_pair> rsa;
  std::vector<ec_pair> ec;
  std::vector<aes_secret> aes;
  std::vector<hmac_secret> hmac;
  bytes attestation_pem;  // as the TA writes it, its NUL included
  bytes device_id;
};

/// fill_shelf provisions the device at the other end of `context_name` and imports the keys. Throws std::exception when
/// anything of that is refused. Afterwards the fixed keys of testing_support are all loaded, so that threads can share
/// them.
key_shelf fill_shelf(const std::string& context_name);

}  // namespace load

#endif  // TESTS_LOAD_KEY_SHELF_H_
