// Contexts of the Client API: what their names mean, and the devices that can't be had.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <optional>

#include "tee/client/default_folder.h"
#include "tee_client_api.h"
#include "tests/support/device_fixture.h"

namespace hosted_tee::testing {
namespace {

namespace fs = std::filesystem;

/// Sets an environment variable (null: takes it away) until the end of the scope.
class variable {
 public:
  variable(const char* name, const char* value) : name_(name) {
    if (const char* old = std::getenv(name)) before_ = old;
    value == nullptr ? ::unsetenv(name) : ::setenv(name, value, 1);
  }
  ~variable() { before_ ? ::setenv(name_, before_->c_str(), 1) : ::unsetenv(name_); }
  variable(const variable&) = delete;
  variable& operator=(const variable&) = delete;

 private:
  const char* name_;
  std::optional<std::string> before_;
};

class ContextTest : public ::testing::Test {
 protected:
  static TEEC_Result initialize(const char* name) {
    TEEC_Context context{};
    const TEEC_Result result = TEEC_InitializeContext(name, &context);
    TEEC_FinalizeContext(&context);
    return result;
  }
  std::string path(const char* name) const { return (folder.path() / name).string(); }

  ::testing_support::temporary_folder folder;
};

TEST_F(ContextTest, TheNameComesFromTheCallTheEnvironmentOrTheDefault) {
  const variable tee("KEYMASTER_TEE", ("embedded:" + path("tee")).c_str());
  const variable state("KEYMASTER_STATE", path("state").c_str());
  EXPECT_EQ(initialize(("embedded:" + path("name")).c_str()), TEEC_SUCCESS);
  EXPECT_TRUE(fs::exists(path("name")));
  EXPECT_FALSE(fs::exists(path("tee")));
  EXPECT_EQ(initialize(nullptr), TEEC_SUCCESS);
  EXPECT_TRUE(fs::exists(path("tee")));
  EXPECT_FALSE(fs::exists(path("state")));
  const variable none("KEYMASTER_TEE", "");
  EXPECT_EQ(initialize(nullptr), TEEC_SUCCESS);
  EXPECT_TRUE(fs::exists(path("state")));
}

TEST_F(ContextTest, TheDefaultFolderFollowsTheXdgRules) {
  const variable state("KEYMASTER_STATE", nullptr);
  const variable home("HOME", "/home/somebody");
  {
    const variable xdg("XDG_STATE_HOME", "/var/somebody");
    EXPECT_EQ(default_state_folder(), "/var/somebody/keymaster");
  }
  const variable xdg("XDG_STATE_HOME", nullptr);
  EXPECT_EQ(default_state_folder(), "/home/somebody/.local/state/keymaster");
}

TEST_F(ContextTest, OtherFormsOfNamesAreRefused) {
  for (const char* name : {"", "embedded:", "unix", "unix:", "embedded", "/tmp/x"}) {
    EXPECT_EQ(initialize(name), TEEC_ERROR_BAD_PARAMETERS) << name;
  }
}

TEST_F(ContextTest, EachFaultOfAFolderHasItsResult) {
  const std::string name = "embedded:" + path("state");
  ASSERT_EQ(initialize(name.c_str()), TEEC_SUCCESS);
  std::ofstream(folder.path() / "state" / "version") << "999";
  EXPECT_EQ(initialize(name.c_str()), TEEC_ERROR_BAD_STATE);
  std::ofstream(folder.path() / "state" / "version") << "?";
  EXPECT_EQ(initialize(name.c_str()), TEEC_ERROR_BAD_FORMAT);
  fs::remove(folder.path() / "state" / "version");
  EXPECT_EQ(initialize(name.c_str()), TEEC_ERROR_SECURITY);
  fs::create_directory(path("letters"));
  std::ofstream(folder.path() / "letters" / "to Mary") << "Dear Mary";
  EXPECT_EQ(initialize(("embedded:" + path("letters")).c_str()), TEEC_ERROR_BAD_PARAMETERS);
  std::ofstream(path("file")) << "in the way";
  EXPECT_EQ(initialize(("embedded:" + path("file")).c_str()), TEEC_ERROR_GENERIC);
}

TEST_F(ContextTest, TheReasonIsPrintedWhereTheTraceIs) {
  fs::create_directory(path("state"));
  std::ofstream(folder.path() / "state" / "settings") << "rpbm = off\n";
  const auto printed = [&](const char* level) {
    const variable trace("KEYMASTER_TRACE", level);
    ::testing::internal::CaptureStderr();
    EXPECT_EQ(initialize(("embedded:" + path("state")).c_str()), TEEC_ERROR_BAD_FORMAT);
    return ::testing::internal::GetCapturedStderr();
  };
  EXPECT_EQ(printed("error"),
            "TEE error client_api:0: " + path("state") + "/settings: can't make sense of line 1: rpbm = off\n");
  EXPECT_EQ(printed(nullptr), "");
}

TEST_F(ContextTest, AFolderIsBusyAsLongAsTheProcessThatHoldsItLives) {
  const std::string name = "embedded:" + path("state");
  std::array<int, 2> ready{};
  ASSERT_EQ(::pipe(ready.data()), 0);
  const pid_t holder = ::fork();
  if (holder == 0) {
    TEEC_Context context{};
    const TEEC_Result result = TEEC_InitializeContext(name.c_str(), &context);
    (void)!::write(ready[1], &result, sizeof result);
    for (;;) ::pause();
  }
  TEEC_Result of_holder = TEEC_ERROR_GENERIC;
  EXPECT_EQ(::read(ready[0], &of_holder, sizeof of_holder), static_cast<ssize_t>(sizeof of_holder));
  EXPECT_EQ(of_holder, TEEC_SUCCESS);
  EXPECT_EQ(initialize(name.c_str()), TEEC_ERROR_BUSY);
  EXPECT_EQ(::kill(holder, SIGKILL), 0);
  EXPECT_EQ(::waitpid(holder, nullptr, 0), holder);
  EXPECT_EQ(initialize(name.c_str()), TEEC_SUCCESS);
  ::close(ready[0]);
  ::close(ready[1]);
}

}  // namespace
}  // namespace hosted_tee::testing
