#include "tee/runtime/uuid.h"

#include <openssl/rand.h>

#include <algorithm>
#include <cstring>
#include <stdexcept>
#include <vector>

#include "tee/crypto/algorithms.h"
#include "tee/runtime/hex.h"

namespace hosted_tee {
namespace {

constexpr std::array<std::size_t, 4> dashes{8, 13, 18, 23};

// The name space of client identities: a version 4 UUID drawn once for this system.
constexpr uuid_bytes client_name_space{0x6b, 0x1d, 0x0a, 0x5e, 0x93, 0x2c, 0x4f, 0x87,
                                       0xa4, 0x3b, 0x5d, 0xe2, 0x70, 0x19, 0xc8, 0x46};

TEE_UUID with_version(uuid_bytes bytes, unsigned version) {
  bytes[6] = static_cast<std::uint8_t>((bytes[6] & 0x0FU) | (version << 4));
  bytes[8] = static_cast<std::uint8_t>((bytes[8] & 0x3FU) | 0x80U);  // the variant of RFC 4122
  return from_bytes(bytes);
}

}  // namespace

uuid_bytes to_bytes(const TEE_UUID& uuid) {
  uuid_bytes bytes{};
  for (unsigned i = 0; i < 4; ++i) bytes[i] = static_cast<std::uint8_t>(uuid.timeLow >> (24 - 8 * i));
  bytes[4] = static_cast<std::uint8_t>(uuid.timeMid >> 8);
  bytes[5] = static_cast<std::uint8_t>(uuid.timeMid);
  bytes[6] = static_cast<std::uint8_t>(uuid.timeHiAndVersion >> 8);
  bytes[7] = static_cast<std::uint8_t>(uuid.timeHiAndVersion);
  std::copy(std::begin(uuid.clockSeqAndNode), std::end(uuid.clockSeqAndNode), bytes.begin() + 8);
  return bytes;
}

TEE_UUID from_bytes(const uuid_bytes& bytes) {
  TEE_UUID uuid{};
  for (unsigned i = 0; i < 4; ++i) uuid.timeLow = (uuid.timeLow << 8) | bytes[i];
  uuid.timeMid = static_cast<std::uint16_t>((bytes[4] << 8) | bytes[5]);
  uuid.timeHiAndVersion = static_cast<std::uint16_t>((bytes[6] << 8) | bytes[7]);
  std::copy(bytes.begin() + 8, bytes.end(), std::begin(uuid.clockSeqAndNode));
  return uuid;
}

std::string to_text(const TEE_UUID& uuid) {
  std::string text = to_hex(to_bytes(uuid));
  for (const std::size_t at : dashes) text.insert(at, 1, '-');
  return text;
}

std::optional<TEE_UUID> parse_uuid(std::string_view text) {
  if (text.size() != 36) return std::nullopt;
  std::string digits(text);
  for (auto at = dashes.rbegin(); at != dashes.rend(); ++at) {
    if (digits[*at] != '-') return std::nullopt;
    digits.erase(*at, 1);
  }
  uuid_bytes bytes{};
  if (!from_hex(digits, bytes)) return std::nullopt;
  return from_bytes(bytes);
}

bool same_uuid(const TEE_UUID& a, const TEE_UUID& b) {
  static_assert(sizeof(TEE_UUID) == 16, "no padding, so that the bytes are the value");
  return std::memcmp(&a, &b, sizeof a) == 0;
}

TEE_UUID random_uuid() {
  uuid_bytes bytes{};
  if (RAND_bytes(bytes.data(), static_cast<int>(bytes.size())) != 1) throw std::runtime_error("no random bytes");
  return with_version(bytes, 4);
}

TEE_UUID named_uuid(std::string_view name) {
  std::vector<std::uint8_t> input(client_name_space.begin(), client_name_space.end());
  input.insert(input.end(), name.begin(), name.end());
  std::array<std::uint8_t, EVP_MAX_MD_SIZE> digest{};
  if (EVP_Digest(input.data(), input.size(), digest.data(), nullptr, fetched_digest(digest_kind::sha1), nullptr) != 1) {
    throw std::runtime_error("SHA-1 is not available");
  }
  uuid_bytes bytes{};
  std::copy_n(digest.begin(), bytes.size(), bytes.begin());
  return with_version(bytes, 5);
}

}  // namespace hosted_tee
