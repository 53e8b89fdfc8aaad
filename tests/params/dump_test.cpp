// The debug dump: which lines, in which form, and what must never be among them.
#include "params/dump.h"

#include <fmt/format.h>

#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;

namespace {

class DumpTest : public TaUnitTest {
 protected:
  /// The lines that a dump of `set` traces, all of them at debug level.
  std::vector<std::string> dump(const keymaster_key_param_set_t& set) {
    ta.clear_trace();
    _keymaster_dump_key_param_set("some/file.cpp", 42, set);
    EXPECT_EQ(device.trace.lines().size(), ta.traced(hosted_tee::trace_level::debug).size());
    return ta.traced(hosted_tee::trace_level::debug);
  }
};

TEST_F(DumpTest, EveryTypeHasItsLine) {
  struct row {
    std::uint32_t tag;
    std::uint64_t value;
    const char* line;
  };
  for (const row& r : {row{0x00000005, 1, "    KM_INVALID"},
                       {0x10000002, 128, "    KM_ENUM: 128"},
                       {0x20000001, 3, "    KM_ENUM: 3"},
                       {0x20000001, 0xFFFFFFFF, "    KM_ENUM: -1"},
                       {0x30000003, 2048, "    KM_UINT: 0x00000800"},
                       {0x40000003, 0xFFFFFFFF, "    KM_UINT: 0xffffffff"},
                       {0x500000C8, 65537, "    KM_ULONG: 0x0000000000010001"},
                       {0xA00001F6, 0x8877665544332211, "    KM_ULONG: 0x8877665544332211"},
                       {0x60000190, 0x18BCFE56800, "    KM_DATE: 0x0000018bcfe56800"},
                       {0x70000007, 1, "    KM_BOOL: 1"},
                       {0x70000007, 0, "    KM_BOOL: 0"},
                       {0x70000007, 0x1FF, "    KM_BOOL: 255"},
                       {0xB0000000, 1, "    Invalid tag type"},
                       {0xC0000001, 1, "    Invalid tag type"},
                       {0xF0000001, 1, "    Invalid tag type"}}) {
    EXPECT_THAT(dump(in_ta(param_list{}.add(r.tag, r.value))),
                ElementsAre("Dump at some/file.cpp:42", fmt::format("Tag: 0x{:08x}", r.tag), r.line));
  }
}

TEST_F(DumpTest, BlobsShowTheirLengthAlone) {
  const parameter_set set = in_ta(param_list{}
                                      .add_blob(0x80000064, pattern(256))
                                      .add_blob(KM_TAG_APPLICATION_DATA, from_text("a secret of the application"))
                                      .add_blob(KM_TAG_NONCE, {}));
  EXPECT_THAT(dump(set),
              ElementsAre("Dump at some/file.cpp:42", "Tag: 0x80000064", "    KM_BIGNUM, length 256B",
                          "Tag: 0x900002bc", "    KM_BYTES, length 27B", "Tag: 0x900003e9", "    KM_BYTES, length 0B"));
}

TEST_F(DumpTest, AnUnknownTypeDoesNotEndTheDump) {
  const parameter_set set = in_ta(param_list{}.add(0xB0000000).add(KM_TAG_KEY_SIZE, 256));
  EXPECT_THAT(dump(set), ElementsAre("Dump at some/file.cpp:42", "Tag: 0xb0000000", "    Invalid tag type",
                                     "Tag: 0x30000003", "    KM_UINT: 0x00000100"));
}

TEST_F(DumpTest, AnEmptySetHasAHeadingOnly) {
  EXPECT_THAT(dump({nullptr, 0}), ElementsAre("Dump at some/file.cpp:42"));
  EXPECT_THAT(dump({nullptr, 9}), ElementsAre("Dump at some/file.cpp:42")) << "a stale length";
}

TEST_F(DumpTest, TheMacroNamesThePlaceItStandsAt) {
  const keymaster_key_param_set_t none = {nullptr, 0};
  KEYMASTER_DUMP_KEY_PARAM_SET(none);
  const int line = __LINE__ - 1;
  EXPECT_THAT(ta.traced(hosted_tee::trace_level::debug), ElementsAre(fmt::format("Dump at {}:{}", __FILE__, line)));
}

}  // namespace
