// The parts of an instance and a device that need no TA: heap, faults, clocks, trace.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <ctime>
#include <random>
#include <stdexcept>
#include <utility>
#include <vector>

#include "tee/runtime/platform_call.h"
#include "tests/tee/scoped_instance.h"

namespace hosted_tee::testing {
namespace {

using ::testing::Each;
using ::testing::ElementsAre;
using bytes = std::vector<std::uint8_t>;

bytes read(const void* block, std::size_t size) {
  const auto* data = static_cast<const std::uint8_t*>(block);
  return {data, data + size};
}

TEST(InstanceHeap, ChargesEachBlockItsSizeRoundedUpAndTheOverhead) {
  instance_heap heap(1024);
  void* block = heap.allocate(9, true);
  EXPECT_EQ(heap.bytes(), 16 + instance_heap::block_overhead);
  EXPECT_EQ(heap.blocks(), 1U);
  EXPECT_TRUE(heap.free(block));
  EXPECT_EQ(heap.bytes(), 0U);
  EXPECT_EQ(heap.blocks(), 0U);
  EXPECT_EQ(heap.peak(), 16 + instance_heap::block_overhead);
}

TEST(InstanceHeap, GivesOutExactlyItsLimitAndNotAByteMore) {
  instance_heap heap(64 + 2 * instance_heap::block_overhead);
  void* first = heap.allocate(32, true);
  void* second = heap.allocate(32, true);
  EXPECT_NE(first, nullptr);
  EXPECT_NE(second, nullptr);
  EXPECT_EQ(heap.allocate(0, true), nullptr);
  EXPECT_TRUE(heap.free(second));
  EXPECT_EQ(heap.allocate(33, true), nullptr);
  EXPECT_NE(heap.allocate(32, true), nullptr);
}

TEST(InstanceHeap, RefusesASizeThatWouldWrap) {
  instance_heap heap(0xFFFFFFFF);
  EXPECT_EQ(heap.allocate(0xFFFFFFFF, true), nullptr);
  EXPECT_EQ(heap.bytes(), 0U);
}

TEST(InstanceHeap, FillsWithZerosOrAPatternAndKeepsToItWhenABlockGrows) {
  instance_heap heap(4096);
  void* zeros = heap.allocate(16, true);
  void* pattern = heap.allocate(16, false);
  EXPECT_THAT(read(zeros, 16), Each(0));
  EXPECT_THAT(read(pattern, 16), Each(0xA5));
  std::memset(zeros, 7, 16);
  zeros = heap.reallocate(zeros, 18);
  pattern = heap.reallocate(pattern, 32);
  EXPECT_THAT(read(zeros, 16), Each(7));
  EXPECT_THAT(read(static_cast<std::uint8_t*>(zeros) + 16, 2), Each(0));
  EXPECT_THAT(read(pattern, 32), Each(0xA5));
}

TEST(InstanceHeap, ZeroSizedBlocksAreBlocks) {
  instance_heap heap(4096);
  void* a = heap.allocate(0, true);
  void* b = heap.allocate(0, true);
  EXPECT_NE(a, nullptr);
  EXPECT_NE(a, b);
  EXPECT_EQ(heap.blocks(), 2U);
  EXPECT_TRUE(heap.free(a));
}

TEST(InstanceHeap, AFailedReallocationLeavesTheBlockAsItWas) {
  instance_heap heap(64);
  void* block = heap.allocate(8, true);
  std::memset(block, 3, 8);
  const std::uint32_t before = heap.bytes();
  EXPECT_EQ(heap.reallocate(block, 64), nullptr);
  EXPECT_EQ(heap.bytes(), before);
  EXPECT_THAT(read(block, 8), Each(3));
  EXPECT_TRUE(heap.free(block));
}

TEST(InstanceHeap, BothBlocksCountWhileOneMovesToTheOther) {
  constexpr std::uint32_t overhead = instance_heap::block_overhead;
  instance_heap heap(40 + 2 * overhead);
  void* block = heap.allocate(16, true);
  EXPECT_EQ(heap.reallocate(block, 25), nullptr);
  block = heap.reallocate(block, 24);
  EXPECT_NE(block, nullptr);
  EXPECT_EQ(heap.bytes(), 24 + overhead);
  EXPECT_EQ(heap.peak(), 40 + 2 * overhead);
}

TEST(InstanceHeap, RecognisesWhatItDidNotHandOut) {
  instance_heap heap(4096);
  int foreign = 0;
  void* block = heap.allocate(8, true);
  EXPECT_FALSE(heap.free(&foreign));
  EXPECT_FALSE(heap.free(static_cast<std::uint8_t*>(block) + 1));
  EXPECT_TRUE(heap.free(block));
  EXPECT_FALSE(heap.owns(block));
}

TEST(InstanceHeap, KeepsTrackOfManyBlocksFreedInAnyOrder) {
  instance_heap heap(1U << 24);
  std::mt19937 random(1);
  std::vector<void*> blocks;
  for (int round = 0; round < 20'000; ++round) {
    if (blocks.empty() || random() % 5 < 3) {
      blocks.push_back(heap.allocate(random() % 64, true));
      ASSERT_NE(blocks.back(), nullptr);
    } else {
      std::swap(blocks[random() % blocks.size()], blocks.back());
      ASSERT_TRUE(heap.free(blocks.back()));
      ASSERT_FALSE(heap.owns(blocks.back()));
      blocks.pop_back();
    }
    ASSERT_EQ(heap.blocks(), blocks.size());
  }
  for (void* block : blocks) ASSERT_TRUE(heap.free(block));
  EXPECT_EQ(heap.bytes(), 0U);
}

TEST(InstanceHeap, ShowsEachBlockBeforeItIsFreedAlsoWhenItMoves) {
  instance_heap heap(4096);
  std::vector<bytes> seen;
  heap.set_inspector([&](std::span<const std::uint8_t> block) { seen.emplace_back(block.begin(), block.end()); });
  void* block = heap.allocate(2, true);
  std::memset(block, 1, 2);
  block = heap.reallocate(block, 3);
  EXPECT_TRUE(heap.free(block));
  EXPECT_THAT(seen, ElementsAre(bytes{1, 1}, bytes{1, 1, 0}));
}

TEST(FaultPlan, FailsTheNthCallOfOneFunctionOnce) {
  fault_plan faults;
  faults.fail_call("TEE_B", 2, TEE_ERROR_BUSY);
  EXPECT_EQ(faults.on_call("TEE_B", call_kind::fallible), std::nullopt);
  EXPECT_EQ(faults.on_call("TEE_A", call_kind::fallible), std::nullopt);
  EXPECT_FALSE(faults.triggered());
  EXPECT_EQ(faults.on_call("TEE_B", call_kind::fallible), TEE_ERROR_BUSY);
  EXPECT_TRUE(faults.triggered());
  EXPECT_EQ(faults.on_call("TEE_B", call_kind::fallible), std::nullopt);
}

TEST(FaultPlan, FailsTheNthOfAllCallsThatCanFail) {
  fault_plan faults;
  (void)faults.on_call("TEE_A", call_kind::fallible);
  faults.fail_any_call(2, TEE_ERROR_GENERIC);
  EXPECT_EQ(faults.on_call("TEE_A", call_kind::fallible), std::nullopt);
  EXPECT_EQ(faults.on_call("TEE_MACInit", call_kind::step), std::nullopt);
  EXPECT_EQ(faults.on_call("TEE_B", call_kind::fallible), TEE_ERROR_GENERIC);
  EXPECT_EQ(faults.fallible_calls(), 3U);
}

TEST(FaultPlan, FailsAStepByItsNameAloneAndListsTheSteps) {
  fault_plan faults;
  faults.fail_any_call(1, TEE_ERROR_GENERIC);
  faults.fail_call("TEE_MACInit", 2, TEE_ERROR_BUSY);
  EXPECT_EQ(faults.on_call("TEE_MACInit", call_kind::step), std::nullopt);
  EXPECT_EQ(faults.on_call("TEE_DigestUpdate", call_kind::step), std::nullopt);
  EXPECT_FALSE(faults.triggered());
  EXPECT_EQ(faults.on_call("TEE_MACInit", call_kind::step), TEE_ERROR_BUSY);
  EXPECT_EQ(faults.on_call("TEE_MACInit", call_kind::step), std::nullopt);
  EXPECT_THAT(faults.steps(), ElementsAre("TEE_MACInit", "TEE_DigestUpdate"));
  EXPECT_EQ(faults.fallible_calls(), 0U);
}

TEST(FaultPlan, NeverFailsWhatCannotFail) {
  fault_plan faults;
  faults.fail_call("TEE_Free", 1, TEE_ERROR_BUSY);
  EXPECT_EQ(faults.on_call("TEE_Free", call_kind::infallible), std::nullopt);
  EXPECT_FALSE(faults.triggered());
  EXPECT_EQ(faults.call_count("TEE_Free"), 1U);
}

TEST(FaultPlan, CountsByNameWhereverTheNameLies) {
  fault_plan faults;
  const std::string copy = "TEE_A";
  (void)faults.on_call("TEE_A", call_kind::fallible);
  (void)faults.on_call(copy.c_str(), call_kind::infallible);
  EXPECT_EQ(faults.call_count("TEE_A"), 2U);
  EXPECT_EQ(faults.call_count("TEE_B"), 0U);
  faults.clear();
  EXPECT_EQ(faults.call_count("TEE_A"), 0U);
}

TEST(FaultPlan, CountsMoreNamesThanItWasMadeFor) {
  fault_plan faults;
  std::vector<std::string> names;
  for (int i = 0; i < 1000; ++i) names.push_back("TEE_" + std::to_string(i));
  for (const std::string& name : names) (void)faults.on_call(name.c_str(), call_kind::fallible);
  for (const std::string& name : names) EXPECT_EQ(faults.call_count(name), 1U) << name;
}

TEST(FaultPlan, FalsifiesTheOutputOfTheNthCall) {
  fault_plan faults;
  faults.override_output("TEE_A", 1, [](std::uint32_t* length, TEE_Result&) { *length = 31; });
  faults.override_output("TEE_A", 2, [](std::uint32_t*, TEE_Result& result) { result = TEE_ERROR_GENERIC; });
  std::uint32_t length = 32;
  TEE_Result result = TEE_SUCCESS;
  faults.on_output("TEE_A", &length, result);
  EXPECT_EQ(length, 31U);
  EXPECT_EQ(result, TEE_SUCCESS);
  faults.on_output("TEE_A", &length, result);
  EXPECT_EQ(result, TEE_ERROR_GENERIC);
}

TEST(FaultPlan, ShowsEachCallBeforeItHappens) {
  scoped_instance ta;
  std::vector<std::string> seen;
  ta.faults().observe_calls([&](std::uint32_t number, std::string_view name) {
    seen.push_back(std::to_string(number) + " " + std::string(name) + " " + std::to_string(ta.self().heap.blocks()));
  });
  TEE_Free(TEE_Malloc(1, 0));
  (void)TEE_Wait(0);
  EXPECT_THAT(seen, ElementsAre("1 TEE_Malloc 0", "2 TEE_Free 1", "3 TEE_Wait 0"));
  ta.faults().clear();
  TEE_Free(nullptr);
  EXPECT_EQ(seen.size(), 3U);
}

TEST(FaultPlan, ClearForgetsOrdersButNotHowThePlatformIs) {
  fault_plan faults;
  faults.strict_gcm_tags(true);
  faults.fail_allocation(1);
  faults.fail_any_call(1, TEE_ERROR_GENERIC);
  faults.clear();
  EXPECT_FALSE(faults.on_allocation());
  EXPECT_EQ(faults.on_call("TEE_A", call_kind::fallible), std::nullopt);
  EXPECT_TRUE(faults.strict_gcm_tags());
}

TEST(Clocks, SystemTimeStartsAtTwoHoursAndReeTimeIsTheHosts) {
  const clocks clock;
  EXPECT_GE(clock.system().seconds, 7200U);
  EXPECT_LT(clock.system().seconds, 7260U);
  EXPECT_NEAR(static_cast<double>(clock.ree().seconds), static_cast<double>(std::time(nullptr)), 2);
}

TEST(Clocks, FrozenClocksMoveOnlyWhenTheyAreAdvanced) {
  clocks clock;
  clock.set_system({7200, 900});
  clock.set_ree({100, 0});
  clock.advance(1200);
  EXPECT_EQ(clock.system().seconds, 7202U);
  EXPECT_EQ(clock.system().millis, 100U);
  EXPECT_EQ(clock.ree().seconds, 101U);
  clock.release();
  EXPECT_GT(clock.ree().seconds, 1'000'000'000U);
}

TEST(Clocks, WaitingMovesAFrozenClockInsteadOfSleeping) {
  scoped_instance ta;
  ta.device().clock.set_system({7200, 0});
  EXPECT_EQ(TEE_Wait(3'600'000), TEE_SUCCESS);
  TEE_Time now{};
  TEE_GetSystemTime(&now);
  EXPECT_EQ(now.seconds, 10800U);
}

TEST(Trace, PrintsExactlyOneNewlineWhateverTheFormatEndsIn) {
  scoped_instance ta;
  ta.self().trace_prefix = "KEYMASTER";
  std::vector<std::string> printed;
  ta.device().trace.set_sink([&](const trace_line& line) { printed.push_back(line.printable()); }, trace_level::info);
  tee_trace("begin", 12, TEE_TRACE_ERROR, "no %d\n", 7);
  tee_trace("begin", 13, TEE_TRACE_INFO, "bare");
  tee_trace("begin", 14, TEE_TRACE_DEBUG, "not printed");
  EXPECT_THAT(printed, ElementsAre("KEYMASTER error begin:12: no 7\n", "KEYMASTER info begin:13: bare\n"));
}

TEST(Trace, KeepsTheTextAsTheTaFormattedIt) {
  scoped_instance ta;
  tee_trace("f", 1, TEE_TRACE_ERROR, "result 0x%08x\n", 0xFFFF0006U);
  const trace_log& log = ta.device().trace;
  EXPECT_TRUE(log.contains("result 0xffff0006\n", trace_level::error));
  EXPECT_FALSE(log.contains("result 0xffff0006", trace_level::error));
  EXPECT_FALSE(log.contains("result 0xffff0006\n", trace_level::info));
}

TEST(Trace, KeepsLongLinesWholeAndTheLatestLinesOnly) {
  scoped_instance ta;
  const std::string longer(5000, 'x');
  tee_trace("f", 1, TEE_TRACE_DEBUG, "%s", longer.c_str());
  EXPECT_TRUE(ta.device().trace.contains(longer, trace_level::debug));
  for (unsigned i = 0; i < trace_log::capacity; ++i) tee_trace("f", 1, TEE_TRACE_INFO, "line %u", i);
  const auto& lines = ta.device().trace.lines();
  EXPECT_EQ(lines.size(), trace_log::capacity);
  EXPECT_EQ(lines.front().text, "line 0");
  EXPECT_EQ(lines.back().text, "line 4095");
}

TEST(Memory, AllocationsFailOnOrderAndCountAsCalls) {
  scoped_instance ta;
  ta.faults().fail_allocation(2);
  void* first = TEE_Malloc(8, TEE_MALLOC_FILL_ZERO);
  EXPECT_NE(first, nullptr);
  EXPECT_EQ(TEE_Realloc(first, 16), nullptr);
  EXPECT_TRUE(ta.self().heap.owns(first));
  EXPECT_EQ(ta.faults().allocations(), 2U);
  EXPECT_EQ(ta.faults().call_count("TEE_Malloc"), 1U);
  TEE_Free(first);
  TEE_Free(nullptr);
  EXPECT_EQ(ta.self().heap.blocks(), 0U);
}

TEST(Memory, FreeingAForeignPointerPanics) {
  scoped_instance ta;
  static int foreign = 0;
  EXPECT_EQ(run_guarded([] { TEE_Free(&foreign); }), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(run_guarded([] { (void)TEE_Realloc(&foreign, 4); }), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(run_guarded([] { TEE_Free(TEE_Malloc(4, 0)); }), std::nullopt);
}

TEST(Memory, ComparesAsUnsignedBytesInOrder) {
  EXPECT_EQ(TEE_MemCompare("abc", "abc", 3), 0);
  EXPECT_LT(TEE_MemCompare("abz", "acb", 3), 0);
  EXPECT_GT(TEE_MemCompare("\xFF", "\x01", 1), 0);
  EXPECT_EQ(TEE_MemCompare("a", "b", 0), 0);
}

TEST(Memory, TellsWhatTheTaMayTouch) {
  scoped_instance ta;
  int own = 0;
  constexpr std::uint32_t any = TEE_MEMORY_ACCESS_ANY_OWNER;
  constexpr std::uint32_t both = TEE_MEMORY_ACCESS_READ | TEE_MEMORY_ACCESS_WRITE;
  EXPECT_EQ(TEE_CheckMemoryAccessRights(any | both, &own, sizeof own), TEE_SUCCESS);
  EXPECT_EQ(TEE_CheckMemoryAccessRights(any | both, nullptr, 1), TEE_ERROR_ACCESS_DENIED);
  EXPECT_EQ(TEE_CheckMemoryAccessRights(any | both, nullptr, 0), TEE_SUCCESS);
  void* code = reinterpret_cast<void*>(&TEE_Malloc);
  EXPECT_EQ(TEE_CheckMemoryAccessRights(any | TEE_MEMORY_ACCESS_READ, code, 16), TEE_SUCCESS);
  EXPECT_EQ(TEE_CheckMemoryAccessRights(any | TEE_MEMORY_ACCESS_WRITE, code, 16), TEE_ERROR_ACCESS_DENIED);
}

TEST(Memory, TheClientsMemoryIsNotTheTas) {
  scoped_instance ta;
  std::array<std::uint8_t, 8> shared{};
  std::array<TEE_Param, 4> params{};
  params[1].memref.buffer = shared.data();
  params[1].memref.size = 8;
  ta.self().params = params.data();
  ta.self().param_types = TEE_PARAM_TYPES(0, TEE_PARAM_TYPE_MEMREF_INPUT, 0, 0);
  EXPECT_EQ(TEE_CheckMemoryAccessRights(TEE_MEMORY_ACCESS_READ, shared.data() + 7, 1), TEE_ERROR_ACCESS_DENIED);
  EXPECT_EQ(TEE_CheckMemoryAccessRights(TEE_MEMORY_ACCESS_READ | TEE_MEMORY_ACCESS_ANY_OWNER, shared.data(), 8),
            TEE_SUCCESS);
}

TEST(Panic, RunsNoMoreOfTheCodeAndTellsTheCode) {
  scoped_instance ta;
  static bool went_on = false;
  EXPECT_EQ(run_guarded([] {
              TEE_Panic(0x1234);
              went_on = true;
            }),
            0x1234U);
  EXPECT_FALSE(went_on);
}

TEST(Panic, LandsAtTheInnermostPlace) {
  scoped_instance ta;
  static std::optional<TEE_Result> inner;
  const auto outer = run_guarded([] { inner = run_guarded([] { TEE_Panic(1); }); });
  EXPECT_EQ(inner, 1U);
  EXPECT_EQ(outer, std::nullopt);
}

TEST(PlatformCall, AnUnexpectedFailureLeavesNoLengthBehind) {
  scoped_instance ta;
  std::uint32_t length = 77;
  const auto failing = [&](auto&& body) { return platform_call("TEE_Test", &length, body); };
  EXPECT_EQ(failing([](const instance&) -> TEE_Result { throw std::bad_alloc(); }), TEE_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(std::exchange(length, 77), 0U);
  EXPECT_EQ(failing([](const instance&) -> TEE_Result { throw std::runtime_error(""); }), TEE_ERROR_GENERIC);
  EXPECT_EQ(std::exchange(length, 77), 0U);
  EXPECT_EQ(failing([](const instance&) -> TEE_Result { throw call_failure(TEE_ERROR_BUSY); }), TEE_ERROR_BUSY);
  EXPECT_EQ(std::exchange(length, 77), 0U);
  EXPECT_EQ(failing([](const instance&) -> TEE_Result { throw call_failure(TEE_ERROR_SHORT_BUFFER); }),
            TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(length, 77U) << "the size that is needed, which the body put there";
}

TEST(BootSeed, IsThirtyTwoBytesOrNothing) {
  scoped_instance ta;
  ta.device().boot_seed.fill(0x42);
  bytes seed(32);
  EXPECT_EQ(GetBootSeed(seed.data(), 32), TEE_SUCCESS);
  EXPECT_THAT(seed, Each(0x42));
  EXPECT_EQ(GetBootSeed(seed.data(), 31), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(GetBootSeed(nullptr, 32), TEE_ERROR_BAD_PARAMETERS);
}

}  // namespace
}  // namespace hosted_tee::testing
