// Blobs that are not what the TA sealed, in every command that opens one.
#include <fmt/format.h>

#include "tests/commands/keys/key_commands.h"
#include "tests/commands/sealed_blob.h"

using namespace keymaster;

namespace testing_support {
namespace {

const failure& unsealed() {
  static const failure expected =
      broken(TEE_ERROR_MAC_INVALID, {"AEDecryptFinal failed with 0xffff3071\n", "Open key failed"});
  return expected;
}

class TamperedBlobTest : public CommandTest {
 protected:
  /// expect_all_fail opens `blob` with every command.
  void expect_all_fail(const failure& expected, const bytes& blob) {
    for (const key_command& command : key_commands()) {
      SCOPED_TRACE(command.name);
      expect_failure(expected, [&] { return command.call(client(), blob, {}, {}); });
    }
  }
};

TEST_F(TamperedBlobTest, EveryFlippedBitIsFoundByTheSeal) {
  const bytes blob = import_fixed(512);
  for (std::size_t offset = 0; offset < blob.size(); ++offset) {
    SCOPED_TRACE(offset);
    expect_failure(unsealed(), [&] { return client().characteristics_size(flip(blob, offset)); });
  }
}

TEST_F(TamperedBlobTest, EveryFieldIsCoveredInEveryCommand) {
  const bytes blob = import_fixed(512);
  struct place {
    const char* field;
    std::size_t offset;
  };
  for (const place& each : {place{"type", 0},
                            {"first of the nonce", 1},
                            {"last of the nonce", 64},
                            {"first of the IV", 65},
                            {"last of the IV", 76},
                            {"first of the tag", 77},
                            {"last of the tag", 92},
                            {"size of the key data", 93},
                            {"key data", 200},
                            {"last of all", blob.size() - 1}}) {
    SCOPED_TRACE(each.field);
    expect_all_fail(unsealed(), flip(blob, each.offset));
  }
}

TEST_F(TamperedBlobTest, AnUnknownProtectionTypeIsRefused) {
  bytes blob = import_fixed(512);
  for (const unsigned type : {2U, 0x7FU, 0x80U, 0xFFU}) {
    blob.front() = static_cast<std::uint8_t>(type);
    expect_all_fail(refused(KM_ERROR_INVALID_KEY_BLOB, {"Unknown key protection", "Open key failed"}), blob);
  }
}

TEST_F(TamperedBlobTest, AnotherLengthIsFoundByTheSeal) {
  const bytes blob = import_fixed(512);
  expect_all_fail(unsealed(), bytes(blob.begin(), blob.end() - 1));
  expect_all_fail(unsealed(), bytes(blob.begin(), blob.begin() + blob_header + 1));
  expect_all_fail(unsealed(), join({blob, {0}}));
  expect_all_fail(unsealed(), join({blob, blob}));
}

TEST_F(TamperedBlobTest, TooShortBlobsAreRefused) {
  const bytes blob = import_fixed(512);
  for (const std::size_t size : {std::size_t{2}, std::size_t{13}, blob_header}) {
    expect_all_fail(refused(KM_ERROR_INVALID_KEY_BLOB, {"Too short key blob", "Open key failed"}),
                    bytes(blob.begin(), blob.begin() + static_cast<std::ptrdiff_t>(size)));
  }
}

TEST_F(TamperedBlobTest, NoBlobAtAllIsTooShortForExportAndBegin) {
  const failure expected = refused(KM_ERROR_INVALID_KEY_BLOB, {"Too short key blob", "Open key failed"});
  for (const bytes& blob : {bytes{}, bytes{1}}) {
    expect_failure(expected, [&] { return client().export_key(blob); });
    expect_failure(expected, [&] { return client().begin(KM_PURPOSE_SIGN, blob, {}); });
  }
}

TEST_F(TamperedBlobTest, PartsOfTwoBlobsMakeNoThird) {
  const bytes one = import_fixed(512), other = import_fixed(512);
  const auto header = static_cast<std::ptrdiff_t>(blob_header);
  expect_all_fail(unsealed(),
                  join({bytes(one.begin(), one.begin() + header), bytes(other.begin() + header, other.end())}));
}

TEST_F(TamperedBlobTest, ABlobOfAnotherDeviceIsNoBlob) {
  device other;
  const bytes blob = other.client().must_import(rsa_key(512), rsa_test_key::of_bits(512).material());
  expect_all_fail(unsealed(), blob);
}

TEST_F(TamperedBlobTest, WithoutRpmbItsBlobsAreLostUntilItIsBack) {
  const bytes sealed_by_rpmb = import_fixed(512);
  tee.restart(/*rpmb=*/false);
  expect_all_fail(broken(0xF0100003, {"RPMB KSK died, fail to open key", "Open key failed"}), sealed_by_rpmb);
  const bytes sealed_without = import_fixed(512);
  tee.restart(/*rpmb=*/true);
  for (const bytes& blob : {sealed_by_rpmb, sealed_without}) {
    for (const key_command& command : key_commands()) {
      EXPECT_TRUE(command.call(client(), blob, {}, {}).ok()) << command.name;
    }
  }
}

/// Blobs whose seal holds, with something else inside than the TA puts there.
class StrangeContentTest : public TamperedBlobTest {
 protected:
  bytes sealed(const bytes& plaintext) { return seal_blob(stored_ksk(), sealed_by_rpmb_ksk, plaintext); }
  bytes sealed(const bytes& key, const param_list& params) { return sealed(blob_plaintext(key, params.marshal())); }
  const bytes key_data = join({u32(512), rsa_test_key::of_bits(512).material()});
};

TEST_F(StrangeContentTest, ABlobThatLibcryptoSealedOpens) {
  const bytes blob = sealed(key_data, rsa_key(512));
  EXPECT_EQ(client().characteristics(blob).body(), rsa_key(512).marshal());
  EXPECT_EQ(client().export_key(blob).body(), rsa_test_key::of_bits(512).spki());
}

TEST_F(StrangeContentTest, AnEmptyKeyWithAnEmptySetIs105BytesLong) {
  const bytes blob = sealed(bytes{}, param_list{});
  EXPECT_EQ(blob.size(), 105U);
  EXPECT_EQ(succeeds([&] { return client().characteristics_size(blob); }).b, 4U);
  EXPECT_EQ(succeeds([&] { return client().characteristics(blob); }).body(), u32(0));
}

TEST_F(StrangeContentTest, InnerLengthsBeyondThePlaintextAreRefused) {
  const failure expected = broken(TEEC_ERROR_GENERIC, {"Too short input", "Open key failed"});
  const bytes params = param_list{}.marshal();
  for (const bytes& plaintext :
       {bytes(1), bytes(3), u32(1), u32(0), join({u32(0), bytes(3)}), join({u32(0), u32(5), params}),
        join({u32(7), params}), join({u32(0), u32(0xFFFFFFFF), params})}) {
    SCOPED_TRACE(to_hex(plaintext));
    expect_all_fail(expected, sealed(plaintext));
  }
}

TEST_F(StrangeContentTest, AHugeKeyLengthIsWantOfMemoryBeforeItIsTooLong) {
  for (const std::uint32_t length : {0xFFFFFFFFU, 0x80000U}) {
    expect_all_fail(refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {"Out of memory", "Open key failed"}),
                    sealed(u32(length)));
  }
}

TEST_F(StrangeContentTest, CharacteristicsThatDontUnmarshalAreAnInvalidArgument) {
  expect_all_fail(refused(KM_ERROR_INVALID_ARGUMENT, {"Too short input", "Unmarshal failed", "Open key failed"}),
                  sealed(blob_plaintext(key_data, bytes(3))));
  expect_all_fail(refused(KM_ERROR_INVALID_ARGUMENT, {"Out of memory", "Unmarshal failed", "Open key failed"}),
                  sealed(blob_plaintext(key_data, u32(0x0AAAAAAB))));
}

TEST_F(StrangeContentTest, BytesBehindTheCharacteristicsAreIgnored) {
  const bytes blob = sealed(join({blob_plaintext(key_data, rsa_key(512).marshal()), pattern(99)}));
  for (const key_command& command : key_commands()) EXPECT_TRUE(command.call(client(), blob, {}, {}).ok());
}

TEST_F(StrangeContentTest, AKeyWithoutOneAlgorithmIsNeitherExportedNorUsed) {
  for (const param_list& params : {rsa_key(512).remove(KM_TAG_ALGORITHM), rsa_key(512).add(KM_TAG_ALGORITHM, 1)}) {
    const bytes blob = sealed(key_data, params);
    expect_failure(refused(KM_ERROR_INVALID_ARGUMENT, {"No or too many KM_TAG_ALGORITHM"}),
                   [&] { return client().export_key(blob); });
    expect_failure(
        refused(KM_ERROR_INVALID_KEY_BLOB, {"No or too many KM_TAG_ALGORITHM in key_params", "Authorization failed"}),
        [&] { return client().begin(KM_PURPOSE_SIGN, blob, {}); });
  }
}

TEST_F(StrangeContentTest, AnUnknownAlgorithmIsNeitherExportedNorUsed) {
  const bytes blob = sealed(key_data, param_list{}.add(KM_TAG_ALGORITHM, 2));
  expect_failure(refused(KM_ERROR_UNSUPPORTED_ALGORITHM, {"Unsupported algorithm"}),
                 [&] { return client().export_key(blob); });
  expect_failure(refused(KM_ERROR_UNSUPPORTED_ALGORITHM, {"Authorization failed"}),
                 [&] { return client().begin(KM_PURPOSE_SIGN, blob, {}); });
}

TEST_F(StrangeContentTest, KeyDataThatEndsTooSoonIsFoundWhereItIsUsed) {
  for (const std::size_t size :
       {std::size_t{0}, std::size_t{3}, std::size_t{4}, std::size_t{50}, key_data.size() - 1}) {
    SCOPED_TRACE(size);
    const bytes cut(key_data.begin(), key_data.begin() + static_cast<std::ptrdiff_t>(size));
    const bytes blob = sealed(cut, rsa_key(512));
    expect_failure(
        broken(TEEC_ERROR_GENERIC, {"Too short input", "Resolve key data failed", "Create operation failed"}),
        [&] { return client().begin(KM_PURPOSE_SIGN, blob, signature(KM_DIGEST_NONE, KM_PAD_NONE)); });
    expect_failure(refused(KM_ERROR_UNKNOWN_ERROR,
                           {"Too short input", "resolve key from data stream error\n", "Export key failed"}),
                   [&] { return client().export_key(blob); });
  }
}

}  // namespace
}  // namespace testing_support
