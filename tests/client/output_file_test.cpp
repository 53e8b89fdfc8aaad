#include "client/kmctl/output_file.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>

#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "tests/client/folder_fixture.h"

namespace {

using namespace kmctl;
namespace fs = std::filesystem;
using OutputFileTest = folder_fixture;

constexpr output_rules keep{.existing = overwrite::never, .mode = 0600};

TEST_F(OutputFileTest, AFileIsWrittenWholeWithItsMode) {
  write_file(path("blob"), bytes{1, 2, 3}, keep);
  EXPECT_EQ(read_small_file(path("blob"), "blob"), (bytes{1, 2, 3}));
  EXPECT_EQ(fs::status(path("blob")).permissions(), fs::perms::owner_read | fs::perms::owner_write);
  EXPECT_EQ(entries(), 1U);
}

TEST_F(OutputFileTest, AnExistingFileStaysUnlessItMayBeOverwritten) {
  write_file(path("blob"), bytes{1}, keep);
  EXPECT_THROW(write_file(path("blob"), bytes{2}, keep), failure_error);
  EXPECT_THROW(check_output(path("blob"), keep), failure_error);
  EXPECT_EQ(read_small_file(path("blob"), "blob"), bytes{1});
  write_file(path("blob"), bytes{3}, {});
  EXPECT_EQ(read_small_file(path("blob"), "blob"), bytes{3});
  EXPECT_EQ(entries(), 1U) << "a temporary file was left behind";
}

TEST_F(OutputFileTest, ALinkStaysALink) {
  write_file(path("target"), bytes{1}, {});
  fs::create_symlink("target", path("link"));
  write_file(path("link"), bytes{2}, {});
  EXPECT_TRUE(fs::is_symlink(path("link")));
  EXPECT_EQ(read_small_file(path("target"), "file"), bytes{2});
}

TEST_F(OutputFileTest, ALinkToNothingStaysALinkToo) {
  fs::create_directory(path("folder"));
  fs::create_symlink("folder/target", path("link"));
  fs::create_symlink("link", path("other"));
  check_output(path("other"), keep);
  write_file(path("other"), bytes{2}, keep);
  EXPECT_TRUE(fs::is_symlink(path("link")));
  EXPECT_TRUE(fs::is_symlink(path("other")));
  EXPECT_EQ(read_small_file(path("folder/target"), "file"), bytes{2});
  fs::create_symlink("round", path("round"));
  EXPECT_THROW(check_output(path("round"), {}), failure_error);
  EXPECT_THROW(write_file(path("round"), bytes{2}, {}), failure_error);
}

TEST_F(OutputFileTest, AReplacedFileKeepsItsModeAndNeverGetsWider) {
  const mode_t mask = ::umask(022);
  struct row {
    mode_t before;
    mode_t asked;
    mode_t after;
  };
  for (const auto& [before, asked, after] :
       {row{0600, 0666, 0600}, row{0644, 0666, 0644}, row{0664, 0666, 0664}, row{0644, 0600, 0600}}) {
    write_file(path("file"), bytes{1}, {});
    ASSERT_EQ(::chmod(path("file").c_str(), before), 0);
    write_file(path("file"), bytes{2}, {.mode = asked});
    EXPECT_EQ(static_cast<mode_t>(fs::status(path("file")).permissions()), after);
  }
  write_file(path("new"), bytes{1}, {});
  EXPECT_EQ(static_cast<mode_t>(fs::status(path("new")).permissions()), 0644U);
  (void)::umask(mask);
}

TEST_F(OutputFileTest, WhatCannotBeWrittenIsRefusedBeforeTheWork) {
  write_file(path("file"), bytes{1}, {});
  for (const std::string& bad : {path("no/such"), path("file/such"), path("."), path("no/"), folder_.string()}) {
    try {
      check_output(bad, {});
      FAIL() << bad;
    } catch (const failure_error& refused) {
      EXPECT_NE(std::string(refused.what()).find("can't write " + bad), std::string::npos);
      EXPECT_FALSE(refused.hint().empty()) << refused.what();
    }
    EXPECT_THROW(write_file(bad, bytes{1}, {}), failure_error) << bad;
  }
  for (const std::string& good : {path("new"), path("file"), std::string("/dev/null"), std::string("-")}) {
    EXPECT_NO_THROW(check_output(good, {}));
  }
  EXPECT_EQ(entries(), 1U);
}

TEST_F(OutputFileTest, WhatIsNotARegularFileIsWrittenStraight) {
  write_file("/dev/null", bytes{1}, keep);
  EXPECT_TRUE(fs::is_character_file("/dev/null"));
}

TEST_F(OutputFileTest, AFolderThatIsMissingIsNamed) {
  try {
    write_file(path("no/such"), bytes{1}, {});
    FAIL();
  } catch (const failure_error& refused) {
    EXPECT_NE(std::string(refused.what()).find(path("no/such")), std::string::npos);
  }
}

TEST_F(OutputFileTest, NothingIsThereBeforeCommitAndNothingStaysWithoutIt) {
  {
    output_file out(path("text"));
    out.write(bytes{1, 2});
    EXPECT_FALSE(fs::exists(path("text")));
    EXPECT_EQ(entries(), 1U) << "the temporary file stands beside its target";
  }
  EXPECT_EQ(entries(), 0U);
}

TEST_F(OutputFileTest, PiecesMakeOneFile) {
  write_file(path("text"), bytes{9, 9, 9, 9}, {});
  output_file out(path("text"));
  out.write(bytes{1, 2});
  out.write(bytes{3});
  EXPECT_EQ(read_small_file(path("text"), "text"), (bytes{9, 9, 9, 9}));
  out.commit();
  EXPECT_EQ(read_small_file(path("text"), "text"), (bytes{1, 2, 3}));
}

/// What can be read from a pipe at this moment.
bytes waiting_in(int pipe) {
  bytes content(4096);
  const ssize_t count = ::read(pipe, content.data(), content.size());
  content.resize(count < 0 ? 0 : static_cast<std::size_t>(count));
  return content;
}

TEST_F(OutputFileTest, APipeGetsWhatIsHeldBackOnlyWithCommit) {
  ASSERT_EQ(::mkfifo(path("pipe").c_str(), 0600), 0);
  const int reader = ::open(path("pipe").c_str(), O_RDONLY | O_NONBLOCK);
  ASSERT_GE(reader, 0);
  {
    output_file out(path("pipe"));
    out.write(bytes{1});
    EXPECT_EQ(waiting_in(reader), bytes{1}) << "without hold_back it goes straight";
  }
  {
    output_file out(path("pipe"), {.hold_back = true});
    out.write(bytes{2});
    EXPECT_TRUE(waiting_in(reader).empty());
  }
  {
    output_file out(path("pipe"), {.hold_back = true});
    out.write(bytes{3});
    out.write(bytes{4});
    out.commit();
    EXPECT_EQ(waiting_in(reader), (bytes{3, 4}));
  }
  (void)::close(reader);
}

TEST_F(OutputFileTest, AKillBeforeTheRenameLeavesTheOldFileWhole) {
  write_file(path("text"), bytes{1, 2, 3}, {});
  const pid_t child = ::fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    output_file out(path("text"));
    out.write(bytes{9, 9, 9, 9});
    (void)::raise(SIGKILL);
    ::_exit(0);
  }
  int status = 0;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_TRUE(WIFSIGNALED(status));
  EXPECT_EQ(read_small_file(path("text"), "text"), (bytes{1, 2, 3}));
  EXPECT_EQ(entries(), 2U) << "nobody was left to remove the temporary file";
  write_file(path("text"), bytes{4}, {});
  EXPECT_EQ(read_small_file(path("text"), "text"), bytes{4}) << "and it is in nobody's way";
}

TEST_F(OutputFileTest, ASignalRemovesWhatIsNotComplete) {
  for (const int signal : {SIGINT, SIGTERM, SIGHUP}) {
    const pid_t child = ::fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
      const output_file one(path("one"));
      const output_file other(path("other"));
      (void)::raise(signal);
      ::_exit(0);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_TRUE(WIFSIGNALED(status));
    EXPECT_EQ(WTERMSIG(status), signal) << "the signal still ends the program";
    EXPECT_EQ(entries(), 0U);
  }
}

}  // namespace
