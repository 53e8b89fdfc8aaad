#include "tee/crypto/algorithms.h"

#include <array>
#include <stdexcept>
#include <string>

namespace hosted_tee {

namespace {

struct digest_row {
  const char* name;
  std::uint32_t bytes;
};
constexpr std::array<digest_row, 7> digests = {{
    {nullptr, 0},
    {"MD5", 16},
    {"SHA1", 20},
    {"SHA2-224", 28},
    {"SHA2-256", 32},
    {"SHA2-384", 48},
    {"SHA2-512", 64},
}};
constexpr std::array<const char*, 4> mode_names = {"ECB", "CBC", "CTR", "GCM"};
constexpr std::array<const char*, 3> aes_names = {"AES-128-", "AES-192-", "AES-256-"};

/// fetched turns what libcrypto's fetch returned into an owner; null: the library was built without the algorithm.
template <class Owner>
Owner fetched(typename Owner::pointer algorithm) {
  if (algorithm == nullptr) throw std::runtime_error("libcrypto lacks an algorithm");
  return Owner(algorithm);
}

struct fetched_algorithms {
  fetched_algorithms() {
    for (std::size_t i = 1; i < digests.size(); ++i) {
      by_digest[i] = fetched<evp_digest>(EVP_MD_fetch(nullptr, digests[i].name, nullptr));
    }
    for (std::size_t mode = 0; mode < mode_names.size(); ++mode) {
      for (std::size_t size = 0; size < aes_names.size(); ++size) {
        const std::string name = std::string(aes_names[size]) + mode_names[mode];
        aes[mode][size] = fetched<evp_cipher>(EVP_CIPHER_fetch(nullptr, name.c_str(), nullptr));
      }
    }
    hmac = fetched<evp_mac>(EVP_MAC_fetch(nullptr, "HMAC", nullptr));
  }

  std::array<evp_digest, digests.size()> by_digest;
  std::array<std::array<evp_cipher, aes_names.size()>, mode_names.size()> aes;
  evp_mac hmac;
};

const fetched_algorithms& algorithms() {
  static const fetched_algorithms all;
  return all;
}

}  // namespace

std::uint32_t digest_bytes(digest_kind digest) {
  return digests.at(static_cast<std::size_t>(digest)).bytes;
}

const char* digest_name(digest_kind digest) {
  return digests.at(static_cast<std::size_t>(digest)).name;
}

const EVP_MD* fetched_digest(digest_kind digest) {
  return algorithms().by_digest.at(static_cast<std::size_t>(digest)).get();
}

const EVP_CIPHER* fetched_aes(block_mode mode, std::size_t key_bytes) {
  return algorithms().aes.at(static_cast<std::size_t>(mode)).at(key_bytes / 8 - 2).get();
}

EVP_MAC* fetched_hmac() {
  return algorithms().hmac.get();
}

}  // namespace hosted_tee
