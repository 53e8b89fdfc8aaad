// A device of its own for each test: an empty state folder, frozen clocks, and one open session to the TA.
#ifndef TESTS_SUPPORT_DEVICE_FIXTURE_H_
#define TESTS_SUPPORT_DEVICE_FIXTURE_H_

#include <gtest/gtest.h>

#include <filesystem>
#include <memory>
#include <string_view>

#include "tee/runtime/secure_world.h"
#include "tests/support/ta_client.h"

namespace testing_support {

/// The frozen clocks at the start of a test.
inline constexpr TEE_Time start_system = {7200, 250};        // two hours after boot
inline constexpr TEE_Time start_ree = {1'700'000'000, 500};  // November 2023

inline constexpr TEE_UUID keymaster_ta = KEYMASTER_TA_UUID;

/// The name of the TA's object in the RPMB storage, its terminating zero included: the key storage key.
inline constexpr std::string_view stored_ksk_name{"Keymaster KSK\0", 14};

/// A folder that is removed with the test.
class temporary_folder {
 public:
  temporary_folder();
  temporary_folder(const temporary_folder&) = delete;
  temporary_folder& operator=(const temporary_folder&) = delete;
  ~temporary_folder();
  [[nodiscard]] const std::filesystem::path& path() const { return path_; }

 private:
  std::filesystem::path path_;
};

/// device is a secure world in a temporary folder, with sessions to it.
class device {
 public:
  explicit device(bool rpmb = true);

  [[nodiscard]] hosted_tee::secure_world& world() { return *world_; }
  [[nodiscard]] ta_client& client() { return *client_; }
  [[nodiscard]] std::string context_name() const { return "embedded:" + (folder_.path() / "state").string(); }
  [[nodiscard]] const std::filesystem::path& folder() const {
    return folder_.path();
  }  ///< for files of the test; the state is in `state` below

  /// another_client opens a second session.
  [[nodiscard]] std::unique_ptr<ta_client> another_client() const;

  /// restart closes the session, ends the secure world and starts it again (a reboot: the boot seed changes), with or
  /// without RPMB. open_session does without the last step when the TA is expected not to start.
  void restart(bool rpmb = true, bool open_session = true);

  /// close_session closes the session, which ends the TA's instance; open_session makes a fresh one.
  void close_session() { client_.reset(); }
  void open_session();

  [[nodiscard]] hosted_tee::accounting accounting() { return world_->account(keymaster_ta); }

  /// traced tells whether the device traced exactly this text (the format's own newline included) at this level since
  /// clear_trace.
  [[nodiscard]] bool traced(std::string_view text, hosted_tee::trace_level level = hosted_tee::trace_level::error) {
    return world_->trace().contains(text, level);
  }
  void clear_trace() { world_->trace().clear(); }

 private:
  void start(bool rpmb);

  temporary_folder folder_;
  std::shared_ptr<hosted_tee::secure_world> world_;
  std::unique_ptr<ta_client> client_;
};

/// Fixture with one device. The client is reached through a function, since a restart replaces it.
class DeviceTest : public ::testing::Test {
 protected:
  device tee;
  ta_client& client() { return tee.client(); }

  /// expect_same compares what the TA holds with an earlier accounting.
  void expect_same(const hosted_tee::accounting& before);
};

}  // namespace testing_support

#endif  // TESTS_SUPPORT_DEVICE_FIXTURE_H_
