// generate_key: what it makes, and what it refuses.
#include <fmt/format.h>
#include <openssl/x509.h>

#include "tests/commands/command_fixture.h"
#include "tests/commands/sealed_blob.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// A record of the parameter format with every field as given.
bytes record(std::uint32_t tag, std::uint32_t gap, std::uint64_t value, std::uint64_t last) {
  return join({u32(tag), u32(gap), u64(value), u64(last)});
}

class GenerateTest : public CommandTest {
 protected:
  answer generate_raw(const bytes& body, std::size_t capacity = 4096) {
    return client().call(KM_COMMAND_GENERATE_KEY, 0, 0, body, capacity);
  }

  /// expect_refused generates with `params` and expects the failure, with the response zeroed over its whole capacity.
  void expect_refused(const failure& expected, const param_list& params, std::size_t capacity = 4096) {
    const answer a = expect_failure(expected, [&] { return client().generate(params, capacity); });
    EXPECT_EQ(a.output, bytes(capacity, 0));
  }
  void expect_refused(const failure& expected, const bytes& body, std::size_t capacity = 4096) {
    const answer a = expect_failure(expected, [&] { return generate_raw(body, capacity); });
    EXPECT_EQ(a.output, bytes(capacity, 0));
  }
};

TEST_F(GenerateTest, AKeyOf2048BitsHasABlobOfTheDocumentedSize) {
  const param_list asked = rsa_key(2048);
  const hosted_tee::accounting before = tee.accounting();
  const answer a = succeeds([&] { return client().generate(asked); });
  expect_same(before);
  const std::size_t characteristics = 4 + 24 * (asked.params().size() + 1);
  // The modulus, 65537, d, and five numbers of half the size. A number that begins with zeros is stored without them.
  constexpr std::size_t longest = 4 + 8 * 4 + 256 + 3 + 256 + 5 * 128;
  const std::size_t key_data = a.size - blob_overhead - characteristics;
  EXPECT_LE(key_data, longest);
  EXPECT_GE(key_data, longest - 16);
  EXPECT_EQ(bytes(a.output.begin() + a.size, a.output.end()), bytes(a.output.size() - a.size, canary));
}

TEST_F(GenerateTest, TheBlobHoldsTheKeysComponentsAndTheCharacteristics) {
  const param_list asked = rsa_key(1024).add_blob(KM_TAG_APPLICATION_ID, from_text("app"));
  const bytes blob = client().must_generate(asked);
  const auto plaintext = open_blob(stored_ksk(), blob);
  ASSERT_TRUE(plaintext.has_value());
  param_list stored = asked;
  stored.add(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED);
  const std::uint32_t key_data_size = u32_at(*plaintext, 0);
  const bytes key_data(plaintext->begin() + 4, plaintext->begin() + 4 + key_data_size);
  EXPECT_EQ(*plaintext, blob_plaintext(key_data, stored.marshal()));

  EXPECT_EQ(u32_at(key_data, 0), 1024U);
  std::size_t at = 4;
  for (int component = 0; component < 8; ++component) {
    const std::uint32_t length = u32_at(key_data, at);
    if (component == rsa_n) {
      EXPECT_EQ(length, 128U);
    }
    if (component == rsa_e) {
      EXPECT_EQ(to_hex({&key_data.at(at + 4), length}), "010001");
    }
    EXPECT_NE(key_data.at(at + 4), 0) << "a component with a leading zero";
    at += 4 + length;
  }
  EXPECT_EQ(at, key_data.size());
}

TEST_F(GenerateTest, TheWholeRequestBecomesTheCharacteristics) {
  const param_list asked = rsa_key(512)
                               .add(KM_TAG_USER_AUTH_TYPE, 3)
                               .add(0x7000FFFF)  // a tag that nobody knows
                               .add_blob(KM_TAG_AUTH_TOKEN, pattern(69))
                               .add(KM_TAG_SOTER_KEY);
  const bytes blob = client().must_generate(asked);
  param_list expected = asked;
  expected.add(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED);
  EXPECT_EQ(client().characteristics(blob).body(), expected.marshal());
}

TEST_F(GenerateTest, UnusedBytesOfARecordAreCarriedAndThePointerSlotIsNot) {
  const param_list base = rsa_key(512);
  bytes body = base.marshal();
  body[0] = static_cast<std::uint8_t>(base.params().size() + 2);
  body = join({body,
               record(0x3000FFFF, 0xAABBCCDD, 0x1122334455667788, 0x99AABBCCDDEEFF00),
               record(KM_TAG_ASSOCIATED_DATA, 0x01020304, 0xFFFFFFFFFFFFFFFF, 0xDEADBEEF00000003),
               {7, 8, 9}});
  const answer made = succeeds([&] { return generate_raw(join({body, from_text("ignored")})); });
  const bytes known = client().characteristics(made.body()).body();
  body[0] = static_cast<std::uint8_t>(base.params().size() + 3);
  const bytes cleared = record(KM_TAG_ASSOCIATED_DATA, 0x01020304, 0, 0xDEADBEEF00000003);
  std::copy(cleared.begin(), cleared.end(), body.end() - 27);
  EXPECT_EQ(known, join({body, record(KM_TAG_ORIGIN, 0, KM_ORIGIN_GENERATED, 0)}));
}

TEST_F(GenerateTest, TheExponentIsTheOneAskedFor) {
  for (const std::uint64_t exponent : {std::uint64_t{3}, std::uint64_t{0x100000001}}) {
    const bytes blob = client().must_generate(
        rsa_key(512).remove(KM_TAG_RSA_PUBLIC_EXPONENT).add(KM_TAG_RSA_PUBLIC_EXPONENT, exponent));
    const bytes der = client().export_key(blob).body();
    const std::uint8_t* in = der.data();
    const std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)> key(
        d2i_PUBKEY(nullptr, &in, static_cast<long>(der.size())), EVP_PKEY_free);
    ASSERT_NE(key, nullptr);
    BIGNUM* e = nullptr;
    ASSERT_EQ(EVP_PKEY_get_bn_param(key.get(), "e", &e), 1);
    bytes value(sizeof exponent);
    EXPECT_EQ(BN_bn2lebinpad(e, value.data(), static_cast<int>(value.size())), 8);
    EXPECT_EQ(value, u64(exponent));
    BN_free(e);
  }
}

TEST_F(GenerateTest, WithoutRpmbTheBlobIsSealedUnderTheDerivedKey) {
  EXPECT_EQ(client().must_generate(rsa_key(512)).front(), sealed_by_rpmb_ksk);
  tee.restart(/*rpmb=*/false);
  EXPECT_EQ(client().must_generate(rsa_key(512)).front(), sealed_by_derived_ksk);
}

TEST_F(GenerateTest, ParametersThatDontUnmarshalAreRefused) {
  const trace_lines too_short = {"Too short input", "Unmarshal failed"};
  const bytes whole = rsa_key(512).add_blob(KM_TAG_APPLICATION_ID, from_text("id")).marshal();
  for (const std::size_t size : {std::size_t{0}, std::size_t{3}, std::size_t{4}, std::size_t{27}, whole.size() - 1}) {
    SCOPED_TRACE(size);
    expect_refused(broken(TEEC_ERROR_BAD_PARAMETERS, too_short),
                   bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size)));
  }
}

TEST_F(GenerateTest, HugeCountsAndBlobsAreWantOfMemory) {
  for (const std::uint32_t count : {0x0AAAAAABU, 0xFFFFFFFFU, 30'000U}) {
    expect_refused(broken(TEEC_ERROR_BAD_PARAMETERS, {"Out of memory", "Unmarshal failed"}), u32(count));
  }
  struct huge {
    std::uint64_t length;
    const char* line;
  };
  for (const huge& each :
       {huge{0x7FFFFFFF, "Out of memory, require 2147483647B"}, {0xFFFFFFFF, "Out of memory, require -1B"}}) {
    expect_refused(broken(TEEC_ERROR_BAD_PARAMETERS, {each.line, "Unmarshal failed"}),
                   join({u32(1), record(KM_TAG_APPLICATION_ID, 0, 0, each.length)}));
  }
}

TEST_F(GenerateTest, TheAlgorithmMustOccurOnce) {
  const trace_lines line = {"No KM_TAG_ALGORITHM or many KM_TAG_ALGORITHM"};
  expect_refused(refused(KM_ERROR_INVALID_ARGUMENT, line), param_list{});
  expect_refused(refused(KM_ERROR_INVALID_ARGUMENT, line), rsa_key(512).remove(KM_TAG_ALGORITHM));
  expect_refused(refused(KM_ERROR_INVALID_ARGUMENT, line), rsa_key(512).add(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA));
}

TEST_F(GenerateTest, AnAlgorithmThatNobodyServesIsRefusedWithoutALine) {
  for (const std::uint32_t algorithm : {0U, 2U, 0xFFFFFFFFU}) {
    expect_refused(refused(KM_ERROR_UNSUPPORTED_ALGORITHM, {}),
                   rsa_key(512).remove(KM_TAG_ALGORITHM).add(KM_TAG_ALGORITHM, algorithm));
  }
}

TEST_F(GenerateTest, AClientMayNotStateTheOrigin) {
  for (const std::uint32_t origin : {KM_ORIGIN_GENERATED, KM_ORIGIN_IMPORTED}) {
    expect_refused(refused(KM_ERROR_INVALID_ARGUMENT, {"Shouldn't specify KM_TAG_ORIGIN"}),
                   rsa_key(512).add(KM_TAG_ORIGIN, origin));
  }
}

TEST_F(GenerateTest, ExponentAndSizeMustOccurOnceAndTheExponentIsLookedAtFirst) {
  const failure exponent = refused(KM_ERROR_INVALID_ARGUMENT, {"No or too many KM_TAG_RSA_PUBLIC_EXPONENT specified"});
  expect_refused(exponent, rsa_key(512).remove(KM_TAG_RSA_PUBLIC_EXPONENT));
  expect_refused(exponent, rsa_key(512).add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537));
  expect_refused(exponent, rsa_key(512).remove(KM_TAG_RSA_PUBLIC_EXPONENT).remove(KM_TAG_KEY_SIZE));
  const failure size = refused(KM_ERROR_INVALID_ARGUMENT, {"No or too many KM_TAG_KEY_SIZE or specified"});
  expect_refused(size, rsa_key(512).remove(KM_TAG_KEY_SIZE));
  expect_refused(size, rsa_key(512).add(KM_TAG_KEY_SIZE, 512));
}

TEST_F(GenerateTest, SizesThatAreNoMultipleOf8OrAbove8192AreRefused) {
  for (const std::uint32_t bits : {1U, 2047U, 2049U, 8193U, 8200U, 0x7FFFFFF8U, 0xFFFFFFF8U, 0xFFFFFFFFU}) {
    expect_refused(refused(KM_ERROR_UNSUPPORTED_KEY_SIZE,
                           {fmt::format("Invalid RSA key size {}", static_cast<std::int32_t>(bits))}),
                   rsa_key(bits));
  }
}

TEST_F(GenerateTest, SmallSizesAreThePlatformsToRefuse) {
  for (const std::uint32_t bits : {0U, 8U, 504U}) {
    expect_refused(broken(TEEC_ERROR_NOT_SUPPORTED, {"AllocateTransientObject failed with 0xffff000a\n"}),
                   rsa_key(bits));
  }
}

TEST_F(GenerateTest, TheLargestSizeGetsAsFarAsThePlatform) {
  tee.world().faults().fail_call("TEE_GenerateKey", 1, TEE_ERROR_NOT_SUPPORTED);  // it would take ten seconds
  expect_refused(broken(TEEC_ERROR_NOT_SUPPORTED, {"GenerateKey failed with 0xffff000a\n"}), rsa_key(8192));
}

TEST_F(GenerateTest, ImpossibleExponentsAreThePlatformsToRefuse) {
  for (const std::uint64_t exponent : {std::uint64_t{0}, std::uint64_t{1}, std::uint64_t{2}, std::uint64_t{65536}}) {
    expect_refused(broken(TEEC_ERROR_BAD_PARAMETERS, {"GenerateKey failed with 0xffff0006\n"}),
                   rsa_key(512).remove(KM_TAG_RSA_PUBLIC_EXPONENT).add(KM_TAG_RSA_PUBLIC_EXPONENT, exponent));
  }
}

TEST_F(GenerateTest, BlobUsageIsStatedAtMostOnceAndLookedAtLast) {
  EXPECT_TRUE(client().generate(rsa_key(512).add(KM_TAG_BLOB_USAGE_REQUIREMENTS, 0)).ok());
  const param_list twice = rsa_key(512).add(KM_TAG_BLOB_USAGE_REQUIREMENTS, 0).add(KM_TAG_BLOB_USAGE_REQUIREMENTS, 0);
  tee.world().faults().clear();
  expect_refused(refused(KM_ERROR_INVALID_TAG, {"Too many KM_TAG_BLOB_USAGE_REQUIREMENTS specified"}), twice);
  EXPECT_EQ(tee.world().faults().call_count("TEE_GenerateKey"), 1U);
}

TEST_F(GenerateTest, ABlobThatDoesntFitIsRefusedAndNothingOfItIsLeft) {
  for (const std::size_t capacity : {std::size_t{0}, std::size_t{1}, std::size_t{101}, std::size_t{600}}) {
    expect_refused(broken(TEEC_ERROR_SHORT_BUFFER, {"Too short key blob", "Can't save key to TEE storage"}),
                   rsa_key(512), capacity);
  }
}

}  // namespace
}  // namespace testing_support
