// The device under the fuzzer: the TA is linked into the program and runs on a hosted secure world of its own.
#ifndef FUZZ_FUZZ_DEVICE_H_
#define FUZZ_FUZZ_DEVICE_H_

#include <array>
#include <functional>
#include <optional>

#include "fuzz/input_reader.h"
#include "tee/runtime/instance.h"
#include "tee/runtime/secure_world.h"

namespace fuzzing {

/// require ends the program, with the reason, when an invariant doesn't hold.
void require(bool holds, const char* invariant);

/// What a command is called with. An absent body makes its slot NONE.
struct command {
  std::uint32_t id = 0;
  std::uint32_t a = 0;
  std::uint32_t b = 0;
  std::optional<bytes> request;
  std::optional<std::uint32_t> capacity;
  std::optional<std::uint32_t> types;  ///< other than the bodies ask for
};

struct reply {
  TEE_Result result = 0;
  std::uint32_t a = 0;
  std::uint32_t b = 0;
  bytes response;  ///< what the TA says it wrote

  [[nodiscard]] bool ok() const { return result == TEE_SUCCESS && a == 0; }
};

/// in_fresh_instance runs `body` where the TA's own functions can be called: with an instance to allocate from, in
/// which nothing may stay.
void in_fresh_instance(const std::function<void(hosted_tee::instance& instance)>& body);

/// A device for the life of the process, with a fresh instance of the TA for each session.
class fuzz_device {
 public:
  static constexpr std::array<std::uint8_t, 32> boot_seed = {7};

  fuzz_device();

  /// open starts an instance, close ends it; both leave nothing pending, and nothing is held after close.
  void open();
  void close();

  /// run carries a command out. Its buffers are blocks of exactly their size, so that the sanitizer sees every byte
  /// beyond them. What must hold whatever a client sends is checked here: no panic, a failure that shows, a length
  /// within the response.
  reply run(const command& what) { return run_in(session_, what); }

  /// run_as does the same in a session of another client, for the one command.
  reply run_as(const TEE_Identity& client, const command& what);

  [[nodiscard]] hosted_tee::accounting holdings() const;
  [[nodiscard]] hosted_tee::secure_world& world() { return *world_; }

 private:
  std::uint32_t open_session(const TEE_Identity& client);
  reply run_in(std::uint32_t session, const command& what);

  std::shared_ptr<hosted_tee::secure_world> world_;
  std::uint32_t session_ = 0;
};

}  // namespace fuzzing

#endif  // FUZZ_FUZZ_DEVICE_H_
