// What a developer sees of parameters in the trace, and what nobody may see.
#include <fmt/format.h>

#include <algorithm>

#include "tests/commands/command_fixture.h"

using namespace keymaster;
using hosted_tee::trace_level;

namespace testing_support {
namespace {

class TraceTest : public CommandTest {
 protected:
  const bytes id = from_text("com.example.app");
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  const bytes blob = import_fixed(1024, rsa_key(1024).add_blob(KM_TAG_APPLICATION_ID, id));

  /// dumps counts the parameter sets that a command dumps.
  template <class Command>
  std::ptrdiff_t dumps(Command&& command) {
    tee.clear_trace();
    EXPECT_TRUE(command().ok());
    const trace_lines debug = lines(trace_level::debug);
    return std::count_if(debug.begin(), debug.end(),
                         [](const std::string& line) { return line.starts_with("Dump at "); });
  }
};

TEST_F(TraceTest, EverySetThatComesInIsDumpedOnce) {
  param_list scheme = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
  scheme.add_blob(KM_TAG_APPLICATION_ID, id);
  EXPECT_EQ(dumps([&] { return client().generate(rsa_key(512)); }), 1);
  EXPECT_EQ(dumps([&] { return client().import_key(rsa_key(1024), key.material()); }), 1);
  EXPECT_EQ(dumps([&] { return client().characteristics(blob, id); }), 1);
  EXPECT_EQ(dumps([&] { return client().export_key(blob, id); }), 1);
  std::uint32_t handle = 0;
  EXPECT_EQ(dumps([&] {
              answer begun = client().begin(KM_PURPOSE_SIGN, blob, scheme);
              handle = begun.b;
              return begun;
            }),
            2);  // what the client asks, and what the blob says
  EXPECT_EQ(dumps([&] { return client().update(handle, {1}); }), 1);
  EXPECT_EQ(dumps([&] { return client().finish(handle); }), 1);
}

TEST_F(TraceTest, ADumpTellsTagsAndValuesAtDebugLevel) {
  tee.clear_trace();
  EXPECT_TRUE(client().characteristics(blob, id).ok());
  const trace_lines debug = lines(trace_level::debug);
  for (const char* const line : {"Tag: 0x10000002", "    KM_ENUM: 1", "Tag: 0x30000003", "    KM_UINT: 0x00000400",
                                 "Tag: 0x500000c8", "    KM_ULONG: 0x0000000000010001", "Tag: 0x700001f7",
                                 "    KM_BOOL: 1", "Tag: 0x90000259", "    KM_BYTES, length 15B"}) {
    EXPECT_THAT(debug, testing::Contains(line));
  }
  EXPECT_THAT(lines(trace_level::info), testing::SizeIs(2));
}

TEST_F(TraceTest, NoLineHoldsTheBytesOfABlobOrOfAKey) {
  tee.clear_trace();
  EXPECT_TRUE(client().import_key(rsa_key(1024).add_blob(KM_TAG_APPLICATION_ID, id), key.material()).ok());
  EXPECT_TRUE(client().export_key(blob, id).ok());
  param_list scheme = signature(KM_DIGEST_NONE, KM_PAD_NONE);
  EXPECT_TRUE(client().sign(blob, scheme.add_blob(KM_TAG_APPLICATION_ID, id), from_text("secret text")).ok());
  for (const hosted_tee::trace_line& line : tee.world().trace().lines()) {
    for (const bytes& hidden :
         {id, from_text("secret text"), bytes(key.component(rsa_d).begin(), key.component(rsa_d).begin() + 8)}) {
      EXPECT_EQ(line.text.find(std::string(hidden.begin(), hidden.end())), std::string::npos) << line.text;
      EXPECT_EQ(line.text.find(to_hex(hidden)), std::string::npos) << line.text;
    }
  }
}

}  // namespace
}  // namespace testing_support
