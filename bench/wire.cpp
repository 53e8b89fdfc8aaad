#include "bench/wire.h"

#include "src/params/keymaster_defs.h"

using namespace keymaster;

namespace bench {
namespace {

void append_u64(bytes& body, std::uint64_t value) {
  append_u32(body, static_cast<std::uint32_t>(value));
  append_u32(body, static_cast<std::uint32_t>(value >> 32));
}

void append_number(bytes& body, std::uint32_t tag, std::uint64_t value) {
  append_u32(body, tag);
  append_u32(body, 0);
  append_u64(body, value);
  append_u64(body, 0);
}

}  // namespace

void append_u32(bytes& body, std::uint32_t value) {
  for (int shift = 0; shift < 32; shift += 8) body.push_back(static_cast<std::uint8_t>(value >> shift));
}

void append_block(bytes& body, const bytes& block) {
  append_u32(body, static_cast<std::uint32_t>(block.size()));
  body.insert(body.end(), block.begin(), block.end());
}

std::uint32_t u32_at(const bytes& data, std::size_t offset) {
  std::uint32_t value = 0;
  for (std::size_t i = 0; i < 4; ++i) value |= std::uint32_t{data.at(offset + i)} << (8 * i);
  return value;
}

bytes marshal(numbers params) {
  bytes body;
  append_u32(body, static_cast<std::uint32_t>(params.size()));
  for (const auto& [tag, value] : params) append_number(body, tag, value);
  return body;
}

bytes key_params(std::uint32_t algorithm, std::uint32_t bits, numbers more) {
  bytes body;
  append_u32(body, static_cast<std::uint32_t>(3 + more.size()));
  append_number(body, KM_TAG_ALGORITHM, algorithm);
  append_number(body, KM_TAG_KEY_SIZE, bits);
  append_number(body, KM_TAG_NO_AUTH_REQUIRED, 1);
  for (const auto& [tag, value] : more) append_number(body, tag, value);
  return body;
}

bytes rsa_sign_key(std::uint32_t bits) {
  return key_params(KM_ALGORITHM_RSA, bits,
                    {{KM_TAG_RSA_PUBLIC_EXPONENT, 65537},
                     {KM_TAG_PURPOSE, KM_PURPOSE_SIGN},
                     {KM_TAG_DIGEST, KM_DIGEST_SHA_2_256},
                     {KM_TAG_PADDING, KM_PAD_RSA_PKCS1_1_5_SIGN}});
}

bytes rsa_sign_params() {
  return marshal({{KM_TAG_DIGEST, KM_DIGEST_SHA_2_256}, {KM_TAG_PADDING, KM_PAD_RSA_PKCS1_1_5_SIGN}});
}

}  // namespace bench
