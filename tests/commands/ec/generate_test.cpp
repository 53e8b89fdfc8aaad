// generate_key for EC: what it makes, and what it refuses.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/commands/sealed_blob.h"
#include "tests/support/ec_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

class EcGenerateTest : public CommandTest {
 protected:
  /// expect_refused generates and expects the failure, with the response zeroed over its whole capacity.
  void expect_refused(const failure& expected, const param_list& params) {
    const answer a = expect_failure(expected, [&] { return client().generate(params, 2048); });
    EXPECT_EQ(a.output, bytes(2048, 0));
  }

  /// fail_read makes the n-th read of an attribute answer the result.
  void fail_read(std::uint32_t n, TEE_Result result) {
    tee.world().faults().fail_call("TEE_GetObjectBufferAttribute", n, result);
  }

  /// The key data inside a blob.
  ec_fields fields_in(const bytes& blob) {
    const bytes plaintext = open_blob(stored_ksk(), blob).value();
    return ec_fields::parse(std::span(plaintext).subspan(4, u32_at(plaintext, 0)), true);
  }
};

TEST_F(EcGenerateTest, TheBlobHoldsAKeyPairOnEachCurveAndTheCharacteristics) {
  for (const std::uint32_t bits : ec_sizes) {
    SCOPED_TRACE(bits);
    const param_list asked = ec_key(bits).add_blob(KM_TAG_APPLICATION_ID, from_text("app"));
    const hosted_tee::accounting before = tee.accounting();
    const bytes blob = succeeds([&] { return client().generate(asked); }).body();
    expect_same(before);
    const ec_fields fields = fields_in(blob);
    param_list stored = asked;
    stored.add(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED);
    EXPECT_EQ(open_blob(stored_ksk(), blob), blob_plaintext(fields.material(), stored.marshal()));

    EXPECT_EQ(fields.bits, bits);
    for (const bytes& value : {fields.x, fields.y, fields.d}) {
      EXPECT_LE(value.size(), bits / 8);  // 65 on P-521
      EXPECT_NE(value.at(0), 0);
    }
    // D belongs to the point: what one signs the other verifies.
    ec_fields public_half = fields;
    public_half.d.clear();
    const bytes made = ec_test_key::from_fields(fields).sign(KM_DIGEST_SHA_2_256, from_text("message"));
    EXPECT_TRUE(ec_test_key::from_fields(public_half).verifies(KM_DIGEST_SHA_2_256, from_text("message"), made));
  }
}

TEST_F(EcGenerateTest, KeyDataOfP256TakesUpTo112Bytes) {
  const param_list asked = ec_key(256);
  const answer a = succeeds([&] { return client().generate(asked); });
  const std::size_t key_data = a.size - blob_overhead - (4 + 24 * (asked.params().size() + 1));
  EXPECT_LE(key_data, 112U);
  EXPECT_GE(key_data, 112U - 6);
}

TEST_F(EcGenerateTest, KeysDiffer) {
  EXPECT_NE(fields_in(client().must_generate(ec_key(256))).d, fields_in(client().must_generate(ec_key(256))).d);
}

TEST_F(EcGenerateTest, AClientMayNotStateTheOriginAndThatIsLookedAtFirst) {
  for (const std::uint32_t origin : {KM_ORIGIN_GENERATED, KM_ORIGIN_IMPORTED}) {
    expect_refused(refused(KM_ERROR_INVALID_ARGUMENT, {"Shouldn't specify KM_TAG_ORIGIN"}),
                   ec_key(255).add(KM_TAG_ORIGIN, origin));
  }
}

TEST_F(EcGenerateTest, TheSizeMustOccurOnce) {
  const failure expected = refused(KM_ERROR_INVALID_ARGUMENT, {"No or too many KM_TAG_KEY_SIZE or specified"});
  expect_refused(expected, ec_key(256).remove(KM_TAG_KEY_SIZE));
  expect_refused(expected, ec_key(256).add(KM_TAG_KEY_SIZE, 256));
}

TEST_F(EcGenerateTest, OnlyTheSizesOfTheFiveCurvesAreSupported) {
  for (const std::uint32_t bits : {0U, 1U, 160U, 191U, 193U, 223U, 225U, 239U, 255U, 257U, 320U, 383U, 385U, 512U, 520U,
                                   522U, 528U, 0xFFFFFFFFU}) {
    expect_refused(refused(KM_ERROR_UNSUPPORTED_KEY_SIZE,
                           {fmt::format("Invalid EC key size {}", static_cast<std::int32_t>(bits))}),
                   ec_key(bits));
  }
}

TEST_F(EcGenerateTest, EachPlatformFailureHasItsLineAndItsResult) {
  struct platform_failure {
    const char* call;
    std::uint32_t n;
    const char* line;
  };
  for (const std::uint32_t bits : {256U, 521U}) {
    for (const platform_failure& each :
         {platform_failure{"TEE_AllocateTransientObject", 1, "AllocateTransientObject failed with 0xffff0001\n"},
          {"TEE_GenerateKey", 1, "GenerateKey failed with 0xffff0001\n"},
          {"TEE_GetObjectBufferAttribute", 1, "GetObjectBufferAttribute failed with 0xffff0001\n"}}) {
      SCOPED_TRACE(fmt::format("{} bits, {}", bits, each.call));
      tee.world().faults().fail_call(each.call, each.n, TEE_ERROR_ACCESS_DENIED);
      expect_refused(broken(TEEC_ERROR_ACCESS_DENIED, {each.line}), ec_key(bits));
    }
  }
}

TEST_F(EcGenerateTest, EachReadOfAValueCanFail) {
  const failure expected = broken(TEEC_ERROR_ACCESS_DENIED, {"GetObjectBufferAttribute failed with 0xffff0001\n"});
  for (std::uint32_t n = 1; n <= 6; ++n) {  // three to measure, three to write
    SCOPED_TRACE(n);
    fail_read(n, TEE_ERROR_ACCESS_DENIED);
    expect_refused(expected, ec_key(384));
  }
}

TEST_F(EcGenerateTest, AValueThatDoesntFitIsNotTriedAgain) {
  const failure expected = broken(TEEC_ERROR_SHORT_BUFFER, {"GetObjectBufferAttribute failed with 0xffff0010\n"});
  for (const std::uint32_t bits : {192U, 224U, 256U, 384U}) {
    const std::uint32_t before = tee.world().faults().call_count("TEE_GenerateKey");
    fail_read(2, TEE_ERROR_SHORT_BUFFER);
    expect_refused(expected, ec_key(bits));
    EXPECT_EQ(tee.world().faults().call_count("TEE_GenerateKey"), before + 1);
  }
}

TEST_F(EcGenerateTest, AValueWhoseLengthChangesBetweenTheReadsIsNoticed) {
  const auto claim = [&](std::uint32_t n, std::uint32_t length) {
    tee.world().faults().override_output("TEE_GetObjectBufferAttribute", n,
                                         [length](std::uint32_t* reported, TEE_Result&) { *reported = length; });
  };
  claim(4, 5);
  tee.clear_trace();
  const answer a = client().generate(ec_key(256), 2048);
  EXPECT_EQ(a.result, TEEC_SUCCESS);
  EXPECT_EQ(a.error, KM_ERROR_UNKNOWN_ERROR);
  ASSERT_EQ(lines().size(), 1U);
  EXPECT_THAT(lines().front(), ::testing::MatchesRegex("Buffer size modified, before 3[0-2]B, after 5B"));
  EXPECT_EQ(a.output, bytes(2048, 0));

  claim(1, 33);  // more than there is: written with what is offered, it comes out shorter
  const answer grown = client().generate(ec_key(256), 2048);
  EXPECT_EQ(grown.error, KM_ERROR_UNKNOWN_ERROR);
  EXPECT_THAT(lines().back(), ::testing::MatchesRegex("Buffer size modified, before 33B, after 3[0-2]B"));

  claim(1, 3);  // less than there is: it doesn't fit any more
  expect_refused(broken(TEEC_ERROR_SHORT_BUFFER, {"GetObjectBufferAttribute failed with 0xffff0010\n"}), ec_key(256));
  claim(2, 0xFFFFFFFF);  // more than any memory holds
  expect_refused(refused(KM_ERROR_UNKNOWN_ERROR, {"Out of memory"}), ec_key(256));
}

TEST_F(EcGenerateTest, WithoutMemoryThereIsNoKeyAndNoReason) {
  (void)client().must_generate(ec_key(256));
  const hosted_tee::accounting before = tee.accounting();
  const std::uint32_t first = tee.world().faults().allocations();
  (void)client().must_generate(ec_key(256));
  const std::uint32_t all = tee.world().faults().allocations() - first;
  int own = 0;
  for (std::uint32_t n = 1; n <= all; ++n) {
    tee.clear_trace();
    tee.world().faults().fail_allocation(n);
    const answer a = client().generate(ec_key(256), 2048);
    EXPECT_FALSE(a.ok()) << n;
    EXPECT_EQ(a.output, bytes(2048, 0));
    expect_same(before);
    own += a.result == TEEC_SUCCESS && a.error == KM_ERROR_UNKNOWN_ERROR && lines() == trace_lines{"Out of memory"};
  }
  EXPECT_EQ(own, 2);  // the scratch buffer and the key data
}

}  // namespace
}  // namespace testing_support
