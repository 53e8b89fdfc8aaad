#include "client/kmctl/files.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "client/kmctl/exit_codes.h"
#include "client/kmctl/output_file.h"
#include "tests/client/folder_fixture.h"

namespace {

using namespace kmctl;
namespace fs = std::filesystem;

using FilesTest = folder_fixture;

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

TEST_F(FilesTest, AnInputIsNeverTheOutput) {
  write_file(path("one"), bytes{1}, {});
  write_file(path("other"), bytes{1}, {});
  fs::create_symlink("one", path("link"));
  fs::create_hard_link(path("one"), path("twin"));
  for (const char* const name : {"one", "link", "twin"}) {
    EXPECT_THROW(refuse_overwriting(path(name), {path("other"), path("one")}), usage_error) << name;
  }
  EXPECT_NO_THROW(refuse_overwriting(path("one"), {path("other"), path("absent"), "", "-"}));
  EXPECT_NO_THROW(refuse_overwriting(path("absent"), {path("absent")}));
  EXPECT_NO_THROW(refuse_overwriting("/dev/null", {"/dev/null"}));
  EXPECT_NO_THROW(refuse_overwriting("-", {"-"}));
}

TEST_F(FilesTest, AFileIsKnownToBeTheOneThatWasOpened) {
  write_file(path("blob"), bytes{1}, {});
  const input_file in(path("blob"));
  EXPECT_TRUE(in.still_named());
  write_file(path("blob"), bytes{1}, {});
  EXPECT_FALSE(in.still_named());
  fs::remove(path("blob"));
  EXPECT_FALSE(in.still_named());
}

}  // namespace
