// A platform that reports more than there was room for. Whatever it claims, the TA reads and writes within its blocks,
// gives back all that it took, and answers as the table says.
#include <fmt/format.h>
#include <fnmatch.h>

#include <set>

#include "tests/second_platform/scenario.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::IsEmpty;

namespace second_platform {
namespace {

/// What becomes of a lie: by the function that tells it and the commands in which it does. The first row that fits
/// counts.
struct expectation {
  std::string function;
  std::string scenarios;  // a pattern of names
  outcome answer;
  std::string line;  // how the first error line begins; none where the lie is clipped and does no harm
  bool tag = false;  // the length is the tag's
  bool huge = false;
};

bool matches(const std::string& pattern, const std::string& name) {
  return fnmatch(pattern.c_str(), name.c_str(), FNM_EXTMATCH) == 0;
}

constexpr outcome unknown = {TEE_SUCCESS, KM_ERROR_UNKNOWN_ERROR};
constexpr outcome generic = {TEE_ERROR_GENERIC, KM_ERROR_UNKNOWN_ERROR};
constexpr outcome fine = {};

const std::vector<expectation>& expectations() {
  static const std::vector<expectation> table = {
      // sealing and opening blobs
      {"TEE_MACComputeFinal",
       "@(generate|import|begin|characteristics|export)*",
       {TEE_ERROR_BAD_PARAMETERS, KM_ERROR_UNKNOWN_ERROR},
       "TEE_DeriveKK: Wrong MAC length, expected 32B, got "},
      {"TEE_AEUpdate", "@(generate|import) *", generic, "refuse_total: Unmatched total size, expected: "},
      {"TEE_AEEncryptFinal", "@(generate|import) *", generic, "refuse_total: Unmatched total size, expected: "},
      {"TEE_AEEncryptFinal", "@(generate|import) *", generic, "finish_encryption: Wrong tag size, expect 16B, got ",
       true},
      {"TEE_AEUpdate", "@(begin|export|characteristics)*", unknown, "decrypt: Too short output of AES, expect "},
      {"TEE_AEDecryptFinal", "@(begin|export|characteristics)*", unknown, "decrypt: Too short output of AES, expect "},
      // reading generated keys: measured, then read
      {"TEE_GetObjectBufferAttribute",
       "generate rsa",
       {TEE_ERROR_OUT_OF_MEMORY, KM_ERROR_UNKNOWN_ERROR},
       "generate: Out of memory",
       false,
       true},
      {"TEE_GetObjectBufferAttribute", "generate *", unknown, "generate: Out of memory", false, true},
      {"TEE_GetObjectBufferAttribute", "generate *", unknown, "write_attribute: Buffer size modified, before "},
      // AES
      {"TEE_CipherUpdate", "update aes * encrypt", unknown, "run_update: Update failed"},
      {"TEE_CipherUpdate", "update aes * decrypt", generic, "run_update: Update failed"},
      {"TEE_CipherUpdate", "finish aes ecb encrypt", unknown,
       "encrypt_padding: Padding input got wrong output length "},
      {"TEE_CipherDoFinal", "finish aes *", unknown, "end_cipher: CipherDoFinal make output "},
      {"TEE_AEUpdate", "update aes gcm encrypt", unknown, "run_update: Update failed"},
      {"TEE_AEUpdate", "update aes gcm decrypt", generic, "run_update: Update failed"},
      {"TEE_AEEncryptFinal", "finish aes gcm encrypt", unknown, "make_tag: AEEncryptFinal make wrong tag size ", true},
      {"TEE_AEEncryptFinal", "finish aes gcm encrypt", unknown, "make_tag: AEEncryptFinal make output "},
      {"TEE_AEDecryptFinal", "finish aes gcm decrypt", unknown, "judge_tag: AEEncryptFinal make output "},
      // digests and MACs: what an ECDSA key doesn't take is cut, and of a MAC there is never more than 64 bytes
      {"TEE_DigestDoFinal", "finish rsa *", generic, "finish_digest: DigestDoFinal failed with 0xffff0000\n"},
      {"TEE_DigestDoFinal", "finish soter sign", unknown,
       "soter_do_sign_finish: DigestDoFinal failed with 0xffff0000\n"},
      {"TEE_DigestDoFinal", "export soter", generic, "do_digest_with_sha: TEE_DigestDoFinal failed: ffff0000\n"},
      {"TEE_DigestDoFinal", "finish ec *", fine, ""},
      {"TEE_MACComputeFinal", "finish hmac *", fine, ""},
      {"TEE_MACComputeFinal",
       "update with token",
       {TEE_SUCCESS, KM_ERROR_INVALID_ARGUMENT},
       "ComputeSignature: Wrong MAC length, expected 32B, got "},
      // RSA results are as long as the modulus, whatever the platform says
      {"TEE_AsymmetricSignDigest", "finish rsa *", fine, ""},
      {"TEE_AsymmetricDecrypt", "finish rsa *", fine, ""},
      {"TEE_AsymmetricEncrypt",
       "finish rsa verify raw",
       {TEE_SUCCESS, KM_ERROR_VERIFICATION_FAILED},
       "run_finish: Finish failed"},
      {"TEE_AsymmetricEncrypt", "finish rsa *", fine, ""},
      {"TEE_AsymmetricSignDigest", "finish ec sign", unknown, "run_finish: Finish failed"},
      {"TEE_AsymmetricSignDigest", "finish soter sign", unknown,
       "soter_do_sign_finish: AsymmetricSignDigest failed with 0xffff0000\n"},
      {"TEE_AsymmetricSignDigest", "export soter", generic,
       "do_sign_with_rsa: TEE_AsymmetricSignDigest failed: ffff0000\n"},
      {"TEE_AsymmetricExport", "export rsa", unknown, "export_public_key: Export key failed"},
      {"TEE_AsymmetricExport", "export soter", generic,
       "export_rsa_public_key: TEE_AsymmetricExport failed: ffff0000\n"},
      {"TEE_AsymmetricExport", "soter export attk", unknown,
       "export_rsa_public_key: TEE_AsymmetricExport failed: ffff0000\n"},
      // the provisioning TA, properties and the counter
      {"TEE_InvokeTACommand", "begin soter sign", unknown,
       "prepare_soter: soter resources is not ready, error 0xffff0010\n"},
      {"TEE_InvokeTACommand",
       "export soter",
       {TEE_ERROR_SHORT_BUFFER, KM_ERROR_UNKNOWN_ERROR},
       "choose_signer: soter is not ready\n"},
      {"TEE_InvokeTACommand", "soter generate attk", unknown,
       "soter_handle_generate_attk_key_pair: attk_key_pair is not produced\n"},
      {"TEE_InvokeTACommand", "soter verify attk", {TEE_SUCCESS, SOTER_STATUS_UNREADABLE_ATTK}, ""},
      {"TEE_InvokeTACommand", "soter export attk", {TEE_SUCCESS, SOTER_STATUS_NO_ATTK}, ""},
      {"TEE_InvokeTACommand", "soter device id", {TEE_SUCCESS, KM_ERROR_INSUFFICIENT_BUFFER_SPACE}, ""},
      {"TEE_GetPropertyAsString", "*soter*", fine, ""},
      {"TEE_ReadObjectData", "finish soter sign", unknown, "increase_and_get_counter: counter object is not 8 bytes, "},
      {"TEE_ReadObjectData",
       "export soter",
       {TEE_ERROR_BAD_STATE, KM_ERROR_UNKNOWN_ERROR},
       "increase_and_get_counter: counter object is not 8 bytes, "},
  };
  return table;
}

std::set<std::string> reporting_functions() {
  std::set<std::string> names;
  for (const expectation& row : expectations()) names.insert(row.function);
  return names;
}

struct lie {
  std::string function;
  std::uint32_t nth;
  bool tag;
  std::uint32_t beyond;
};

/// Every length that the command is told, with a little too much and with far too much.
std::vector<lie> lies_of(const std::vector<std::string>& calls) {
  std::map<std::string, std::uint32_t> counts;
  std::vector<lie> lies;
  const std::set<std::string> reporting = reporting_functions();
  for (const std::string& name : calls) {
    if (!reporting.contains(name)) continue;
    const std::uint32_t nth = ++counts[name];
    for (const std::uint32_t beyond : {1U, 0x1000U, UINT32_MAX}) {
      lies.push_back({name, nth, false, beyond});
      if (name == "TEE_AEEncryptFinal") lies.push_back({name, nth, true, beyond});
    }
  }
  return lies;
}

class LyingLengthTest : public ::testing::Test {
 protected:
  /// Runs a scenario from the start of a device to the end of the TA; `told` is the lie, or none.
  command_answer run(const scenario& tested, const lie* told) {
    power_on();
    EXPECT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
    const bytes blob = tested.prepare(keymaster_ta);
    const std::uint32_t handle = tested.begin(keymaster_ta, blob);
    platform.clear();
    twist departure;
    if (told != nullptr) {
      departure.beyond_capacity = told->beyond;
      departure.second_length = told->tag;
      platform.answer(told->function, told->nth, departure);
    }
    command_answer answer = tested.command(keymaster_ta, blob, handle);
    calls_ = platform.names();
    errors_ = platform.errors();
    if (handle != 0) (void)keymaster_ta.abort(handle);
    TA_DestroyEntryPoint();
    EXPECT_EQ(platform.held(), (holdings{0, 2, 0, 0}));
    EXPECT_THAT(platform.violations(), IsEmpty());
    return answer;
  }

  void expect_row(const scenario& tested, const lie& told, const command_answer& answer) {
    for (std::size_t i = 0; i < expectations().size(); ++i) {
      const expectation& row = expectations()[i];
      if (row.function != told.function || row.tag != told.tag || (row.huge && told.beyond != UINT32_MAX)) continue;
      if (!matches(row.scenarios, tested.name)) continue;
      // A huge length is met when the key is measured, and not when it is read.
      if (row.huge && (errors_.empty() || errors_[0].find("Out of memory") == std::string::npos)) continue;
      used_.insert(i);
      EXPECT_EQ(static_cast<const outcome&>(answer), row.answer);
      EXPECT_EQ(errors_.empty() ? "" : errors_[0].substr(0, row.line.size()), row.line);
      return;
    }
    ADD_FAILURE() << "the table says nothing of this";
  }

  ta keymaster_ta;
  std::vector<std::string> calls_, errors_;
  std::set<std::size_t> used_;
};

TEST_F(LyingLengthTest, EveryLengthBeyondItsBufferIsCaughtInEveryCommandThatIsToldIt) {
  for (const scenario& tested : scenarios()) {
    EXPECT_EQ(run(tested, nullptr), fine) << tested.name;
    for (const lie& told : lies_of(calls_)) {
      SCOPED_TRACE(fmt::format("{}: {} no. {}{}, {:#x} too many", tested.name, told.function, told.nth,
                               told.tag ? " (tag)" : "", told.beyond));
      expect_row(tested, told, run(tested, &told));
    }
  }
  for (std::size_t i = 0; i < expectations().size(); ++i) {
    EXPECT_TRUE(used_.contains(i)) << expectations()[i].function << " in " << expectations()[i].scenarios;
  }
}

TEST_F(LyingLengthTest, LiesThroughoutTheReadingOfAKeyStayWithinItsData) {
  for (const std::uint32_t beyond : {1U, 0x1000U, UINT32_MAX}) {
    for (const param_list& params : {rsa_key(), ec_key(), ec_key(521), aes_key(), hmac_key()}) {
      power_on();
      ASSERT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
      twist always;
      always.beyond_capacity = beyond;
      platform.answer("TEE_GetObjectBufferAttribute", 0, always);
      EXPECT_NE(keymaster_ta.generate(params), fine);
      TA_DestroyEntryPoint();
      EXPECT_EQ(platform.held(), (holdings{0, 2, 0, 0}));
      EXPECT_THAT(platform.violations(), IsEmpty());
    }
  }
}

TEST_F(LyingLengthTest, AFreshKeyStorageKeyOfAnotherLengthFailsTheStart) {
  for (const std::uint32_t beyond : {1U, UINT32_MAX}) {
    power_on();
    twist departure;
    departure.beyond_capacity = beyond;
    platform.answer("TEE_GetObjectBufferAttribute", 1, departure);
    EXPECT_EQ(TA_CreateEntryPoint(), TEE_ERROR_GENERIC);
    EXPECT_EQ(platform.errors()[0].find("create_rpmb_ksk: Wrong key size, expected 32B, got "), 0U);
    EXPECT_THAT(platform.storage, IsEmpty());
    EXPECT_EQ(platform.held(), holdings{});
    EXPECT_THAT(platform.violations(), IsEmpty());
  }
}

TEST_F(LyingLengthTest, AStoredKeyStorageKeyThatReadsTooLongIsDeleted) {
  for (const std::uint32_t nth : {1U, 2U}) {
    power_on();
    platform.storage[{TEE_STORAGE_RPMB, bytes{'K', 'e', 'y', 'm', 'a', 's', 't', 'e', 'r', ' ', 'K', 'S', 'K', 0}}] =
        pattern(32);
    twist departure;
    departure.beyond_capacity = 1;
    platform.answer("TEE_ReadObjectData", nth, departure);
    EXPECT_EQ(TA_CreateEntryPoint(), TEE_Result{0xF0100001});
    EXPECT_THAT(platform.storage, IsEmpty());
    EXPECT_EQ(platform.held(), holdings{});
    EXPECT_THAT(platform.violations(), IsEmpty());
  }
}

}  // namespace
}  // namespace second_platform
