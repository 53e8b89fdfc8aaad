// A folder of a test's own.
#ifndef KEYMASTER_TESTS_CLIENT_FOLDER_FIXTURE_H_
#define KEYMASTER_TESTS_CLIENT_FOLDER_FIXTURE_H_

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <string>

/// Gives each test an empty folder, and removes it with what the test left there.
class folder_fixture : public testing::Test {
 protected:
  void SetUp() override {
    std::string name = (std::filesystem::temp_directory_path() / "kmctl-files-XXXXXX").string();
    ASSERT_NE(::mkdtemp(name.data()), nullptr);
    folder_ = name;
  }
  void TearDown() override { std::filesystem::remove_all(folder_); }

  [[nodiscard]] std::string path(const char* name) const { return (folder_ / name).string(); }
  [[nodiscard]] std::size_t entries() const {
    return static_cast<std::size_t>(
        std::distance(std::filesystem::directory_iterator(folder_), std::filesystem::directory_iterator()));
  }

  std::filesystem::path folder_;
};

#endif  // KEYMASTER_TESTS_CLIENT_FOLDER_FIXTURE_H_
