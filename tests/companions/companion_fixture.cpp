#include "tests/companions/companion_fixture.h"

#include <openssl/evp.h>
#include <openssl/hmac.h>

#include <stdexcept>

namespace testing_support {

TEE_Param value_slot(std::uint32_t a, std::uint32_t b) {
  TEE_Param slot = {};
  slot.value.a = a;
  slot.value.b = b;
  return slot;
}

TEE_Param wide_slot(std::uint64_t value) {
  return value_slot(static_cast<std::uint32_t>(value), static_cast<std::uint32_t>(value >> 32));
}

TEE_Param memory_slot(bytes& buffer) {
  TEE_Param slot = {};
  slot.memref.buffer = buffer.data();
  slot.memref.size = static_cast<std::uint32_t>(buffer.size());
  return slot;
}

std::uint64_t wide_value(const TEE_Param& slot) {
  return std::uint64_t{slot.value.b} << 32 | slot.value.a;
}

companion_session::companion_session(hosted_tee::secure_world& world, const TEE_UUID& ta, const TEE_Identity& client)
    : world_(world) {
  TEE_Param none[4] = {};
  std::uint32_t origin = 0;
  if (world_.open_session(ta, client, 0, none, session_, origin) != TEE_SUCCESS) {
    throw std::runtime_error("the companion takes no session");
  }
}

companion_session::~companion_session() {
  world_.close_session(session_);
}

TEE_Result companion_session::invoke(std::uint32_t command, std::uint32_t types, TEE_Param (&params)[4]) {
  std::uint32_t origin = 0;
  return world_.invoke(session_, command, types, params, origin);
}

void CompanionTest::open_session(const TEE_Identity& client) {
  session_.reset();
  session_ = std::make_unique<companion_session>(tee.world(), ta_, client);
}

void CompanionTest::restart() {
  session_.reset();
  tee.restart();
  open_session();
}

std::vector<std::string> CompanionTest::errors() {
  std::vector<std::string> found;
  for (const hosted_tee::trace_line& line : tee.world().trace().lines()) {
    if (line.prefix == prefix_ && line.level == hosted_tee::trace_level::error) found.push_back(line.text);
  }
  return found;
}

std::optional<bytes> CompanionTest::stored(const std::string& name) {
  const auto content = tee.world().read_object(ta_, TEE_STORAGE_PRIVATE, name);
  if (!content) return std::nullopt;
  return bytes(content->begin(), content->end());
}

void CompanionTest::store(const std::string& name, const bytes& content) {
  tee.world().write_object(ta_, TEE_STORAGE_PRIVATE, name, std::string(content.begin(), content.end()));
}

stored_objects CompanionTest::stored_now() {
  stored_objects all;
  for (const std::string& name : objects_) all[name] = stored(name);
  return all;
}

void CompanionTest::expect_same_holdings(const hosted_tee::accounting& before) {
  const hosted_tee::accounting now = holdings();
  EXPECT_EQ(now.heap_bytes, before.heap_bytes);
  EXPECT_EQ(now.heap_blocks, before.heap_blocks);
  EXPECT_EQ(now.transient_objects, before.transient_objects);
  EXPECT_EQ(now.persistent_objects, before.persistent_objects);
  EXPECT_EQ(now.operations, before.operations);
}

bytes hmac_sha256_of(const bytes& key, const bytes& message) {
  bytes mac(32);
  unsigned length = 0;
  HMAC(EVP_sha256(), key.data(), static_cast<int>(key.size()), message.data(), message.size(), mac.data(), &length);
  return mac;
}

}  // namespace testing_support
