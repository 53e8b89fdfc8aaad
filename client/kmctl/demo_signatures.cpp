// The rounds of kmctl demo that sign: RSA with everything that can be refused, EC, and a MAC.
#include <fmt/format.h>
#include <openssl/rand.h>

#include "client/kmctl/demonstration.h"
#include "client/kmctl/describe.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/openssl_command.h"
#include "client/kmctl/signing.h"
#include "client/kmctl/values.h"
#include "client/lib/names.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;
using client::authorizations;

authorizations signing_key(keymaster::keymaster_algorithm_t algorithm, std::uint32_t bits) {
  return authorizations{}
      .algorithm(algorithm)
      .key_size(bits)
      .purpose({keymaster::KM_PURPOSE_SIGN, keymaster::KM_PURPOSE_VERIFY})
      .digest({keymaster::KM_DIGEST_SHA_2_256})
      .no_auth_required();
}

authorizations rsa_parameters() {
  return authorizations{}.digest({keymaster::KM_DIGEST_SHA_2_256}).padding({keymaster::KM_PAD_RSA_PKCS1_1_5_SIGN});
}

key_use use_of(byte_view blob, const authorizations& parameters) {
  return {.blob = blob, .app = {}, .parameters = parameters, .each_step = {}};
}

/// Signs the file and leaves the signature in the folder.
bytes sign(demonstration& demo, const key_use& key, const char* name) {
  input_file file(demo.file());
  bytes signature = sign_stream(demo.ta(), key, data_of(file));
  demo.keep(name, signature);
  return signature;
}

std::string told_signature(const demonstration& demo, const bytes& signature, const char* name) {
  return fmt::format("   {} of signature: {}", format_size(signature.size()), demo.path(name));
}

std::string generate_rsa(demonstration& demo, bytes& blob) {
  blob = demo.generate("key.blob", authorizations{}
                                       .algorithm(keymaster::KM_ALGORITHM_RSA)
                                       .key_size(2048)
                                       .rsa_public_exponent(65537)
                                       .purpose({keymaster::KM_PURPOSE_SIGN, keymaster::KM_PURPOSE_VERIFY})
                                       .add(rsa_parameters())
                                       .no_auth_required());
  return fmt::format(
      "   Outside the TEE the key exists only as this sealed blob of {}: {}\n   What it may be used for:\n{}",
      format_size(blob.size()), demo.path("key.blob"), describe_text(client::get_characteristics(demo.ta(), blob), 5));
}

std::string verify_in_ta(demonstration& demo, const key_use& key, byte_view signature) {
  input_file file(demo.file());
  verify_stream(demo.ta(), key, data_of(file), signature);
  return "   The signature is valid.";
}

std::string verify_with_openssl(const demonstration& demo, const char* public_key, const char* signature) {
  return demonstration::by_openssl(verify_command(demo.path(public_key), demo.path(signature), demo.file()),
                                   "accept the signature");
}

std::string refuse_tampered_file(demonstration& demo, const key_use& key, byte_view signature) {
  return demonstration::refused(
      "a changed file",
      [&] {
        tampered_file file(demo.file());
        verify_stream(demo.ta(), key, file.data(), signature);
      },
      is_wrong_signature);
}

std::string refuse_tampered_blob(demonstration& demo, bytes blob) {
  blob[blob.size() / 2] ^= 1U;
  return demonstration::refused(
      "a changed blob",
      [&] { (void)client::operation::begin(demo.ta(), keymaster::KM_PURPOSE_SIGN, blob, rsa_parameters()); },
      [](const client::failure& facts) {
        return client::tee_result_name(facts.tee_result) == "TEE_ERROR_MAC_INVALID";
      });
}

/// A key that both sides have: made here, imported into the TA, and left in the folder for openssl.
bytes import_mac_key(demonstration& demo, bytes& blob) {
  bytes value(32);
  if (RAND_bytes(value.data(), static_cast<int>(value.size())) != 1) {
    throw failure_error("libcrypto has no random numbers");
  }
  blob = client::import_key(demo.ta(), signing_key(keymaster::KM_ALGORITHM_HMAC, 256).min_mac_length(256), value).blob;
  demo.keep_blob("hmac.blob", blob);
  return value;
}

std::string compare_macs(const demonstration& demo, byte_view key, byte_view mac) {
  std::string told = demonstration::by_openssl(mac_command(to_hex(key), demo.file()), "compute the MAC");
  if (!told.ends_with(to_hex(mac))) {
    throw failure_error(fmt::format("openssl computes another MAC:\n{}", told));
  }
  return told;
}

}  // namespace

void show_rsa_signature(demonstration& demo) {
  bytes blob;
  bytes signature;
  demo.step("generate", "Generate an RSA-2048 key inside the TEE", [&] { return generate_rsa(demo, blob); });
  const key_use key = use_of(blob, rsa_parameters());
  demo.step("export", "Export its public part", [&] {
    demo.export_public("public.pem", keymaster::KM_ALGORITHM_RSA, blob);
    return "   " + demo.path("public.pem");
  });
  demo.step("sign", "Sign the file", [&] {
    signature = sign(demo, key, "signature.bin");
    return told_signature(demo, signature, "signature.bin");
  });
  demo.step("verify", "Verify the signature in the TA", [&] { return verify_in_ta(demo, key, signature); });
  demo.step("openssl", "Verify it with openssl, which knows nothing of the TEE",
            [&] { return verify_with_openssl(demo, "public.pem", "signature.bin"); });
  demo.step("tampered_file", "Flip one bit of the file: the TA must refuse the signature",
            [&] { return refuse_tampered_file(demo, key, signature); });
  demo.step("tampered_blob", "Flip one bit of the key blob: the TA must refuse the key",
            [&] { return refuse_tampered_blob(demo, blob); });
}

void show_ec_signature(demonstration& demo) {
  demo.step("ec_sign", "EC: generate a key on the curve P-256 and sign the file", [&] {
    const bytes blob = demo.generate("ec.blob", signing_key(keymaster::KM_ALGORITHM_EC, 256));
    demo.export_public("ec-public.pem", keymaster::KM_ALGORITHM_EC, blob);
    const key_use key = use_of(blob, authorizations{}.digest({keymaster::KM_DIGEST_SHA_2_256}));
    return told_signature(demo, sign(demo, key, "ec-signature.bin"), "ec-signature.bin");
  });
  demo.step("ec_openssl", "Verify it with openssl",
            [&] { return verify_with_openssl(demo, "ec-public.pem", "ec-signature.bin"); });
}

void show_mac(demonstration& demo) {
  bytes value;
  bytes mac;
  demo.step("mac", "HMAC-SHA-256: import a key that openssl may know too, and make the file's MAC", [&] {
    bytes blob;
    value = import_mac_key(demo, blob);
    mac =
        sign(demo, use_of(blob, authorizations{}.digest({keymaster::KM_DIGEST_SHA_2_256}).mac_length(256)), "mac.bin");
    return "   " + to_hex(mac);
  });
  demo.step("mac_openssl", "Have openssl make it", [&] { return compare_macs(demo, value, mac); });
}

}  // namespace kmctl
