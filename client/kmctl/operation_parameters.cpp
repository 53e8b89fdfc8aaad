#include "client/kmctl/operation_parameters.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <optional>
#include <vector>

#include "client/kmctl/exit_codes.h"
#include "client/lib/names.h"

namespace kmctl {
namespace {

using namespace keymaster;
using client::authorizations;

constexpr std::uint32_t gcm_tag_bits = 128;

/// What is known when a value is chosen: what was given or chosen so far, and the key.
struct choice {
  const authorizations& chosen;
  const authorizations& key;
};
using maybe = std::optional<std::uint64_t>;

[[noreturn]] void ask_for(keymaster_tag_t tag, const std::vector<std::uint64_t>& left) {
  const client::tag_name* const row = client::find_tag(tag);
  std::string choices;
  for (const std::uint64_t one : left) {
    choices += (choices.empty() ? "" : ", ") + client::name_of(row->values, one);
  }
  throw usage_error(left.empty() ? fmt::format("the key names no {} that could be used", row->name)
                                 : fmt::format("the key allows more than one {}: {}", row->name, choices),
                    fmt::format("say which one with --{}", row->name));
}

/// The key's only value of a tag, among those that count for the purpose; no candidates: all count.
template <keymaster_tag_t Tag, auto... Candidates>
maybe only(const choice& from) {
  const auto counts = [](std::uint64_t one) {
    return sizeof...(Candidates) == 0 || ((one == static_cast<std::uint64_t>(Candidates)) || ...);
  };
  std::vector<std::uint64_t> left;
  for (const std::uint64_t one : from.key.numbers(Tag)) {
    if (counts(one) && std::ranges::find(left, one) == left.end()) {
      left.push_back(one);
    }
  }
  if (left.size() != 1) {
    ask_for(Tag, left);
  }
  return left.front();
}

/// Raw RSA signs what the caller prepared.
maybe signature_digest(const choice& from) {
  return from.chosen.unique_number(KM_TAG_PADDING) == KM_PAD_NONE ? maybe(KM_DIGEST_NONE) : only<KM_TAG_DIGEST>(from);
}

/// Only OAEP has a digest.
maybe encryption_digest(const choice& from) {
  return from.chosen.unique_number(KM_TAG_PADDING) != KM_PAD_RSA_OAEP
             ? std::nullopt
             : only<KM_TAG_DIGEST, KM_DIGEST_SHA1, KM_DIGEST_SHA_2_224, KM_DIGEST_SHA_2_256, KM_DIGEST_SHA_2_384,
                    KM_DIGEST_SHA_2_512>(from);
}

/// CTR and GCM work on text of any length.
maybe block_padding(const choice& from) {
  const std::uint64_t mode = from.chosen.unique_number(KM_TAG_BLOCK_MODE).value_or(0);
  return mode == KM_MODE_CTR || mode == KM_MODE_GCM ? maybe(KM_PAD_NONE)
                                                    : only<KM_TAG_PADDING, KM_PAD_NONE, KM_PAD_PKCS7>(from);
}

maybe tag_length(const choice& from) {
  return from.chosen.unique_number(KM_TAG_BLOCK_MODE) == KM_MODE_GCM ? maybe(gcm_tag_bits) : std::nullopt;
}

maybe whole_digest(const choice& from) {
  return digest_bits(from.chosen.unique_number(KM_TAG_DIGEST).value_or(KM_DIGEST_NONE));
}

/// The values of each algorithm in the order in which they are chosen.
struct choice_row {
  keymaster_algorithm_t algorithm;
  bool ciphers;  ///< for encrypt and decrypt; otherwise for sign and verify
  keymaster_tag_t tag;
  maybe (*choose)(const choice& from);
};
constexpr std::array choice_rows = std::to_array<choice_row>({
    {KM_ALGORITHM_RSA, false, KM_TAG_PADDING,
     only<KM_TAG_PADDING, KM_PAD_NONE, KM_PAD_RSA_PSS, KM_PAD_RSA_PKCS1_1_5_SIGN>},
    {KM_ALGORITHM_RSA, false, KM_TAG_DIGEST, signature_digest},
    {KM_ALGORITHM_RSA, true, KM_TAG_PADDING,
     only<KM_TAG_PADDING, KM_PAD_NONE, KM_PAD_RSA_OAEP, KM_PAD_RSA_PKCS1_1_5_ENCRYPT>},
    {KM_ALGORITHM_RSA, true, KM_TAG_DIGEST, encryption_digest},
    {KM_ALGORITHM_EC, false, KM_TAG_DIGEST, only<KM_TAG_DIGEST>},
    {KM_ALGORITHM_HMAC, false, KM_TAG_DIGEST, only<KM_TAG_DIGEST>},
    {KM_ALGORITHM_HMAC, false, KM_TAG_MAC_LENGTH, whole_digest},
    {KM_ALGORITHM_AES, true, KM_TAG_BLOCK_MODE, only<KM_TAG_BLOCK_MODE>},
    {KM_ALGORITHM_AES, true, KM_TAG_PADDING, block_padding},
    {KM_ALGORITHM_AES, true, KM_TAG_MAC_LENGTH, tag_length},
});

struct size_row {
  std::uint64_t value;
  std::uint32_t size;
};
constexpr std::array digest_sizes = std::to_array<size_row>({{KM_DIGEST_MD5, 128},
                                                             {KM_DIGEST_SHA1, 160},
                                                             {KM_DIGEST_SHA_2_224, 224},
                                                             {KM_DIGEST_SHA_2_256, 256},
                                                             {KM_DIGEST_SHA_2_384, 384},
                                                             {KM_DIGEST_SHA_2_512, 512}});
constexpr std::array nonce_sizes = std::to_array<size_row>({{KM_MODE_CBC, 16}, {KM_MODE_CTR, 16}, {KM_MODE_GCM, 12}});

template <class Table>
std::uint32_t size_in(const Table& table, std::uint64_t value) {
  const auto row = std::ranges::find(table, value, &size_row::value);
  return row == table.end() ? 0 : row->size;
}

}  // namespace

authorizations operation_parameters(keymaster_purpose_t purpose, const authorizations& given,
                                    const authorizations& characteristics) {
  authorizations all = given;
  const bool ciphers = purpose == KM_PURPOSE_ENCRYPT || purpose == KM_PURPOSE_DECRYPT;
  const auto algorithm = characteristics.unique_number(KM_TAG_ALGORITHM);
  for (const choice_row& row : choice_rows) {
    if (row.algorithm != algorithm || row.ciphers != ciphers || all.contains(row.tag)) {
      continue;
    }
    if (const maybe chosen = row.choose({.chosen = all, .key = characteristics})) {
      all.add(row.tag, *chosen);
    }
  }
  return all;
}

std::uint32_t digest_bits(std::uint64_t digest) {
  return size_in(digest_sizes, digest);
}

std::size_t nonce_size(const authorizations& parameters) {
  return size_in(nonce_sizes, parameters.unique_number(KM_TAG_BLOCK_MODE).value_or(0));
}

}  // namespace kmctl
