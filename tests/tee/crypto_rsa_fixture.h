// What the tests of RSA share: keys that libcrypto made, and the platform's calls on them.
#ifndef TESTS_TEE_CRYPTO_RSA_FIXTURE_H_
#define TESTS_TEE_CRYPTO_RSA_FIXTURE_H_

#include <map>

#include "tests/tee/crypto_fixture.h"

namespace hosted_tee::testing {

struct context_closer {
  void operator()(EVP_PKEY_CTX* context) const { EVP_PKEY_CTX_free(context); }
};
using context_owner = std::unique_ptr<EVP_PKEY_CTX, context_closer>;

[[nodiscard]] inline const EVP_MD* md(const char* name) {
  return EVP_get_digestbyname(name);
}

class rsa_fixture : public crypto_fixture {
 protected:
  /// One key of each size serves all tests of the process.
  static const key_owner& reference(unsigned bits) {
    static std::map<unsigned, key_owner> keys;
    key_owner& key = keys[bits];
    if (key == nullptr) key = new_rsa_key(bits);
    return key;
  }
  static object_owner imported(unsigned bits, bool crt = true) {
    object_owner object = allocate(TEE_TYPE_RSA_KEYPAIR, bits);
    EXPECT_EQ(populate_into(object, rsa_attributes(reference(bits), crt)), TEE_SUCCESS);
    return object;
  }
  static operation_owner rsa(std::uint32_t algorithm, std::uint32_t mode, unsigned bits = 1024) {
    return operation_for(algorithm, mode, imported(bits));
  }
  static answer encrypt(const operation_owner& op, const bytes& plain, std::size_t capacity,
                        const attribute_list& params = {}) {
    return taking(capacity, [&](void* place, std::uint32_t* length) {
      return TEE_AsymmetricEncrypt(op.get(), params.data(), params.count(), plain.data(), size_of(plain), place,
                                   length);
    });
  }
  static answer decrypt(const operation_owner& op, const bytes& cipher, std::size_t capacity,
                        const attribute_list& params = {}) {
    return taking(capacity, [&](void* place, std::uint32_t* length) {
      return TEE_AsymmetricDecrypt(op.get(), params.data(), params.count(), cipher.data(), size_of(cipher), place,
                                   length);
    });
  }
  static answer sign(const operation_owner& op, const bytes& digest, std::size_t capacity,
                     const attribute_list& params = {}) {
    return taking(capacity, [&](void* place, std::uint32_t* length) {
      return TEE_AsymmetricSignDigest(op.get(), params.data(), params.count(), digest.data(), size_of(digest), place,
                                      length);
    });
  }
  static TEE_Result verify(const operation_owner& op, const bytes& digest, const bytes& signature,
                           const attribute_list& params = {}) {
    return TEE_AsymmetricVerifyDigest(op.get(), params.data(), params.count(), digest.data(), size_of(digest),
                                      signature.data(), size_of(signature));
  }
};

}  // namespace hosted_tee::testing

#endif  // TESTS_TEE_CRYPTO_RSA_FIXTURE_H_
