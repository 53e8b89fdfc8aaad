#include "tee/companions/authenticator/password_handle.h"

#include "platform/byte_order.h"
#include "platform/cursor.h"
#include "platform/wipe.h"
#include "tee/companions/common/fixed_object.h"

namespace keymaster::authenticator {
namespace {

constexpr uint8_t handle_version = 0;
constexpr uint32_t salt_size = 16;
constexpr uint32_t head_size = sizeof handle_version + sizeof(uint32_t) + sizeof(uint64_t) + salt_size;
static_assert(head_size + companion::mac_size == handle_size);

/// What stands before the salt.
struct handle_head {
  uint8_t version = handle_version;
  uint32_t uid = 0;
  uint64_t secure_id = 0;
};

bool read_head(byte_reader in, handle_head& head) {
  return in.copy_to(&head.version, sizeof head.version) && in.read_u32(head.uid) &&
         in.copy_to(&head.secure_id, sizeof head.secure_id);
}

bool write_head(byte_writer out, const handle_head& head) {
  std::span<uint8_t> salt;
  const bool fits = out.write_bytes(&head.version, sizeof head.version) && out.write_u32(head.uid) &&
                    out.write_bytes(&head.secure_id, sizeof head.secure_id) && out.reserve(salt_size, salt);
  if (fits) companion::draw(salt);
  return fits;
}

}  // namespace

TEE_Result prepare_handle_mac(companion::keyed_mac& mac) {
  wiped_array<companion::mac_size> key;
  if (TEE_Result r = companion::draw_once("pwauth.key", key.bytes); r != TEE_SUCCESS) return r;
  return mac.prepare(key.bytes);
}

TEE_Result make_handle(companion::keyed_mac& mac, uint32_t uid, uint64_t secure_id, std::span<const uint8_t> password,
                       std::span<uint8_t, handle_size> handle) {
  const std::span<uint8_t> head = handle.first<head_size>();
  if (!write_head(byte_writer{head}, {.uid = uid, .secure_id = secure_id})) return TEE_ERROR_BAD_STATE;
  const TEE_Result result = mac.compute(head, password, handle.last<companion::mac_size>());
  if (result != TEE_SUCCESS) wipe(handle.data(), handle.size());
  return result;
}

TEE_Result check_handle(companion::keyed_mac& mac, uint32_t uid, std::span<const uint8_t> password,
                        std::span<const uint8_t> handle, bool* right, uint64_t* secure_id) {
  *right = false;
  handle_head head;
  if (handle.size() != handle_size || !read_head(byte_reader{handle}, head)) return TEE_SUCCESS;
  wiped_array<companion::mac_size> expected;
  if (TEE_Result r = mac.compute(handle.first<head_size>(), password, expected.bytes); r != TEE_SUCCESS) return r;
  const bool genuine = constant_time_equal(expected.bytes, handle.last<companion::mac_size>());
  *right = genuine && head.version == handle_version && head.uid == uid;
  if (*right) *secure_id = head.secure_id;
  return TEE_SUCCESS;
}

}  // namespace keymaster::authenticator
