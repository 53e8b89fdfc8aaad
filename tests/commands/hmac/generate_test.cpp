// generate_key for HMAC: each key is made for one digest.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/commands/sealed_blob.h"
#include "tests/support/hmac_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

class HmacGenerateTest : public CommandTest {
 protected:
  void expect_refused(const failure& expected, const param_list& params) {
    const answer a = expect_failure(expected, [&] { return client().generate(params, 2048); });
    EXPECT_EQ(a.output, bytes(2048, 0));
  }

  /// The key data inside a blob.
  bytes key_data_in(const bytes& blob) {
    const bytes plaintext = open_blob(stored_ksk(), blob).value();
    return {plaintext.begin() + 4, plaintext.begin() + 4 + u32_at(plaintext, 0)};
  }
};

TEST_F(HmacGenerateTest, AKeyStandsBehindItsSizeAndTheObjectTypeOfItsDigest) {
  for (const hmac_limits& each : every_hmac) {
    for (const std::uint32_t bits : {each.shortest_key, each.shortest_key + 8, each.longest_key}) {
      SCOPED_TRACE(fmt::format("digest {}, {} bits", each.digest, bits));
      const param_list asked = hmac_key(each.digest, bits, each.longest_mac);
      const hosted_tee::accounting before = tee.accounting();
      const bytes blob = succeeds([&] { return client().generate(asked); }).body();
      expect_same(before);
      const bytes key_data = key_data_in(blob);
      ASSERT_EQ(key_data.size(), 8 + bits / 8);
      EXPECT_EQ(u32_at(key_data, 0), bits);
      EXPECT_EQ(u32_at(key_data, 4), each.object_type);
      param_list stored = asked;
      stored.add(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED);
      EXPECT_EQ(open_blob(stored_ksk(), blob), blob_plaintext(key_data, stored.marshal()));
      EXPECT_NE(key_data_in(client().must_generate(asked)), key_data);
    }
  }
}

TEST_F(HmacGenerateTest, AClientMayNotStateTheOriginAndThatIsLookedAtFirst) {
  expect_refused(refused(KM_ERROR_INVALID_ARGUMENT, {"Shouldn't specify KM_TAG_ORIGIN"}),
                 param_list{}.add(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC).add(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED));
}

TEST_F(HmacGenerateTest, SizeShortestMacAndDigestMustOccurOnceAndAreLookedAtInThisOrder) {
  const failure size = refused(KM_ERROR_INVALID_ARGUMENT, {"No or too many KM_TAG_KEY_SIZE or specified"});
  const failure mac = refused(KM_ERROR_INVALID_ARGUMENT, {"No or too many KM_TAG_MIN_MAC_LENGTH or specified"});
  const failure digest = refused(KM_ERROR_UNSUPPORTED_DIGEST, {"No or too many KM_TAG_DIGEST"});
  param_list params = param_list{}.add(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC);
  expect_refused(size, params);
  expect_refused(mac, params.add(KM_TAG_KEY_SIZE, 256));
  expect_refused(digest, params.add(KM_TAG_MIN_MAC_LENGTH, 128));
  EXPECT_TRUE(client().generate(params.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256)).ok());
  expect_refused(digest, params.add(KM_TAG_DIGEST, KM_DIGEST_SHA1));
  expect_refused(mac, params.add(KM_TAG_MIN_MAC_LENGTH, 128));
  expect_refused(size, params.add(KM_TAG_KEY_SIZE, 256));
}

TEST_F(HmacGenerateTest, SizesBelow64OrOfNoWholeBytesAreRefusedWhateverTheDigest) {
  for (const std::uint32_t bits : {0U, 8U, 56U, 60U, 63U, 65U, 100U, 257U, 0xFFFFFFFFU}) {
    const failure expected = refused(KM_ERROR_UNSUPPORTED_KEY_SIZE,
                                     {fmt::format("Invalid hmac key size {}", static_cast<std::int32_t>(bits))});
    for (const hmac_limits& each : every_hmac) {
      expect_refused(expected, param_list(hmac_key(each.digest, 0)).add(KM_TAG_KEY_SIZE, bits));
    }
    expect_refused(expected, param_list{}.add(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC).add(KM_TAG_KEY_SIZE, bits));
  }
}

TEST_F(HmacGenerateTest, EachDigestHasItsShortestAndLongestKey) {
  for (const hmac_limits& each : every_hmac) {
    for (const std::uint32_t bits : {64U, each.shortest_key - 8, each.longest_key + 8, 2048U, 0xFFFFFFF8U}) {
      if (bits < 64 || (bits >= each.shortest_key && bits <= each.longest_key)) continue;
      expect_refused(refused(KM_ERROR_UNSUPPORTED_KEY_SIZE,
                             {fmt::format("Invalid HMAC key size {}", static_cast<std::int32_t>(bits))}),
                     hmac_key(each.digest, bits));
    }
  }
  expect_refused(refused(KM_ERROR_UNSUPPORTED_KEY_SIZE, {"Invalid HMAC key size 128"}),
                 hmac_key(KM_DIGEST_SHA_2_256, 128));
}

TEST_F(HmacGenerateTest, TheShortestMacIsAtLeast64BitsInWholeBytesAndAtMostTheDigest) {
  for (const hmac_limits& each : every_hmac) {
    for (const std::uint32_t mac : {0U, 8U, 56U, 63U, 65U, 100U, each.longest_mac + 8, 0xFFFFFFF8U, 0xFFFFFFFFU}) {
      expect_refused(refused(KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH,
                             {fmt::format("Invalid KM_TAG_MIN_MAC_LENGTH {}", static_cast<std::int32_t>(mac))}),
                     hmac_key(each.digest, each.longest_key, mac));
    }
    for (const std::uint32_t mac : {64U, each.longest_mac}) {
      EXPECT_TRUE(client().generate(hmac_key(each.digest, each.longest_key, mac)).ok());
    }
  }
  expect_refused(refused(KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH, {"Invalid KM_TAG_MIN_MAC_LENGTH 168"}),
                 hmac_key(KM_DIGEST_SHA1, 160, 168));
}

TEST_F(HmacGenerateTest, TheSizeIsLookedAtBeforeTheShortestMacOfTheDigest) {
  expect_refused(refused(KM_ERROR_UNSUPPORTED_KEY_SIZE, {"Invalid HMAC key size 128"}),
                 hmac_key(KM_DIGEST_SHA_2_256, 128, 512));
  expect_refused(refused(KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH, {"Invalid KM_TAG_MIN_MAC_LENGTH 7"}),
                 hmac_key(KM_DIGEST_SHA_2_256, 128, 7));
}

TEST_F(HmacGenerateTest, NoOtherDigestIsSupported) {
  for (const std::uint32_t digest : {0U, 7U, 0x80000004U, 0xFFFFFFFFU}) {
    expect_refused(refused(KM_ERROR_UNSUPPORTED_DIGEST, {}), hmac_key(digest, 256));
  }
}

TEST_F(HmacGenerateTest, EachPlatformFailureHasItsLineAndItsResult) {
  for (const std::string call : {"AllocateTransientObject", "GenerateKey", "GetObjectBufferAttribute"}) {
    tee.world().faults().fail_call("TEE_" + call, 1, TEE_ERROR_ACCESS_DENIED);
    expect_refused(broken(TEEC_ERROR_ACCESS_DENIED, {call + " failed with 0xffff0001\n"}),
                   hmac_key(KM_DIGEST_SHA_2_256, 256));
  }
}

TEST_F(HmacGenerateTest, AKeyOfAnotherLengthThanAskedForIsNotKept) {
  for (const std::uint32_t length : {0U, 31U, 33U, 0xFFFFFFFFU}) {
    tee.world().faults().override_output("TEE_GetObjectBufferAttribute", 1,
                                         [length](std::uint32_t* reported, TEE_Result&) { *reported = length; });
    expect_refused(refused(KM_ERROR_UNKNOWN_ERROR, {fmt::format("Buffer size modified, before 32B, after {}B",
                                                                static_cast<std::int32_t>(length))}),
                   hmac_key(KM_DIGEST_SHA_2_256, 256));
  }
}

TEST_F(HmacGenerateTest, WithoutMemoryForTheKeyDataThereIsNoKeyAndNoReason) {
  const param_list params = hmac_key(KM_DIGEST_SHA_2_256, 256);
  (void)client().must_generate(params);
  const hosted_tee::accounting before = tee.accounting();
  const std::uint32_t first = tee.world().faults().allocations();
  (void)client().must_generate(params);
  const std::uint32_t all = tee.world().faults().allocations() - first;
  int found = 0;
  for (std::uint32_t n = 1; n <= all; ++n) {
    tee.clear_trace();
    tee.world().faults().fail_allocation(n);
    const answer a = client().generate(params, 2048);
    EXPECT_FALSE(a.ok()) << n;
    EXPECT_EQ(a.output, bytes(2048, 0));
    expect_same(before);
    found += a.result == TEEC_SUCCESS && a.error == KM_ERROR_UNKNOWN_ERROR && lines() == trace_lines{"Out of memory"};
  }
  EXPECT_EQ(found, 1);
}

}  // namespace
}  // namespace testing_support
