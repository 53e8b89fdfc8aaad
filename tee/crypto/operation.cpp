#include "tee/crypto/operation.h"

#include <array>

namespace hosted_tee {

namespace {

/// What a key must be allowed to do, by mode.
constexpr std::array<std::uint32_t, 9> usage_of_mode = {
    TEE_USAGE_ENCRYPT, TEE_USAGE_DECRYPT, TEE_USAGE_SIGN, TEE_USAGE_VERIFY, TEE_USAGE_MAC, 0, TEE_USAGE_DERIVE, 0, 0,
};

std::uint32_t required_usage(const algorithm& kind, std::uint32_t mode) {
  // A bare RSA operation is also half of a signature.
  if (kind.id == TEE_ALG_RSA_NOPAD && mode == TEE_MODE_ENCRYPT) return TEE_USAGE_ENCRYPT | TEE_USAGE_VERIFY;
  if (kind.id == TEE_ALG_RSA_NOPAD && mode == TEE_MODE_DECRYPT) return TEE_USAGE_DECRYPT | TEE_USAGE_SIGN;
  return usage_of_mode.at(mode);
}

bool is_private_mode(std::uint32_t mode) {
  return mode == TEE_MODE_DECRYPT || mode == TEE_MODE_SIGN;
}

/// takes_type: the algorithm's own type always; the other type everywhere for a secret key, and where no private key is
/// needed for a public one.
bool takes_type(const algorithm& kind, std::uint32_t mode, const object_type& type) {
  if (type.id == kind.key_type) return true;
  const bool is_public = type.generate == nullptr;
  return type.id == kind.other_key_type && !(is_public && is_private_mode(mode));
}

}  // namespace

void operation_deleter::operator()(operation* op) const {
  delete op;
}

TEE_OperationInfo operation::info() const {
  const bool keyless = kind_.key_type == 0;
  std::uint32_t state = keyless || key_bits_ != 0 ? TEE_HANDLE_FLAG_KEY_SET : 0;
  if (is_running()) state |= TEE_HANDLE_FLAG_INITIALIZED;
  return {.algorithm = kind_.id,
          .operationClass = static_cast<std::uint32_t>(kind_.group),
          .mode = mode_,
          .digestLength = result_bytes(),
          .maxKeySize = keyless ? 0 : max_bits_,
          .keySize = key_bits_,
          .requiredKeyUsage = keyless ? 0 : required_usage(kind_, mode_),
          .handleState = state};
}

void operation::set_key(const transient_object* key) {
  panic_unless(kind_.key_type != 0, "the operation takes no key");
  panic_unless(!is_running(), "the operation is processing data");
  if (key != nullptr) {
    panic_unless(key->holds_key(), "the object holds no key");
    panic_unless(takes_type(kind_, mode_, key->type()), "a key of a type that the operation doesn't take");
    const std::uint32_t needed = required_usage(kind_, mode_);
    panic_unless((key->usage() & needed) == needed, "a key that may not be used so");
    const std::uint32_t bits = key->material().bits;
    refuse_unless(bits <= max_bits_ && (kind_.exact_bits == 0 || bits == kind_.exact_bits), TEE_ERROR_BAD_PARAMETERS);
  }
  reset();
  drop_key();
  key_bits_ = 0;
  if (key == nullptr) return;
  take_key(key->material());
  key_bits_ = key->material().bits;
}

void operation::copy_from(const operation& other) {
  panic_unless(&kind_ == &other.kind_ && mode_ == other.mode_, "operations of different algorithms or modes");
  panic_unless(other.key_bits_ <= max_bits_ || kind_.key_type == 0, "a key above the operation's maximum size");
  key_bits_ = other.key_bits_;
  copy_content(other);
}

void multi_stage_operation::expect_running() const {
  refuse_unless(stage_ != stage::poisoned, TEE_ERROR_GENERIC);
  panic_unless(stage_ == stage::running, "the operation isn't initialised");
}

void multi_stage_operation::expect_step(bool done) {
  if (done) return;
  stage_ = stage::poisoned;
  refuse(TEE_ERROR_GENERIC);
}

operation& find_any_operation(const instance& self, TEE_OperationHandle handle) {
  const auto found = self.operations.find(reinterpret_cast<std::uintptr_t>(handle));
  panic_unless(found != self.operations.end(), "not an open operation");
  return *found->second;
}

}  // namespace hosted_tee
