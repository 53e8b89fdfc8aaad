#include "tests/support/libcrypto_digest.h"

#include <openssl/hmac.h>

#include <map>
#include <stdexcept>

using namespace keymaster;

namespace testing_support {

const EVP_MD* libcrypto_digest(std::uint32_t digest) {
  static const std::map<std::uint32_t, const EVP_MD* (*)()> all = {
      {KM_DIGEST_MD5, EVP_md5},          {KM_DIGEST_SHA1, EVP_sha1},        {KM_DIGEST_SHA_2_224, EVP_sha224},
      {KM_DIGEST_SHA_2_256, EVP_sha256}, {KM_DIGEST_SHA_2_384, EVP_sha384}, {KM_DIGEST_SHA_2_512, EVP_sha512}};
  return all.at(digest)();
}

std::size_t digest_size(std::uint32_t digest) {
  return static_cast<std::size_t>(EVP_MD_get_size(libcrypto_digest(digest)));
}

bytes digest_of(std::uint32_t digest, std::span<const std::uint8_t> message) {
  bytes value(digest_size(digest));
  unsigned length = 0;
  if (EVP_Digest(message.data(), message.size(), value.data(), &length, libcrypto_digest(digest), nullptr) != 1) {
    throw std::runtime_error("libcrypto computes no digest");
  }
  return value;
}

bytes hmac_of(std::uint32_t digest, std::span<const std::uint8_t> key, std::span<const std::uint8_t> message) {
  bytes mac(digest_size(digest));
  unsigned length = 0;
  if (HMAC(libcrypto_digest(digest), key.data(), static_cast<int>(key.size()), message.data(), message.size(),
           mac.data(), &length) == nullptr) {
    throw std::runtime_error("libcrypto computes no HMAC");
  }
  return mac;
}

}  // namespace testing_support
