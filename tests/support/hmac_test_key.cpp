#include "tests/support/hmac_test_key.h"

using namespace keymaster;

namespace testing_support {

const std::vector<hmac_limits> every_hmac = {
    {KM_DIGEST_MD5, 0xA0000001, 64, 512, 128},         {KM_DIGEST_SHA1, 0xA0000002, 80, 512, 160},
    {KM_DIGEST_SHA_2_224, 0xA0000003, 112, 512, 224},  {KM_DIGEST_SHA_2_256, 0xA0000004, 192, 1024, 256},
    {KM_DIGEST_SHA_2_384, 0xA0000005, 256, 1024, 384}, {KM_DIGEST_SHA_2_512, 0xA0000006, 256, 1024, 512}};

param_list hmac_key(std::uint32_t digest, std::uint32_t bits, std::uint32_t min_mac) {
  param_list list;
  list.add(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC)
      .add(KM_TAG_DIGEST, digest)
      .add(KM_TAG_MIN_MAC_LENGTH, min_mac)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY)
      .add(KM_TAG_NO_AUTH_REQUIRED);
  if (bits != 0) list.add(KM_TAG_KEY_SIZE, bits);
  return list;
}

param_list hmac_length(std::uint32_t bits) {
  return param_list{}.add(KM_TAG_MAC_LENGTH, bits);
}

}  // namespace testing_support
