// What passes between the key store and the platform, where the platform's own fault plan does not reach. This program
// defines some of the platform's functions itself, notes their arguments and calls the hosted TEE's.
#ifndef TESTS_KEYSTORE_PLATFORM_SPY_H_
#define TESTS_KEYSTORE_PLATFORM_SPY_H_

#include <optional>
#include <vector>

#include "tee_internal_api.h"
#include "tests/support/bytes.h"

namespace testing_support {

struct create_call {
  std::uint32_t storage;
  bytes id;
  std::uint32_t flags;
  bool has_attributes;
  bytes data;
};
struct open_call {
  std::uint32_t storage;
  bytes id;
  std::uint32_t flags;
};
struct ae_init_call {
  bytes nonce;
  std::uint32_t tag_bits, aad_length, payload_length;
};

struct platform_spy {
  std::vector<create_call> created;
  std::vector<open_call> opened;
  std::vector<ae_init_call> ae_started;
  std::vector<bytes> encrypted;                     // the chunks that TEE_AEUpdate was given
  std::vector<std::uint32_t> final_rooms;           // the capacities that TEE_AEDecryptFinal was offered
  std::optional<std::uint32_t> falsify_tag_length;  // what the next TEE_AEEncryptFinal reports for its tag
};
extern platform_spy spy;

}  // namespace testing_support

#endif  // TESTS_KEYSTORE_PLATFORM_SPY_H_
