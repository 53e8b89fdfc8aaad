// TA images: where they are found, what makes one refused, and that each instance has data of its own.
#include <gmock/gmock.h>

#include <fstream>

#include "tee/runtime/instance_heap.h"
#include "tee/runtime/ta_image.h"
#include "tee/runtime/uuid.h"
#include "tests/tee/world_fixture.h"

namespace hosted_tee::testing {
namespace {

namespace fs = std::filesystem;

// The images of tests/tee/images, one source with two sets of flags.
const TEE_UUID shared_ta = *parse_uuid("11d0a5d2-6f0c-4f3e-9d0e-0d6a5b1c2e01");
const TEE_UUID separate_ta = *parse_uuid("11d0a5d2-6f0c-4f3e-9d0e-0d6a5b1c2e02");

class LoaderTest : public WorldTest {
 protected:
  LoaderTest() {
    options.ta_folder = TEST_TA_FOLDER;
    start();
  }

  std::uint32_t count(std::uint32_t session) {
    std::array<TEE_Param, 4> params{};
    EXPECT_EQ(invoke(session, 0, TEE_PARAM_TYPE_VALUE_OUTPUT, params.data()).result, TEE_SUCCESS);
    return params[0].value.a;
  }
  TEE_Result allocate(std::uint32_t session, std::uint32_t size) {
    std::array<TEE_Param, 4> params{};
    params[0].value.a = size;
    return invoke(session, 2, TEE_PARAM_TYPE_VALUE_INPUT, params.data()).result;
  }
};

TEST_F(LoaderTest, SessionsOfASingleInstanceShareItsData) {
  const std::uint32_t a = must_open(shared_ta);
  const std::uint32_t b = must_open(shared_ta);
  EXPECT_EQ(count(a), 1U);
  EXPECT_EQ(count(b), 2U);
}

TEST_F(LoaderTest, EachInstanceOfOneImageHasDataOfItsOwn) {
  const std::uint32_t a = must_open(separate_ta);
  const std::uint32_t b = must_open(separate_ta);
  EXPECT_EQ(count(a), 1U);
  EXPECT_EQ(count(a), 2U);
  EXPECT_EQ(count(b), 1U);
}

TEST_F(LoaderTest, ANewInstanceStartsWithFreshData) {
  for (int i = 0; i < 20; ++i) {
    const std::uint32_t session = must_open(shared_ta);
    EXPECT_EQ(count(session), 1U);
    if (i % 2 == 0) {
      EXPECT_EQ(invoke(session, 1), dead);
    }
    world->close_session(session);
  }
}

TEST_F(LoaderTest, TheImageSaysItsPrefixAndItsHeap) {
  const std::uint32_t session = must_open(shared_ta);
  const auto& line = world->trace().lines().back();
  EXPECT_EQ(line.prefix, "COUNTING");
  EXPECT_EQ(line.text, "created");
  EXPECT_EQ(allocate(session, 1024 - instance_heap::block_overhead + 1), TEE_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(allocate(session, 1024 - instance_heap::block_overhead), TEE_SUCCESS);
}

TEST_F(LoaderTest, AHeapLimitOfTheDeviceGoesBeforeTheImages) {
  options.heap_limit = 64;
  start();
  EXPECT_EQ(allocate(must_open(shared_ta), 100), TEE_ERROR_OUT_OF_MEMORY);
}

TEST_F(LoaderTest, AnImageUnderAnotherNameAndWhatIsNoImageAreRefusedWithTheReason) {
  const TEE_UUID other{0xAAAAAAAA, 0xBBBB, 0xCCCC, {1, 2, 3, 4, 5, 6, 7, 8}};
  options.ta_folder = folder.path();
  start();
  const fs::path file = folder.path() / (to_text(other) + ".ta");
  EXPECT_EQ(open(other), (reply{TEE_ERROR_ITEM_NOT_FOUND, TEE_ORIGIN_TEE, 0}));
  fs::copy_file(fs::path(TEST_TA_FOLDER) / (to_text(shared_ta) + ".ta"), file);
  EXPECT_EQ(open(other), (reply{TEE_ERROR_BAD_FORMAT, TEE_ORIGIN_TEE, 0}));
  EXPECT_THAT(world->trace().lines().back().text, ::testing::EndsWith("the image is that of " + to_text(shared_ta)));
  std::ofstream(file, std::ios::trunc) << "not an image";
  EXPECT_EQ(open(other).result, TEE_ERROR_BAD_FORMAT);
}

TEST_F(LoaderTest, LooksThroughTheFoldersOfTheEnvironmentInOrder) {
  const char* old = std::getenv("KEYMASTER_TA_PATH");
  const std::string before = old == nullptr ? "" : old;
  options.ta_folder.clear();
  ::setenv("KEYMASTER_TA_PATH", (folder.path().string() + ":" + TEST_TA_FOLDER).c_str(), 1);
  start();
  EXPECT_EQ(open(shared_ta).result, TEE_SUCCESS);
  ::setenv("KEYMASTER_TA_PATH", folder.path().c_str(), 1);
  start();
  EXPECT_EQ(open(shared_ta).result, TEE_ERROR_ITEM_NOT_FOUND);
  ::setenv("KEYMASTER_TA_PATH", before.c_str(), 1);
}

TEST_F(LoaderTest, LooksBesideItsOwnLibraryAndNowhereElseWhenTheEnvironmentNamesNoFolder) {
  const char* old = std::getenv("KEYMASTER_TA_PATH");
  const std::string before = old == nullptr ? "" : old;
  for (const char* none : {"", static_cast<const char*>(nullptr)}) {
    ::unsetenv("KEYMASTER_TA_PATH");
    if (none != nullptr) ::setenv("KEYMASTER_TA_PATH", none, 1);
    const std::vector<fs::path> folders = default_ta_folders();
    ASSERT_EQ(folders.size(), 1U);
    EXPECT_TRUE(folders.front().is_absolute());
    EXPECT_THAT(folders.front().string(), ::testing::EndsWith("/keymaster/ta"));
    EXPECT_TRUE(fs::is_regular_file(folders.front() / "fbacea43-f475-4df3-866f-76256aba994f.ta"));
  }
  ::setenv("KEYMASTER_TA_PATH", before.c_str(), 1);
}

}  // namespace
}  // namespace hosted_tee::testing
