// The rounds of kmctl demo that encrypt: the file with AES-GCM, and a secret with RSA-OAEP.
#include <fmt/format.h>
#include <openssl/rand.h>

#include <algorithm>

#include "client/kmctl/ciphering.h"
#include "client/kmctl/demonstration.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/openssl_command.h"
#include "client/kmctl/values.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;
using client::authorizations;

constexpr std::size_t gcm_nonce = 12;
constexpr std::size_t secret_size = 32;

authorizations ciphering_key(keymaster::keymaster_algorithm_t algorithm, std::uint32_t bits) {
  return authorizations{}
      .algorithm(algorithm)
      .key_size(bits)
      .purpose({keymaster::KM_PURPOSE_ENCRYPT, keymaster::KM_PURPOSE_DECRYPT})
      .no_auth_required();
}

key_use gcm_use(byte_view blob) {
  return {.blob = blob,
          .app = {},
          .parameters =
              authorizations{}.block_mode({keymaster::KM_MODE_GCM}).padding({keymaster::KM_PAD_NONE}).mac_length(128),
          .each_step = {}};
}

std::string encrypt_file(demonstration& demo, const key_use& key) {
  input_file text(demo.file());
  output_file out(demo.path("file.enc"), demo.rules());
  const auto write = [&out](byte_view piece) { out.write(piece); };
  encrypt_stream(demo.ta(), key, data_of(text), {}, write, write);
  out.commit();
  return fmt::format("   Nonce, ciphertext and tag: {}", demo.path("file.enc"));
}

/// Decrypts what `data` has behind its nonce, and hands it on.
void decrypt(demonstration& demo, key_use key, data_stream data, const client::byte_sink& sink) {
  key.parameters.nonce(take_nonce(data, gcm_nonce, demo.path("file.enc")));
  decrypt_stream(demo.ta(), key, data, {}, sink);
}

std::string decrypt_file(demonstration& demo, const key_use& key) {
  input_file ciphertext(demo.path("file.enc"));
  input_file original(demo.file());
  bool same = true;
  std::uint64_t size = 0;
  decrypt(demo, key, data_of(ciphertext), [&](byte_view piece) {
    bytes expected(piece.size());
    same = same && original.read(expected) == piece.size() && std::ranges::equal(expected, piece);
    size += piece.size();
  });
  if (!same || size != original.size()) {
    throw failure_error("the decrypted text is not that of the file");
  }
  return fmt::format("   The tag is right, and the file came back ({}).", format_size(size));
}

std::string refuse_tampered_ciphertext(demonstration& demo, const key_use& key) {
  return demonstration::refused(
      "a changed ciphertext",
      [&] {
        tampered_file changed(demo.path("file.enc"), gcm_nonce);
        decrypt(demo, key, changed.data(), [](byte_view /*never looked at*/) {});
      },
      is_wrong_signature);
}

std::string encrypt_secret(demonstration& demo, bytes& blob, bytes& secret) {
  blob = demo.generate("oaep.blob", ciphering_key(keymaster::KM_ALGORITHM_RSA, 2048)
                                        .rsa_public_exponent(65537)
                                        .padding({keymaster::KM_PAD_RSA_OAEP})
                                        .digest({keymaster::KM_DIGEST_SHA_2_256}));
  demo.export_public("oaep-public.pem", keymaster::KM_ALGORITHM_RSA, blob);
  secret.resize(secret_size);
  if (RAND_bytes(secret.data(), static_cast<int>(secret.size())) != 1) {
    throw failure_error("libcrypto has no random numbers");
  }
  demo.keep_blob("secret.bin", secret);
  return demonstration::by_openssl(
      oaep_command(demo.path("oaep-public.pem"), demo.path("secret.bin"), demo.path("secret.enc")),
      "encrypt the secret");
}

std::string decrypt_secret(demonstration& demo, byte_view blob, const bytes& secret) {
  input_file ciphertext(demo.path("secret.enc"));
  const key_use key{
      .blob = blob,
      .app = {},
      .parameters = authorizations{}.padding({keymaster::KM_PAD_RSA_OAEP}).digest({keymaster::KM_DIGEST_SHA_2_256}),
      .each_step = {}};
  bytes text;
  decrypt_stream(demo.ta(), key, data_of(ciphertext), {},
                 [&text](byte_view piece) { text.insert(text.end(), piece.begin(), piece.end()); });
  if (text != secret) {
    throw failure_error("the TA decrypts another secret");
  }
  return fmt::format("   It is the secret: {}", to_hex(text));
}

}  // namespace

void show_file_encryption(demonstration& demo) {
  bytes blob;
  demo.step("encrypt", "AES-256-GCM: generate a key and encrypt the file", [&] {
    blob = demo.generate("aes.blob", ciphering_key(keymaster::KM_ALGORITHM_AES, 256)
                                         .block_mode({keymaster::KM_MODE_GCM})
                                         .padding({keymaster::KM_PAD_NONE})
                                         .min_mac_length(128));
    return encrypt_file(demo, gcm_use(blob));
  });
  demo.step("decrypt", "Decrypt it", [&] { return decrypt_file(demo, gcm_use(blob)); });
  demo.step("tampered_ciphertext", "Flip one bit of the ciphertext: the TA must refuse it",
            [&] { return refuse_tampered_ciphertext(demo, gcm_use(blob)); });
}

void show_secret_transport(demonstration& demo) {
  bytes blob;
  bytes secret;
  demo.step("openssl_encrypt", "RSA-OAEP: generate a key and have openssl encrypt a secret for it",
            [&] { return encrypt_secret(demo, blob, secret); });
  demo.step("decrypt_secret", "Decrypt the secret in the TA", [&] { return decrypt_secret(demo, blob, secret); });
}

}  // namespace kmctl
