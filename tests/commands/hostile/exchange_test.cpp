// A client that exchanges a part of its request in the middle of a command, right before each of the platform calls in
// turn. The TA may take the one or the other, whole; from the first call that works with it, it is the first one.
#include <algorithm>
#include <functional>

#include "tests/commands/command_fixture.h"
#include "tests/commands/raw_session.h"
#include "tests/commands/sealed_blob.h"
#include "tests/support/ec_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

enum class taken { first, second, neither };

/// The calls that a command makes before it works with what it was given.
bool is_preparation(std::string_view call) {
  constexpr std::string_view preparations[] = {"TEE_Malloc", "TEE_Realloc", "TEE_Free", "tee_trace"};
  return std::find(std::begin(preparations), std::end(preparations), call) != std::end(preparations);
}

class ExchangeTest : public CommandTest {
 protected:
  hosted_tee::fault_plan& faults = tee.world().faults();
  bytes response = bytes(8192);

  using arm = std::function<void()>;

  /// sweep plays once for each platform call of a command. `play(request, armed)` calls `armed` right before the
  /// command that it runs on `request`, and tells which of the two requests was taken.
  void sweep(const bytes& first, const bytes& second,
             const std::function<taken(bytes& request, const arm& armed)>& play) {
    ASSERT_EQ(first.size(), second.size());
    bool settled = false, is_working = false;
    for (std::uint32_t n = 1;; ++n) {
      bytes request = first;
      std::string before;
      const taken got = play(request, [&] {
        faults.clear();
        faults.observe_calls([&](std::uint32_t number, std::string_view call) {
          if (number != n) return;
          before = call;
          std::copy(second.begin(), second.end(), request.begin());
        });
      });
      if (before.empty()) break;  // the command has fewer calls
      SCOPED_TRACE(before + ", which is call " + std::to_string(n));
      EXPECT_NE(got, taken::neither);
      is_working = is_working || !is_preparation(before);
      settled = settled || is_working || got == taken::first;
      EXPECT_TRUE(!settled || got == taken::first);
      EXPECT_TRUE(n != 1 || got == taken::second) << "the sweep must begin before the request is read";
    }
    EXPECT_TRUE(is_working);
  }

  raw_answer call(std::uint32_t command, std::uint32_t a, bytes& request, const arm& armed = {}) {
    raw_session session(tee.world());
    std::fill(response.begin(), response.end(), canary);
    if (armed) armed();
    const raw_answer got = session.call(command, a, memref(request), memref(response));
    faults.clear();
    return got;
  }
  bytes body(const raw_answer& got) const {
    EXPECT_EQ(got.result, TEE_SUCCESS);
    EXPECT_EQ(got.error, KM_ERROR_OK);
    return {response.begin(), response.begin() + static_cast<std::ptrdiff_t>(got.size)};
  }
};

TEST_F(ExchangeTest, TheUseOfABlobIsCountedForTheBlobThatWasOpened) {
  const bytes once = import_fixed(512, rsa_key(512).add(KM_TAG_MAX_USES_PER_BOOT, 1));
  const bytes also_once = import_fixed(512, rsa_key(512).add(KM_TAG_MAX_USES_PER_BOOT, 1));
  const param_list raw = signature(KM_DIGEST_NONE, KM_PAD_NONE);
  const auto request_for = [&](const bytes& blob) { return join({prefixed(blob), prefixed(raw.marshal())}); };
  sweep(request_for(once), request_for(also_once), [&](bytes& request, const arm& armed) {
    tee.close_session();  // a new instance has counted nothing
    tee.open_session();
    EXPECT_EQ(call(KM_COMMAND_BEGIN, KM_PURPOSE_SIGN, request, armed).error, KM_ERROR_OK);
    const auto used_up = [&](const bytes& blob) {
      return client().begin(KM_PURPOSE_SIGN, blob, raw).error == KM_ERROR_KEY_MAX_OPS_EXCEEDED;
    };
    const bool first = used_up(once), second = used_up(also_once);
    if (first == second) return taken::neither;
    return first ? taken::first : taken::second;
  });
}

TEST_F(ExchangeTest, TheKeyThatIsExportedIsTheOneWhoseApplicationWasChecked) {
  const auto bound_to = [](const bytes& id) { return rsa_key(512).add_blob(KM_TAG_APPLICATION_ID, id); };
  const bytes own_id = pattern(8), other_id = pattern(8, 100);
  const bytes own = client().must_generate(bound_to(own_id));
  bytes other;
  do other = client().must_generate(bound_to(other_id));
  while (other.size() != own.size());  // a component may be a byte shorter
  const bytes own_public = client().export_key(own, own_id).body();
  const auto request_for = [&](const bytes& blob) { return join({prefixed(blob), prefixed(own_id), prefixed({})}); };
  sweep(request_for(own), request_for(other), [&](bytes& request, const arm& armed) {
    const raw_answer got = call(KM_COMMAND_EXPORT_KEY, 0, request, armed);
    if (got.error == KM_ERROR_INVALID_KEY_BLOB) return taken::second;  // of another application
    return body(got) == own_public ? taken::first : taken::neither;
  });
}

TEST_F(ExchangeTest, TheCharacteristicsAreThoseOfOneBlob) {
  const bytes first = import_fixed(512, rsa_key(512).add(KM_TAG_MAX_USES_PER_BOOT, 1));
  const bytes second = import_fixed(512, rsa_key(512).add(KM_TAG_MAX_USES_PER_BOOT, 2));
  const bytes of_first = client().characteristics(first).body(), of_second = client().characteristics(second).body();
  sweep(key_body(first, {}, {}), key_body(second, {}, {}), [&](bytes& request, const arm& armed) {
    const bytes got = body(call(KM_COMMAND_GET_KEY_CHARACTER, 0, request, armed));
    if (got == of_first) return taken::first;
    return got == of_second ? taken::second : taken::neither;
  });
}

/// Keys and signatures as they come from outside.
class ExchangedMaterialTest : public ExchangeTest {
 protected:
  void expect_stored_as_parsed(const param_list& params, const bytes& material, const bytes& other) {
    const bytes request_head = prefixed(params.marshal());
    const bytes first = join({request_head, material}), second = join({request_head, other});
    const bytes ksk = stored_ksk();
    const auto import = [&](bytes& request, const arm& armed) {
      const bytes got = body(call(KM_COMMAND_IMPORT_KEY, 0, request, armed));
      return open_blob(ksk, {got.begin() + 4, got.begin() + 4 + u32_at(got, 0)}).value();
    };
    bytes request = first;
    const bytes sealed_first = import(request, {});
    request = second;
    const bytes sealed_second = import(request, {});
    sweep(first, second, [&](bytes& exchanged, const arm& armed) {
      const bytes sealed = import(exchanged, armed);
      if (sealed == sealed_first) return taken::first;
      return sealed == sealed_second ? taken::second : taken::neither;
    });
  }

  /// changed flips a bit in the middle of each field from `at` on.
  static bytes changed(bytes material, std::size_t at) {
    const bytes as_it_was = material;
    for (; at < material.size(); at += 4 + u32_at(as_it_was, at)) {
      material[at + 4 + u32_at(as_it_was, at) / 2] ^= 0x10;
    }
    return material;
  }

  void expect_verified_as_taken(const bytes& blob, const param_list& scheme, const bytes& message, const bytes& good) {
    bytes bad = good;
    bad.back() ^= 1;
    const auto request_for = [](const bytes& made) { return join({prefixed(made), prefixed(u32(0))}); };
    tee.clear_trace();
    sweep(request_for(good), request_for(bad), [&](bytes& request, const arm& armed) {
      const std::uint32_t handle = client().must_begin(KM_PURPOSE_VERIFY, blob, scheme);
      EXPECT_TRUE(client().update(handle, message).ok());
      const raw_answer got = call(KM_COMMAND_FINISH, handle, request, armed);
      if (got.error == KM_ERROR_OK) return taken::first;
      return got.error == KM_ERROR_VERIFICATION_FAILED ? taken::second : taken::neither;
    });
  }
};

TEST_F(ExchangedMaterialTest, AnRsaKeyIsStoredAsItWasParsed) {
  const bytes material = rsa_test_key::of_bits(512).material();
  expect_stored_as_parsed(rsa_key(512).remove(KM_TAG_RSA_PUBLIC_EXPONENT),  // that of the material
                          material, changed(material, 0));
}

TEST_F(ExchangedMaterialTest, AnEcKeyIsStoredAsItWasParsed) {
  const bytes material = ec_test_key::of_bits(256).material();
  expect_stored_as_parsed(ec_key(256), material, changed(material, 4));
}

TEST_F(ExchangedMaterialTest, AnRsaSignatureIsVerifiedAsItWasTaken) {
  const bytes blob = import_fixed(1024), message = from_text("message");
  for (const param_list& scheme :
       {signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN), signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS)}) {
    expect_verified_as_taken(blob, scheme, message, client().sign(blob, scheme, message).data);
  }
}

TEST_F(ExchangedMaterialTest, AnEcSignatureIsVerifiedAsItWasTaken) {
  // It is read twice: decoded, and compared with the only form of what was decoded.
  const ec_test_key& key = ec_test_key::of_bits(256);
  const bytes digest = pattern(32);
  expect_verified_as_taken(client().must_import(ec_key(256), key.material()), ec_digest(KM_DIGEST_NONE), digest,
                           key.sign(KM_DIGEST_NONE, digest));
  EXPECT_FALSE(tee.traced("Encoding mismatch"));
}

}  // namespace
}  // namespace testing_support
