#include "tests/support/param_list.h"

#include <algorithm>
#include <stdexcept>

using namespace keymaster;

namespace testing_support {
namespace {

bool is_blob(std::uint32_t tag) {
  return (tag >> 28) == 8 || (tag >> 28) == 9;
}

std::uint64_t number_at(std::span<const std::uint8_t> data, std::size_t offset) {
  return u32_at(data, offset) | (std::uint64_t{u32_at(data, offset + 4)} << 32);
}

}  // namespace

param_list& param_list::add(std::uint32_t tag, std::uint64_t value) {
  params_.push_back({tag, value, {}});
  return *this;
}

param_list& param_list::add_blob(std::uint32_t tag, bytes blob) {
  params_.push_back({tag, 0, std::move(blob)});
  return *this;
}

param_list& param_list::add(const param_list& others) {
  params_.insert(params_.end(), others.params_.begin(), others.params_.end());
  return *this;
}

param_list& param_list::remove(std::uint32_t tag) {
  std::erase_if(params_, [tag](const param& p) { return p.tag == tag; });
  return *this;
}

bytes param_list::marshal() const {
  bytes out = u32(static_cast<std::uint32_t>(params_.size()));
  for (const param& p : params_) {
    const std::uint64_t length = is_blob(p.tag) ? p.blob.size() : 0;
    const bytes record = join({u32(p.tag), u32(0), u64(is_blob(p.tag) ? 0 : p.value), u64(length), p.blob});
    out.insert(out.end(), record.begin(), record.end());
  }
  return out;
}

std::optional<param_list> param_list::parse(std::span<const std::uint8_t> data) {
  if (data.size() < 4) return std::nullopt;
  const std::uint32_t count = u32_at(data, 0);
  data = data.subspan(4);
  param_list list;
  for (std::uint32_t i = 0; i < count; ++i) {
    if (data.size() < 24) return std::nullopt;
    param p{u32_at(data, 0), number_at(data, 8), {}};
    const std::uint32_t length = u32_at(data, 16);
    data = data.subspan(24);
    if (is_blob(p.tag)) {
      if (data.size() < length) return std::nullopt;
      p.blob.assign(data.begin(), data.begin() + length);
      data = data.subspan(length);
    }
    list.params_.push_back(std::move(p));
  }
  if (!data.empty()) return std::nullopt;
  return list;
}

bool param_list::has(std::uint32_t tag) const {
  return std::any_of(params_.begin(), params_.end(), [tag](const param& p) { return p.tag == tag; });
}

std::uint64_t param_list::value(std::uint32_t tag) const {
  const auto it = std::find_if(params_.begin(), params_.end(), [tag](const param& p) { return p.tag == tag; });
  if (it == params_.end()) throw std::out_of_range("no such tag");
  return it->value;
}

bytes param_list::blob(std::uint32_t tag) const {
  const auto it = std::find_if(params_.begin(), params_.end(), [tag](const param& p) { return p.tag == tag; });
  if (it == params_.end()) throw std::out_of_range("no such tag");
  return it->blob;
}

param_list rsa_key(std::uint32_t bits) {
  param_list list;
  list.add(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA)
      .add(KM_TAG_KEY_SIZE, bits)
      .add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY)
      .add(KM_TAG_NO_AUTH_REQUIRED);
  for (const std::uint32_t padding : {KM_PAD_NONE, KM_PAD_RSA_PSS, KM_PAD_RSA_PKCS1_1_5_SIGN}) {
    list.add(KM_TAG_PADDING, padding);
  }
  for (std::uint32_t digest = KM_DIGEST_NONE; digest <= KM_DIGEST_SHA_2_512; ++digest) {
    list.add(KM_TAG_DIGEST, digest);
  }
  return list;
}

param_list signature(std::uint32_t digest, std::uint32_t padding) {
  return param_list{}.add(KM_TAG_DIGEST, digest).add(KM_TAG_PADDING, padding);
}

}  // namespace testing_support
