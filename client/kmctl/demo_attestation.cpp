// The last round of kmctl demo: a device vouches for a key, the key for another, and that one for what a finger agreed
// to. A relying party, which has nothing but the device's public attestation key, believes it.
#include <fmt/format.h>
#include <openssl/rand.h>

#include <optional>

#include "client/kmctl/demonstration.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/openssl_command.h"
#include "client/kmctl/values.h"
#include "client/lib/attestation.h"
#include "client/lib/device_information.h"
#include "client/lib/factory_record.h"
#include "client/lib/fingerprint.h"
#include "client/lib/operation.h"
#include "client/lib/provisioning.h"
#include "client/lib/statement.h"
#include "client/lib/statement_refused.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;
using client::authorizations;

constexpr std::uint32_t application_uid = 10001;
constexpr std::uint64_t demo_user = 0x6b6d63746c;  // "kmctl"
constexpr client::signature_scheme pss = {keymaster::KM_PAD_RSA_PSS, keymaster::KM_DIGEST_SHA_2_256};

/// What the rounds' parties know: the application on the device, and the relying party.
struct parties {
  bytes app_blob;
  bytes auth_blob;
  std::optional<client::rsa_public_key> app_key;   // the relying party's, once it accepted it
  std::optional<client::rsa_public_key> auth_key;  // likewise
  std::uint64_t last_counter = 0;
};

bytes random_bytes(std::size_t size) {
  bytes drawn(size);
  if (RAND_bytes(drawn.data(), static_cast<int>(size)) != 1) {
    throw failure_error("libcrypto has no random numbers");
  }
  return drawn;
}

/// A factory's work, unless it is done: the key and the properties. The device stays open for others to be put in.
std::string provision(demonstration& demo) {
  client::provisioning factory(demo.tee());
  const client::provisioning_status before = factory.status();
  std::string told = "   The device has an attestation key already.\n";
  if (!before.key) {
    (void)factory.generate_attk();
    told = "   Made an RSA-2048 attestation key inside the provisioning TA.\n";
  }
  if (!before.soter_properties) {
    factory.put_soter_properties("demo sensor", "1.0", client::fingerprint_ta);
  }
  if (!before.cpu_id) {
    factory.put_cpu_id(to_hex(random_bytes(8)));
  }
  if (!before.device_id) {
    factory.put_device_id(random_bytes(client::shortest_device_id));
  }
  client::ensure_ready(demo.ta());
  demo.keep("attk.pem", client::as_bytes(client::export_attk(demo.ta())));
  return told + fmt::format("   Device id {}; what its maker publishes: {}", to_hex(client::get_device_id(demo.ta())),
                            demo.path("attk.pem"));
}

authorizations soter_key() {
  return authorizations{}
      .algorithm(keymaster::KM_ALGORITHM_RSA)
      .key_size(2048)
      .rsa_public_exponent(65537)
      .purpose({keymaster::KM_PURPOSE_SIGN})
      .digest({pss.digest})
      .padding({pss.padding})
      .no_auth_required()
      .soter_key()
      .soter_counted()
      .soter_uid(application_uid);
}

/// Has the device make a key and vouch for it, and leaves both in the folder.
bytes make_key(demonstration& demo, const char* blob_name, const char* statement_name,
               const authorizations& description, bytes& blob) {
  blob = demo.generate(blob_name, description);
  bytes statement = client::export_key(demo.ta(), blob);
  demo.keep(statement_name, statement);
  return statement;
}

/// The relying party's part: whether to believe what is said of a key.
client::rsa_public_key accept_key(parties& all, const client::rsa_public_key& signer, byte_view statement) {
  client::export_facts facts = client::verify_export_statement(
      statement, {.signer = signer, .uid = application_uid, .last_counter = all.last_counter});
  all.last_counter = facts.counter.value_or(all.last_counter);
  return std::move(facts.key);
}

/// The text of a statement as people read it: without the NUL of those that end with one.
std::string text_of(byte_view statement, std::size_t signature_size) {
  const byte_view text = client::split_statement(statement, signature_size).text;
  std::string shown(text.begin(), text.end());
  if (!shown.empty() && shown.back() == '\0') {
    shown.pop_back();
  }
  return shown;
}

client::rsa_public_key attestation_key_of(demonstration& demo) {
  const bytes pem = read_small_file(demo.path("attk.pem"), "attestation key");
  return client::rsa_public_key::from_pem({reinterpret_cast<const char*>(pem.data()), pem.size()});
}

std::string make_app_key(demonstration& demo, parties& all) {
  const client::rsa_public_key attk = attestation_key_of(demo);
  const bytes statement = make_key(demo, "app.blob", "app.statement", soter_key().soter_signed_by_attk(), all.app_blob);
  all.app_key = accept_key(all, attk, statement);
  const client::statement_parts parts = client::split_statement(statement, attk.signature_size());
  demo.keep("app-statement.json", parts.text);
  demo.keep("app-statement.sig", parts.signature);
  return fmt::format("   {}\n   Accepted: uid {}, counter {}.", text_of(statement, attk.signature_size()),
                     application_uid, all.last_counter);
}

std::string make_auth_key(demonstration& demo, parties& all) {
  const bytes statement =
      make_key(demo, "auth.blob", "auth.statement",
               soter_key().soter_signed_by_key().soter_signing_key_blob(all.app_blob), all.auth_blob);
  all.auth_key = accept_key(all, *all.app_key, statement);
  return fmt::format("   Accepted, as the app key's: uid {}, counter {}.", application_uid, all.last_counter);
}

/// The demo's own finger, and nobody else's.
std::uint32_t demo_finger(client::fingerprint& sensor) {
  for (const client::finger& enrolled : sensor.list()) {
    if (enrolled.secure_id == demo_user) {
      return enrolled.id;
    }
  }
  return sensor.enrol(demo_user);
}

std::string sign_challenge(demonstration& demo, const parties& all, const std::string& challenge, bytes& statement,
                           std::uint32_t& finger) {
  client::fingerprint sensor(demo.tee());
  finger = demo_finger(sensor);
  client::operation op = client::operation::begin(demo.ta(), keymaster::KM_PURPOSE_SIGN, all.auth_blob,
                                                  authorizations{}.digest({pss.digest}).padding({pss.padding}));
  op.update(client::as_bytes(challenge));
  (void)sensor.touch(finger, op.handle());
  statement = op.finish().output;
  demo.keep("sign.statement", statement);
  return fmt::format("   {}", text_of(statement, all.auth_key->signature_size()));
}

client::sign_expectations expected_of(const parties& all, const std::string& challenge, std::uint32_t finger) {
  return {.signer = *all.auth_key,
          .challenge = challenge,
          .scheme = pss,
          .fingers = std::vector{finger},
          .uid = application_uid,
          .last_counter = all.last_counter};
}

std::string refuse_altered(const client::sign_expectations& expected, bytes statement) {
  statement[16] ^= 1U;  // in the message
  try {
    (void)client::verify_sign_statement(statement, expected);
  } catch (const client::statement_refused& refusal) {
    return fmt::format("   Refused, as it must be ({}): {}", client::check_name(refusal.check()), refusal.what());
  }
  throw failure_error("the relying party believed an altered statement");
}

}  // namespace

void show_attestation(demonstration& demo) {
  parties all;
  bytes statement;
  std::uint32_t finger = 0;
  const std::string challenge = fmt::format("pay 10 to Mary, nonce {}", to_hex(random_bytes(8)));
  demo.step("provision", "Attestation: the factory gives the device a key of its own", [&] { return provision(demo); });
  demo.step("app_key", "Make an app key, which the device vouches for", [&] { return make_app_key(demo, all); });
  demo.step("statement_openssl", "Verify that statement with openssl", [&] {
    return demonstration::by_openssl(
        verify_command(demo.path("attk.pem"), demo.path("app-statement.sig"), demo.path("app-statement.json")),
        "accept the statement");
  });
  demo.step("auth_key", "Make an auth key, which the app key vouches for", [&] { return make_auth_key(demo, all); });
  demo.step("sign_statement", "Touch the sensor, and sign the relying party's challenge",
            [&] { return sign_challenge(demo, all, challenge, statement, finger); });
  const client::sign_expectations expected = expected_of(all, challenge, finger);
  demo.step("verify_statement", "Be the relying party: check the chain up to the attestation key", [&] {
    const client::sign_facts facts = client::verify_sign_statement(statement, expected);
    return fmt::format("   Believed: finger {}, uid {}, counter {}, device {}.", facts.fid.value_or(0),
                       facts.uid.value_or(0), facts.counter, facts.cpu_id);
  });
  demo.step("altered_statement", "Flip one bit of the statement: the relying party must not believe it",
            [&] { return refuse_altered(expected, statement); });
}

}  // namespace kmctl
