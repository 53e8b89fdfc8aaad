// Whole commands of kmctl with a TEE that answers what the test wants, at the moment that the test wants.
#include "client/kmctl/application.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <thread>
#include <vector>

#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/output_file.h"
#include "client/kmctl/progress.h"
#include "tests/client/fake_tee.h"
#include "tests/client/folder_fixture.h"

namespace {

using namespace kmctl;
namespace fs = std::filesystem;

/// Has a stream lead to another file while it lives.
class redirection {
 public:
  redirection(int stream, int file) : stream_(stream), kept_(::fcntl(stream, F_DUPFD_CLOEXEC, 3)) {
    (void)::dup2(file, stream_);
  }
  redirection(const redirection&) = delete;
  redirection& operator=(const redirection&) = delete;
  ~redirection() {
    (void)::dup2(kept_, stream_);
    (void)::close(kept_);
  }

 private:
  int stream_;
  int kept_;
};

class ApplicationTest : public folder_fixture {
 protected:
  void SetUp() override {
    folder_fixture::SetUp();
    fake_tee::reset();
  }

  /// Runs kmctl, and gives its exit code.
  int kmctl(std::vector<std::string> words) const {
    words.insert(words.begin(), {"kmctl", "--tee", "embedded:/nowhere"});
    std::vector<const char*> argv;
    argv.reserve(words.size());
    for (const std::string& word : words) {
      argv.push_back(word.c_str());
    }
    return run(static_cast<int>(argv.size()), argv.data());
  }
};

TEST_F(ApplicationTest, DeleteDoesNotRemoveAFileThatTookTheBlobsPlace) {
  write_file(path("key.blob"), bytes{1, 2, 3}, {});
  fake_tee::now().at_command = [&] { write_file(path("key.blob"), bytes{4, 5, 6}, {}); };
  testing::internal::CaptureStderr();
  EXPECT_EQ(kmctl({"delete", path("key.blob")}), exit_failure);
  EXPECT_NE(testing::internal::GetCapturedStderr().find("is another file now"), std::string::npos);
  EXPECT_EQ(read_small_file(path("key.blob"), "blob"), (bytes{4, 5, 6}));
  fake_tee::reset();
  testing::internal::CaptureStdout();
  EXPECT_EQ(kmctl({"delete", path("key.blob")}), exit_done);
  EXPECT_NE(testing::internal::GetCapturedStdout().find("is removed"), std::string::npos);
  EXPECT_FALSE(fs::exists(path("key.blob")));
}

TEST_F(ApplicationTest, NothingIsAskedOfTheTaWhenTheOutputCannotBeWritten) {
  write_file(path("key.blob"), bytes{1, 2, 3}, {});
  write_file(path("data"), bytes{1}, {});
  const std::string nowhere = path("no/such");
  testing::internal::CaptureStderr();
  for (const std::vector<std::string>& words : std::vector<std::vector<std::string>>{
           {"sign", path("key.blob"), path("data"), "-o", nowhere},
           {"encrypt", path("key.blob"), path("data"), "-o", nowhere},
           {"decrypt", path("key.blob"), path("data"), "-o", nowhere},
           {"encrypt", path("key.blob"), path("data"), "-o", path("out"), "--nonce-out", nowhere},
           {"export", path("key.blob"), "-o", nowhere},
           {"generate", nowhere},
           {"import", path("data"), nowhere},
           {"generate", path("key.blob")},
       }) {
    EXPECT_EQ(kmctl(words), exit_failure) << words.front();
  }
  (void)testing::internal::GetCapturedStderr();
  EXPECT_TRUE(fake_tee::now().arrivals.empty());
  EXPECT_EQ(fake_tee::now().connected_to, "");
}

/// A terminal: what is written to `follower` can be read from `leader`.
struct terminal {
  int leader = ::posix_openpt(O_RDWR | O_NOCTTY);
  int follower = ::grantpt(leader) == 0 && ::unlockpt(leader) == 0 ? ::open(::ptsname(leader), O_RDWR | O_NOCTTY) : -1;

  terminal() = default;
  terminal(const terminal&) = delete;
  terminal& operator=(const terminal&) = delete;
  ~terminal() {
    (void)::close(leader);
    if (follower >= 0) {
      (void)::close(follower);
    }
  }
  /// What is shown next, at most 4 KiB of it; nothing when that takes longer than 200 ms. A terminal hands on what was
  /// written to it only a little later.
  [[nodiscard]] std::string next() const {
    std::array<char, 4096> piece{};
    pollfd waiting{leader, POLLIN, 0};
    const ssize_t count = ::poll(&waiting, 1, 200) > 0 ? ::read(leader, piece.data(), piece.size()) : 0;
    return {piece.data(), static_cast<std::size_t>(std::max<ssize_t>(count, 0))};
  }

  /// All that was written by somebody who writes no more.
  [[nodiscard]] std::string rest() const {
    std::string text;
    for (std::string piece = next(); !piece.empty(); piece = next()) {
      text += piece;
    }
    return text;
  }
};

TEST_F(ApplicationTest, TheTaIsNotAskedForBinaryDataThatATerminalWouldGet) {
  write_file(path("key.blob"), bytes{1, 2, 3}, {});
  const terminal screen;
  ASSERT_GE(screen.follower, 0);
  for (const std::vector<std::string>& words : std::vector<std::vector<std::string>>{
           {"sign", path("key.blob"), path("key.blob")},
           {"encrypt", path("key.blob"), path("key.blob")},
           {"export", path("key.blob"), "--der"},
           {"generate", "-"},
           {"import", path("key.blob"), "-"},
       }) {
    const redirection out(STDOUT_FILENO, screen.follower);
    testing::internal::CaptureStderr();
    EXPECT_EQ(kmctl(words), exit_usage) << words.front();
    EXPECT_NE(testing::internal::GetCapturedStderr().find("does not go to a terminal"), std::string::npos);
  }
  EXPECT_TRUE(fake_tee::now().arrivals.empty());
}

TEST_F(ApplicationTest, ASpinnerTurnsAndGoesAway) {
  const terminal screen;
  ASSERT_GE(screen.follower, 0);
  {
    const redirection error(STDERR_FILENO, screen.follower);
    const spinner quick("Quick");
  }
  std::string shown;
  {
    const redirection error(STDERR_FILENO, screen.follower);
    const spinner slow("Working");
    // It turns when the machine has time for it; reading waits for something to be shown.
    while (shown.find("Working /") == std::string::npos) {
      shown += screen.next();
    }
  }
  shown += screen.rest();
  EXPECT_EQ(shown.find("Quick"), std::string::npos);
  EXPECT_NE(shown.find("\r\x1b[KWorking |  0."), std::string::npos) << shown;
  EXPECT_NE(shown.find("Working /"), std::string::npos) << shown;
  EXPECT_TRUE(shown.ends_with("s\r\x1b[K")) << shown;
}

TEST_F(ApplicationTest, ATerminalThatHangsUpEndsNothing) {
  int follower = -1;
  {
    const terminal screen;
    follower = ::fcntl(screen.follower, F_DUPFD_CLOEXEC, 3);
  }  // from here on, writing fails
  ASSERT_EQ(::write(follower, "x", 1), -1);
  {
    const redirection error(STDERR_FILENO, follower);
    const spinner slow("Working");
    progress_bar bar("Working", 1000);
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    bar.advance(500);
  }
  (void)::close(follower);
}

}  // namespace
