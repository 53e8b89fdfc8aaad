// Messages about as long as the heap allows, and longer ones.
#include "tests/attestation/attested_device.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr std::size_t kilobyte = 1024;

class LongMessageTest : public AttestationTest {
 protected:
  LongMessageTest() { EXPECT_EQ(soter_command(KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR), SOTER_STATUS_OK); }

  static std::string message(std::size_t size) {
    std::string raw;
    while (raw.size() < size) raw += "no escapes " + std::to_string(raw.size());
    raw.resize(size);
    return raw;
  }
  void expect_signed(const std::string& raw, std::uint64_t counter) {
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, pkcs1);
    EXPECT_TRUE(client().update(handle, from_text(raw)).ok());
    const finish_answer done = succeeds([&] { return client().finish(handle, {}, {}, raw.size() + 4 * kilobyte); });
    ASSERT_TRUE(done.ok());
    const statement made = take_apart(done.data, 128);
    EXPECT_EQ(made.json()["raw"], raw);
    EXPECT_EQ(made.json()["counter"], counter);
    EXPECT_TRUE(rsa_test_key::of_bits(1024).verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, made.text,
                                                     made.signature));
  }

  const bytes blob = soter_key(1024, {});
};

TEST_F(LongMessageTest, OfNearly160KilobytesIsSigned) {
  const hosted_tee::accounting before = tee.accounting();
  expect_signed(message(158 * kilobyte), 1);
  expect_same(before);
}

TEST_F(LongMessageTest, WhoseStatementHasNoRoomOnTheHeapIsNotSignedAndTheNextOneIs) {
  struct row {
    std::size_t kilobytes;
    trace_lines first;
    std::optional<std::uint64_t> counter;
  };
  for (const row& each :
       {row{250, {"set raw message error -1\n"}, std::nullopt}, row{200, {"json serialization error\n"}, 1}}) {
    SCOPED_TRACE(each.kilobytes);
    const hosted_tee::accounting before = tee.accounting();
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, pkcs1);
    EXPECT_TRUE(client().update(handle, from_text(message(each.kilobytes * kilobyte))).ok());
    trace_lines lines = each.first;
    lines.insert(lines.end(), {"produce json string error", "soter enhance error ffff0007", "Finish failed"});
    (void)expect_lost(refused(KM_ERROR_UNKNOWN_ERROR, lines), handle, before,
                      [&] { return client().finish(handle, {}, {}, 256 * kilobyte); });
    EXPECT_EQ(stored_counter(), each.counter);
  }
  expect_signed("short", 2);
}

TEST_F(LongMessageTest, BeyondTheHeapEndsTheOperation) {
  const hosted_tee::accounting before = tee.accounting();
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, pkcs1);
  EXPECT_TRUE(client().update(handle, from_text(message(200 * kilobyte))).ok());
  (void)expect_lost(
      refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {"no memory to expand soter buf 409600", "Update failed"}), handle,
      before, [&] { return client().update(handle, from_text(message(200 * kilobyte))); });
  EXPECT_EQ(stored_counter(), std::nullopt);
  expect_signed("short", 1);
}

}  // namespace
}  // namespace testing_support
