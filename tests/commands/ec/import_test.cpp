// import_key and export_key for EC: the layout of the material, which is that of the key data, and its public half.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/commands/sealed_blob.h"
#include "tests/support/ec_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

class EcImportTest : public CommandTest {
 protected:
  const ec_fields& fields = ec_test_key::of_bits(256).fields();
  const failure too_short = refused(KM_ERROR_UNKNOWN_ERROR, {"Too short input", "Export key failed"});

  void expect_refused(const failure& expected, const param_list& params, const bytes& material) {
    const answer a = expect_failure(expected, [&] { return client().import_key(params, material, 2048); });
    EXPECT_EQ(a.output, bytes(2048, 0));
  }

  /// What a blob says of its key data and characteristics.
  bytes plaintext_of(const bytes& blob) { return open_blob(stored_ksk(), blob).value(); }
};

TEST_F(EcImportTest, TheMaterialIsStoredAsItStands) {
  for (const std::uint32_t bits : ec_sizes) {
    const ec_test_key& key = ec_test_key::of_bits(bits);
    const param_list asked = ec_key(bits);
    param_list stored = asked;
    stored.add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED);
    const hosted_tee::accounting before = tee.accounting();
    const answer a = succeeds([&] { return client().import_key(asked, key.material()); });
    expect_same(before);
    const bytes blob(a.output.begin() + 4, a.output.begin() + 4 + u32_at(a.output, 0));
    EXPECT_EQ(plaintext_of(blob), blob_plaintext(key.material(), stored.marshal()));
    EXPECT_EQ(a.body(), join({prefixed(blob), prefixed(stored.marshal())}));
  }
}

TEST_F(EcImportTest, ASizeThatIsNotStatedIsTakenFromTheMaterial) {
  for (const bool twice : {false, true}) {
    param_list asked = ec_key(256);
    if (twice) {
      asked.add(KM_TAG_KEY_SIZE, 384);  // repeated: as good as none
    } else {
      asked.remove(KM_TAG_KEY_SIZE);
    }
    param_list stored = asked;
    stored.add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED).add(KM_TAG_KEY_SIZE, 256);
    EXPECT_EQ(plaintext_of(client().must_import(asked, fields.material())),
              blob_plaintext(fields.material(), stored.marshal()));
  }
}

TEST_F(EcImportTest, BytesBehindDAreDropped) {
  const bytes blob = client().must_import(ec_key(256), join({fields.material(), pattern(300)}));
  EXPECT_EQ(u32_at(plaintext_of(blob), 0), fields.material().size());
}

TEST_F(EcImportTest, NeitherTheLengthsNorThePointAreLookedAt) {
  for (const ec_fields& odd : {ec_fields{256, {}, {}, {}}, ec_fields{256, bytes(500, 7), {1}, {}},
                               ec_fields{521, pattern(66), pattern(66), pattern(66)}, ec_fields{192, {0}, {0}, {0}}}) {
    const bytes blob = client().must_import(ec_key(odd.bits), odd.material());
    const answer exported = succeeds([&] { return client().export_key(blob); });
    EXPECT_EQ(exported.body(), odd.public_material());
  }
}

TEST_F(EcImportTest, MaterialThatEndsTooSoonIsRefusedBeforeTheParametersAreLookedAt) {
  const bytes material = fields.material();
  const param_list with_origin = ec_key(384).add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED);
  const failure expected = broken(TEEC_ERROR_GENERIC, {"Too short input"});
  for (std::size_t size = 0; size < material.size(); ++size) {
    expect_refused(expected, with_origin, {material.begin(), material.begin() + static_cast<std::ptrdiff_t>(size)});
  }
  for (const std::uint32_t length : {33U, 100U, 0x80000000U, 0xFFFFFFFCU, 0xFFFFFFFFU}) {
    expect_refused(expected, with_origin, join({u32(256), prefixed(fields.x), u32(length), fields.y}));
    expect_refused(expected, with_origin, join({u32(256), u32(length), fields.x}));
    expect_refused(expected, with_origin, join({fields.public_material(), u32(length), fields.d}));
  }
}

TEST_F(EcImportTest, AClientMayNotStateTheOriginAndThatComesBeforeTheSize) {
  expect_refused(refused(KM_ERROR_INVALID_ARGUMENT, {"Shouldn't specify KM_TAG_ORIGIN"}),
                 ec_key(384).add(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED), fields.material());
}

TEST_F(EcImportTest, AStatedSizeMustBeThatOfTheMaterialAndThatComesBeforeItsCurve) {
  expect_refused(refused(KM_ERROR_IMPORT_PARAMETER_MISMATCH, {"Key size mismatch (given 384, guessed 256)"}),
                 ec_key(384), fields.material());
  expect_refused(refused(KM_ERROR_IMPORT_PARAMETER_MISMATCH, {"Key size mismatch (given 256, guessed 255)"}),
                 ec_key(256), ec_fields{255, {1}, {2}, {3}}.material());
  expect_refused(refused(KM_ERROR_IMPORT_PARAMETER_MISMATCH, {"Key size mismatch (given -1, guessed 256)"}),
                 ec_key(0xFFFFFFFF), fields.material());
}

TEST_F(EcImportTest, OnlyTheSizesOfTheFiveCurvesAreSupported) {
  for (const std::uint32_t bits : {0U, 160U, 191U, 255U, 257U, 512U, 528U, 0xFFFFFFFFU}) {
    for (const bool stated : {false, true}) {
      param_list params = ec_key(bits);
      if (!stated) params.remove(KM_TAG_KEY_SIZE);
      expect_refused(refused(KM_ERROR_UNSUPPORTED_KEY_SIZE,
                             {fmt::format("Invalid EC key size {}", static_cast<std::int32_t>(bits))}),
                     params, ec_fields{bits, fields.x, fields.y, fields.d}.material());
    }
  }
}

TEST_F(EcImportTest, WithoutMemoryForTheKeyDataThereIsNoKey) {
  (void)client().must_import(ec_key(256), fields.material());
  int found = 0;
  for (std::uint32_t n = 1; n <= 12; ++n) {
    tee.clear_trace();
    tee.world().faults().fail_allocation(n);
    const answer a = client().import_key(ec_key(256), fields.material(), 2048);
    EXPECT_FALSE(a.ok());
    found += a.error == KM_ERROR_MEMORY_ALLOCATION_FAILED && lines() == trace_lines{"Out of memory"};
    if (a.error == KM_ERROR_UNKNOWN_ERROR && a.result != TEEC_SUCCESS && found > 2) break;  // sealing has begun
  }
  EXPECT_EQ(found, 3);  // the material's copy, the list of parameters for the origin, the key data
}

TEST_F(EcImportTest, ExportAnswersSizeXAndY) {
  for (const std::uint32_t bits : ec_sizes) {
    const ec_fields& pair = ec_test_key::of_bits(bits).fields();
    const bytes blob = client().must_import(ec_key(bits), pair.material());
    const hosted_tee::accounting before = tee.accounting();
    const answer a = succeeds([&] { return client().export_key(blob); });
    EXPECT_EQ(a.body(), pair.public_material());
    EXPECT_EQ(bytes(a.output.begin() + a.size, a.output.end()), bytes(a.output.size() - a.size, canary));
    expect_same(before);
  }
}

TEST_F(EcImportTest, ABufferShorterThanThePublicHalfIsRefused) {
  const bytes blob = client().must_import(ec_key(256), fields.material());
  const std::size_t exact = fields.public_material().size();
  for (std::size_t capacity = 0; capacity < exact; ++capacity) {
    SCOPED_TRACE(capacity);
    expect_failure(too_short, [&] { return client().export_key(blob, {}, {}, capacity); });
  }
  EXPECT_TRUE(client().export_key(blob, {}, {}, exact).ok());
}

TEST_F(EcImportTest, KeyDataThatEndsTooSoonExportsNothing) {
  const bytes material = fields.public_material();
  for (const std::size_t size : {std::size_t{0}, std::size_t{3}, std::size_t{7}, material.size() - 1}) {
    const bytes key_data(material.begin(), material.begin() + static_cast<std::ptrdiff_t>(size));
    const bytes blob = seal_blob(stored_ksk(), sealed_by_rpmb_ksk, blob_plaintext(key_data, ec_key(256).marshal()));
    expect_failure(too_short, [&] { return client().export_key(blob); });
  }
}

}  // namespace
}  // namespace testing_support
