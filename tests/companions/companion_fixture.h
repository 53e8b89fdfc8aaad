// A device, and one session to a companion on it, below the Client API: the four slots exactly as the TA receives them.
#ifndef TESTS_COMPANIONS_COMPANION_FIXTURE_H_
#define TESTS_COMPANIONS_COMPANION_FIXTURE_H_

#include <gmock/gmock.h>

#include <map>

#include "tests/support/device_fixture.h"

namespace testing_support {

inline constexpr TEE_Identity normal_world = {TEE_LOGIN_PUBLIC, {}};
/// The identity of a TA that calls another; no TA of the device has this UUID.
inline constexpr TEE_Identity some_ta = {TEE_LOGIN_TRUSTED_APP, {1, 2, 3, {4, 5, 6, 7, 8, 9, 10, 11}}};

/// Slots.
[[nodiscard]] TEE_Param value_slot(std::uint32_t a, std::uint32_t b = 0);
[[nodiscard]] TEE_Param wide_slot(std::uint64_t value);
[[nodiscard]] TEE_Param memory_slot(bytes& buffer);
[[nodiscard]] std::uint64_t wide_value(const TEE_Param& slot);

/// Throws std::runtime_error when the session can't be opened.
class companion_session {
 public:
  companion_session(hosted_tee::secure_world& world, const TEE_UUID& ta, const TEE_Identity& client = normal_world);
  companion_session(const companion_session&) = delete;
  companion_session& operator=(const companion_session&) = delete;
  ~companion_session();

  TEE_Result invoke(std::uint32_t command, std::uint32_t types, TEE_Param (&params)[4]);

 private:
  hosted_tee::secure_world& world_;
  std::uint32_t session_ = 0;
};

/// What a companion keeps: each object that a test watches, and its content if it is there.
using stored_objects = std::map<std::string, std::optional<bytes>>;

/// Fixture for a companion `ta` that prints its trace as `prefix`.
class CompanionTest : public ::testing::Test {
 protected:
  CompanionTest(const TEE_UUID& ta, std::string prefix, std::vector<std::string> objects)
      : ta_(ta), prefix_(std::move(prefix)), objects_(std::move(objects)) {
    open_session();
  }

  device tee;

  TEE_Result invoke(std::uint32_t command, std::uint32_t types, TEE_Param (&params)[4]) {
    return session_->invoke(command, types, params);
  }
  void open_session(const TEE_Identity& client = normal_world);
  /// restart is a reboot: the boot seed and the clocks begin anew, storage stays.
  void restart();

  [[nodiscard]] ta_client& keymaster() { return tee.client(); }
  [[nodiscard]] hosted_tee::fault_plan& faults() { return tee.world().faults(); }
  [[nodiscard]] std::uint64_t now_ms() { return milliseconds(tee.world().clock().system()); }
  [[nodiscard]] static std::uint64_t milliseconds(TEE_Time time) {
    return std::uint64_t{time.seconds} * 1000 + time.millis;
  }
  void advance(std::uint64_t ms) { tee.world().clock().advance(ms); }
  [[nodiscard]] hosted_tee::accounting holdings() { return tee.world().account(ta_); }

  /// What the companion traced as errors since the trace was last cleared.
  [[nodiscard]] std::vector<std::string> errors();

  [[nodiscard]] std::optional<bytes> stored(const std::string& name);
  void store(const std::string& name, const bytes& content);
  [[nodiscard]] stored_objects stored_now();

  void expect_same_holdings(const hosted_tee::accounting& before);

  /// expect_refused runs `command`, which answers a TEE_Result, and expects it to fail just so: these error lines, and
  /// nothing left behind or changed in storage.
  template <class Command>
  void expect_refused(TEE_Result result, const std::vector<std::string>& lines, Command&& command) {
    const hosted_tee::accounting before = holdings();
    const stored_objects kept = stored_now();
    tee.clear_trace();
    EXPECT_EQ(command(), result);
    EXPECT_EQ(errors(), lines);
    expect_same_holdings(before);
    EXPECT_EQ(stored_now(), kept);
  }

 private:
  TEE_UUID ta_;
  std::string prefix_;
  std::vector<std::string> objects_;
  std::unique_ptr<companion_session> session_;
};

/// hmac_sha256_of as libcrypto has it.
[[nodiscard]] bytes hmac_sha256_of(const bytes& key, const bytes& message);

}  // namespace testing_support

#endif  // TESTS_COMPANIONS_COMPANION_FIXTURE_H_
