// import_key: the response, and what the material and the parameters may say of each other.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/commands/sealed_blob.h"

using namespace keymaster;

namespace testing_support {
namespace {

class ImportTest : public CommandTest {
 protected:
  const rsa_test_key& key = rsa_test_key::of_bits(1024);

  /// The material with one component replaced.
  bytes material_with(rsa_component which, bytes value) const {
    rsa_components changed = key.components();
    changed.at(which) = std::move(value);
    return rsa_material(changed);
  }

  /// expect_refused imports and expects the failure, with the response zeroed over its whole capacity.
  void expect_refused(const failure& expected, const param_list& params, const bytes& material,
                      std::size_t capacity = 4096) {
    const answer a = expect_failure(expected, [&] { return client().import_key(params, material, capacity); });
    EXPECT_EQ(a.output, bytes(capacity, 0));
  }
  void expect_refused(const failure& expected, const bytes& body) {
    const answer a =
        expect_failure(expected, [&] { return client().call(KM_COMMAND_IMPORT_KEY, 0, 0, body, std::size_t{2048}); });
    EXPECT_EQ(a.output, bytes(2048, 0));
  }

  /// imported_characteristics imports and answers the parameters behind the blob.
  param_list imported_characteristics(const param_list& params, const bytes& material) {
    const answer a = succeeds([&] { return client().import_key(params, material); });
    const std::uint32_t blob_size = u32_at(a.output, 0);
    EXPECT_EQ(a.size, 4 + blob_size + 4 + u32_at(a.output, 4 + blob_size));
    return param_list::parse(std::span(a.output).subspan(8 + blob_size, u32_at(a.output, 4 + blob_size))).value();
  }
};

TEST_F(ImportTest, TheResponseIsTheBlobAndTheParametersEachBehindItsLength) {
  const param_list asked = rsa_key(1024).add_blob(KM_TAG_APPLICATION_ID, from_text("some app"));
  param_list stored = asked;
  stored.add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED);
  param_list shown = stored;
  shown.remove(KM_TAG_APPLICATION_ID);

  const hosted_tee::accounting before = tee.accounting();
  const answer a = succeeds([&] { return client().import_key(asked, key.material()); });
  expect_same(before);
  const std::uint32_t blob_size = u32_at(a.output, 0);
  EXPECT_EQ(blob_size, blob_overhead + 4 + key.material().size() + stored.marshal().size());
  const bytes blob(a.output.begin() + 4, a.output.begin() + 4 + blob_size);
  EXPECT_EQ(a.body(), join({prefixed(blob), prefixed(shown.marshal())}));
  EXPECT_EQ(open_blob(stored_ksk(), blob), blob_plaintext(join({u32(1024), key.material()}), stored.marshal()));
  EXPECT_EQ(bytes(a.output.begin() + a.size, a.output.end()), bytes(a.output.size() - a.size, canary));
}

TEST_F(ImportTest, SizeAndExponentAreTakenFromTheMaterialWhenNotStated) {
  const param_list asked = rsa_key(1024).remove(KM_TAG_KEY_SIZE).remove(KM_TAG_RSA_PUBLIC_EXPONENT);
  param_list expected = asked;
  expected.add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED).add(KM_TAG_KEY_SIZE, 1024).add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537);
  EXPECT_EQ(imported_characteristics(asked, key.material()).marshal(), expected.marshal());
}

TEST_F(ImportTest, WhatIsStatedTwiceCountsAsNotStatedAndIsStatedOnceMore) {
  const param_list asked = rsa_key(1024).add(KM_TAG_KEY_SIZE, 7).add(KM_TAG_RSA_PUBLIC_EXPONENT, 9);
  param_list expected = asked;
  expected.add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED).add(KM_TAG_KEY_SIZE, 1024).add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537);
  EXPECT_EQ(imported_characteristics(asked, key.material()).marshal(), expected.marshal());
}

TEST_F(ImportTest, ALeadingZeroOfTheModulusCounts8Bits) {
  const bytes material = material_with(rsa_n, join({{0}, key.component(rsa_n)}));
  expect_refused(refused(KM_ERROR_IMPORT_PARAMETER_MISMATCH, {"Key size mismatch (given 1024, guessed 1032)"}),
                 rsa_key(1024), material);
  EXPECT_EQ(imported_characteristics(rsa_key(1024).remove(KM_TAG_KEY_SIZE), material).value(KM_TAG_KEY_SIZE), 1032U);
}

TEST_F(ImportTest, AStatedSizeMustBeThatOfTheModulus) {
  for (const std::uint32_t stated : {0U, 1016U, 1032U, 2048U, 0xFFFFFC00U}) {
    expect_refused(refused(KM_ERROR_IMPORT_PARAMETER_MISMATCH,
                           {fmt::format("Key size mismatch (given {}, guessed 1024)", static_cast<int>(stated))}),
                   rsa_key(stated), key.material());
  }
}

TEST_F(ImportTest, AModulusAbove8192BitsIsRefused) {
  const param_list unstated = rsa_key(0).remove(KM_TAG_KEY_SIZE);
  expect_refused(refused(KM_ERROR_UNSUPPORTED_KEY_SIZE, {"Invalid RSA key size 8200"}), unstated,
                 material_with(rsa_n, bytes(1025, 0xC1)));
  EXPECT_TRUE(client().import_key(unstated, material_with(rsa_n, bytes(1024, 0xC1))).ok());
}

TEST_F(ImportTest, TheExponentFieldIsComparedWithTheLastBytesOfTheStatedOne) {
  for (const char* const field : {"010001", "00010001", "0000000000010001", "0001", "01", ""}) {
    SCOPED_TRACE(field);
    EXPECT_TRUE(client().import_key(rsa_key(1024), material_with(rsa_e, from_hex(field))).ok());
  }
  for (const char* const field : {"03", "010003", "01000001", "00010000", "0100000000010001", "000000000000010001"}) {
    SCOPED_TRACE(field);
    expect_refused(refused(KM_ERROR_IMPORT_PARAMETER_MISMATCH, {"Public exponent mismatch"}), rsa_key(1024),
                   material_with(rsa_e, from_hex(field)));
  }
}

TEST_F(ImportTest, AnExponentFieldThatIsNotStatedMayHave8BytesAndNoMore) {
  const param_list unstated = rsa_key(1024).remove(KM_TAG_RSA_PUBLIC_EXPONENT);
  EXPECT_EQ(imported_characteristics(unstated, material_with(rsa_e, from_hex("8102030405060709")))
                .value(KM_TAG_RSA_PUBLIC_EXPONENT),
            0x8102030405060709U);
  EXPECT_EQ(imported_characteristics(unstated, material_with(rsa_e, {})).value(KM_TAG_RSA_PUBLIC_EXPONENT), 0U);
  for (const std::size_t size : {9U, 64U, 300U}) {
    expect_refused(refused(KM_ERROR_IMPORT_PARAMETER_MISMATCH, {"Public exponent mismatch"}), unstated,
                   material_with(rsa_e, bytes(size)));
  }
}

TEST_F(ImportTest, MaterialThatEndsTooSoonIsRefusedWhereverItEnds) {
  const bytes whole = key.material();
  const failure expected = broken(TEEC_ERROR_GENERIC, {"Too short input"});
  for (std::size_t size = 0; size < whole.size(); size += size % 7 == 0 ? 1 : 5) {
    SCOPED_TRACE(size);
    expect_refused(expected, rsa_key(1024), bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size)));
  }
  for (const std::uint32_t length : {0xFFFFFFFFU, 0xFFFFFFFCU, 0x80000000U}) {
    expect_refused(expected, rsa_key(1024), join({u32(length), whole}));
  }
}

TEST_F(ImportTest, MalformedMaterialIsFoundBeforeAWrongOrigin) {
  expect_refused(broken(TEEC_ERROR_GENERIC, {"Too short input"}), rsa_key(1024).add(KM_TAG_ORIGIN, 0), bytes(3));
  expect_refused(refused(KM_ERROR_INVALID_ARGUMENT, {"Shouldn't specify KM_TAG_ORIGIN"}),
                 rsa_key(1024).add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED), key.material());
}

TEST_F(ImportTest, BytesBehindTheEighthComponentAreDropped) {
  const bytes plain = client().must_import(rsa_key(1024), key.material());
  const bytes with_more = client().must_import(rsa_key(1024), join({key.material(), pattern(500)}));
  EXPECT_EQ(with_more.size(), plain.size());
  EXPECT_EQ(open_blob(stored_ksk(), with_more), open_blob(stored_ksk(), plain));
}

TEST_F(ImportTest, ComponentsAreStoredAsTheyComeAndFailWhereTheyAreUsed) {
  bytes even = key.component(rsa_n);
  even.back() &= 0xFE;
  const bytes material = material_with(rsa_n, even);
  const bytes blob = client().must_import(rsa_key(1024), material);
  const bytes plaintext = open_blob(stored_ksk(), blob).value();
  EXPECT_EQ(bytes(plaintext.begin() + 8, plaintext.begin() + 8 + static_cast<std::ptrdiff_t>(material.size())),
            material);
  expect_failure(broken(TEEC_ERROR_BAD_PARAMETERS, {"PopulateTransientObject failed with 0xffff0006\n",
                                                    "Resolve key data failed", "Create operation failed"}),
                 [&] { return client().begin(KM_PURPOSE_SIGN, blob, signature(KM_DIGEST_NONE, KM_PAD_NONE)); });
}

TEST_F(ImportTest, AnEmptyModulusIsImportedAsAKeyOf0BitsThatNothingCanBeDoneWith) {
  const bytes blob = client().must_import(rsa_key(0), material_with(rsa_n, {}));
  EXPECT_EQ(client().characteristics(blob).result, TEEC_SUCCESS);
  expect_failure(broken(TEEC_ERROR_NOT_SUPPORTED, {"AllocateTransientObject failed with 0xffff000a\n",
                                                   "Resolve key data failed", "Create operation failed"}),
                 [&] { return client().begin(KM_PURPOSE_SIGN, blob, signature(KM_DIGEST_NONE, KM_PAD_NONE)); });
}

TEST_F(ImportTest, TheAlgorithmMustOccurOnceAndBeServed) {
  const failure missing = refused(KM_ERROR_INVALID_ARGUMENT, {"No or too many KM_TAG_ALGORITHM"});
  expect_refused(missing, param_list{}, key.material());
  expect_refused(missing, rsa_key(1024).add(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA), key.material());
  for (const std::uint32_t algorithm : {0U, 2U, 0xFFFFFFFFU}) {
    const std::string line =
        fmt::format("Unsupport import_key for algorithm  ({})", static_cast<std::int32_t>(algorithm));
    expect_refused(refused(KM_ERROR_UNSUPPORTED_ALGORITHM, {line}), param_list{}.add(KM_TAG_ALGORITHM, algorithm),
                   key.material());
  }
}

TEST_F(ImportTest, BlobUsageIsStatedAtMostOnceAndTheMaterialIsLookedAtFirst) {
  const param_list twice = rsa_key(1024).add(KM_TAG_BLOB_USAGE_REQUIREMENTS).add(KM_TAG_BLOB_USAGE_REQUIREMENTS);
  expect_refused(refused(KM_ERROR_INVALID_TAG, {"Too many KM_TAG_BLOB_USAGE_REQUIREMENTS specified"}), twice,
                 key.material());
  expect_refused(broken(TEEC_ERROR_GENERIC, {"Too short input"}), twice, {});
}

TEST_F(ImportTest, ARequestWhoseParametersRunPastItIsRefused) {
  const bytes params = rsa_key(1024).marshal();
  const failure expected = broken(TEEC_ERROR_GENERIC, {"Too short input"});
  for (const bytes& body : {bytes{}, bytes(3), u32(1), join({u32(0xFFFFFFFF), params}),
                            join({u32(static_cast<std::uint32_t>(params.size()) + 1), params})}) {
    expect_refused(expected, body);
  }
}

TEST_F(ImportTest, ParametersThatDontUnmarshalAreRefused) {
  const failure expected = broken(TEEC_ERROR_BAD_PARAMETERS, {"Too short input", "Unmarshal failed"});
  expect_refused(expected, join({u32(0), key.material()}));  // no bytes are no empty set
  expect_refused(expected, join({prefixed(u32(1)), key.material()}));
}

TEST_F(ImportTest, EveryCapacityBelowTheTotalIsRefusedAndNothingIsLeftInTheResponse) {
  const param_list asked = rsa_key(1024);
  const std::size_t total = client().import_key(asked, key.material()).size;
  const std::size_t params_size = asked.marshal().size() + 24, blob_end = total - 4 - params_size;
  const failure no_room = broken(TEEC_ERROR_GENERIC, {"Too short input"});
  for (const std::size_t capacity : {std::size_t{0}, std::size_t{3}, blob_end, blob_end + 3}) {
    SCOPED_TRACE(capacity);
    expect_refused(no_room, asked, key.material(), capacity);
  }
  for (const std::size_t capacity : {std::size_t{4}, std::size_t{5}, std::size_t{100}, blob_end - 1}) {
    SCOPED_TRACE(capacity);
    expect_refused(broken(TEEC_ERROR_SHORT_BUFFER, {"Too short key blob", "Can't save key to TEE storage"}), asked,
                   key.material(), capacity);
  }
  for (const std::size_t capacity : {blob_end + 4, total - 25, total - 1}) {
    SCOPED_TRACE(capacity);
    expect_refused(broken(TEEC_ERROR_SHORT_BUFFER, {"Too short marshalling buffer", "Marshal failed"}), asked,
                   key.material(), capacity);
  }
  EXPECT_EQ(succeeds([&] { return client().import_key(asked, key.material(), total); }).size, total);
}

}  // namespace
}  // namespace testing_support
