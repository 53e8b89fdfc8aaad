// In which order the TA calls its platform, and with what. The flows here are fixed: a platform may hang on them, and
// so do the blobs and statements of devices in the field.
#include <fmt/format.h>

#include <algorithm>
#include <stdexcept>

#include "tests/second_platform/scenario.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAreArray;

namespace second_platform {
namespace {

using call_list = std::vector<std::string>;

call_list operator+(call_list first, const call_list& second) {
  first.insert(first.end(), second.begin(), second.end());
  return first;
}

const char* const stored_ksk = "[4b65796d6173746572204b534b00]";  // its name, with the zero byte

const call_list derived_ksk_made = {"TEE_GetPropertyAsUUID(gpd.tee.deviceID)",
                                    "TEE_AllocateTransientObject(a0000004, 256)",
                                    "TEE_PopulateTransientObject(object a0000004, c0000000=[32])"};
const call_list authorization_started = {"TEE_GetSystemTime()", "TEE_GetREETime()",
                                         "TEE_AllocateTransientObject(a0000004, 256)", "GetBootSeed(32)",
                                         "TEE_PopulateTransientObject(object a0000004, c0000000=[32])"};

/// The key of a blob: the HMAC of the blob's 64 random bytes under the key storage key.
const call_list blob_key_derived = {"TEE_AllocateOperation(30000004, 4, 256)",
                                    "TEE_SetOperationKey(operation 30000004, object a0000004)",
                                    "TEE_MACInit(operation 30000004, [])",
                                    "TEE_MACComputeFinal(operation 30000004, [64], 32)",
                                    "TEE_FreeOperation(operation 30000004)",
                                    "TEE_AllocateTransientObject(a0000010, 256)",
                                    "TEE_PopulateTransientObject(object a0000010, c0000000=[32])"};

call_list blob_cipher_started(std::uint32_t mode) {
  return blob_key_derived + call_list{fmt::format("TEE_AllocateOperation(40000810, {}, 256)", mode),
                                      "TEE_SetOperationKey(operation 40000810, object a0000010)",
                                      "TEE_AEInit(operation 40000810, [472e688849555d2c9d068d5a], 128, 0, 0)"};
}

const call_list blob_cipher_ended = {"TEE_FreeOperation(operation 40000810)",
                                     "TEE_FreeTransientObject(object a0000010)"};

call_list blob_opened(std::size_t blob_size) {
  const std::size_t size = blob_size - 93;
  return blob_cipher_started(TEE_MODE_DECRYPT) +
         call_list{fmt::format("TEE_AEUpdate(operation 40000810, [{0}], {0})", size),
                   "TEE_AEDecryptFinal(operation 40000810, [], 0, [4995eb9632ba7a8439d7712a14c24ec5])"} +
         blob_cipher_ended;
}

class StartOrderTest : public ::testing::Test {
 protected:
  StartOrderTest() { power_on(); }
  ~StartOrderTest() override {
    platform.clear();
    TA_DestroyEntryPoint();
    EXPECT_THAT(platform.calls(), ElementsAreArray({"TEE_FreeTransientObject(object a0000004)"}));
    EXPECT_THAT(platform.violations(), ::testing::IsEmpty());
    platform.power_on();
  }
};

TEST_F(StartOrderTest, TheFirstStartProbesTheReplayProtectedStorageAndMakesItsKey) {
  EXPECT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
  EXPECT_EQ(
      platform.calls(),
      derived_ksk_made +
          (call_list{"TEE_RPMB_MakeFileSystem(0)",
                     fmt::format("TEE_OpenPersistentObject(80000001, {}, 0x1)", stored_ksk),
                     "TEE_AllocateTransientObject(a0000004, 256)", "TEE_GenerateKey(object a0000004, 256, none)",
                     "TEE_GetObjectBufferAttribute(object a0000004, c0000000, 32)",
                     fmt::format("TEE_CreatePersistentObject(80000001, {}, 0x1, no attributes, [32])", stored_ksk),
                     "TEE_CloseObject(stored)"} +
           authorization_started));
}

TEST_F(StartOrderTest, ALaterStartReadsTheKeyAndOneByteMore) {
  platform.storage[{TEE_STORAGE_RPMB, from_hex("4b65796d6173746572204b534b00")}] = pattern(32);
  EXPECT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
  EXPECT_EQ(platform.calls(),
            derived_ksk_made +
                (call_list{"TEE_RPMB_MakeFileSystem(0)",
                           fmt::format("TEE_OpenPersistentObject(80000001, {}, 0x1)", stored_ksk),
                           "TEE_ReadObjectData(stored, 32)", "TEE_ReadObjectData(stored, 1)",
                           "TEE_AllocateTransientObject(a0000004, 256)",
                           "TEE_PopulateTransientObject(object a0000004, c0000000=[32])", "TEE_CloseObject(stored)"} +
                 authorization_started));
}

TEST_F(StartOrderTest, WithoutThatStorageNothingIsAskedOfIt) {
  platform.rpmb = false;
  EXPECT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
  EXPECT_EQ(platform.calls(), derived_ksk_made + (call_list{"TEE_RPMB_MakeFileSystem(0)"} + authorization_started));
}

class CallOrderTest : public SecondPlatformTest {};

TEST_F(CallOrderTest, ABlobIsSealedInFourPiecesUnderAFreshKey) {
  const bytes material = pattern(32);
  const command_answer made = keymaster_ta.import_key(hmac_key(), material);
  const std::uint32_t key_data = 8 + 32;  // bits, type, key
  const std::uint32_t blob = u32_at(made.body, 0);
  const std::uint32_t marshalled = blob - 101 - key_data;
  const auto piece = [](const std::string& shown_bytes, std::uint32_t room) {
    return fmt::format("TEE_AEUpdate(operation 40000810, {}, {})", shown_bytes, room);
  };
  EXPECT_EQ(
      platform.calls(),
      (call_list{"TEE_GenerateRandom(64)", "TEE_GenerateRandom(12)"} + blob_cipher_started(TEE_MODE_ENCRYPT) +
       call_list{piece(shown(u32(key_data)), 8 + key_data + marshalled),
                 piece(fmt::format("[{}]", key_data), 4 + key_data + marshalled),
                 piece(shown(u32(marshalled)), 4 + marshalled), piece(fmt::format("[{}]", marshalled), marshalled),
                 "TEE_AEEncryptFinal(operation 40000810, [], 0, 16)"} +
       blob_cipher_ended));
}

TEST_F(CallOrderTest, ABlobIsOpenedInOnePiece) {
  const bytes blob = keymaster_ta.must_generate(aes_key());
  platform.clear();
  EXPECT_EQ(keymaster_ta.characteristics(blob), outcome{});
  EXPECT_EQ(platform.calls(), blob_opened(blob.size()));
}

// A key's material as it is handed to the platform: attributes with their values or lengths.
constexpr const char* populate_aes_key =
    "TEE_PopulateTransientObject(object a0000010, c0000000=[fc1e4174cc1e864ec463002c5796fcbb])";
constexpr const char* populate_rsa_key =
    "TEE_PopulateTransientObject(object a1000030, d0000130=[128] d0000230=[065741] c0000330=[128] c0000430=[64] "
    "c0000530=[64] c0000630=[64] c0000730=[64] c0000830=[64])";
constexpr const char* populate_ec_key =
    "TEE_PopulateTransientObject(object a1000041, d0000141=[32] d0000241=[32] c0000341=[32] f0000441=3,0)";

struct operation_flow {
  std::string name;
  call_list begin;  // behind the opening of the blob
  call_list update;
  call_list finish;
};

const std::vector<operation_flow>& flows() {
  static const std::vector<operation_flow> all = {
      {"aes ecb encrypt",
       {"TEE_AllocateTransientObject(a0000010, 128)", populate_aes_key, "TEE_AllocateOperation(10000010, 0, 128)",
        "TEE_SetOperationKey(operation 10000010, object a0000010)", "TEE_CipherInit(operation 10000010, [])"},
       {"TEE_CipherUpdate(operation 10000010, [48], 4096)"},
       {"TEE_CipherUpdate(operation 10000010, [10101010101010101010101010101010], 16)",
        "TEE_CipherDoFinal(operation 10000010, [], 0)", "TEE_FreeTransientObject(object a0000010)",
        "TEE_FreeOperation(operation 10000010)"}},
      {"aes cbc encrypt",
       {"TEE_AllocateTransientObject(a0000010, 128)", populate_aes_key, "TEE_AllocateOperation(10000110, 0, 128)",
        "TEE_SetOperationKey(operation 10000110, object a0000010)", "TEE_GenerateRandom(16)",
        "TEE_CipherInit(operation 10000110, [4d165bf267d1287beab83451e44d86de])"},
       {"TEE_CipherUpdate(operation 10000110, [48], 4096)"},
       {"TEE_CipherDoFinal(operation 10000110, [], 0)", "TEE_FreeTransientObject(object a0000010)",
        "TEE_FreeOperation(operation 10000110)"}},
      {"aes ctr encrypt",
       {"TEE_AllocateTransientObject(a0000010, 128)", populate_aes_key, "TEE_AllocateOperation(10000210, 0, 128)",
        "TEE_SetOperationKey(operation 10000210, object a0000010)", "TEE_GenerateRandom(16)",
        "TEE_CipherInit(operation 10000210, [4d165bf267d1287beab83451e44d86de])"},
       {"TEE_CipherUpdate(operation 10000210, [48], 4096)"},
       {"TEE_CipherDoFinal(operation 10000210, [], 0)", "TEE_FreeTransientObject(object a0000010)",
        "TEE_FreeOperation(operation 10000210)"}},
      {"aes gcm encrypt",
       {"TEE_AllocateTransientObject(a0000010, 128)", populate_aes_key, "TEE_AllocateOperation(40000810, 0, 128)",
        "TEE_SetOperationKey(operation 40000810, object a0000010)", "TEE_GenerateRandom(12)",
        "TEE_AEInit(operation 40000810, [4d165bf267d1287beab83451], 128, 0, 0)"},
       {"TEE_AEUpdate(operation 40000810, [48], 4096)"},
       {"TEE_AEEncryptFinal(operation 40000810, [], 0, 16)", "TEE_FreeTransientObject(object a0000010)",
        "TEE_FreeOperation(operation 40000810)"}},
      {"aes cbc decrypt",
       {"TEE_AllocateTransientObject(a0000010, 128)", populate_aes_key, "TEE_AllocateOperation(10000110, 1, 128)",
        "TEE_SetOperationKey(operation 10000110, object a0000010)", "TEE_GenerateRandom(16)",
        "TEE_CipherInit(operation 10000110, [4d165bf267d1287beab83451e44d86de])"},
       {"TEE_CipherUpdate(operation 10000110, [48], 4096)"},
       {"TEE_CipherDoFinal(operation 10000110, [], 0)", "TEE_FreeTransientObject(object a0000010)",
        "TEE_FreeOperation(operation 10000110)"}},
      {"aes gcm decrypt",
       {"TEE_AllocateTransientObject(a0000010, 128)", populate_aes_key, "TEE_AllocateOperation(40000810, 1, 128)",
        "TEE_SetOperationKey(operation 40000810, object a0000010)", "TEE_GenerateRandom(12)",
        "TEE_AEInit(operation 40000810, [4d165bf267d1287beab83451], 128, 0, 0)"},
       {"TEE_AEUpdate(operation 40000810, [48], 4096)"},
       {"TEE_AEDecryptFinal(operation 40000810, [], 0, [4995eb9632ba7a8439d7712a14c24ec5])",
        "TEE_FreeTransientObject(object a0000010)", "TEE_FreeOperation(operation 40000810)"}},
      {"rsa sign pkcs1",
       {"TEE_AllocateTransientObject(a1000030, 1024)", populate_rsa_key, "TEE_AllocateOperation(50000004, 5, 0)",
        "TEE_AllocateOperation(70004830, 2, 1024)", "TEE_SetOperationKey(operation 70004830, object a1000030)"},
       {"TEE_DigestUpdate(operation 50000004, [48])"},
       {"TEE_DigestDoFinal(operation 50000004, [], 128)",
        "TEE_AsymmetricSignDigest(operation 70004830, none, [32], 128)", "TEE_FreeTransientObject(object a1000030)",
        "TEE_FreeOperation(operation 50000004)", "TEE_FreeOperation(operation 70004830)"}},
      {"rsa sign pss",
       {"TEE_AllocateTransientObject(a1000030, 1024)", populate_rsa_key, "TEE_AllocateOperation(50000004, 5, 0)",
        "TEE_AllocateOperation(70414930, 2, 1024)", "TEE_SetOperationKey(operation 70414930, object a1000030)"},
       {"TEE_DigestUpdate(operation 50000004, [48])"},
       {"TEE_DigestDoFinal(operation 50000004, [], 128)",
        "TEE_AsymmetricSignDigest(operation 70414930, f0000a30=-1,0, [32], 128)",
        "TEE_FreeTransientObject(object a1000030)", "TEE_FreeOperation(operation 50000004)",
        "TEE_FreeOperation(operation 70414930)"}},
      {"rsa sign raw",
       {"TEE_AllocateTransientObject(a1000030, 1024)", populate_rsa_key, "TEE_AllocateOperation(60000030, 1, 1024)",
        "TEE_SetOperationKey(operation 60000030, object a1000030)"},
       {},
       {"TEE_AsymmetricDecrypt(operation 60000030, none, [128], 128)", "TEE_FreeTransientObject(object a1000030)",
        "TEE_FreeOperation(operation 60000030)"}},
      {"rsa verify pkcs1",
       {"TEE_AllocateTransientObject(a1000030, 1024)", populate_rsa_key, "TEE_AllocateOperation(50000004, 5, 0)",
        "TEE_AllocateOperation(70004830, 3, 1024)", "TEE_SetOperationKey(operation 70004830, object a1000030)"},
       {"TEE_DigestUpdate(operation 50000004, [48])"},
       {"TEE_DigestDoFinal(operation 50000004, [], 128)",
        "TEE_AsymmetricVerifyDigest(operation 70004830, none, [32], [128])", "TEE_FreeTransientObject(object a1000030)",
        "TEE_FreeOperation(operation 50000004)", "TEE_FreeOperation(operation 70004830)"}},
      {"rsa verify raw",
       {"TEE_AllocateTransientObject(a1000030, 1024)", populate_rsa_key, "TEE_AllocateOperation(60000030, 0, 1024)",
        "TEE_SetOperationKey(operation 60000030, object a1000030)"},
       {},
       {"TEE_AsymmetricEncrypt(operation 60000030, none, [128], 128)", "TEE_FreeTransientObject(object a1000030)",
        "TEE_FreeOperation(operation 60000030)"}},
      {"rsa encrypt oaep",
       {"TEE_AllocateTransientObject(a1000030, 1024)", populate_rsa_key, "TEE_AllocateOperation(60412230, 0, 1024)",
        "TEE_SetOperationKey(operation 60412230, object a1000030)"},
       {},
       {"TEE_AsymmetricEncrypt(operation 60412230, none, [48], 128)", "TEE_FreeTransientObject(object a1000030)",
        "TEE_FreeOperation(operation 60412230)"}},
      {"rsa decrypt oaep",
       {"TEE_AllocateTransientObject(a1000030, 1024)", populate_rsa_key, "TEE_AllocateOperation(60412230, 1, 1024)",
        "TEE_SetOperationKey(operation 60412230, object a1000030)"},
       {},
       {"TEE_AsymmetricDecrypt(operation 60412230, none, [128], 128)", "TEE_FreeTransientObject(object a1000030)",
        "TEE_FreeOperation(operation 60412230)"}},
      {"rsa decrypt bare",
       {"TEE_AllocateTransientObject(a1000030, 1024)", populate_rsa_key, "TEE_AllocateOperation(60000030, 1, 1024)",
        "TEE_SetOperationKey(operation 60000030, object a1000030)"},
       {},
       {"TEE_AsymmetricDecrypt(operation 60000030, none, [128], 128)", "TEE_FreeTransientObject(object a1000030)",
        "TEE_FreeOperation(operation 60000030)"}},
      {"ec sign",
       {"TEE_AllocateTransientObject(a1000041, 256)", populate_ec_key, "TEE_AllocateOperation(50000004, 5, 0)",
        "TEE_AllocateOperation(70003041, 2, 256)", "TEE_SetOperationKey(operation 70003041, object a1000041)"},
       {"TEE_DigestUpdate(operation 50000004, [48])"},
       {"TEE_DigestDoFinal(operation 50000004, [], 64)", "TEE_AsymmetricSignDigest(operation 70003041, none, [32], 64)",
        "TEE_FreeTransientObject(object a1000041)", "TEE_FreeOperation(operation 50000004)",
        "TEE_FreeOperation(operation 70003041)"}},
      {"ec verify",
       {"TEE_AllocateTransientObject(a1000041, 256)", populate_ec_key, "TEE_AllocateOperation(50000004, 5, 0)",
        "TEE_AllocateOperation(70003041, 3, 256)", "TEE_SetOperationKey(operation 70003041, object a1000041)"},
       {"TEE_DigestUpdate(operation 50000004, [48])"},
       {"TEE_DigestDoFinal(operation 50000004, [], 64)",
        "TEE_AsymmetricVerifyDigest(operation 70003041, none, [32], [64])", "TEE_FreeTransientObject(object a1000041)",
        "TEE_FreeOperation(operation 50000004)", "TEE_FreeOperation(operation 70003041)"}},
      {"hmac sign",
       {"TEE_AllocateTransientObject(a0000004, 256)", "TEE_PopulateTransientObject(object a0000004, c0000000=[32])",
        "TEE_AllocateOperation(30000004, 4, 256)", "TEE_SetOperationKey(operation 30000004, object a0000004)",
        "TEE_MACInit(operation 30000004, [])"},
       {"TEE_MACUpdate(operation 30000004, [48])"},
       {"TEE_MACComputeFinal(operation 30000004, [], 64)", "TEE_FreeTransientObject(object a0000004)",
        "TEE_FreeOperation(operation 30000004)"}},
      {"hmac verify",
       {"TEE_AllocateTransientObject(a0000004, 256)", "TEE_PopulateTransientObject(object a0000004, c0000000=[32])",
        "TEE_AllocateOperation(30000004, 4, 256)", "TEE_SetOperationKey(operation 30000004, object a0000004)",
        "TEE_MACInit(operation 30000004, [])"},
       {"TEE_MACUpdate(operation 30000004, [48])"},
       {"TEE_MACComputeFinal(operation 30000004, [], 64)", "TEE_FreeTransientObject(object a0000004)",
        "TEE_FreeOperation(operation 30000004)"}},
  };
  return all;
}

const scenario& named(const std::string& name) {
  for (const scenario& each : scenarios()) {
    if (each.name == name) return each;
  }
  throw std::out_of_range(name);
}

TEST_F(CallOrderTest, EveryOperationGoesItsFixedWay) {
  for (const operation_flow& flow : flows()) {
    SCOPED_TRACE(flow.name);
    TA_DestroyEntryPoint();
    power_on();  // the random numbers of a fresh device are those of the table
    ASSERT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
    const bytes blob = named("begin " + flow.name).prepare(keymaster_ta);
    platform.clear();
    const std::uint32_t first = named("update " + flow.name).begin(keymaster_ta, blob);
    // The handle in the pool is the last that a begin asks for.
    call_list begin = flow.begin;
    begin.emplace_back("TEE_GenerateRandom(4)");
    call_list begun = platform.calls();
    const auto behind = static_cast<std::ptrdiff_t>(blob_opened(blob.size()).size());
    ASSERT_GT(begun.size(), static_cast<std::size_t>(behind));
    EXPECT_EQ(call_list(begun.begin() + behind, begun.end()), begin);
    platform.clear();
    EXPECT_EQ(named("update " + flow.name).command(keymaster_ta, blob, first), outcome{});
    EXPECT_EQ(platform.calls(), flow.update);
    platform.clear();
    EXPECT_EQ(named("finish " + flow.name).command(keymaster_ta, blob, first), outcome{});
    EXPECT_EQ(platform.calls(), flow.finish);
  }
}

TEST_F(CallOrderTest, TheSoterResourcesAreAskedForOneByOneAndEachInASessionOfItsOwn) {
  EXPECT_EQ(keymaster_ta.soter(KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR), outcome{});
  EXPECT_THAT(platform.calls(), ElementsAreArray({
                                    "TEE_OpenTASession(d625ee97, 0xffffffff, 0x0, no origin)",
                                    "TEE_InvokeTACommand(0xffffffff, 2, 0x26, [], 8192, no origin)",
                                    "TEE_CloseTASession()",
                                    "TEE_OpenTASession(d625ee97, 0xffffffff, 0x0, no origin)",
                                    "TEE_InvokeTACommand(0xffffffff, 12, 0x65, [34180000], 512, no origin)",
                                    "TEE_CloseTASession()",
                                    "TEE_OpenTASession(d625ee97, 0xffffffff, 0x0, no origin)",
                                    "TEE_InvokeTACommand(0xffffffff, 12, 0x65, [34173a17], 64, no origin)",
                                    "TEE_CloseTASession()",
                                    "TEE_GetPropertyAsString(gpd.tee.trustedos.manufacturer, 64)",
                                    "TEE_GetPropertyAsString(gpd.tee.trustedos.implementation.version, 64)",
                                }));
}

TEST_F(CallOrderTest, TheDeviceIdIsAskedForEachTimeWithTheRoomOfTheClient) {
  EXPECT_EQ(keymaster_ta.soter(KM_COMMAND_SOTER_GET_DEVICE_ID), outcome{});
  EXPECT_THAT(platform.calls(), ElementsAreArray({
                                    "TEE_OpenTASession(d625ee97, 0xffffffff, 0x0, no origin)",
                                    "TEE_InvokeTACommand(0xffffffff, 12, 0x65, [34193619], 4096, no origin)",
                                    "TEE_CloseTASession()",
                                }));
}

/// The calls from the opening of the stored counter to its closing.
call_list counter_calls() {
  const call_list& all = platform.calls();
  const auto is_open = [](const std::string& call) { return call.starts_with("TEE_OpenPersistentObject"); };
  const auto first = std::find_if(all.begin(), all.end(), is_open);
  const auto last = std::find(first, all.end(), "TEE_CloseObject(stored)");
  return {first, last == all.end() ? last : last + 1};
}

TEST_F(CallOrderTest, TheCounterIsMadeOnceAndThenWrittenInPlace) {
  const bytes blob = keymaster_ta.must_generate(soter_key());
  platform.clear();
  EXPECT_EQ(keymaster_ta.export_key(blob), outcome{});
  EXPECT_THAT(counter_calls(), ElementsAreArray({
                                   "TEE_OpenPersistentObject(00000001, [21], 0x3)",
                                   "TEE_CreatePersistentObject(00000001, [21], 0x3, no attributes, [0000000000000000])",
                                   "TEE_ReadObjectData(stored, 8)",
                                   "TEE_SeekObjectData(stored, 0, 0)",
                                   "TEE_WriteObjectData(stored, [0100000000000000])",
                                   "TEE_CloseObject(stored)",
                               }));
  platform.clear();
  EXPECT_EQ(keymaster_ta.export_key(blob), outcome{});
  EXPECT_THAT(counter_calls(), ElementsAreArray({
                                   "TEE_OpenPersistentObject(00000001, [21], 0x3)",
                                   "TEE_ReadObjectData(stored, 8)",
                                   "TEE_SeekObjectData(stored, 0, 0)",
                                   "TEE_WriteObjectData(stored, [0200000000000000])",
                                   "TEE_CloseObject(stored)",
                               }));
}

}  // namespace
}  // namespace second_platform
