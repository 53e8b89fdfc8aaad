#include "client/kmctl/files.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "client/kmctl/exit_codes.h"

namespace {

using namespace kmctl;
namespace fs = std::filesystem;

class FilesTest : public testing::Test {
 protected:
  void SetUp() override {
    std::string name = (fs::temp_directory_path() / "kmctl-files-XXXXXX").string();
    ASSERT_NE(::mkdtemp(name.data()), nullptr);
    folder_ = name;
  }
  void TearDown() override { fs::remove_all(folder_); }

  [[nodiscard]] std::string path(const char* name) const { return (folder_ / name).string(); }
  [[nodiscard]] std::size_t entries() const {
    return static_cast<std::size_t>(std::distance(fs::directory_iterator(folder_), fs::directory_iterator()));
  }

  fs::path folder_;
};

constexpr output_rules keep{.existing = overwrite::never, .mode = 0600};

TEST_F(FilesTest, AFileIsWrittenWholeWithItsMode) {
  write_file(path("blob"), bytes{1, 2, 3}, keep);
  EXPECT_EQ(read_small_file(path("blob"), "blob"), (bytes{1, 2, 3}));
  EXPECT_EQ(fs::status(path("blob")).permissions(), fs::perms::owner_read | fs::perms::owner_write);
  EXPECT_EQ(entries(), 1U);
}

TEST_F(FilesTest, AnExistingFileStaysUnlessItMayBeOverwritten) {
  write_file(path("blob"), bytes{1}, keep);
  EXPECT_THROW(write_file(path("blob"), bytes{2}, keep), failure_error);
  EXPECT_THROW(check_output(path("blob"), keep), failure_error);
  EXPECT_EQ(read_small_file(path("blob"), "blob"), bytes{1});
  write_file(path("blob"), bytes{3}, {});
  EXPECT_EQ(read_small_file(path("blob"), "blob"), bytes{3});
  EXPECT_EQ(entries(), 1U) << "a temporary file was left behind";
}

TEST_F(FilesTest, ALinkStaysALink) {
  write_file(path("target"), bytes{1}, {});
  fs::create_symlink("target", path("link"));
  write_file(path("link"), bytes{2}, {});
  EXPECT_TRUE(fs::is_symlink(path("link")));
  EXPECT_EQ(read_small_file(path("target"), "file"), bytes{2});
}

TEST_F(FilesTest, WhatIsNotARegularFileIsWrittenStraight) {
  write_file("/dev/null", bytes{1}, keep);
  EXPECT_TRUE(fs::is_character_file("/dev/null"));
}

TEST_F(FilesTest, AFolderThatIsMissingIsNamed) {
  try {
    write_file(path("no/such"), bytes{1}, {});
    FAIL();
  } catch (const failure_error& refused) {
    EXPECT_NE(std::string(refused.what()).find(path("no/such")), std::string::npos);
  }
}

TEST_F(FilesTest, AFileThatIsTooLargeForABlobIsRefused) {
  std::ofstream(path("large")).close();
  fs::resize_file(path("large"), small_file_limit + 1);
  EXPECT_THROW((void)read_small_file(path("large"), "blob"), failure_error);
  fs::resize_file(path("large"), small_file_limit);
  EXPECT_EQ(read_small_file(path("large"), "blob").size(), small_file_limit);
}

TEST_F(FilesTest, AFileIsReadInFullBuffers) {
  write_file(path("data"), bytes(100, 7), {});
  input_file in(path("data"));
  EXPECT_EQ(in.size(), 100U);
  bytes buffer(64);
  EXPECT_EQ(in.read(buffer), 64U);
  EXPECT_EQ(in.read(buffer), 36U);
  EXPECT_EQ(in.read(buffer), 0U);
  EXPECT_THROW(input_file(path("absent")), failure_error);
}

TEST_F(FilesTest, TwoNamesOfOneFileAreRecognised) {
  write_file(path("one"), bytes{1}, {});
  fs::create_symlink("one", path("other"));
  EXPECT_TRUE(same_file(path("one"), path("other")));
  EXPECT_FALSE(same_file(path("one"), path("absent")));
  EXPECT_FALSE(same_file("-", "-"));
}

}  // namespace
