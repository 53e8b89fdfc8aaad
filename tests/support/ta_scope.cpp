#include "tests/support/ta_scope.h"

#include <openssl/evp.h>
#include <openssl/hmac.h>

#include <algorithm>
#include <cstring>
#include <stdexcept>

#include "src/params/keymaster_protocol.h"
#include "tee_internal_api.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr TEE_UUID ta_uuid = KEYMASTER_TA_UUID;

}  // namespace

ta_scope::ta_scope(hosted_tee::device_services& device, std::uint32_t heap_limit)
    : instance_(ta_uuid, heap_limit, device, device.faults), scope_(instance_) {
  instance_.trace_prefix = "KEYMASTER";
}

hosted_tee::accounting ta_scope::holdings() const {
  hosted_tee::accounting sum;
  sum.heap_bytes = instance_.heap.bytes();
  sum.heap_blocks = instance_.heap.blocks();
  sum.heap_peak = instance_.heap.peak();
  for (const auto& [handle, item] : instance_.objects) {
    ++(item->is_persistent() ? sum.persistent_objects : sum.transient_objects);
  }
  sum.operations = static_cast<std::uint32_t>(instance_.operations.size());
  return sum;
}

std::vector<std::string> ta_scope::traced(hosted_tee::trace_level level) const {
  std::vector<std::string> texts;
  for (const hosted_tee::trace_line& line : instance_.device.trace.lines()) {
    if (line.level == level) texts.push_back(line.text);
  }
  return texts;
}

void expect_same(const hosted_tee::accounting& now, const hosted_tee::accounting& before) {
  EXPECT_EQ(now.heap_bytes, before.heap_bytes);
  EXPECT_EQ(now.heap_blocks, before.heap_blocks);
  EXPECT_EQ(now.transient_objects, before.transient_objects);
  EXPECT_EQ(now.persistent_objects, before.persistent_objects);
  EXPECT_EQ(now.operations, before.operations);
}

bool contains(std::span<const std::uint8_t> haystack, std::span<const std::uint8_t> needle) {
  return !needle.empty() &&
         std::search(haystack.begin(), haystack.end(), needle.begin(), needle.end()) != haystack.end();
}

std::uint8_t* heap_copy(std::span<const std::uint8_t> data) {
  void* const block = TEE_Malloc(static_cast<std::uint32_t>(data.size()), TEE_MALLOC_FILL_ZERO);
  if (block == nullptr) throw std::runtime_error("the TA's heap is exhausted");
  if (!data.empty()) std::memcpy(block, data.data(), data.size());
  return static_cast<std::uint8_t*>(block);
}

parameter_set in_ta(const param_list& list) {
  parameter_set set;
  const std::size_t count = list.params().size();
  if (count == 0) return set;
  void* const records = heap_copy(bytes(count * sizeof(keymaster_key_param_t)));
  set.params = static_cast<keymaster_key_param_t*>(records);
  for (const param& p : list.params()) {
    keymaster_key_param_t& record = set.params[set.length++];
    record.tag = p.tag;
    if (tag_has_blob(p.tag)) {
      record.blob.data = heap_copy(p.blob);
      record.blob.data_length = static_cast<std::uint32_t>(p.blob.size());
    } else {
      record.long_integer = p.value;
    }
  }
  return set;
}

param_list from_ta(const keymaster_key_param_set_t& set) {
  param_list list;
  const std::uint32_t count = set.params == nullptr ? 0 : set.length;
  for (std::uint32_t i = 0; i < count; ++i) {
    const keymaster_key_param_t& record = set.params[i];
    if (tag_has_blob(record.tag)) {
      list.add_blob(record.tag, {record.blob.data, record.blob.data + record.blob.data_length});
    } else {
      list.add(record.tag, record.long_integer);
    }
  }
  return list;
}

bytes hmac_sha256(std::span<const std::uint8_t> key, std::span<const std::uint8_t> message) {
  bytes mac(32);
  unsigned length = 0;
  if (HMAC(EVP_sha256(), key.data(), static_cast<int>(key.size()), message.data(), message.size(), mac.data(),
           &length) == nullptr ||
      length != mac.size()) {
    throw std::runtime_error("libcrypto computes no HMAC");
  }
  return mac;
}

}  // namespace testing_support
