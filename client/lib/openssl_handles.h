// Owners of the libcrypto objects that the client uses.
#ifndef KEYMASTER_CLIENT_LIB_OPENSSL_HANDLES_H_
#define KEYMASTER_CLIENT_LIB_OPENSSL_HANDLES_H_

#include <openssl/bio.h>
#include <openssl/bn.h>
#include <openssl/decoder.h>
#include <openssl/evp.h>
#include <openssl/param_build.h>

#include <memory>

namespace keymaster::client {

template <auto Free>
struct openssl_free {
  template <class T>
  void operator()(T* object) const {
    Free(object);
  }
};

using bio_ptr = std::unique_ptr<BIO, openssl_free<BIO_free_all>>;
using bignum_ptr = std::unique_ptr<BIGNUM, openssl_free<BN_clear_free>>;
using pkey_ptr = std::unique_ptr<EVP_PKEY, openssl_free<EVP_PKEY_free>>;
using pkey_ctx_ptr = std::unique_ptr<EVP_PKEY_CTX, openssl_free<EVP_PKEY_CTX_free>>;
using decoder_ctx_ptr = std::unique_ptr<OSSL_DECODER_CTX, openssl_free<OSSL_DECODER_CTX_free>>;
using param_bld_ptr = std::unique_ptr<OSSL_PARAM_BLD, openssl_free<OSSL_PARAM_BLD_free>>;
using params_ptr = std::unique_ptr<OSSL_PARAM, openssl_free<OSSL_PARAM_free>>;

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_OPENSSL_HANDLES_H_
