// Cryptographic operations: what they share.
#ifndef TEE_CRYPTO_OPERATION_H_
#define TEE_CRYPTO_OPERATION_H_

#include <cstdint>
#include <memory>
#include <optional>

#include "tee/crypto/algorithm_table.h"
#include "tee/crypto/transient_object.h"

namespace hosted_tee {

/// An operation keeps its own copy of its key, so that the object may be freed at any time.
class operation {
 public:
  operation(const algorithm& kind, std::uint32_t mode, std::uint32_t max_bits)
      : kind_(kind), mode_(mode), max_bits_(max_bits) {}
  operation(const operation&) = delete;
  operation& operator=(const operation&) = delete;
  virtual ~operation() = default;

  [[nodiscard]] TEE_OperationInfo info() const;

  /// set_key gives the operation its key, or takes it away (null). Refused with TEE_ERROR_BAD_PARAMETERS: a key above
  /// the operation's maximum size, or of another curve than the algorithm's. Panics for a key of a type or usage that
  /// the operation can't take, and while data are being processed.
  void set_key(const transient_object* key);

  /// copy_from takes over the key and the progress of `other`, which has the same algorithm and mode.
  void copy_from(const operation& other);

  /// reset forgets the data that were processed and keeps the key.
  virtual void reset() {}

 protected:
  [[nodiscard]] const algorithm& kind() const { return kind_; }
  [[nodiscard]] std::uint32_t mode() const { return mode_; }
  [[nodiscard]] std::uint32_t max_bits() const { return max_bits_; }
  void expect_key() const { panic_unless(key_bits_ != 0, "the operation has no key"); }
  void expect_mode(std::uint32_t wanted) const { panic_unless(mode_ == wanted, "the operation has another mode"); }

 private:
  virtual void take_key(const key_material& material) = 0;  ///< copies what it needs
  virtual void drop_key() = 0;
  virtual void copy_content(const operation& other) = 0;           ///< `other` is of the same class
  [[nodiscard]] virtual bool is_running() const { return false; }  ///< initialised for data
  [[nodiscard]] virtual std::uint32_t result_bytes() const { return digest_bytes(kind_.digest); }

  const algorithm& kind_;
  std::uint32_t mode_;
  std::uint32_t max_bits_;
  std::uint32_t key_bits_ = 0;
};

/// An operation that takes its data in pieces, between an initialisation and a final call.
///
/// A step that fails without being able to say so (the calls without a result) poisons the operation: every later call
/// that has a result answers TEE_ERROR_GENERIC until the operation is initialised or reset.
class multi_stage_operation : public operation {
 public:
  using operation::operation;

  /// guard runs a step of a call without a result. Only a panic comes out of it.
  template <class Step>
  void guard(Step&& step) {
    try {
      std::forward<Step>(step)();
    } catch (const std::exception&) {
      stage_ = stage::poisoned;
    }
  }

  void reset() override { stage_ = stage::initial; }
  [[nodiscard]] bool is_poisoned() const { return stage_ == stage::poisoned; }

 protected:
  /// start leaves the poisoned state, if it was in it, and runs the initialisation; a failure poisons again.
  template <class Initialisation>
  void start(Initialisation&& initialisation) {
    stage_ = stage::poisoned;
    std::forward<Initialisation>(initialisation)();
    stage_ = stage::running;
  }
  /// expect_running panics before an initialisation, and refuses with TEE_ERROR_GENERIC when poisoned.
  void expect_running() const;
  /// expect_step poisons and refuses with TEE_ERROR_GENERIC when libcrypto failed in the middle of the data.
  void expect_step(bool done);
  void finish() { stage_ = stage::initial; }
  void copy_stage(const multi_stage_operation& other) { stage_ = other.stage_; }

 private:
  [[nodiscard]] bool is_running() const override { return stage_ == stage::running; }

  enum class stage { initial, running, poisoned };
  stage stage_ = stage::initial;
};

/// find_operation is the operation of a handle; panics when there is none or when it belongs to another class of
/// operations than the called function.
[[nodiscard]] operation& find_any_operation(const instance& self, TEE_OperationHandle handle);

template <class Operation>
[[nodiscard]] Operation& find_operation(const instance& self, TEE_OperationHandle handle) {
  auto* const found = dynamic_cast<Operation*>(&find_any_operation(self, handle));
  panic_unless(found != nullptr, "an operation of another class");
  return *found;
}

/// operation_call is crypto_call on the operation of a handle; operation_step is the same for the functions without a
/// result.
template <class Operation, class Body>
TEE_Result operation_call(const char* name, TEE_OperationHandle handle, std::uint32_t* length, Body&& body) noexcept {
  return crypto_call(name, length, [&](instance& self) { body(find_operation<Operation>(self, handle)); });
}

template <class Operation, class Body>
void operation_step(const char* name, TEE_OperationHandle handle, Body&& body) noexcept {
  platform_step(name, [&](instance& self, const std::optional<TEE_Result>& fault) {
    const error_queue_scope own_errors;
    auto& found = find_operation<Operation>(self, handle);
    found.guard([&] {
      if (fault) refuse(*fault);
      body(found);
    });
  });
}

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_OPERATION_H_
