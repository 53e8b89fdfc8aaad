// Making MACs: libcrypto computes the same.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/support/hmac_test_key.h"
#include "tests/support/libcrypto_digest.h"

using namespace keymaster;

namespace testing_support {
namespace {

class HmacSignTest : public CommandTest {
 protected:
  const bytes key = pattern(32, 5);
  const bytes blob = client().must_import(hmac_key(KM_DIGEST_SHA_2_256, 256), key);
  const bytes message = from_text("the message");

  static bytes first(const bytes& data, std::size_t size) {
    return {data.begin(), data.begin() + static_cast<std::ptrdiff_t>(size)};
  }
  std::uint32_t started(std::uint32_t purpose, std::uint32_t bits) {
    const std::uint32_t handle = client().must_begin(purpose, blob, hmac_length(bits));
    EXPECT_EQ(client().update(handle, message).b, message.size());
    return handle;
  }
  void claim(std::uint32_t length) {
    tee.world().faults().override_output("TEE_MACComputeFinal", 1,
                                         [length](std::uint32_t* reported, TEE_Result&) { *reported = length; });
  }
};

TEST_F(HmacSignTest, MacsOfEachDigestAndKeySizeAreLibcryptos) {
  for (const hmac_limits& each : every_hmac) {
    for (const std::uint32_t bits : {each.shortest_key, each.longest_mac, each.longest_key}) {
      if (bits < each.shortest_key || bits > each.longest_key) continue;
      const bytes secret = pattern(bits / 8, each.digest);
      const bytes imported = client().must_import(hmac_key(each.digest, bits), secret);
      for (const std::size_t size : {std::size_t{0}, std::size_t{1}, std::size_t{129}, std::size_t{100000}}) {
        SCOPED_TRACE(fmt::format("digest {}, {} bits, {} bytes", each.digest, bits, size));
        const bytes text = pattern(size);
        const hosted_tee::accounting before = tee.accounting();
        const finish_answer made =
            succeeds([&] { return client().sign(imported, hmac_length(each.longest_mac), text); });
        expect_same(before);
        EXPECT_EQ(to_hex(made.data), to_hex(hmac_of(each.digest, secret, text)));
        EXPECT_EQ(made.out_params, u32(0));
      }
    }
  }
}

TEST_F(HmacSignTest, TheMacIsCutToItsLeftmostWholeBytes) {
  const bytes whole = hmac_of(KM_DIGEST_SHA_2_256, key, message);
  for (std::uint32_t bits = 64; bits <= 263; ++bits) {  // 263: still 32 whole bytes
    const finish_answer made = succeeds([&] { return client().sign(blob, hmac_length(bits), message); });
    EXPECT_EQ(made.data, first(whole, bits / 8)) << bits;
  }
}

TEST_F(HmacSignTest, AMacLongerThanTheDigestFailsAtTheEndForBothPurposes) {
  const hosted_tee::accounting before = tee.accounting();
  for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
    for (const std::uint32_t bits : {264U, 512U, 520U, 4096U}) {
      const std::uint32_t handle = started(purpose, bits);
      (void)expect_lost(
          refused(KM_ERROR_UNKNOWN_ERROR,
                  {fmt::format("Too short output of HMAC operation, expect at least {}B, got 32B", bits / 8),
                   "Finish failed"}),
          handle, before, [&] { return client().finish(handle, bytes(bits / 8)); });
    }
  }
}

TEST_F(HmacSignTest, AMacThatNoMemoryHoldsFailsAtTheEndForBothPurposes) {
  const hosted_tee::accounting before = tee.accounting();
  for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
    for (const std::uint32_t bits : {8U * 0x80000, 0x80000000U, 0xFFFFFFFFU}) {
      const std::uint32_t handle = started(purpose, bits);
      (void)expect_lost(refused(KM_ERROR_MEMORY_ALLOCATION_FAILED,
                                {fmt::format("Out of memory, need {}B", bits / 8), "Finish failed"}),
                        handle, before, [&] { return client().finish(handle, bytes(64)); });
    }
  }
}

TEST_F(HmacSignTest, WithoutMemoryThereIsNoMac) {
  const hosted_tee::accounting before = tee.accounting();
  for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
    const std::uint32_t handle = started(purpose, 128);
    tee.world().faults().fail_allocation(1);
    (void)expect_lost(refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {"Out of memory, need 16B", "Finish failed"}), handle,
                      before, [&] { return client().finish(handle, bytes(16)); });
  }
}

TEST_F(HmacSignTest, AFailingComputationIsThePlatformsFailure) {
  const hosted_tee::accounting before = tee.accounting();
  for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
    const std::uint32_t handle = started(purpose, 256);
    tee.world().faults().fail_call("TEE_MACComputeFinal", 1, TEE_ERROR_ACCESS_DENIED);
    (void)expect_lost(broken(TEEC_ERROR_ACCESS_DENIED, {"MACComputeFinal failed with 0xffff0001\n", "Finish failed"}),
                      handle, before, [&] { return client().finish(handle, bytes(32)); });
  }
}

TEST_F(HmacSignTest, FalseLengthsOfThePlatformStayInsideTheBuffers) {
  const hosted_tee::accounting before = tee.accounting();
  for (const std::uint32_t length : {0U, 1U, 31U}) {
    const std::uint32_t handle = started(KM_PURPOSE_SIGN, 256);
    claim(length);
    (void)expect_lost(refused(KM_ERROR_UNKNOWN_ERROR,
                              {fmt::format("Too short output of HMAC operation, expect at least 32B, got {}B", length),
                               "Finish failed"}),
                      handle, before, [&] { return client().finish(handle); });
  }
  const std::uint32_t handle = started(KM_PURPOSE_SIGN, 256);
  claim(0xFFFFFFFF);
  EXPECT_EQ(succeeds([&] { return client().finish(handle); }).data, hmac_of(KM_DIGEST_SHA_2_256, key, message));
}

TEST_F(HmacSignTest, APlatformThatClaimsMoreThanAnyMacHasDoesNotMakeOneLonger) {
  const hosted_tee::accounting before = tee.accounting();
  for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
    for (const std::uint32_t bits : {520U, 4096U}) {
      for (const std::uint32_t length : {65U, 512U, 0xFFFFFFFFU}) {
        SCOPED_TRACE(fmt::format("purpose {}, {} bits, a claim of {} bytes", purpose, bits, length));
        const std::uint32_t handle = started(purpose, bits);
        claim(length);
        // What a MAC of 64 bytes would have behind it.
        const bytes zeros_behind = first(join({hmac_of(KM_DIGEST_SHA_2_256, key, message), bytes(512)}), bits / 8);
        (void)expect_lost(
            refused(KM_ERROR_UNKNOWN_ERROR,
                    {fmt::format("Too short output of HMAC operation, expect at least {}B, got 64B", bits / 8),
                     "Finish failed"}),
            handle, before, [&] { return client().finish(handle, zeros_behind); });
      }
    }
  }
}

TEST_F(HmacSignTest, UpdatesAnswerNothingAndFinishIgnoresItsInput) {
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, hmac_length(256));
  for (const std::size_t size : {std::size_t{0}, std::size_t{5}, std::size_t{70000}}) {
    const answer a = succeeds([&] { return client().update(handle, bytes(size, 3), {}, 0); });
    EXPECT_EQ(a.b, size);
    EXPECT_EQ(a.size, 0U);
  }
  EXPECT_EQ(client().finish(handle, message).data, hmac_of(KM_DIGEST_SHA_2_256, key, bytes(70005, 3)));
}

TEST_F(HmacSignTest, AGeneratedKeyMakesWhatItVerifies) {
  for (const hmac_limits& each : every_hmac) {
    const bytes made_key = client().must_generate(hmac_key(each.digest, each.longest_key));
    const bytes mac = client().sign(made_key, hmac_length(each.longest_mac), message).data;
    EXPECT_EQ(mac.size(), each.longest_mac / 8);
    EXPECT_TRUE(client().verify(made_key, hmac_length(each.longest_mac), message, mac).ok());
  }
}

}  // namespace
}  // namespace testing_support
