// Commands 1 to 12.
#include <algorithm>
#include <optional>

#include "src/params/keymaster_defs.h"
#include "tests/load/steps.h"

using namespace keymaster;
using testing_support::join;
using testing_support::u32;

namespace load {
namespace {

using list = std::vector<std::uint32_t>;

struct offer {
  std::uint32_t algorithm;
  std::uint32_t first_purpose;  // and the one that follows it
  std::array<list, 3> lists;    // block modes, paddings, digests
};
const offer offers[] = {
    {KM_ALGORITHM_RSA, KM_PURPOSE_SIGN, {list{}, list{1, 3, 5}, list{0, 1, 2, 3, 4, 5, 6}}},
    {KM_ALGORITHM_RSA, KM_PURPOSE_ENCRYPT, {list{}, list{1, 2, 4}, list{0, 2, 3, 4, 5, 6}}},
    {KM_ALGORITHM_AES, KM_PURPOSE_ENCRYPT, {list{1, 2, 3, 32}, list{1, 64}, list{}}},
    {KM_ALGORITHM_EC, KM_PURPOSE_SIGN, {list{}, list{}, list{0, 2, 3, 4, 5, 6}}},
    {KM_ALGORITHM_HMAC, KM_PURPOSE_SIGN, {list{}, list{}, list{1, 2, 3, 4, 5, 6}}},
};

constexpr std::uint32_t algorithms[] = {KM_ALGORITHM_RSA, KM_ALGORITHM_AES, KM_ALGORITHM_EC, KM_ALGORITHM_HMAC, 77};

const list* find_offer(std::uint32_t algorithm, std::uint32_t purpose, std::size_t which) {
  const auto* const found = std::find_if(std::begin(offers), std::end(offers), [&](const offer& o) {
    return o.algorithm == algorithm && (o.first_purpose == purpose || o.first_purpose + 1 == purpose);
  });
  return found == std::end(offers) ? nullptr : &found->lists[which];
}

bytes joined(const list& values) {
  bytes all;
  for (const std::uint32_t value : values) all = join({all, u32(value)});
  return all;
}

/// Asks for a count and then for the list, whose command is the next one. Without a list, `error` is the answer.
void ask_list(desk& d, std::uint32_t command, std::uint32_t a, std::uint32_t b, const list* expected,
              std::int32_t error) {
  const list values = expected != nullptr ? *expected : list{};
  if (expected != nullptr) error = KM_ERROR_OK;
  const answer count = d.client.call(command, a, b, std::nullopt, std::nullopt);
  expect(count, TEEC_SUCCESS, error, "a count");
  expect(count.b == values.size(), "the count is the list's");
  const answer given = d.client.call(command + 1, a, b, std::nullopt, values.size() * 4);
  expect(given, TEEC_SUCCESS, error, "a list");
  expect(given.body() == joined(values), "the list is the offer's");
  const answer misfit = d.client.call(command + 1, a, b, std::nullopt, values.size() * 4 + 1 + d.below(20'000));
  if (expected == nullptr) {
    expect(misfit, TEEC_SUCCESS, error, "a list that there is none of");
  } else {
    expect(misfit, TEEC_ERROR_BAD_PARAMETERS, KM_ERROR_UNKNOWN_ERROR, "a list with too much room");
  }
}

}  // namespace

bool ask_capabilities(desk& d) {
  const std::uint32_t which = d.below(6), algorithm = d.pick(algorithms), purpose = d.below(6);
  if (which < 3) {
    ask_list(d, 3 + 2 * which, algorithm, purpose, find_offer(algorithm, purpose, which), KM_ERROR_UNSUPPORTED_PURPOSE);
  } else if (which < 5) {
    const bool is_pair = algorithm == KM_ALGORITHM_RSA || algorithm == KM_ALGORITHM_EC;
    const list import_format = {is_pair ? 1U : 3U}, export_format = is_pair ? list{0} : list{};
    const list& formats = which == 3 ? import_format : export_format;
    ask_list(d, which == 3 ? 9 : 11, algorithm, 0, algorithm == 77 ? nullptr : &formats,
             KM_ERROR_UNSUPPORTED_ALGORITHM);
  } else {
    const answer count = d.client.call(1, 0, 0, std::nullopt, std::nullopt);
    expect(count, TEEC_SUCCESS, 4, "the number of algorithms");
    const answer given = d.client.call(2, 0, 0, std::nullopt, 16);
    expect_ok(given, "the algorithms");
    expect(given.body() == joined({1, 32, 3, 128}), "the algorithms are those of the TA");
  }
  return true;
}

}  // namespace load
