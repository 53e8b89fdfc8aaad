#include "tests/load/key_shelf.h"

#include <openssl/evp.h>

#include "client/lib/connection.h"
#include "client/lib/provisioning.h"
#include "tests/support/ec_test_key.h"
#include "tests/support/encryption.h"
#include "tests/support/hmac_test_key.h"
#include "tests/support/rsa_test_key.h"

using namespace testing_support;

namespace load {
namespace {

bytes pem_of(const keymaster::client::bytes& der) {
  bytes base64((der.size() + 2) / 3 * 4 + 1);
  base64.resize(static_cast<std::size_t>(EVP_EncodeBlock(base64.data(), der.data(), static_cast<int>(der.size()))));
  return join({from_text("-----BEGIN PUBLIC KEY-----\n"), base64, from_text("\n-----END PUBLIC KEY-----"), bytes{0}});
}

void provision(const std::string& context_name, key_shelf& shelf) {
  keymaster::client::connection tee(context_name);
  keymaster::client::provisioning factory(tee);
  shelf.attestation_pem = pem_of(factory.generate_attk());
  shelf.device_id = pattern(20, 77);
  factory.put_device_id(shelf.device_id);
  factory.put_cpu_id("LOAD-1");
  factory.put_soter_properties("sensor", "1.0", keymaster::client::fingerprint_ta);
}

}  // namespace

key_shelf fill_shelf(const std::string& context_name) {
  key_shelf shelf;
  provision(context_name, shelf);
  ta_client client(context_name);
  for (const unsigned bits : {1024U, 2048U}) {
    const bytes material = rsa_test_key::of_bits(bits).material();
    shelf.rsa.push_back(
        {bits, client.must_import(rsa_key(bits), material), client.must_import(rsa_cipher_key(bits), material)});
  }
  for (const std::uint32_t bits : ec_sizes) {
    shelf.ec.push_back({bits, client.must_import(ec_key(bits), ec_test_key::of_bits(bits).material())});
  }
  for (const std::uint32_t bits : {128U, 192U, 256U}) {
    const bytes key = pattern(bits / 8, bits);
    shelf.aes.push_back({key, client.must_import(aes_key(bits), key)});
  }
  for (const hmac_limits& limits : every_hmac) {
    const bytes key = pattern(limits.longest_key / 8, limits.digest);
    shelf.hmac.push_back({limits.digest, limits.longest_mac, key, client.must_import(hmac_key(limits.digest, 0), key)});
  }
  return shelf;
}

}  // namespace load
