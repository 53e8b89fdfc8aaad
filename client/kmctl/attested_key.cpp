#include "client/kmctl/attested_key.h"

#include <algorithm>
#include <array>
#include <initializer_list>

#include "client/kmctl/exit_codes.h"

namespace kmctl {
namespace {

using namespace keymaster;
using client::authorizations;

/// The smallest key that is accepted from a statement, and the largest whose public half fits into one.
constexpr std::uint64_t smallest_size = 2048;
constexpr std::uint64_t largest_size = 4096;

constexpr std::array details = {KM_TAG_SOTER_SIGNED_BY_ATTK, KM_TAG_SOTER_SIGNING_KEY_BLOB, KM_TAG_SOTER_COUNTED,
                                KM_TAG_SOTER_UID};

bool has_only(const authorizations& given, keymaster_tag_t tag, std::initializer_list<std::uint64_t> values) {
  return std::ranges::all_of(given.numbers(tag),
                             [&](std::uint64_t one) { return std::ranges::count(values, one) != 0; });
}

void check(const authorizations& given) {
  struct row {
    bool fits;
    const char* what;
    const char* hint;
  };
  const std::uint64_t size = given.unique_number(KM_TAG_KEY_SIZE).value_or(smallest_size);
  for (const row& one : std::to_array<row>({
           {has_only(given, KM_TAG_ALGORITHM, {KM_ALGORITHM_RSA}), "attested keys are RSA keys",
            "leave --algorithm out"},
           {size >= smallest_size && size <= largest_size, "attested keys have 2048 to 4096 bits", "leave --size out"},
           {has_only(given, KM_TAG_PURPOSE, {KM_PURPOSE_SIGN}),
            "attested keys sign and do nothing else: with another use anybody could make their statements",
            "leave --purpose out"},
           {has_only(given, KM_TAG_PADDING, {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_PAD_RSA_PSS}),
            "attested keys sign with pkcs1-1-5-sign or pss", "leave --padding out, or name one of these"},
           {has_only(
                given, KM_TAG_DIGEST,
                {KM_DIGEST_SHA1, KM_DIGEST_SHA_2_224, KM_DIGEST_SHA_2_256, KM_DIGEST_SHA_2_384, KM_DIGEST_SHA_2_512}),
            "attested keys sign the digest of their statement", "leave --digest out, or name another one"},
           {!given.contains(KM_TAG_SOTER_SIGNED_BY_ATTK) || !given.contains(KM_TAG_SOTER_SIGNING_KEY_BLOB),
            "one key signs the statement", "leave --signed-by-attk or --signed-by out"},
           {given.unique_number(KM_TAG_SOTER_UID).value_or(0) != UINT32_MAX, "this uid stands for nobody",
            "leave --uid out for a key of nobody in particular"},
       })) {
    if (!one.fits) {
      throw usage_error(one.what, one.hint);
    }
  }
}

}  // namespace

authorizations attested_description(const authorizations& given) {
  authorizations all = given;
  if (!given.contains(KM_TAG_SOTER_KEY)) {
    if (std::ranges::any_of(details, [&](keymaster_tag_t tag) { return given.contains(tag); })) {
      throw usage_error("--signed-by-attk, --signed-by, --counted and --uid say more of an attested key",
                        "say --soter too, or leave them out");
    }
    return all;
  }
  check(given);
  if (!given.contains(KM_TAG_PURPOSE)) {
    all.purpose({KM_PURPOSE_SIGN});
  }
  if (given.contains(KM_TAG_SOTER_SIGNING_KEY_BLOB)) {
    all.soter_signed_by_key();
  } else if (!given.contains(KM_TAG_SOTER_SIGNED_BY_ATTK)) {
    all.soter_signed_by_attk();
  }
  return all;
}

}  // namespace kmctl
