// Password handles: what the normal world keeps of a password. A handle tells neither the password nor anything that a
// password could be tried against: that takes the TA's own key.
#ifndef TEE_COMPANIONS_AUTHENTICATOR_PASSWORD_HANDLE_H_
#define TEE_COMPANIONS_AUTHENTICATOR_PASSWORD_HANDLE_H_

#include <cstdint>
#include <span>

#include "tee/companions/authenticator/authenticator_protocol.h"
#include "tee/companions/common/keyed_mac.h"

namespace keymaster::authenticator {

/// prepare_handle_mac makes `mac` ready with the TA's own key, "pwauth.key": 32 bytes, drawn the first time. The
/// results of draw_once and keyed_mac::prepare.
[[nodiscard]] TEE_Result prepare_handle_mac(companion::keyed_mac& mac);

/// make_handle writes a handle with a fresh salt. The result of keyed_mac::compute; `handle` is all zero unless it is
/// TEE_SUCCESS.
[[nodiscard]] TEE_Result make_handle(companion::keyed_mac& mac, uint32_t uid, uint64_t secure_id,
                                     std::span<const uint8_t> password, std::span<uint8_t, handle_size> handle);

/// check_handle tells in `*right` whether `handle`, of any size, is one that make_handle made for `uid` with this
/// password, and then hands out the secure id. The result of keyed_mac::compute; nothing is known unless it is
/// TEE_SUCCESS.
[[nodiscard]] TEE_Result check_handle(companion::keyed_mac& mac, uint32_t uid, std::span<const uint8_t> password,
                                      std::span<const uint8_t> handle, bool* right, uint64_t* secure_id);

}  // namespace keymaster::authenticator

#endif  // TEE_COMPANIONS_AUTHENTICATOR_PASSWORD_HANDLE_H_
