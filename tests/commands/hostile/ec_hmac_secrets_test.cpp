// Freed memory keeps nothing of EC and HMAC keys, nor of a MAC that a client has to know.
#include <fmt/format.h>

#include <functional>

#include "tests/commands/command_fixture.h"
#include "tests/commands/hostile/freed_memory.h"
#include "tests/commands/sealed_blob.h"
#include "tests/support/ec_test_key.h"
#include "tests/support/hmac_test_key.h"
#include "tests/support/libcrypto_digest.h"

using namespace keymaster;

namespace testing_support {
namespace {

class EcHmacSecretsTest : public CommandTest {
 protected:
  const ec_test_key& pair = ec_test_key::of_bits(384);
  const bytes mac_key = pattern(64, 99);
  const bytes message = from_text("the message");
  const bytes mac = hmac_of(KM_DIGEST_SHA_2_512, mac_key, message);
  const bytes ec_blob = client().must_import(ec_key(384), pair.material());
  const bytes hmac_blob = client().must_import(hmac_key(KM_DIGEST_SHA_2_512, 512), mac_key);
  freed_memory freed{tee.world()};

  void expect_no_secrets() {
    EXPECT_FALSE(freed.holds(pair.fields().d)) << "the private value";
    EXPECT_FALSE(freed.holds(mac_key)) << "the HMAC key";
    freed.clear();
  }

  void ec_sign() { (void)client().sign(ec_blob, ec_digest(KM_DIGEST_SHA_2_512), message); }
  void ec_verify() {
    (void)client().verify(ec_blob, ec_digest(KM_DIGEST_SHA_2_512), message, pair.sign(KM_DIGEST_SHA_2_512, message));
  }
  void hmac_sign() { (void)client().sign(hmac_blob, hmac_length(512), message); }
  void hmac_verify(const bytes& given) { (void)client().verify(hmac_blob, hmac_length(512), message, given); }
};

TEST_F(EcHmacSecretsTest, MakingKeysLeavesNone) {
  for (const param_list& params : {ec_key(384), ec_key(521), hmac_key(KM_DIGEST_SHA_2_256, 256)}) {
    const bytes blob = client().must_generate(params);
    const bytes plaintext = open_blob(stored_ksk(), blob).value();
    const std::span<const std::uint8_t> key_data = std::span(plaintext).subspan(4, u32_at(plaintext, 0));
    if (params.value(KM_TAG_ALGORITHM) == KM_ALGORITHM_EC) {
      EXPECT_FALSE(freed.holds(ec_fields::parse(key_data, true).d));
    } else {
      EXPECT_FALSE(freed.holds({key_data.begin() + 8, key_data.end()}));
    }
  }
  EXPECT_TRUE(client().import_key(ec_key(384), pair.material()).ok());
  EXPECT_FALSE(client().import_key(ec_key(256), pair.material()).ok());
  EXPECT_FALSE(client().import_key(ec_key(384), pair.material(), 20).ok());
  EXPECT_TRUE(client().import_key(hmac_key(KM_DIGEST_SHA_2_512, 512), mac_key).ok());
  EXPECT_FALSE(client().import_key(hmac_key(KM_DIGEST_SHA_2_512, 504), mac_key).ok());
  EXPECT_FALSE(client().import_key(hmac_key(KM_DIGEST_SHA_2_512, 512), mac_key, 20).ok());
  expect_no_secrets();
}

TEST_F(EcHmacSecretsTest, WholeOperationsLeaveNone) {
  ec_sign();
  ec_verify();
  hmac_sign();
  hmac_verify(mac);
  EXPECT_TRUE(client().export_key(ec_blob).ok());
  EXPECT_TRUE(client().abort(client().must_begin(KM_PURPOSE_SIGN, ec_blob, ec_digest(KM_DIGEST_NONE))).ok());
  EXPECT_TRUE(client().abort(client().must_begin(KM_PURPOSE_SIGN, hmac_blob, hmac_length(64))).ok());
  expect_no_secrets();
}

TEST_F(EcHmacSecretsTest, AMacThatTheClientDidNotKnowStaysUnknown) {
  hmac_verify(bytes(64));
  hmac_verify({});
  EXPECT_FALSE(freed.holds(mac));
  hmac_sign();
  EXPECT_FALSE(freed.holds(mac));
}

TEST_F(EcHmacSecretsTest, WhateverFailsBelowLeavesNone) {
  hosted_tee::fault_plan& faults = tee.world().faults();
  const std::vector<std::function<void()>> commands = {
      [&] { ec_sign(); },
      [&] { ec_verify(); },
      [&] { hmac_sign(); },
      [&] { hmac_verify(bytes(64)); },
      [&] { (void)client().import_key(ec_key(384), pair.material()); },
      [&] { (void)client().import_key(hmac_key(KM_DIGEST_SHA_2_512, 512), mac_key); },
  };
  const hosted_tee::accounting before = tee.accounting();
  for (std::size_t command = 0; command < commands.size(); ++command) {
    faults.clear();
    commands[command]();
    const std::uint32_t allocations = faults.allocations(), calls = faults.fallible_calls();
    SCOPED_TRACE(fmt::format("command {}, {} allocations, {} calls", command, allocations, calls));
    freed.clear();
    for (std::uint32_t n = 1; n <= allocations; ++n) {
      faults.clear();
      faults.fail_allocation(n);
      commands[command]();
      EXPECT_TRUE(faults.triggered());
      expect_same(before);
    }
    for (std::uint32_t n = 1; n <= calls; ++n) {
      faults.clear();
      faults.fail_any_call(n, TEE_ERROR_GENERIC);
      commands[command]();
      EXPECT_TRUE(faults.triggered());
      expect_same(before);
    }
    EXPECT_FALSE(freed.holds(mac));
    expect_no_secrets();
  }
}

}  // namespace
}  // namespace testing_support
