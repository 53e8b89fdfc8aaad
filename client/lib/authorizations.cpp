#include "client/lib/authorizations.h"

#include <algorithm>
#include <stdexcept>

#include "client/lib/wire.h"

namespace keymaster::client {
namespace {

constexpr std::size_t record_size = 24;

/// The largest number that a tag of this type can hold.
std::uint64_t largest_number(keymaster_tag_type_t type) {
  switch (type) {
    case KM_ULONG:
    case KM_ULONG_REP:
    case KM_DATE:
      return UINT64_MAX;
    case KM_BOOL:
      return 1;
    default:
      return UINT32_MAX;
  }
}

}  // namespace

authorizations& authorizations::add(keymaster_tag_t tag, std::uint64_t number) {
  if (holds_bytes(tag)) {
    throw std::invalid_argument("the tag holds bytes, not a number");
  }
  if (number > largest_number(tag_type(tag))) {
    throw std::invalid_argument("the number is too large for its tag");
  }
  list_.push_back({.tag = tag, .number = number, .blob = {}});
  return *this;
}

authorizations& authorizations::add(keymaster_tag_t tag, byte_view blob) {
  if (!holds_bytes(tag)) {
    throw std::invalid_argument("the tag holds a number, not bytes");
  }
  list_.push_back({.tag = tag, .number = 0, .blob = {blob.begin(), blob.end()}});
  return *this;
}

authorizations& authorizations::add(const authorizations& others) {
  const std::vector<authorization> copy = others.list_;  // `others` may be this very list
  list_.insert(list_.end(), copy.begin(), copy.end());
  return *this;
}

authorizations& authorizations::add_date(keymaster_tag_t tag, date moment) {
  const auto millis = moment.time_since_epoch().count();
  if (millis < 0) {
    throw std::invalid_argument("a key's dates begin with 1970");
  }
  return add(tag, static_cast<std::uint64_t>(millis));
}

std::size_t authorizations::count(keymaster_tag_t tag) const {
  return static_cast<std::size_t>(std::ranges::count(list_, tag, &authorization::tag));
}

std::vector<std::uint64_t> authorizations::numbers(keymaster_tag_t tag) const {
  std::vector<std::uint64_t> found;
  for (const authorization& one : list_) {
    if (one.tag == tag) {
      found.push_back(one.number);
    }
  }
  return found;
}

std::optional<std::uint64_t> authorizations::unique_number(keymaster_tag_t tag) const {
  const auto found = numbers(tag);
  return found.size() == 1 ? std::optional(found.front()) : std::nullopt;
}

std::optional<bytes> authorizations::unique_blob(keymaster_tag_t tag) const {
  if (count(tag) != 1) {
    return std::nullopt;
  }
  return std::ranges::find(list_, tag, &authorization::tag)->blob;
}

std::size_t authorizations::marshalled_size() const {
  std::size_t size = 4;
  for (const authorization& one : list_) {
    size += record_size + one.blob.size();
  }
  return size;
}

bytes authorizations::marshal() const {
  bytes out;
  out.reserve(marshalled_size());
  append_u32(out, static_cast<std::uint32_t>(list_.size()));
  for (const authorization& one : list_) {
    append_u32(out, one.tag);
    append_u32(out, 0);
    append_number(out, one.number, 8);
    append_number(out, one.blob.size(), 8);
    append_bytes(out, one.blob);
  }
  return out;
}

authorizations authorizations::unmarshal(byte_view data) {
  byte_reader in{data};
  authorizations out;
  for (std::uint32_t left = in.read_u32(); left != 0; --left) {
    authorization one;
    one.tag = in.read_u32();
    (void)in.read_u32();
    const std::uint64_t value = in.read_number(8);
    const auto length = static_cast<std::uint32_t>(in.read_number(8));
    if (holds_bytes(one.tag)) {
      const byte_view blob = in.read_bytes(length);
      one.blob.assign(blob.begin(), blob.end());
    } else {
      const std::uint64_t largest = largest_number(tag_type(one.tag));
      one.number = tag_type(one.tag) == KM_BOOL ? value & 0xFF : value & largest;
    }
    out.list_.push_back(std::move(one));
  }
  return out;
}

}  // namespace keymaster::client
