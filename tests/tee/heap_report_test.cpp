// The report of the most heap that each command took.
#include <gmock/gmock.h>

#include <cstdlib>
#include <fstream>

#include "tee/runtime/instance_heap.h"
#include "tee_internal_api.h"
#include "tests/tee/world_fixture.h"

using namespace hosted_tee;
using namespace hosted_tee::testing;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

constexpr std::uint32_t charge(std::uint32_t multiple_of_8) {
  return multiple_of_8 + instance_heap::block_overhead;
}

class HeapReportTest : public WorldTest {
 protected:
  HeapReportTest() {
    if (const char* value = std::getenv("KEYMASTER_HEAP_REPORT"); value != nullptr) before_ = value;
    ::setenv("KEYMASTER_HEAP_REPORT", file.c_str(), 1);
    start();
    // Command n has blocks of n * 8 bytes in use, two of them one after the other, and keeps none.
    first.invoke = [](void*, std::uint32_t command, std::uint32_t, TEE_Param*) {
      for (int i = 0; i < 2; ++i) TEE_Free(TEE_Malloc(command * 8, 0));
      return TEE_SUCCESS;
    };
  }
  ~HeapReportTest() override {
    before_.empty() ? ::unsetenv("KEYMASTER_HEAP_REPORT") : ::setenv("KEYMASTER_HEAP_REPORT", before_.c_str(), 1);
  }

  std::vector<std::string> reported() {
    world.reset();
    std::ifstream in(file);
    std::vector<std::string> lines;
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    return lines;
  }

  static std::string line(const char* uuid, std::uint32_t command, std::uint32_t bytes) {
    return std::string(uuid) + " " + std::to_string(command) + " " + std::to_string(bytes);
  }

  static constexpr const char* first_uuid = "7e57a001-0001-4000-8000-000000000001";
  static constexpr const char* second_uuid = "7e57a002-0001-4000-8000-000000000002";
  const std::string file = folder.path() / "report";

 private:
  std::string before_;
};

TEST_F(HeapReportTest, EachCommandHasTheMostThatWasInUseWhileItRan) {
  const std::uint32_t session = must_open(first_ta::uuid);
  for (const std::uint32_t command : {30U, 3U, 255U, 3U}) (void)invoke(session, command);
  EXPECT_THAT(reported(), ElementsAre(line(first_uuid, 3, charge(24)), line(first_uuid, 30, charge(240)),
                                      line(first_uuid, 255, charge(2040))));
}

TEST_F(HeapReportTest, ARunThatTookLessDoesNotHideOneThatTookMore) {
  for (const std::uint32_t size : {8U, 800U, 16U}) {
    first.invoke = [size](void*, std::uint32_t, std::uint32_t, TEE_Param*) {
      TEE_Free(TEE_Malloc(size, 0));
      return TEE_SUCCESS;
    };
    (void)invoke(must_open(first_ta::uuid), 1);
  }
  EXPECT_THAT(reported(), ElementsAre(line(first_uuid, 1, charge(800))));
}

TEST_F(HeapReportTest, WhatAnEarlierCommandKeepsCounts) {
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) {
    return TEE_Malloc(8, 0) != nullptr ? TEE_SUCCESS : TEE_ERROR_OUT_OF_MEMORY;
  };
  const std::uint32_t session = must_open(first_ta::uuid);
  for (int i = 0; i < 3; ++i) (void)invoke(session, 1);
  EXPECT_THAT(reported(), ElementsAre(line(first_uuid, 1, 3 * charge(8))));
}

TEST_F(HeapReportTest, TasAreToldApartAndDevicesAppend) {
  second.invoke = first.invoke;
  (void)invoke(must_open(first_ta::uuid), 1);
  (void)invoke(must_open(second_ta::uuid), 2);
  start();
  (void)invoke(must_open(second_ta::uuid), 5);
  EXPECT_THAT(reported(), ElementsAre(line(first_uuid, 1, charge(8)), line(second_uuid, 2, charge(16)),
                                      line(second_uuid, 5, charge(40))));
}

TEST_F(HeapReportTest, ACommandThatPanicsIsCounted) {
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) {
    (void)TEE_Malloc(800, 0);
    TEE_Panic(1);
    return TEE_SUCCESS;
  };
  (void)invoke(must_open(first_ta::uuid), 9);
  EXPECT_THAT(reported(), ElementsAre(line(first_uuid, 9, charge(800))));
}

TEST_F(HeapReportTest, SessionsAloneAreNoCommand) {
  world->close_session(must_open(first_ta::uuid));
  EXPECT_THAT(reported(), IsEmpty());
}

TEST_F(HeapReportTest, AFileThatCannotBeWrittenIsTold) {
  ::setenv("KEYMASTER_HEAP_REPORT", (folder.path() / "missing" / "report").c_str(), 1);
  start();
  (void)invoke(must_open(first_ta::uuid), 1);
  ::testing::internal::CaptureStderr();
  world.reset();
  EXPECT_THAT(::testing::internal::GetCapturedStderr(), ::testing::StartsWith("the heap report can't be written: "));
}

}  // namespace
