// Freed memory keeps no secrets: no part of a private key, no key storage key, no key of a blob, no boot seed.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/commands/hostile/freed_memory.h"
#include "tests/commands/sealed_blob.h"
#include "tests/support/issued_token.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr const char* private_names[] = {"", "", "d", "p", "q", "d mod (p-1)", "d mod (q-1)", "q^-1 mod p"};

class SecretsTest : public CommandTest {
 protected:
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  const param_list pkcs1 = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
  const param_list raw = signature(KM_DIGEST_NONE, KM_PAD_NONE);
  const param_list raw_pkcs1 = signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN);
  const param_list pss = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS);
  freed_memory freed{tee.world()};

  /// expect_no_secrets looks at all that was freed: for the device's secrets, and those of these blobs.
  void expect_no_secrets(const std::vector<bytes>& blobs) {
    const bytes ksk = stored_ksk();
    const auto seed = tee.world().boot_seed();
    EXPECT_FALSE(freed.holds(ksk)) << "the key storage key";
    EXPECT_FALSE(freed.holds({seed.begin(), seed.end()})) << "the boot seed";
    for (const bytes& blob : blobs) {
      EXPECT_FALSE(freed.holds(blob_key(ksk, blob))) << "the key of a blob";
      if (const auto plaintext = open_blob(ksk, blob)) expect_no_private_parts(*plaintext);
    }
    expect_no_private_parts(join({u32(0), u32(0), key.material()}));
    freed.clear();
  }

 private:
  /// The components behind the public ones in a blob's plaintext: the words of the two sizes come first.
  void expect_no_private_parts(const bytes& plaintext) {
    std::size_t at = 8;
    for (std::size_t component = 0; component < std::size(private_names); ++component) {
      const std::uint32_t length = u32_at(plaintext, at);
      const auto begin = plaintext.begin() + static_cast<std::ptrdiff_t>(at) + 4;
      if (component >= rsa_d) {
        EXPECT_FALSE(freed.holds({begin, begin + length})) << private_names[component];
      }
      at += 4 + length;
    }
  }
};

TEST_F(SecretsTest, TheWatchSeesWhatIsNotWiped) {
  // A blob is no secret, and the TA frees its copy as it is.
  const bytes blob = import_fixed(1024);
  freed.clear();
  EXPECT_TRUE(client().characteristics(blob).ok());
  EXPECT_TRUE(freed.holds(blob));
  EXPECT_GT(freed.blocks(), 3U);
}

TEST_F(SecretsTest, StartingAndEndingTheInstanceLeavesNone) {
  tee.close_session();
  tee.open_session();
  expect_no_secrets({});
}

TEST_F(SecretsTest, TheDerivedKeyStorageKeyIsLeftNowhereEither) {
  // The device identifier as it lies in memory, filled up with one byte: the part that makes it a key of this system.
  const TEE_UUID id = tee.world().device_id();
  const auto* const id_bytes = reinterpret_cast<const std::uint8_t*>(&id);
  const bytes derived_ksk = join({bytes(id_bytes, id_bytes + sizeof id), bytes(16, 0x5A)});
  tee.close_session();
  tee.world().faults().fail_call("TEE_RPMB_MakeFileSystem", 1, TEE_ERROR_NOT_SUPPORTED);
  tee.open_session();
  const bytes blob = import_fixed(1024);
  ASSERT_EQ(blob.front(), sealed_by_derived_ksk);
  ASSERT_TRUE(open_blob(derived_ksk, blob).has_value());
  EXPECT_TRUE(client().sign(blob, pss, from_text("message")).ok());
  EXPECT_FALSE(freed.holds(derived_ksk));
  EXPECT_FALSE(freed.holds(blob_key(derived_ksk, blob)));
}

TEST_F(SecretsTest, MakingAKeyLeavesNone) {
  const bytes generated = client().must_generate(rsa_key(1024));
  expect_no_secrets({generated});
  const bytes imported = import_fixed(1024);
  expect_no_secrets({imported});
}

TEST_F(SecretsTest, AKeyThatCantBeHandedOutLeavesNone) {
  param_list twice = rsa_key(1024);
  twice.add(KM_TAG_BLOB_USAGE_REQUIREMENTS).add(KM_TAG_BLOB_USAGE_REQUIREMENTS);
  EXPECT_FALSE(client().import_key(twice, key.material()).ok());
  EXPECT_FALSE(client().import_key(rsa_key(2048), key.material()).ok());
  EXPECT_FALSE(client().import_key(rsa_key(1024).add(KM_TAG_ORIGIN), key.material()).ok());
  bytes cut = key.material();
  cut.pop_back();
  EXPECT_FALSE(client().import_key(rsa_key(1024), cut).ok());
  for (const std::size_t capacity : {0U, 100U, 1200U}) {
    EXPECT_FALSE(client().import_key(rsa_key(1024), key.material(), capacity).ok());
  }
  expect_no_secrets({});
}

TEST_F(SecretsTest, LookingAtAKeyLeavesNone) {
  // Knowing the application's id and data is what opens the key: they are secrets too.
  const bytes id = from_text("the id of an application"), data = from_text("what the application adds");
  const bytes blob =
      import_fixed(1024, rsa_key(1024).add_blob(KM_TAG_APPLICATION_ID, id).add_blob(KM_TAG_APPLICATION_DATA, data));
  freed.clear();
  EXPECT_TRUE(client().characteristics_size(blob, id, data).ok());
  EXPECT_TRUE(client().characteristics(blob, id, data).ok());
  EXPECT_TRUE(client().export_key(blob, id, data).ok());
  EXPECT_FALSE(client().characteristics(blob).ok());
  EXPECT_FALSE(client().characteristics(blob, data, id).ok());
  EXPECT_FALSE(client().characteristics(blob, id, data, 3).ok());
  EXPECT_FALSE(client().export_key(blob, id, data, 3).ok());
  EXPECT_TRUE(client().delete_key(blob).ok());
  EXPECT_FALSE(freed.holds(id));
  EXPECT_FALSE(freed.holds(data));
  expect_no_secrets({blob});
}

TEST_F(SecretsTest, ABlobWhoseTagWasForgedIsDecryptedAndLeavesNone) {
  const bytes blob = import_fixed(1024);
  freed.clear();
  EXPECT_FALSE(client().export_key(flip(blob, 77)).ok());
  EXPECT_FALSE(client().begin(KM_PURPOSE_SIGN, flip(blob, 92), raw).ok());
  EXPECT_FALSE(client().characteristics_size(flip(blob, blob.size() - 1)).ok());
  expect_no_secrets({blob});
}

TEST_F(SecretsTest, WholeOperationsLeaveNone) {
  const bytes blob = import_fixed(1024), message = from_text("message");
  freed.clear();
  for (const param_list& scheme : {pkcs1, pss, raw, raw_pkcs1}) {
    const finish_answer made = client().sign(blob, scheme, message);
    EXPECT_TRUE(made.ok());
    (void)client().verify(blob, scheme, message, made.data);
    (void)client().verify(blob, scheme, message, flip(made.data, 5));
    expect_no_secrets({blob});
  }
}

TEST_F(SecretsTest, OperationsThatFailOrAreAbortedLeaveNone) {
  const bytes blob = import_fixed(1024);
  freed.clear();
  EXPECT_TRUE(client().abort(client().must_begin(KM_PURPOSE_SIGN, blob, pkcs1)).ok());
  EXPECT_FALSE(client().update(client().must_begin(KM_PURPOSE_SIGN, blob, raw), bytes(129)).ok());
  EXPECT_FALSE(client().finish(client().must_begin(KM_PURPOSE_SIGN, blob, raw), {}, {}, 20).ok());
  EXPECT_FALSE(client().begin(KM_PURPOSE_SIGN, blob, pkcs1, 0).ok());
  EXPECT_FALSE(client().begin(KM_PURPOSE_SIGN, blob, {}).ok());
  EXPECT_FALSE(client().begin(KM_PURPOSE_SIGN, blob, signature(KM_DIGEST_MD5, KM_PAD_NONE)).ok());
  for (int i = 0; i < 16; ++i) (void)client().must_begin(KM_PURPOSE_SIGN, blob, raw);
  EXPECT_FALSE(client().begin(KM_PURPOSE_SIGN, blob, raw).ok());
  tee.close_session();
  expect_no_secrets({blob});
}

TEST_F(SecretsTest, AuthTokensLeaveTheirMacNowhere) {
  const bytes blob = import_fixed(
      1024, rsa_key(1024).remove(KM_TAG_NO_AUTH_REQUIRED).add(KM_TAG_USER_SECURE_ID, 5).add(KM_TAG_USER_AUTH_TYPE, 1));
  const bytes token = issued_token{.user_id = 5}.issue(tee.world().boot_seed());
  freed.clear();
  param_list params = pkcs1;
  EXPECT_TRUE(client().begin(KM_PURPOSE_SIGN, blob, params.add_blob(KM_TAG_AUTH_TOKEN, token)).ok());
  EXPECT_FALSE(freed.holds({token.end() - 32, token.end()}));
  expect_no_secrets({blob});
}

TEST_F(SecretsTest, WhateverFailsBelowLeavesNone) {
  hosted_tee::fault_plan& faults = tee.world().faults();
  const bytes blob = import_fixed(1024);
  const std::vector<std::function<void()>> commands = {
      [&] { (void)client().import_key(rsa_key(1024), key.material()); },
      [&] { (void)client().export_key(blob); },
      [&] { (void)client().sign(blob, pss, from_text("message")); },
      [&] { (void)client().sign(blob, raw, from_text("message")); },
  };
  for (std::size_t command = 0; command < commands.size(); ++command) {
    faults.clear();
    commands[command]();
    const std::uint32_t allocations = faults.allocations(), calls = faults.fallible_calls();
    freed.clear();
    for (std::uint32_t n = 1; n <= allocations; ++n) {
      faults.clear();
      faults.fail_allocation(n);
      commands[command]();
    }
    for (std::uint32_t n = 1; n <= calls; ++n) {
      faults.clear();
      faults.fail_any_call(n, TEE_ERROR_GENERIC);
      commands[command]();
    }
    SCOPED_TRACE(fmt::format("command {}, {} allocations, {} calls", command, allocations, calls));
    expect_no_secrets({blob});
  }
}

}  // namespace
}  // namespace testing_support
